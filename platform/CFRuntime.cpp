#include "platform/CFRuntime.h"

#include <cstdio>

#include "platform/ArgumentChecks.h"
#include "platform/CFString.h"
#include "platform/Log.h"

using glyphwell::runtime::AsObject;
using glyphwell::runtime::CFObject;

namespace glyphwell::runtime {

void CFObject::Retain() const noexcept {
    if (!immortal_)
        refCount_.fetch_add(1, std::memory_order_relaxed);
}

bool CFObject::ReleaseShouldDestroy() const noexcept {
    if (immortal_)
        return false;
    return refCount_.fetch_sub(1, std::memory_order_acq_rel) == 1;
}

CFIndex CFObject::RetainCount() const noexcept {
    return immortal_ ? CFIndex(0x7fffffffffffffffL) : refCount_.load(std::memory_order_relaxed);
}

std::string DescriptionPrefix(const CFObject* object, const char* kindName) {
    char text[64];
    std::snprintf(text, sizeof text, "<%s %p>", kindName, static_cast<const void*>(object));
    return text;
}

const void* CallRetain(CFRetainCallBack retain, const void* value) {
    return retain ? retain(kCFAllocatorDefault, value) : value;
}

void CallRelease(CFReleaseCallBack release, const void* value) {
    if (release)
        release(kCFAllocatorDefault, value);
}

bool CallEqual(CFEqualCallBack equal, const void* a, const void* b) {
    if (a == b)
        return true;
    return equal ? equal(a, b) != 0 : false;
}

CFHashCode CallHash(CFHashCallBack hash, const void* value) {
    return hash ? hash(value) : CFHashCode(reinterpret_cast<uintptr_t>(value) >> 4);
}

std::string CallDescribe(CFCopyDescriptionCallBack describe, const void* value) {
    if (describe) {
        CFStringRef text = describe(value);
        std::string result = Describe(text);
        if (text)
            CFRelease(text);
        return result;
    }
    char text[32];
    std::snprintf(text, sizeof text, "<%p>", value);
    return text;
}

} // namespace glyphwell::runtime

// Allocators are tokens; only their identity matters.
struct __CFAllocator {
    int tag;
};
static const __CFAllocator systemDefaultAllocator{1};
static const __CFAllocator mallocAllocator{2};
static const __CFAllocator nullAllocator{3};
const CFAllocatorRef kCFAllocatorDefault = nullptr;
const CFAllocatorRef kCFAllocatorSystemDefault = &systemDefaultAllocator;
const CFAllocatorRef kCFAllocatorMalloc = &mallocAllocator;
const CFAllocatorRef kCFAllocatorNull = &nullAllocator;

CFTypeRef CFRetain(CFTypeRef value) {
    GW_CHECK_ARGUMENT(value != nullptr);
    if (value)
        AsObject(value)->Retain();
    return value;
}

void CFRelease(CFTypeRef value) {
    GW_CHECK_ARGUMENT(value != nullptr);
    if (value && AsObject(value)->ReleaseShouldDestroy())
        delete AsObject(value);
}

CFIndex CFGetRetainCount(CFTypeRef value) {
    GW_CHECK_ARGUMENT(value != nullptr);
    return value ? AsObject(value)->RetainCount() : 0;
}

CFTypeID CFGetTypeID(CFTypeRef value) {
    GW_CHECK_ARGUMENT(value != nullptr);
    return value ? AsObject(value)->Kind() : 0;
}

Boolean CFEqual(CFTypeRef a, CFTypeRef b) {
    if (a == b)
        return true;
    if (!a || !b)
        return false;
    const CFObject* left = AsObject(a);
    const CFObject* right = AsObject(b);
    return left->Kind() == right->Kind() && left->Equals(*right);
}

CFHashCode CFHash(CFTypeRef value) {
    GW_CHECK_ARGUMENT(value != nullptr);
    return value ? AsObject(value)->Hash() : 0;
}

CFStringRef CFCopyDescription(CFTypeRef value) {
    GW_CHECK_ARGUMENT(value != nullptr);
    if (!value)
        return nullptr;
    std::string text = AsObject(value)->Description();
    return CFStringCreateWithBytes(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(text.data()),
                                   CFIndex(text.size()), kCFStringEncodingUTF8, false);
}

CFStringRef CFCopyTypeIDDescription(CFTypeID typeID) {
    using namespace glyphwell::runtime;
    static const char* const names[kKindCount] = {
        "",         "CFNull",       "CFBoolean",      "CFNumber",
        "CFString", "CFData",       "CFCharacterSet", "CFArray",
        "CFSet",    "CFDictionary", "CFURL",          "CFUUID",
        "CFError",  "CFDate",       "CFMessagePort",  "CFRunLoopSource"};
    if (typeID == 0)
        return nullptr;
    if (typeID >= kKindCount) {
        std::string name = RegisteredKindName(typeID);
        return name.empty()
                   ? nullptr
                   : CFStringCreateWithBytes(kCFAllocatorDefault,
                                             reinterpret_cast<const UInt8*>(name.data()),
                                             CFIndex(name.size()), kCFStringEncodingUTF8, false);
    }
    return CFStringCreateWithCString(kCFAllocatorDefault, names[typeID], kCFStringEncodingUTF8);
}

void CFShow(CFTypeRef value) {
    std::string text = glyphwell::Describe(value);
    std::fprintf(stderr, "%s\n", text.c_str());
}

static const void* RetainValue(CFAllocatorRef, const void* value) {
    return CFRetain(value);
}
static void ReleaseValue(CFAllocatorRef, const void* value) {
    CFRelease(value);
}

const CFArrayCallBacks kCFTypeArrayCallBacks = {0, RetainValue, ReleaseValue, CFCopyDescription,
                                                CFEqual};
const CFSetCallBacks kCFTypeSetCallBacks = {0,       RetainValue, ReleaseValue, CFCopyDescription,
                                            CFEqual, CFHash};
const CFDictionaryKeyCallBacks kCFTypeDictionaryKeyCallBacks = {
    0, RetainValue, ReleaseValue, CFCopyDescription, CFEqual, CFHash};
const CFDictionaryValueCallBacks kCFTypeDictionaryValueCallBacks = {0, RetainValue, ReleaseValue,
                                                                    CFCopyDescription, CFEqual};
const CFDictionaryKeyCallBacks kCFCopyStringDictionaryKeyCallBacks = {
    0, RetainValue, ReleaseValue, CFCopyDescription, CFEqual, CFHash};
const CFSetCallBacks kCFCopyStringSetCallBacks = {
    0, RetainValue, ReleaseValue, CFCopyDescription, CFEqual, CFHash};

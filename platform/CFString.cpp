// Strings: a UTF-16 unit buffer and a mutable flag. Conversions live in TextCodec.
#include "platform/CFString.h"

#include <algorithm>
#include <atomic>
#include <climits>
#include <cstdarg>
#include <cstring>
#include <mutex>
#include <string>
#include <unordered_map>

#include "platform/ArgumentChecks.h"
#include "platform/CFRuntime.h"
#include "platform/Log.h"
#include "platform/TextCodec.h"

using namespace glyphwell::runtime;
namespace text = glyphwell::text;

struct __CFString final : public CFObject {
    __CFString(std::u16string units, bool isMutable)
        : CFObject(kStringKind), units(std::move(units)), isMutable(isMutable) {}

    bool Equals(const CFObject& other) const override {
        return units == static_cast<const __CFString&>(other).units;
    }
    /// FNV-1a over the units. An immutable string computes it once and keeps it, so that every
    /// dictionary it becomes a key of does not hash it again; a mutable one computes it each time.
    CFHashCode Hash() const override {
        if (isMutable)
            return HashUnits();
        // Relaxed is enough: every thread computes the same value, and 0 means "not yet" (a
        // string whose hash is 0 just computes it each time).
        CFHashCode h = cachedHash.load(std::memory_order_relaxed);
        if (h == 0) {
            h = HashUnits();
            cachedHash.store(h, std::memory_order_relaxed);
        }
        return h;
    }
    std::string Description() const override { return text::EncodeUTF8Lossy(units); }

    CFHashCode HashUnits() const {
        CFHashCode h = 0xcbf29ce484222325ULL;
        for (char16_t unit : units)
            h = (h ^ unit) * 0x100000001b3ULL;
        return h;
    }

    std::u16string units;
    const bool isMutable;
    /// The hash of an immutable string once computed, else 0. Immutable strings are shared
    /// between threads (the uniquer's, constants), hence atomic.
    mutable std::atomic<CFHashCode> cachedHash{0};
};

namespace {

/// The string behind `string`; reports a null or foreign reference through the assertion
/// handler and returns null.
const __CFString* Get(CFStringRef string, const glyphwell::runtime::SourceLocation& where =
                                              glyphwell::runtime::SourceLocation::current()) {
    const __CFString* object = As<__CFString>(string, kStringKind);
    CheckArgument(object != nullptr, "object != nullptr", where);
    return object;
}

/// The mutable string behind `string`, or null (reported) when it is null or immutable.
__CFString* GetMutable(CFMutableStringRef string,
                       const glyphwell::runtime::SourceLocation& where =
                           glyphwell::runtime::SourceLocation::current()) {
    __CFString* object = AsMutable<__CFString>(string, kStringKind);
    CheckArgument(object != nullptr && object->isMutable, "object != nullptr && object->isMutable",
                  where);
    return object && object->isMutable ? object : nullptr;
}

/// True when `range` lies inside a string of `length` units; reported otherwise.
bool RangeInside(CFRange range, size_t length,
                 const glyphwell::runtime::SourceLocation& where =
                     glyphwell::runtime::SourceLocation::current()) {
    return CheckRange(range, CFIndex(length), where, "range lies inside the string");
}

CFStringRef Make(std::u16string units) {
    return new __CFString(std::move(units), false);
}

std::u16string_view Units(const __CFString* object) {
    return object ? std::u16string_view(object->units) : std::u16string_view();
}

char16_t FoldASCII(char16_t unit) {
    return unit >= u'A' && unit <= u'Z' ? char16_t(unit + (u'a' - u'A')) : unit;
}

bool UnitsMatch(std::u16string_view a, std::u16string_view b, bool caseInsensitive) {
    if (!caseInsensitive)
        return a == b;
    for (size_t i = 0; i < a.size(); ++i)
        if (FoldASCII(a[i]) != FoldASCII(b[i]))
            return false;
    return true;
}

CFComparisonResult CompareUnits(std::u16string_view a, std::u16string_view b,
                                CFStringCompareFlags options) {
    bool fold = options & kCFCompareCaseInsensitive;
    size_t common = std::min(a.size(), b.size());
    for (size_t i = 0; i < common; ++i) {
        char16_t x = fold ? FoldASCII(a[i]) : a[i];
        char16_t y = fold ? FoldASCII(b[i]) : b[i];
        if (x != y)
            return x < y ? kCFCompareLessThan : kCFCompareGreaterThan;
    }
    if (a.size() == b.size())
        return kCFCompareEqualTo;
    return a.size() < b.size() ? kCFCompareLessThan : kCFCompareGreaterThan;
}

/// Constant strings: one immortal string per literal text, for the life of the process. The
/// table is built on first use and never destroyed, so constant strings may be made from the
/// static initialisers and destructors of any translation unit.
struct ConstantTable {
    std::mutex mutex;
    std::unordered_map<std::string, const __CFString*> strings;
};

ConstantTable& Constants() {
    static ConstantTable* table = new ConstantTable;
    return *table;
}

} // namespace

CFTypeID CFStringGetTypeID() {
    return kStringKind;
}

CFStringRef __CFStringMakeConstantString(const char* utf8) {
    GW_CHECK_ARGUMENT(utf8 != nullptr);
    if (!utf8)
        return nullptr;
    ConstantTable& table = Constants();
    std::lock_guard<std::mutex> lock(table.mutex);
    auto [slot, inserted] = table.strings.try_emplace(utf8, nullptr);
    if (inserted)
        slot->second = MakeImmortal<__CFString>(text::DecodeUTF8Lenient(utf8), false);
    return slot->second;
}

// ---------------------------------------------------------------------------------------------
// Creation.

CFStringRef CFStringCreateWithBytes(CFAllocatorRef, const UInt8* bytes, CFIndex numBytes,
                                    CFStringEncoding encoding, Boolean isExternalRepresentation) {
    GW_CHECK_ARGUMENT(numBytes >= 0 && (bytes != nullptr || numBytes == 0));
    if (numBytes < 0 || (!bytes && numBytes != 0))
        return nullptr;
    std::u16string units;
    if (!text::Decode(bytes, size_t(numBytes), encoding, isExternalRepresentation, units))
        return nullptr;
    return Make(std::move(units));
}

CFStringRef CFStringCreateWithCString(CFAllocatorRef allocator, const char* cString,
                                      CFStringEncoding encoding) {
    GW_CHECK_ARGUMENT(cString != nullptr);
    if (!cString)
        return nullptr;
    return CFStringCreateWithBytes(allocator, reinterpret_cast<const UInt8*>(cString),
                                   CFIndex(std::strlen(cString)), encoding, false);
}

CFStringRef CFStringCreateWithCharacters(CFAllocatorRef, const UniChar* chars, CFIndex numChars) {
    if (!GW_CHECK_ARGUMENT(numChars >= 0 && (chars != nullptr || numChars == 0)))
        return nullptr;
    if (numChars == 0)
        return Make(std::u16string());
    return Make(std::u16string(reinterpret_cast<const char16_t*>(chars), size_t(numChars)));
}

CFStringRef CFStringCreateWithFileSystemRepresentation(CFAllocatorRef allocator,
                                                       const char* buffer) {
    return CFStringCreateWithCString(allocator, buffer, kCFStringEncodingUTF8);
}

CFStringRef CFStringCreateCopy(CFAllocatorRef, CFStringRef string) {
    const __CFString* object = Get(string);
    if (!object)
        return nullptr;
    if (!object->isMutable) // immutable strings are shared, not copied
        return static_cast<CFStringRef>(CFRetain(string));
    return Make(object->units);
}

CFStringRef CFStringCreateWithSubstring(CFAllocatorRef, CFStringRef string, CFRange range) {
    const __CFString* object = Get(string);
    if (!object)
        return nullptr;
    if (!RangeInside(range, object->units.size()))
        return nullptr;
    return Make(object->units.substr(size_t(range.location), size_t(range.length)));
}

CFStringRef CFStringCreateWithFormat(CFAllocatorRef, CFDictionaryRef, CFStringRef format, ...) {
    const __CFString* object = Get(format);
    if (!object)
        return nullptr;
    std::string utf8 = text::EncodeUTF8Lossy(object->units);
    va_list arguments;
    va_start(arguments, format);
    std::string formatted = glyphwell::FormatV(utf8.c_str(), arguments);
    va_end(arguments);
    return Make(text::DecodeUTF8Lenient(formatted));
}

CFMutableStringRef CFStringCreateMutable(CFAllocatorRef, CFIndex maxLength) {
    if (!GW_CHECK_ARGUMENT(maxLength >= 0))
        return nullptr;
    return new __CFString(std::u16string(), true);
}

CFMutableStringRef CFStringCreateMutableCopy(CFAllocatorRef, CFIndex maxLength,
                                             CFStringRef string) {
    const __CFString* object = Get(string);
    if (!object || !GW_CHECK_ARGUMENT(maxLength >= 0))
        return nullptr;
    return new __CFString(object->units, true);
}

// ---------------------------------------------------------------------------------------------
// Mutation. Every operation on an immutable string, or with a range outside the string, is
// reported and changes nothing.

void CFStringAppend(CFMutableStringRef string, CFStringRef appended) {
    __CFString* object = GetMutable(string);
    const __CFString* tail = Get(appended);
    if (object && tail)
        object->units += tail->units; // appending a string to itself is fine: += copies first
}

void CFStringAppendCString(CFMutableStringRef string, const char* cString,
                           CFStringEncoding encoding) {
    __CFString* object = GetMutable(string);
    GW_CHECK_ARGUMENT(cString != nullptr);
    if (!object || !cString)
        return;
    std::u16string units;
    if (text::Decode(reinterpret_cast<const uint8_t*>(cString), std::strlen(cString), encoding,
                     false, units))
        object->units += units;
}

void CFStringAppendCharacters(CFMutableStringRef string, const UniChar* chars, CFIndex numChars) {
    __CFString* object = GetMutable(string);
    GW_CHECK_ARGUMENT(numChars >= 0 && (chars != nullptr || numChars == 0));
    if (object && chars && numChars > 0)
        object->units.append(reinterpret_cast<const char16_t*>(chars), size_t(numChars));
}

void CFStringReplace(CFMutableStringRef string, CFRange range, CFStringRef replacement) {
    __CFString* object = GetMutable(string);
    const __CFString* with = Get(replacement);
    if (!object || !with || !RangeInside(range, object->units.size()))
        return;
    std::u16string copy = with->units; // the replacement may be the string itself
    object->units.replace(size_t(range.location), size_t(range.length), copy);
}

void CFStringDelete(CFMutableStringRef string, CFRange range) {
    __CFString* object = GetMutable(string);
    if (object && RangeInside(range, object->units.size()))
        object->units.erase(size_t(range.location), size_t(range.length));
}

void CFStringInsert(CFMutableStringRef string, CFIndex index, CFStringRef inserted) {
    CFStringReplace(string, CFRangeMake(index, 0), inserted);
}

// ---------------------------------------------------------------------------------------------
// Access.

CFIndex CFStringGetLength(CFStringRef string) {
    const __CFString* object = Get(string);
    return object ? CFIndex(object->units.size()) : 0;
}

UniChar CFStringGetCharacterAtIndex(CFStringRef string, CFIndex index) {
    const __CFString* object = Get(string);
    if (!object || !RangeInside(CFRangeMake(index, 1), object->units.size()))
        return 0;
    return object->units[size_t(index)];
}

void CFStringGetCharacters(CFStringRef string, CFRange range, UniChar* buffer) {
    const __CFString* object = Get(string);
    GW_CHECK_ARGUMENT(buffer != nullptr || range.length == 0);
    if (!object || !buffer || !RangeInside(range, object->units.size()))
        return;
    std::memcpy(buffer, object->units.data() + range.location,
                size_t(range.length) * sizeof(UniChar));
}

const UniChar* CFStringGetCharactersPtr(CFStringRef string) {
    const __CFString* object = Get(string);
    return object ? reinterpret_cast<const UniChar*>(object->units.data()) : nullptr;
}

CFIndex CFStringGetBytes(CFStringRef string, CFRange range, CFStringEncoding encoding,
                         UInt8 lossByte, Boolean isExternalRepresentation, UInt8* buffer,
                         CFIndex maxBufLen, CFIndex* usedBufLen) {
    if (usedBufLen)
        *usedBufLen = 0;
    const __CFString* object = Get(string);
    if (!object || !RangeInside(range, object->units.size()))
        return 0;
    text::EncodeResult result;
    std::u16string_view units = Units(object).substr(size_t(range.location), size_t(range.length));
    size_t capacity = maxBufLen > 0 ? size_t(maxBufLen) : 0;
    if (!text::Encode(units, encoding, lossByte, isExternalRepresentation, buffer, capacity,
                      result))
        return 0;
    if (usedBufLen)
        *usedBufLen = CFIndex(result.bytes);
    return CFIndex(result.unitsConverted);
}

Boolean CFStringGetCString(CFStringRef string, char* buffer, CFIndex bufferSize,
                           CFStringEncoding encoding) {
    const __CFString* object = Get(string);
    GW_CHECK_ARGUMENT(buffer != nullptr || bufferSize == 0);
    if (!object || !buffer || bufferSize <= 0)
        return false;
    // Room for the terminator is kept back from the conversion.
    text::EncodeResult result;
    bool converted =
        text::Encode(object->units, encoding, 0, false, reinterpret_cast<uint8_t*>(buffer),
                     size_t(bufferSize - 1), result) &&
        result.unitsConverted == object->units.size();
    buffer[converted ? result.bytes : 0] = '\0';
    return converted;
}

const char* CFStringGetCStringPtr(CFStringRef, CFStringEncoding) {
    return nullptr;
}

CFIndex CFStringGetMaximumSizeForEncoding(CFIndex length, CFStringEncoding encoding) {
    GW_CHECK_ARGUMENT(length >= 0);
    size_t perUnit = text::MaxBytesPerUnit(encoding);
    if (length < 0 || perUnit == 0 || size_t(length) > size_t(LONG_MAX) / perUnit)
        return kCFNotFound;
    return length * CFIndex(perUnit);
}

CFIndex CFStringGetMaximumSizeOfFileSystemRepresentation(CFStringRef string) {
    return 3 * CFStringGetLength(string) + 1;
}

Boolean CFStringGetFileSystemRepresentation(CFStringRef string, char* buffer, CFIndex maxBufLen) {
    const __CFString* object = Get(string);
    if (!object)
        return false;
    // A path cannot hold a zero byte: refuse rather than hand out a shortened path.
    if (object->units.find(u'\0') != std::u16string::npos) {
        if (buffer && maxBufLen > 0)
            buffer[0] = '\0';
        return false;
    }
    return CFStringGetCString(string, buffer, maxBufLen, kCFStringEncodingUTF8);
}

// ---------------------------------------------------------------------------------------------
// Comparison and search.

CFComparisonResult CFStringCompare(CFStringRef a, CFStringRef b, CFStringCompareFlags options) {
    return CompareUnits(Units(Get(a)), Units(Get(b)), options);
}

CFComparisonResult CFStringCompareWithOptions(CFStringRef a, CFStringRef b, CFRange rangeToCompare,
                                              CFStringCompareFlags options) {
    std::u16string_view units = Units(Get(a));
    if (!RangeInside(rangeToCompare, units.size()))
        return kCFCompareLessThan;
    return CompareUnits(
        units.substr(size_t(rangeToCompare.location), size_t(rangeToCompare.length)), Units(Get(b)),
        options);
}

Boolean CFStringFindWithOptions(CFStringRef string, CFStringRef toFind, CFRange rangeToSearch,
                                CFStringCompareFlags options, CFRange* result) {
    const __CFString* haystackObject = Get(string);
    const __CFString* needleObject = Get(toFind);
    if (!haystackObject || !needleObject ||
        !RangeInside(rangeToSearch, haystackObject->units.size()))
        return false;
    std::u16string_view haystack =
        Units(haystackObject).substr(size_t(rangeToSearch.location), size_t(rangeToSearch.length));
    std::u16string_view needle = Units(needleObject);
    if (needle.empty() || needle.size() > haystack.size())
        return false;

    const bool fold = options & kCFCompareCaseInsensitive;
    const bool backwards = options & kCFCompareBackwards;
    const bool anchored = options & kCFCompareAnchored;
    const size_t last = haystack.size() - needle.size(); // the last possible start
    // Anchored: only the first start (the last one when searching backwards) is tried.
    size_t first = backwards ? last : 0;
    size_t count = anchored ? 1 : last + 1;
    for (size_t step = 0; step < count; ++step) {
        size_t start = backwards ? first - step : first + step;
        if (UnitsMatch(haystack.substr(start, needle.size()), needle, fold)) {
            if (result)
                *result =
                    CFRangeMake(rangeToSearch.location + CFIndex(start), CFIndex(needle.size()));
            return true;
        }
    }
    return false;
}

CFRange CFStringFind(CFStringRef string, CFStringRef toFind, CFStringCompareFlags options) {
    CFRange found{kCFNotFound, 0};
    CFStringFindWithOptions(string, toFind, CFRangeMake(0, CFStringGetLength(string)), options,
                            &found);
    return found;
}

Boolean CFStringHasPrefix(CFStringRef string, CFStringRef prefix) {
    return CFStringFindWithOptions(string, prefix, CFRangeMake(0, CFStringGetLength(string)),
                                   kCFCompareAnchored, nullptr);
}

Boolean CFStringHasSuffix(CFStringRef string, CFStringRef suffix) {
    return CFStringFindWithOptions(string, suffix, CFRangeMake(0, CFStringGetLength(string)),
                                   kCFCompareAnchored | kCFCompareBackwards, nullptr);
}

std::optional<std::string> glyphwell::UTF8String(CFStringRef string, UInt8 lossByte) {
    if (!string)
        return std::nullopt;
    const __CFString* object = Get(string);
    if (!object)
        return std::nullopt;
    std::string bytes;
    if (text::EncodeUTF8(object->units, bytes))
        return bytes;
    if (lossByte == 0)
        return std::nullopt;
    text::EncodeResult result;
    text::Encode(object->units, kCFStringEncodingUTF8, lossByte, false, nullptr, 0, result);
    bytes.assign(result.bytes, '\0');
    text::Encode(object->units, kCFStringEncodingUTF8, lossByte, false,
                 reinterpret_cast<uint8_t*>(bytes.data()), bytes.size(), result);
    return bytes;
}

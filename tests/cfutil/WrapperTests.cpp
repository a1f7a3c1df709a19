// The property-value wrappers: who owns which count, what Orphan hands out, and what the
// constructors create.
#include <string>

#include <gtest/gtest.h>

#include "cfutil/TCFArray.h"
#include "cfutil/TCFData.h"
#include "cfutil/TCFDictionary.h"
#include "cfutil/TCFError.h"
#include "cfutil/TCFNumber.h"
#include "cfutil/TCFRetained.h"
#include "cfutil/TCFSet.h"
#include "cfutil/TCFString.h"
#include "cfutil/TCFURL.h"
#include "cfutil/TUTF8Buffer.h"
#include "platform/PropertyValues.h"
#include "support/Values.h"

namespace {

/// A new string with one count (not a shared constant, so its count can be watched).
CFStringRef NewString(const char* text) {
    return CFStringCreateWithCString(kCFAllocatorDefault, text, kCFStringEncodingUTF8);
}

// The wrappers cost one reference each (the sorted array adds its comparison and context).
static_assert(sizeof(TCFAdopted<CFStringRef>) == sizeof(void*));
static_assert(sizeof(TCFMutableDictionary) == sizeof(void*));
static_assert(sizeof(TCFMutableArray) == sizeof(void*));
static_assert(sizeof(TCFLazyMutableArray) == sizeof(void*));
static_assert(sizeof(TCFSortedArray) == 3 * sizeof(void*));
static_assert(sizeof(TCFMutableString) == sizeof(void*));

} // namespace

TEST(Retained, CountsFollowRetainAdoptCopyAssignAndSwap) {
    CFStringRef first = NewString("first"), second = NewString("second");
    {
        TCFRetained<CFStringRef> retained(first), copy(retained), empty;
        TCFAdopted<CFStringRef> adopted(TCFRetain(first));
        EXPECT_EQ(CFGetRetainCount(first), 4);
        copy = copy;
        EXPECT_EQ(CFGetRetainCount(first), 4);
        copy.Adopt(TCFRetain(second));
        EXPECT_EQ(CFGetRetainCount(first), 3);
        retained = copy;
        EXPECT_EQ(CFGetRetainCount(first), 2);
        EXPECT_EQ(CFGetRetainCount(second), 3);
        empty.Swap(retained);
        EXPECT_TRUE(!retained && empty && empty.Get() == second);
        EXPECT_EQ(static_cast<CFStringRef>(adopted), first);
    }
    EXPECT_EQ(CFGetRetainCount(first), 1);
    EXPECT_EQ(CFGetRetainCount(second), 1);
    CFRelease(first);
    CFRelease(second);
}

TEST(OwningWrappers, StringAdoptsWhileDataArraySetAndUrlRetain) {
    CFStringRef string = NewString("adopted");
    { TCFString adopted(TCFRetain(string)); }
    EXPECT_EQ(CFGetRetainCount(string), 1);
    CFRelease(string);

    const UInt8 bytes[] = {1, 2, 3};
    CFTypeRef values[] = {CFDataCreate(nullptr, bytes, 3),
                          CFArrayCreate(nullptr, nullptr, 0, &kCFTypeArrayCallBacks),
                          CFSetCreate(nullptr, nullptr, 0, &kCFTypeSetCallBacks),
                          CFURLCreateWithString(nullptr, CFSTR("file:///tmp/x"), nullptr)};
    {
        TCFData data(static_cast<CFDataRef>(values[0]));
        TCFArray<CFStringRef> array(static_cast<CFArrayRef>(values[1]));
        TCFSet<CFStringRef> set(static_cast<CFSetRef>(values[2]));
        TCFURL url(static_cast<CFURLRef>(values[3]));
        for (CFTypeRef value : values)
            EXPECT_EQ(CFGetRetainCount(value), 2);
    }
    for (CFTypeRef value : values) {
        EXPECT_EQ(CFGetRetainCount(value), 1);
        CFRelease(value);
    }
}

TEST(OwningWrappers, OrphanHandsOutTheCountAndLeavesNothingToRelease) {
    TCFString string(NewString("s"));
    TCFMutableDictionary dictionary;
    TCFArray<CFStringRef> array(CFArrayCreate(kCFAllocatorDefault, nullptr, 0, nullptr), kAdopted);
    TCFURL url(CFSTR("/tmp/x"), kIsFile, nullptr);
    TCFError error(CFSTR("Domain"), 7, nullptr);
    TCFNumber number(SInt64(5));
    TCFData data(nullptr);
    TCFMutableSet set;

    CFTypeRef orphans[] = {string.Orphan(), dictionary.Orphan(), array.Orphan(), url.Orphan(),
                           error.Orphan(),  number.Orphan(),     set.Orphan()};
    for (CFTypeRef orphan : orphans) {
        ASSERT_NE(orphan, nullptr);
        EXPECT_EQ(CFGetRetainCount(orphan), 1);
    }
    EXPECT_TRUE(!string && !url && !error);
    EXPECT_EQ(data.Orphan(), nullptr);
    // The wrappers are destroyed after the orphans' counts are given back here; a release by a
    // wrapper would be a use after free.
    for (CFTypeRef orphan : orphans)
        CFRelease(orphan);
}

TEST(OwningWrappers, ConstructorsMakeWhatTheyName) {
    const UInt8 utf8WithMark[] = {0xEF, 0xBB, 0xBF, 'a', 'b'}, invalid[] = {0xFF};
    EXPECT_EQ(TCFString(utf8WithMark, 5, kCFStringEncodingUTF8).GetLength(), 3); // mark is text
    EXPECT_FALSE(TCFString(invalid, 1, kCFStringEncodingUTF8));

    TCFURL file(CFSTR("/tmp/folder/"), kIsFile, nullptr);
    ASSERT_TRUE(file);
    EXPECT_FALSE(CFURLHasDirectoryPath(file));
    TCFAdopted<CFStringRef> path(CFURLCopyFileSystemPath(file, kCFURLPOSIXPathStyle));
    EXPECT_EQ(glyphwell::testing::TextOf(path), "/tmp/folder");

    CFStringRef key = NewString("key"), value = NewString("value");
    const void* keys[] = {key};
    const void* values[] = {value};
    {
        TCFDictionary dictionary(keys, values, 1);
        EXPECT_EQ(dictionary.GetValue(CFSTR("key")), value);
        EXPECT_EQ(CFGetRetainCount(value), 2);
        const void* outKeys[1] = {};
        const void* outValues[1] = {};
        dictionary.GetKeysAndValues(outKeys, outValues);
        EXPECT_TRUE(outKeys[0] == key && outValues[0] == value);
    }
    EXPECT_EQ(CFGetRetainCount(key) + CFGetRetainCount(value), 2);
    CFRelease(key);
    CFRelease(value);
}

TEST(ArrayWrappers, MutableArrayConstructors) {
    const void* values[] = {CFSTR("a"), CFSTR("b"), CFSTR("c")};
    EXPECT_EQ(TCFMutableArray(0).GetCount(), 0);
    TCFMutableArray filled(3, values, &kCFTypeArrayCallBacks);
    ASSERT_EQ(filled.GetCount(), 3);
    EXPECT_TRUE(filled.At(0) == values[0] && filled.At(2) == values[2]);

    TCFMutableArray copy(static_cast<CFArrayRef>(filled), 0);
    EXPECT_NE(copy.GetMutable(), filled.GetMutable());
    EXPECT_EQ(copy.GetCount(), 3);
    EXPECT_NE(TCFMutableArray(static_cast<CFArrayRef>(nullptr), 0).GetMutable(), nullptr);
    EXPECT_NE(TCFMutableArray(static_cast<CFMutableArrayRef>(nullptr)).GetMutable(), nullptr);

    CFIndex countBefore = CFGetRetainCount(filled);
    {
        TCFMutableArray shared(filled.GetMutable());
        EXPECT_EQ(shared.GetMutable(), filled.GetMutable());
        EXPECT_EQ(CFGetRetainCount(filled), countBefore + 1);
    }
    EXPECT_EQ(CFGetRetainCount(filled), countBefore);
}

TEST(ArrayWrappers, LazyArrayExistsOnlyAfterFirstAppend) {
    TCFLazyMutableArray array;
    EXPECT_EQ(array.GetCount(), 0);
    EXPECT_EQ(array.GetMutable(), nullptr);
    EXPECT_EQ(array.Orphan(), nullptr);
    array.Append(CFSTR("a"));
    array.Append(CFSTR("b"));
    TCFArray<CFStringRef> orphan(array.Orphan(), kAdopted);
    EXPECT_EQ(orphan.GetCount(), 2);
    EXPECT_EQ(array.GetCount(), 0);
}

TEST(SetWrappers, MutableSetAddsDistinctValuesAndRemoves) {
    TCFMutableSet set;
    CFStringRef value = NewString("a");
    set.AddValue(value);
    set.AddValue(CFSTR("a"));
    set.AddValue(CFSTR("b"));
    EXPECT_EQ(set.GetCount(), 2);
    EXPECT_EQ(CFGetRetainCount(value), 2);
    set.RemoveValue(CFSTR("a"));
    EXPECT_EQ(CFGetRetainCount(value), 1);
    EXPECT_TRUE(!set.ContainsValue(CFSTR("a")) && set.ContainsValue(CFSTR("b")));
    CFRelease(value);

    TCFMutableSet adopted(CFSetCreateMutableCopy(kCFAllocatorDefault, 0, set), kAdopted);
    EXPECT_EQ(adopted.GetCount(), 1);
    EXPECT_NE(adopted.GetMutable(), set.GetMutable());
}

TEST(UTF8Buffer, HoldsTheUTF8PathOfAnyLengthAndNothingForNull) {
    EXPECT_EQ(TUTF8Buffer(nullptr).GetCount(), 0u);
    TUTF8Buffer empty(CFSTR(""));
    EXPECT_GE(empty.GetCount(), 1u);
    EXPECT_STREQ(empty.GetBuffer(), "");
    EXPECT_STREQ(TUTF8Buffer(CFSTR("/tmp/caf\u00e9")).GetBuffer(), "/tmp/caf\xC3\xA9");

    std::string longPath = "/" + std::string(600, 'x');
    TCFString string(NewString(longPath.c_str()));
    TUTF8Buffer buffer(string);
    EXPECT_GT(buffer.GetCount(), 601u);
    EXPECT_EQ(std::string(buffer.GetBuffer()), longPath);
}

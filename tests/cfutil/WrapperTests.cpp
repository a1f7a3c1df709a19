// The property-value wrappers: who owns which count, how null references read, and what the
// constructors create.
#include <cstring>
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

TEST(Retained, RetainingConstructorAddsACountAndAdoptingDoesNot) {
    CFStringRef string = NewString("held");
    {
        TCFRetained<CFStringRef> retained(string);
        EXPECT_EQ(CFGetRetainCount(string), 2);
        TCFRetained<CFStringRef> copy(retained);
        EXPECT_EQ(CFGetRetainCount(string), 3);
    }
    EXPECT_EQ(CFGetRetainCount(string), 1);
    {
        TCFRetained<CFStringRef> adopted(TCFRetain(string), kAdopted);
        TCFAdopted<CFStringRef> alsoAdopted(TCFRetain(string));
        EXPECT_EQ(CFGetRetainCount(string), 3);
        EXPECT_EQ(static_cast<CFStringRef>(alsoAdopted), string);
    }
    EXPECT_EQ(CFGetRetainCount(string), 1);
    CFRelease(string);
}

TEST(Retained, AdoptReleasesThePreviousReference) {
    CFStringRef first = NewString("first");
    CFStringRef second = NewString("second");
    TCFRetained<CFStringRef> retained(first);
    retained.Adopt(TCFRetain(second));
    EXPECT_EQ(CFGetRetainCount(first), 1);
    EXPECT_EQ(CFGetRetainCount(second), 2);
    CFRelease(first);
    CFRelease(second);
}

TEST(SafeEqual, ComparesNullsByIdentityAndValuesByContent) {
    TCFString a(NewString("same"));
    TCFString b(NewString("same"));
    TCFString c(NewString("other"));
    ASSERT_NE(static_cast<CFStringRef>(a), static_cast<CFStringRef>(b));

    EXPECT_TRUE(TCFSafeEqual(nullptr, nullptr));
    EXPECT_FALSE(TCFSafeEqual(a, nullptr));
    EXPECT_FALSE(TCFSafeEqual(nullptr, a));
    EXPECT_TRUE(TCFSafeEqual(a, a));
    EXPECT_TRUE(TCFSafeEqual(a, b));
    EXPECT_FALSE(TCFSafeEqual(a, c));
}

TEST(OwningWrappers, StringAdoptsWhileDataArraySetAndUrlRetain) {
    CFStringRef string = NewString("adopted");
    CFRetain(string); // our own count, to watch the wrapper's
    { TCFString adopted(string); }
    EXPECT_EQ(CFGetRetainCount(string), 1);
    CFRelease(string);

    const UInt8 bytes[] = {1, 2, 3};
    CFDataRef data = CFDataCreate(kCFAllocatorDefault, bytes, 3);
    CFArrayRef array = CFArrayCreate(kCFAllocatorDefault, nullptr, 0, &kCFTypeArrayCallBacks);
    CFSetRef set = CFSetCreate(kCFAllocatorDefault, nullptr, 0, &kCFTypeSetCallBacks);
    CFURLRef url = CFURLCreateWithString(kCFAllocatorDefault, CFSTR("file:///tmp/x"), nullptr);
    {
        TCFData dataWrapper(data);
        TCFArray<CFStringRef> arrayWrapper(array);
        TCFSet<CFStringRef> setWrapper(set);
        TCFURL urlWrapper(url);
        for (CFTypeRef value : {CFTypeRef(data), CFTypeRef(array), CFTypeRef(set), CFTypeRef(url)})
            EXPECT_EQ(CFGetRetainCount(value), 2);
    }
    for (CFTypeRef value : {CFTypeRef(data), CFTypeRef(array), CFTypeRef(set), CFTypeRef(url)}) {
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
    EXPECT_EQ(static_cast<CFStringRef>(string), nullptr);
    EXPECT_EQ(static_cast<CFURLRef>(url), nullptr);
    EXPECT_EQ(data.Orphan(), nullptr);
    // The wrappers are destroyed after the orphans' counts are given back here; a release by a
    // wrapper would be a use after free.
    for (CFTypeRef orphan : orphans)
        CFRelease(orphan);
}

TEST(StringWrappers, BytesAreDecodedAsPlainText) {
    const UInt8 utf8WithMark[] = {0xEF, 0xBB, 0xBF, 'a', 'b'};
    TCFString string(utf8WithMark, sizeof utf8WithMark, kCFStringEncodingUTF8);
    EXPECT_EQ(string.GetLength(), 3); // the byte-order mark stays text
    const UInt8 invalid[] = {0xFF};
    EXPECT_EQ(static_cast<CFStringRef>(TCFString(invalid, 1, kCFStringEncodingUTF8)), nullptr);
}

TEST(DictionaryWrappers, CreatedDictionaryRetainsKeysAndValues) {
    CFStringRef key = NewString("key");
    CFStringRef value = NewString("value");
    const void* keys[] = {key};
    const void* values[] = {value};
    {
        TCFDictionary dictionary(keys, values, 1);
        EXPECT_EQ(dictionary.GetCount(), 1);
        EXPECT_EQ(dictionary.GetValue(CFSTR("key")), value);
        EXPECT_EQ(CFGetRetainCount(value), 2);
        const void* outKeys[1] = {};
        const void* outValues[1] = {};
        dictionary.GetKeysAndValues(outKeys, outValues);
        EXPECT_EQ(outKeys[0], key);
        EXPECT_EQ(outValues[0], value);
    }
    EXPECT_EQ(CFGetRetainCount(key), 1);
    EXPECT_EQ(CFGetRetainCount(value), 1);
    CFRelease(key);
    CFRelease(value);
}

TEST(ArrayWrappers, MutableArrayConstructors) {
    const void* values[] = {CFSTR("a"), CFSTR("b"), CFSTR("c")};
    TCFMutableArray empty(0);
    EXPECT_EQ(empty.GetCount(), 0);

    TCFMutableArray filled(3, values, &kCFTypeArrayCallBacks);
    ASSERT_EQ(filled.GetCount(), 3);
    EXPECT_EQ(filled.At(0), values[0]);
    EXPECT_EQ(filled.At(2), values[2]);

    TCFMutableArray copy(static_cast<CFArrayRef>(filled), 0);
    EXPECT_NE(copy.GetMutable(), filled.GetMutable());
    EXPECT_EQ(copy.GetCount(), 3);
    TCFMutableArray fromNull(static_cast<CFArrayRef>(nullptr), 0);
    EXPECT_NE(fromNull.GetMutable(), nullptr);

    CFIndex countBefore = CFGetRetainCount(filled);
    {
        TCFMutableArray shared(filled.GetMutable());
        EXPECT_EQ(shared.GetMutable(), filled.GetMutable());
        EXPECT_EQ(CFGetRetainCount(filled), countBefore + 1);
    }
    EXPECT_EQ(CFGetRetainCount(filled), countBefore);
    TCFMutableArray sharedNull(static_cast<CFMutableArrayRef>(nullptr));
    EXPECT_NE(sharedNull.GetMutable(), nullptr);
}

TEST(ArrayWrappers, LazyArrayExistsOnlyAfterFirstAppend) {
    TCFLazyMutableArray untouched;
    EXPECT_EQ(untouched.GetCount(), 0);
    EXPECT_EQ(untouched.GetMutable(), nullptr);
    EXPECT_EQ(untouched.Orphan(), nullptr);

    TCFLazyMutableArray array;
    array.Append(CFSTR("a"));
    array.Append(CFSTR("b"));
    EXPECT_EQ(array.GetCount(), 2);
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
    EXPECT_FALSE(set.ContainsValue(CFSTR("a")));
    EXPECT_TRUE(set.ContainsValue(CFSTR("b")));
    CFRelease(value);

    TCFMutableSet adopted(CFSetCreateMutableCopy(kCFAllocatorDefault, 0, set), kAdopted);
    EXPECT_EQ(adopted.GetCount(), 1);
    EXPECT_NE(adopted.GetMutable(), set.GetMutable());
}

TEST(URLWrapper, FilePathIsNeverADirectory) {
    TCFURL file(CFSTR("/tmp/folder/"), kIsFile, nullptr);
    ASSERT_NE(static_cast<CFURLRef>(file), nullptr);
    EXPECT_FALSE(CFURLHasDirectoryPath(file));
    TCFAdopted<CFStringRef> path(CFURLCopyFileSystemPath(file, kCFURLPOSIXPathStyle));
    EXPECT_EQ(glyphwell::testing::TextOf(path), "/tmp/folder");
}

TEST(UTF8Buffer, NullGivesNoTextAndEmptyGivesEmptyCString) {
    EXPECT_EQ(TUTF8Buffer(nullptr).GetCount(), 0u);
    TUTF8Buffer buffer(CFSTR(""));
    EXPECT_GE(buffer.GetCount(), 1u);
    EXPECT_STREQ(buffer.GetBuffer(), "");
}

TEST(UTF8Buffer, HoldsUTF8PathOfAnyLength) {
    TUTF8Buffer accented(CFSTR("/tmp/caf\u00e9"));
    EXPECT_STREQ(accented.GetBuffer(), "/tmp/caf\xC3\xA9");

    std::string longPath = "/" + std::string(600, 'x');
    TCFString string(NewString(longPath.c_str()));
    TUTF8Buffer buffer(string);
    EXPECT_GT(buffer.GetCount(), 601u);
    EXPECT_EQ(std::string(buffer.GetBuffer()), longPath);
}

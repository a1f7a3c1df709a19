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
#include "cfutil/TCFString.h"
#include "cfutil/TCFURL.h"
#include "cfutil/TUTF8Buffer.h"
#include "platform/PropertyValues.h"
#include "support/Values.h"

using glyphwell::testing::Ref;
using glyphwell::testing::TextOf;

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

// Every owning wrapper is built on TCFReferenceHolder, so its counting is tested here once.
TEST(Retained, CountsFollowRetainAdoptCopyAssignSwapAndOrphan) {
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
        EXPECT_EQ((std::pair{CFGetRetainCount(first), CFGetRetainCount(second)}),
                  std::pair(2L, 3L));
        empty.Swap(retained);
        EXPECT_TRUE(!retained && empty && empty.Get() == second);
        // The orphan keeps its count after the holder is gone; a release by the holder would
        // show as a count of 1 below.
        EXPECT_EQ(adopted.Orphan(), first);
        EXPECT_TRUE(!adopted && !TCFRetained<CFStringRef>().Orphan());
    }
    EXPECT_EQ((std::pair{CFGetRetainCount(first), CFGetRetainCount(second)}), std::pair(2L, 1L));
    CFRelease(first);
    CFRelease(first);
    CFRelease(second);
}

// The retaining and adopting constructors of the other wrappers are the holder's own.
TEST(OwningWrappers, ConstructorsMakeWhatTheyName) {
    CFStringRef string = NewString("adopted");
    { TCFString adopted(TCFRetain(string)); }
    EXPECT_EQ(CFGetRetainCount(string), 1);
    CFRelease(string);

    const UInt8 utf8WithMark[] = {0xEF, 0xBB, 0xBF, 'a', 'b'}, invalid[] = {0xFF};
    EXPECT_EQ(TCFString(utf8WithMark, 5, kCFStringEncodingUTF8).GetLength(), 3); // mark is text
    EXPECT_FALSE(TCFString(invalid, 1, kCFStringEncodingUTF8));

    TCFError error(CFSTR("Domain"), 7, nullptr);
    EXPECT_EQ((std::pair{CFGetRetainCount(error), CFErrorGetCode(error)}), std::pair(1L, 7L));

    // A file URL, never a directory URL.
    EXPECT_EQ(TextOf(TCFURL(CFSTR("/tmp/folder/"), kIsFile, nullptr)), "file:///tmp/folder");

    Ref key(NewString("key")), value(NewString("value"));
    const void* keys[] = {key.get()};
    const void* values[] = {value.get()};
    {
        TCFDictionary dictionary(keys, values, 1);
        EXPECT_EQ(dictionary.GetValue(CFSTR("key")), value.get());
        EXPECT_EQ(CFGetRetainCount(value.get()), 2);
    }
    EXPECT_EQ(CFGetRetainCount(key.get()) + CFGetRetainCount(value.get()), 2);
}

TEST(ArrayWrappers, ConstructorsCopyWrapOrCreateAndTheLazyArrayExistsAfterItsFirstAppend) {
    const void* values[] = {CFSTR("a"), CFSTR("b"), CFSTR("c")};
    TCFMutableArray filled(3, values, &kCFTypeArrayCallBacks);
    EXPECT_TRUE(filled.GetCount() == 3 && filled.At(0) == values[0] && filled.At(2) == values[2]);
    TCFMutableArray copy(static_cast<CFArrayRef>(filled), 0);
    EXPECT_TRUE(copy.GetMutable() != filled.GetMutable() && copy.GetCount() == 3);
    EXPECT_EQ(TCFMutableArray(filled.GetMutable()).GetMutable(), filled.GetMutable());
    EXPECT_NE(TCFMutableArray(static_cast<CFArrayRef>(nullptr), 0).GetMutable(), nullptr);
    EXPECT_NE(TCFMutableArray(static_cast<CFMutableArrayRef>(nullptr)).GetMutable(), nullptr);

    TCFLazyMutableArray array;
    EXPECT_TRUE(array.GetCount() == 0 && !array.GetMutable() && !array.Orphan());
    array.Append(CFSTR("a"));
    array.Append(CFSTR("b"));
    TCFArray<CFStringRef> orphan(array.Orphan(), kAdopted);
    EXPECT_EQ((std::pair{orphan.GetCount(), array.GetCount()}), std::pair(2L, 0L));
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

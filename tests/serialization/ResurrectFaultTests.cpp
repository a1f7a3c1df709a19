// The reader under allocation failure: every allocation of a read, in turn, fails once; the read
// then never gives the whole value, never crashes and never leaks (the suite runs under
// LeakSanitizer).
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "serialization/TCFResurrectContext.h"
#include "support/FailingAllocator.h"
#include "support/FlattenedBytes.h"
#include "support/LogCapture.h"
#include "support/Values.h"

namespace {

using namespace glyphwell::testing;

/// A value that makes the reader allocate in every way it can: containers past their inline
/// tables, strings new to the uniquer, numbers, data, URLs, a character set and an error.
Ref RichValue() {
    Ref list(CFArrayCreateMutable(nullptr, 0, &kCFTypeArrayCallBacks));
    for (int i = 0; i < 40; ++i)
        CFArrayAppendValue(list.as<CFMutableArrayRef>(),
                           Str("fault-injection-text-" + std::to_string(i)).get());
    Ref number = Num(kCFNumberSInt32Type, 7);
    const UInt8 bytes[] = {1, 2, 3};
    Ref data(CFDataCreate(nullptr, bytes, 3));
    Ref url(CFURLCreateWithString(nullptr, CFSTR("https://example.org/a"), nullptr));
    Ref set = Set({number.get(), CFArrayGetValueAtIndex(list.as<CFArrayRef>(), 0)});
    Ref characters(CFCharacterSetCreateWithCharactersInRange(nullptr, CFRangeMake(0x41, 26)));
    Ref error(CFErrorCreate(nullptr, CFSTR("FaultDomain"), 3, nullptr));
    return Dict({{CFSTR("list"), list.get()},
                 {CFSTR("number"), number.get()},
                 {CFSTR("data"), data.get()},
                 {CFSTR("url"), url.get()},
                 {CFSTR("set"), set.get()},
                 {CFSTR("characters"), characters.get()},
                 {CFSTR("error"), error.get()}});
}

TEST(ResurrectFaults, EveryFailedAllocationStopsTheReadAsCorruptWithoutLeaks) {
    Ref value = RichValue();
    const std::vector<uint8_t> stream = FlattenedBytes(value.get());
    const UInt8* bytes = stream.data();
    const unsigned long length = stream.size();

    long failures = 0;
    for (long nth = 0;; ++nth) {
        LogCapture log;
        TCFResurrectContext reader(bytes, length);
        gAllocationsBeforeFailure = nth;
        Ref result(reader.Resurrect(kTCFTypeAny));
        const bool failed = gAllocationsBeforeFailure == -1;
        gAllocationsBeforeFailure = -1;
        if (!failed) { // the read needed fewer than nth + 1 allocations: it saw no failure
            ASSERT_TRUE(CFEqual(result.get(), value.get()));
            break;
        }
        ++failures;
        // The read stops as at corrupt input ("memory"), or the element that could not be made
        // is missing (a character set whose bitmap could not be expanded): never the whole value.
        EXPECT_TRUE(!result || !CFEqual(result.get(), value.get())) << nth;
        if (reader.IsCorrupted()) {
            EXPECT_EQ(log.Texts().front(), "ERROR: Quzel got corrupted data. (memory)") << nth;
        }
    }
    EXPECT_GT(failures, 10);
}

} // namespace

#include <gtest/gtest.h>

#include <syslog.h>

#include <atomic>
#include <climits>
#include <cstddef>
#include <cstdint>
#include <string>
#include <thread>
#include <tuple>
#include <utility>
#include <vector>

#include "platform/CFNumber.h"
#include "platform/Log.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Values.h"

namespace {

using glyphwell::Format;
using glyphwell::LogChannel;
using glyphwell::LogRecord;
using glyphwell::testing::LogCapture;

TEST(Format, FormatsLikePrintf) {
    const std::string padded = Format("%300d", 1), long_(1000, 'k');
    const glyphwell::testing::Ref number = glyphwell::testing::Num(kCFNumberFloat64Type, 1.5);
    int count = -1;
    const std::pair<std::string, std::string> cases[] = {
        {Format("%d|%5.2f|%-4s|%x|%llu|%c|%%", 42, 3.14159, "ab", 255, 18446744073709551615ULL,
                'Z'),
         "42| 3.14|ab  |ff|18446744073709551615|Z|%"},
        {Format("%i %u %o %X", -3, 4000000000U, 8U, 0xabcU), "-3 4000000000 10 ABC"},
        // Length modifiers take the matching argument type.
        {Format("%hhd %hhu %hd %hu", 300, 257, 70000, 65537), "44 1 4464 1"},
        {Format("%ld %lu %lld", -7L, 7UL, LLONG_MIN), "-7 7 -9223372036854775808"},
        {Format("%zu %zd %jd %ju %td %tx", SIZE_MAX, ptrdiff_t(-3), INTMAX_MIN, UINTMAX_MAX,
                ptrdiff_t(-5), ptrdiff_t(255)),
         "18446744073709551615 -3 -9223372036854775808 18446744073709551615 -5 ff"},
        {Format("%Lf %Lg %lf", 1.5L, 0.25L, 2.0), "1.500000 0.25 2.000000"},
        {Format("%ls %lc", L"wide", wint_t(L'w')), "wide w"},
        {Format("%a %A %E %G %e %g %F %f", 1.0, 2.0, 1.5, 0.0001, 12345.678, 1e-5, 2.5, -0.125),
         "0x1p+0 0X1P+1 1.500000E+00 0.0001 1.234568e+04 1e-05 2.500000 -0.125000"},
        {Format("[%+d][% d][%05d][%#x][%#o][%-6d][%*d][%-*d][%.*s][%.3d][%.*f]", 5, 5, 42, 255, 8U,
                7, -4, 3, 4, 3, 2, "xyz", 7, -1, 0.5),
         "[+5][ 5][00042][0xff][010][7     ][3   ][3   ][xy][007][0.500000]"},
        {Format("%p %p", nullptr, reinterpret_cast<void*>(0x1234)), "(nil) 0x1234"},
        {Format("<%s>", static_cast<const char*>(nullptr)), "<(null)>"},
        {padded, std::string(299, ' ') + "1"},
        {Format("[%s]", long_.c_str()), "[" + long_ + "]"},
        // Broken directives are copied as they stand.
        {Format("%y and %1$d and 100%", 5), "%y and %1$d and 100%"},
        {Format("%Ld|%hf|%d", 1, 2), "%Ld|%hf|1"},
        {Format("%99999999999d|%d", 3), "%99999999999d|3"},
        {glyphwell::Format(nullptr), ""},
        // An object directive inserts the description.
        {Format("n=%@ b=%@ z=%@ d=%d", number.get(), kCFBooleanTrue, nullptr, 9),
         "n=1.5 b=true z=(null) d=9"},
        {Format("[%6@][%-6@][%.2@]", kCFBooleanTrue, kCFBooleanTrue, kCFBooleanFalse),
         "[  true][true  ][fa]"},
        {Format("a%nb%d", &count, 5), "ab5"}, // the count directive writes nothing
    };
    for (const auto& [formatted, expected] : cases)
        EXPECT_EQ(formatted, expected);
    EXPECT_EQ(count, -1);
}

TEST(LogSink, EachChannelReachesTheSinkWithItsLevel) {
    LogCapture log;
    double value = 1.5;
    CFNumberRef number = CFNumberCreate(nullptr, kCFNumberFloat64Type, &value);
    CFLog(kCFLogLevelError, "value %@", number);
    glyphwell::SystemLog(LOG_ERR, "sys %d", 1);
    glyphwell::AppLog("app %s", "x");
    glyphwell::LogLine(LogChannel::Platform, kCFLogLevelDebug, "plain");
    CFRelease(number);

    std::vector<std::tuple<LogChannel, int, std::string>> lines;
    for (const LogCapture::Line& line : log.Lines())
        lines.emplace_back(line.channel, line.level, line.text);
    EXPECT_EQ(lines, (decltype(lines){{LogChannel::Platform, 3, "value 1.5"},
                                      {LogChannel::System, 3, "sys 1"},
                                      {LogChannel::Application, 0, "app x"},
                                      {LogChannel::Platform, 7, "plain"}}));
}

TEST(LogSink, SetReturnsThePreviousSinkAndEmptyRestoresTheDefault) {
    int first = 0, second = 0;
    glyphwell::LogSink original = glyphwell::SetLogSink([&first](const LogRecord&) { ++first; });
    glyphwell::LogSink previous = glyphwell::SetLogSink([&second](const LogRecord&) { ++second; });
    glyphwell::AppLog("to second");
    previous(LogRecord{LogChannel::Application, 0, "direct"}); // the first sink came back
    EXPECT_EQ(first, 1);
    EXPECT_EQ(second, 1);

    // The empty sink writes to standard error; so do lines logged inside a sink.
    glyphwell::SetLogSink({});
    ::testing::internal::CaptureStderr();
    glyphwell::AppLog("to stderr %d", 2);
    glyphwell::SetLogSink([&second](const LogRecord& record) {
        ++second;
        glyphwell::AppLog("inner after %s", std::string(record.text).c_str());
    });
    glyphwell::AppLog("outer");
    EXPECT_EQ(::testing::internal::GetCapturedStderr(), "to stderr 2\ninner after outer\n");
    EXPECT_EQ(second, 2);
    glyphwell::SetLogSink(original);
}

TEST(LogSink, ASinkMayReplaceItselfWhileRunning) {
    LogCapture log;
    std::string kept(100, 'k'); // captured by value: freed early if the running sink were freed
    std::string seen;
    glyphwell::LogSink outer = glyphwell::SetLogSink([kept, &seen](const LogRecord& record) {
        glyphwell::SetLogSink({});
        seen = kept + std::string(record.text);
    });
    glyphwell::AppLog("x");
    EXPECT_EQ(seen, kept + "x");
    glyphwell::SetLogSink(outer);
}

TEST(LogSink, LinesFromManyThreadsArriveWhole) {
    LogCapture log;
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t)
        threads.emplace_back([t] {
            for (int i = 0; i < 200; ++i)
                glyphwell::AppLog("thread %d line %d", t, i);
        });
    for (std::thread& thread : threads)
        thread.join();
    std::vector<std::string> texts = log.Texts();
    ASSERT_EQ(texts.size(), 800u);
    for (const std::string& text : texts)
        EXPECT_EQ(text.rfind("thread ", 0), 0u) << text;
}

// A failed assertion logs two application lines (the macro names function, file and line) and
// the program goes on; one that holds logs nothing.
TEST(Assertion, FailureLogsTwoApplicationLinesAndGoesOn) {
    LogCapture log;
    int count = 2;
    GW_ASSERT(count == 2);
    const int line = __LINE__ + 1;
    GW_ASSERT(count == 3);
    glyphwell::AssertionFailure("x > 0", "Compute", "Sample.cpp", 12);
    std::vector<std::pair<LogChannel, std::string>> lines;
    for (const LogCapture::Line& entry : log.Lines())
        lines.emplace_back(entry.channel, entry.text);
    const auto app = LogChannel::Application;
    EXPECT_EQ(lines, (decltype(lines){{app, std::string("*** Assertion failure in TestBody, ") +
                                                __FILE__ + ":" + std::to_string(line)},
                                      {app, "Invalid parameter not satisfying: count == 3"},
                                      {app, "*** Assertion failure in Compute, Sample.cpp:12"},
                                      {app, "Invalid parameter not satisfying: x > 0"}}));
}

} // namespace

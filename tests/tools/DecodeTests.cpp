#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include "tests/tools/ToolRun.h"

namespace {

using glyphwell::testing::Invoke;
using Result = glyphwell::testing::ToolResult;

std::string Bytes(const std::vector<int>& values) {
    std::string bytes;
    for (int v : values)
        bytes += char(v);
    return bytes;
}

} // namespace

TEST(DecodeCommand, GivesBackTheEncodedJSONForEveryKind) {
    const char* inputs[] = {
        R"({"a":true,"b":false,"s":"text \u00e9 \ud83d\ude00","i":-42,"f":0.25})",
        R"([1,[2,[3,[]]],{}])",
        R"({"$number":-7,"$type":7})",
        R"({"$number":1.5,"$type":5})",
        R"({"$number":"NaN","$type":13})",
        R"({"$number":9007199254740993,"$type":4})",
        R"({"$data":"AAEC/w=="})",
        R"({"$url":"file:///usr/share/fonts/a%20b.ttf"})",
        R"({"$uuid":"00010203-0405-0607-0809-0a0b0c0d0e0f"})",
        R"({"$set":["x"]})",
        R"({"$dict":[[1,"one"],[{"$data":""},[]]]})",
        R"({"$dict":[["$not a tag",1]]})",
        R"({"$error":{"domain":"NSPOSIXErrorDomain","code":2}})",
        R"({"$charset":[[0,0],[65,90],[65535,65537],[1114110,1114111]]})",
    };
    for (const char* input : inputs) {
        const Result encoded = Invoke({"encode"}, input);
        ASSERT_EQ(encoded.status, 0) << input << ": " << encoded.err;
        const Result decoded = Invoke({"decode", "--compact"}, encoded.out);
        EXPECT_EQ(decoded.status, 0) << input << ": " << decoded.err;
        EXPECT_EQ(decoded.err, "") << input;
        EXPECT_EQ(nlohmann::ordered_json::parse(decoded.out), nlohmann::ordered_json::parse(input))
            << input << " came back as " << decoded.out;
    }
}

TEST(DecodeCommand, PrintsTheReadersLinesAndFailsOnCorruption) {
    // A dictionary claiming three pairs that holds two.
    const std::string bytes =
        Bytes({0, 0, 0, 0x10, 0, 0, 0, 3, 0, 0, 0, 7, 0,   0, 0, 1, 'a', 0, 0, 1, 3, 0,
               0, 0, 1, 1,    0, 0, 0, 7, 0, 0, 0, 1, 'b', 0, 0, 1, 3,   0, 0, 0, 1, 0});
    const Result result = Invoke({"decode", "--compact", "--expect", "dictionary"}, bytes);
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.out, "{\"a\":true,\"b\":false}\n");
    EXPECT_EQ(result.err, "ERROR: Quzel got corrupted data. (cftype)\n"
                          "*** don't how to resurrect type 99999\n"
                          "*** ResurrectCFDictionary missing either a key or a value, truncating "
                          "dictionary\n");
}

// Each kind --expect names takes a value of that kind, and a value of any other kind reads null.
TEST(DecodeCommand, ExpectTakesItsKindOnly) {
    const std::pair<const char*, const char*> kinds[] = {
        {"string", R"("abc")"},
        {"number", "1"},
        {"boolean", "true"},
        {"data", R"({"$data":"AA=="})"},
        {"charset", R"({"$charset":[[65,66]]})"},
        {"array", "[1]"},
        {"dictionary", R"({"k":1})"},
        {"set", R"({"$set":[1]})"},
        {"url", R"({"$url":"file:///a"})"},
        {"uuid", R"({"$uuid":"00010203-0405-0607-0809-0a0b0c0d0e0f"})"},
        {"error", R"({"$error":{"domain":"D","code":1}})"},
    };
    for (const auto& [kind, json] : kinds) {
        const std::string bytes = Invoke({"encode"}, json).out;
        for (const auto& [expected, unused] : kinds) {
            const Result result = Invoke({"decode", "--compact", "--expect", expected}, bytes);
            const bool same = std::string(kind) == expected;
            EXPECT_EQ(result.status, same ? 0 : 1) << kind << " as " << expected;
            EXPECT_EQ(result.out, same ? std::string(json) + "\n" : "null\n")
                << kind << " as " << expected;
        }
        EXPECT_EQ(Invoke({"decode", "--compact", "--expect", "any"}, bytes).out,
                  std::string(json) + "\n");
    }
    const std::string abc = Bytes({0, 0, 0, 7, 0, 0, 0, 3, 'a', 'b', 'c'});
    EXPECT_EQ(Invoke({"decode", "--expect", "dictionary"}, abc).err,
              "Quzel encounters an unexpected type. (7, 16)\n");
}

TEST(DecodeCommand, NullResultWithoutCorruptionStillFails) {
    const Result empty = Invoke({"decode"}, Bytes({0, 0, 1, 2, 0, 0, 0, 0})); // a UUID of count 0
    EXPECT_EQ(empty.status, 1);
    EXPECT_EQ(empty.out, "null\n");
    EXPECT_EQ(empty.err, "");
}

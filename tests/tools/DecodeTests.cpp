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

// Every value comes back whole; --expect takes its own kind (or any) and reads others as null.
TEST(DecodeCommand, GivesBackTheEncodedJSONAndExpectTakesItsKindOnly) {
    const char* kinds[] = {"string",     "number", "boolean", "data", "charset", "array",
                           "dictionary", "set",    "url",     "uuid", "error",   "any"};
    const std::pair<const char*, const char*> values[] = {
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
        {"dictionary", R"({"a":true,"b":false,"s":"text \u00e9 \ud83d\ude00","i":-42,"f":0.25})"},
        {"array", R"([1,[2,[3,[]]],{}])"},
        {"number", R"({"$number":-7,"$type":7})"},
        {"number", R"({"$number":1.5,"$type":5})"},
        {"number", R"({"$number":"NaN","$type":13})"},
        {"number", R"({"$number":9007199254740993,"$type":4})"},
        {"data", R"({"$data":"AAEC/w=="})"},
        {"url", R"({"$url":"file:///usr/share/fonts/a%20b.ttf"})"},
        {"set", R"({"$set":["x"]})"},
        {"dictionary", R"({"$dict":[[1,"one"],[{"$data":""},[]]]})"},
        {"dictionary", R"({"$dict":[["$not a tag",1]]})"},
        {"error", R"({"$error":{"domain":"NSPOSIXErrorDomain","code":2}})"},
        {"charset", R"({"$charset":[[0,0],[65,90],[65535,65537],[1114110,1114111]]})"},
    };
    for (const auto& [kind, json] : values) {
        SCOPED_TRACE(json);
        const Result encoded = Invoke({"encode"}, json);
        ASSERT_EQ(encoded.status, 0) << encoded.err;
        const std::string compact = nlohmann::ordered_json::parse(json).dump() + "\n";
        EXPECT_EQ(Invoke({"decode", "--compact"}, encoded.out), (Result{0, compact, ""}));
        for (const std::string expected : kinds) {
            const bool same = expected == kind || expected == "any";
            const Result result =
                Invoke({"decode", "--compact", "--expect", expected}, encoded.out);
            EXPECT_EQ(std::pair(result.status, result.out),
                      std::pair(same ? 0 : 1, same ? compact : "null\n"))
                << kind << " as " << expected;
        }
    }
    const std::string abc = Bytes({0, 0, 0, 7, 0, 0, 0, 3, 'a', 'b', 'c'});
    EXPECT_EQ(Invoke({"decode", "--expect", "dictionary"}, abc).err,
              "Quzel encounters an unexpected type. (7, 16)\n");
}

TEST(DecodeCommand, PrintsTheReadersLinesAndFailsOnCorruption) {
    // A dictionary claiming three pairs that holds two.
    const std::string bytes =
        Bytes({0, 0, 0, 0x10, 0, 0, 0, 3, 0, 0, 0, 7, 0,   0, 0, 1, 'a', 0, 0, 1, 3, 0,
               0, 0, 1, 1,    0, 0, 0, 7, 0, 0, 0, 1, 'b', 0, 0, 1, 3,   0, 0, 0, 1, 0});
    EXPECT_EQ(Invoke({"decode", "--compact", "--expect", "dictionary"}, bytes),
              (Result{1, "{\"a\":true,\"b\":false}\n",
                      "ERROR: Quzel got corrupted data. (cftype)\n"
                      "*** don't how to resurrect type 99999\n"
                      "*** ResurrectCFDictionary missing either a key or a value, truncating "
                      "dictionary\n"}));
}

TEST(DecodeCommand, NullResultWithoutCorruptionStillFails) {
    // A UUID of count 0.
    EXPECT_EQ(Invoke({"decode"}, Bytes({0, 0, 1, 2, 0, 0, 0, 0})), (Result{1, "null\n", ""}));
}

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "cfutil/TCFRetained.h"
#include "tests/tools/ToolRun.h"
#include "tools/Base64.h"
#include "tools/ToolInput.h"

namespace {

using Result = glyphwell::testing::ToolResult;

Result Encode(const std::string& input, std::vector<std::string> arguments = {"--hex"}) {
    arguments.insert(arguments.begin(), "encode");
    return glyphwell::testing::Invoke(arguments, input);
}

} // namespace

TEST(EncodeCommand, WritesTheDocumentedBytesOfPlainAndTaggedJSON) {
    const std::pair<std::string, std::string> cases[] = {
        {"\"abc\"", "00 00 00 07 00 00 00 03 61 62 63\n"},
        {"{}", "00 00 00 10 00 00 00 00\n"},
        {"true", "00 00 01 03 00 00 00 01 01\n"},
        {R"({"$number": 1, "$type": 3})", "00 00 00 16 00 00 00 03 00 00 00 04 00 00 00 01\n"},
        {R"({"$number": 1.0, "$type": 6})",
         "00 00 00 16 00 00 00 06 00 00 00 08 3F F0 00 00 00 00 00 00\n"},
        {R"({"a": true})",
         "00 00 00 10 00 00 00 01 00 00 00 07 00 00 00 01 61 00 00 01 03 00 00 00 01 01\n"},
        {"7", "00 00 00 16 00 00 00 0A 00 00 00 08 00 00 00 00 00 00 00 07\n"},
        {"0.5", "00 00 00 16 00 00 00 0D 00 00 00 08 3F E0 00 00 00 00 00 00\n"},
        {"[false]", "00 00 00 11 00 00 00 01 00 00 01 03 00 00 00 01 00\n"},
        {R"({"$array": []})", "00 00 00 11 00 00 00 00\n"},
        {R"({"$set": [true]})", "00 00 01 00 00 00 00 01 00 00 01 03 00 00 00 01 01\n"},
        {R"({"$data": "3q0="})", "00 00 00 12 00 00 00 02 DE AD\n"},
        {R"({"$url": "file:///a"})", "00 00 01 01 00 00 00 09 66 69 6C 65 3A 2F 2F 2F 61\n"},
        {R"({"$uuid": "00010203-0405-0607-0809-0a0b0c0d0e0f"})",
         "00 00 01 02 00 00 00 10 00 01 02 03 04 05 06 07 08 09 0A 0B 0C 0D 0E 0F\n"},
        {R"({"$error": {"domain": "D", "code": 5}})",
         "00 00 01 04 00 00 00 05 00 00 00 07 00 00 00 01 44\n"},
        {R"({"$dict": [[1, "x"]]})",
         "00 00 00 10 00 00 00 01 00 00 00 16 00 00 00 0A 00 00 00 08 00 00 00 00 00 00 00 "
         "01 00 00 00 07 00 00 00 01 78\n"},
        {R"({"$number": -1, "$type": 7})", "00 00 00 16 00 00 00 07 00 00 00 01 FF\n"},
        // A set of just U+0000 is a BMP bitmap whose first word is 0x0001: literal 1, fill 4095.
        {R"({"$charset": [[0, 0]]})",
         "00 00 00 1B 00 00 00 0E 00 00 00 00 00 20 00 00 01 00 01 00 FF 0F\n"},
    };
    for (const auto& [input, hex] : cases)
        EXPECT_EQ(Encode(input).out, hex) << input;
}

TEST(EncodeCommand, WritesRawBytesToAFileThatDecodeReadsBack) {
    const std::filesystem::path path =
        std::filesystem::temp_directory_path() / ("glyphwell-encode-" + std::to_string(getpid()));
    std::ofstream(path.string() + ".json") << "\"abc\"";
    EXPECT_EQ(Encode("", {path.string() + ".json", "-o", path.string()}), (Result{0, "", ""}));
    std::string bytes, error;
    EXPECT_TRUE(glyphwell::tools::ReadFile(path.string(), &bytes, &error)) << error;
    EXPECT_EQ(bytes, std::string("\0\0\0\x07\0\0\0\x03"
                                 "abc",
                                 11));
    EXPECT_EQ(glyphwell::testing::Invoke({"decode", path.string(), "--compact"}),
              (Result{0, "\"abc\"\n", ""}));
    std::filesystem::remove(path);
    std::filesystem::remove(path.string() + ".json");
}

TEST(ReadFile, ReadsWholeFilesUpToItsLimitAndNoFurther) {
    const std::string path =
        std::filesystem::temp_directory_path() / ("glyphwell-read-" + std::to_string(getpid()));
    struct Row {
        size_t size, limit;
        bool read;
    } rows[] = {{0, SIZE_MAX, true},  {5, SIZE_MAX, true},   {70000, SIZE_MAX, true},
                {70000, 70000, true}, {70000, 69999, false}, {65536, 65535, false},
                {5, 0, false}};
    for (const Row& row : rows) {
        SCOPED_TRACE(testing::Message() << row.size << " bytes, limit " << row.limit);
        const std::string content(row.size, 'x');
        std::ofstream(path, std::ios::binary) << content;
        std::string text, error;
        EXPECT_EQ(glyphwell::tools::ReadFile(path, &text, &error, row.limit), row.read);
        if (row.read)
            EXPECT_EQ(text, content);
        else
            EXPECT_EQ(error, path + ": larger than " + std::to_string(row.limit) + " bytes");
    }
    std::filesystem::remove(path);
}

TEST(EncodeCommand, RejectsBadInputWithThePlaceAndNoOutput) {
    struct Case {
        std::string input;
        std::string message;
        std::vector<std::string> arguments = {"--hex"};
    } cases[] = {
        {"", "cannot open /nonexistent/input.json", {"/nonexistent/input.json"}},
        {"{\"a\": [1,\n  2,,]}", "<stdin>:2:5: malformed JSON"},
        {"", "<stdin>:1:1: malformed JSON"},
        {R"({"a": [1, {"$bogus": 1}]})", "at /a/1: unknown tag \"$bogus\""},
        {R"({"$number": 1, "$type": 17})",
         "at /$type: number type code must be an integer from 1 to 16"},
        {R"({"$number": 1, "$type": 0})", "at /$type: number type code"},
        {R"({"$number": 300, "$type": 1})", "at /$number: value out of range for type 1"},
        {R"({"$number": 1.5, "$type": 3})", "at /$number: type 3 needs an integer value"},
        {R"({"$data": "not base64!"})", "at /$data: \"$data\" must be a base64 string"},
        {R"({"$uuid": "1234"})", "at /$uuid: \"$uuid\" must be a string"},
        {R"({"$charset": [[5, 1]]})", "at /$charset/0: a range is [first, last]"},
        {R"({"k": null})", "at /k: null has no property value"},
        {R"({"$url": "http://exa mple/"})", "at /$url: not a URL"},
        {R"({"$dict": [[1]]})", "at /$dict/0: a \"$dict\" entry is a [key, value] pair"},
        {R"({"$error": {"domain": "D"}})", "at /$error: \"$error\" must be"},
        {R"({"a/b": {"~": null}})", "at /a~1b/~0: null"},
        {"18446744073709551615", "at /: integer out of range"},
        {"[\"" + std::string(0x100001, 'x') + "\"]",
         "at /0: string longer than 1048576 UTF-8 bytes"},
    };
    for (const Case& c : cases) {
        const Result result = Encode(c.input, c.arguments);
        SCOPED_TRACE(c.message);
        EXPECT_EQ(result.status, 1);
        EXPECT_EQ(result.out, "");
        EXPECT_NE(result.err.find(c.message), std::string::npos) << result.err;
    }
}

// A text with a lone surrogate has no UTF-8 form: the writer gives up on it, and the tool must
// not send the emptied text in its place.
TEST(EncodeCommand, RefusesAValueTheWriterCannotCarryUnchanged) {
    const UniChar lone[] = {'a', 0xD800};
    TCFAdopted<CFStringRef> text(CFStringCreateWithCharacters(kCFAllocatorDefault, lone, 2));
    std::string bytes = "left over";
    EXPECT_FALSE(glyphwell::tools::FlattenValue(text, &bytes));
    EXPECT_EQ(bytes, "");
    EXPECT_TRUE(glyphwell::tools::FlattenValue(CFSTR("a"), &bytes));
    EXPECT_EQ(bytes, std::string("\0\0\0\x07\0\0\0\x01"
                                 "a",
                                 9));
}

TEST(Base64, RoundTripsAndRejectsNonCanonicalText) {
    using glyphwell::tools::DecodeBase64;
    using glyphwell::tools::EncodeBase64;
    for (size_t length = 0; length < 8; ++length) {
        std::vector<uint8_t> bytes;
        for (size_t i = 0; i < length; ++i)
            bytes.push_back(uint8_t(0xF0 + i * 37));
        const std::string text = EncodeBase64(bytes.data(), bytes.size());
        EXPECT_EQ(text.size() % 4, 0u);
        EXPECT_EQ(DecodeBase64(text), bytes);
    }
    EXPECT_EQ(EncodeBase64(reinterpret_cast<const uint8_t*>("foobar"), 6), "Zm9vYmFy");
    EXPECT_FALSE(DecodeBase64("Zg="));
    EXPECT_FALSE(DecodeBase64("Zh==")); // stray bits under the padding
    EXPECT_FALSE(DecodeBase64("Z=g="));
    EXPECT_FALSE(DecodeBase64("Zm9v YmFy"));
}

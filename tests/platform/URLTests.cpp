#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <utility>

#include "platform/CFURL.h"
#include "tests/platform/ContainerTestSupport.h"
#include "tests/support/Values.h"

using glyphwell::testing::Own;
using glyphwell::testing::Owned;
using glyphwell::testing::Ref;
using glyphwell::testing::TextOf;

namespace {

Owned<CFURLRef> URL(const std::string& text, CFURLRef base = nullptr) {
    return Own(CFURLCreateWithBytes(nullptr, reinterpret_cast<const UInt8*>(text.data()),
                                    CFIndex(text.size()), kCFStringEncodingUTF8, base));
}

/// Takes a new string, returns its text ("<null>" for null) and releases it.
std::string Take(CFStringRef string) {
    return TextOf(Ref(string).get());
}

/// The URL's own bytes.
std::string Bytes(CFURLRef url) {
    std::string bytes(size_t(CFURLGetBytes(url, nullptr, 0)), '\0');
    CFURLGetBytes(url, reinterpret_cast<UInt8*>(bytes.data()), CFIndex(bytes.size()));
    return bytes;
}

std::string Absolute(CFURLRef url) {
    return Bytes(Own(CFURLCopyAbsoluteURL(url)).get());
}

// The examples of RFC 3986, section 5.4, against its base; a URL keeps its own bytes unresolved.
TEST(URLResolution, ExamplesOfRFC3986) {
    static const std::pair<const char*, const char*> cases[] = {
        {"g:h", "g:h"},
        {"g", "http://a/b/c/g"},
        {"./g", "http://a/b/c/g"},
        {"g/", "http://a/b/c/g/"},
        {"/g", "http://a/g"},
        {"//g", "http://g"},
        {"?y", "http://a/b/c/d;p?y"},
        {"g?y", "http://a/b/c/g?y"},
        {"#s", "http://a/b/c/d;p?q#s"},
        {"g;x?y#s", "http://a/b/c/g;x?y#s"},
        {"", "http://a/b/c/d;p?q"},
        {".", "http://a/b/c/"},
        {"..", "http://a/b/"},
        {"../g", "http://a/b/g"},
        {"../..", "http://a/"},
        {"../../g", "http://a/g"},
        // The abnormal examples.
        {"../../../g", "http://a/g"},
        {"../../../../g", "http://a/g"},
        {"/./g", "http://a/g"},
        {"/../g", "http://a/g"},
        {"g.", "http://a/b/c/g."},
        {"..g", "http://a/b/c/..g"},
        {"./../g", "http://a/b/g"},
        {"./g/.", "http://a/b/c/g/"},
        {"g/../h", "http://a/b/c/h"},
        {"g;x=1/../y", "http://a/b/c/y"},
        {"g?y/../x", "http://a/b/c/g?y/../x"},
        {"g#s/../x", "http://a/b/c/g#s/../x"},
        {"http:g", "http:g"},
    };
    auto base = URL("http://a/b/c/d;p?q");
    for (const auto& [reference, resolved] : cases) {
        auto url = URL(reference, base.get());
        ASSERT_TRUE(url) << reference;
        EXPECT_EQ(Absolute(url.get()), resolved) << reference;
        EXPECT_EQ(Bytes(url.get()), reference);
    }
}

TEST(URLResolution, ChainsOfRelativeBasesResolveFromTheTop) {
    auto top = URL("http://h/x/y/");
    auto middle = URL("m/n", top.get());
    auto leaf = URL("../z?q", middle.get());
    EXPECT_EQ(Absolute(leaf.get()), "http://h/x/y/z?q");
    auto relativeOnly = URL("c", URL("a/b").get());
    EXPECT_EQ(Absolute(relativeOnly.get()), "a/c");
}

TEST(URL, KeepsItsOwnStringAndHandsOutTheSameURLWhenAlreadyAbsolute) {
    auto url = URL("https://example.org/a%20b?x=1#frag");
    ASSERT_TRUE(url);
    EXPECT_EQ(TextOf(CFURLGetString(url.get())), "https://example.org/a%20b?x=1#frag");
    auto absolute = Own(CFURLCopyAbsoluteURL(url.get()));
    EXPECT_EQ(absolute.get(), url.get());
    UInt8 small[4];
    EXPECT_EQ(CFURLGetBytes(url.get(), small, sizeof small), -1);
    EXPECT_EQ(Take(CFURLCopyScheme(url.get())), "https");
    EXPECT_EQ(Take(CFURLCopyHostName(url.get())), "example.org");
    EXPECT_EQ(Take(CFURLCopyPath(url.get())), "/a%20b");
    EXPECT_EQ(Take(CFURLCopyLastPathComponent(url.get())), "a b");
    EXPECT_EQ(Take(CFURLCopyQueryString(url.get(), nullptr)), "x=1");
    EXPECT_EQ(Take(CFURLCopyFragment(url.get(), nullptr)), "frag");
    EXPECT_EQ(Take(CFURLCopyHostName(URL("http://user@[::1]:8080/").get())), "::1");
}

TEST(URL, RejectsBytesThatAreNotAReference) {
    for (const char* text : {"a b", "%zz", "http://a/\xC3", "x\x01", ":no-scheme"})
        EXPECT_FALSE(URL(text)) << text;
    using namespace std::string_literals;
    EXPECT_FALSE(URL("a\0b"s));
}

TEST(URL, InternationalTextIsKeptPercentEncoded) {
    auto url = URL("file:///Schriften/Gr\xC3\xBC\xC3\x9F"
                   "e.ttf");
    ASSERT_TRUE(url);
    EXPECT_EQ(Bytes(url.get()), "file:///Schriften/Gr%C3%BC%C3%9Fe.ttf");
    UInt8 path[64] = {};
    ASSERT_TRUE(CFURLGetFileSystemRepresentation(url.get(), true, path, sizeof path));
    EXPECT_EQ(std::string(reinterpret_cast<char*>(path)), "/Schriften/Gr\xC3\xBC\xC3\x9F"
                                                          "e.ttf");
}

TEST(URL, EmptyBytesGiveAnEmptyRelativeURL) {
    auto empty = URL("");
    ASSERT_TRUE(empty);
    EXPECT_EQ(CFURLGetBytes(empty.get(), nullptr, 0), 0);
    EXPECT_EQ(Absolute(empty.get()), "");
    auto base = URL("http://a/b?q#f");
    auto relative = URL("", base.get());
    EXPECT_EQ(Absolute(relative.get()), "http://a/b?q");
}

TEST(URL, EqualityComparesOwnStringAndBase) {
    auto base = URL("http://a/");
    EXPECT_TRUE(CFEqual(URL("b", base.get()).get(), URL("b", URL("http://a/").get()).get()));
    EXPECT_EQ(CFHash(URL("b", base.get()).get()), CFHash(URL("b").get()));
    EXPECT_FALSE(CFEqual(URL("b", base.get()).get(), URL("b").get()));
    EXPECT_FALSE(CFEqual(URL("http://a/b").get(), URL("b", base.get()).get()));
    EXPECT_EQ(Take(CFCopyDescription(URL("b", base.get()).get())), "b -- http://a/");
    // A reference with a scheme keeps no base.
    EXPECT_EQ(CFURLGetBaseURL(URL("http://x/", base.get()).get()), nullptr);
}

TEST(FileURL, PathWithSpacesAndNonASCIIRoundTrips) {
    CFStringRef path = CFSTR("/tmp/My Files/r\xC3\xA9sum\xC3\xA9 #1;v=2%.txt");
    auto url = Own(CFURLCreateWithFileSystemPath(nullptr, path, kCFURLPOSIXPathStyle, false));
    ASSERT_TRUE(url);
    EXPECT_EQ(Bytes(url.get()), "file:///tmp/My%20Files/r%C3%A9sum%C3%A9%20%231%3Bv=2%25.txt");
    EXPECT_EQ(Take(CFURLCopyFileSystemPath(url.get(), kCFURLPOSIXPathStyle)), TextOf(path));
    UInt8 buffer[64];
    ASSERT_TRUE(CFURLGetFileSystemRepresentation(url.get(), true, buffer, sizeof buffer));
    EXPECT_EQ(std::string(reinterpret_cast<char*>(buffer)), TextOf(path));
    EXPECT_FALSE(CFURLGetFileSystemRepresentation(url.get(), true, buffer, 10));

    const UInt8 raw[] = {'/', 't', 'm', 'p', '/', 0xFF}; // not UTF-8: the bytes still round-trip
    auto rawURL = Own(CFURLCreateFromFileSystemRepresentation(nullptr, raw, sizeof raw, false));
    EXPECT_EQ(Bytes(rawURL.get()), "file:///tmp/%FF");
    ASSERT_TRUE(CFURLGetFileSystemRepresentation(rawURL.get(), true, buffer, sizeof buffer));
    EXPECT_EQ(std::string(reinterpret_cast<char*>(buffer)), "/tmp/\xFF");
    EXPECT_EQ(CFURLCopyFileSystemPath(rawURL.get(), kCFURLPOSIXPathStyle), nullptr);
}

TEST(FileURL, DirectoryFlagAddsOrRemovesTheTrailingSlash) {
    auto make = [](const char* path, bool isDirectory) {
        auto string = Own(CFStringCreateWithCString(nullptr, path, kCFStringEncodingUTF8));
        return Bytes(Own(CFURLCreateWithFileSystemPath(nullptr, string.get(), kCFURLPOSIXPathStyle,
                                                       isDirectory))
                         .get());
    };
    EXPECT_EQ(make("/tmp/dir", true), "file:///tmp/dir/");
    EXPECT_EQ(make("/tmp/dir/", true), "file:///tmp/dir/");
    EXPECT_EQ(make("/tmp/dir/", false), "file:///tmp/dir");
    EXPECT_EQ(make("/", false), "file:///");
    EXPECT_EQ(make("/", true), "file:///");
    auto directory =
        Own(CFURLCreateWithFileSystemPath(nullptr, CFSTR("/tmp/dir"), kCFURLPOSIXPathStyle, true));
    EXPECT_TRUE(CFURLHasDirectoryPath(directory.get()));
    EXPECT_EQ(Take(CFURLCopyFileSystemPath(directory.get(), kCFURLPOSIXPathStyle)), "/tmp/dir");
}

TEST(FileURL, RelativePathIsRelativeToTheCurrentDirectory) {
    auto url =
        Own(CFURLCreateWithFileSystemPath(nullptr, CFSTR("a b/x:y"), kCFURLPOSIXPathStyle, false));
    ASSERT_TRUE(url);
    EXPECT_EQ(Bytes(url.get()), "a%20b/x:y");
    CFURLRef base = CFURLGetBaseURL(url.get());
    ASSERT_NE(base, nullptr);
    const std::string cwd = std::filesystem::current_path().string();
    EXPECT_EQ(Take(CFURLCopyFileSystemPath(base, kCFURLPOSIXPathStyle)), cwd);
    EXPECT_TRUE(CFURLHasDirectoryPath(base));
    EXPECT_EQ(Take(CFURLCopyFileSystemPath(url.get(), kCFURLPOSIXPathStyle)),
              (cwd == "/" ? "" : cwd) + "/a b/x:y");
    UInt8 buffer[32];
    ASSERT_TRUE(CFURLGetFileSystemRepresentation(url.get(), false, buffer, sizeof buffer));
    EXPECT_EQ(std::string(reinterpret_cast<char*>(buffer)), "a b/x:y");

    // A colon in the first segment would read as a scheme: it is escaped there.
    auto colon = Own(CFURLCreateWithFileSystemPathRelativeToBase(
        nullptr, CFSTR("x:y"), kCFURLPOSIXPathStyle, false, URL("file:///base/").get()));
    EXPECT_EQ(Bytes(colon.get()), "x%3Ay");
    EXPECT_EQ(Absolute(colon.get()), "file:///base/x%3Ay");
    EXPECT_EQ(CFURLCreateWithFileSystemPath(nullptr, CFSTR(""), kCFURLPOSIXPathStyle, false),
              nullptr);
}

TEST(FileURL, OnlyLocalFileURLsAndSchemelessReferencesHavePaths) {
    auto path = [](const char* text) {
        return Take(CFURLCopyFileSystemPath(URL(text).get(), kCFURLPOSIXPathStyle));
    };
    EXPECT_EQ(path("file://localhost/etc/x%2Fy"), "/etc/x/y");
    EXPECT_EQ(path("FILE:///"), "/");
    EXPECT_EQ(path("rel/dir/"), "rel/dir");
    EXPECT_EQ(path("http://a/b"), "<null>");
    EXPECT_EQ(path("file://elsewhere/b"), "<null>");
    EXPECT_EQ(path("file:///a%00b"), "<null>");
}

TEST(URLEditing, AppendDeleteAndStandardizeWorkOnTheOwnPath) {
    auto url = URL("http://h/a/b?q#f");
    auto appended =
        Own(CFURLCreateCopyAppendingPathComponent(nullptr, url.get(), CFSTR("c d"), true));
    EXPECT_EQ(Bytes(appended.get()), "http://h/a/b/c%20d/?q#f");
    auto parent = Own(CFURLCreateCopyDeletingLastPathComponent(nullptr, appended.get()));
    EXPECT_EQ(Bytes(parent.get()), "http://h/a/b/?q#f");
    auto root = Own(CFURLCreateCopyDeletingLastPathComponent(nullptr, URL("http://h").get()));
    EXPECT_EQ(Bytes(root.get()), "http://h/");
    auto relative = Own(CFURLCreateCopyDeletingLastPathComponent(nullptr, URL("a/..").get()));
    EXPECT_EQ(Bytes(relative.get()), "a/../../");

    // Taking out the dots must not turn a path into an authority or a scheme (the last two).
    for (const auto& [messy, clean] : {std::pair{"http://h/a/./b/../c/", "http://h/a/c/"},
                                       {"../x/./../y", "../y"},
                                       {"./a:b", "./a:b"},
                                       {"file:/.//x", "file:/.//x"}})
        EXPECT_EQ(Bytes(Own(CFURLCreateStandardizedURL(URL(messy).get())).get()), clean);
}

TEST(URLEscapes, ReplacesEscapesExceptThoseLeftEscaped) {
    auto replace = [](const char* text, CFStringRef keep) {
        return Take(CFURLCreateStringByReplacingPercentEscapes(
            nullptr, Own(CFStringCreateWithCString(nullptr, text, kCFStringEncodingUTF8)).get(),
            keep));
    };
    EXPECT_EQ(replace("a%20b%2Fc%C3%A9", CFSTR("")), "a b/c\xC3\xA9");
    EXPECT_EQ(replace("a%20b%2Fc%C3%A9", CFSTR("/\xC3\xA9")), "a b%2Fc%C3%A9");
    EXPECT_EQ(replace("a%20b", nullptr), "a%20b");
    EXPECT_EQ(replace("bad%2", CFSTR("")), "<null>");
    EXPECT_EQ(replace("bad%C3", CFSTR("")), "<null>"); // not UTF-8 once decoded
}

} // namespace

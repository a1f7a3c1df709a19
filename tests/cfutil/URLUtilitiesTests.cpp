// URL and file utilities on real files in a temporary directory, type conformance against a
// MIME database of the test's own, and the per-user configuration directories.
#include <cerrno>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include "cfutil/CFURLComponents.h"
#include "cfutil/CFURLResourceProperties.h"
#include "cfutil/FileTestSupport.h"
#include "cfutil/TCFData.h"
#include "cfutil/TCFString.h"
#include "cfutil/TCFURL.h"
#include "support/Values.h"

using namespace glyphwell::testing;
using Strings = std::vector<std::string>;

namespace {

Ref URL(const std::string& text) {
    return Ref(CFURLCreateWithString(nullptr, Str(text).as<CFStringRef>(), nullptr));
}

Ref Bytes(const std::string& bytes) {
    return Ref(
        CFDataCreate(nullptr, reinterpret_cast<const UInt8*>(bytes.data()), CFIndex(bytes.size())));
}

std::string Contents(const TCFBlob& data) {
    return std::string(reinterpret_cast<const char*>(data.GetPtr()), size_t(data.GetLength()));
}

std::string DirectoryURL(confstr_path_t name) {
    return TextOf(Ref(TCFURL::CopyConfigurationDirectoryURL(name)).get());
}

class FileUtilities : public TemporaryDirectoryTest {};
class ConfigurationDirectory : public TemporaryDirectoryTest {};

} // namespace

TEST(URLUtilities, NullURLYieldsNullOrFalseEverywhere) {
    TCFURL none(nullptr);
    CFErrorRef error = nullptr;
    EXPECT_EQ(TCFURL::CopyNormalizedPath(nullptr, true), nullptr);
    EXPECT_EQ(none.CreateComponentPathURLs(), nullptr);
    EXPECT_EQ(TCFURL::CreateStandardizedURLFromURL(nullptr), nullptr);
    EXPECT_EQ(TCFURL::ConvertURLArrayToStringArray(nullptr), nullptr);
    EXPECT_EQ(TCFURL::CopySymlinkTarget(nullptr), nullptr);
    EXPECT_EQ(none.CopyProperty(kCFURLNameKey, &error), nullptr);
    EXPECT_EQ(error, nullptr);
    EXPECT_EQ(CFDataRef(TCFData(static_cast<CFURLRef>(nullptr))), nullptr);
    EXPECT_EQ(TCFBlob(Bytes("x").as<CFDataRef>()).WriteToURL(nullptr), EINVAL);
}

TEST(NormalizedPath, DropsPrivateOnEightCharactersAndKeepsMarkedURLsWithoutPath) {
    const char* marked = "memory://font/iNmEmOrYcGfOnT_0001";
    const struct {
        const char* url;
        bool asURL;
        const char* expected;
        bool same; // the input URL (or, for a path, the URL's own string) with one more count
    } rows[] = {
        {"file:///private/etc/hosts", false, "/etc/hosts", false},
        {"file:///private/tmp", false, "/tmp", false},
        {"file:///privateer/x", false, "er/x", false},
        {"file:///private", false, "", false},
        {"file:///var/x", false, "/var/x", false},
        {"file:///private/etc/hosts", true, "file:///etc/hosts", false},
        {"file:///private", true, "<null>", false},
        {"file:///var/x", true, "file:///var/x", true},
        {marked, false, marked, true},
        {marked, true, marked, true},
        {"http://example.com/a", false, "<null>", false},
        {"memory://font/inmemorycgfont_0001", false, "<null>", false},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(testing::Message() << row.url << " asURL " << row.asURL);
        Ref url = URL(row.url);
        Ref result(TCFURL::CopyNormalizedPath(url.as<CFURLRef>(), row.asURL));
        EXPECT_EQ(TextOf(result.get()), row.expected);
        CFTypeRef input = row.asURL ? url.get() : CFURLGetString(url.as<CFURLRef>());
        EXPECT_EQ(result.get() == input, row.same);
    }
}

TEST(ComponentPathURLs, ListsTheURLAndItsAncestorsWithoutQueryOrParameters) {
    const struct {
        const char* url;
        Strings expected;
    } rows[] = {
        {"file:///a/b/c", {"file:///a/b/c", "file:///a/b", "file:///a"}},
        {"file:///a", {"file:///a"}},
        {"file:///a/b/", {"file:///a/b/", "file:///a/b", "file:///a"}},
        {"file:///", {"file:///"}}, // two empty components make the root itself
        {"file:///a/b?q=1#frag", {"file:///a/b#frag", "file:///a#frag"}},
        {"http://user@host:8080/a/b;type=x?q#f",
         {"http://user@host:8080/a/b#f", "http://user@host:8080/a#f"}},
        {"http://host", {}},
        {"mailto:someone@example.com", {}},
    };
    for (const auto& row : rows) {
        Ref url = URL(row.url);
        Ref urls(TCFURL(url.as<CFURLRef>()).CreateComponentPathURLs());
        EXPECT_EQ(Texts(urls.get()), row.expected) << row.url;
    }
}

TEST(URLComponents, DecomposesAfterRFC2396AndComposesTheSameText) {
    const char* text = "http://me:pw@[::1]:8080/a%20b/c;p=1?q=2#frag";
    Ref url = URL(text);
    TCFURLComponentsRFC2396 parts;
    ASSERT_TRUE(
        CFURLCopyComponents(url.as<CFURLRef>(), kCFURLComponentDecompositionRFC2396, &parts));
    auto fields = [&parts] {
        return Strings{
            TextOf(parts.scheme),       TextOf(parts.userInfo),        TextOf(parts.host),
            std::to_string(parts.port), TextOf(parts.parameterString), TextOf(parts.query),
            TextOf(parts.fragment)};
    };
    EXPECT_EQ(fields(), (Strings{"http", "me:pw", "[::1]", "8080", "p=1", "q=2", "frag"}));
    EXPECT_EQ(Texts(parts.pathComponents), (Strings{"", "a%20b", "c"}));
    Ref again(CFURLCreateFromComponents(nullptr, kCFURLComponentDecompositionRFC2396, &parts));
    EXPECT_EQ(TextOf(again.get()), text);

    Ref file = URL("file:///x");
    ASSERT_TRUE(
        CFURLCopyComponents(file.as<CFURLRef>(), kCFURLComponentDecompositionRFC2396, &parts));
    EXPECT_EQ(fields(), (Strings{"file", "<null>", "", std::to_string(kCFNotFound), "<null>",
                                 "<null>", "<null>"}));

    for (const char* bad : {"http://host:99999999999/a", "mailto:a@b"}) {
        Ref malformed = URL(bad);
        ASSERT_TRUE(malformed) << bad;
        EXPECT_FALSE(CFURLCopyComponents(malformed.as<CFURLRef>(),
                                         kCFURLComponentDecompositionRFC2396, &parts))
            << bad;
        EXPECT_EQ(parts.scheme, nullptr) << bad;
    }
}

TEST(URLUtilities, StandardizedURLRewritesOnlyTheLocalhostPrefix) {
    // Null: the input itself comes back, retained.
    const std::pair<const char*, const char*> rows[] = {{"file://localhost/tmp/x", "file:///tmp/x"},
                                                        {"file://LOCALHOST/tmp/x", nullptr},
                                                        {"file:///tmp/x", nullptr}};
    for (const auto& [text, expected] : rows) {
        Ref url = URL(text);
        Ref standardized(TCFURL::CreateStandardizedURLFromURL(url.as<CFURLRef>()));
        EXPECT_EQ(TextOf(standardized.get()), expected ? expected : text);
        EXPECT_EQ(standardized.get() == url.get(), !expected) << text;
    }
}

TEST(URLUtilities, StringArrayHoldsOwnStringsInOrderAndIsNullWhenEmpty) {
    Ref base = URL("file:///base/");
    Ref relative(CFURLCreateWithString(nullptr, CFSTR("child"), base.as<CFURLRef>()));
    Ref absolute = URL("http://example.com/a");
    Ref urls = Array({relative.get(), CFSTR("not a URL"), absolute.get()});
    Ref strings(TCFURL::ConvertURLArrayToStringArray(urls.as<CFArrayRef>()));
    EXPECT_EQ(Texts(strings.get()), (Strings{"child", "http://example.com/a"}));
    EXPECT_EQ(TCFURL::ConvertURLArrayToStringArray(Array({}).as<CFArrayRef>()), nullptr);
}

TEST_F(FileUtilities, SymlinkTargetResolvesLinksAndDotsElseGivesTheInput) {
    std::string target = WriteFile("dir/target.ttf", "x");
    ASSERT_EQ(symlink("dir/target.ttf", PathOf("first").c_str()), 0);
    ASSERT_EQ(symlink("first", PathOf("second").c_str()), 0);
    ASSERT_EQ(symlink("missing", PathOf("dangling").c_str()), 0);
    const struct {
        std::string path;
        bool isDirectory;
        std::string expected; // empty: the input URL itself
    } rows[] = {
        {PathOf("second"), false, "file://" + target},
        {PathOf("dir/../dir/./target.ttf"), false, "file://" + target},
        {PathOf("dir"), true, "file://" + PathOf("dir")}, // never a directory URL
        {PathOf("dangling"), false, ""},
    };
    for (const auto& row : rows) {
        Ref url(NewFileURL(row.path, row.isDirectory));
        Ref resolved(TCFURL::CopySymlinkTarget(url.as<CFURLRef>()));
        if (row.expected.empty())
            EXPECT_EQ(resolved.get(), url.get()) << row.path;
        else
            EXPECT_EQ(TextOf(resolved.get()), row.expected) << row.path;
    }
    EXPECT_EQ(TCFURL::CopySymlinkTarget(URL("http://example.com/a").as<CFURLRef>()), nullptr);
}

TEST_F(FileUtilities, DataFromURLReadsWholeFilesAndIsNullForOtherItems) {
    for (size_t size : {10, 1000}) { // inside and beyond the reader's stack buffer
        const std::string contents = Repeat("0123456789", size / 10);
        Ref url(NewFileURL(WriteFile("file" + std::to_string(size), contents)));
        EXPECT_EQ(Contents(TCFData(url.as<CFURLRef>())), contents);
    }
    for (const auto& [path, isDirectory] : {std::pair{WriteFile("empty", ""), false},
                                            {PathOf("missing"), false},
                                            {directory_, true}}) {
        Ref url(NewFileURL(path, isDirectory));
        EXPECT_EQ(CFDataRef(TCFData(url.as<CFURLRef>())), nullptr) << path;
    }
}

TEST_F(FileUtilities, WriteToURLCreatesOrTruncatesWithMode0644AndReportsErrors) {
    mode_t previous = umask(022);
    Ref path(NewFileURL(PathOf("written")));
    EXPECT_EQ(TCFBlob(nullptr).WriteToURL(path.as<CFURLRef>()), 0);
    struct stat status;
    ASSERT_EQ(stat(PathOf("written").c_str(), &status), 0);
    EXPECT_EQ(status.st_size, 0);
    EXPECT_EQ(status.st_mode & 0777, 0644u);
    umask(previous);

    EXPECT_EQ(TCFBlob(Bytes("hello, world").as<CFDataRef>()).WriteToURL(path.as<CFURLRef>()), 0);
    EXPECT_EQ(TCFBlob(Bytes("bye").as<CFDataRef>()).WriteToURL(path.as<CFURLRef>()), 0);
    EXPECT_EQ(Contents(TCFData(path.as<CFURLRef>())), "bye");

    Ref inMissingDirectory(NewFileURL(PathOf("no/such/file")));
    Ref directory(NewFileURL(directory_, true));
    TCFBlob bytes(Bytes("x").as<CFDataRef>());
    EXPECT_EQ(bytes.WriteToURL(inMissingDirectory.as<CFURLRef>()), ENOENT);
    EXPECT_EQ(bytes.WriteToURL(directory.as<CFURLRef>()), EISDIR);
}

TEST_F(FileUtilities, PropertiesDescribeTheItemItself) {
    std::string path = WriteFile("sub/font file.ttf", "0123456789");
    // 2021-01-01 00:00:00.5 UTC: 631152000.5 seconds after 2001-01-01.
    struct timespec times[2] = {{1609459200, 500000000}, {1609459200, 500000000}};
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
    ASSERT_EQ(symlink("sub/font file.ttf", PathOf("link").c_str()), 0);
    TCFURL file(NewFileURL(path), kAdopted), link(NewFileURL(PathOf("link")), kAdopted);
    TCFURL directory(NewFileURL(directory_, true), kAdopted), root(NewFileURL("/", true), kAdopted);
    const struct {
        const TCFURL& url;
        CFStringRef key;
        std::string expected;
    } rows[] = {
        {file, kCFURLNameKey, "font file.ttf"},
        {file, kCFURLParentDirectoryURLKey, "file://" + PathOf("sub") + "/"},
        {file, kCFURLIsRegularFileKey, "true"},
        {file, kCFURLIsDirectoryKey, "false"},
        {file, kCFURLIsSymbolicLinkKey, "false"},
        {file, kCFURLFileSizeKey, "10"},
        {file, kCFURLContentModificationDateKey, std::to_string(631152000.5)},
        {file, _kCFURLFileSizeOfResourceForkKey, "<null>"},
        {link, kCFURLIsSymbolicLinkKey, "true"},
        {link, kCFURLIsRegularFileKey, "false"},
        {link, kCFURLFileSizeKey, "<null>"},
        {directory, kCFURLIsDirectoryKey, "true"},
        {directory, kCFURLFileSizeKey, "<null>"},
        {root, kCFURLNameKey, "/"},
        {root, kCFURLParentDirectoryURLKey, "<null>"},
    };
    for (const auto& row : rows) {
        Ref value(row.url.CopyProperty(row.key, nullptr));
        EXPECT_EQ(ValueText(value.get()), row.expected)
            << TextOf(row.url) << " " << TextOf(row.key);
    }
    Ref created(file.CopyProperty(kCFURLCreationDateKey, nullptr));
    if (created) { // only where the file system records birth times
        EXPECT_NEAR(CFDateGetAbsoluteTime(created.as<CFDateRef>()), CFAbsoluteTimeGetCurrent(), 60);
    }

    TCFURL missing(NewFileURL(PathOf("missing")), kAdopted);
    CFErrorRef error = nullptr;
    EXPECT_EQ(missing.CopyProperty(kCFURLNameKey, &error), nullptr);
    Ref owned(error);
    ASSERT_NE(error, nullptr);
    EXPECT_EQ((std::pair{TextOf(CFErrorGetDomain(error)), CFErrorGetCode(error)}),
              (std::pair{TextOf(kCFErrorDomainPOSIX), CFIndex(ENOENT)}));
}

namespace {

/// A MIME database of the test's own as the only data directory, plus an empty user one.
class TypeConformance : public TemporaryDirectoryTest {
protected:
    void SetUp() override {
        TemporaryDirectoryTest::SetUp();
        WriteFile("system/mime/globs2", "# comment\n"
                                        "50:font/ttf:*.ttf\n"
                                        "50:font/otf:*.otf\n"
                                        "50:font/collection:*.ttc\n"
                                        "50:text/x-c++src:*.C:cs\n"
                                        "50:text/x-csrc:*.c\n"
                                        "55:application/x-special-font:*.special.ttf\n"
                                        "10:text/x-makefile:makefile\n"
                                        "not a glob line\n");
        WriteFile("system/mime/subclasses", "font/otf font/ttf\n"
                                            "font/ttf font/sfnt\n"
                                            "font/sfnt font/otf\n"); // a cycle must end
        std::filesystem::create_directories(PathOf("user"));
        environment_.Set("XDG_DATA_HOME", PathOf("user").c_str());
        environment_.Set("XDG_DATA_DIRS", ("relative/ignored:" + PathOf("system")).c_str());
    }

    /// The URL of `name`, a file written now or (ending in a slash) a directory.
    CFURLRef NewURL(const std::string& name) {
        return NewFileURL(name.back() == '/' ? PathOf(name) : WriteFile(name, "x"));
    }
    std::string TypeOf(const std::string& name) {
        Ref type(TCFURL(NewURL(name), kAdopted).CopyProperty(kCFURLTypeIdentifierKey, nullptr));
        return TextOf(type.get());
    }
    bool Conforms(const std::string& name, CFStringRef type) {
        return TCFURL(NewURL(name), kAdopted).ConformsToUTI(type);
    }
};

} // namespace

TEST_F(TypeConformance, TypeComesFromTheBestMatchingGlobAndConformanceFollowsTheSubclassChain) {
    std::filesystem::create_directories(PathOf("folder.ttf"));
    std::filesystem::create_directories(PathOf("folder"));
    const std::pair<const char*, const char*> types[] = {
        {"a.ttf", "font/ttf"},
        {"B.TTF", "font/ttf"},
        {"main.C", "text/x-c++src"},
        {"main.c", "text/x-csrc"},
        {"Makefile", "text/x-makefile"},
        {"unknown.bin", "application/octet-stream"},
        {"folder.ttf/", "inode/directory"},
        {"x.special.ttf", "application/x-special-font"},
    };
    for (const auto& [name, type] : types)
        EXPECT_EQ(TypeOf(name), type) << name;

    const struct {
        const char* name;
        CFStringRef type;
        bool conforms;
    } rows[] = {
        {"a.otf", CFSTR("font/otf"), true},
        {"a.otf", CFSTR("FONT/TTF"), true},
        {"a.otf", CFSTR("font/sfnt"), true},
        {"a.otf", CFSTR("application/octet-stream"), true},
        {"a.ttf", CFSTR("font/collection"), false},
        {"a.ttc", CFSTR("font/ttf"), false},
        {"main.c", CFSTR("text/plain"), true},
        {"a.ttf", CFSTR("text/plain"), false},
        {"a.ttf", nullptr, false},
        {"folder/", CFSTR("inode/directory"), true},
        {"folder/", CFSTR("application/octet-stream"), false},
    };
    for (const auto& row : rows)
        EXPECT_EQ(Conforms(row.name, row.type), row.conforms)
            << row.name << " " << TextOf(row.type);
    TCFURL missing(NewFileURL(PathOf("missing.ttf")), kAdopted);
    EXPECT_FALSE(missing.ConformsToUTI(CFSTR("font/ttf")));

    WriteFile("user/mime/globs2", "50:font/ttf:*.truetype\n"
                                  "50:font/otf:__NOGLOBS__\n");
    // The user's list replaces the system's, type by type.
    EXPECT_EQ((Strings{TypeOf("a.truetype"), TypeOf("b.ttf"), TypeOf("b.otf"), TypeOf("b.ttc")}),
              (Strings{"font/ttf", "application/octet-stream", "application/octet-stream",
                       "font/collection"}));
}

TEST_F(ConfigurationDirectory, ComesFromTheEnvironmentIsCreatedWithMode0700AndFitsIn1024Bytes) {
    WriteFile("occupied", "x");
    // The path must fit in 1024 bytes with its terminator; nested 200-byte names make it long.
    std::string parent = directory_;
    while (parent.size() < 1023 - 201 - 10)
        parent += "/" + std::string(200, 'd');
    std::filesystem::create_directories(parent);
    const std::string fits = parent + "/" + std::string(1023 - parent.size() - 1, 'f');
    const std::string tooLong = fits.substr(0, 1022) + "gg";
    const struct {
        const char* variable;
        std::string value; // "-": unset
        confstr_path_t name;
        std::string expected;
    } rows[] = {
        {"XDG_RUNTIME_DIR", PathOf("run"), kUserRuntimeDirectory, "file://" + PathOf("run") + "/"},
        {"XDG_CACHE_HOME", PathOf("cache"), kUserCacheDirectory, "file://" + PathOf("cache") + "/"},
        {"TMPDIR", PathOf("tmp"), kUserTemporaryDirectory, "file://" + PathOf("tmp") + "/"},
        {"TMPDIR", "-", kUserTemporaryDirectory, "file:///tmp/"},
        // An existing file counts as present.
        {"XDG_RUNTIME_DIR", PathOf("occupied"), kUserRuntimeDirectory,
         "file://" + PathOf("occupied") + "/"},
        {"XDG_RUNTIME_DIR", "-", kUserRuntimeDirectory, "<null>"},
        {"XDG_RUNTIME_DIR", "relative/run", kUserRuntimeDirectory, "<null>"},
        {"XDG_RUNTIME_DIR", PathOf("no/parent"), kUserRuntimeDirectory, "<null>"},
        {"XDG_CACHE_HOME", tooLong, kUserCacheDirectory, "<null>"},
        {"XDG_CACHE_HOME", fits, kUserCacheDirectory, "file://" + fits + "/"},
    };
    for (const auto& row : rows) {
        environment_.Set(row.variable, row.value == "-" ? nullptr : row.value.c_str());
        EXPECT_EQ(DirectoryURL(row.name), row.expected) << row.variable << "=" << row.value;
    }
    struct stat status;
    ASSERT_EQ(stat(PathOf("run").c_str(), &status), 0);
    EXPECT_TRUE(S_ISDIR(status.st_mode));
    EXPECT_EQ(status.st_mode & 0777, 0700u);
    EXPECT_EQ(fits.size(), 1023u);
    EXPECT_TRUE(std::filesystem::is_directory(fits));
    EXPECT_FALSE(std::filesystem::exists(tooLong));
    EXPECT_FALSE(std::filesystem::exists(tooLong.substr(0, 1023))); // not even cut short
}

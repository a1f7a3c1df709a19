// URL and file utilities on real files in a temporary directory: normalised paths, ancestor
// URLs, symbolic links, whole-file reads and writes, resource properties, type conformance
// against a MIME database of the test's own, and the per-user configuration directories.
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

using glyphwell::testing::NewFileURL;
using glyphwell::testing::Ref;
using glyphwell::testing::Str;
using glyphwell::testing::TemporaryDirectoryTest;
using glyphwell::testing::TextOf;
using glyphwell::testing::Texts;

namespace {

Ref URL(const std::string& text) {
    return Ref(CFURLCreateWithString(nullptr, Str(text).as<CFStringRef>(), nullptr));
}

std::vector<std::string> ComponentPathURLs(const std::string& text) {
    Ref url = URL(text);
    Ref urls(TCFURL(url.as<CFURLRef>()).CreateComponentPathURLs());
    return Texts(urls.as<CFArrayRef>());
}

std::string NormalizedPath(const std::string& text) {
    Ref url = URL(text);
    Ref path(TCFURL::CopyNormalizedPath(url.as<CFURLRef>(), false));
    return TextOf(path.get());
}

class FileUtilities : public TemporaryDirectoryTest {};

} // namespace

TEST(NormalizedPath, DropsPrivatePrefixMatchedOnEightCharacters) {
    EXPECT_EQ(NormalizedPath("file:///private/etc/hosts"), "/etc/hosts");
    EXPECT_EQ(NormalizedPath("file:///private/tmp"), "/tmp");
    EXPECT_EQ(NormalizedPath("file:///privateer/x"), "er/x");
    EXPECT_EQ(NormalizedPath("file:///private"), "");
    EXPECT_EQ(NormalizedPath("file:///var/x"), "/var/x");

    Ref hosts = URL("file:///private/etc/hosts");
    Ref asURL(TCFURL::CopyNormalizedPath(hosts.as<CFURLRef>(), true));
    EXPECT_EQ(TextOf(asURL.get()), "file:///etc/hosts");
    Ref root = URL("file:///private");
    EXPECT_EQ(TCFURL::CopyNormalizedPath(root.as<CFURLRef>(), true), nullptr);
}

TEST(NormalizedPath, UnchangedURLIsReturnedWithOneMoreCount) {
    Ref url = URL("file:///var/x");
    CFIndex before = CFGetRetainCount(url.get());
    CFTypeRef result = TCFURL::CopyNormalizedPath(url.as<CFURLRef>(), true);
    EXPECT_EQ(result, url.get());
    EXPECT_EQ(CFGetRetainCount(url.get()), before + 1);
    CFRelease(result);
    EXPECT_EQ(TCFURL::CopyNormalizedPath(nullptr, true), nullptr);
    EXPECT_EQ(TCFURL(nullptr).CopyNormalizedPath(), nullptr);
}

TEST(NormalizedPath, URLWithoutPathNeedsTheInMemoryFontMarker) {
    Ref font = URL("memory://font/iNmEmOrYcGfOnT_0001");
    CFStringRef string = CFURLGetString(font.as<CFURLRef>());
    Ref path(TCFURL::CopyNormalizedPath(font.as<CFURLRef>(), false));
    EXPECT_EQ(path.get(), string);
    Ref same(TCFURL::CopyNormalizedPath(font.as<CFURLRef>(), true));
    EXPECT_EQ(same.get(), font.get());
    EXPECT_EQ(NormalizedPath("http://example.com/a"), "<null>");
    EXPECT_EQ(NormalizedPath("memory://font/inmemorycgfont_0001"), "<null>");
}

TEST(ComponentPathURLs, ListsTheURLAndItsAncestorsDeepestFirst) {
    EXPECT_EQ(ComponentPathURLs("file:///a/b/c"),
              (std::vector<std::string>{"file:///a/b/c", "file:///a/b", "file:///a"}));
    EXPECT_EQ(ComponentPathURLs("file:///a"), (std::vector<std::string>{"file:///a"}));
    EXPECT_EQ(ComponentPathURLs("file:///a/b/"),
              (std::vector<std::string>{"file:///a/b/", "file:///a/b", "file:///a"}));
    // "/" splits into two empty components: the URL made of both is the root itself.
    EXPECT_EQ(ComponentPathURLs("file:///"), (std::vector<std::string>{"file:///"}));
}

TEST(ComponentPathURLs, DropsQueryAndParametersKeepsAuthorityAndFragment) {
    EXPECT_EQ(ComponentPathURLs("file:///a/b?q=1#frag"),
              (std::vector<std::string>{"file:///a/b#frag", "file:///a#frag"}));
    EXPECT_EQ(
        ComponentPathURLs("http://user@host:8080/a/b;type=x?q#f"),
        (std::vector<std::string>{"http://user@host:8080/a/b#f", "http://user@host:8080/a#f"}));
}

TEST(ComponentPathURLs, NullWhenThereIsNoHierarchicalPath) {
    EXPECT_TRUE(ComponentPathURLs("http://host").empty());
    EXPECT_TRUE(ComponentPathURLs("mailto:someone@example.com").empty());
    EXPECT_EQ(TCFURL(nullptr).CreateComponentPathURLs(), nullptr);
}

TEST(URLComponents, DecomposesAfterRFC2396AndComposesTheSameText) {
    const char* text = "http://me:pw@[::1]:8080/a%20b/c;p=1?q=2#frag";
    Ref url = URL(text);
    TCFURLComponentsRFC2396 parts;
    ASSERT_TRUE(
        CFURLCopyComponents(url.as<CFURLRef>(), kCFURLComponentDecompositionRFC2396, &parts));
    EXPECT_EQ(TextOf(parts.scheme), "http");
    EXPECT_EQ(TextOf(parts.userInfo), "me:pw");
    EXPECT_EQ(TextOf(parts.host), "[::1]");
    EXPECT_EQ(parts.port, 8080);
    EXPECT_EQ(Texts(parts.pathComponents), (std::vector<std::string>{"", "a%20b", "c"}));
    EXPECT_EQ(TextOf(parts.parameterString), "p=1");
    EXPECT_EQ(TextOf(parts.query), "q=2");
    EXPECT_EQ(TextOf(parts.fragment), "frag");
    Ref again(CFURLCreateFromComponents(nullptr, kCFURLComponentDecompositionRFC2396, &parts));
    EXPECT_EQ(TextOf(again.get()), text);

    Ref file = URL("file:///x");
    ASSERT_TRUE(
        CFURLCopyComponents(file.as<CFURLRef>(), kCFURLComponentDecompositionRFC2396, &parts));
    EXPECT_EQ(TextOf(parts.host), "");
    EXPECT_EQ(parts.port, kCFNotFound);
    EXPECT_EQ(parts.userInfo, nullptr);
}

TEST(URLComponents, RejectsMalformedPortsAndOpaqueURLs) {
    TCFURLComponentsRFC2396 parts;
    for (const char* text : {"http://host:99999999999/a", "mailto:a@b"}) {
        Ref url = URL(text);
        ASSERT_TRUE(url) << text;
        EXPECT_FALSE(
            CFURLCopyComponents(url.as<CFURLRef>(), kCFURLComponentDecompositionRFC2396, &parts))
            << text;
        EXPECT_EQ(parts.scheme, nullptr) << text;
    }
}

TEST(StandardizedURL, RewritesLocalhostPrefixOnly) {
    Ref localhost = URL("file://localhost/tmp/x");
    Ref standardized(TCFURL::CreateStandardizedURLFromURL(localhost.as<CFURLRef>()));
    EXPECT_EQ(TextOf(standardized.get()), "file:///tmp/x");
    for (const char* text : {"file://LOCALHOST/tmp/x", "file:///tmp/x"}) {
        Ref url = URL(text);
        Ref same(TCFURL::CreateStandardizedURLFromURL(url.as<CFURLRef>()));
        EXPECT_EQ(same.get(), url.get()) << text;
    }
    EXPECT_EQ(TCFURL::CreateStandardizedURLFromURL(nullptr), nullptr);
}

TEST(URLStringArray, OwnStringsInOrderAndNullWhenEmpty) {
    Ref base = URL("file:///base/");
    Ref relative(CFURLCreateWithString(nullptr, CFSTR("child"), base.as<CFURLRef>()));
    Ref absolute = URL("http://example.com/a");
    Ref urls = glyphwell::testing::Array({relative.get(), CFSTR("not a URL"), absolute.get()});
    Ref strings(TCFURL::ConvertURLArrayToStringArray(urls.as<CFArrayRef>()));
    EXPECT_EQ(Texts(strings.as<CFArrayRef>()),
              (std::vector<std::string>{"child", "http://example.com/a"}));
    Ref empty = glyphwell::testing::Array({});
    EXPECT_EQ(TCFURL::ConvertURLArrayToStringArray(empty.as<CFArrayRef>()), nullptr);
    EXPECT_EQ(TCFURL::ConvertURLArrayToStringArray(nullptr), nullptr);
}

TEST_F(FileUtilities, SymlinkTargetResolvesEveryLinkAndDotSegment) {
    std::string target = WriteFile("dir/target.ttf", "x");
    ASSERT_EQ(symlink("dir/target.ttf", PathOf("first").c_str()), 0);
    ASSERT_EQ(symlink("first", PathOf("second").c_str()), 0);
    Ref link(NewFileURL(PathOf("second")));
    Ref resolved(TCFURL::CopySymlinkTarget(link.as<CFURLRef>()));
    EXPECT_EQ(TextOf(resolved.get()), "file://" + target);

    Ref dotted(NewFileURL(PathOf("dir/../dir/./target.ttf")));
    Ref clean(TCFURL::CopySymlinkTarget(dotted.as<CFURLRef>()));
    EXPECT_EQ(TextOf(clean.get()), "file://" + target);

    Ref directory(NewFileURL(PathOf("dir"), true));
    Ref notDirectory(TCFURL::CopySymlinkTarget(directory.as<CFURLRef>()));
    EXPECT_EQ(TextOf(notDirectory.get()), "file://" + PathOf("dir"));
}

TEST_F(FileUtilities, SymlinkTargetFallsBackToTheInputWhenUnresolvable) {
    ASSERT_EQ(symlink("missing", PathOf("dangling").c_str()), 0);
    Ref dangling(NewFileURL(PathOf("dangling")));
    CFIndex before = CFGetRetainCount(dangling.get());
    Ref same(TCFURL::CopySymlinkTarget(dangling.as<CFURLRef>()));
    EXPECT_EQ(same.get(), dangling.get());
    EXPECT_EQ(CFGetRetainCount(dangling.get()), before + 1);
    Ref web = URL("http://example.com/a");
    EXPECT_EQ(TCFURL::CopySymlinkTarget(web.as<CFURLRef>()), nullptr);
    EXPECT_EQ(TCFURL::CopySymlinkTarget(nullptr), nullptr);
}

TEST_F(FileUtilities, DataFromURLReadsTheWholeFile) {
    std::string small(10, '\0');
    for (int i = 0; i < 10; ++i)
        small[size_t(i)] = char('0' + i);
    Ref smallURL(NewFileURL(WriteFile("small", small)));
    TCFData smallData(smallURL.as<CFURLRef>());
    ASSERT_EQ(smallData.GetLength(), 10);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(smallData.GetPtr()), 10), "0123456789");

    std::string large(1000, 'a');
    large[999] = 'z';
    Ref largeURL(NewFileURL(WriteFile("large", large)));
    TCFData largeData(largeURL.as<CFURLRef>());
    ASSERT_EQ(largeData.GetLength(), 1000);
    EXPECT_EQ(largeData.GetPtr()[999], 'z');
}

TEST_F(FileUtilities, DataFromURLIsNullForEmptyMissingAndNonRegularItems) {
    Ref empty(NewFileURL(WriteFile("empty", "")));
    EXPECT_EQ(CFDataRef(TCFData(empty.as<CFURLRef>())), nullptr);
    Ref missing(NewFileURL(PathOf("missing")));
    EXPECT_EQ(CFDataRef(TCFData(missing.as<CFURLRef>())), nullptr);
    Ref directory(NewFileURL(directory_, true));
    EXPECT_EQ(CFDataRef(TCFData(directory.as<CFURLRef>())), nullptr);
    EXPECT_EQ(CFDataRef(TCFData(static_cast<CFURLRef>(nullptr))), nullptr);
}

TEST_F(FileUtilities, WriteToURLCreatesOrTruncatesWithMode0644) {
    mode_t previous = umask(022);
    Ref path(NewFileURL(PathOf("written")));
    TCFBlob empty(nullptr);
    EXPECT_EQ(empty.WriteToURL(path.as<CFURLRef>()), 0);
    struct stat status;
    ASSERT_EQ(stat(PathOf("written").c_str(), &status), 0);
    EXPECT_EQ(status.st_size, 0);
    EXPECT_EQ(status.st_mode & 0777, 0644u);

    Ref bytes(CFDataCreate(nullptr, reinterpret_cast<const UInt8*>("hello, world"), 12));
    EXPECT_EQ(TCFBlob(bytes.as<CFDataRef>()).WriteToURL(path.as<CFURLRef>()), 0);
    Ref shorter(CFDataCreate(nullptr, reinterpret_cast<const UInt8*>("bye"), 3));
    EXPECT_EQ(TCFBlob(shorter.as<CFDataRef>()).WriteToURL(path.as<CFURLRef>()), 0);
    TCFData read(path.as<CFURLRef>());
    ASSERT_EQ(read.GetLength(), 3);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(read.GetPtr()), 3), "bye");
    umask(previous);
}

TEST_F(FileUtilities, WriteToURLReportsTheOpenError) {
    Ref inMissingDirectory(NewFileURL(PathOf("no/such/file")));
    Ref bytes(CFDataCreate(nullptr, reinterpret_cast<const UInt8*>("x"), 1));
    EXPECT_EQ(TCFBlob(bytes.as<CFDataRef>()).WriteToURL(inMissingDirectory.as<CFURLRef>()), ENOENT);
    Ref directory(NewFileURL(directory_, true));
    EXPECT_EQ(TCFBlob(bytes.as<CFDataRef>()).WriteToURL(directory.as<CFURLRef>()), EISDIR);
    EXPECT_EQ(TCFBlob(bytes.as<CFDataRef>()).WriteToURL(nullptr), EINVAL);
}

TEST_F(FileUtilities, PropertiesOfARegularFile) {
    std::string path = WriteFile("sub/font file.ttf", "0123456789");
    // 2021-01-01 00:00:00.5 UTC: 631152000.5 seconds after 2001-01-01.
    struct timespec times[2] = {{1609459200, 500000000}, {1609459200, 500000000}};
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
    TCFURL url(NewFileURL(path), kAdopted);

    Ref name(url.CopyProperty(kCFURLNameKey, nullptr));
    EXPECT_EQ(TextOf(name.get()), "font file.ttf");
    Ref parent(url.CopyProperty(kCFURLParentDirectoryURLKey, nullptr));
    EXPECT_EQ(TextOf(parent.get()), "file://" + PathOf("sub") + "/");
    Ref regular(url.CopyProperty(kCFURLIsRegularFileKey, nullptr));
    EXPECT_EQ(regular.get(), kCFBooleanTrue);
    Ref directory(url.CopyProperty(kCFURLIsDirectoryKey, nullptr));
    EXPECT_EQ(directory.get(), kCFBooleanFalse);
    Ref size(url.CopyProperty(kCFURLFileSizeKey, nullptr));
    SInt64 bytes = 0;
    ASSERT_TRUE(size);
    CFNumberGetValue(size.as<CFNumberRef>(), kCFNumberSInt64Type, &bytes);
    EXPECT_EQ(bytes, 10);
    Ref modified(url.CopyProperty(kCFURLContentModificationDateKey, nullptr));
    ASSERT_TRUE(modified);
    EXPECT_DOUBLE_EQ(CFDateGetAbsoluteTime(modified.as<CFDateRef>()), 631152000.5);
    Ref created(url.CopyProperty(kCFURLCreationDateKey, nullptr));
    if (created) { // only where the file system records birth times
        EXPECT_NEAR(CFDateGetAbsoluteTime(created.as<CFDateRef>()), CFAbsoluteTimeGetCurrent(), 60);
    }
    EXPECT_EQ(url.CopyProperty(_kCFURLFileSizeOfResourceForkKey, nullptr), nullptr);
}

TEST_F(FileUtilities, PropertiesOfLinksAndDirectoriesDescribeTheItemItself) {
    WriteFile("target", "0123456789");
    ASSERT_EQ(symlink("target", PathOf("link").c_str()), 0);
    TCFURL link(NewFileURL(PathOf("link")), kAdopted);
    Ref isLink(link.CopyProperty(kCFURLIsSymbolicLinkKey, nullptr));
    EXPECT_EQ(isLink.get(), kCFBooleanTrue);
    Ref isRegular(link.CopyProperty(kCFURLIsRegularFileKey, nullptr));
    EXPECT_EQ(isRegular.get(), kCFBooleanFalse);
    EXPECT_EQ(link.CopyProperty(kCFURLFileSizeKey, nullptr), nullptr);

    TCFURL directory(NewFileURL(directory_, true), kAdopted);
    Ref isDirectory(directory.CopyProperty(kCFURLIsDirectoryKey, nullptr));
    EXPECT_EQ(isDirectory.get(), kCFBooleanTrue);
    EXPECT_EQ(directory.CopyProperty(kCFURLFileSizeKey, nullptr), nullptr);

    TCFURL root(NewFileURL("/", true), kAdopted);
    Ref rootName(root.CopyProperty(kCFURLNameKey, nullptr));
    EXPECT_EQ(TextOf(rootName.get()), "/");
    EXPECT_EQ(root.CopyProperty(kCFURLParentDirectoryURLKey, nullptr), nullptr);
}

TEST_F(FileUtilities, PropertyOfAMissingItemFailsWithAPOSIXError) {
    TCFURL missing(NewFileURL(PathOf("missing")), kAdopted);
    CFErrorRef error = nullptr;
    EXPECT_EQ(missing.CopyProperty(kCFURLNameKey, &error), nullptr);
    ASSERT_NE(error, nullptr);
    EXPECT_TRUE(CFEqual(CFErrorGetDomain(error), kCFErrorDomainPOSIX));
    EXPECT_EQ(CFErrorGetCode(error), ENOENT);
    CFRelease(error);

    error = nullptr;
    EXPECT_EQ(TCFURL(nullptr).CopyProperty(kCFURLNameKey, &error), nullptr);
    EXPECT_EQ(error, nullptr);
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
        SetEnvironment("XDG_DATA_HOME", PathOf("user").c_str());
        SetEnvironment("XDG_DATA_DIRS", ("relative/ignored:" + PathOf("system")).c_str());
    }

    std::string TypeOf(const std::string& name) {
        std::string path = name.back() == '/' ? PathOf(name) : WriteFile(name, "x");
        TCFURL url(NewFileURL(path), kAdopted);
        Ref type(url.CopyProperty(kCFURLTypeIdentifierKey, nullptr));
        return TextOf(type.get());
    }

    bool Conforms(const std::string& name, const char* type) {
        std::string path = WriteFile(name, "x");
        TCFURL url(NewFileURL(path), kAdopted);
        Ref wanted = Str(type);
        return url.ConformsToUTI(wanted.as<CFStringRef>());
    }
};

} // namespace

TEST_F(TypeConformance, TypeComesFromTheBestMatchingGlob) {
    EXPECT_EQ(TypeOf("a.ttf"), "font/ttf");
    EXPECT_EQ(TypeOf("B.TTF"), "font/ttf");
    EXPECT_EQ(TypeOf("x.special.ttf"), "application/x-special-font");
    EXPECT_EQ(TypeOf("main.C"), "text/x-c++src");
    EXPECT_EQ(TypeOf("main.c"), "text/x-csrc");
    EXPECT_EQ(TypeOf("Makefile"), "text/x-makefile");
    EXPECT_EQ(TypeOf("unknown.bin"), "application/octet-stream");
    std::filesystem::create_directories(PathOf("folder.ttf"));
    EXPECT_EQ(TypeOf("folder.ttf/"), "inode/directory");
}

TEST_F(TypeConformance, UserDatabaseReplacesTheGlobsOfTheTypesItLists) {
    WriteFile("user/mime/globs2", "50:font/ttf:*.truetype\n"
                                  "50:font/otf:__NOGLOBS__\n");
    EXPECT_EQ(TypeOf("a.truetype"), "font/ttf");
    EXPECT_EQ(TypeOf("a.ttf"), "application/octet-stream");
    EXPECT_EQ(TypeOf("a.otf"), "application/octet-stream");
    EXPECT_EQ(TypeOf("a.ttc"), "font/collection");
}

TEST_F(TypeConformance, ConformanceFollowsTheSubclassChain) {
    EXPECT_TRUE(Conforms("a.otf", "font/otf"));
    EXPECT_TRUE(Conforms("a.otf", "FONT/TTF"));
    EXPECT_TRUE(Conforms("a.otf", "font/sfnt"));
    EXPECT_TRUE(Conforms("a.otf", "application/octet-stream"));
    EXPECT_FALSE(Conforms("a.ttf", "font/collection"));
    EXPECT_FALSE(Conforms("a.ttc", "font/ttf"));
    EXPECT_TRUE(Conforms("main.c", "text/plain"));
    EXPECT_FALSE(Conforms("a.ttf", "text/plain"));
}

TEST_F(TypeConformance, NoConformanceForMissingItemsDirectoriesOrNull) {
    TCFURL missing(NewFileURL(PathOf("missing.ttf")), kAdopted);
    EXPECT_FALSE(missing.ConformsToUTI(CFSTR("font/ttf")));
    TCFURL directory(NewFileURL(directory_, true), kAdopted);
    EXPECT_TRUE(directory.ConformsToUTI(CFSTR("inode/directory")));
    EXPECT_FALSE(directory.ConformsToUTI(CFSTR("application/octet-stream")));
    EXPECT_FALSE(TCFURL(nullptr).ConformsToUTI(CFSTR("font/ttf")));
    TCFURL file(NewFileURL(WriteFile("a.ttf", "x")), kAdopted);
    EXPECT_FALSE(file.ConformsToUTI(nullptr));
}

namespace {

class ConfigurationDirectory : public TemporaryDirectoryTest {
protected:
    std::string DirectoryURL(confstr_path_t name) {
        Ref url(TCFURL::CopyConfigurationDirectoryURL(name));
        return TextOf(url.get());
    }
};

} // namespace

TEST_F(ConfigurationDirectory, MissingDirectoryIsCreatedWithMode0700) {
    SetEnvironment("XDG_RUNTIME_DIR", PathOf("run").c_str());
    EXPECT_EQ(DirectoryURL(kUserRuntimeDirectory), "file://" + PathOf("run") + "/");
    struct stat status;
    ASSERT_EQ(stat(PathOf("run").c_str(), &status), 0);
    EXPECT_TRUE(S_ISDIR(status.st_mode));
    EXPECT_EQ(status.st_mode & 0777, 0700u);

    SetEnvironment("XDG_CACHE_HOME", PathOf("cache").c_str());
    EXPECT_EQ(DirectoryURL(kUserCacheDirectory), "file://" + PathOf("cache") + "/");
    SetEnvironment("TMPDIR", PathOf("tmp").c_str());
    EXPECT_EQ(DirectoryURL(kUserTemporaryDirectory), "file://" + PathOf("tmp") + "/");
}

TEST_F(ConfigurationDirectory, ExistingFileCountsAsPresent) {
    WriteFile("occupied", "x");
    SetEnvironment("XDG_RUNTIME_DIR", PathOf("occupied").c_str());
    EXPECT_EQ(DirectoryURL(kUserRuntimeDirectory), "file://" + PathOf("occupied") + "/");
}

TEST_F(ConfigurationDirectory, NullWithoutAValueOrWhenCreationFails) {
    SetEnvironment("XDG_RUNTIME_DIR", nullptr);
    EXPECT_EQ(DirectoryURL(kUserRuntimeDirectory), "<null>");
    SetEnvironment("XDG_RUNTIME_DIR", "relative/run");
    EXPECT_EQ(DirectoryURL(kUserRuntimeDirectory), "<null>");
    SetEnvironment("XDG_RUNTIME_DIR", PathOf("no/parent").c_str());
    EXPECT_EQ(DirectoryURL(kUserRuntimeDirectory), "<null>");
    SetEnvironment("TMPDIR", nullptr);
    EXPECT_EQ(DirectoryURL(kUserTemporaryDirectory), "file:///tmp/");
}

TEST_F(ConfigurationDirectory, PathMustFitIn1024BytesWithItsTerminator) {
    // Nested 200-byte names bring the path to the lengths under test.
    std::string parent = directory_;
    while (parent.size() < 1023 - 201 - 10)
        parent += "/" + std::string(200, 'd');
    std::filesystem::create_directories(parent);
    std::string fits = parent + "/" + std::string(1023 - parent.size() - 1, 'f');
    ASSERT_EQ(fits.size(), 1023u);
    std::string tooLong = fits + "g";

    SetEnvironment("XDG_CACHE_HOME", tooLong.c_str());
    EXPECT_EQ(DirectoryURL(kUserCacheDirectory), "<null>");
    EXPECT_FALSE(std::filesystem::exists(tooLong));
    EXPECT_FALSE(std::filesystem::exists(fits)); // not even the cut-short path

    SetEnvironment("XDG_CACHE_HOME", fits.c_str());
    EXPECT_EQ(DirectoryURL(kUserCacheDirectory), "file://" + fits + "/");
    EXPECT_TRUE(std::filesystem::is_directory(fits));
}

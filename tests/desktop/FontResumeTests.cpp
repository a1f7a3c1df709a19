// Resumed font downloads against a real nginx and the loopback server's hostile modes; every
// case ends with the installed file's SHA-256 checked.
#include <QTemporaryDir>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <utime.h>

#include "desktop/QZFontDownloader.h"
#include "desktop/QZPartialDownload.h"
#include "support/LoopbackHTTPServer.h"
#include "support/NginxServer.h"
#include "support/PrivateFonts.h"

namespace {

using namespace glyphwell::testing;
using Resource = LoopbackHTTPServer::Resource;
namespace fs = std::filesystem;

class FontResumeTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_FALSE(UsePrivateFonts(root_.path()).isEmpty());
        QZDownloadLimits limits;
        limits.resumePause = std::chrono::milliseconds(10);
        QZSetDownloadLimits(limits);
    }
    void TearDown() override {
        QZSetDownloadLimits({});
        StopUsingPrivateFonts();
    }
    /// Downloads `body` from `url`; the bytes reported first, in `*firstReport`.
    QZFontDownloadResult Download(const std::string& url, const std::string& body,
                                  uint64_t stopAt = 0, uint64_t* firstReport = nullptr) {
        return QZDownloadFontAsset(
            {"serif", url, body.size(), SHA256Of(body), {"DejaVuSerif"}}, QZFontInstallDirectory(),
            [&](uint64_t received) {
                if (firstReport && !*firstReport)
                    *firstReport = received;
                return stopAt == 0 || received < stopAt;
            },
            nullptr);
    }
    std::string Partial(const std::string& body) const {
        return QZPartialDownloadDirectory() + "/" + SHA256Of(body);
    }
    QTemporaryDir root_;
};

TEST_F(FontResumeTest, ACutTransferResumesWhereItStopped) {
    const std::string serif = ReadFile(kDejaVu + "DejaVuSerif.ttf");
    const size_t half = serif.size() / 2;
    const std::string fromHalf = "bytes=" + std::to_string(half) + "-",
                      fromEnd = "bytes=" + std::to_string(serif.size()) + "-";
    LoopbackHTTPServer server;
    struct Case {
        const char* what;
        Resource resource;
        int requests;
        std::string lastRange;     // the Range header of the last request, "" for none
        bool seedComplete = false; // a complete partial is there before the download
    } cases[] = {
        {"strong ETag", {.etag = "\"v1\""}, 2, fromHalf},
        {"Last-Modified only", {.lastModified = "Mon, 07 Dec 2026 01:00:00 GMT"}, 2, fromHalf},
        {"weak ETag: no range", {.etag = "W/\"v1\""}, 2, ""},
        {"ignores Range: starts over", {.etag = "\"v1\"", .ignoreRange = true}, 2, fromHalf},
        {"changed between tries: starts over", {.etag = "\"v1\"", .changedETag = "\"v2\""}, 3, ""},
        {"416 on a complete partial", {.etag = "\"v1\""}, 1, fromEnd, true},
    };
    int index = 0;
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        const std::string path = "/f" + std::to_string(index++);
        Resource resource = c.resource;
        resource.body = serif;
        resource.dropAfter = half; // the first answer breaks off half-way
        resource.dropOnce = true;
        server.Serve(path, resource);
        if (c.seedComplete) {
            fs::create_directories(QZPartialDownloadDirectory());
            std::ofstream(Partial(serif), std::ios::binary) << serif;
            std::ofstream(Partial(serif) + ".meta")
                << "url: " << server.URL(path) << "\nsize: " << serif.size() << "\netag: \"v1\"\n";
        }
        const QZFontDownloadResult result = Download(server.URL(path), serif);
        ASSERT_EQ(result.outcome, QZFontDownloadOutcome::Installed) << result.failureReason;
        EXPECT_EQ(SHA256Of(ReadFile(QString::fromStdString(result.path))), SHA256Of(serif));
        EXPECT_EQ(server.RequestCount(path), c.requests);
        EXPECT_EQ(server.LastRequestHeader(path, "Range"), c.lastRange);
        EXPECT_EQ(server.LastRequestHeader(path, "Accept-Encoding"), "");
        EXPECT_FALSE(fs::exists(Partial(serif)));
        fs::remove(result.path);
    }
}

TEST_F(FontResumeTest, AStoppedDownloadResumesFromItsPartialWithNginx) {
    const std::string serif = ReadFile(kDejaVu + "DejaVuSerif.ttf");
    const std::string www = root_.path().toStdString() + "/www";
    fs::create_directories(www);
    std::ofstream(www + "/serif.ttf", std::ios::binary) << serif;
    // Slow enough that the first download is stopped part-way.
    NginxServer nginx(www, root_.path().toStdString() + "/nginx", "limit_rate 256k;");
    if (!nginx.IsRunning())
        GTEST_SKIP() << "nginx-light is not installed";
    const std::string url = nginx.URL("/serif.ttf");
    EXPECT_EQ(Download(url, serif, 64 * 1024).outcome, QZFontDownloadOutcome::Stopped);
    ASSERT_TRUE(fs::exists(Partial(serif)));
    const uint64_t kept = fs::file_size(Partial(serif));
    ASSERT_GE(kept, 64u * 1024);
    ASSERT_LT(kept, serif.size());
    uint64_t firstReport = 0;
    const QZFontDownloadResult result = Download(url, serif, 0, &firstReport);
    ASSERT_EQ(result.outcome, QZFontDownloadOutcome::Installed) << result.failureReason;
    EXPECT_EQ(firstReport, kept); // the window shows the kept bytes as done at once
    EXPECT_EQ(SHA256Of(ReadFile(QString::fromStdString(result.path))), SHA256Of(serif));
    EXPECT_FALSE(fs::exists(Partial(serif)));

    // A partial unused for more than 7 days goes; a full disk is said before anything starts.
    const std::string stale = QZPartialDownloadDirectory() + "/" + std::string(64, 'a');
    std::ofstream(stale) << "old";
    const utimbuf old{time(nullptr) - 8 * 86400, time(nullptr) - 8 * 86400};
    utime(stale.c_str(), &old);
    const QZFontDownloadResult huge =
        QZDownloadFontAsset({"huge", url, uint64_t(1) << 60, std::string(64, 'b'), {}},
                            QZFontInstallDirectory(), {}, nullptr);
    EXPECT_EQ(huge.failureReason.rfind("There is not enough free space for the font: it needs ", 0),
              0u)
        << huge.failureReason;
    EXPECT_FALSE(fs::exists(stale));
}

} // namespace

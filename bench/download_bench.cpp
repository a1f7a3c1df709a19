// Downloading font assets over loopback, beside `curl -o` of the same file from the same server in
// the same run.
//
// The asset is a real font (DejaVu Sans) padded with pseudo-random bytes to 50 MB, served by an
// in-process HTTP server on 127.0.0.1. Cases:
//   Download/QZDownloadFontAsset  our downloader: libcurl with its progress callback, SHA-256 as
//                                 the bytes arrive, fsync, rename, fontconfig registration and
//                                 cache update
//   Download/curl-o               the curl program writing the same URL to a file (process start
//                                 included: that is what a person or a script pays)
//   Matching/50MB                 the whole matching service for one font of that asset: worker
//                                 thread, progress dictionaries, download and match
//   Matching/ten-fonts            ten DejaVu fonts (about 4 MB in all) in one request from one
//                                 catalog
// Everything happens under a private XDG data home and a private fontconfig configuration; the
// user's fonts are never touched. Times are wall-clock (the work is I/O and another process).
#include <benchmark/benchmark.h>
#include <condition_variable>
#include <cstdlib>
#include <filesystem>
#include <mutex>
#include <random>
#include <spawn.h>
#include <sys/wait.h>

#include "desktop/QZFontDownloader.h"
#include "desktop/QZFontMatching.h"
#include "desktop/QZFontService.h"
#include "desktop/QZSHA256.h"
#include "platform/PropertyValues.h"
#include "support/LoopbackHTTPServer.h"
#include "support/PrivateFonts.h"

extern char** environ;

namespace {

namespace fs = std::filesystem;
using glyphwell::testing::kDejaVu;
using glyphwell::testing::LoopbackHTTPServer;
using glyphwell::testing::ReadFile;
using glyphwell::testing::UsePrivateFonts;

constexpr size_t kLargeAssetSize = 50'000'000;

/// One font of the ten-font catalog.
struct SmallFont {
    std::string file;
    std::string postScriptName;
};
const SmallFont kTenFonts[] = {
    {"DejaVuSans.ttf", "DejaVuSans"},
    {"DejaVuSans-Bold.ttf", "DejaVuSans-Bold"},
    {"DejaVuSans-Oblique.ttf", "DejaVuSans-Oblique"},
    {"DejaVuSans-BoldOblique.ttf", "DejaVuSans-BoldOblique"},
    {"DejaVuSansMono.ttf", "DejaVuSansMono"},
    {"DejaVuSansMono-Bold.ttf", "DejaVuSansMono-Bold"},
    {"DejaVuSerif.ttf", "DejaVuSerif"},
    {"DejaVuSerif-Bold.ttf", "DejaVuSerif-Bold"},
    {"DejaVuSerif-Italic.ttf", "DejaVuSerif-Italic"},
    {"DejaVuSansCondensed.ttf", "DejaVuSansCondensed"},
};

/// The private environment, the server and the assets, made once.
struct Setup {
    fs::path root;
    LoopbackHTTPServer server;
    std::string largeBody;
    std::string largeSHA256;
    std::string missing; ///< why the ten-font case cannot run, if it cannot

    Setup() {
        char pattern[] = "/tmp/glyphwell-download-bench-XXXXXX";
        root = mkdtemp(pattern);
        UsePrivateFonts(QString::fromStdString(root.string()));

        largeBody = ReadFile(kDejaVu + "DejaVuSans.ttf");
        std::mt19937_64 random(20261206);
        while (largeBody.size() < kLargeAssetSize) {
            const uint64_t word = random();
            largeBody.append(reinterpret_cast<const char*>(&word),
                             std::min(sizeof word, kLargeAssetSize - largeBody.size()));
        }
        largeSHA256 = QZSHA256Hex(largeBody);
        LoopbackHTTPServer::Resource resource;
        resource.body = largeBody;
        server.Serve("/large", resource);

        for (const SmallFont& font : kTenFonts) {
            resource.body = ReadFile(kDejaVu + QString::fromStdString(font.file));
            if (resource.body.empty())
                missing = "no " + font.file + " (fonts-dejavu-extra)";
            server.Serve("/" + font.file, resource);
        }
    }
    ~Setup() {
        std::error_code ignored;
        fs::remove_all(root, ignored);
    }

    /// A catalog entry for the file served at `path`.
    std::string Asset(const std::string& localID, const std::string& path, size_t size,
                      const std::string& sha256, const std::string& postScriptName) {
        return glyphwell::testing::CatalogAsset(localID, server.URL(path), size, sha256,
                                                postScriptName);
    }
    /// Makes the catalog list `assets` (catalog entries).
    void WriteCatalog(const std::vector<std::string>& assets) {
        glyphwell::testing::WriteCatalog(QString::fromStdString((root / "data").string()), assets);
    }

    /// Removes every downloaded font and reloads fontconfig, so that nothing is installed.
    void Uninstall() {
        std::error_code ignored;
        fs::remove_all(root / "data/fonts/glyphwell", ignored);
        fs::remove_all(root / "cache", ignored);
        QZReloadFontConfiguration();
    }
};

Setup& TheSetup() {
    static Setup setup;
    return setup;
}

void DownloadWithOurDownloader(benchmark::State& state) {
    Setup& setup = TheSetup();
    const QZFontAssetDownload asset{
        "large", setup.server.URL("/large"), setup.largeBody.size(), setup.largeSHA256, {}};
    for (auto _ : state) {
        const QZFontDownloadResult result =
            QZDownloadFontAsset(asset, QZFontInstallDirectory(), {}, nullptr);
        if (result.outcome != QZFontDownloadOutcome::Installed) {
            state.SkipWithError(("download failed: " + result.failureReason).c_str());
            break;
        }
    }
    state.SetBytesProcessed(int64_t(state.iterations()) * int64_t(setup.largeBody.size()));
}

void DownloadWithCurlProgram(benchmark::State& state) {
    Setup& setup = TheSetup();
    const std::string url = setup.server.URL("/large");
    const std::string output = (setup.root / "curl.out").string();
    for (auto _ : state) {
        const char* arguments[] = {"curl", "-s", "-f", "-o", output.c_str(), url.c_str(), nullptr};
        pid_t child = 0;
        int status = 0;
        if (posix_spawnp(&child, "curl", nullptr, nullptr, const_cast<char**>(arguments),
                         environ) != 0 ||
            waitpid(child, &status, 0) != child || !WIFEXITED(status) || WEXITSTATUS(status) != 0) {
            state.SkipWithError("curl failed (is it installed?)");
            break;
        }
    }
    if (fs::exists(output) && fs::file_size(output) != setup.largeBody.size())
        state.SkipWithError("curl wrote a file of the wrong size");
    state.SetBytesProcessed(int64_t(state.iterations()) * int64_t(setup.largeBody.size()));
}

/// Runs one matching of `names` and waits for its end; the number of fonts matched, or -1.
long MatchAndWait(const std::vector<std::string>& names) {
    std::vector<CFDictionaryRef> descriptors;
    for (const std::string& name : names) {
        CFStringRef key = CFSTR("NSFontNameAttribute");
        CFStringRef value = CFStringCreateWithCString(nullptr, name.c_str(), kCFStringEncodingUTF8);
        const void* keys[] = {key};
        const void* values[] = {value};
        descriptors.push_back(CFDictionaryCreate(nullptr, keys, values, 1,
                                                 &kCFTypeDictionaryKeyCallBacks,
                                                 &kCFTypeDictionaryValueCallBacks));
        CFRelease(value);
    }
    CFArrayRef array = CFArrayCreate(nullptr, reinterpret_cast<const void**>(descriptors.data()),
                                     CFIndex(descriptors.size()), &kCFTypeArrayCallBacks);
    for (CFDictionaryRef descriptor : descriptors)
        CFRelease(descriptor);

    std::mutex mutex;
    std::condition_variable ended;
    long matched = -1;
    bool done = false;
    QZMatchFontDescriptorsWithProgressHandler(
        array, nullptr, [&](QZFontDescriptorMatchingState state, CFDictionaryRef progress) {
            if (state == kCTFontDescriptorMatchingDidFinish) {
                const void* result =
                    CFDictionaryGetValue(progress, kCTFontDescriptorMatchingResult);
                std::lock_guard<std::mutex> lock(mutex);
                matched = result ? CFArrayGetCount(static_cast<CFArrayRef>(result)) : 0;
                done = true;
                ended.notify_all();
            }
            return true;
        });
    CFRelease(array);
    std::unique_lock<std::mutex> lock(mutex);
    ended.wait(lock, [&] { return done; });
    return matched;
}

void MatchLargeAsset(benchmark::State& state) {
    Setup& setup = TheSetup();
    setup.WriteCatalog(
        {setup.Asset("large", "/large", setup.largeBody.size(), setup.largeSHA256, "DejaVuSans")});
    for (auto _ : state) {
        state.PauseTiming();
        setup.Uninstall();
        state.ResumeTiming();
        if (MatchAndWait({"DejaVuSans"}) != 1) {
            state.SkipWithError("the font was not matched");
            break;
        }
    }
    state.SetBytesProcessed(int64_t(state.iterations()) * int64_t(setup.largeBody.size()));
}

void MatchTenFonts(benchmark::State& state) {
    Setup& setup = TheSetup();
    if (!setup.missing.empty()) {
        state.SkipWithError(setup.missing.c_str());
        return;
    }
    std::vector<std::string> assets;
    std::vector<std::string> names;
    size_t bytes = 0;
    for (const SmallFont& font : kTenFonts) {
        const std::string body = ReadFile(kDejaVu + QString::fromStdString(font.file));
        bytes += body.size();
        assets.push_back(setup.Asset(font.postScriptName, "/" + font.file, body.size(),
                                     QZSHA256Hex(body), font.postScriptName));
        names.push_back(font.postScriptName);
    }
    setup.WriteCatalog(assets);
    for (auto _ : state) {
        state.PauseTiming();
        setup.Uninstall();
        state.ResumeTiming();
        if (MatchAndWait(names) != 10) {
            state.SkipWithError("not every font was matched");
            break;
        }
    }
    state.SetBytesProcessed(int64_t(state.iterations()) * int64_t(bytes));
    state.SetItemsProcessed(int64_t(state.iterations()) * 10);
}

} // namespace

BENCHMARK(DownloadWithOurDownloader)
    ->Name("Download/QZDownloadFontAsset")
    ->Unit(benchmark::kMillisecond)
    ->UseRealTime();
BENCHMARK(DownloadWithCurlProgram)
    ->Name("Download/curl-o")
    ->Unit(benchmark::kMillisecond)
    ->UseRealTime();
BENCHMARK(MatchLargeAsset)->Name("Matching/50MB")->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(MatchTenFonts)->Name("Matching/ten-fonts")->Unit(benchmark::kMillisecond)->UseRealTime();

int main(int argc, char** argv) {
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv))
        return 1;
    TheSetup();
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}

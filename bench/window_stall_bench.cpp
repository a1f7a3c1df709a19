// How long the agent's main thread is kept from its event loop while the progress window runs a
// download. A probe timer asks to fire every millisecond on the main thread; the longest gap
// between two of its firings is the longest stall that a request arriving then, a repaint or a
// click would have suffered. The download itself runs on the matching's worker thread; the main
// thread only receives the window's changes (blocking queued calls) and refreshes the size line.
//
// Cases (each a whole FontDownloadWindowController run, shown modally on Qt's offscreen
// platform, against a loopback HTTP server, under a private fontconfig configuration):
//   Window/50MB       one font asset of 50 MB (DejaVu Sans padded with random bytes)
//   Window/six-fonts  the six fonts of fonts-dejavu-core, one after another in one request
//   Idle/probe        the same probe over an event loop with nothing to do, for 500 ms: what
//                     the machine's scheduling alone costs
// Counters: longest_gap_ms (the longest gap of the iteration, 1 ms of which is the probe's own
// interval), busiest_gap_cpu_ms (the most main-thread CPU time within one gap) and mean_gap_ms.
#include <QApplication>
#include <QDialog>
#include <QElapsedTimer>
#include <QEventLoop>
#include <QTimer>
#include <benchmark/benchmark.h>
#include <cstdlib>
#include <filesystem>
#include <random>
#include <time.h>

#include "UIAgent/FontDownloadWindowController.h"
#include "desktop/QZFontMatching.h"
#include "desktop/QZSHA256.h"
#include "platform/PropertyValues.h"
#include "support/LoopbackHTTPServer.h"
#include "support/PrivateFonts.h"

namespace {

namespace fs = std::filesystem;
using glyphwell::testing::kDejaVu;
using glyphwell::testing::LoopbackHTTPServer;
using glyphwell::testing::ReadFile;
using glyphwell::testing::UsePrivateFonts;

constexpr size_t kLargeAssetSize = 50'000'000;
const char* const kSixFonts[][2] = {
    {"DejaVuSans.ttf", "DejaVuSans"},         {"DejaVuSans-Bold.ttf", "DejaVuSans-Bold"},
    {"DejaVuSansMono.ttf", "DejaVuSansMono"}, {"DejaVuSansMono-Bold.ttf", "DejaVuSansMono-Bold"},
    {"DejaVuSerif.ttf", "DejaVuSerif"},       {"DejaVuSerif-Bold.ttf", "DejaVuSerif-Bold"},
};

/// The CPU time of the calling thread, in nanoseconds.
qint64 ThreadCPUTime() {
    timespec now{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
    return qint64(now.tv_sec) * 1'000'000'000 + now.tv_nsec;
}

/// Fires every millisecond on the main thread and keeps the longest gap between firings, and
/// the most CPU time the main thread spent within one gap: a long gap with little CPU time is
/// the thread waiting for a core (the machine's load), a long one with as much CPU time is work
/// of its own.
class StallProbe {
public:
    StallProbe() {
        timer_.setTimerType(Qt::PreciseTimer);
        timer_.setInterval(1);
        QObject::connect(&timer_, &QTimer::timeout, [this] {
            const qint64 now = clock_.nsecsElapsed();
            const qint64 cpu = ThreadCPUTime();
            const qint64 gap = now - last_;
            longest_ = std::max(longest_, gap);
            busiest_ = std::max(busiest_, cpu - lastCPU_);
            last_ = now;
            lastCPU_ = cpu;
            total_ += gap;
            ++gaps_;
        });
    }
    void Start() {
        longest_ = busiest_ = total_ = gaps_ = 0;
        clock_.start();
        last_ = 0;
        lastCPU_ = ThreadCPUTime();
        timer_.start();
    }
    void Stop() { timer_.stop(); }
    double LongestMs() const { return double(longest_) / 1e6; }
    double BusiestMs() const { return double(busiest_) / 1e6; }
    double MeanMs() const { return gaps_ ? double(total_) / double(gaps_) / 1e6 : 0.0; }

private:
    QTimer timer_;
    QElapsedTimer clock_;
    qint64 last_ = 0, lastCPU_ = 0, longest_ = 0, busiest_ = 0, total_ = 0, gaps_ = 0;
};

/// The private environment, the server and the catalog entries, made once.
struct Setup {
    fs::path root;
    LoopbackHTTPServer server;
    std::string largeAsset;
    std::vector<std::string> sixAssets;
    std::string missing;

    Setup() {
        char pattern[] = "/tmp/glyphwell-stall-bench-XXXXXX";
        root = mkdtemp(pattern);
        UsePrivateFonts(QString::fromStdString(root.string()));

        std::string large = ReadFile(kDejaVu + "DejaVuSans.ttf");
        if (large.empty())
            missing = "no DejaVuSans.ttf (fonts-dejavu-core)";
        std::mt19937_64 random(20261206);
        while (large.size() < kLargeAssetSize) {
            const uint64_t word = random();
            large.append(reinterpret_cast<const char*>(&word),
                         std::min(sizeof word, kLargeAssetSize - large.size()));
        }
        largeAsset = Asset("large", "/large", large, "DejaVuSans");
        LoopbackHTTPServer::Resource resource;
        resource.body = std::move(large);
        server.Serve("/large", resource);

        for (const auto& font : kSixFonts) {
            resource.body = ReadFile(kDejaVu + font[0]);
            if (resource.body.empty())
                missing = std::string("no ") + font[0] + " (fonts-dejavu-core)";
            sixAssets.push_back(Asset(font[1], std::string("/") + font[0], resource.body, font[1]));
            server.Serve(std::string("/") + font[0], resource);
        }
    }
    ~Setup() {
        std::error_code ignored;
        fs::remove_all(root, ignored);
    }

    std::string Asset(const std::string& localID, const std::string& path, const std::string& body,
                      const std::string& postScriptName) {
        return glyphwell::testing::CatalogAsset(localID, server.URL(path), body.size(),
                                                QZSHA256Hex(body), postScriptName);
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

/// Descriptors {"NSFontNameAttribute": name} for `names`. The caller releases the array.
CFArrayRef CreateDescriptors(const std::vector<std::string>& names) {
    CFMutableArrayRef array = CFArrayCreateMutable(nullptr, 0, &kCFTypeArrayCallBacks);
    for (const std::string& name : names) {
        CFStringRef value = CFStringCreateWithCString(nullptr, name.c_str(), kCFStringEncodingUTF8);
        const void* keys[] = {CFSTR("NSFontNameAttribute")};
        const void* values[] = {value};
        CFDictionaryRef descriptor =
            CFDictionaryCreate(nullptr, keys, values, 1, &kCFTypeDictionaryKeyCallBacks,
                               &kCFTypeDictionaryValueCallBacks);
        CFArrayAppendValue(array, descriptor);
        CFRelease(descriptor);
        CFRelease(value);
    }
    return array;
}

/// Waits on the event loop until the matching's thread is done.
void WaitForTheMatchingToEnd() {
    while (FontDownloadWindowController::MatchingRunsInProgress() > 0) {
        QEventLoop loop;
        QTimer::singleShot(5, &loop, &QEventLoop::quit);
        loop.exec();
    }
}

void RunWindow(benchmark::State& state, const std::vector<std::string>& assets,
               const std::vector<std::string>& names) {
    Setup& setup = TheSetup();
    if (!setup.missing.empty()) {
        state.SkipWithError(setup.missing.c_str());
        return;
    }
    setup.WriteCatalog(assets);
    CFArrayRef descriptors = CreateDescriptors(names);
    StallProbe probe;
    double longest = 0.0, busiest = 0.0, mean = 0.0;
    for (auto _ : state) {
        state.PauseTiming();
        setup.Uninstall();
        state.ResumeTiming();
        probe.Start();
        CFIndex matched = 0;
        {
            FontDownloadWindowController controller(descriptors);
            controller.runModal();
            matched = controller.matches() ? CFArrayGetCount(controller.matches()) : 0;
        }
        probe.Stop();
        state.PauseTiming();
        WaitForTheMatchingToEnd();
        state.ResumeTiming();
        if (matched != CFIndex(names.size())) {
            state.SkipWithError("not every font was matched");
            break;
        }
        longest = std::max(longest, probe.LongestMs());
        busiest = std::max(busiest, probe.BusiestMs());
        mean += probe.MeanMs();
    }
    CFRelease(descriptors);
    state.counters["longest_gap_ms"] = longest;
    state.counters["busiest_gap_cpu_ms"] = busiest;
    state.counters["mean_gap_ms"] = state.iterations() ? mean / double(state.iterations()) : 0.0;
}

void WindowLargeAsset(benchmark::State& state) {
    RunWindow(state, {TheSetup().largeAsset}, {"DejaVuSans"});
}

void WindowSixFonts(benchmark::State& state) {
    std::vector<std::string> names;
    for (const auto& font : kSixFonts)
        names.push_back(font[1]);
    RunWindow(state, TheSetup().sixAssets, names);
}

void IdleProbe(benchmark::State& state) {
    StallProbe probe;
    double longest = 0.0, busiest = 0.0, mean = 0.0;
    for (auto _ : state) {
        probe.Start();
        QEventLoop loop;
        QTimer::singleShot(500, &loop, &QEventLoop::quit);
        loop.exec();
        probe.Stop();
        longest = std::max(longest, probe.LongestMs());
        busiest = std::max(busiest, probe.BusiestMs());
        mean += probe.MeanMs();
    }
    state.counters["longest_gap_ms"] = longest;
    state.counters["busiest_gap_cpu_ms"] = busiest;
    state.counters["mean_gap_ms"] = state.iterations() ? mean / double(state.iterations()) : 0.0;
}

} // namespace

BENCHMARK(WindowLargeAsset)->Name("Window/50MB")->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(WindowSixFonts)->Name("Window/six-fonts")->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(IdleProbe)->Name("Idle/probe")->Unit(benchmark::kMillisecond)->UseRealTime();

int main(int argc, char** argv) {
    setenv("QT_QPA_PLATFORM", "offscreen", 0);
    QApplication application(argc, argv);
    QApplication::setQuitOnLastWindowClosed(false);
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv))
        return 1;
    TheSetup();
    // The first window of the process loads the font database: not part of any download.
    {
        CFArrayRef none = CreateDescriptors({});
        FontDownloadWindowController warmUp(none);
        warmUp.window()->show();
        QApplication::processEvents();
        CFRelease(none);
    }
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}

// Font matching with downloads: DejaVu copies served over loopback HTTP, fontconfig pointed at a
// private configuration so that those fonts are not installed before the test downloads them.
#include <QDir>
#include <QFile>
#include <QTemporaryDir>
#include <condition_variable>
#include <csignal>
#include <cstdio>
#include <fcntl.h>
#include <fontconfig/fontconfig.h>
#include <mutex>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

#include "desktop/DesktopTesting.h"
#include "desktop/QZFontDownloader.h"
#include "desktop/QZFontFileWriter.h"
#include "desktop/QZFontMatching.h"
#include "desktop/QZFontService.h"
#include "platform/CFError.h"
#include "platform/CFNumber.h"
#include "tests/desktop/DesktopTestEnvironment.h"
#include "tests/support/LogCapture.h"
#include "tests/support/LoopbackHTTPServer.h"
#include "tests/support/PrivateFonts.h"
#include "tests/support/Values.h"

namespace {

using namespace glyphwell::testing;
using std::chrono::milliseconds;
using Resource = LoopbackHTTPServer::Resource;

constexpr auto kRunTimeout = std::chrono::seconds(20);

int64_t Int64(CFTypeRef value) {
    int64_t number = -1;
    if (value && CFGetTypeID(value) == CFNumberGetTypeID())
        CFNumberGetValue(static_cast<CFNumberRef>(value), kCFNumberSInt64Type, &number);
    return number;
}

/// The `key` of each dictionary of an array.
std::vector<std::string> Names(CFTypeRef array, const char* key) {
    std::vector<std::string> names;
    for (CFIndex i = 0; array && i < CFArrayGetCount(static_cast<CFArrayRef>(array)); ++i)
        names.push_back(TextOf(CFDictionaryGetValue(
            static_cast<CFDictionaryRef>(CFArrayGetValueAtIndex(static_cast<CFArrayRef>(array), i)),
            Str(key).get())));
    return names;
}

/// What one callback carried.
struct Event {
    uint32_t state = 0;
    std::vector<std::string> names;   ///< PostScript names of the descriptors
    std::vector<std::string> matched; ///< PostScript names of the result (state 1)
    std::vector<std::string> matchedFamilies;
    int64_t downloaded = -1;
    int64_t total = -1;
    bool hasCancelHandler = false;
    std::string error; ///< "domain code: failure reason" (state 8)
};

Event Read(uint32_t state, CFDictionaryRef progress) {
    const auto get = [progress](CFStringRef key) { return CFDictionaryGetValue(progress, key); };
    Event event;
    event.state = state;
    event.names = Names(get(kCTFontDescriptorMatchingDescriptors), "NSFontNameAttribute");
    event.matched = Names(get(kCTFontDescriptorMatchingResult), "NSFontNameAttribute");
    event.matchedFamilies = Names(get(kCTFontDescriptorMatchingResult), "NSFontFamilyAttribute");
    event.downloaded = Int64(get(kCTFontDescriptorMatchingTotalDownloadedSize));
    event.total = Int64(get(kCTFontDescriptorMatchingTotalAssetSize));
    const void* handler = get(kCTFontDescriptorMatchingCancelDownloadHandler);
    event.hasCancelHandler = handler && CFGetTypeID(handler) == QZCancelDownloadHandlerGetTypeID();
    if (const void* error = get(kCTFontDescriptorMatchingError)) {
        auto* cfError = static_cast<CFErrorRef>(const_cast<void*>(error));
        Ref userInfo(CFErrorCopyUserInfo(cfError));
        event.error = TextOf(CFErrorGetDomain(cfError)) + " " +
                      std::to_string(CFErrorGetCode(cfError)) + ": " +
                      TextOf(CFDictionaryGetValue(userInfo.as<CFDictionaryRef>(),
                                                  kCFErrorLocalizedFailureReasonKey));
    }
    return event;
}

/// Records every callback of one run; `answer` decides each reply (true by default). The run
/// has ended once state 1 was seen or an answer was false.
class Recorder {
public:
    using Answer = std::function<bool(const Event&, CFTypeRef cancelHandler)>;

    explicit Recorder(Answer answer = {}) : shared_(new Shared{std::move(answer)}) {}

    QZFontDescriptorProgressHandler Handler() const {
        return [shared = shared_](QZFontDescriptorMatchingState state, CFDictionaryRef progress) {
            Event event = Read(state, progress);
            const bool answer =
                !shared->answer ||
                shared->answer(
                    event,
                    CFDictionaryGetValue(progress, kCTFontDescriptorMatchingCancelDownloadHandler));
            std::lock_guard<std::mutex> lock(shared->mutex);
            shared->ended = state == kCTFontDescriptorMatchingDidFinish || !answer;
            shared->events.push_back(std::move(event));
            shared->changed.notify_all();
            return answer;
        };
    }

    bool WaitForEnd() const {
        std::unique_lock<std::mutex> lock(shared_->mutex);
        return shared_->changed.wait_for(lock, kRunTimeout, [this] { return shared_->ended; });
    }
    /// Waits until the run let go of its handler: it can report nothing more.
    bool WaitForRelease() const {
        const auto deadline = std::chrono::steady_clock::now() + kRunTimeout;
        while (shared_.use_count() > 1 && std::chrono::steady_clock::now() < deadline)
            std::this_thread::sleep_for(milliseconds(10));
        return shared_.use_count() == 1;
    }
    std::vector<Event> Events() const {
        std::lock_guard<std::mutex> lock(shared_->mutex);
        return shared_->events;
    }
    /// The states in order, runs of state 5 folded into one.
    std::vector<uint32_t> States() const {
        std::vector<uint32_t> states;
        for (const Event& event : Events())
            if (states.empty() || event.state != 5 || states.back() != 5)
                states.push_back(event.state);
        return states;
    }

private:
    struct Shared {
        Answer answer;
        std::mutex mutex = {};
        std::condition_variable changed = {};
        std::vector<Event> events = {};
        bool ended = false;
    };
    std::shared_ptr<Shared> shared_;
};

class FontServiceTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(root_.isValid());
        ASSERT_TRUE(server_.IsListening());
        fonts_ = UsePrivateFonts(root_.path());
        ASSERT_FALSE(fonts_.isEmpty());
        ASSERT_FALSE(QZIsFontInstalled("DejaVuSans-Bold"));
        // A cut transfer resumes after a pause; tests need not wait for it.
        QZDownloadLimits limits;
        limits.resumePause = milliseconds(10);
        QZSetDownloadLimits(limits);
    }
    void TearDown() override {
        QZSetDownloadLimits({});
        StopUsingPrivateFonts();
    }

    /// Serves the DejaVu file `file` at "/<file>" with `resource`'s delivery settings and
    /// returns its catalog entry holding `postScriptName`; `sha256` replaces the file's own.
    std::string ServeFont(const QString& file, const std::string& localID,
                          const std::string& postScriptName, Resource resource = {},
                          std::string sha256 = {}) {
        resource.body = ReadFile(kDejaVu + file);
        EXPECT_FALSE(resource.body.empty()) << file.toStdString();
        if (sha256.empty())
            sha256 = SHA256Of(resource.body);
        const std::string path = "/" + file.toStdString();
        server_.Serve(path, resource);
        return CatalogAsset(localID, server_.URL(path), resource.body.size(), sha256,
                            postScriptName);
    }
    void WriteCatalog(const std::vector<std::string>& assets) {
        ASSERT_TRUE(glyphwell::testing::WriteCatalog(root_.path() + "/data", assets));
    }
    /// Every entry of the download folder, hidden ones included.
    QStringList DownloadFolder() const {
        return QDir(fonts_ + "/glyphwell")
            .entryList(QDir::Files | QDir::Hidden | QDir::NoDotAndDotDot, QDir::Name);
    }
    /// What another application finds: fc-list with the same environment.
    static std::string ListedFile(const std::string& postScriptName) {
        const std::string command =
            "fc-list --format '%{file}\\n' ':postscriptname=" + postScriptName + "'";
        std::string output;
        char buffer[512];
        if (FILE* pipe = popen(command.c_str(), "r")) {
            while (size_t n = fread(buffer, 1, sizeof buffer, pipe))
                output.append(buffer, n);
            pclose(pipe);
        }
        return output;
    }

    QTemporaryDir root_;
    QString fonts_;
    LoopbackHTTPServer server_;
};

TEST_F(FontServiceTest, DownloadsWhatIsMissingAndGoesOnAfterAFailure) {
    const std::string bold = ReadFile(kDejaVu + "DejaVuSans-Bold.ttf");
    const std::string serif = ReadFile(kDejaVu + "DejaVuSerif.ttf");
    // An installed font is matched without a download.
    ASSERT_TRUE(QFile::copy(kDejaVu + "DejaVuSansMono.ttf", fonts_ + "/DejaVuSansMono.ttf"));
    ASSERT_TRUE(QZReloadFontConfiguration());
    WriteCatalog(
        {ServeFont("DejaVuSans-Bold.ttf", "bold", "DejaVuSans-Bold", {}, std::string(64, '0')),
         ServeFont("DejaVuSerif.ttf", "org.dejavu.Serif", "DejaVuSerif",
                   {.chunkSize = 64 * 1024, .pauseBetweenChunks = milliseconds(20)}),
         ServeFont("DejaVuSansMono.ttf", "mono", "DejaVuSansMono")});
    Recorder recorder;
    ASSERT_TRUE(QZMatchFontDescriptorsWithProgressHandler(
        FontNameDescriptors({"DejaVuSans-Bold", "NotInTheCatalog", "DejaVuSansMono", "DejaVuSerif"})
            .as<CFArrayRef>(),
        nullptr, recorder.Handler()));
    ASSERT_TRUE(recorder.WaitForEnd());

    EXPECT_EQ(recorder.States(),
              (std::vector<uint32_t>{0, 2, 4, 5, 8, 2, 8, 2, 7, 2, 4, 5, 6, 7, 1}));
    const std::vector<Event> events = recorder.Events();
    std::vector<std::string> failures;
    // The byte count goes on from the failed asset's full size.
    const int64_t size = int64_t(bold.size() + serif.size());
    int64_t previous = 0;
    for (size_t i = 0; i < events.size(); ++i) {
        const Event& event = events[i];
        SCOPED_TRACE(i);
        EXPECT_TRUE(event.hasCancelHandler);
        EXPECT_TRUE(event.state < 2 || event.names.size() == 1u);
        if (event.state >= 4 && event.state <= 6) {
            EXPECT_EQ(event.total, size);
            EXPECT_GE(event.downloaded, previous);
            previous = event.downloaded;
        }
        if (event.state == kCTFontDescriptorMatchingDidFailWithError)
            failures.push_back(event.names.at(0) + " " + event.error);
    }
    EXPECT_EQ(failures, (std::vector<std::string>{
                            "DejaVuSans-Bold QZFontDownloadErrorDomain 2: The downloaded file is "
                            "damaged: its SHA-256 checksum is not the expected one.",
                            "NotInTheCatalog QZFontDownloadErrorDomain 1: No downloadable font "
                            "has this name."}));
    EXPECT_EQ(events[2].downloaded, 0);
    EXPECT_EQ(events[events.size() - 4].downloaded, size); // the last state 5
    EXPECT_EQ(events[events.size() - 3].downloaded, size); // state 6
    EXPECT_EQ(events.back().matched, (std::vector<std::string>{"DejaVuSansMono", "DejaVuSerif"}));
    EXPECT_EQ(events.back().matchedFamilies,
              (std::vector<std::string>{"DejaVu Sans Mono", "DejaVu Serif"}));
    EXPECT_EQ(server_.RequestCount("/DejaVuSansMono.ttf"), 0);

    const QString installed = fonts_ + "/glyphwell/org.dejavu.Serif.ttf";
    EXPECT_EQ(DownloadFolder(), QStringList{"org.dejavu.Serif.ttf"});
    EXPECT_TRUE(ReadFile(installed) == serif);
    const std::optional<QZInstalledFont> found = QZFindInstalledFont("DejaVuSerif");
    ASSERT_TRUE(found);
    EXPECT_EQ(found->file, installed.toStdString());
    EXPECT_EQ(ListedFile("DejaVuSerif"), installed.toStdString() + "\n");
    // Another application starting now reads the folder from the cache instead of scanning it.
    FcConfig* fresh = FcInitLoadConfig();
    FcCache* cache = FcDirCacheLoad(
        reinterpret_cast<const FcChar8*>((fonts_ + "/glyphwell").toUtf8().constData()), fresh,
        nullptr);
    ASSERT_NE(cache, nullptr);
    EXPECT_EQ(FcCacheNumFont(cache), 1);
    FcDirCacheUnload(cache);
    FcConfigDestroy(fresh);
}

TEST_F(FontServiceTest, AnInterruptedTransferEndsTheRunAndLeavesNoFile) {
    const std::string size = std::to_string(ReadFile(kDejaVu + "DejaVuSans-Bold.ttf").size());
    // At 1 KiB per 50 ms the whole file would take half a minute, longer than the wait.
    const Resource slow{.chunkSize = 1024, .pauseBetweenChunks = milliseconds(50)};
    enum class Stop { CancelHandler, FalseToProgress, FalseToFailure };
    struct Case {
        const char* name;
        Stop stop;
        Resource resource;
        std::vector<uint32_t> states;
        std::string error; ///< of the last callback
    } cases[] = {
        // Cancelling ends the run with a finish and no match, the second font included.
        {"cancel handler", Stop::CancelHandler, slow, {0, 2, 4, 5, 1}, ""},
        // After a false answer nothing more is reported.
        {"false answer", Stop::FalseToProgress, slow, {0, 2, 4, 5}, ""},
        {"dropped connection",
         Stop::FalseToFailure,
         {.dropAfter = 10000},
         {0, 2, 4, 5, 8},
         "QZFontDownloadErrorDomain 2: The connection ended after 10000 of " + size + " bytes."},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        WriteCatalog({ServeFont("DejaVuSans-Bold.ttf", "bold", "DejaVuSans-Bold", c.resource)});
        std::thread canceller;
        Recorder recorder([&](const Event& event, CFTypeRef cancelHandler) {
            if (c.stop == Stop::FalseToFailure)
                return event.state != kCTFontDescriptorMatchingDidFailWithError;
            if (event.state != kCTFontDescriptorMatchingDownloading)
                return true;
            if (c.stop == Stop::FalseToProgress)
                return false;
            if (!canceller.joinable()) {
                // Like the window's Cancel button: another thread calls the kept handler.
                CFRetain(cancelHandler);
                canceller = std::thread([cancelHandler] {
                    QZCancelDownloadHandlerInvoke(cancelHandler);
                    CFRelease(cancelHandler);
                });
            }
            return true;
        });
        QZMatchFontDescriptorsWithProgressHandler(
            FontNameDescriptors({"DejaVuSans-Bold", "DejaVuSerif"}).as<CFArrayRef>(), nullptr,
            recorder.Handler());
        const bool ended = recorder.WaitForEnd();
        if (canceller.joinable())
            canceller.join();
        ASSERT_TRUE(ended);
        EXPECT_TRUE(recorder.WaitForRelease());
        EXPECT_TRUE(DownloadFolder().isEmpty()) << DownloadFolder().join(", ").toStdString();
        EXPECT_EQ(recorder.States(), c.states);
        EXPECT_TRUE(recorder.Events().back().matched.empty());
        EXPECT_EQ(recorder.Events().back().error, c.error);
        EXPECT_FALSE(QZIsFontInstalled("DejaVuSans-Bold"));
    }
}

/// QZDownloadFontAsset on its own, into the download folder.
class FontDownloaderTest : public FontServiceTest {
protected:
    void TearDown() override {
        QZSetDownloadLimits({});
        for (auto operation :
             {QZFontFileOperation::Write, QZFontFileOperation::Sync, QZFontFileOperation::Link,
              QZFontFileOperation::Rename, QZFontFileOperation::Lock})
            QZInjectFontFileFault(operation, 0);
        FontServiceTest::TearDown();
    }
    QZFontDownloadResult Download(const std::string& url, const std::string& body,
                                  const std::string& localID = "asset",
                                  std::vector<std::string> names = {},
                                  QZDownloadCancellation* cancellation = nullptr,
                                  const QZDownloadProgressFunction& progress = {}) {
        return QZDownloadFontAsset({localID, url, body.size(), SHA256Of(body), std::move(names)},
                                   QZFontInstallDirectory(), progress, cancellation);
    }
    /// Serves `resource` with `body` at `path`; its URL.
    std::string Serve(const std::string& path, const std::string& body, Resource resource = {}) {
        resource.body = body;
        server_.Serve(path, std::move(resource));
        return server_.URL(path);
    }
};

TEST_F(FontDownloaderTest, AFailedUpdateLeavesTheInstalledFontAndAVerifiedOneReplacesIt) {
    const std::string bold = ReadFile(kDejaVu + "DejaVuSans-Bold.ttf");
    const std::string serif = ReadFile(kDejaVu + "DejaVuSerif.ttf");
    const std::string installed = (fonts_ + "/glyphwell/bold.ttf").toStdString();
    ASSERT_EQ(Download(Serve("/v1", bold), bold, "bold", {"DejaVuSans-Bold"}).outcome,
              QZFontDownloadOutcome::Installed);
    const int unnamed = open(QZFontInstallDirectory().c_str(), O_TMPFILE | O_RDWR, 0600);
    if (unnamed >= 0)
        close(unnamed);
    const std::string schemes = "Fonts are downloaded only from https, http and file addresses, "
                                "and redirected only to https and http ones.";
    using Op = QZFontFileOperation;
    struct Case {
        std::string url;  ///< empty: `body` served
        std::string body; ///< gives the expected size and SHA-256
        Op operation;
        int error; ///< injected into `operation`
        std::string reason;
    };
    const std::vector<Case> cases = {
        {server_.URL("/missing"), bold, Op::Write, 0,
         "The server answered with the HTTP status 404."},
        {Serve("/serif", serif), serif + "!", Op::Write, 0,
         "The server offers " + std::to_string(serif.size()) + " bytes, but the font should have " +
             std::to_string(serif.size() + 1) + " bytes."},
        // A redirect never reaches a local file.
        {Serve("/to-file", "",
               {.redirectTo = "file://" + (kDejaVu + "DejaVuSerif.ttf").toStdString()}),
         serif, Op::Write, 0, schemes},
        {"ftp://127.0.0.1/font.ttf", serif, Op::Write, 0, schemes},
        {"file:///nonexistent/font.ttf", serif, Op::Write, 0,
         "The download failed: Couldn't open file /nonexistent/font.ttf"},
        {"", std::string(4096, 'x'), Op::Write, 0, "The downloaded file is not a font."},
        {"", serif, Op::Write, 0, "The downloaded file does not hold the font “DejaVuSans-Bold”."},
        {"", bold, Op::Write, ENOSPC, "The font file cannot be written: No space left on device"},
        {"", bold, Op::Sync, EIO, "The font file cannot be written: Input/output error"},
        // Without unnamed files the temporary is named and renamed: a link fault cannot touch it.
        {"", bold, Op::Link, EDQUOT,
         unnamed >= 0 ? "The font file cannot be written: Disk quota exceeded" : ""},
        {"", bold, Op::Rename, EROFS, "The font file cannot be written: Read-only file system"},
    };
    for (const Case& test : cases) {
        SCOPED_TRACE(test.reason);
        QZInjectFontFileFault(test.operation, test.error);
        const QZFontDownloadResult result =
            Download(test.url.empty() ? Serve("/v2", test.body) : test.url, test.body, "bold",
                     {"DejaVuSans-Bold"});
        QZInjectFontFileFault(test.operation, 0);
        EXPECT_EQ(result.failureReason, test.reason);
        EXPECT_EQ(DownloadFolder(), QStringList{"bold.ttf"});
        EXPECT_TRUE(ReadFile(QString::fromStdString(installed)) == bold);
        EXPECT_EQ(ListedFile("DejaVuSans-Bold"), installed + "\n");
    }
    LogCapture log;
    const QZFontDownloadResult result =
        Download(Serve("/v3", serif), serif, "bold", {"DejaVuSerif"});
    ASSERT_EQ(result.outcome, QZFontDownloadOutcome::Installed) << result.failureReason;
    EXPECT_TRUE(ReadFile(QString::fromStdString(installed)) == serif);
    EXPECT_EQ(log.Texts(), std::vector<std::string>{"Replaced the installed font file " +
                                                    installed + " with a new download"});
    EXPECT_EQ(QZFindInstalledFont("DejaVuSerif")->file, installed);
}

TEST_F(FontDownloaderTest, AKilledWriterLeavesNothingOnceTheNextDownloadStarts) {
    const std::string directory = QZFontInstallDirectory();
    ASSERT_TRUE(QDir().mkpath(QString::fromStdString(directory)));
    const std::string mono = ReadFile(kDejaVu + "DejaVuSansMono.ttf");
    for (const bool allowUnnamed : {true, false}) {
        SCOPED_TRACE(allowUnnamed ? "unnamed" : "named");
        int ready[2];
        ASSERT_EQ(pipe(ready), 0);
        const pid_t child = fork();
        if (child == 0) {
            QZFontFileWriter writer;
            if (writer.Open(directory, "victim", allowUnnamed) && writer.Write("OTTO", 4) &&
                write(ready[1], writer.IsUnnamed() ? "u" : "n", 1) == 1)
                pause();
            _exit(1);
        }
        char kind = 0;
        ASSERT_EQ(read(ready[0], &kind, 1), 1);
        close(ready[0]);
        close(ready[1]);
        // The temporary of a live writer is kept.
        QZRemoveStaleFontTemporaries(directory);
        EXPECT_EQ(DownloadFolder().size(), kind == 'n' ? 1 : 0);
        kill(child, SIGKILL);
        waitpid(child, nullptr, 0);
        LogCapture log;
        // A file URL, and a local ID that is no safe file name.
        const std::string url = "file://" + (kDejaVu + "DejaVuSansMono.ttf").toStdString();
        const QZFontDownloadResult result = Download(url, mono, "../fonts/Mono");
        ASSERT_EQ(result.outcome, QZFontDownloadOutcome::Installed) << result.failureReason;
        const std::string name =
            "_._fonts_Mono-" + SHA256Of("../fonts/Mono").substr(0, 16) + ".ttf";
        EXPECT_EQ(DownloadFolder(), QStringList{QString::fromStdString(name)});
        EXPECT_EQ(result.path, directory + "/" + name);
        EXPECT_TRUE(ReadFile(QString::fromStdString(result.path)) == mono);
        EXPECT_EQ(log.Texts().size(), kind == 'n' ? 1u : 0u);
        QFile::remove(QString::fromStdString(result.path));
    }
}

TEST_F(FontDownloaderTest, ANamedTemporaryThatCannotBeLockedIsRemovedAtOnce) {
    // Unlocked, it would pass for a dead writer's leftover; each retry would leave one more.
    const std::string directory = QZFontInstallDirectory();
    ASSERT_TRUE(QDir().mkpath(QString::fromStdString(directory)));
    QZInjectFontFileFault(QZFontFileOperation::Lock, ENOLCK);
    QZFontFileWriter writer;
    EXPECT_FALSE(writer.Open(directory, "unlocked", false));
    EXPECT_EQ(errno, ENOLCK);
    EXPECT_TRUE(DownloadFolder().isEmpty());
}

TEST_F(FontDownloaderTest, SlowAndSilentServersAreGivenUpAndCancelWorksMeanwhile) {
    const std::string serif = ReadFile(kDejaVu + "DejaVuSerif.ttf");
    const Resource silent{.neverAnswer = true},
        slow{.chunkSize = 1, .pauseBetweenChunks = milliseconds(20)};
    struct Case {
        Resource resource;
        QZDownloadLimits limits;
        bool cancel;
        std::string reason; ///< empty: cancelled
    };
    const std::vector<Case> cases = {
        {slow,
         {milliseconds(5000), milliseconds(1500), 1024},
         false,
         "The download was given up: the server sent less than 1024 bytes per second over 1.5 "
         "seconds."},
        {silent,
         {milliseconds(500), milliseconds(30000), 1024},
         false,
         "The server did not answer within 0.5 seconds."},
        {silent, {}, true, ""},
        {slow, {}, true, ""},
    };
    int index = 0;
    for (const Case& test : cases) {
        SCOPED_TRACE(test.reason);
        QZSetDownloadLimits(test.limits);
        const std::string path = "/slow" + std::to_string(index++);
        const std::string url = Serve(path, serif, test.resource);
        QZDownloadCancellation cancellation;
        std::thread canceller([&] {
            if (test.cancel && server_.WaitForRequests(path, 1, kRunTimeout))
                cancellation.Cancel();
        });
        const auto start = std::chrono::steady_clock::now();
        const QZFontDownloadResult result = Download(url, serif, "serif", {}, &cancellation);
        canceller.join();
        EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(10));
        EXPECT_EQ(result.outcome,
                  test.cancel ? QZFontDownloadOutcome::Cancelled : QZFontDownloadOutcome::Failed);
        EXPECT_EQ(result.failureReason, test.reason);
        EXPECT_TRUE(DownloadFolder().isEmpty());
    }
}

TEST_F(FontDownloaderTest, ASecondRequestForTheSameAssetSharesTheFirstTransfer) {
    const std::string bold = ReadFile(kDejaVu + "DejaVuSans-Bold.ttf");
    const std::string url =
        Serve("/shared", bold, {.chunkSize = 16 * 1024, .pauseBetweenChunks = milliseconds(10)});
    QZFontDownloadResult first;
    std::thread owner([&] { first = Download(url, bold, "bold"); });
    ASSERT_TRUE(server_.WaitForRequests("/shared", 1, kRunTimeout));
    uint64_t lastReported = 0;
    const QZFontDownloadResult second =
        Download(url, bold, "bold", {}, nullptr, [&](uint64_t received) {
            lastReported = received;
            return true;
        });
    owner.join();
    EXPECT_EQ(server_.RequestCount("/shared"), 1);
    EXPECT_EQ(first.outcome, QZFontDownloadOutcome::Installed) << first.failureReason;
    EXPECT_EQ(second.outcome, QZFontDownloadOutcome::Installed) << second.failureReason;
    EXPECT_EQ(second.path, first.path);
    EXPECT_EQ(lastReported, bold.size());

    // Another version of the asset waits for the transfer in progress, then fetches its own.
    const std::string serif = ReadFile(kDejaVu + "DejaVuSerif.ttf");
    const std::string v2 = Serve("/v2", serif);
    std::thread older([&] { first = Download(url, bold, "bold"); });
    ASSERT_TRUE(server_.WaitForRequests("/shared", 2, kRunTimeout));
    const QZFontDownloadResult newer = Download(v2, serif, "bold", {"DejaVuSerif"});
    older.join();
    EXPECT_EQ(first.outcome, QZFontDownloadOutcome::Installed) << first.failureReason;
    ASSERT_EQ(newer.outcome, QZFontDownloadOutcome::Installed) << newer.failureReason;
    EXPECT_EQ(server_.RequestCount("/v2"), 1);
    EXPECT_TRUE(ReadFile(QString::fromStdString(newer.path)) == serif);
}

TEST(FontFileNames, KeepSafeLocalIDsAndMarkChangedOnesWithAHash) {
    EXPECT_EQ(QZFontFileBaseName("org.dejavu.Sans-Bold_2"), "org.dejavu.Sans-Bold_2");
    EXPECT_EQ(QZFontFileBaseName(".hidden"), "_hidden-1692419006a88aab");
    EXPECT_EQ(QZFontFileBaseName(""), "font-e3b0c44298fc1c14");
    EXPECT_EQ(QZFontFileBaseName(std::string(100, 'a')),
              std::string(80, 'a') + "-2816597888e4a0d3");
}

TEST(FontFileNames, ExtensionComesFromTheFileSignature) {
    const unsigned char trueType[] = {0, 1, 0, 0, 0x12};
    EXPECT_EQ(QZFontFileExtension(trueType, sizeof trueType), ".ttf");
    EXPECT_EQ(QZFontFileExtension(reinterpret_cast<const unsigned char*>("OTTO"), 4), ".otf");
    EXPECT_EQ(QZFontFileExtension(reinterpret_cast<const unsigned char*>("ttcf"), 4), ".ttc");
    EXPECT_EQ(QZFontFileExtension(reinterpret_cast<const unsigned char*>("wOF2"), 4), ".woff2");
    EXPECT_EQ(QZFontFileExtension(reinterpret_cast<const unsigned char*>("<htm"), 4), ".font");
    EXPECT_EQ(QZFontFileExtension(trueType, 3), ".font");
}

} // namespace

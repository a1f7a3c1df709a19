#include "desktop/QZFontDownloader.h"

#include <QCoreApplication>
#include <QStandardPaths>
#include <QString>
#include <algorithm>
#include <cerrno>
#include <condition_variable>
#include <cstring>
#include <curl/curl.h>
#include <deque>
#include <filesystem>
#include <map>
#include <memory>
#include <optional>
#include <strings.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <thread>
#include <unistd.h>

#include "desktop/QZCurlHandle.h"
#include "desktop/QZFontFileWriter.h"
#include "desktop/QZFontMatching.h"
#include "desktop/QZPartialDownload.h"
#include "desktop/QZSHA256.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"

namespace {

constexpr size_t kMaximumBaseNameLength = 80;
/// The longest wait in the transfer loop; Cancel() wakes it sooner.
constexpr int kPollTimeoutMilliseconds = 1000;
/// The longest wait for another thread's transfer of the same asset before the cancellation is
/// looked at again.
constexpr std::chrono::milliseconds kShareWaitInterval{50};
/// libcurl's receive buffer: its largest size, so that a large asset costs fewer callbacks and
/// system calls.
constexpr long kReceiveBufferSize = 512 * 1024;
/// How often a cut transfer is resumed on its own before the download fails.
constexpr int kMaximumResumes = 3;

std::string Text(const char* sourceText) {
    return QCoreApplication::translate("QZFontDownloader", sourceText).toStdString();
}
std::string Text(const char* sourceText, const QString& argument) {
    return QCoreApplication::translate("QZFontDownloader", sourceText).arg(argument).toStdString();
}
std::string Text(const char* sourceText, uint64_t first, uint64_t second) {
    return QCoreApplication::translate("QZFontDownloader", sourceText)
        .arg(qulonglong(first))
        .arg(qulonglong(second))
        .toStdString();
}

using Clock = std::chrono::steady_clock;

std::mutex gLimitsMutex;
QZDownloadLimits gLimits;

/// State shared with libcurl's callbacks during one try of a transfer.
struct Transfer {
    CURL* easy = nullptr;
    QZPartialDownload* partial = nullptr;
    std::optional<QZSHA256Digest>* digest = nullptr;
    uint64_t expectedSize = 0;
    uint64_t resumedFrom = 0; ///< bytes kept before this try, asked for with a range
    uint64_t written = 0;     ///< bytes in the partial file
    uint64_t reported = 0;
    const QZDownloadProgressFunction* progress = nullptr;
    QZDownloadCancellation* cancellation = nullptr;

    QZDownloadLimits limits;
    Clock::time_point start = Clock::now();
    bool answered = false; ///< a header line or body byte arrived
    bool bodyStarted = false;
    /// Byte counts at most one low-speed window apart, oldest first, taken every eighth of it.
    std::deque<std::pair<Clock::time_point, uint64_t>> samples;

    // The answer's headers (of the last answer, after redirects).
    std::string etag;
    std::string lastModified;
    int64_t rangeStart = -1; ///< of a Content-Range

    // Why the transfer was ended from our side, if it was.
    bool cancelled = false;
    bool stopped = false;
    bool tooLarge = false;
    bool noAnswer = false;
    bool tooSlow = false;
    bool restart = false;       ///< the answer does not continue the kept bytes
    int64_t announcedSize = -1; ///< a Content-Length that differs from the expected size
    int writeError = 0;
};

std::string HeaderValue(const std::string& line, size_t colon) {
    const size_t first = line.find_first_not_of(" \t", colon + 1);
    const size_t last = line.find_last_not_of(" \t\r\n");
    return first == std::string::npos || last < first ? std::string()
                                                      : line.substr(first, last - first + 1);
}

size_t ReceiveHeader(char* bytes, size_t, size_t count, void* context) {
    auto* transfer = static_cast<Transfer*>(context);
    transfer->answered = true;
    const std::string line(bytes, count);
    if (line.rfind("HTTP/", 0) == 0) { // a new answer: a redirect's headers do not count
        transfer->etag.clear();
        transfer->lastModified.clear();
        transfer->rangeStart = -1;
        return count;
    }
    const size_t colon = line.find(':');
    if (colon == std::string::npos)
        return count;
    const std::string name = line.substr(0, colon);
    if (strcasecmp(name.c_str(), "ETag") == 0) {
        transfer->etag = HeaderValue(line, colon);
    } else if (strcasecmp(name.c_str(), "Last-Modified") == 0) {
        transfer->lastModified = HeaderValue(line, colon);
    } else if (strcasecmp(name.c_str(), "Content-Range") == 0) {
        const std::string value = HeaderValue(line, colon);
        unsigned long long first = 0;
        if (std::sscanf(value.c_str(), "bytes %llu-", &first) == 1)
            transfer->rangeStart = int64_t(first);
    }
    return count;
}

/// The first body bytes of an answer: whether it continues the kept bytes (206 from where they
/// end, with the same ETag) or starts over (200: the kept bytes are dropped).
bool StartBody(Transfer& transfer) {
    transfer.bodyStarted = true;
    long status = 0;
    curl_easy_getinfo(transfer.easy, CURLINFO_RESPONSE_CODE, &status);
    if (status == 206) {
        const std::string& kept = transfer.partial->ETag();
        if (transfer.rangeStart != int64_t(transfer.resumedFrom) ||
            (!kept.empty() && !transfer.etag.empty() && transfer.etag != kept)) {
            transfer.restart = true;
            return false;
        }
    } else if (transfer.partial->Size() > 0) {
        if (!transfer.partial->Clear()) {
            transfer.writeError = errno;
            return false;
        }
        transfer.digest->emplace();
        transfer.written = 0;
    }
    curl_off_t announced = -1;
    if (curl_easy_getinfo(transfer.easy, CURLINFO_CONTENT_LENGTH_DOWNLOAD_T, &announced) ==
            CURLE_OK &&
        announced >= 0 && uint64_t(announced) != transfer.expectedSize - transfer.written) {
        transfer.announcedSize = announced + int64_t(transfer.written);
        return false;
    }
    transfer.partial->SetValidators(transfer.etag, transfer.lastModified);
    return true;
}

size_t WriteBody(char* bytes, size_t, size_t count, void* context) {
    auto* transfer = static_cast<Transfer*>(context);
    transfer->answered = true;
    if (!transfer->bodyStarted && !StartBody(*transfer))
        return CURL_WRITEFUNC_ERROR;
    if (count > transfer->expectedSize - transfer->written) {
        transfer->tooLarge = true;
        return CURL_WRITEFUNC_ERROR;
    }
    (*transfer->digest)->Update(bytes, count);
    if (!transfer->partial->Append(bytes, count)) {
        transfer->writeError = errno;
        return CURL_WRITEFUNC_ERROR;
    }
    transfer->written += count;
    return count;
}

/// Whether the transfer is too slow to go on: no answer within the connect timeout, or less than
/// the low-speed limit on average over the last window.
bool IsTooSlow(Transfer& transfer) {
    const Clock::time_point now = Clock::now();
    if (!transfer.answered) {
        transfer.noAnswer = now - transfer.start >= transfer.limits.connectTimeout;
        return transfer.noAnswer;
    }
    const auto window = transfer.limits.lowSpeedWindow;
    if (transfer.samples.empty() || now - transfer.samples.back().first >= window / 8)
        transfer.samples.emplace_back(now, transfer.written);
    while (transfer.samples.size() > 2 && now - transfer.samples[1].first >= window)
        transfer.samples.pop_front();
    const auto& [oldest, bytes] = transfer.samples.front();
    const double seconds = std::chrono::duration<double>(now - oldest).count();
    transfer.tooSlow =
        now - oldest >= window &&
        double(transfer.written - bytes) < seconds * double(transfer.limits.lowSpeedBytesPerSecond);
    return transfer.tooSlow;
}

int TransferProgress(void* context, curl_off_t, curl_off_t, curl_off_t, curl_off_t) {
    auto* transfer = static_cast<Transfer*>(context);
    if (transfer->cancellation && transfer->cancellation->IsCancelled()) {
        transfer->cancelled = true;
        return 1;
    }
    if (IsTooSlow(*transfer))
        return 1;
    if (transfer->written != transfer->reported) {
        transfer->reported = transfer->written;
        if (*transfer->progress && !(*transfer->progress)(transfer->written)) {
            transfer->stopped = true;
            return 1;
        }
    }
    return 0;
}

bool IsHTTPScheme(CURL* easy) {
    const char* scheme = nullptr;
    return curl_easy_getinfo(easy, CURLINFO_SCHEME, &scheme) == CURLE_OK && scheme &&
           (strcasecmp(scheme, "http") == 0 || strcasecmp(scheme, "https") == 0);
}

/// Runs the transfer to its end, cancellation or failure; the libcurl result.
CURLcode RunTransfer(CURL* easy, Transfer& transfer, QZDownloadCancellation* cancellation) {
    CURLM* multi = curl_multi_init();
    if (!multi)
        return CURLE_OUT_OF_MEMORY;
    CURLcode result = CURLE_OK;
    if (curl_multi_add_handle(multi, easy) != CURLM_OK) {
        curl_multi_cleanup(multi);
        return CURLE_OUT_OF_MEMORY;
    }
    if (cancellation)
        cancellation->Attach(multi);
    // The speed checks run at least eight times per window.
    const auto window =
        std::chrono::duration_cast<std::chrono::milliseconds>(transfer.limits.lowSpeedWindow / 8);
    const int pollTimeout = int(std::clamp<int64_t>(window.count(), 10, kPollTimeoutMilliseconds));
    bool done = false;
    while (!done) {
        int running = 0;
        if (curl_multi_perform(multi, &running) != CURLM_OK) {
            result = CURLE_RECV_ERROR;
            break;
        }
        int queued = 0;
        while (CURLMsg* message = curl_multi_info_read(multi, &queued)) {
            if (message->msg == CURLMSG_DONE) {
                result = message->data.result;
                done = true;
            }
        }
        if (done)
            break;
        if (cancellation && cancellation->IsCancelled()) {
            transfer.cancelled = true;
            result = CURLE_ABORTED_BY_CALLBACK;
            break;
        }
        if (curl_multi_poll(multi, nullptr, 0, pollTimeout, nullptr) != CURLM_OK) {
            result = CURLE_RECV_ERROR;
            break;
        }
    }
    if (cancellation)
        cancellation->Attach(nullptr);
    curl_multi_remove_handle(multi, easy);
    curl_multi_cleanup(multi);
    return result;
}

QZFontDownloadResult Failure(std::string reason) {
    return {QZFontDownloadOutcome::Failed, {}, std::move(reason)};
}

QZFontDownloadResult WriteFailure(int error) {
    return Failure(
        Text("The font file cannot be written: %1", QString::fromLocal8Bit(std::strerror(error))));
}

QString Seconds(std::chrono::milliseconds duration) {
    return QString::number(double(duration.count()) / 1000.0);
}

/// The reason for a transfer that our side or libcurl ended with `code`.
std::string TransferFailureReason(const Transfer& transfer, CURL* easy, CURLcode code,
                                  const char* detail) {
    if (transfer.announcedSize >= 0)
        return Text("The server offers %1 bytes, but the font should have %2 bytes.",
                    uint64_t(transfer.announcedSize), transfer.expectedSize);
    if (transfer.tooLarge || code == CURLE_FILESIZE_EXCEEDED)
        return Text("The server sent more than the %1 bytes of the font.",
                    QString::number(qulonglong(transfer.expectedSize)));
    if (transfer.writeError)
        return WriteFailure(transfer.writeError).failureReason;
    if (transfer.noAnswer || (code == CURLE_OPERATION_TIMEDOUT && !transfer.answered))
        return Text("The server did not answer within %1 seconds.",
                    Seconds(transfer.limits.connectTimeout));
    if (transfer.tooSlow)
        return QCoreApplication::translate("QZFontDownloader",
                                           "The download was given up: the server sent less "
                                           "than %1 bytes per second over %2 seconds.")
            .arg(qulonglong(transfer.limits.lowSpeedBytesPerSecond))
            .arg(Seconds(transfer.limits.lowSpeedWindow))
            .toStdString();
    if (code == CURLE_HTTP_RETURNED_ERROR) {
        long status = 0;
        curl_easy_getinfo(easy, CURLINFO_RESPONSE_CODE, &status);
        return Text("The server answered with the HTTP status %1.", QString::number(status));
    }
    if (code == CURLE_UNSUPPORTED_PROTOCOL)
        return Text("Fonts are downloaded only from https, http and file addresses, and "
                    "redirected only to https and http ones.");
    if (code == CURLE_PARTIAL_FILE)
        return Text("The connection ended after %1 of %2 bytes.", transfer.written,
                    transfer.expectedSize);
    return Text("The download failed: %1",
                QString::fromUtf8(detail && *detail ? detail : curl_easy_strerror(code)));
}

bool IsNameByte(unsigned char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' ||
           c == '_' || c == '.';
}

/// Reads the completed temporary as a font; the failure reason when it is not one or lacks a
/// requested font, empty when it passes.
std::string CheckFontFile(const QZFontFileWriter& file, const QZFontAssetDownload& asset) {
    const std::optional<std::vector<std::string>> names =
        QZFontFilePostScriptNames(file.ReadablePath());
    if (!names)
        return Text("The downloaded file is not a font.");
    for (const std::string& wanted : asset.postScriptNames)
        if (std::find(names->begin(), names->end(), wanted) == names->end())
            return Text("The downloaded file does not hold the font “%1”.",
                        QString::fromStdString(wanted));
    return {};
}

/// Sets up `easy` for `asset`, its callbacks working on `transfer`.
void ConfigureTransfer(CURL* easy, const QZFontAssetDownload& asset, Transfer& transfer,
                       char* detail) {
    curl_easy_setopt(easy, CURLOPT_URL, asset.url.c_str());
    curl_easy_setopt(easy, CURLOPT_PROTOCOLS_STR, "http,https,file");
    // A redirect never leads to a local file.
    curl_easy_setopt(easy, CURLOPT_REDIR_PROTOCOLS_STR, "http,https");
    curl_easy_setopt(easy, CURLOPT_FOLLOWLOCATION, 1L);
    curl_easy_setopt(easy, CURLOPT_MAXREDIRS, 10L);
    curl_easy_setopt(easy, CURLOPT_FAILONERROR, 1L);
    curl_easy_setopt(easy, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(easy, CURLOPT_CONNECTTIMEOUT_MS, long(transfer.limits.connectTimeout.count()));
    curl_easy_setopt(easy, CURLOPT_MAXFILESIZE_LARGE, curl_off_t(asset.size));
    curl_easy_setopt(easy, CURLOPT_BUFFERSIZE, kReceiveBufferSize);
    curl_easy_setopt(easy, CURLOPT_USERAGENT, "Glyphwell font downloader");
    curl_easy_setopt(easy, CURLOPT_ERRORBUFFER, detail);
    curl_easy_setopt(easy, CURLOPT_HEADERFUNCTION, ReceiveHeader);
    curl_easy_setopt(easy, CURLOPT_HEADERDATA, &transfer);
    curl_easy_setopt(easy, CURLOPT_WRITEFUNCTION, WriteBody);
    curl_easy_setopt(easy, CURLOPT_WRITEDATA, &transfer);
    curl_easy_setopt(easy, CURLOPT_NOPROGRESS, 0L);
    curl_easy_setopt(easy, CURLOPT_XFERINFOFUNCTION, TransferProgress);
    curl_easy_setopt(easy, CURLOPT_XFERINFODATA, &transfer);
}

/// The validator that makes a range request safe: a strong ETag, else the Last-Modified date;
/// empty when the kept bytes have neither (a weak ETag never is one).
std::string RangeValidator(const QZPartialDownload& partial) {
    if (!partial.ETag().empty() && partial.ETag().rfind("W/", 0) != 0)
        return partial.ETag();
    return partial.LastModified();
}

/// Digests the bytes kept in `partial` into a new `digest`; false when they cannot be read.
bool DigestKept(const QZPartialDownload& partial, std::optional<QZSHA256Digest>& digest) {
    digest.emplace();
    std::vector<char> buffer(kReceiveBufferSize);
    for (uint64_t offset = 0; offset < partial.Size();) {
        const ssize_t count = pread(
            partial.Descriptor(), buffer.data(),
            size_t(std::min<uint64_t>(buffer.size(), partial.Size() - offset)), off_t(offset));
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            return false;
        digest->Update(buffer.data(), size_t(count));
        offset += uint64_t(count);
    }
    return digest->IsValid();
}

/// Why `asset` cannot be downloaded for lack of space, or empty: the bytes still to come must fit
/// beside the partial file, and the whole file in the font folder.
std::string FreeSpaceProblem(const QZFontAssetDownload& asset, const QZPartialDownload& partial,
                             const std::string& directory) {
    struct statvfs cache {
    }, fonts{};
    if (statvfs(QZPartialDownloadDirectory().c_str(), &cache) != 0 ||
        statvfs(directory.c_str(), &fonts) != 0)
        return {};
    const auto available = [](const struct statvfs& status) {
        return uint64_t(status.f_bavail) * uint64_t(status.f_frsize);
    };
    const uint64_t toCome = asset.size - partial.Size();
    const bool shared = cache.f_fsid == fonts.f_fsid;
    const uint64_t needed = shared ? toCome + asset.size : asset.size;
    const bool fits = available(fonts) >= needed && (shared || available(cache) >= toCome);
    if (fits)
        return {};
    return QCoreApplication::translate("QZFontDownloader",
                                       "There is not enough free space for the font: it needs "
                                       "%1 bytes, and %2 has %3 bytes free.")
        .arg(qulonglong(shared || available(fonts) < needed ? needed : toCome))
        .arg(QString::fromStdString(available(fonts) < needed ? directory
                                                              : QZPartialDownloadDirectory()))
        .arg(qulonglong(available(fonts) < needed ? available(fonts) : available(cache)))
        .toStdString();
}

/// Waits `pause` before a resume; false when the download was cancelled meanwhile.
bool PauseBeforeResume(std::chrono::milliseconds pause, QZDownloadCancellation* cancellation) {
    const auto end = Clock::now() + pause;
    while (Clock::now() < end) {
        if (cancellation && cancellation->IsCancelled())
            return false;
        std::this_thread::sleep_for(
            std::min<Clock::duration>(end - Clock::now(), std::chrono::milliseconds(20)));
    }
    return !(cancellation && cancellation->IsCancelled());
}

/// Copies the complete `partial` into `file`, with the first bytes into `head`.
bool CopyPartial(const QZPartialDownload& partial, QZFontFileWriter& file,
                 unsigned char (&head)[4]) {
    std::vector<char> buffer(kReceiveBufferSize);
    for (uint64_t offset = 0; offset < partial.Size();) {
        const ssize_t count =
            pread(partial.Descriptor(), buffer.data(), buffer.size(), off_t(offset));
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            return false;
        if (offset == 0)
            std::memcpy(head, buffer.data(), std::min<size_t>(size_t(count), sizeof head));
        if (!file.Write(buffer.data(), size_t(count)))
            return false;
        offset += uint64_t(count);
    }
    return true;
}

/// Fetches `asset` into its partial file, resuming a cut transfer up to kMaximumResumes times,
/// checks its size and SHA-256, and copies it into `file`. Installed (without a path) when every
/// byte arrived as expected; otherwise the outcome that ends the download. A cancelled, stopped
/// or cut download keeps its partial file for the next try.
QZFontDownloadResult Fetch(const QZFontAssetDownload& asset, const std::string& directory,
                           QZFontFileWriter& file, const QZDownloadProgressFunction& progress,
                           QZDownloadCancellation* cancellation, unsigned char (&head)[4]) {
    QZPartialDownload partial;
    if (!partial.Open(QZPartialDownloadDirectory(), asset.sha256, asset.url, asset.size))
        return WriteFailure(errno);
    if (std::string problem = FreeSpaceProblem(asset, partial, directory); !problem.empty())
        return Failure(std::move(problem));
    std::optional<QZSHA256Digest> digest;
    if (!DigestKept(partial, digest) && !partial.Clear())
        return WriteFailure(errno);
    if (!digest->IsValid())
        return Failure(Text("The download failed: %1", QStringLiteral("out of memory")));
    // The bytes kept count as done from the start.
    if (partial.Size() > 0 && progress && !progress(partial.Size()))
        return {QZFontDownloadOutcome::Stopped, {}, {}};
    const QZDownloadLimits limits = QZCurrentDownloadLimits();
    for (int resumes = 0;; ++resumes) {
        const std::string validator = RangeValidator(partial);
        if (partial.Size() > 0 && validator.empty()) {
            // Nothing tells whether the server's file is still the one the bytes came from.
            if (!partial.Clear())
                return WriteFailure(errno);
            digest.emplace();
        }
        const QZCurlHandle easy = QZCreateCurlHandle();
        if (!easy)
            return Failure(Text("The download failed: %1", QStringLiteral("out of memory")));
        Transfer transfer;
        transfer.easy = easy.get();
        transfer.partial = &partial;
        transfer.digest = &digest;
        transfer.expectedSize = asset.size;
        transfer.resumedFrom = transfer.written = transfer.reported = partial.Size();
        transfer.progress = &progress;
        transfer.cancellation = cancellation;
        transfer.limits = limits;
        char detail[CURL_ERROR_SIZE] = {};
        ConfigureTransfer(easy.get(), asset, transfer, detail);
        // No compression: the bytes must be the file's, countable against its size and ranges.
        curl_slist* headers = curl_slist_append(nullptr, "Accept-Encoding:");
        const std::string range = std::to_string(transfer.resumedFrom) + "-";
        if (transfer.resumedFrom > 0) {
            curl_easy_setopt(easy.get(), CURLOPT_RANGE, range.c_str());
            headers = curl_slist_append(headers, ("If-Range: " + validator).c_str());
        }
        const std::unique_ptr<curl_slist, decltype(&curl_slist_free_all)> headerList(
            headers, curl_slist_free_all);
        curl_easy_setopt(easy.get(), CURLOPT_HTTPHEADER, headers);

        const CURLcode code = RunTransfer(easy.get(), transfer, cancellation);
        if (transfer.cancelled)
            return {QZFontDownloadOutcome::Cancelled, {}, {}};
        if (transfer.stopped)
            return {QZFontDownloadOutcome::Stopped, {}, {}};
        long status = 0;
        curl_easy_getinfo(easy.get(), CURLINFO_RESPONSE_CODE, &status);
        const bool http = IsHTTPScheme(easy.get());
        if (http && status == 416 && transfer.resumedFrom == asset.size)
            break; // every byte was kept already; the digest below decides
        const bool again = transfer.restart || (http && status == 416);
        if (again && resumes < kMaximumResumes) {
            if (!partial.Clear())
                return WriteFailure(errno);
            digest.emplace();
            continue;
        }
        if (code == CURLE_OK && !again) {
            if (http && status != 200 && status != 206)
                return Failure(
                    Text("The server answered with the HTTP status %1.", QString::number(status)));
            break;
        }
        // Cut off mid-body: resumed after a pause that grows with each resume.
        const bool cut = !again && transfer.written > transfer.resumedFrom && !transfer.tooLarge &&
                         transfer.announcedSize < 0 && !transfer.writeError && !transfer.tooSlow;
        if (cut && resumes < kMaximumResumes) {
            if (!PauseBeforeResume(limits.resumePause * (1 << resumes), cancellation))
                return {QZFontDownloadOutcome::Cancelled, {}, {}};
            continue;
        }
        return Failure(again ? Text("The server's file changed during the download.")
                             : TransferFailureReason(transfer, easy.get(), code, detail));
    }
    if (partial.Size() != asset.size) {
        partial.Remove();
        return Failure(Text("The download holds %1 bytes, but the font should have %2 bytes.",
                            partial.Size(), asset.size));
    }
    const std::string sha256 = digest->FinishHex();
    if (sha256.empty() || strcasecmp(sha256.c_str(), asset.sha256.c_str()) != 0) {
        partial.Remove();
        return Failure(Text("The downloaded file is damaged: its SHA-256 checksum is not the "
                            "expected one."));
    }
    if (!CopyPartial(partial, file, head))
        return WriteFailure(errno);
    partial.Remove();
    return {QZFontDownloadOutcome::Installed, {}, {}};
}

/// The files that an installed copy of the asset `baseName` may have, one per extension.
std::vector<std::string> InstalledCopies(const std::string& directory,
                                         const std::string& baseName) {
    std::vector<std::string> copies;
    for (const char* extension : {".ttf", ".otf", ".ttc", ".woff", ".woff2", ".font"}) {
        std::string path = directory + "/" + baseName + extension;
        struct stat status {};
        if (lstat(path.c_str(), &status) == 0)
            copies.push_back(std::move(path));
    }
    return copies;
}

/// Puts the checked `file` in place as `path`, replacing the installed copies of the asset, and
/// registers it; logs one line per file replaced.
QZFontDownloadResult Install(QZFontFileWriter& file, const std::string& directory,
                             const std::string& baseName, const std::string& path) {
    const std::vector<std::string> replaced = InstalledCopies(directory, baseName);
    if (!file.Publish(path))
        return WriteFailure(errno);
    for (const std::string& old : replaced) {
        // A copy under another extension is left over from an earlier version of the asset.
        if (old != path && unlink(old.c_str()) != 0)
            continue;
        glyphwell::AppLog("Replaced the installed font file %s with a new download",
                          glyphwell::LogEscape(old).c_str());
    }
    if (!QZRegisterInstalledFontFile(path, directory))
        glyphwell::AppLog("Cannot register the downloaded font file %s with fontconfig",
                          glyphwell::LogEscape(path).c_str());
    return {QZFontDownloadOutcome::Installed, path, {}};
}

/// Downloads, checks and installs `asset`: the download itself, without sharing.
QZFontDownloadResult DownloadAndInstall(const QZFontAssetDownload& asset,
                                        const std::string& directory,
                                        const QZDownloadProgressFunction& progress,
                                        QZDownloadCancellation* cancellation) {
    std::error_code error;
    std::filesystem::create_directories(directory, error);
    if (error)
        return Failure(Text("The font folder cannot be created: %1",
                            QString::fromStdString(directory + ": " + error.message())));
    QZRemoveStaleFontTemporaries(directory);
    const std::string baseName = QZFontFileBaseName(asset.localID);
    QZFontFileWriter file;
    if (!file.Open(directory, baseName))
        return WriteFailure(errno);
    unsigned char head[4] = {};
    QZFontDownloadResult result = Fetch(asset, directory, file, progress, cancellation, head);
    if (result.outcome != QZFontDownloadOutcome::Installed)
        return result;
    if (!file.Sync())
        return WriteFailure(errno);
    if (std::string reason = CheckFontFile(file, asset); !reason.empty())
        return Failure(std::move(reason));
    const std::string path = directory + "/" + baseName +
                             QZFontFileExtension(head, size_t(std::min<uint64_t>(asset.size, 4)));
    return Install(file, directory, baseName, path);
}

/// A download in progress that later requests for the same asset wait for.
struct SharedDownload {
    uint64_t size = 0;
    std::string sha256;
    std::mutex mutex;
    std::condition_variable changed;
    uint64_t received = 0;
    bool done = false;
    QZFontDownloadResult result;
};

std::mutex gSharedDownloadsMutex;
std::map<std::string, std::shared_ptr<SharedDownload>> gSharedDownloads; ///< by target base path

/// Downloads for every request of the asset that comes while it runs.
QZFontDownloadResult DownloadAsOwner(const QZFontAssetDownload& asset, const std::string& directory,
                                     const QZDownloadProgressFunction& progress,
                                     QZDownloadCancellation* cancellation, const std::string& key,
                                     SharedDownload& shared) {
    const QZDownloadProgressFunction reporting = [&](uint64_t received) {
        {
            std::lock_guard<std::mutex> lock(shared.mutex);
            shared.received = received;
        }
        shared.changed.notify_all();
        return !progress || progress(received);
    };
    QZFontDownloadResult result = DownloadAndInstall(asset, directory, reporting, cancellation);
    {
        std::lock_guard<std::mutex> lock(gSharedDownloadsMutex);
        gSharedDownloads.erase(key);
    }
    {
        std::lock_guard<std::mutex> lock(shared.mutex);
        shared.done = true;
        shared.result = result;
    }
    shared.changed.notify_all();
    return result;
}

/// Waits for another thread's download of the asset, reporting its progress; its outcome when it
/// applies to this request, nothing when this request must download on its own (the other one
/// was cancelled or stopped, or fetched another version of the asset into the same file).
std::optional<QZFontDownloadResult> WaitForShared(SharedDownload& shared,
                                                  const QZFontAssetDownload& asset,
                                                  const QZDownloadProgressFunction& progress,
                                                  QZDownloadCancellation* cancellation) {
    // The size and checksum are set before the download is shared and never change.
    const bool sameVersion =
        shared.size == asset.size && strcasecmp(shared.sha256.c_str(), asset.sha256.c_str()) == 0;
    uint64_t reported = 0;
    std::unique_lock<std::mutex> lock(shared.mutex);
    for (;;) {
        if (cancellation && cancellation->IsCancelled())
            return QZFontDownloadResult{QZFontDownloadOutcome::Cancelled, {}, {}};
        if (shared.done)
            break;
        if (sameVersion && shared.received != reported) {
            reported = shared.received;
            lock.unlock();
            const bool goOn = !progress || progress(reported);
            lock.lock();
            if (!goOn)
                return QZFontDownloadResult{QZFontDownloadOutcome::Stopped, {}, {}};
            continue;
        }
        // Cancel() does not know this wait: it is seen within one interval.
        shared.changed.wait_for(lock, kShareWaitInterval);
    }
    const QZFontDownloadResult& result = shared.result;
    if (result.outcome == QZFontDownloadOutcome::Cancelled ||
        result.outcome == QZFontDownloadOutcome::Stopped || !sameVersion)
        return std::nullopt;
    return result;
}
} // namespace

void QZSetDownloadLimits(const QZDownloadLimits& limits) {
    std::lock_guard<std::mutex> lock(gLimitsMutex);
    gLimits = limits;
}

QZDownloadLimits QZCurrentDownloadLimits() {
    std::lock_guard<std::mutex> lock(gLimitsMutex);
    return gLimits;
}

void QZDownloadCancellation::Cancel() {
    cancelled_.store(true, std::memory_order_release);
    std::lock_guard<std::mutex> lock(mutex_);
    if (multiHandle_)
        curl_multi_wakeup(static_cast<CURLM*>(multiHandle_));
}

void QZDownloadCancellation::Attach(void* multiHandle) {
    std::lock_guard<std::mutex> lock(mutex_);
    multiHandle_ = multiHandle;
}

std::string QZFontInstallDirectory() {
    const QString data = QStandardPaths::writableLocation(QStandardPaths::GenericDataLocation);
    return (data + QStringLiteral("/fonts/glyphwell")).toStdString();
}

std::string QZFontFileBaseName(const std::string& localID) {
    std::string name;
    bool changed = localID.empty();
    for (unsigned char c : localID) {
        if (name.size() == kMaximumBaseNameLength) {
            changed = true;
            break;
        }
        if (!IsNameByte(c) || (c == '.' && name.empty())) {
            name += '_';
            changed = true;
        } else {
            name += char(c);
        }
    }
    if (name.empty())
        name = "font";
    if (changed) {
        name += '-';
        name.append(QZSHA256Hex(localID), 0, 16);
    }
    return name;
}

std::string QZFontFileExtension(const unsigned char* bytes, size_t count) {
    if (count < 4)
        return ".font";
    auto is = [bytes](const char* tag) { return std::memcmp(bytes, tag, 4) == 0; };
    static const unsigned char trueTypeVersion[4] = {0, 1, 0, 0};
    if (std::memcmp(bytes, trueTypeVersion, 4) == 0 || is("true"))
        return ".ttf";
    if (is("OTTO"))
        return ".otf";
    if (is("ttcf"))
        return ".ttc";
    if (is("wOFF"))
        return ".woff";
    if (is("wOF2"))
        return ".woff2";
    return ".font";
}

QZFontDownloadResult QZDownloadFontAsset(const QZFontAssetDownload& asset,
                                         const std::string& directory,
                                         const QZDownloadProgressFunction& progress,
                                         QZDownloadCancellation* cancellation) {
    const std::string key = directory + "/" + QZFontFileBaseName(asset.localID);
    for (;;) {
        if (cancellation && cancellation->IsCancelled())
            return {QZFontDownloadOutcome::Cancelled, {}, {}};
        std::shared_ptr<SharedDownload> shared;
        bool owner = false;
        {
            std::lock_guard<std::mutex> lock(gSharedDownloadsMutex);
            std::shared_ptr<SharedDownload>& entry = gSharedDownloads[key];
            if (!entry) {
                entry = std::make_shared<SharedDownload>();
                entry->size = asset.size;
                entry->sha256 = asset.sha256;
                owner = true;
            }
            shared = entry;
        }
        if (owner)
            return DownloadAsOwner(asset, directory, progress, cancellation, key, *shared);
        std::optional<QZFontDownloadResult> result =
            WaitForShared(*shared, asset, progress, cancellation);
        if (result)
            return *result;
        // The other transfer was cancelled or stopped by its owner, or fetched another version.
    }
}

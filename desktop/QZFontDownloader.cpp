#include "desktop/QZFontDownloader.h"

#include <QCoreApplication>
#include <QStandardPaths>
#include <QString>
#include <cerrno>
#include <cstring>
#include <curl/curl.h>
#include <fcntl.h>
#include <filesystem>
#include <openssl/evp.h>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>

#include "desktop/QZFontMatching.h"
#include "platform/Log.h"

namespace {

constexpr size_t kMaximumBaseNameLength = 80;
/// How long a transfer may wait for its first byte of connection, and how long it may go
/// without receiving anything, before it counts as failed.
constexpr long kConnectTimeoutSeconds = 30;
constexpr long kStallTimeoutSeconds = 60;
/// The longest wait in the transfer loop; Cancel() wakes it sooner.
constexpr int kPollTimeoutMilliseconds = 1000;
/// libcurl's receive buffer: its largest size, so that a large asset costs fewer callbacks and
/// system calls.
constexpr long kReceiveBufferSize = 512 * 1024;

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

void InitializeCurlOnce() {
    static std::once_flag once;
    std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
}

std::string Hex(const unsigned char* bytes, size_t count) {
    static const char digits[] = "0123456789abcdef";
    std::string text;
    text.reserve(count * 2);
    for (size_t i = 0; i < count; ++i) {
        text += digits[bytes[i] >> 4];
        text += digits[bytes[i] & 15];
    }
    return text;
}

/// A SHA-256 computation through OpenSSL's digest interface.
class SHA256Digest {
public:
    SHA256Digest() : context_(EVP_MD_CTX_new()) {
        if (context_ && EVP_DigestInit_ex(context_, EVP_sha256(), nullptr) != 1) {
            EVP_MD_CTX_free(context_);
            context_ = nullptr;
        }
    }
    ~SHA256Digest() { EVP_MD_CTX_free(context_); }
    SHA256Digest(const SHA256Digest&) = delete;
    SHA256Digest& operator=(const SHA256Digest&) = delete;

    bool IsValid() const { return context_ != nullptr; }
    void Update(const void* bytes, size_t count) {
        if (context_ && EVP_DigestUpdate(context_, bytes, count) != 1) {
            EVP_MD_CTX_free(context_);
            context_ = nullptr;
        }
    }
    /// The digest as 64 lower-case hexadecimal digits; empty when the computation failed.
    std::string FinishHex() {
        unsigned char digest[EVP_MAX_MD_SIZE];
        unsigned int length = 0;
        if (!context_ || EVP_DigestFinal_ex(context_, digest, &length) != 1)
            return {};
        return Hex(digest, length);
    }

private:
    EVP_MD_CTX* context_;
};

std::string SHA256Hex(const std::string& bytes) {
    SHA256Digest digest;
    digest.Update(bytes.data(), bytes.size());
    return digest.FinishHex();
}

/// The hidden temporary file a download is written to; removed unless it was renamed into place.
class TemporaryFile {
public:
    TemporaryFile() = default;
    TemporaryFile(const TemporaryFile&) = delete;
    TemporaryFile& operator=(const TemporaryFile&) = delete;
    ~TemporaryFile() {
        Close();
        if (!path_.empty())
            unlink(path_.c_str());
    }

    /// Creates "<directory>/.<baseName>.XXXXXX"; the leading dot keeps fontconfig from scanning
    /// a file that is still being written.
    bool Create(const std::string& directory, const std::string& baseName) {
        std::string pattern = directory + "/." + baseName + ".XXXXXX";
        fd_ = mkostemp(pattern.data(), O_CLOEXEC);
        if (fd_ < 0)
            return false;
        path_ = pattern;
        fchmod(fd_, 0644);
        return true;
    }
    int Descriptor() const { return fd_; }
    const std::string& Path() const { return path_; }
    /// Flushes the bytes to the disk and closes; false with errno set on failure.
    bool SyncAndClose() {
        const bool synced = fsync(fd_) == 0;
        const int syncError = errno;
        const bool closed = Close();
        if (!synced)
            errno = syncError;
        return synced && closed;
    }
    /// Renames the file to `path`, which replaces any file there; false with errno set.
    bool RenameTo(const std::string& path) {
        if (rename(path_.c_str(), path.c_str()) != 0)
            return false;
        path_.clear();
        return true;
    }

private:
    bool Close() {
        if (fd_ < 0)
            return true;
        const bool closed = close(fd_) == 0;
        fd_ = -1;
        return closed;
    }

    int fd_ = -1;
    std::string path_;
};

/// State shared with libcurl's callbacks during one transfer.
struct Transfer {
    CURL* easy = nullptr;
    int fd = -1;
    SHA256Digest digest;
    uint64_t expectedSize = 0;
    uint64_t written = 0;
    uint64_t reported = 0;
    unsigned char head[4] = {};
    const QZDownloadProgressFunction* progress = nullptr;
    QZDownloadCancellation* cancellation = nullptr;

    // Why the transfer was ended from our side, if it was.
    bool cancelled = false;
    bool stopped = false;
    bool tooLarge = false;
    int64_t announcedSize = -1; ///< a Content-Length that differs from the expected size
    int writeError = 0;
};

size_t WriteBody(char* bytes, size_t, size_t count, void* context) {
    auto* transfer = static_cast<Transfer*>(context);
    if (transfer->written == 0) {
        curl_off_t announced = -1;
        if (curl_easy_getinfo(transfer->easy, CURLINFO_CONTENT_LENGTH_DOWNLOAD_T, &announced) ==
                CURLE_OK &&
            announced >= 0 && uint64_t(announced) != transfer->expectedSize) {
            transfer->announcedSize = announced;
            return CURL_WRITEFUNC_ERROR;
        }
    }
    if (count > transfer->expectedSize - transfer->written) {
        transfer->tooLarge = true;
        return CURL_WRITEFUNC_ERROR;
    }
    for (size_t i = 0; i < count && transfer->written + i < sizeof transfer->head; ++i)
        transfer->head[transfer->written + i] = static_cast<unsigned char>(bytes[i]);
    transfer->digest.Update(bytes, count);
    size_t done = 0;
    while (done < count) {
        const ssize_t n = write(transfer->fd, bytes + done, count - done);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0) {
            transfer->writeError = n < 0 ? errno : EIO;
            return CURL_WRITEFUNC_ERROR;
        }
        done += size_t(n);
    }
    transfer->written += count;
    return count;
}

int TransferProgress(void* context, curl_off_t, curl_off_t, curl_off_t, curl_off_t) {
    auto* transfer = static_cast<Transfer*>(context);
    if (transfer->cancellation && transfer->cancellation->IsCancelled()) {
        transfer->cancelled = true;
        return 1;
    }
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
        if (curl_multi_poll(multi, nullptr, 0, kPollTimeoutMilliseconds, nullptr) != CURLM_OK) {
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

/// The reason for a transfer that libcurl ended with `code`.
std::string TransferFailureReason(const Transfer& transfer, CURL* easy, CURLcode code,
                                  const char* detail) {
    if (transfer.announcedSize >= 0)
        return Text("The server offers %1 bytes, but the font should have %2 bytes.",
                    uint64_t(transfer.announcedSize), transfer.expectedSize);
    if (transfer.tooLarge || code == CURLE_FILESIZE_EXCEEDED)
        return Text("The server sent more than the %1 bytes of the font.",
                    QString::number(qulonglong(transfer.expectedSize)));
    if (transfer.writeError)
        return Text("The font file cannot be written: %1",
                    QString::fromLocal8Bit(std::strerror(transfer.writeError)));
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

} // namespace

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
        name.append(SHA256Hex(localID), 0, 16);
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
    if (cancellation && cancellation->IsCancelled())
        return {QZFontDownloadOutcome::Cancelled, {}, {}};
    std::error_code error;
    std::filesystem::create_directories(directory, error);
    if (error)
        return Failure(Text("The font folder cannot be created: %1",
                            QString::fromStdString(directory + ": " + error.message())));
    const std::string baseName = QZFontFileBaseName(asset.localID);
    TemporaryFile file;
    if (!file.Create(directory, baseName))
        return Failure(Text("The font file cannot be written: %1",
                            QString::fromLocal8Bit(std::strerror(errno))));

    InitializeCurlOnce();
    CURL* easy = curl_easy_init();
    if (!easy)
        return Failure(Text("The download failed: %1", QStringLiteral("out of memory")));
    Transfer transfer;
    transfer.easy = easy;
    transfer.fd = file.Descriptor();
    transfer.expectedSize = asset.size;
    transfer.progress = &progress;
    transfer.cancellation = cancellation;
    if (!transfer.digest.IsValid()) {
        curl_easy_cleanup(easy);
        return Failure(Text("The download failed: %1", QStringLiteral("no SHA-256 digest")));
    }

    char detail[CURL_ERROR_SIZE] = {};
    curl_easy_setopt(easy, CURLOPT_URL, asset.url.c_str());
    curl_easy_setopt(easy, CURLOPT_PROTOCOLS_STR, "http,https,file");
    // A redirect never leads to a local file.
    curl_easy_setopt(easy, CURLOPT_REDIR_PROTOCOLS_STR, "http,https");
    curl_easy_setopt(easy, CURLOPT_FOLLOWLOCATION, 1L);
    curl_easy_setopt(easy, CURLOPT_MAXREDIRS, 10L);
    curl_easy_setopt(easy, CURLOPT_FAILONERROR, 1L);
    curl_easy_setopt(easy, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(easy, CURLOPT_CONNECTTIMEOUT, kConnectTimeoutSeconds);
    curl_easy_setopt(easy, CURLOPT_LOW_SPEED_LIMIT, 1L);
    curl_easy_setopt(easy, CURLOPT_LOW_SPEED_TIME, kStallTimeoutSeconds);
    curl_easy_setopt(easy, CURLOPT_MAXFILESIZE_LARGE, curl_off_t(asset.size));
    curl_easy_setopt(easy, CURLOPT_BUFFERSIZE, kReceiveBufferSize);
    curl_easy_setopt(easy, CURLOPT_USERAGENT, "Glyphwell font downloader");
    curl_easy_setopt(easy, CURLOPT_ERRORBUFFER, detail);
    curl_easy_setopt(easy, CURLOPT_WRITEFUNCTION, WriteBody);
    curl_easy_setopt(easy, CURLOPT_WRITEDATA, &transfer);
    curl_easy_setopt(easy, CURLOPT_NOPROGRESS, 0L);
    curl_easy_setopt(easy, CURLOPT_XFERINFOFUNCTION, TransferProgress);
    curl_easy_setopt(easy, CURLOPT_XFERINFODATA, &transfer);

    const CURLcode code = RunTransfer(easy, transfer, cancellation);
    long status = 0;
    curl_easy_getinfo(easy, CURLINFO_RESPONSE_CODE, &status);
    const bool http = IsHTTPScheme(easy);
    std::string reason;
    if (!transfer.cancelled && !transfer.stopped && code != CURLE_OK)
        reason = TransferFailureReason(transfer, easy, code, detail);
    curl_easy_cleanup(easy);

    if (transfer.cancelled)
        return {QZFontDownloadOutcome::Cancelled, {}, {}};
    if (transfer.stopped)
        return {QZFontDownloadOutcome::Stopped, {}, {}};
    if (!reason.empty())
        return Failure(std::move(reason));
    if (http && status != 200)
        return Failure(
            Text("The server answered with the HTTP status %1.", QString::number(status)));
    if (transfer.written != asset.size)
        return Failure(Text("The download holds %1 bytes, but the font should have %2 bytes.",
                            transfer.written, asset.size));
    const std::string digest = transfer.digest.FinishHex();
    if (digest.empty() || strcasecmp(digest.c_str(), asset.sha256.c_str()) != 0)
        return Failure(Text("The downloaded file is damaged: its SHA-256 checksum is not the "
                            "expected one."));
    if (!file.SyncAndClose())
        return Failure(Text("The font file cannot be written: %1",
                            QString::fromLocal8Bit(std::strerror(errno))));

    const std::string path =
        directory + "/" + baseName +
        QZFontFileExtension(transfer.head, size_t(std::min<uint64_t>(transfer.written, 4)));
    if (!file.RenameTo(path))
        return Failure(Text("The font file cannot be written: %1",
                            QString::fromLocal8Bit(std::strerror(errno))));
    if (const int directoryFd = open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
        directoryFd >= 0) {
        fsync(directoryFd);
        close(directoryFd);
    }
    if (!QZRegisterInstalledFontFile(path, directory)) {
        unlink(path.c_str());
        return Failure(Text("The downloaded file is not a font."));
    }
    return {QZFontDownloadOutcome::Installed, path, {}};
}

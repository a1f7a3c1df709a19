// Downloading one font asset and installing it for the user.
//
// The asset is fetched with libcurl (https, http or file URLs; redirects only to http or https)
// into its partial file in the cache (QZPartialDownload), its size and SHA-256 checked as the
// bytes arrive. A transfer cut off mid-body resumes on its own, up to three times with a growing
// pause, with a range request made safe by If-Range; a later download of the asset resumes from
// the partial file too. Once complete and checked, it is copied into a temporary file in the
// destination directory (QZFontFileWriter: unnamed where the file system allows, so that a crash
// leaves nothing). Then the temporary is read as a font and must hold the requested fonts; only
// then does it replace, in one rename, the file installed under a name made from its LocalID
// (never from the URL), and it is registered with fontconfig, so that this process and other
// applications find it. A download that is cancelled, stopped, fails or is rejected leaves the
// directory as it was. A transfer that does not start within the connect timeout, or that
// averages under the low-speed limit over the low-speed window, is given up. Two downloads of
// the same asset into the same directory at the same time share one transfer. Downloads run on
// the calling thread; several may run at once on different threads.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <mutex>
#include <string>
#include <vector>

/// Cancels a download from another thread. Cancel() wakes the transfer at once, wherever it
/// waits, and the download then ends as Cancelled. Thread-safe; a cancellation is final and
/// applies to every download that is given it, also to those that start after Cancel().
class QZDownloadCancellation {
public:
    QZDownloadCancellation() = default;
    QZDownloadCancellation(const QZDownloadCancellation&) = delete;
    QZDownloadCancellation& operator=(const QZDownloadCancellation&) = delete;

    /// Cancels, and wakes the transfer in flight if there is one.
    void Cancel();
    bool IsCancelled() const { return cancelled_.load(std::memory_order_acquire); }

    /// For the downloader: the transfer (a libcurl multi handle) that Cancel() must wake, or null
    /// once it is gone. The downloader detaches before it destroys the handle.
    void Attach(void* multiHandle);

private:
    std::atomic<bool> cancelled_{false};
    std::mutex mutex_; ///< guards multiHandle_ against its destruction during a wake-up
    void* multiHandle_ = nullptr;
};

/// What to download: the asset's catalog entry.
struct QZFontAssetDownload {
    std::string localID;
    std::string url;
    uint64_t size = 0;  ///< exact number of bytes expected
    std::string sha256; ///< 64 hexadecimal digits (either case)
    /// PostScript names the file must hold; empty: any font will do.
    std::vector<std::string> postScriptNames;
};

/// When a transfer is given up.
struct QZDownloadLimits {
    /// The longest wait for the connection and the first bytes of the answer.
    std::chrono::milliseconds connectTimeout{30000};
    /// A transfer that receives less than `lowSpeedBytesPerSecond` on average over any window
    /// this long is given up.
    std::chrono::milliseconds lowSpeedWindow{30000};
    uint64_t lowSpeedBytesPerSecond = 1024;
    /// The pause before the first automatic resume of a cut transfer; it doubles for each next.
    std::chrono::milliseconds resumePause{1000};
};

/// The limits of the downloads that start from now on; process-wide (tests shorten them).
void QZSetDownloadLimits(const QZDownloadLimits& limits);
QZDownloadLimits QZCurrentDownloadLimits();

enum class QZFontDownloadOutcome {
    Installed, ///< the file is in place and fontconfig knows it
    Cancelled, ///< QZDownloadCancellation::Cancel() was called
    Stopped,   ///< the progress function answered false
    Failed     ///< see failureReason
};

struct QZFontDownloadResult {
    QZFontDownloadOutcome outcome = QZFontDownloadOutcome::Failed;
    std::string path;          ///< the installed file, when Installed
    std::string failureReason; ///< a sentence for the user, when Failed
};

/// Told the number of bytes received so far, each time it grows; answers false to stop the
/// download. Runs on the downloading thread, inside the transfer: the transfer waits for it.
using QZDownloadProgressFunction = std::function<bool(uint64_t downloadedBytes)>;

/// Downloads `asset` into `directory` (created with its parents when missing) and installs it.
/// `progress` may be empty; `cancellation` may be null. A file already installed under the same
/// name is replaced only once the new one has been checked, with one log line naming it. Stale
/// temporaries of earlier downloads in `directory` are removed first. While another thread
/// downloads the same asset (same name, size and SHA-256) into `directory`, this call waits for
/// that transfer, reports its progress and returns its outcome; when that one was cancelled or
/// stopped, this call downloads on its own.
QZFontDownloadResult QZDownloadFontAsset(const QZFontAssetDownload& asset,
                                         const std::string& directory,
                                         const QZDownloadProgressFunction& progress,
                                         QZDownloadCancellation* cancellation);

/// Where downloaded fonts go: $XDG_DATA_HOME/fonts/glyphwell (XDG_DATA_HOME defaults to
/// ~/.local/share), a directory that fontconfig's usual configuration scans.
std::string QZFontInstallDirectory();

/// The file name, without extension, of the asset `localID`: its letters, digits, '-', '_' and
/// '.' kept, any other byte made '_', no leading '.', at most 80 bytes ("font" for an empty
/// identifier); when anything had to change, "-" and the first 16 hexadecimal digits of the
/// identifier's SHA-256 follow, so that different identifiers keep different names.
std::string QZFontFileBaseName(const std::string& localID);

/// The extension of a font file from its first bytes: ".ttf", ".otf", ".ttc", ".woff", ".woff2",
/// or ".font" when the bytes name no format known here. `bytes` may be shorter than four.
std::string QZFontFileExtension(const unsigned char* bytes, size_t count);

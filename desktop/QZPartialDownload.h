// The partial file of a font download, kept in $XDG_CACHE_HOME/glyphwell/partial/ (never in the
// font folder) so that a cut transfer resumes where it stopped. The file is named by the asset's
// SHA-256; beside it, NAME.meta holds the URL, the size, and the ETag and Last-Modified of the
// answer its bytes came from. A partial is locked (flock) while a download uses it; one that
// another process holds is not touched, and that download goes without one. Partials unused for
// 7 days are removed. No Qt.
#pragma once

#include <cstdint>
#include <string>

/// How long an unused partial is kept.
inline constexpr int64_t kPartialDownloadLifetime = 7 * 24 * 60 * 60;

class QZPartialDownload {
public:
    QZPartialDownload() = default;
    QZPartialDownload(const QZPartialDownload&) = delete;
    QZPartialDownload& operator=(const QZPartialDownload&) = delete;
    /// Closes the file (kept on disk unless Remove() was called).
    ~QZPartialDownload();

    /// Opens the partial of the asset (`sha256`, `url`, `size`) in `directory` (created when
    /// missing; stale partials removed first). The bytes kept are those of an earlier download
    /// of the same URL and size; others are dropped. When another process holds the partial, an
    /// unnamed file stands in. False with errno set when nothing can be opened.
    bool Open(const std::string& directory, const std::string& sha256, const std::string& url,
              uint64_t size);

    int Descriptor() const { return fd_; }
    /// Bytes kept so far.
    uint64_t Size() const { return size_; }
    /// The validators of the answer the kept bytes came from; empty when unknown.
    const std::string& ETag() const { return etag_; }
    const std::string& LastModified() const { return lastModified_; }

    /// Appends `count` bytes; false with errno set.
    bool Append(const char* bytes, size_t count);
    /// Drops every byte kept, to start over.
    bool Clear();
    /// Records the validators of the answer that the next bytes come from.
    void SetValidators(const std::string& etag, const std::string& lastModified);
    /// Removes the file and its metadata (the download is installed, or its bytes are bad).
    void Remove();

private:
    void WriteMetadata();

    int fd_ = -1;
    uint64_t size_ = 0;
    std::string path_; ///< empty for an unnamed stand-in
    std::string url_;
    uint64_t expected_ = 0;
    std::string etag_;
    std::string lastModified_;
};

/// $XDG_CACHE_HOME/glyphwell/partial.
std::string QZPartialDownloadDirectory();

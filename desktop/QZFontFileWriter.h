// The file a font download is written to, and how it is put in place.
//
// Where the file system allows it, the download goes into an unnamed file (O_TMPFILE) in the font
// directory: a crash at any moment leaves nothing behind. Elsewhere it goes into a hidden file
// ".<base name>.XXXXXX" that its writer keeps locked (flock) while it lives; a temporary of that
// shape whose lock can be taken belongs to a writer that is gone, and
// QZRemoveStaleFontTemporaries removes it. Either way the file is checked while it is still the
// temporary, and only Publish() makes it replace the installed one, in one rename.
#pragma once

#include <string>

/// Removes the hidden temporaries of `directory` whose writer is gone. Never removes a file that
/// a live writer holds, nor anything that is not a regular file of the temporaries' name shape.
void QZRemoveStaleFontTemporaries(const std::string& directory);

class QZFontFileWriter {
public:
    QZFontFileWriter() = default;
    QZFontFileWriter(const QZFontFileWriter&) = delete;
    QZFontFileWriter& operator=(const QZFontFileWriter&) = delete;
    /// Closes the file; a file that was not published is gone afterwards.
    ~QZFontFileWriter();

    /// Creates the temporary in `directory` for a file named after `baseName`; false with errno
    /// set when it cannot. `allowUnnamed` false forces the named temporary (for tests).
    bool Open(const std::string& directory, const std::string& baseName, bool allowUnnamed = true);
    /// Appends `count` bytes; false with errno set.
    bool Write(const char* bytes, size_t count);
    /// Flushes the bytes to the disk; false with errno set.
    bool Sync();
    /// A path that reads the file as written so far, valid until Publish() or destruction.
    std::string ReadablePath() const;
    /// Whether the temporary has no name (O_TMPFILE).
    bool IsUnnamed() const { return unnamed_; }

    /// Puts the file at `target` in one rename, replacing any file there, and flushes the
    /// directory; false with errno set, and the file at `target` untouched.
    bool Publish(const std::string& target);

private:
    bool OpenUnnamed(const std::string& directory);
    bool OpenNamed(const std::string& directory, const std::string& baseName);
    void Close();

    int fd_ = -1;
    bool unnamed_ = false;
    std::string directory_;
    std::string baseName_;
    std::string path_; ///< the named temporary while it exists
};

// The languages a user declined to download fonts for, per application, remembered for 24 h so
// that the same application does not ask again at every start. Kept in one small text file,
// $XDG_STATE_HOME/glyphwell/declined-languages (default ~/.local/state), one line per choice:
// seconds since the epoch, a tab, the language tag, a tab, the application key.
#pragma once

#include <ctime>
#include <string>
#include <vector>

class QZDeclinedLanguages {
public:
    static constexpr time_t kRemembered = 24 * 60 * 60;
    /// Lines beyond this many (the oldest) are forgotten.
    static constexpr size_t kMaximumEntries = 1024;

    /// Uses the file at `path`; an empty path remembers nothing.
    explicit QZDeclinedLanguages(std::string path) : path_(std::move(path)) {}
    /// $XDG_STATE_HOME/glyphwell/declined-languages; empty without a home directory.
    static std::string DefaultPath();

    /// Whether `application` declined `language` less than kRemembered seconds before `now`.
    bool IsDeclined(const std::string& application, const std::string& language, time_t now) const;
    /// Records that `application` declined `languages` at `now`, dropping expired lines; the
    /// file is replaced whole (written beside it, then renamed). False when it cannot be written.
    bool Record(const std::string& application, const std::vector<std::string>& languages,
                time_t now);

private:
    struct Entry {
        time_t time = 0;
        std::string language;
        std::string application;
    };
    std::vector<Entry> Read(time_t now) const;

    std::string path_;
};

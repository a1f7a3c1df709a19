#include "bridge/QZDeclinedLanguages.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "bridge/QZApplicationName.h"

#include "cfutil/CFUserDirectories.h"
#include "platform/ReadFile.h"
#include "platform/ReplaceFile.h"

namespace {

constexpr size_t kMaximumFileSize = 1 << 20;

/// `text` with tabs, line ends and other controls made spaces, so that it fits one field.
std::string Field(const std::string& text) {
    std::string field = text.substr(0, 256);
    for (char& c : field)
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f)
            c = ' ';
    return field;
}

/// Creates `directory` and its missing parents, private to the user.
void MakeDirectories(const std::string& directory) {
    for (size_t slash = directory.find('/', 1); slash != std::string::npos;
         slash = directory.find('/', slash + 1))
        mkdir(directory.substr(0, slash).c_str(), 0700);
    mkdir(directory.c_str(), 0700);
}

} // namespace

std::string QZDeclinedLanguages::DefaultPath() {
    const std::string state = GetUserBaseDirectory(XDGUserDirectory::State);
    return state.empty() ? std::string() : state + "/glyphwell/declined-languages";
}

std::vector<QZDeclinedLanguages::Entry> QZDeclinedLanguages::Read(time_t now) const {
    std::vector<Entry> entries;
    std::string text;
    if (!glyphwell::ReadFileStart(path_, kMaximumFileSize, &text))
        return entries;
    for (size_t start = 0; start < text.size();) {
        const size_t lineEnd = text.find('\n', start);
        if (lineEnd == std::string::npos)
            break; // a line cut short by the size limit or a crash
        const std::string line = text.substr(start, lineEnd - start);
        start = lineEnd + 1;
        const size_t first = line.find('\t');
        const size_t second = first == std::string::npos ? first : line.find('\t', first + 1);
        if (second == std::string::npos)
            continue;
        char* end = nullptr;
        const long long time = std::strtoll(line.c_str(), &end, 10);
        // Lines from over a day ahead (a clock set back, a damaged file) do not count.
        if (end != line.c_str() + first || time < 0 || time > now + kRemembered ||
            now - time >= kRemembered)
            continue;
        entries.push_back(
            {time_t(time), line.substr(first + 1, second - first - 1), line.substr(second + 1)});
    }
    return entries;
}

bool QZDeclinedLanguages::IsDeclined(const std::string& application, const std::string& language,
                                     time_t now) const {
    if (path_.empty())
        return false;
    const std::string key = Field(application);
    for (const Entry& entry : Read(now))
        if (entry.language == language && entry.application == key)
            return true;
    return false;
}

bool QZDeclinedLanguages::Record(const std::string& application,
                                 const std::vector<std::string>& languages, time_t now) {
    if (path_.empty())
        return false;
    std::vector<Entry> entries = Read(now);
    for (const std::string& language : languages)
        entries.push_back({now, Field(language), Field(application)});
    if (entries.size() > kMaximumEntries)
        entries.erase(entries.begin(), entries.end() - kMaximumEntries);
    MakeDirectories(path_.substr(0, path_.rfind('/')));
    std::string text;
    for (const Entry& entry : entries)
        text +=
            std::to_string(entry.time) + '\t' + entry.language + '\t' + entry.application + '\n';
    return glyphwell::ReplaceFile(path_, text, 0600);
}

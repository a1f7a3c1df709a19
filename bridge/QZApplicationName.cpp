#include "bridge/QZApplicationName.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <fcntl.h>
#include <unistd.h>
#include <vector>

#include "cfutil/CFUserDirectories.h"
#include "platform/ReadFile.h"

namespace {

constexpr size_t kMaximumEntrySize = 1 << 20;

/// The user's language preferences as desktop entry locale keys, most wanted first.
std::vector<std::string> LocaleKeys() {
    std::vector<std::string> locales;
    if (const char* list = getenv("LANGUAGE"); list && *list) {
        std::string_view rest(list);
        while (!rest.empty()) {
            const size_t colon = rest.find(':');
            if (colon != 0)
                locales.emplace_back(rest.substr(0, colon));
            rest = colon == std::string_view::npos ? std::string_view() : rest.substr(colon + 1);
        }
    }
    for (const char* variable : {"LC_ALL", "LC_MESSAGES", "LANG"})
        if (const char* value = getenv(variable); value && *value) {
            locales.emplace_back(value);
            break;
        }
    std::vector<std::string> keys;
    for (std::string locale : locales) {
        if (locale == "C" || locale.starts_with("C.") || locale == "POSIX")
            continue;
        // ll_CC.encoding@modifier: the encoding does not count.
        std::string modifier;
        if (const size_t at = locale.find('@'); at != std::string::npos) {
            modifier = locale.substr(at);
            locale.erase(at);
        }
        if (const size_t dot = locale.find('.'); dot != std::string::npos)
            locale.erase(dot);
        const std::string language = locale.substr(0, locale.find('_'));
        for (const std::string& key : {locale + modifier, locale, language + modifier, language})
            if (!key.empty() && std::find(keys.begin(), keys.end(), key) == keys.end())
                keys.push_back(key);
    }
    return keys;
}

} // namespace

std::string QZDesktopEntryPath(std::string_view desktopID) {
    if (desktopID.empty() || desktopID.size() > 255 || desktopID.front() == '.' ||
        desktopID.find('/') != std::string_view::npos ||
        desktopID.find('\0') != std::string_view::npos)
        return {};
    std::string file(desktopID);
    if (!file.ends_with(".desktop"))
        file += ".desktop";
    for (const std::string& directory : GetDataDirectories()) {
        const std::string path = directory + "/applications/" + file;
        if (access(path.c_str(), R_OK) == 0)
            return path;
    }
    return {};
}

std::string QZDesktopEntryName(const std::string& path) {
    std::string text;
    if (!glyphwell::ReadFileStart(path, kMaximumEntrySize + 1, &text) ||
        text.size() > kMaximumEntrySize)
        return {};
    const std::vector<std::string> keys = LocaleKeys();
    std::string name;
    size_t nameRank = SIZE_MAX; ///< index in `keys` of the name found; keys.size() for `Name`
    bool inEntry = false;
    for (size_t start = 0; start < text.size();) {
        size_t end = text.find('\n', start);
        if (end == std::string::npos)
            end = text.size();
        const std::string line = text.substr(start, end - start);
        start = end + 1;
        if (line.starts_with('[')) {
            if (inEntry)
                break; // the group is over
            inEntry = line == "[Desktop Entry]";
            continue;
        }
        if (!inEntry || !line.starts_with("Name"))
            continue;
        const size_t equals = line.find('=');
        if (equals == std::string::npos)
            continue;
        std::string key = line.substr(0, equals);
        while (!key.empty() && key.back() == ' ')
            key.pop_back();
        size_t rank = SIZE_MAX;
        if (key == "Name") {
            rank = keys.size();
        } else if (key.starts_with("Name[") && key.ends_with(']')) {
            const std::string locale = key.substr(5, key.size() - 6);
            rank = size_t(std::find(keys.begin(), keys.end(), locale) - keys.begin());
            if (rank == keys.size())
                rank = SIZE_MAX;
        }
        if (rank < nameRank) {
            const size_t value = line.find_first_not_of(' ', equals + 1);
            name = value == std::string::npos ? std::string() : line.substr(value);
            nameRank = rank;
        }
    }
    return name;
}

std::string QZExecutableName(pid_t pid) {
    const std::string process = "/proc/" + std::to_string(pid);
    char target[PATH_MAX];
    const ssize_t length = readlink((process + "/exe").c_str(), target, sizeof target - 1);
    if (length > 0) {
        std::string path(target, size_t(length));
        if (path.ends_with(" (deleted)"))
            path.erase(path.size() - 10);
        return path.substr(path.rfind('/') + 1);
    }
    std::string name;
    if (!glyphwell::ReadFileStart(process + "/comm", 64, &name))
        return {};
    return name.substr(0, name.find('\n'));
}

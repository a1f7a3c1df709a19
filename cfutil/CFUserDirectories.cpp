#include "cfutil/CFUserDirectories.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <string_view>

#include "cfutil/CFStringUtilities.h"
#include "platform/HomeDirectory.h"

namespace {

/// The home directory of `user` from the password database, or the current user's home
/// directory ($HOME first) when `user` is null; false when there is none.
bool HomeDirectoryPath(const char* user, std::string& home) {
    home = user ? glyphwell::PasswordDatabaseHome(user) : glyphwell::HomeDirectory();
    return !home.empty();
}

/// The value of the environment variable `name` when it is an absolute path.
const char* AbsolutePathVariable(const char* name) {
    const char* value = getenv(name);
    return value && value[0] == '/' ? value : nullptr;
}

/// `home` joined with the relative path `subdirectory`, with exactly one slash between them.
std::string InHome(std::string home, const char* subdirectory) {
    if (home.empty() || home.back() != '/')
        home += '/';
    return home + subdirectory;
}

/// The path that `name` stands for; false when it has none.
bool ConfigurationPath(confstr_path_t name, std::string& path) {
    const char* value = nullptr;
    switch (name) {
    case kUserRuntimeDirectory:
        value = AbsolutePathVariable("XDG_RUNTIME_DIR");
        break;
    case kUserCacheDirectory:
        path = GetUserBaseDirectory(XDGUserDirectory::Cache);
        return !path.empty();
    case kUserTemporaryDirectory:
        value = AbsolutePathVariable("TMPDIR");
        if (!value)
            value = "/tmp";
        break;
    }
    if (!value)
        return false;
    path = value;
    return true;
}

void RemoveTrailingSlashes(std::string& path) {
    while (path.size() > 1 && path.back() == '/')
        path.pop_back();
}

} // namespace

CFURLRef CFCopyHomeDirectoryURLForUser(CFStringRef user) {
    std::string name;
    if (user &&
        (!CFString::GetUTF8(user, name) || name.empty() || name.find('\0') != std::string::npos))
        return nullptr;
    std::string home;
    if (!HomeDirectoryPath(user ? name.c_str() : nullptr, home))
        return nullptr;
    return CFURLCreateFromFileSystemRepresentation(kCFAllocatorDefault,
                                                   reinterpret_cast<const UInt8*>(home.data()),
                                                   CFIndex(home.size()), true);
}

size_t GetConfigurationPath(confstr_path_t name, char* buffer, size_t length) {
    std::string path;
    if (!ConfigurationPath(name, path))
        return 0;
    if (length > 0) {
        size_t copied = std::min(path.size(), length - 1);
        memcpy(buffer, path.data(), copied);
        buffer[copied] = '\0';
    }
    return path.size() + 1;
}

std::string GetUserBaseDirectory(XDGUserDirectory which) {
    static constexpr struct {
        const char* variable;
        const char* inHome;
    } kRules[] = {{"XDG_CACHE_HOME", ".cache"},
                  {"XDG_CONFIG_HOME", ".config"},
                  {"XDG_DATA_HOME", ".local/share"},
                  {"XDG_STATE_HOME", ".local/state"}};
    const auto& rule = kRules[int(which)];
    if (const char* value = AbsolutePathVariable(rule.variable))
        return value;
    std::string home;
    return HomeDirectoryPath(nullptr, home) ? InHome(home, rule.inHome) : std::string();
}

std::vector<std::string> GetSystemDataDirectories() {
    std::vector<std::string> directories;
    const char* dataDirs = getenv("XDG_DATA_DIRS");
    if (!dataDirs || !*dataDirs)
        dataDirs = "/usr/local/share:/usr/share";
    std::string_view list(dataDirs);
    while (!list.empty()) {
        size_t colon = list.find(':');
        std::string_view entry = list.substr(0, colon);
        if (!entry.empty() && entry[0] == '/')
            directories.emplace_back(entry);
        list = colon == std::string_view::npos ? std::string_view() : list.substr(colon + 1);
    }
    for (std::string& directory : directories)
        RemoveTrailingSlashes(directory);
    return directories;
}

std::vector<std::string> GetDataDirectories() {
    std::vector<std::string> directories;
    if (std::string dataHome = GetUserBaseDirectory(XDGUserDirectory::Data); !dataHome.empty()) {
        RemoveTrailingSlashes(dataHome);
        directories.push_back(std::move(dataHome));
    }
    for (std::string& directory : GetSystemDataDirectories())
        directories.push_back(std::move(directory));
    return directories;
}

// Publisher files and the kept copies of their catalogs (the refresh, which needs libcurl, is in
// QZCatalogRefresh.cpp, so that readers of the catalogs do not load it).
#include "desktop/QZCatalogPublishers.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <dirent.h>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <mutex>
#include <sstream>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

#include "desktop/QZCatalogPaths.h"
#include "desktop/QZDownloadableFontCatalog.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"

namespace {

struct DirectoryCloser {
    void operator()(DIR* directory) const { closedir(directory); }
};

/// A publisher file is a few lines; anything larger is not one.
constexpr size_t kMaximumPublisherFileSize = 16 << 10;

/// Guards the record of the publisher files already logged.
std::mutex gStateMutex;

std::string Trim(const std::string& text) {
    const size_t first = text.find_first_not_of(" \t\r\n");
    if (first == std::string::npos)
        return {};
    return text.substr(first, text.find_last_not_of(" \t\r\n") - first + 1);
}

bool IsPublisherName(const std::string& name) {
    return !name.empty() && name[0] != '.' && std::all_of(name.begin(), name.end(), [](char c) {
        return std::isalnum(static_cast<unsigned char>(c)) || c == '-' || c == '_' || c == '.';
    });
}

bool IsHTTPURL(const std::string& url) {
    for (const char* scheme : {"http://", "https://"}) {
        const size_t length = std::strlen(scheme);
        if (url.size() > length && strncasecmp(url.c_str(), scheme, length) == 0)
            return url[length] != '/';
    }
    return false;
}

} // namespace

std::optional<QZCatalogPublisher>
QZParseCatalogPublisher(const std::string& name, const std::string& text, std::string* problem) {
    QZCatalogPublisher publisher;
    publisher.name = name;
    std::map<std::string, std::string> values;
    std::istringstream lines(text);
    std::string line;
    for (int number = 1; std::getline(lines, line); ++number) {
        line = Trim(line);
        if (line.empty() || line[0] == '#')
            continue;
        const size_t equals = line.find('=');
        const std::string key = equals == std::string::npos ? "" : Trim(line.substr(0, equals));
        const std::string value = equals == std::string::npos ? "" : Trim(line.substr(equals + 1));
        if (key.empty() || value.empty()) {
            *problem = "line " + std::to_string(number) + " is not `key = value`";
            return std::nullopt;
        }
        if (key != "url" && key != "public-key") {
            *problem = "line " + std::to_string(number) + ": unknown key " + key;
            return std::nullopt;
        }
        if (!values.emplace(key, value).second) {
            *problem = "line " + std::to_string(number) + ": " + key + " given twice";
            return std::nullopt;
        }
    }
    if (!values.count("url") || !values.count("public-key")) {
        *problem = values.count("url") ? "no public-key" : "no url";
        return std::nullopt;
    }
    publisher.url = values["url"];
    publisher.publicKeyText = values["public-key"];
    if (!IsHTTPURL(publisher.url)) {
        *problem = "the url is not an http or https URL";
        return std::nullopt;
    }
    const std::optional<QZMinisignPublicKey> key =
        QZParseMinisignPublicKey(publisher.publicKeyText);
    if (!key) {
        *problem = "the public-key is not a minisign public key";
        return std::nullopt;
    }
    publisher.publicKey = *key;
    return publisher;
}

std::vector<QZCatalogPublisher>
QZReadCatalogPublishers(const std::vector<std::string>& directories) {
    std::map<std::string, std::string> files; // NAME to the file that wins
    for (auto directory = directories.rbegin(); directory != directories.rend(); ++directory) {
        std::unique_ptr<DIR, DirectoryCloser> listing(opendir(directory->c_str()));
        while (listing) {
            const dirent* entry = readdir(listing.get());
            if (!entry)
                break;
            const std::string file = entry->d_name;
            constexpr std::string_view suffix = ".conf";
            if (file.size() <= suffix.size() ||
                file.compare(file.size() - suffix.size(), suffix.size(), suffix) != 0)
                continue;
            files[file.substr(0, file.size() - suffix.size())] = *directory + "/" + file;
        }
    }
    std::vector<QZCatalogPublisher> publishers;
    for (const auto& [name, path] : files) {
        std::string problem;
        std::optional<QZCatalogPublisher> publisher;
        if (!IsPublisherName(name)) {
            problem = "the name may hold only letters, digits, '-', '_' and '.'";
        } else if (const auto text = QZReadCatalogFile(path, kMaximumPublisherFileSize); !text) {
            problem = "not a readable file of at most " +
                      std::to_string(kMaximumPublisherFileSize) + " bytes";
        } else {
            publisher = QZParseCatalogPublisher(name, *text, &problem);
        }
        if (!publisher) {
            // The agent reads the files at every question: each state of a file is logged once.
            struct stat status {};
            stat(path.c_str(), &status);
            const std::string state = std::to_string(status.st_size) + ":" +
                                      std::to_string(status.st_mtim.tv_sec) + "." +
                                      std::to_string(status.st_mtim.tv_nsec);
            std::lock_guard<std::mutex> lock(gStateMutex);
            static std::map<std::string, std::string> logged;
            if (std::exchange(logged[path], state) != state)
                glyphwell::AppLog("Skipping the catalog publisher file %s: %s",
                                  glyphwell::LogEscape(path).c_str(),
                                  glyphwell::LogEscape(problem).c_str());
            continue;
        }
        publisher->file = path;
        publishers.push_back(std::move(*publisher));
    }
    return publishers;
}

std::string QZPublisherCacheDirectory(const std::string& name) {
    return QZGlyphwellCacheDirectory() + "/publishers/" + name;
}

QZPublisherState QZReadPublisherState(const std::string& directory) {
    QZPublisherState state;
    const std::optional<std::string> text =
        QZReadCatalogFile(directory + "/" + kPublisherStateFile, kMaximumPublisherFileSize);
    if (!text)
        return state;
    std::istringstream lines(*text);
    std::string line;
    bool haveVersion = false;
    while (std::getline(lines, line)) {
        const size_t colon = line.find(": ");
        if (colon == std::string::npos)
            continue;
        const std::string key = line.substr(0, colon), value = line.substr(colon + 2);
        char* end = nullptr;
        errno = 0;
        const long long number = std::strtoll(value.c_str(), &end, 10);
        const bool numeric = errno == 0 && end && *end == '\0' && !value.empty();
        if (key == "version" && numeric)
            state.version = number, haveVersion = true;
        else if (key == "expires" && numeric)
            state.expires = number;
        else if (key == "etag")
            state.etag = value;
        else if (key == "last-modified")
            state.lastModified = value;
    }
    state.present = haveVersion;
    return state;
}

#include "tools/CatalogAssets.h"

#include <curl/curl.h>
#include <fcntl.h>
#include <fontconfig/fontconfig.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>

#include "desktop/QZCurlHandle.h"
#include "desktop/QZSHA256.h"

namespace glyphwell::tools {

namespace {

/// The catalog's language identifier for a fontconfig language tag: Chinese tags by script,
/// the others unchanged.
std::string LanguageIdentifier(const std::string& tag) {
    if (tag == "zh-cn" || tag == "zh-sg")
        return "zh-Hans";
    if (tag == "zh-tw" || tag == "zh-hk" || tag == "zh-mo")
        return "zh-Hant";
    return tag;
}

/// The face described by one fontconfig pattern; false when it has no PostScript name.
bool FaceOfPattern(FcPattern* pattern, FontFace* face) {
    FcChar8* text = nullptr;
    if (FcPatternGetString(pattern, FC_POSTSCRIPT_NAME, 0, &text) != FcResultMatch || !*text)
        return false;
    face->postScriptName = reinterpret_cast<const char*>(text);
    // Families and their languages are parallel lists; the first family is the font's own.
    for (int i = 0; FcPatternGetString(pattern, FC_FAMILY, i, &text) == FcResultMatch; ++i) {
        const std::string family = reinterpret_cast<const char*>(text);
        if (i == 0)
            face->family = family;
        FcChar8* language = nullptr;
        if (FcPatternGetString(pattern, FC_FAMILYLANG, i, &language) != FcResultMatch)
            continue;
        const std::string identifier = LanguageIdentifier(reinterpret_cast<const char*>(language));
        if (family != face->family && !identifier.empty())
            face->localizedFamilyNames.emplace(identifier, family);
    }
    FcLangSet* languages = nullptr;
    if (FcPatternGetLangSet(pattern, FC_LANG, 0, &languages) == FcResultMatch) {
        FcStrSet* tags = FcLangSetGetLangs(languages);
        FcStrList* list = tags ? FcStrListCreate(tags) : nullptr;
        while (FcChar8* tag = list ? FcStrListNext(list) : nullptr)
            face->languages.emplace_back(reinterpret_cast<const char*>(tag));
        if (list)
            FcStrListDone(list);
        if (tags)
            FcStrSetDestroy(tags);
        std::sort(face->languages.begin(), face->languages.end());
    }
    return true;
}

} // namespace

bool ReadFontFaces(const std::string& path, std::vector<FontFace>* faces, std::string* error) {
    faces->clear();
    std::unique_ptr<FcFontSet, decltype(&FcFontSetDestroy)> set(FcFontSetCreate(),
                                                                FcFontSetDestroy);
    const unsigned count = set ? FcFreeTypeQueryAll(reinterpret_cast<const FcChar8*>(path.c_str()),
                                                    -1, nullptr, nullptr, set.get())
                               : 0;
    if (count == 0) {
        *error = path + ": not a font file fontconfig can read";
        return false;
    }
    for (int i = 0; i < set->nfont; ++i) {
        int index = 0;
        FcPatternGetInteger(set->fonts[i], FC_INDEX, 0, &index);
        if (index >> 16) // a named instance of a variable font
            continue;
        FontFace face;
        if (!FaceOfPattern(set->fonts[i], &face)) {
            *error = path + ": face " + std::to_string(index) + " has no PostScript name";
            return false;
        }
        faces->push_back(std::move(face));
    }
    return true;
}

bool DigestFile(const std::string& path, uint64_t* size, std::string* sha256, std::string* error) {
    // Opened without blocking and checked to be a regular file: a FIFO put in its place would
    // otherwise wait forever.
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    struct stat status {};
    if (fd < 0 || fstat(fd, &status) != 0 || !S_ISREG(status.st_mode)) {
        *error = fd < 0 ? "cannot open " + path + ": " + std::strerror(errno)
                        : path + ": not a regular file";
        if (fd >= 0)
            close(fd);
        return false;
    }
    QZSHA256Digest digest;
    char buffer[65536];
    *size = 0;
    ssize_t count = 0;
    while ((count = read(fd, buffer, sizeof buffer)) != 0) {
        if (count < 0 && errno == EINTR)
            continue;
        if (count < 0)
            break;
        digest.Update(buffer, size_t(count));
        *size += uint64_t(count);
    }
    close(fd);
    *sha256 = digest.FinishHex();
    if (count < 0 || sha256->empty()) {
        *error = path + ": cannot read";
        return false;
    }
    return true;
}

std::string AssetURL(const std::string& prefix, const std::string& path) {
    static const char digits[] = "0123456789ABCDEF";
    std::string url = prefix;
    if (url.empty() || url.back() != '/')
        url += '/';
    for (const unsigned char c : std::filesystem::path(path).filename().string()) {
        if (std::isalnum(c) || c == '-' || c == '.' || c == '_' || c == '~') {
            url += char(c);
        } else {
            url += '%';
            url += digits[c >> 4];
            url += digits[c & 15];
        }
    }
    return url;
}

namespace {

/// What the transfer callbacks share.
struct Transfer {
    QZSHA256Digest digest;
    uint64_t received = 0;
    uint64_t limit = 0;
    bool overLimit = false;
    const FetchProgress* progress = nullptr;
    std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
    std::chrono::steady_clock::time_point lastReport = start;
};

/// libcurl's write callback: digests and counts the bytes, ends the transfer over the limit.
size_t Receive(char* bytes, size_t size, size_t count, void* context) {
    auto* transfer = static_cast<Transfer*>(context);
    const size_t length = size * count;
    if (transfer->received + length > transfer->limit) {
        transfer->overLimit = true;
        return 0; // ends the transfer
    }
    transfer->digest.Update(bytes, length);
    transfer->received += length;
    const auto now = std::chrono::steady_clock::now();
    if (*transfer->progress && now - transfer->lastReport >= std::chrono::milliseconds(200)) {
        transfer->lastReport = now;
        (*transfer->progress)(transfer->received,
                              std::chrono::duration<double>(now - transfer->start).count());
    }
    return length;
}

} // namespace

FetchResult FetchAsset(const std::string& url, uint64_t limit, const FetchProgress& progress) {
    FetchResult result;
    const QZCurlHandle curl = QZCreateCurlHandle();
    if (!curl) {
        result.error = "libcurl cannot be set up";
        return result;
    }
    Transfer transfer;
    transfer.limit = limit;
    transfer.progress = &progress;
    char message[CURL_ERROR_SIZE] = "";
    curl_easy_setopt(curl.get(), CURLOPT_URL, url.c_str());
    curl_easy_setopt(curl.get(), CURLOPT_FOLLOWLOCATION, 1L);
    curl_easy_setopt(curl.get(), CURLOPT_MAXREDIRS, 10L);
    curl_easy_setopt(curl.get(), CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(curl.get(), CURLOPT_CONNECTTIMEOUT, 30L);
    // Give up on a transfer that moves less than 1 byte a second for 60 s.
    curl_easy_setopt(curl.get(), CURLOPT_LOW_SPEED_LIMIT, 1L);
    curl_easy_setopt(curl.get(), CURLOPT_LOW_SPEED_TIME, 60L);
    curl_easy_setopt(curl.get(), CURLOPT_ERRORBUFFER, message);
    curl_easy_setopt(curl.get(), CURLOPT_WRITEFUNCTION, Receive);
    curl_easy_setopt(curl.get(), CURLOPT_WRITEDATA, &transfer);
    const CURLcode code = curl_easy_perform(curl.get());
    long status = 0;
    curl_easy_getinfo(curl.get(), CURLINFO_RESPONSE_CODE, &status);
    result.size = transfer.received;
    result.tooLarge = transfer.overLimit;
    if (transfer.overLimit)
        result.error = "more than " + std::to_string(limit) + " bytes";
    else if (code != CURLE_OK)
        result.error = *message ? message : curl_easy_strerror(code);
    else if (status >= 400)
        result.error = "HTTP status " + std::to_string(status);
    else
        result.sha256 = transfer.digest.FinishHex();
    if (progress)
        progress(transfer.received,
                 std::chrono::duration<double>(std::chrono::steady_clock::now() - transfer.start)
                     .count());
    return result;
}

} // namespace glyphwell::tools

// `glyphwell catalog refresh`: one bounded HTTP GET of a publisher's catalog and its signature,
// the checks, and the kept copy replaced whole. The file reads top-down: writing the kept copy;
// one bounded GET; the refresh that ties them together.
#include <algorithm>
#include <cerrno>
#include <cstring>
#include <curl/curl.h>
#include <fcntl.h>
#include <filesystem>
#include <memory>
#include <mutex>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>

#include "desktop/QZCatalogPublishers.h"
#include "desktop/QZCurlHandle.h"
#include "desktop/QZDownloadableFontCatalog.h"
#include "platform/LogEscape.h"
#include "platform/ReplaceFile.h"

namespace {

/// Guards the limits.
std::mutex gLimitsMutex;
QZCatalogFetchLimits gLimits;

std::string Trim(const std::string& text) {
    const size_t first = text.find_first_not_of(" \t\r\n");
    if (first == std::string::npos)
        return {};
    return text.substr(first, text.find_last_not_of(" \t\r\n") - first + 1);
}

/// Puts the new kept copy in place: every file written first, then renamed over the old ones
/// (signature, catalog, state), so that an interrupted refresh leaves the old copy or the new one
/// readable; a reader that sees a catalog and a signature that do not match refuses the pair.
bool Keep(const std::string& directory, const std::string& catalog, const std::string& signature,
          const std::string& state) {
    std::error_code ignored;
    std::filesystem::create_directories(directory, ignored);
    const std::string files[3][2] = {{kPublisherSignatureFile, signature},
                                     {kPublisherCatalogFile, catalog},
                                     {kPublisherStateFile, state}};
    std::string temporaries[3];
    for (int i = 0; i < 3; ++i) {
        temporaries[i] = glyphwell::WriteFileBeside(directory + "/" + files[i][0], files[i][1]);
        if (temporaries[i].empty()) {
            for (int j = 0; j < i; ++j)
                unlink(temporaries[j].c_str());
            return false;
        }
    }
    bool good = true;
    for (int i = 0; i < 3; ++i) {
        if (!good || rename(temporaries[i].c_str(), (directory + "/" + files[i][0]).c_str()) != 0) {
            good = false;
            unlink(temporaries[i].c_str());
        }
    }
    const int fd = open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd >= 0) {
        fsync(fd);
        close(fd);
    }
    return good;
}

std::string StateText(const std::string& etag, const std::string& lastModified, int64_t version,
                      std::optional<int64_t> expires) {
    std::string text = "version: " + std::to_string(version) + "\n";
    if (expires)
        text += "expires: " + std::to_string(*expires) + "\n";
    if (!etag.empty())
        text += "etag: " + etag + "\n";
    if (!lastModified.empty())
        text += "last-modified: " + lastModified + "\n";
    return text;
}

// ---- one bounded GET ---------------------------------------------------------------------

struct Response {
    long status = 0;
    std::string body;
    std::string etag;
    std::string lastModified;
    bool tooLarge = false;
    std::string error; ///< a transfer failure; empty when an answer came
};

struct Receiver {
    Response* response;
    uint64_t limit;
};

size_t ReceiveBody(char* bytes, size_t, size_t count, void* context) {
    auto* receiver = static_cast<Receiver*>(context);
    if (receiver->response->body.size() + count > receiver->limit) {
        receiver->response->tooLarge = true;
        return CURL_WRITEFUNC_ERROR;
    }
    receiver->response->body.append(bytes, count);
    return count;
}

size_t ReceiveHeader(char* bytes, size_t, size_t count, void* context) {
    Response& response = *static_cast<Receiver*>(context)->response;
    const std::string line(bytes, count);
    if (line.rfind("HTTP/", 0) == 0) { // a new answer, after a redirect
        response.etag.clear();
        response.lastModified.clear();
    }
    const size_t colon = line.find(':');
    if (colon == std::string::npos)
        return count;
    const std::string name = line.substr(0, colon);
    const std::string value = Trim(line.substr(colon + 1));
    // A header value that is kept on disk holds no line breaks (Trim takes the final one).
    if (value.find_first_of("\r\n") != std::string::npos)
        return count;
    if (strcasecmp(name.c_str(), "ETag") == 0)
        response.etag = value;
    else if (strcasecmp(name.c_str(), "Last-Modified") == 0)
        response.lastModified = value;
    return count;
}

/// GETs `url` with the extra request `headers`, keeping at most `limit` body bytes.
Response Get(const std::string& url, uint64_t limit, const std::vector<std::string>& headers) {
    Response response;
    const QZCurlHandle curl = QZCreateCurlHandle();
    if (!curl) {
        response.error = "libcurl cannot be set up";
        return response;
    }
    curl_slist* list = nullptr;
    for (const std::string& header : headers)
        list = curl_slist_append(list, header.c_str());
    std::unique_ptr<curl_slist, decltype(&curl_slist_free_all)> headerList(list,
                                                                           curl_slist_free_all);
    const QZCatalogFetchLimits limits = QZCurrentCatalogFetchLimits();
    Receiver receiver{&response, limit};
    char message[CURL_ERROR_SIZE] = "";
    CURL* easy = curl.get();
    curl_easy_setopt(easy, CURLOPT_URL, url.c_str());
    curl_easy_setopt(easy, CURLOPT_PROTOCOLS_STR, "http,https");
    curl_easy_setopt(easy, CURLOPT_REDIR_PROTOCOLS_STR, "http,https");
    curl_easy_setopt(easy, CURLOPT_FOLLOWLOCATION, 1L);
    curl_easy_setopt(easy, CURLOPT_MAXREDIRS, 10L);
    curl_easy_setopt(easy, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(easy, CURLOPT_CONNECTTIMEOUT_MS, long(limits.connectTimeout.count()));
    curl_easy_setopt(easy, CURLOPT_TIMEOUT_MS, long(limits.totalTimeout.count()));
    curl_easy_setopt(easy, CURLOPT_LOW_SPEED_LIMIT, long(limits.lowSpeedBytesPerSecond));
    curl_easy_setopt(easy, CURLOPT_LOW_SPEED_TIME,
                     long(std::max<int64_t>(1, limits.lowSpeedWindow.count() / 1000)));
    curl_easy_setopt(easy, CURLOPT_MAXFILESIZE_LARGE, curl_off_t(limit));
    curl_easy_setopt(easy, CURLOPT_USERAGENT, "Glyphwell catalog refresh");
    curl_easy_setopt(easy, CURLOPT_HTTPHEADER, list);
    curl_easy_setopt(easy, CURLOPT_ERRORBUFFER, message);
    curl_easy_setopt(easy, CURLOPT_WRITEFUNCTION, ReceiveBody);
    curl_easy_setopt(easy, CURLOPT_WRITEDATA, &receiver);
    curl_easy_setopt(easy, CURLOPT_HEADERFUNCTION, ReceiveHeader);
    curl_easy_setopt(easy, CURLOPT_HEADERDATA, &receiver);
    const CURLcode code = curl_easy_perform(easy);
    curl_easy_getinfo(easy, CURLINFO_RESPONSE_CODE, &response.status);
    if (response.tooLarge || code == CURLE_FILESIZE_EXCEEDED) {
        response.tooLarge = true;
        response.error = "larger than " + std::to_string(limit) + " bytes";
    } else if (code != CURLE_OK) {
        response.error = *message ? message : curl_easy_strerror(code);
    }
    return response;
}

QZPublisherRefresh Refused(std::string reason, const QZPublisherState& kept) {
    QZPublisherRefresh refresh;
    refresh.reason = std::move(reason);
    refresh.version = kept.present ? kept.version : 0;
    return refresh;
}

} // namespace

void QZSetCatalogFetchLimits(const QZCatalogFetchLimits& limits) {
    std::lock_guard<std::mutex> lock(gLimitsMutex);
    gLimits = limits;
}

QZCatalogFetchLimits QZCurrentCatalogFetchLimits() {
    std::lock_guard<std::mutex> lock(gLimitsMutex);
    return gLimits;
}

QZPublisherRefresh QZRefreshCatalogPublisher(const QZCatalogPublisher& publisher, int64_t now) {
    const std::string directory = QZPublisherCacheDirectory(publisher.name);
    const QZPublisherState kept = QZReadPublisherState(directory);
    // A state whose files were removed by hand still guards against a rollback, but asks for the
    // catalog unconditionally.
    const bool haveCopy = kept.present &&
                          access((directory + "/" + kPublisherCatalogFile).c_str(), R_OK) == 0 &&
                          access((directory + "/" + kPublisherSignatureFile).c_str(), R_OK) == 0;
    std::vector<std::string> headers;
    if (haveCopy && !kept.etag.empty())
        headers.push_back("If-None-Match: " + kept.etag);
    else if (haveCopy && !kept.lastModified.empty())
        headers.push_back("If-Modified-Since: " + kept.lastModified);
    const Response catalog = Get(publisher.url, kMaximumPublishedCatalogSize, headers);
    if (!catalog.error.empty())
        return Refused("the catalog: " + catalog.error, kept);
    if (catalog.status == 304 && haveCopy) {
        QZPublisherRefresh refresh;
        refresh.outcome = QZPublisherRefresh::Outcome::NotModified;
        refresh.version = kept.version;
        refresh.expired = kept.expires && *kept.expires <= now;
        if (refresh.expired) {
            refresh.outcome = QZPublisherRefresh::Outcome::Refused;
            refresh.reason = "the kept catalog expired at " + std::to_string(*kept.expires);
        }
        return refresh;
    }
    if (catalog.status != 200)
        return Refused("the catalog: HTTP status " + std::to_string(catalog.status), kept);
    const Response signature = Get(publisher.url + ".minisig", kMaximumCatalogSignatureSize, {});
    if (!signature.error.empty())
        return Refused("the signature: " + signature.error, kept);
    if (signature.status != 200)
        return Refused("the signature: HTTP status " + std::to_string(signature.status), kept);
    const QZCatalogSignatureCheck check =
        QZVerifyCatalogSignature(catalog.body, signature.body, publisher.publicKey);
    if (!check.valid)
        return Refused(check.problem, kept);
    if (kept.present && check.version < kept.version)
        return Refused("version " + std::to_string(check.version) + " is older than the kept " +
                           std::to_string(kept.version) + " (rollback)",
                       kept);
    if (check.version > now + kCatalogClockAllowance)
        return Refused("version " + std::to_string(check.version) +
                           " is more than one day ahead of this machine's clock",
                       kept);
    if (check.expires && *check.expires <= now)
        return Refused("expired at " + std::to_string(*check.expires), kept);
    std::vector<QZCatalogProblem> problems;
    const QZDownloadableFontCatalog parsed = QZReadDownloadableFontCatalog(catalog.body, problems);
    for (const QZCatalogProblem& problem : problems)
        if (problem.kind != QZCatalogProblem::Kind::Asset)
            return Refused("not a catalog: " + problem.message, kept);
    if (!Keep(directory, catalog.body, signature.body,
              StateText(catalog.etag, catalog.lastModified, check.version, check.expires)))
        return Refused("cannot write " + directory + ": " + std::strerror(errno), kept);
    QZPublisherRefresh refresh;
    refresh.outcome = QZPublisherRefresh::Outcome::Updated;
    refresh.version = check.version;
    refresh.assets = parsed.assets.size();
    return refresh;
}

std::string QZDescribePublisherRefresh(const std::string& name, const QZPublisherRefresh& refresh) {
    const std::string place = glyphwell::LogEscape(name) + ": ";
    switch (refresh.outcome) {
    case QZPublisherRefresh::Outcome::Updated:
        return place + "updated (version " + std::to_string(refresh.version) + ", " +
               std::to_string(refresh.assets) + (refresh.assets == 1 ? " asset)" : " assets)");
    case QZPublisherRefresh::Outcome::NotModified:
        return place + "not modified (version " + std::to_string(refresh.version) + ")";
    case QZPublisherRefresh::Outcome::Refused:
        break;
    }
    return place + "refused: " + glyphwell::LogEscape(refresh.reason) +
           (refresh.version ? "; kept version " + std::to_string(refresh.version)
                            : std::string("; nothing kept"));
}

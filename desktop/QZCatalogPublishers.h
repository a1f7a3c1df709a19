// Publishers of downloadable-font catalogs, and keeping their catalogs current.
//
// A publisher is one file, NAME.conf, in a publishers folder (the user's, then the system's; a
// user file hides a system file of the same NAME), of `key = value` lines: `url`, the catalog's
// http or https address, and `public-key`, the base64 line of the publisher's `minisign.pub`.
// Blank lines and lines starting with '#' are ignored; an unknown key or a malformed line skips
// the file with one log line.
//
// A refresh fetches the catalog with a conditional GET and its signature from URL.minisig,
// verifies both, and keeps the last good copy in $XDG_CACHE_HOME/glyphwell/publishers/NAME/:
// `catalog.json`, `catalog.json.minisig` and `state` (ETag, Last-Modified, version, expiry). New
// files are written beside the old ones and renamed over them, so a refused or failed refresh
// never loses the kept copy. No Qt.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "desktop/QZCatalogSignature.h"

/// The largest catalog body a refresh accepts.
inline constexpr uint64_t kMaximumPublishedCatalogSize = 64u << 20;
/// How far ahead of this machine's clock a catalog's version may be.
inline constexpr int64_t kCatalogClockAllowance = 24 * 60 * 60;
/// The files of a publisher's kept copy, in its cache directory.
inline constexpr char kPublisherCatalogFile[] = "catalog.json";
inline constexpr char kPublisherSignatureFile[] = "catalog.json.minisig";
inline constexpr char kPublisherStateFile[] = "state";

/// When a catalog transfer is given up.
struct QZCatalogFetchLimits {
    std::chrono::milliseconds connectTimeout{30000};
    /// Less than `lowSpeedBytesPerSecond` over this window (whole seconds) ends the transfer.
    std::chrono::milliseconds lowSpeedWindow{30000};
    uint64_t lowSpeedBytesPerSecond = 1024;
    std::chrono::milliseconds totalTimeout{600000};
};

/// The limits of the catalog transfers from now on; process-wide (tests shorten them).
void QZSetCatalogFetchLimits(const QZCatalogFetchLimits& limits);
QZCatalogFetchLimits QZCurrentCatalogFetchLimits();

struct QZCatalogPublisher {
    std::string name; ///< NAME of NAME.conf
    std::string url;
    std::string publicKeyText; ///< the `public-key` value as written
    QZMinisignPublicKey publicKey;
    std::string file; ///< the NAME.conf it was read from
};

/// Reads one publisher file's `text`; `name` is its NAME. Nothing, with the reason in `*problem`,
/// when a line is malformed, a key is unknown or repeated, `url` is not http(s), or the key is not
/// a minisign public key.
std::optional<QZCatalogPublisher>
QZParseCatalogPublisher(const std::string& name, const std::string& text, std::string* problem);

/// Every publisher in `directories` (earlier folders hide later ones' files of the same NAME),
/// sorted by NAME. Files that cannot be read or parsed are skipped with one log line each.
std::vector<QZCatalogPublisher>
QZReadCatalogPublishers(const std::vector<std::string>& directories);

/// $XDG_CACHE_HOME/glyphwell/publishers/NAME.
std::string QZPublisherCacheDirectory(const std::string& name);

/// What is kept of a publisher's last good catalog.
struct QZPublisherState {
    bool present = false; ///< a verified copy is kept
    std::string etag;
    std::string lastModified;
    int64_t version = 0;
    std::optional<int64_t> expires;
};

/// The state kept in `directory` (not present when there is none or it is unreadable).
QZPublisherState QZReadPublisherState(const std::string& directory);

/// How a refresh ended for one publisher.
struct QZPublisherRefresh {
    enum class Outcome { Updated, NotModified, Refused };
    Outcome outcome = Outcome::Refused;
    int64_t version = 0;  ///< of the catalog now kept
    size_t assets = 0;    ///< in the catalog now kept (Updated only)
    std::string reason;   ///< why it was refused
    bool expired = false; ///< the catalog kept has expired: it is not offered
};

/// Refreshes `publisher`'s kept copy at the time `now` (Unix seconds). Transfers follow the
/// download limits (QZCurrentDownloadLimits). Never loses the kept copy.
QZPublisherRefresh QZRefreshCatalogPublisher(const QZCatalogPublisher& publisher, int64_t now);

/// The one line `glyphwell catalog refresh` prints for `refresh` of the publisher `name`.
std::string QZDescribePublisherRefresh(const std::string& name, const QZPublisherRefresh& refresh);

#include "tools/CatalogCommand.h"

#include <cerrno>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fontconfig/fontconfig.h>
#include <fstream>
#include <iomanip>
#include <iterator>
#include <nlohmann/json.hpp>
#include <ostream>
#include <sstream>
#include <strings.h>
#include <sys/stat.h>

#include "desktop/QZCatalogPaths.h"
#include "desktop/QZCatalogPublishers.h"
#include "desktop/QZCatalogSources.h"
#include "desktop/QZDownloadableFontCatalog.h"
#include "desktop/QZFontMatching.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"
#include "platform/ReplaceFile.h"
#include "tools/CatalogAssets.h"
#include "tools/ToolInput.h"

namespace glyphwell::tools {

const char kCatalogUsage[] =
    "  catalog add FONTFILE... --url-prefix URL [--catalog FILE]\n"
    "                                     write or update the assets of font files\n"
    "  catalog check [FILE] [--fetch]     check a catalog; --fetch downloads every asset\n"
    "  catalog list [FILE]                the fonts offered, whether they are installed, and\n"
    "                                     which catalog offers them\n"
    "  catalog refresh                    fetch and verify every publisher's catalog\n"
    "    FILE: the catalog the agent reads (default)\n";

namespace {

using Json = nlohmann::ordered_json;

/// The agent's catalogs are at most this large.
constexpr uint64_t kMaximumCatalogSize = 64u << 20;

/// `text` escaped as every outside value the agent logs, for printing catalog values.
std::string Escaped(std::string_view text) {
    return glyphwell::LogEscape(text);
}

/// The catalog the agent would read: the first search path that exists, else the first one.
std::string DefaultCatalogPath(bool mustExist) {
    const std::vector<std::string> paths = QZDownloadableFontCatalogPaths();
    for (const std::string& path : paths)
        if (!mustExist || std::filesystem::exists(path))
            return path;
    return paths.empty() ? std::string() : paths.front();
}

/// Reads a whole catalog file of at most kMaximumCatalogSize bytes; false with a message.
bool ReadCatalogFile(const std::string& path, std::string* text, std::string* error) {
    return ReadFile(path, text, error, kMaximumCatalogSize);
}

/// Parses with the agent's reader; every line it logs is a problem.
QZDownloadableFontCatalog ParseCatalog(const std::string& text, const std::string& origin,
                                       std::vector<std::string>* problems) {
    LogSink previous =
        SetLogSink([problems](const LogRecord& record) { problems->emplace_back(record.text); });
    QZDownloadableFontCatalog catalog = QZDownloadableFontCatalog::Parse(text, origin);
    SetLogSink(previous);
    return catalog;
}

// ---- add ----------------------------------------------------------------------------------

struct AddOptions {
    std::vector<std::string> files;
    std::string urlPrefix;
    std::string catalogPath;
};

/// Whether `prefix` is an http or https URL with a host: the only addresses the agent downloads
/// from on a catalog's word.
bool IsDownloadPrefix(const std::string& prefix) {
    for (const std::string_view scheme : {"http://", "https://"}) {
        if (prefix.size() > scheme.size() &&
            strncasecmp(prefix.c_str(), scheme.data(), scheme.size()) == 0)
            return prefix[scheme.size()] != '/';
    }
    return false;
}

/// Why the file at `path` cannot be added, before anything opens it: it must exist and be a
/// regular file (a FIFO or a device would block or never end). Empty when it may be read.
std::string FileProblem(const std::string& path) {
    struct stat status {};
    if (stat(path.c_str(), &status) != 0)
        return path + (errno == ENOENT ? ": no such file" : ": " + std::string(strerror(errno)));
    if (!S_ISREG(status.st_mode))
        return path + ": not a regular file";
    return {};
}

/// The asset of one font file: every member the catalog format knows.
bool DescribeAsset(const std::string& path, const std::string& urlPrefix, Json* asset,
                   std::string* error) {
    std::vector<FontFace> faces;
    uint64_t size = 0;
    std::string sha256;
    if (*error = FileProblem(path); !error->empty())
        return false;
    if (!ReadFontFaces(path, &faces, error) || !DigestFile(path, &size, &sha256, error))
        return false;
    // The asset is named after its fonts: a single font's PostScript name, or the names of all
    // the faces of a collection joined with "+".
    std::string identifier;
    Json fonts = Json::array();
    for (const FontFace& face : faces) {
        identifier += (identifier.empty() ? "" : "+") + face.postScriptName;
        Json font = {{"postScriptName", face.postScriptName}};
        if (!face.family.empty())
            font["family"] = face.family;
        if (!face.localizedFamilyNames.empty())
            font["localizedFamilyNames"] = face.localizedFamilyNames;
        if (!face.languages.empty())
            font["languages"] = face.languages;
        fonts.push_back(std::move(font));
    }
    (*asset)["LocalID"] = identifier;
    (*asset)["url"] = AssetURL(urlPrefix, path);
    (*asset)["size"] = size;
    (*asset)["sha256"] = sha256;
    (*asset)["fonts"] = std::move(fonts);
    return true;
}

/// The existing catalog document at `path`, or a new empty one when there is no file. False
/// with a message when the file is there but is not a catalog document.
bool LoadDocument(const std::string& path, Json* document, std::string* error) {
    std::error_code ignored;
    if (!std::filesystem::exists(path, ignored)) {
        *document = Json{{"assets", Json::array()}};
        return true;
    }
    std::string text;
    if (!ReadCatalogFile(path, &text, error))
        return false;
    try {
        *document = Json::parse(text);
    } catch (const nlohmann::json::parse_error& failure) {
        *error = path + ": not JSON (" + failure.what() + "); fix or remove it first";
        return false;
    }
    if (!document->is_object() || !document->contains("assets") ||
        !(*document)["assets"].is_array()) {
        *error = path + ": no \"assets\" array; fix or remove it first";
        return false;
    }
    return true;
}

/// Puts `asset` in place of the asset with its LocalID or URL (keeping that asset's other
/// members), or appends it. True when it replaced one.
bool MergeAsset(Json& assets, const Json& asset) {
    for (Json& existing : assets) {
        if (!existing.is_object())
            continue;
        if (existing.value("LocalID", Json()) == asset["LocalID"] ||
            existing.value("url", Json()) == asset["url"]) {
            for (const auto& [key, value] : asset.items())
                existing[key] = value;
            return true;
        }
    }
    assets.push_back(asset);
    return false;
}

/// Reads the command line of `add`; false after a usage message on `err`.
bool ParseAddArguments(const std::vector<std::string>& arguments, AddOptions* options,
                       std::ostream& err) {
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string& argument = arguments[i];
        if (argument == "--url-prefix" || argument == "--catalog") {
            if (i + 1 == arguments.size() || arguments[i + 1].empty()) {
                err << "glyphwell catalog add: " << argument << " needs a value\n";
                return false;
            }
            (argument == "--catalog" ? options->catalogPath : options->urlPrefix) = arguments[++i];
        } else if (argument.size() > 1 && argument[0] == '-') {
            err << "glyphwell catalog add: unknown option " << argument << "\n";
            return false;
        } else {
            options->files.push_back(argument);
        }
    }
    if (options->files.empty() || options->urlPrefix.empty()) {
        err << "glyphwell catalog add: give the font files and --url-prefix URL\n";
        return false;
    }
    if (!IsDownloadPrefix(options->urlPrefix)) {
        err << "glyphwell catalog add: --url-prefix must be an http:// or https:// URL, not "
            << Escaped(options->urlPrefix) << "\n";
        return false;
    }
    return true;
}

/// `catalog add`: every file read first, then the catalog merged and replaced at once.
int RunAdd(const std::vector<std::string>& arguments, std::ostream& out, std::ostream& err) {
    AddOptions options;
    if (!ParseAddArguments(arguments, &options, err))
        return 2;
    if (options.catalogPath.empty())
        options.catalogPath = DefaultCatalogPath(false);
    std::string error;
    // Every file is read before anything is written: one bad file leaves the catalog as it was.
    std::vector<Json> assets;
    for (const std::string& file : options.files) {
        Json asset = Json::object();
        if (!DescribeAsset(file, options.urlPrefix, &asset, &error)) {
            err << "glyphwell catalog add: " << Escaped(error) << "\n";
            return 1;
        }
        assets.push_back(std::move(asset));
    }
    Json document;
    if (!LoadDocument(options.catalogPath, &document, &error)) {
        err << "glyphwell catalog add: " << Escaped(error) << "\n";
        return 1;
    }
    std::vector<std::string> lines;
    for (const Json& asset : assets) {
        const bool replaced = MergeAsset(document["assets"], asset);
        lines.push_back(std::string(replaced ? "updated " : "added ") +
                        asset["LocalID"].get<std::string>() + " (" +
                        std::to_string(asset["fonts"].size()) + " font" +
                        (asset["fonts"].size() == 1 ? "" : "s") + ", " +
                        std::to_string(asset["size"].get<uint64_t>()) + " bytes) " +
                        asset["url"].get<std::string>());
    }
    std::error_code ignored;
    const std::filesystem::path parent = std::filesystem::path(options.catalogPath).parent_path();
    if (!parent.empty())
        std::filesystem::create_directories(parent, ignored);
    if (!glyphwell::ReplaceFile(options.catalogPath, document.dump(2) + "\n")) {
        err << "glyphwell catalog add: "
            << Escaped("cannot write " + options.catalogPath + ": " + std::strerror(errno)) << "\n";
        return 1;
    }
    for (const std::string& line : lines)
        out << Escaped(line) << "\n";
    out << options.catalogPath << ": " << document["assets"].size() << " assets\n";
    return 0;
}

// ---- check and list -----------------------------------------------------------------------

struct ReadOptions {
    std::string catalogPath;
    bool fetch = false;
};

/// Reads the command line of `check` or `list`; false after a usage message on `err`.
bool ParseReadArguments(const char* verb, bool takesFetch,
                        const std::vector<std::string>& arguments, ReadOptions* options,
                        std::ostream& err) {
    bool haveFile = false;
    for (const std::string& argument : arguments) {
        if (takesFetch && argument == "--fetch") {
            options->fetch = true;
        } else if (argument.size() > 1 && argument[0] == '-') {
            err << "glyphwell catalog " << verb << ": unknown option " << argument << "\n";
            return false;
        } else if (!haveFile) {
            options->catalogPath = argument;
            haveFile = true;
        } else {
            err << "glyphwell catalog " << verb << ": more than one catalog given\n";
            return false;
        }
    }
    if (options->catalogPath.empty())
        options->catalogPath = DefaultCatalogPath(true);
    return true;
}

/// "1.2 MiB/s" for `bytes` in `seconds`.
std::string Rate(uint64_t bytes, double seconds) {
    std::ostringstream text;
    const double perSecond = seconds > 0 ? double(bytes) / seconds : 0;
    text << std::fixed << std::setprecision(1);
    if (perSecond >= 1 << 20)
        text << perSecond / (1 << 20) << " MiB/s";
    else
        text << perSecond / 1024 << " KiB/s";
    return text.str();
}

/// Downloads `asset` and compares it with the catalog; the problems found go to `problems`.
void FetchAndCompare(const QZDownloadableFontAsset& asset, bool progress, std::ostream& out,
                     std::vector<std::string>* problems) {
    const std::string name = "asset " + Escaped(asset.localID);
    FetchProgress report;
    if (progress)
        report = [&](uint64_t received, double seconds) {
            out << "\r" << name << ": " << received << " bytes, " << Rate(received, seconds)
                << "\x1b[K" << std::flush;
        };
    const FetchResult result = FetchAsset(std::string(asset.url), asset.size, report);
    if (progress)
        out << "\n";
    if (result.tooLarge) {
        problems->push_back(name + ": " + Escaped(asset.url) + " has more than " +
                            std::to_string(asset.size) + " bytes, the catalog says " +
                            std::to_string(asset.size));
    } else if (!result.error.empty()) {
        problems->push_back(name + ": cannot download " + Escaped(asset.url) + ": " +
                            Escaped(result.error));
    } else if (result.size != asset.size) {
        problems->push_back(name + ": " + Escaped(asset.url) + " has " +
                            std::to_string(result.size) + " bytes, the catalog says " +
                            std::to_string(asset.size));
    } else if (result.sha256 != asset.sha256) {
        problems->push_back(name + ": " + Escaped(asset.url) + " has the SHA-256 " + result.sha256 +
                            ", the catalog says " + std::string(asset.sha256));
    }
}

/// Reads and parses the catalog of `options` for `verb`; its reader's lines go to `problems`.
/// False after a message on `err` when the file cannot be read.
bool LoadCatalog(const char* verb, const ReadOptions& options, std::ostream& err,
                 QZDownloadableFontCatalog* catalog, std::vector<std::string>* problems) {
    std::string text, error;
    if (!ReadCatalogFile(options.catalogPath, &text, &error)) {
        err << "glyphwell catalog " << verb << ": " << Escaped(error) << "\n";
        return false;
    }
    *catalog = ParseCatalog(text, options.catalogPath, problems);
    return true;
}

/// `catalog check`: the reader's problems, then with --fetch those of each download.
int RunCheck(const std::vector<std::string>& arguments, std::ostream& out, std::ostream& err,
             bool progress) {
    ReadOptions options;
    if (!ParseReadArguments("check", true, arguments, &options, err))
        return 2;
    QZDownloadableFontCatalog catalog;
    std::vector<std::string> problems;
    if (!LoadCatalog("check", options, err, &catalog, &problems))
        return 1;
    for (const std::string& problem : problems)
        out << problem << "\n";
    const size_t readProblems = problems.size();
    problems.clear();
    size_t fonts = 0;
    for (const QZDownloadableFontAsset& asset : catalog.assets) {
        fonts += asset.fonts.size();
        if (options.fetch)
            FetchAndCompare(asset, progress, out, &problems);
    }
    for (const std::string& problem : problems)
        out << problem << "\n";
    const size_t total = readProblems + problems.size();
    out << Escaped(options.catalogPath) << ": " << catalog.assets.size() << " assets, " << fonts
        << " fonts" << (options.fetch ? ", downloaded" : "") << "; " << total
        << (total == 1 ? " problem\n" : " problems\n");
    return total == 0 ? 0 : 1;
}

/// `catalog list`: one tab-separated line per font offered, ending with the catalog that offers
/// it: without FILE, the agent's merged view of every catalog.
int RunList(const std::vector<std::string>& arguments, std::ostream& out, std::ostream& err) {
    bool merged = true;
    for (const std::string& argument : arguments)
        merged = merged && argument.size() > 1 && argument[0] == '-';
    ReadOptions options;
    if (!ParseReadArguments("list", false, arguments, &options, err))
        return 2;
    QZMergedDownloadableFontCatalog view;
    std::vector<std::string> problems;
    if (merged) {
        LogSink previous = SetLogSink(
            [&problems](const LogRecord& record) { problems.emplace_back(record.text); });
        view = *QZCurrentMergedDownloadableFontCatalog();
        SetLogSink(previous);
    } else {
        if (!LoadCatalog("list", options, err, &view.catalog, &problems))
            return 1;
        view.sources.push_back({QZCatalogSource::Kind::User, options.catalogPath, {}, {}, {}});
        view.assetSources.assign(view.catalog.assets.size(), 0);
    }
    for (const std::string& problem : problems)
        err << problem << "\n";
    for (size_t i = 0; i < view.catalog.assets.size(); ++i) {
        const QZDownloadableFontAsset& asset = view.catalog.assets[i];
        for (const QZDownloadableFont& font : asset.fonts)
            out << (QZIsFontInstalled(std::string(font.postScriptName)) ? "installed" : "offered")
                << "\t" << Escaped(font.postScriptName) << "\t" << Escaped(font.family) << "\t"
                << Escaped(asset.localID) << "\t" << asset.size << "\t"
                << Escaped(view.sources[view.assetSources[i]].label) << "\n";
    }
    // fontconfig holds its configuration until told to let go.
    FcFini();
    return 0;
}

// ---- refresh ------------------------------------------------------------------------------

/// `catalog refresh`: one line per publisher; 0 only when every one is current and verified.
int RunRefresh(const std::vector<std::string>& arguments, std::ostream& out, std::ostream& err) {
    if (!arguments.empty()) {
        err << "glyphwell catalog refresh: takes no arguments\n";
        return 2;
    }
    const std::vector<std::string> directories = QZCatalogPublisherDirectories();
    const std::vector<QZCatalogPublisher> publishers = QZReadCatalogPublishers(directories);
    if (publishers.empty()) {
        out << "no publishers in " << Escaped(directories[0]) << " or " << Escaped(directories[1])
            << "\n";
        return 0;
    }
    const int64_t now = int64_t(std::time(nullptr));
    bool current = true;
    for (const QZCatalogPublisher& publisher : publishers) {
        const QZPublisherRefresh refresh = QZRefreshCatalogPublisher(publisher, now);
        current = current && refresh.outcome != QZPublisherRefresh::Outcome::Refused;
        out << QZDescribePublisherRefresh(publisher.name, refresh) << "\n";
    }
    return current ? 0 : 1;
}

} // namespace

int RunCatalog(const std::vector<std::string>& arguments, std::ostream& out, std::ostream& err,
               bool progress) {
    const std::string verb = arguments.empty() ? "" : arguments[0];
    const std::vector<std::string> rest(
        arguments.empty() ? arguments.begin() : arguments.begin() + 1, arguments.end());
    if (verb == "add")
        return RunAdd(rest, out, err);
    if (verb == "check")
        return RunCheck(rest, out, err, progress);
    if (verb == "list")
        return RunList(rest, out, err);
    if (verb == "refresh")
        return RunRefresh(rest, out, err);
    err << "glyphwell catalog: give add, check, list or refresh\n" << kCatalogUsage;
    return 2;
}

} // namespace glyphwell::tools

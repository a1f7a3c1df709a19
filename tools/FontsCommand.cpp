#include "tools/FontsCommand.h"

#include <spawn.h>
#include <sys/wait.h>

#include <QCoreApplication>
#include <QDBusConnection>
#include <QDBusMessage>
#include <QVariantMap>
#include <map>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <ostream>
#include <sstream>

#include "desktop/QZDocumentFontMatching.h"
#include "desktop/QZFontMatching.h"
#include "documents/QZDocumentFonts.h"
#include "glyphwell/client.h"
#include "platform/LogEscape.h"

namespace glyphwell::tools {

const char kFontsUsage[] =
    "  fonts [--json] [--ask] [--notify] [--app NAME] FILE...\n"
    "                                     the fonts documents name: embedded, installed,\n"
    "                                     offered by the catalog or missing; --ask asks the\n"
    "                                     agent to download the offered ones; --notify\n"
    "                                     also shows the result on the desktop\n";

namespace {

struct Options {
    bool json = false;
    bool ask = false;
    bool notify = false;
    std::string application = "Glyphwell";
    std::string port; ///< empty: the agent's
    std::vector<std::string> files;
};

bool ParseArguments(const std::vector<std::string>& arguments, Options* options,
                    std::ostream& err) {
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string& argument = arguments[i];
        if (argument == "--json") {
            options->json = true;
        } else if (argument == "--ask") {
            options->ask = true;
        } else if (argument == "--notify") {
            options->notify = true;
        } else if (argument == "--app" || argument == "--name") {
            if (i + 1 == arguments.size()) {
                err << "glyphwell fonts: " << argument << " needs a value\n";
                return false;
            }
            (argument == "--app" ? options->application : options->port) = arguments[++i];
        } else if (argument == "--") {
            options->files.insert(options->files.end(), arguments.begin() + long(i) + 1,
                                  arguments.end());
            break;
        } else if (argument.size() > 1 && argument[0] == '-') {
            err << "glyphwell fonts: unknown option " << argument << "\nusage:\n" << kFontsUsage;
            return false;
        } else {
            options->files.push_back(argument);
        }
    }
    if (options->files.empty()) {
        err << "glyphwell fonts: no file given\nusage:\n" << kFontsUsage;
        return false;
    }
    return true;
}

struct Report {
    std::string file;
    QZDocumentScan scan;
    std::vector<QZDocumentFontMatch> matches;
};

void MatchAll(std::vector<Report>& reports) {
    const QZDocumentFontMatcher matcher = QZDocumentFontMatcher::ForThisMachine();
    for (Report& report : reports) {
        report.matches.clear();
        for (const QZDocumentFont& font : report.scan.fonts)
            report.matches.push_back(matcher.Match(font));
    }
}

/// Asks the agent to download every offered font once; false with a message when it failed.
bool AskForOfferedFonts(const std::vector<Report>& reports, const Options& options,
                        std::ostream& err) {
    struct RequestFree {
        void operator()(glyphwell_request* request) const { glyphwell_request_free(request); }
    };
    std::unique_ptr<glyphwell_request, RequestFree> request(
        glyphwell_request_new(GLYPHWELL_ASK_DOWNLOAD));
    std::map<std::string, bool> added;
    for (const Report& report : reports)
        for (const QZDocumentFontMatch& match : report.matches)
            for (size_t i = 0; i < match.postScriptNames.size(); ++i)
                if (added.emplace(match.postScriptNames[i], true).second)
                    glyphwell_request_add_font(request.get(), match.postScriptNames[i].c_str(),
                                               match.families[i].c_str());
    if (added.empty())
        return true;
    glyphwell_request_set_application_name(request.get(), options.application.c_str());
    glyphwell_reply* reply = nullptr;
    const int status = glyphwell_request_send(
        request.get(), options.port.empty() ? nullptr : options.port.c_str(), -1, &reply);
    glyphwell_reply_free(reply);
    if (status != GLYPHWELL_OK) {
        err << "glyphwell fonts: cannot ask for the offered fonts: "
            << glyphwell_status_text(status) << "\n";
        return false;
    }
    // The agent installed what it could: look at the fonts afresh.
    QZReloadFontConfiguration();
    return true;
}

void PrintJSON(const std::vector<Report>& reports, std::ostream& out) {
    nlohmann::ordered_json files = nlohmann::ordered_json::array();
    for (const Report& report : reports) {
        nlohmann::ordered_json file;
        file["file"] = report.file;
        if (!report.scan.error.empty()) {
            file["error"] = report.scan.error;
            files.push_back(std::move(file));
            continue;
        }
        file["format"] = report.scan.format;
        nlohmann::ordered_json fonts = nlohmann::ordered_json::array();
        for (size_t i = 0; i < report.scan.fonts.size(); ++i) {
            const QZDocumentFont& font = report.scan.fonts[i];
            const QZDocumentFontMatch& match = report.matches[i];
            nlohmann::ordered_json entry;
            entry["name"] = font.name;
            entry["kind"] = QZDocumentFontKindName(font.kind);
            if (!font.style.empty())
                entry["style"] = font.style;
            entry["embedded"] = font.embedded;
            entry["state"] = QZDocumentFontStateName(match.state);
            if (match.state == QZDocumentFontState::Offered)
                entry["postScriptNames"] = match.postScriptNames;
            fonts.push_back(std::move(entry));
        }
        file["fonts"] = std::move(fonts);
        files.push_back(std::move(file));
    }
    // Names come from outside: replace what is not UTF-8 rather than fail.
    out << nlohmann::ordered_json{{"files", std::move(files)}}.dump(
               2, ' ', false, nlohmann::json::error_handler_t::replace)
        << "\n";
}

/// Shows `summary` as a desktop notification; without a notification service, in a short alert
/// (zenity), else on `err`. For runs from a file manager, which shows no terminal.
void Notify(const std::string& summary, std::ostream& err) {
    std::optional<QCoreApplication> application;
    static int argc = 1;
    static char name[] = "glyphwell";
    static char* argv[] = {name, nullptr};
    if (!QCoreApplication::instance())
        application.emplace(argc, argv);
    QDBusMessage call = QDBusMessage::createMethodCall(
        QStringLiteral("org.freedesktop.Notifications"),
        QStringLiteral("/org/freedesktop/Notifications"),
        QStringLiteral("org.freedesktop.Notifications"), QStringLiteral("Notify"));
    call << QStringLiteral("Glyphwell") << 0u
         << QStringLiteral("org.glyphwell.Glyphwell.GlyphwellUIAgent")
         << QStringLiteral("Get Missing Fonts") << QString::fromStdString(summary) << QStringList()
         << QVariantMap() << -1;
    const QDBusMessage reply = QDBusConnection::sessionBus().call(call, QDBus::Block, 5000);
    if (reply.type() == QDBusMessage::ReplyMessage)
        return;
    const std::string text = "--text=" + summary;
    const char* arguments[] = {"zenity",      "--info",     "--title=Get Missing Fonts",
                               "--no-markup", text.c_str(), nullptr};
    pid_t child = 0;
    if (posix_spawnp(&child, "zenity", nullptr, nullptr, const_cast<char* const*>(arguments),
                     environ) == 0) {
        int status = 0;
        if (waitpid(child, &status, 0) == child && WIFEXITED(status) && WEXITSTATUS(status) == 0)
            return;
    }
    err << summary << "\n";
}

void PrintText(const std::vector<Report>& reports, std::ostream& out) {
    size_t counts[4] = {};
    size_t files = 0;
    for (const Report& report : reports) {
        if (!report.scan.error.empty())
            continue;
        ++files;
        out << glyphwell::LogEscape(report.file) << " (" << report.scan.format << ")\n";
        if (report.scan.fonts.empty())
            out << "  no fonts named\n";
        for (size_t i = 0; i < report.scan.fonts.size(); ++i) {
            const QZDocumentFont& font = report.scan.fonts[i];
            const QZDocumentFontMatch& match = report.matches[i];
            ++counts[size_t(match.state)];
            std::string state = QZDocumentFontStateName(match.state);
            state.resize(10, ' ');
            // Names come from the document: no control character reaches the terminal.
            out << "  " << state << glyphwell::LogEscape(font.name);
            if (!font.style.empty())
                out << ", " << glyphwell::LogEscape(font.style);
            out << " (" << QZDocumentFontKindName(font.kind) << ")";
            for (size_t n = 0; n < match.postScriptNames.size(); ++n)
                out << (n ? ", " : ": ") << glyphwell::LogEscape(match.postScriptNames[n]);
            out << "\n";
        }
    }
    const size_t total = counts[0] + counts[1] + counts[2] + counts[3];
    out << total << (total == 1 ? " font" : " fonts") << " in " << files
        << (files == 1 ? " file" : " files") << ": " << counts[0] << " embedded, " << counts[1]
        << " installed, " << counts[2] << " offered, " << counts[3] << " missing\n";
}

} // namespace

int RunFonts(const std::vector<std::string>& arguments, std::istream&, std::ostream& out,
             std::ostream& err) {
    Options options;
    if (!ParseArguments(arguments, &options, err))
        return 2;
    std::vector<Report> reports;
    bool unreadable = false;
    for (const std::string& file : options.files) {
        Report report{file, QZScanDocumentFile(file), {}};
        if (!report.scan.error.empty()) {
            err << "glyphwell fonts: " << glyphwell::LogEscape(file) << ": "
                << glyphwell::LogEscape(report.scan.error) << "\n";
            unreadable = true;
        }
        reports.push_back(std::move(report));
    }
    MatchAll(reports);
    bool asked = true;
    if (options.ask) {
        asked = AskForOfferedFonts(reports, options, err);
        MatchAll(reports);
    }
    if (options.json)
        PrintJSON(reports, out);
    else
        PrintText(reports, out);
    out.flush();
    if (options.notify) {
        std::ostringstream summary;
        PrintText(reports, summary);
        Notify(summary.str(), err);
    }
    if (unreadable)
        return 2;
    for (const Report& report : reports)
        for (const QZDocumentFontMatch& match : report.matches)
            if (match.state == QZDocumentFontState::Offered ||
                match.state == QZDocumentFontState::Missing)
                return 1;
    return asked ? 0 : 1;
}

} // namespace glyphwell::tools

#include "tools/SendCommand.h"

#include <unistd.h>

#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>

#include "cfutil/CFStringUtilities.h"
#include "cfutil/TCFRetained.h"
#include "platform/CFMessagePort.h"
#include "protocol/QZUIProtocol.h"
#include "tools/TaggedJSON.h"
#include "tools/ToolInput.h"

namespace glyphwell::tools {

const char kSendUsage[] =
    "  send --msgid N [FILE|-] [--empty]  send the tagged JSON value of FILE (or stdin) to the\n"
    "                                     agent as request N and print the reply\n"
    "  ask-activation --candidate FILE... [--font NAME] [--family NAME] [--app NAME]\n"
    "                 [--bundle PATH]     ask whether an application may use a font found in\n"
    "                                     font files on disk (message id 1)\n"
    "  ask-download --font PSNAME[:FAMILY]... [--app NAME] [--bundle PATH] [--pid N]\n"
    "               [--suppress]          ask whether fonts may be downloaded (message id 2)\n"
    "    options of these three: --name PORT, --timeout SECONDS (reply; default: no limit),\n"
    "    --send-timeout SECONDS (default 10), --compact, --dry-run (print the request only)\n";

namespace {

using Json = nlohmann::ordered_json;

struct PortOptions {
    std::string name = kQZUIAgentPortNameText;
    CFTimeInterval receiveTimeout = kCFMessagePortWaitForever;
    CFTimeInterval sendTimeout = 10;
    bool compact = false;
    bool dryRun = false;
};

/// The UTF-8 text of a protocol key.
std::string Text(CFStringRef key) {
    std::string text;
    CFString::GetUTF8(key, text);
    return text;
}

/// Seconds: a number >= 0, or "forever".
bool ParseSeconds(const std::string& text, CFTimeInterval* seconds) {
    if (text == "forever") {
        *seconds = kCFMessagePortWaitForever;
        return true;
    }
    char* end = nullptr;
    errno = 0;
    const double value = std::strtod(text.c_str(), &end);
    if (text.empty() || *end || errno || !(value >= 0) || std::isinf(value))
        return false;
    *seconds = value;
    return true;
}

bool ParseInt32(const std::string& text, long* value) {
    char* end = nullptr;
    errno = 0;
    const long parsed = std::strtol(text.c_str(), &end, 10);
    if (text.empty() || *end || errno || parsed < INT32_MIN || parsed > INT32_MAX)
        return false;
    *value = parsed;
    return true;
}

/// Handles a port option at arguments[*i], moving *i past its value. 1: taken, 0: not a port
/// option, -1: a usage error (said on `err`).
int TakePortOption(const char* verb, const std::vector<std::string>& arguments, size_t* i,
                   PortOptions* options, std::ostream& err) {
    const std::string& argument = arguments[*i];
    if (argument == "--compact") {
        options->compact = true;
        return 1;
    }
    if (argument == "--dry-run") {
        options->dryRun = true;
        return 1;
    }
    if (argument != "--name" && argument != "--timeout" && argument != "--send-timeout")
        return 0;
    if (*i + 1 == arguments.size()) {
        err << "glyphwell " << verb << ": " << argument << " needs a value\n";
        return -1;
    }
    const std::string& value = arguments[++*i];
    if (argument == "--name") {
        options->name = value;
        return 1;
    }
    if (!ParseSeconds(value,
                      argument == "--timeout" ? &options->receiveTimeout : &options->sendTimeout)) {
        err << "glyphwell " << verb << ": " << argument << " takes seconds or \"forever\", not "
            << value << "\n";
        return -1;
    }
    return 1;
}

/// The values after a multi-value option: every following argument up to the next option.
std::vector<std::string> TakeValues(const std::vector<std::string>& arguments, size_t* i) {
    std::vector<std::string> values;
    while (*i + 1 < arguments.size() && arguments[*i + 1].rfind("--", 0) != 0)
        values.push_back(arguments[++*i]);
    return values;
}

/// The tagged JSON of the file URL for `path` (made absolute), or null JSON.
Json FileURL(const std::string& path) {
    std::error_code error;
    const std::filesystem::path absolute = std::filesystem::absolute(path, error);
    if (error)
        return Json();
    const bool directory = std::filesystem::is_directory(absolute, error);
    const std::string text = absolute.lexically_normal().string();
    TCFAdopted<CFURLRef> url(CFURLCreateFromFileSystemRepresentation(
        kCFAllocatorDefault, reinterpret_cast<const UInt8*>(text.data()), CFIndex(text.size()),
        directory));
    return url ? ValueToJSON(url) : Json();
}

/// Stores the file URL of `path` under `key`; false (said on `err`) when none can be made.
bool AddFileURL(Json* request, const std::string& key, const std::string& path, std::ostream& err) {
    Json url = FileURL(path);
    if (url.is_null()) {
        err << "glyphwell: cannot make a file URL of " << path << "\n";
        return false;
    }
    (*request)[key] = std::move(url);
    return true;
}

const char* DescribeStatus(SInt32 status) {
    switch (status) {
    case kCFMessagePortSendTimeout:
        return "the request could not be sent in time";
    case kCFMessagePortReceiveTimeout:
        return "no reply came in time";
    case kCFMessagePortIsInvalid:
        return "the port is not valid";
    case kCFMessagePortBecameInvalidError:
        return "the server went away before replying";
    default:
        return "the connection failed";
    }
}

/// Sends `bytes` as request `msgid` on the port of `options` and stores the reply's bytes.
/// False after a message on `err` when nothing listens or the exchange fails.
bool SendBytes(const char* verb, const PortOptions& options, SInt32 msgid, const std::string& bytes,
               std::string* reply, std::ostream& err) {
    TCFAdopted<CFStringRef> name(CFStringCreateWithBytes(
        kCFAllocatorDefault, reinterpret_cast<const UInt8*>(options.name.data()),
        CFIndex(options.name.size()), kCFStringEncodingUTF8, false));
    TCFAdopted<CFMessagePortRef> port(name ? CFMessagePortCreateRemote(kCFAllocatorDefault, name)
                                           : nullptr);
    if (!port) {
        err << "glyphwell " << verb << ": nothing answers on the port " << options.name << "\n";
        return false;
    }
    TCFAdopted<CFDataRef> request(CFDataCreate(
        kCFAllocatorDefault, reinterpret_cast<const UInt8*>(bytes.data()), CFIndex(bytes.size())));
    CFDataRef replyData = nullptr;
    const SInt32 status =
        CFMessagePortSendRequest(port, msgid, request, options.sendTimeout, options.receiveTimeout,
                                 kCFRunLoopDefaultMode, &replyData);
    TCFAdopted<CFDataRef> replyHolder(replyData);
    if (status != kCFMessagePortSuccess) {
        err << "glyphwell " << verb << ": " << DescribeStatus(status) << " (" << status << ")\n";
        return false;
    }
    reply->assign(reinterpret_cast<const char*>(CFDataGetBytePtr(replyData)),
                  size_t(CFDataGetLength(replyData)));
    return true;
}

/// Prints the reply bytes as tagged JSON. 0 when they hold an intact value; an empty reply is
/// said on `err` and is not a failure.
int PrintReply(const char* verb, const PortOptions& options, const std::string& reply,
               std::ostream& out, std::ostream& err) {
    if (reply.empty()) {
        err << "glyphwell " << verb << ": the reply is empty\n";
        return 0;
    }
    bool intact = false;
    out << DecodeToJSON(reply, err, &intact).dump(options.compact ? -1 : 2) << "\n";
    out.flush();
    if (!intact)
        err << "glyphwell " << verb << ": the reply is not a readable value\n";
    return intact ? 0 : 1;
}

/// Sends `request` (a tagged JSON value; null sends no bytes) and prints the reply, or with
/// --dry-run prints the request instead.
int Exchange(const char* verb, const PortOptions& options, SInt32 msgid, const Json* request,
             std::ostream& out, std::ostream& err) {
    std::string bytes, error, reply;
    if (request && !FlattenJSON(*request, &bytes, &error)) {
        err << "glyphwell " << verb << ": " << error << "\n";
        return 1;
    }
    if (options.dryRun) {
        out << (request ? *request : Json()).dump(options.compact ? -1 : 2) << "\n";
        return 0;
    }
    if (!SendBytes(verb, options, msgid, bytes, &reply, err))
        return 1;
    return PrintReply(verb, options, reply, out, err);
}

} // namespace

int RunSend(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
            std::ostream& err) {
    PortOptions options;
    std::string inputPath;
    bool haveInput = false, haveMsgid = false, empty = false;
    long msgid = 0;
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string& argument = arguments[i];
        const int taken = TakePortOption("send", arguments, &i, &options, err);
        if (taken < 0)
            return 2;
        if (taken > 0)
            continue;
        if (argument == "--msgid") {
            if (i + 1 == arguments.size() || !ParseInt32(arguments[i + 1], &msgid)) {
                err << "glyphwell send: --msgid needs a signed 32-bit number\n";
                return 2;
            }
            ++i;
            haveMsgid = true;
        } else if (argument == "--empty") {
            empty = true;
        } else if (argument.size() > 1 && argument[0] == '-') {
            err << "glyphwell send: unknown option " << argument << "\n";
            return 2;
        } else if (!haveInput) {
            inputPath = argument;
            haveInput = true;
        } else {
            err << "glyphwell send: more than one input given\n";
            return 2;
        }
    }
    if (!haveMsgid) {
        err << "glyphwell send: --msgid is required\n";
        return 2;
    }
    if (empty && haveInput) {
        err << "glyphwell send: --empty takes no input\n";
        return 2;
    }
    if (empty)
        return Exchange("send", options, SInt32(msgid), nullptr, out, err);

    Json request;
    std::string error;
    if (!ReadJSONInput(inputPath, in, &request, &error)) {
        err << "glyphwell send: " << error << "\n";
        return 1;
    }
    return Exchange("send", options, SInt32(msgid), &request, out, err);
}

int RunAskActivation(const std::vector<std::string>& arguments, std::istream&, std::ostream& out,
                     std::ostream& err) {
    PortOptions options;
    std::string font, family, app, bundle;
    std::vector<std::string> candidates;
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string& argument = arguments[i];
        const int taken = TakePortOption("ask-activation", arguments, &i, &options, err);
        if (taken < 0)
            return 2;
        if (taken > 0)
            continue;
        if (argument == "--candidate") {
            const std::vector<std::string> files = TakeValues(arguments, &i);
            candidates.insert(candidates.end(), files.begin(), files.end());
            if (files.empty()) {
                err << "glyphwell ask-activation: --candidate needs at least one file\n";
                return 2;
            }
            continue;
        }
        std::string* target = argument == "--font"     ? &font
                              : argument == "--family" ? &family
                              : argument == "--app"    ? &app
                              : argument == "--bundle" ? &bundle
                                                       : nullptr;
        if (!target) {
            err << "glyphwell ask-activation: unknown argument " << argument << "\n";
            return 2;
        }
        if (i + 1 == arguments.size()) {
            err << "glyphwell ask-activation: " << argument << " needs a value\n";
            return 2;
        }
        *target = arguments[++i];
    }
    if (candidates.empty()) {
        err << "glyphwell ask-activation: give the font files with --candidate\n";
        return 2;
    }

    Json request = Json::object();
    if (!app.empty())
        request[Text(kQZUIPropertyApplicationName)] = app;
    if (!bundle.empty() && !AddFileURL(&request, Text(kQZUIPropertyBundleURL), bundle, err))
        return 1;
    if (!font.empty())
        request[Text(kQZUIPropertyFontName)] = font;
    Json attributes = Json::object();
    if (!font.empty())
        attributes[Text(NSFontNameAttribute)] = font;
    if (!family.empty())
        attributes[Text(NSFontFamilyAttribute)] = family;
    if (!attributes.empty())
        request[Text(kQZUIPropertyRequestDictionary)] = attributes;
    Json urls = Json::array();
    for (const std::string& file : candidates) {
        Json url = FileURL(file);
        if (url.is_null()) {
            err << "glyphwell ask-activation: cannot make a file URL of " << file << "\n";
            return 1;
        }
        urls.push_back(url);
    }
    request[Text(kQZUIPropertyCandidateFontURLs)] = urls;
    return Exchange("ask-activation", options, 1, &request, out, err);
}

int RunAskDownload(const std::vector<std::string>& arguments, std::istream&, std::ostream& out,
                   std::ostream& err) {
    PortOptions options;
    std::string app, bundle;
    std::vector<std::string> fonts;
    long pid = long(getpid());
    bool suppress = false;
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string& argument = arguments[i];
        const int taken = TakePortOption("ask-download", arguments, &i, &options, err);
        if (taken < 0)
            return 2;
        if (taken > 0)
            continue;
        if (argument == "--font") {
            const std::vector<std::string> names = TakeValues(arguments, &i);
            if (names.empty()) {
                err << "glyphwell ask-download: --font needs at least one PSNAME[:FAMILY]\n";
                return 2;
            }
            fonts.insert(fonts.end(), names.begin(), names.end());
        } else if (argument == "--suppress") {
            suppress = true;
        } else if (argument == "--pid") {
            if (i + 1 == arguments.size() || !ParseInt32(arguments[i + 1], &pid)) {
                err << "glyphwell ask-download: --pid needs a process id\n";
                return 2;
            }
            ++i;
        } else if (argument == "--app" || argument == "--bundle") {
            if (i + 1 == arguments.size()) {
                err << "glyphwell ask-download: " << argument << " needs a value\n";
                return 2;
            }
            (argument == "--app" ? app : bundle) = arguments[++i];
        } else {
            err << "glyphwell ask-download: unknown argument " << argument << "\n";
            return 2;
        }
    }
    if (fonts.empty()) {
        err << "glyphwell ask-download: give the fonts with --font\n";
        return 2;
    }

    Json request = Json::object();
    if (!app.empty())
        request[Text(kQZUIPropertyApplicationName)] = app;
    if (!bundle.empty() && !AddFileURL(&request, Text(kQZUIPropertyBundleURL), bundle, err))
        return 1;
    request[Text(kQZUIPropertyProcessID)] = Json{{"$number", pid}, {"$type", 9}};
    Json properties = Json::array();
    for (const std::string& font : fonts) {
        const size_t colon = font.find(':');
        const std::string postScriptName = font.substr(0, colon);
        if (postScriptName.empty()) {
            err << "glyphwell ask-download: " << font << " has no PostScript name\n";
            return 2;
        }
        Json attributes = Json::object();
        attributes[Text(NSFontNameAttribute)] = postScriptName;
        if (colon != std::string::npos && colon + 1 < font.size())
            attributes[Text(NSFontFamilyAttribute)] = font.substr(colon + 1);
        properties.push_back(attributes);
    }
    request[Text(kQZUIPropertyFontProperties)] = properties;
    if (suppress)
        request[Text(kQZUIPropertySuppress)] = true;
    return Exchange("ask-download", options, 2, &request, out, err);
}

} // namespace glyphwell::tools

#include "tools/SendCommand.h"

#include <unistd.h>

#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <span>

#include "cfutil/TCFRetained.h"
#include "glyphwell/client.h"
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
    "    --compact, --dry-run (print the request only); send also --send-timeout SECONDS\n"
    "    (default 10)\n";

namespace {

using Json = nlohmann::ordered_json;

struct PortOptions {
    std::string name = kQZUIAgentPortNameText;
    CFTimeInterval receiveTimeout = kCFMessagePortWaitForever;
    CFTimeInterval sendTimeout = 10;
    bool compact = false;
    bool dryRun = false;
};

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

/// A decimal signed 32-bit number, the whole of `text`.
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
/// `--send-timeout` is taken only with `sendTimeout`: the ask verbs have one timeout for all.
int TakePortOption(const char* verb, const std::vector<std::string>& arguments, size_t* i,
                   PortOptions* options, bool sendTimeout, std::ostream& err) {
    const std::string& argument = arguments[*i];
    if (argument == "--compact") {
        options->compact = true;
        return 1;
    }
    if (argument == "--dry-run") {
        options->dryRun = true;
        return 1;
    }
    if (argument != "--name" && argument != "--timeout" &&
        (argument != "--send-timeout" || !sendTimeout))
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

/// The message for a port error code.
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

/// The values after a multi-value option: every following argument up to the next option.
std::vector<std::string> TakeValues(const std::vector<std::string>& arguments, size_t* i) {
    std::vector<std::string> values;
    while (*i + 1 < arguments.size() && arguments[*i + 1].rfind("--", 0) != 0)
        values.push_back(arguments[++*i]);
    return values;
}

/// What the ask verbs take from their command line.
struct AskArguments {
    std::string app, bundle, font, family;
    std::vector<std::string> candidates;
    std::vector<std::string> fonts; ///< PSNAME[:FAMILY]
    long pid = long(getpid());
    bool suppress = false;
};

/// One option of an ask verb: how many values it takes, where they go, and what it needs.
struct AskOption {
    const char* name;
    enum Shape { kFlag, kOne, kMany } shape;
    /// Stores one value (a flag gets ""); false when the value is not acceptable.
    bool (*store)(AskArguments&, const std::string&);
    const char* needs;
};

const AskOption kActivationOptions[] = {
    {"--candidate", AskOption::kMany,
     [](AskArguments& a, const std::string& v) { return a.candidates.push_back(v), true; },
     "at least one file"},
    {"--font", AskOption::kOne,
     [](AskArguments& a, const std::string& v) { return a.font = v, true; }, "a value"},
    {"--family", AskOption::kOne,
     [](AskArguments& a, const std::string& v) { return a.family = v, true; }, "a value"},
    {"--app", AskOption::kOne,
     [](AskArguments& a, const std::string& v) { return a.app = v, true; }, "a value"},
    {"--bundle", AskOption::kOne,
     [](AskArguments& a, const std::string& v) { return a.bundle = v, true; }, "a value"},
};

const AskOption kDownloadOptions[] = {
    {"--font", AskOption::kMany,
     [](AskArguments& a, const std::string& v) { return a.fonts.push_back(v), true; },
     "at least one PSNAME[:FAMILY]"},
    {"--app", AskOption::kOne,
     [](AskArguments& a, const std::string& v) { return a.app = v, true; }, "a value"},
    {"--bundle", AskOption::kOne,
     [](AskArguments& a, const std::string& v) { return a.bundle = v, true; }, "a value"},
    {"--pid", AskOption::kOne,
     [](AskArguments& a, const std::string& v) { return ParseInt32(v, &a.pid); }, "a process id"},
    {"--suppress", AskOption::kFlag,
     [](AskArguments& a, const std::string&) { return a.suppress = true; }, ""},
};

/// Reads an ask verb's command line with its option table. False after a message on `err`.
bool ParseAskArguments(const char* verb, std::span<const AskOption> table,
                       const std::vector<std::string>& arguments, AskArguments* values,
                       PortOptions* options, std::ostream& err) {
    for (size_t i = 0; i < arguments.size(); ++i) {
        const int taken = TakePortOption(verb, arguments, &i, options, false, err);
        if (taken < 0)
            return false;
        if (taken > 0)
            continue;
        const AskOption* option = nullptr;
        for (const AskOption& candidate : table)
            if (arguments[i] == candidate.name)
                option = &candidate;
        if (!option) {
            err << "glyphwell " << verb << ": unknown argument " << arguments[i] << "\n";
            return false;
        }
        std::vector<std::string> given;
        if (option->shape == AskOption::kMany)
            given = TakeValues(arguments, &i);
        else if (option->shape == AskOption::kOne && i + 1 < arguments.size())
            given.push_back(arguments[++i]);
        else if (option->shape == AskOption::kFlag)
            given.emplace_back();
        bool good = !given.empty();
        for (const std::string& value : given)
            good = good && option->store(*values, value);
        if (!good) {
            err << "glyphwell " << verb << ": " << option->name << " needs " << option->needs
                << "\n";
            return false;
        }
    }
    return true;
}

/// Frees a request of the client library.
struct RequestDeleter {
    void operator()(glyphwell_request* request) const { glyphwell_request_free(request); }
};
using Request = std::unique_ptr<glyphwell_request, RequestDeleter>;

/// Sets the application name and bundle of both questions; false after a message on `err`.
bool SetCommonFields(const char* verb, const AskArguments& values, glyphwell_request* request,
                     std::ostream& err) {
    if (!values.app.empty() &&
        glyphwell_request_set_application_name(request, values.app.c_str()) < 0) {
        err << "glyphwell " << verb << ": the application name is not UTF-8\n";
        return false;
    }
    if (!values.bundle.empty() &&
        glyphwell_request_set_bundle_path(request, values.bundle.c_str()) < 0) {
        err << "glyphwell " << verb << ": cannot make a file URL of " << values.bundle << "\n";
        return false;
    }
    return true;
}

/// The message id 1 request of `values`; null after a message on `err`.
Request BuildActivationRequest(const AskArguments& values, std::ostream& err) {
    Request request(glyphwell_request_new(GLYPHWELL_ASK_ACTIVATION));
    if (!SetCommonFields("ask-activation", values, request.get(), err))
        return nullptr;
    if (!values.font.empty() &&
        glyphwell_request_add_font(request.get(), values.font.c_str(), values.family.c_str()) < 0) {
        err << "glyphwell ask-activation: the font names are not UTF-8\n";
        return nullptr;
    }
    for (const std::string& file : values.candidates)
        if (glyphwell_request_add_candidate_file(request.get(), file.c_str()) < 0) {
            err << "glyphwell ask-activation: cannot make a file URL of " << file << "\n";
            return nullptr;
        }
    return request;
}

/// The message id 2 request of `values`; null after a message on `err`.
Request BuildDownloadRequest(const AskArguments& values, std::ostream& err) {
    Request request(glyphwell_request_new(GLYPHWELL_ASK_DOWNLOAD));
    if (!SetCommonFields("ask-download", values, request.get(), err))
        return nullptr;
    glyphwell_request_set_process_id(request.get(), int32_t(values.pid));
    glyphwell_request_set_suppress(request.get(), values.suppress);
    for (const std::string& font : values.fonts) {
        const size_t colon = font.find(':');
        const std::string postScriptName = font.substr(0, colon);
        const std::string family = colon == std::string::npos ? "" : font.substr(colon + 1);
        if (postScriptName.empty()) {
            err << "glyphwell ask-download: " << font << " has no PostScript name\n";
            return nullptr;
        }
        if (glyphwell_request_add_font(request.get(), postScriptName.c_str(), family.c_str()) < 0) {
            err << "glyphwell ask-download: " << font << " is not UTF-8\n";
            return nullptr;
        }
    }
    return request;
}

/// The reply timeout in milliseconds for the client library (-1: no limit).
int TimeoutMilliseconds(CFTimeInterval seconds) {
    if (seconds == kCFMessagePortWaitForever || seconds * 1000 >= double(INT32_MAX))
        return -1;
    return int(std::ceil(seconds * 1000));
}

/// One ask verb: its name, its option table, what it cannot go without, and its request.
struct AskVerb {
    const char* name;
    std::span<const AskOption> options;
    bool (*complete)(const AskArguments&);
    const char* incomplete;
    Request (*build)(const AskArguments&, std::ostream&);
};

const AskVerb kAskActivation = {"ask-activation", kActivationOptions,
                                [](const AskArguments& a) { return !a.candidates.empty(); },
                                "give the font files with --candidate", BuildActivationRequest};
const AskVerb kAskDownload = {"ask-download", kDownloadOptions,
                              [](const AskArguments& a) { return !a.fonts.empty(); },
                              "give the fonts with --font", BuildDownloadRequest};

/// Runs an ask verb: the request built with the client library, sent, and the reply printed as
/// tagged JSON (or the request, with --dry-run).
int RunAsk(const AskVerb& verb, const std::vector<std::string>& arguments, std::ostream& out,
           std::ostream& err) {
    PortOptions options;
    AskArguments values;
    if (!ParseAskArguments(verb.name, verb.options, arguments, &values, &options, err))
        return 2;
    if (!verb.complete(values)) {
        err << "glyphwell " << verb.name << ": " << verb.incomplete << "\n";
        return 2;
    }
    Request request = verb.build(values, err);
    if (!request)
        return 2;
    if (options.dryRun) {
        const void* bytes = nullptr;
        size_t length = 0;
        glyphwell_request_get_bytes(request.get(), &bytes, &length);
        bool intact = false;
        const Json json =
            DecodeToJSON(std::string(static_cast<const char*>(bytes), length), err, &intact);
        out << json.dump(options.compact ? -1 : 2) << "\n";
        return intact ? 0 : 1;
    }
    glyphwell_reply* reply = nullptr;
    const int status = glyphwell_request_send(request.get(), options.name.c_str(),
                                              TimeoutMilliseconds(options.receiveTimeout), &reply);
    if (status != GLYPHWELL_OK) {
        err << "glyphwell " << verb.name << ": " << glyphwell_status_text(status) << "\n";
        return 1;
    }
    size_t length = 0;
    const void* bytes = glyphwell_reply_get_bytes(reply, &length);
    const std::string replyBytes(static_cast<const char*>(bytes), length);
    glyphwell_reply_free(reply);
    return PrintReply(verb.name, options, replyBytes, out, err);
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
        const int taken = TakePortOption("send", arguments, &i, &options, true, err);
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
    return RunAsk(kAskActivation, arguments, out, err);
}

int RunAskDownload(const std::vector<std::string>& arguments, std::istream&, std::ostream& out,
                   std::ostream& err) {
    return RunAsk(kAskDownload, arguments, out, err);
}

} // namespace glyphwell::tools

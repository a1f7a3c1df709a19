#include "tools/Commands.h"

#include <unistd.h>

#include <fstream>
#include <iostream>

#include "cfutil/TCFRetained.h"
#include "serialization/TCFResurrectContext.h"
#include "tools/SendCommand.h"
#ifdef GLYPHWELL_CATALOG_TOOL
#include "tools/CatalogCommand.h"
#include "tools/FontsCommand.h"
#endif
#include "tools/TaggedJSON.h"
#include "tools/ToolInput.h"

namespace glyphwell::tools {

namespace {

const char kCodecUsage[] =
    "usage: glyphwell <command> [options]\n"
    "\n"
    "commands:\n"
    "  encode [FILE|-] [-o OUT] [--hex]   tagged JSON (file or stdin) to flattened bytes\n"
    "  decode [FILE|-] [--expect KIND] [--compact]\n"
    "                                     flattened bytes (file or stdin) to tagged JSON;\n"
    "                                     KIND: any (default), string, number, boolean, data,\n"
    "                                     charset, array, dictionary, set, url, uuid, error\n";
#ifdef GLYPHWELL_CATALOG_TOOL
const char* const kCatalogVerbUsage = kCatalogUsage;
const char* const kFontsVerbUsage = kFontsUsage;
#else
const char* const kCatalogVerbUsage = "";
const char* const kFontsVerbUsage = "";
#endif
const std::string kUsage = std::string(kCodecUsage) + kSendUsage + kCatalogVerbUsage +
                           kFontsVerbUsage + "  help                               this text\n";

/// The bytes as hexadecimal pairs separated by spaces, with a final newline.
std::string HexDump(const std::string& bytes) {
    static const char digits[] = "0123456789ABCDEF";
    std::string text;
    text.reserve(bytes.size() * 3 + 1);
    for (size_t i = 0; i < bytes.size(); ++i) {
        const auto byte = static_cast<unsigned char>(bytes[i]);
        if (i)
            text += ' ';
        text += digits[byte >> 4];
        text += digits[byte & 15];
    }
    text += '\n';
    return text;
}

struct EncodeOptions {
    std::string inputPath;
    std::string outputPath;
    bool hex = false;
};

/// Reads the command line of `encode`; false after a usage message on `err`.
bool ParseEncodeArguments(const std::vector<std::string>& arguments, EncodeOptions* options,
                          std::ostream& err) {
    bool haveInput = false;
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string& argument = arguments[i];
        if (argument == "--hex") {
            options->hex = true;
        } else if (argument == "-o" || argument == "--output") {
            if (i + 1 == arguments.size()) {
                err << "glyphwell encode: " << argument << " needs a file name\n";
                return false;
            }
            options->outputPath = arguments[++i];
        } else if (argument.size() > 1 && argument[0] == '-') {
            err << "glyphwell encode: unknown option " << argument << "\n" << kUsage;
            return false;
        } else if (!haveInput) {
            options->inputPath = argument;
            haveInput = true;
        } else {
            err << "glyphwell encode: more than one input given\n";
            return false;
        }
    }
    return true;
}

/// One kind `decode --expect` accepts and the reader call that retrieves it.
struct ExpectedKind {
    const char* name;
    CFTypeRef (*retrieve)(TCFResurrectContext&);
};

const ExpectedKind kExpectedKinds[] = {
    {"any", [](TCFResurrectContext& c) -> CFTypeRef { return c.Resurrect(kTCFTypeAny); }},
    {"string", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFString(); }},
    {"number", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFNumber(); }},
    {"boolean", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFBoolean(); }},
    {"data", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFData(); }},
    {"charset", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFCharacterSet(); }},
    {"array", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFArray(); }},
    {"dictionary", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFDictionary(); }},
    {"set", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFSet(); }},
    {"url", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFURL(); }},
    {"uuid", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFUUID(); }},
    {"error", [](TCFResurrectContext& c) -> CFTypeRef { return c.RetrieveCFError(); }},
};

struct DecodeOptions {
    std::string inputPath;
    const ExpectedKind* expected = &kExpectedKinds[0];
    bool compact = false;
};

/// Reads the command line of `decode`; false after a usage message on `err`.
bool ParseDecodeArguments(const std::vector<std::string>& arguments, DecodeOptions* options,
                          std::ostream& err) {
    bool haveInput = false;
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string& argument = arguments[i];
        if (argument == "--expect") {
            if (i + 1 == arguments.size()) {
                err << "glyphwell decode: --expect needs a kind\n";
                return false;
            }
            const std::string& kind = arguments[++i];
            options->expected = nullptr;
            for (const ExpectedKind& candidate : kExpectedKinds)
                if (kind == candidate.name)
                    options->expected = &candidate;
            if (!options->expected) {
                err << "glyphwell decode: unknown kind " << kind << "\n" << kUsage;
                return false;
            }
        } else if (argument == "--compact") {
            options->compact = true;
        } else if (argument.size() > 1 && argument[0] == '-') {
            err << "glyphwell decode: unknown option " << argument << "\n" << kUsage;
            return false;
        } else if (!haveInput) {
            options->inputPath = argument;
            haveInput = true;
        } else {
            err << "glyphwell decode: more than one input given\n";
            return false;
        }
    }
    return true;
}

/// `catalog ...`, when the tool was built with the agent's catalog reader. Progress lines go to
/// a terminal only.
int RunCatalogVerb(const std::vector<std::string>& arguments, std::istream&, std::ostream& out,
                   std::ostream& err) {
#ifdef GLYPHWELL_CATALOG_TOOL
    return RunCatalog(arguments, out, err, &out == &std::cout && isatty(STDOUT_FILENO));
#else
    (void)arguments;
    (void)out;
    err << "glyphwell catalog: this glyphwell was built without the agent's catalog reader\n";
    return 1;
#endif
}

/// `fonts ...`, when the tool was built with the agent's desktop library.
int RunFontsVerb(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
                 std::ostream& err) {
#ifdef GLYPHWELL_CATALOG_TOOL
    return RunFonts(arguments, in, out, err);
#else
    (void)arguments;
    (void)in;
    (void)out;
    err << "glyphwell fonts: this glyphwell was built without the agent's desktop library\n";
    return 2;
#endif
}

} // namespace

int RunEncode(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
              std::ostream& err) {
    EncodeOptions options;
    if (!ParseEncodeArguments(arguments, &options, err))
        return 2;
    nlohmann::ordered_json json;
    std::string bytes, error;
    if (!ReadJSONInput(options.inputPath, in, &json, &error)) {
        err << "glyphwell encode: " << error << "\n";
        return 1;
    }
    if (!FlattenJSON(json, &bytes, &error)) {
        err << "glyphwell encode: " << InputName(options.inputPath) << ": " << error << "\n";
        return 1;
    }
    const std::string output = options.hex ? HexDump(bytes) : bytes;
    if (options.outputPath.empty()) {
        out << output;
        out.flush();
        return 0;
    }
    std::ofstream file(options.outputPath, std::ios::binary | std::ios::trunc);
    file << output;
    file.close();
    if (!file) {
        err << "glyphwell encode: cannot write " << options.outputPath << "\n";
        return 1;
    }
    return 0;
}

int RunDecode(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
              std::ostream& err) {
    DecodeOptions options;
    if (!ParseDecodeArguments(arguments, &options, err))
        return 2;
    std::string bytes, error;
    if (!ReadInput(options.inputPath, in, &bytes, &error)) {
        err << "glyphwell decode: " << error << "\n";
        return 1;
    }
    // Every line the reader and the uniquer log goes to `err` as its bare text.
    LogSink previous = SetLogSink([&](const LogRecord& record) { err << record.text << "\n"; });
    TCFResurrectContext context(reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size());
    TCFAdopted<CFTypeRef> value(options.expected->retrieve(context));
    SetLogSink(previous);

    out << ValueToJSON(value).dump(options.compact ? -1 : 2) << "\n";
    out.flush();
    return value && !context.IsCorrupted() ? 0 : 1;
}

int RunTool(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
            std::ostream& err) {
    using Verb =
        int (*)(const std::vector<std::string>&, std::istream&, std::ostream&, std::ostream&);
    static const std::pair<const char*, Verb> kVerbs[] = {
        {"encode", RunEncode},
        {"decode", RunDecode},
        {"send", RunSend},
        {"ask-activation", RunAskActivation},
        {"ask-download", RunAskDownload},
        {"catalog", RunCatalogVerb},
        {"fonts", RunFontsVerb},
    };
    if (arguments.empty()) {
        err << kUsage;
        return 2;
    }
    const std::string& command = arguments[0];
    const std::vector<std::string> rest(arguments.begin() + 1, arguments.end());
    for (const auto& [name, verb] : kVerbs)
        if (command == name)
            return verb(rest, in, out, err);
    if (command == "help" || command == "--help" || command == "-h") {
        out << kUsage;
        return 0;
    }
    err << "glyphwell: unknown command " << command << "\n" << kUsage;
    return 2;
}

} // namespace glyphwell::tools

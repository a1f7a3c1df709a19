#include "tools/Commands.h"

#include <fstream>
#include <iostream>
#include <iterator>
#include <sstream>

#include "serialization/TCFFlattenContext.h"
#include "serialization/TCFResurrectContext.h"
#include "tools/SendCommand.h"
#include "tools/TaggedJSON.h"

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
const std::string kUsage =
    std::string(kCodecUsage) + kSendUsage + "  help                               this text\n";

/// Reads the whole input named by `path` ("-" or empty: `in`). False with a message on failure.
bool ReadInput(const std::string& path, std::istream& in, std::string* text, std::string* error) {
    if (path.empty() || path == "-") {
        text->assign(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
        return true;
    }
    std::ifstream file(path, std::ios::binary);
    if (!file) {
        *error = "cannot open " + path;
        return false;
    }
    text->assign(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
    if (file.bad()) {
        *error = "cannot read " + path;
        return false;
    }
    return true;
}

/// "line:column" of a byte offset in `text` (both from 1).
std::string Position(const std::string& text, size_t offset) {
    size_t line = 1, column = 1;
    for (size_t i = 0; i < offset && i < text.size(); ++i) {
        if (text[i] == '\n') {
            ++line;
            column = 1;
        } else {
            ++column;
        }
    }
    return std::to_string(line) + ":" + std::to_string(column);
}

std::string HexDump(const UInt8* bytes, CFIndex length) {
    static const char digits[] = "0123456789ABCDEF";
    std::string text;
    text.reserve(size_t(length) * 3 + 1);
    for (CFIndex i = 0; i < length; ++i) {
        if (i)
            text += ' ';
        text += digits[bytes[i] >> 4];
        text += digits[bytes[i] & 15];
    }
    text += '\n';
    return text;
}

} // namespace

int RunEncode(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
              std::ostream& err) {
    std::string inputPath, outputPath;
    bool hex = false, haveInput = false;
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string& argument = arguments[i];
        if (argument == "--hex") {
            hex = true;
        } else if (argument == "-o" || argument == "--output") {
            if (i + 1 == arguments.size()) {
                err << "glyphwell encode: " << argument << " needs a file name\n";
                return 2;
            }
            outputPath = arguments[++i];
        } else if (argument.size() > 1 && argument[0] == '-') {
            err << "glyphwell encode: unknown option " << argument << "\n" << kUsage;
            return 2;
        } else if (!haveInput) {
            inputPath = argument;
            haveInput = true;
        } else {
            err << "glyphwell encode: more than one input given\n";
            return 2;
        }
    }
    const std::string name = inputPath.empty() || inputPath == "-" ? "<stdin>" : inputPath;

    std::string text, error;
    if (!ReadInput(inputPath, in, &text, &error)) {
        err << "glyphwell encode: " << error << "\n";
        return 1;
    }
    nlohmann::ordered_json json;
    try {
        json = nlohmann::ordered_json::parse(text);
    } catch (const nlohmann::json::parse_error& failure) {
        err << "glyphwell encode: " << name << ":"
            << Position(text, failure.byte ? failure.byte - 1 : 0)
            << ": malformed JSON: " << failure.what() << "\n";
        return 1;
    }
    CFTypeRef value = CreateValueFromJSON(json, &error);
    if (!value) {
        err << "glyphwell encode: " << name << ": " << error << "\n";
        return 1;
    }

    // Anything the writer logs means it could not write the value as given.
    std::string writerProblem;
    LogSink previous = SetLogSink([&](const LogRecord& record) {
        if (writerProblem.empty())
            writerProblem = std::string(record.text);
    });
    CFMutableDataRef bytes = CFDataCreateMutable(kCFAllocatorDefault, 0);
    {
        TCFFlattenContext context(bytes, false);
        context.Flatten(value);
    }
    SetLogSink(previous);
    CFRelease(value);

    int status = 0;
    if (!writerProblem.empty()) {
        err << "glyphwell encode: " << name << ": the value cannot be written: " << writerProblem
            << "\n";
        status = 1;
    } else {
        const std::string output =
            hex ? HexDump(CFDataGetBytePtr(bytes), CFDataGetLength(bytes))
                : std::string(reinterpret_cast<const char*>(CFDataGetBytePtr(bytes)),
                              size_t(CFDataGetLength(bytes)));
        if (outputPath.empty()) {
            out << output;
            out.flush();
        } else {
            std::ofstream file(outputPath, std::ios::binary | std::ios::trunc);
            file << output;
            file.close();
            if (!file) {
                err << "glyphwell encode: cannot write " << outputPath << "\n";
                status = 1;
            }
        }
    }
    CFRelease(bytes);
    return status;
}

int RunDecode(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
              std::ostream& err) {
    static const std::pair<const char*, TCFType> kKinds[] = {
        {"any", kTCFTypeAny},       {"string", kTCFTypeString},
        {"number", kTCFTypeNumber}, {"boolean", kTCFTypeBoolean},
        {"data", kTCFTypeData},     {"charset", kTCFTypeCharacterSet},
        {"array", kTCFTypeArray},   {"dictionary", kTCFTypeDictionary},
        {"set", kTCFTypeSet},       {"url", kTCFTypeURL},
        {"uuid", kTCFTypeUUID},     {"error", kTCFTypeError}};
    std::string inputPath;
    TCFType expected = kTCFTypeAny;
    bool compact = false, haveInput = false;
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string& argument = arguments[i];
        if (argument == "--expect") {
            if (i + 1 == arguments.size()) {
                err << "glyphwell decode: --expect needs a kind\n";
                return 2;
            }
            const std::string& kind = arguments[++i];
            bool known = false;
            for (const auto& [name, type] : kKinds)
                if (kind == name) {
                    expected = type;
                    known = true;
                }
            if (!known) {
                err << "glyphwell decode: unknown kind " << kind << "\n" << kUsage;
                return 2;
            }
        } else if (argument == "--compact") {
            compact = true;
        } else if (argument.size() > 1 && argument[0] == '-') {
            err << "glyphwell decode: unknown option " << argument << "\n" << kUsage;
            return 2;
        } else if (!haveInput) {
            inputPath = argument;
            haveInput = true;
        } else {
            err << "glyphwell decode: more than one input given\n";
            return 2;
        }
    }
    std::string bytes, error;
    if (!ReadInput(inputPath, in, &bytes, &error)) {
        err << "glyphwell decode: " << error << "\n";
        return 1;
    }

    // Every line the reader and the uniquer log goes to `err` as its bare text.
    LogSink previous = SetLogSink([&](const LogRecord& record) { err << record.text << "\n"; });
    TCFResurrectContext context(reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size());
    CFTypeRef value =
        expected == kTCFTypeAny ? context.Resurrect(kTCFTypeAny) : [&]() -> CFTypeRef {
        switch (expected) {
        case kTCFTypeString:
            return context.RetrieveCFString();
        case kTCFTypeNumber:
            return context.RetrieveCFNumber();
        case kTCFTypeBoolean:
            return context.RetrieveCFBoolean();
        case kTCFTypeData:
            return context.RetrieveCFData();
        case kTCFTypeCharacterSet:
            return context.RetrieveCFCharacterSet();
        case kTCFTypeArray:
            return context.RetrieveCFArray();
        case kTCFTypeDictionary:
            return context.RetrieveCFDictionary();
        case kTCFTypeSet:
            return context.RetrieveCFSet();
        case kTCFTypeURL:
            return context.RetrieveCFURL();
        case kTCFTypeUUID:
            return context.RetrieveCFUUID();
        default:
            return context.RetrieveCFError();
        }
    }();
    SetLogSink(previous);

    out << ValueToJSON(value).dump(compact ? -1 : 2) << "\n";
    out.flush();
    const bool good = value && !context.IsCorrupted();
    if (value)
        CFRelease(value);
    return good ? 0 : 1;
}

int RunTool(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
            std::ostream& err) {
    if (arguments.empty()) {
        err << kUsage;
        return 2;
    }
    const std::string& command = arguments[0];
    const std::vector<std::string> rest(arguments.begin() + 1, arguments.end());
    if (command == "encode")
        return RunEncode(rest, in, out, err);
    if (command == "decode")
        return RunDecode(rest, in, out, err);
    if (command == "send")
        return RunSend(rest, in, out, err);
    if (command == "ask-activation")
        return RunAskActivation(rest, in, out, err);
    if (command == "ask-download")
        return RunAskDownload(rest, in, out, err);
    if (command == "help" || command == "--help" || command == "-h") {
        out << kUsage;
        return 0;
    }
    err << "glyphwell: unknown command " << command << "\n" << kUsage;
    return 2;
}

} // namespace glyphwell::tools

#include "tools/ToolInput.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <istream>
#include <iterator>
#include <ostream>

#include "cfutil/TCFRetained.h"
#include "serialization/TCFFlattenContext.h"
#include "serialization/TCFResurrectContext.h"
#include "tools/TaggedJSON.h"

namespace glyphwell::tools {

namespace {

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

} // namespace

bool ReadFile(const std::string& path, std::string* text, std::string* error, size_t maximumSize) {
    std::ifstream file(path, std::ios::binary);
    if (!file) {
        *error = "cannot open " + path + ": " + std::strerror(errno);
        return false;
    }
    text->clear();
    char buffer[65536];
    // Reads at most one byte past the limit, to tell a file of exactly the limit from a larger one.
    while (file && text->size() <= maximumSize) {
        const size_t room = maximumSize - text->size();
        file.read(buffer, std::streamsize(room < sizeof buffer ? room + 1 : sizeof buffer));
        text->append(buffer, size_t(file.gcount()));
    }
    if (file.bad()) {
        *error = "cannot read " + path;
        return false;
    }
    if (text->size() > maximumSize) {
        *error = path + ": larger than " + std::to_string(maximumSize) + " bytes";
        return false;
    }
    return true;
}

bool ReadInput(const std::string& path, std::istream& in, std::string* text, std::string* error) {
    if (path.empty() || path == "-") {
        text->assign(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
        return true;
    }
    return ReadFile(path, text, error);
}

std::string InputName(const std::string& path) {
    return path.empty() || path == "-" ? "<stdin>" : path;
}

bool ReadJSONInput(const std::string& path, std::istream& in, nlohmann::ordered_json* json,
                   std::string* error) {
    std::string text;
    if (!ReadInput(path, in, &text, error))
        return false;
    try {
        *json = nlohmann::ordered_json::parse(text);
    } catch (const nlohmann::json::parse_error& failure) {
        *error = InputName(path) + ":" + Position(text, failure.byte ? failure.byte - 1 : 0) +
                 ": malformed JSON: " + failure.what();
        return false;
    }
    return true;
}

bool FlattenValue(CFTypeRef value, std::string* bytes) {
    TCFAdopted<CFMutableDataRef> buffer(CFDataCreateMutable(kCFAllocatorDefault, 0));
    TCFFlattenContext context(buffer, false);
    context.Flatten(value);
    if (context.HasFailed()) {
        bytes->clear();
        return false;
    }
    bytes->assign(reinterpret_cast<const char*>(CFDataGetBytePtr(buffer)),
                  size_t(CFDataGetLength(buffer)));
    return true;
}

bool FlattenJSON(const nlohmann::ordered_json& json, std::string* bytes, std::string* error) {
    bytes->clear();
    TCFAdopted<CFTypeRef> value(CreateValueFromJSON(json, error));
    if (!value)
        return false;
    if (!FlattenValue(value, bytes)) {
        *error = "the value cannot be written unchanged (a text or URL without a UTF-8 form or "
                 "too long for a reader, or a kind the stream cannot carry)";
        return false;
    }
    return true;
}

nlohmann::ordered_json DecodeToJSON(const std::string& bytes, std::ostream& err, bool* intact) {
    LogSink previous = SetLogSink([&](const LogRecord& record) { err << record.text << "\n"; });
    TCFResurrectContext context(reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size());
    TCFAdopted<CFTypeRef> value(context.Resurrect(kTCFTypeAny));
    SetLogSink(previous);
    *intact = value && !context.IsCorrupted();
    return ValueToJSON(value);
}

} // namespace glyphwell::tools

#include "bridge/QZFontChoice.h"

#include <charconv>
#include <cstring>

#include "platform/ReadFile.h"

namespace {

void Add(std::string& text, std::string_view key, std::string_view value) {
    text.append(key).append("=").append(value).push_back('\0');
}

} // namespace

bool QZProcessRuns(pid_t pid) {
    std::string stat;
    if (pid <= 0 ||
        !glyphwell::ReadFileStart("/proc/" + std::to_string(pid) + "/stat", 1024, &stat))
        return false;
    const size_t end = stat.rfind(')');
    return end != std::string::npos && end + 2 < stat.size() && stat[end + 2] != 'Z' &&
           stat[end + 2] != 'X';
}

std::vector<std::string> QZFontChoiceArguments(const QZFontChoiceRequest& request) {
    std::vector<std::string> arguments = {"sender=" + request.sender,
                                          "desktop=" + request.desktopID};
    for (const std::string& language : request.wants.languages)
        arguments.push_back("language=" + language);
    for (const std::string& family : request.wants.families)
        arguments.push_back("family=" + family);
    arguments.push_back("pid=" + std::to_string(request.pid));
    if (request.hasPortName)
        arguments.push_back("port=" + request.portName);
    return arguments;
}

bool QZParseFontChoiceArguments(int count, const char* const* arguments,
                                QZFontChoiceRequest* request) {
    std::vector<bool> seen(2);
    for (int index = 0; index < count; ++index) {
        const std::string_view argument(arguments[index]);
        const size_t equals = argument.find('=');
        if (equals == std::string_view::npos)
            return false;
        const std::string_view key = argument.substr(0, equals);
        const std::string value(argument.substr(equals + 1));
        if (key == "language" || key == "family") {
            auto& list = key == "language" ? request->wants.languages : request->wants.families;
            if (list.size() >= QZFontResourceWants::kMaximumWanted)
                return false;
            list.push_back(value);
            continue;
        }
        if (key == "pid") {
            const auto [end, error] =
                std::from_chars(value.data(), value.data() + value.size(), request->pid);
            if (error != std::errc() || end != value.data() + value.size() || request->pid <= 0)
                return false;
            continue;
        }
        if (key == "port") {
            if (request->hasPortName)
                return false;
            request->hasPortName = true;
            request->portName = value;
            continue;
        }
        static constexpr std::string_view kKeys[] = {"sender", "desktop"};
        std::string* fields[] = {&request->sender, &request->desktopID};
        size_t field = 0;
        while (field < 2 && kKeys[field] != key)
            ++field;
        if (field == 2 || seen[field])
            return false;
        seen[field] = true;
        *fields[field] = value;
    }
    return true;
}

std::string QZEncodeFontChoice(const QZFontChoice& choice) {
    std::string text;
    Add(text, "application", choice.application);
    Add(text, "name", choice.displayName);
    Add(text, "file", choice.desktopFile);
    Add(text, "fonts", choice.fontNames);
    Add(text, "unserved", choice.unserved);
    for (const std::string& language : choice.askedLanguages)
        Add(text, "asked", language);
    for (const auto& [postScriptName, family] : choice.fonts) {
        Add(text, "postscript", postScriptName);
        Add(text, "family", family);
    }
    Add(text, "end", "");
    return text;
}

bool QZDecodeFontChoice(std::string_view text, QZFontChoice* choice) {
    *choice = {};
    bool ended = false, family = false;
    while (!text.empty()) {
        const size_t end = text.find('\0');
        if (ended || end == std::string_view::npos)
            return false;
        const std::string_view record = text.substr(0, end);
        text.remove_prefix(end + 1);
        const size_t equals = record.find('=');
        if (equals == std::string_view::npos)
            return false;
        const std::string_view key = record.substr(0, equals);
        const std::string value(record.substr(equals + 1));
        // Each PostScript name is followed by its family, and by nothing else.
        if (family != (key == "family"))
            return false;
        family = key == "postscript";
        if (key == "application")
            choice->application = value;
        else if (key == "name")
            choice->displayName = value;
        else if (key == "file")
            choice->desktopFile = value;
        else if (key == "fonts")
            choice->fontNames = value;
        else if (key == "unserved")
            choice->unserved = value;
        else if (key == "asked")
            choice->askedLanguages.push_back(value);
        else if (key == "postscript")
            choice->fonts.emplace_back(value, std::string());
        else if (key == "family")
            choice->fonts.back().second = value;
        else if (key == "end")
            ended = true;
        else
            return false;
    }
    return ended && !family;
}

std::string QZEncodeQuestionAsking() {
    std::string text;
    Add(text, "asking", "");
    return text;
}

std::string QZEncodeQuestionOutcome(int status, int result, const std::string& statusText) {
    std::string text;
    Add(text, "status", std::to_string(status));
    Add(text, "result", std::to_string(result));
    Add(text, "text", statusText);
    return text;
}

size_t QZFontChoiceSize(std::string_view text) {
    // Every record follows a NUL, and a value holds none: "\0end=\0" is the end record.
    static constexpr std::string_view kEnd("\0end=\0", 6);
    const size_t end = text.find(kEnd);
    return end == std::string_view::npos ? end : end + kEnd.size();
}

bool QZDecodeQuestionTail(std::string_view text, QZFontQuestionTail* tail) {
    *tail = {};
    static constexpr std::string_view kAsking("asking=\0", 8);
    if (text.substr(0, kAsking.size()) == kAsking) {
        tail->asking = true;
        text.remove_prefix(kAsking.size());
    }
    if (text.empty())
        return true;
    // The outcome: its three records in order, then nothing.
    std::string_view values[3];
    static constexpr std::string_view kKeys[] = {"status=", "result=", "text="};
    for (size_t index = 0; index < 3; ++index) {
        const size_t end = text.find('\0');
        if (end == std::string_view::npos || text.substr(0, kKeys[index].size()) != kKeys[index])
            return false;
        values[index] = text.substr(kKeys[index].size(), end - kKeys[index].size());
        text.remove_prefix(end + 1);
    }
    for (size_t index = 0; index < 2; ++index) {
        int& number = index == 0 ? tail->status : tail->result;
        const auto [last, error] = std::from_chars(
            values[index].data(), values[index].data() + values[index].size(), number);
        if (error != std::errc() || last != values[index].data() + values[index].size())
            return false;
    }
    tail->statusText = values[2];
    tail->ended = true;
    return text.empty();
}

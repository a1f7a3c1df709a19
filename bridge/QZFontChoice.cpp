#include "bridge/QZFontChoice.h"

#include <cstring>

namespace {

void Add(std::string& text, std::string_view key, std::string_view value) {
    text.append(key).append("=").append(value).push_back('\0');
}

} // namespace

std::vector<std::string> QZFontChoiceArguments(const QZFontChoiceRequest& request) {
    std::vector<std::string> arguments = {
        "sender=" + request.sender, "desktop=" + request.desktopID,
        "executable=" + request.executable, "declined=" + request.declinedPath};
    for (const std::string& language : request.wants.languages)
        arguments.push_back("language=" + language);
    for (const std::string& family : request.wants.families)
        arguments.push_back("family=" + family);
    return arguments;
}

bool QZParseFontChoiceArguments(int count, const char* const* arguments,
                                QZFontChoiceRequest* request) {
    std::vector<bool> seen(4);
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
        static constexpr std::string_view kKeys[] = {"sender", "desktop", "executable", "declined"};
        std::string* fields[] = {&request->sender, &request->desktopID, &request->executable,
                                 &request->declinedPath};
        size_t field = 0;
        while (field < 4 && kKeys[field] != key)
            ++field;
        if (field == 4 || seen[field])
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

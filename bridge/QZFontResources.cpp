#include "bridge/QZFontResources.h"

#include <algorithm>

#include "desktop/QZFontLanguages.h"

namespace {

/// Whether `text` is valid UTF-8 without NUL.
bool IsUTF8(std::string_view text) {
    size_t i = 0;
    while (i < text.size()) {
        const unsigned char c = text[i];
        size_t length = c < 0x80         ? 1
                        : (c >> 5) == 6  ? 2
                        : (c >> 4) == 14 ? 3
                        : (c >> 3) == 30 ? 4
                                         : 0;
        if (c == 0 || length == 0 || i + length > text.size())
            return false;
        for (size_t k = 1; k < length; ++k)
            if ((static_cast<unsigned char>(text[i + k]) >> 6) != 2)
                return false;
        i += length;
    }
    return true;
}

/// The parts of `text` between unescaped `separator`s (a `stop` ends the text), with
/// fontconfig's "\\" escapes undone when `unescape`.
std::vector<std::string> Split(std::string_view text, char separator, bool unescape,
                               char stop = 0) {
    std::vector<std::string> parts(1);
    for (size_t i = 0; i < text.size(); ++i) {
        if (text[i] == '\\' && i + 1 < text.size()) {
            if (!unescape)
                parts.back() += text[i];
            parts.back() += text[++i];
        } else if (text[i] == separator) {
            parts.emplace_back();
        } else if (stop && text[i] == stop) {
            break;
        } else {
            parts.back() += text[i];
        }
    }
    return parts;
}

void AddOnce(std::vector<std::string>& list, std::string value) {
    if (list.size() < QZFontResourceWants::kMaximumWanted &&
        std::find(list.begin(), list.end(), value) == list.end())
        list.push_back(std::move(value));
}

/// Family names as fontconfig reads them: blanks around a name do not count.
std::string Trimmed(std::string_view text) {
    const size_t first = text.find_first_not_of(' ');
    if (first == std::string_view::npos)
        return {};
    return std::string(text.substr(first, text.find_last_not_of(' ') - first + 1));
}

} // namespace

void QZFontResourceWants::Merge(const QZFontResourceWants& other) {
    for (const std::string& language : other.languages)
        AddOnce(languages, language);
    for (const std::string& family : other.families)
        AddOnce(families, family);
}

bool QZAddFontResource(std::string_view resource, QZFontResourceWants& wants) {
    if (resource.empty() || resource.size() > kMaximumResourceSize || !IsUTF8(resource))
        return false;
    QZFontResourceWants found;
    const std::vector<std::string> elements = Split(resource, ':', false);
    // Before the first ":", families separated by "," and ended by "-" (the size).
    for (const std::string& family : Split(elements.front(), ',', true, '-'))
        if (std::string name = Trimmed(family); !name.empty())
            AddOnce(found.families, std::move(name));
    for (size_t i = 1; i < elements.size(); ++i) {
        const size_t equals = elements[i].find('=');
        if (equals == std::string::npos)
            continue; // a constant such as `bold`: not ours to serve
        const std::string_view property = std::string_view(elements[i]).substr(0, equals);
        const std::vector<std::string> values =
            Split(std::string_view(elements[i]).substr(equals + 1), ',', true);
        if (property == "lang") {
            for (const std::string& value : values) {
                std::string tag = QZFontLanguageTag(value);
                if (tag.empty())
                    return false;
                AddOnce(found.languages, std::move(tag));
            }
        } else if (property == "family") {
            for (const std::string& value : values)
                if (std::string name = Trimmed(value); !name.empty())
                    AddOnce(found.families, std::move(name));
        }
    }
    if (found.Empty())
        return false;
    wants.Merge(found);
    return true;
}

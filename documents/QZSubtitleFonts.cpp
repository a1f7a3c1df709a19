// The font names of ASS and SSA subtitles: the Fontname (with Bold and Italic) of each Style line,
// the \fn override tags of the events, and the fonts attached in [Fonts], whose file names carry
// the family ("Lato_B0.ttf": Lato, bold, encoding 0).
#include <string>
#include <vector>

#include "documents/QZDocumentReaders.h"

namespace {

std::string_view Trim(std::string_view text) {
    while (!text.empty() && (text.front() == ' ' || text.front() == '\t'))
        text.remove_prefix(1);
    while (!text.empty() && (text.back() == ' ' || text.back() == '\t' || text.back() == '\r'))
        text.remove_suffix(1);
    return text;
}

std::vector<std::string_view> Fields(std::string_view text) {
    std::vector<std::string_view> fields;
    for (size_t start = 0;;) {
        const size_t comma = text.find(',', start);
        fields.push_back(Trim(text.substr(start, comma - start)));
        if (comma == std::string_view::npos)
            return fields;
        start = comma + 1;
    }
}

/// A vertical font ("@Name") is the font "Name" turned.
std::string_view Unturned(std::string_view name) {
    return !name.empty() && name.front() == '@' ? name.substr(1) : name;
}

/// The family an attached font's file name stands for: the extension, the encoding number and
/// the _B/_I/_BI style mark removed.
std::string AttachedFamily(std::string_view file) {
    std::string name(Trim(file));
    if (const size_t dot = name.rfind('.'); dot != std::string::npos)
        name.erase(dot);
    size_t end = name.size();
    while (end > 0 && name[end - 1] >= '0' && name[end - 1] <= '9')
        --end;
    name.erase(end);
    for (const char* mark : {"_BI", "_B", "_I", "_"})
        if (name.ends_with(mark)) {
            name.erase(name.size() - std::string_view(mark).size());
            break;
        }
    return name;
}

} // namespace

bool QZCollectSubtitleFonts(std::string_view text, QZFontCollector& fonts, std::string* format) {
    if (text.starts_with("\xEF\xBB\xBF"))
        text.remove_prefix(3);
    while (!text.empty() && (text.front() == '\n' || text.front() == '\r' || text.front() == ' '))
        text.remove_prefix(1);
    if (glyphwell::LowerASCIICopy(text.substr(0, 13)) != "[script info]")
        return false;
    *format = "ass";
    std::string section;
    size_t fontnameField = 1, boldField = 7, italicField = 8; // the fields of the usual Format line
    for (size_t start = 0; start < text.size();) {
        size_t end = text.find('\n', start);
        if (end == std::string_view::npos)
            end = text.size();
        const std::string_view line = Trim(text.substr(start, end - start));
        start = end + 1;
        if (line.starts_with("[")) {
            section = glyphwell::LowerASCIICopy(line);
            if (section == "[v4 styles]")
                *format = "ssa";
            continue;
        }
        const size_t colon = line.find(':');
        if (colon == std::string_view::npos)
            continue;
        const std::string key = glyphwell::LowerASCIICopy(Trim(line.substr(0, colon)));
        const std::string_view value = Trim(line.substr(colon + 1));
        if (section == "[v4+ styles]" || section == "[v4 styles]") {
            const std::vector<std::string_view> fields = Fields(value);
            if (key == "format") {
                for (size_t i = 0; i < fields.size(); ++i) {
                    const std::string field = glyphwell::LowerASCIICopy(fields[i]);
                    if (field == "fontname")
                        fontnameField = i;
                    else if (field == "bold")
                        boldField = i;
                    else if (field == "italic")
                        italicField = i;
                }
            } else if (key == "style" && fontnameField < fields.size()) {
                const bool bold = boldField < fields.size() && !fields[boldField].empty() &&
                                  fields[boldField] != "0";
                const bool italic = italicField < fields.size() && !fields[italicField].empty() &&
                                    fields[italicField] != "0";
                const char* style =
                    bold ? (italic ? "Bold Italic" : "Bold") : (italic ? "Italic" : "");
                fonts.Add(Unturned(fields[fontnameField]), QZDocumentFontKind::Family, style);
            }
        } else if (section == "[events]" && key == "dialogue") {
            // Override blocks: {\fnName\b1...}; the name ends at the next tag or the block.
            for (size_t tag = value.find("\\fn"); tag != std::string_view::npos;
                 tag = value.find("\\fn", tag + 3)) {
                const size_t stop = value.find_first_of("\\}", tag + 3);
                fonts.Add(Unturned(Trim(value.substr(tag + 3, stop - tag - 3))),
                          QZDocumentFontKind::Family);
            }
        } else if (section == "[fonts]" && key == "fontname") {
            fonts.Add(AttachedFamily(value), QZDocumentFontKind::Family, {}, true);
        }
    }
    return true;
}

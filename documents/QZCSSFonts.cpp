// The font names of CSS and HTML, read by small hand-written scanners: every loop moves forward
// through its input, and block nesting stops at kQZDocumentDepthLimit, so the cost is linear
// whatever the text holds.
//
//   - style sheets: rules, @font-face, and the at-rules that hold rules (@media, @supports...);
//   - declarations: font-family and the font shorthand;
//   - HTML: <style> elements, style attributes and <font face>.
#include <algorithm>
#include <cctype>
#include <string>

#include "documents/QZDocumentReaders.h"

namespace {

/// The position after the comment or string that starts at `i`, or `i` when none starts there.
size_t SkipCommentOrString(std::string_view css, size_t i) {
    if (css.compare(i, 2, "/*") == 0) {
        const size_t end = css.find("*/", i + 2);
        return end == std::string_view::npos ? css.size() : end + 2;
    }
    if (css[i] == '"' || css[i] == '\'') {
        const char quote = css[i];
        for (size_t j = i + 1; j < css.size(); ++j) {
            if (css[j] == '\\')
                ++j;
            else if (css[j] == quote || css[j] == '\n')
                return j + 1;
        }
        return css.size();
    }
    return i;
}

/// The text with comments removed (strings kept as they are).
std::string WithoutComments(std::string_view css) {
    std::string text;
    for (size_t i = 0; i < css.size();) {
        const size_t next = SkipCommentOrString(css, i);
        if (next == i) {
            text += css[i++];
        } else {
            if (css[i] != '/')
                text.append(css.substr(i, next - i));
            else
                text += ' ';
            i = next;
        }
    }
    return text;
}

/// Splits at `separator` outside strings, comments and parentheses.
template <class Visit> void Split(std::string_view text, char separator, Visit visit) {
    size_t start = 0;
    int parentheses = 0;
    for (size_t i = 0; i < text.size();) {
        const size_t next = SkipCommentOrString(text, i);
        if (next != i) {
            i = next;
            continue;
        }
        if (text[i] == '(')
            ++parentheses;
        else if (text[i] == ')' && parentheses > 0)
            --parentheses;
        else if (text[i] == separator && parentheses == 0) {
            visit(text.substr(start, i - start));
            start = i + 1;
        }
        ++i;
    }
    visit(text.substr(start));
}

/// Calls `visit(property, value)` for each "property: value" of a declaration list, the property
/// trimmed and in lower case, the value as written.
template <class Visit> void ForEachDeclaration(std::string_view declarations, Visit visit) {
    Split(declarations, ';', [&](std::string_view declaration) {
        const size_t colon = declaration.find(':');
        if (colon != std::string_view::npos)
            visit(glyphwell::LowerASCIICopy(QZTrimWhitespace(declaration.substr(0, colon))),
                  declaration.substr(colon + 1));
    });
}

/// One family of a font-family list: a quoted string without its quotes and escapes, or
/// identifiers joined by single spaces.
std::string FamilyName(std::string_view item) {
    item = QZTrimWhitespace(item);
    if (const size_t bang = item.find("!important"); bang != std::string_view::npos)
        item = QZTrimWhitespace(item.substr(0, bang));
    std::string name;
    if (!item.empty() && (item.front() == '"' || item.front() == '\'')) {
        for (size_t i = 1; i < item.size() && item[i] != item.front(); ++i) {
            if (item[i] == '\\' && i + 1 < item.size())
                ++i;
            name += item[i];
        }
        return name;
    }
    for (char c : item) {
        if (QZIsWhitespace(c)) {
            if (!name.empty() && name.back() != ' ')
                name += ' ';
        } else if (c != '\\') {
            name += c;
        }
    }
    return std::string(QZTrimWhitespace(name));
}

/// The style that font-weight and font-style values give, e.g. "Bold Italic"; empty for normal.
std::string StyleOf(std::string_view weight, std::string_view slant) {
    static const std::pair<const char*, const char*> kWeights[] = {
        {"100", "Thin"},   {"200", "ExtraLight"}, {"300", "Light"},
        {"500", "Medium"}, {"600", "SemiBold"},   {"700", "Bold"},
        {"bold", "Bold"},  {"800", "ExtraBold"},  {"900", "Black"}};
    std::string style;
    const std::string lowerWeight = glyphwell::LowerASCIICopy(QZTrimWhitespace(weight));
    for (const auto& [value, name] : kWeights)
        if (lowerWeight == value)
            style = name;
    const std::string lowerSlant = glyphwell::LowerASCIICopy(QZTrimWhitespace(slant));
    if (lowerSlant.starts_with("italic") || lowerSlant.starts_with("oblique"))
        style += style.empty() ? "Italic" : " Italic";
    return style;
}

/// The family list of a `font` shorthand value: what follows the size (and line height).
std::string_view ShorthandFamilies(std::string_view value) {
    static const char* const kSizes[] = {"xx-small", "x-small",  "small",  "medium", "large",
                                         "x-large",  "xx-large", "larger", "smaller"};
    for (size_t i = 0; i < value.size();) {
        while (i < value.size() && QZIsWhitespace(value[i]))
            ++i;
        if (i < value.size() && (value[i] == '"' || value[i] == '\''))
            return {}; // a quoted family before any size: not a valid shorthand
        const size_t start = i;
        while (i < value.size() && !QZIsWhitespace(value[i]) && value[i] != ',')
            ++i;
        std::string token = glyphwell::LowerASCIICopy(value.substr(start, i - start));
        if (token.empty())
            return {};
        const bool digits = token.find_first_not_of("0123456789") == std::string::npos;
        bool size =
            (token[0] >= '0' && token[0] <= '9' && !digits) || token[0] == '.' || token == "0";
        for (const char* keyword : kSizes)
            size = size || token.starts_with(keyword);
        if (!size)
            continue;
        // The line height follows the size after a slash, joined or apart.
        while (i < value.size() && QZIsWhitespace(value[i]))
            ++i;
        if (token.find('/') == std::string::npos && i < value.size() && value[i] == '/') {
            ++i;
            while (i < value.size() && QZIsWhitespace(value[i]))
                ++i;
            while (i < value.size() && !QZIsWhitespace(value[i]))
                ++i;
        }
        return value.substr(i);
    }
    return {};
}

/// One @font-face block: a family the document carries when its sources include a url(); the
/// local() names it points at otherwise.
void CollectFontFace(std::string_view declarations, QZFontCollector& fonts) {
    std::string family, source, weight, slant;
    ForEachDeclaration(declarations, [&](const std::string& property, std::string_view value) {
        value = QZTrimWhitespace(value);
        if (property == "font-family")
            family = FamilyName(value);
        else if (property == "src")
            source = std::string(value);
        else if (property == "font-weight")
            weight = std::string(value);
        else if (property == "font-style")
            slant = std::string(value);
    });
    if (glyphwell::LowerASCIICopy(source).find("url(") != std::string::npos) {
        fonts.Add(family, QZDocumentFontKind::Family, StyleOf(weight, slant), true);
        return;
    }
    Split(source, ',', [&](std::string_view item) {
        item = QZTrimWhitespace(item);
        if (glyphwell::LowerASCIICopy(item.substr(0, 6)) == "local(" && item.back() == ')')
            fonts.Add(FamilyName(item.substr(6, item.size() - 7)), QZDocumentFontKind::Full);
    });
}

/// The position after the block whose '{' is at `open` (strings and comments skipped).
size_t BlockEnd(std::string_view css, size_t open) {
    int depth = 0;
    for (size_t i = open; i < css.size();) {
        const size_t next = SkipCommentOrString(css, i);
        if (next != i) {
            i = next;
            continue;
        }
        if (css[i] == '{')
            ++depth;
        else if (css[i] == '}' && --depth == 0)
            return i + 1;
        ++i;
    }
    return css.size();
}

/// The first '{' or ';' at or after `i` outside strings and comments, or the end.
size_t PreludeEnd(std::string_view css, size_t i) {
    while (i < css.size()) {
        const size_t next = SkipCommentOrString(css, i);
        if (next != i)
            i = next;
        else if (css[i] == '{' || css[i] == ';')
            return i;
        else
            ++i;
    }
    return i;
}

void CollectRules(std::string_view css, QZFontCollector& fonts, unsigned depth) {
    for (size_t i = 0; i < css.size();) {
        const size_t end = PreludeEnd(css, i);
        if (end == css.size())
            return;
        const std::string prelude =
            glyphwell::LowerASCIICopy(QZTrimWhitespace(WithoutComments(css.substr(i, end - i))));
        if (css[end] == ';') { // @import, @charset...
            i = end + 1;
            continue;
        }
        const size_t close = BlockEnd(css, end);
        const size_t innerLength =
            close - end - (close <= css.size() && css[close - 1] == '}' ? 2 : 1);
        const std::string_view inner = css.substr(end + 1, innerLength);
        if (prelude.starts_with("@font-face"))
            CollectFontFace(inner, fonts);
        else if (prelude.starts_with("@media") || prelude.starts_with("@supports") ||
                 prelude.starts_with("@document") || prelude.starts_with("@layer") ||
                 prelude.starts_with("@container")) {
            if (depth < kQZDocumentDepthLimit)
                CollectRules(inner, fonts, depth + 1);
        } else if (!prelude.starts_with("@")) {
            QZCollectCSSDeclarations(inner, fonts);
        }
        i = close;
    }
}

/// The attribute value with the common character references replaced.
std::string DecodeReferences(std::string_view value) {
    static const std::pair<std::string_view, char> kReferences[] = {
        {"&quot;", '"'}, {"&apos;", '\''}, {"&#39;", '\''}, {"&#34;", '"'},
        {"&amp;", '&'},  {"&lt;", '<'},    {"&gt;", '>'}};
    std::string text;
    for (size_t i = 0; i < value.size(); ++i) {
        bool replaced = false;
        if (value[i] == '&')
            for (const auto& [reference, c] : kReferences)
                if (value.compare(i, reference.size(), reference) == 0) {
                    text += c;
                    i += reference.size() - 1;
                    replaced = true;
                    break;
                }
        if (!replaced)
            text += value[i];
    }
    return text;
}

size_t FindIgnoringCase(std::string_view text, std::string_view needle, size_t from) {
    for (size_t i = from; i + needle.size() <= text.size(); ++i) {
        size_t j = 0;
        while (j < needle.size() && glyphwell::LowerASCII(text[i + j]) == needle[j])
            ++j;
        if (j == needle.size())
            return i;
    }
    return std::string_view::npos;
}

} // namespace

void QZCollectCSSFamilies(std::string_view value, QZFontCollector& fonts, bool embedded) {
    Split(value, ',', [&](std::string_view item) {
        fonts.Add(FamilyName(item), QZDocumentFontKind::Family, {}, embedded);
    });
}

void QZCollectCSSDeclarations(std::string_view declarations, QZFontCollector& fonts) {
    ForEachDeclaration(declarations, [&](const std::string& property, std::string_view text) {
        const std::string value = WithoutComments(text);
        if (property == "font-family")
            QZCollectCSSFamilies(value, fonts);
        else if (property == "font")
            QZCollectCSSFamilies(ShorthandFamilies(value), fonts);
    });
}

void QZCollectCSSStyleSheet(std::string_view css, QZFontCollector& fonts) {
    CollectRules(css, fonts, 0);
}

void QZCollectHTMLFonts(std::string_view html, QZFontCollector& fonts) {
    size_t i = 0;
    while ((i = html.find('<', i)) != std::string_view::npos) {
        if (html.compare(i, 4, "<!--") == 0) {
            const size_t end = html.find("-->", i + 4);
            i = end == std::string_view::npos ? html.size() : end + 3;
            continue;
        }
        ++i;
        if (i < html.size() && (html[i] == '!' || html[i] == '?' || html[i] == '/')) {
            const size_t end = html.find('>', i);
            i = end == std::string_view::npos ? html.size() : end + 1;
            continue;
        }
        const size_t nameStart = i;
        while (i < html.size() && (std::isalnum(static_cast<unsigned char>(html[i])) ||
                                   html[i] == ':' || html[i] == '-'))
            ++i;
        std::string tag = glyphwell::LowerASCIICopy(html.substr(nameStart, i - nameStart));
        if (const size_t colon = tag.rfind(':'); colon != std::string::npos)
            tag.erase(0, colon + 1);
        if (tag.empty())
            continue;
        // Attributes up to the end of the tag.
        while (i < html.size() && html[i] != '>') {
            if (QZIsWhitespace(html[i]) || html[i] == '/') {
                ++i;
                continue;
            }
            const size_t attributeStart = i;
            while (i < html.size() && !QZIsWhitespace(html[i]) && html[i] != '=' &&
                   html[i] != '>' && html[i] != '/')
                ++i;
            const std::string attribute =
                glyphwell::LowerASCIICopy(html.substr(attributeStart, i - attributeStart));
            if (attributeStart == i) {
                ++i;
                continue;
            }
            while (i < html.size() && QZIsWhitespace(html[i]))
                ++i;
            if (i >= html.size() || html[i] != '=')
                continue;
            ++i;
            while (i < html.size() && QZIsWhitespace(html[i]))
                ++i;
            std::string_view value;
            if (i < html.size() && (html[i] == '"' || html[i] == '\'')) {
                const size_t end = html.find(html[i], i + 1);
                const size_t stop = end == std::string_view::npos ? html.size() : end;
                value = html.substr(i + 1, stop - i - 1);
                i = std::min(html.size(), stop + 1);
            } else {
                const size_t start = i;
                while (i < html.size() && !QZIsWhitespace(html[i]) && html[i] != '>')
                    ++i;
                value = html.substr(start, i - start);
            }
            if (attribute == "style")
                QZCollectCSSDeclarations(DecodeReferences(value), fonts);
            else if ((attribute == "face" && tag == "font") || attribute == "font-family")
                QZCollectCSSFamilies(DecodeReferences(value), fonts);
        }
        if (i < html.size())
            ++i;
        // The raw text of <style> and <script> ends at their end tag only.
        if (tag == "style" || tag == "script") {
            const size_t end = FindIgnoringCase(html, "</" + tag, i);
            const size_t stop = end == std::string_view::npos ? html.size() : end;
            if (tag == "style")
                QZCollectCSSStyleSheet(html.substr(i, stop - i), fonts);
            i = stop;
        }
    }
}

#include <algorithm>
#include <array>
#include <string>
#include <unordered_set>

#include "documents/QZDocumentReaders.h"

namespace {

/// The key under which a font is kept once: case folded, kind and style apart.
std::string Key(std::string_view name, QZDocumentFontKind kind, std::string_view style) {
    std::string key;
    key.reserve(name.size() + style.size() + 3);
    for (char c : name)
        key += glyphwell::LowerASCII(c);
    key += '\x1f';
    key += char('0' + int(kind));
    key += '\x1f';
    for (char c : style)
        key += glyphwell::LowerASCII(c);
    return key;
}

} // namespace

bool QZIsGenericFamily(std::string_view name) {
    static constexpr std::array<std::string_view, 20> kGeneric = {
        "serif",     "sans-serif", "monospace",     "cursive",      "fantasy",
        "system-ui", "ui-serif",   "ui-sans-serif", "ui-monospace", "ui-rounded",
        "math",      "emoji",      "fangsong",      "inherit",      "initial",
        "unset",     "revert",     "revert-layer",  "default",      "none"};
    // Browser vendors' prefixed keywords for the system font ("-vendor-system") name no family.
    if (name.size() > 1 && name.front() == '-' && name[1] != '-')
        return true;
    return std::any_of(kGeneric.begin(), kGeneric.end(), [&](std::string_view generic) {
        return glyphwell::EqualIgnoringASCIICase(name, generic);
    });
}

void QZFontCollector::Add(std::string_view name, QZDocumentFontKind kind, std::string_view style,
                          bool embedded) {
    name = QZTrimWhitespace(name);
    style = QZTrimWhitespace(style);
    // Names arrive quoted from style attributes and ODF's svg:font-family.
    if (name.size() >= 2 && (name.front() == '"' || name.front() == '\'') &&
        name.back() == name.front())
        name = QZTrimWhitespace(name.substr(1, name.size() - 2));
    if (name.empty() || name.size() > 512 ||
        (kind == QZDocumentFontKind::Family && QZIsGenericFamily(name)))
        return;
    const auto [found, added] = index_.emplace(Key(name, kind, style), fonts_.size());
    if (!added) {
        fonts_[found->second].embedded = fonts_[found->second].embedded || embedded;
        return;
    }
    if (fonts_.size() == kQZDocumentFontLimit) {
        index_.erase(found);
        overflowed_ = true;
        return;
    }
    fonts_.push_back({std::string(name), kind, std::string(style), embedded});
}

void QZFontCollector::AddCommaStyled(std::string_view name, bool embedded) {
    const size_t comma = name.find(',');
    if (comma == std::string_view::npos)
        Add(name, QZDocumentFontKind::PostScript, {}, embedded);
    else
        Add(name.substr(0, comma), QZDocumentFontKind::Family, name.substr(comma + 1), embedded);
}

std::vector<QZDocumentFont> QZFontCollector::Take() {
    std::unordered_set<std::string> carried;
    for (const QZDocumentFont& font : fonts_)
        if (font.embedded && font.kind == QZDocumentFontKind::Family && font.style.empty())
            carried.insert(Key(font.name, font.kind, {}));
    for (QZDocumentFont& font : fonts_)
        if (font.kind == QZDocumentFontKind::Family && carried.count(Key(font.name, font.kind, {})))
            font.embedded = true;
    index_.clear();
    return std::move(fonts_);
}

void QZFontCollector::TakeInto(QZDocumentScan& scan) {
    if (overflowed_)
        scan.error = "names more than " + std::to_string(kQZDocumentFontLimit) + " fonts";
    else
        scan.fonts = Take();
}

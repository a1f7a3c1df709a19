#include "desktop/QZDocumentFontMatching.h"

#include <fontconfig/fontconfig.h>

#include <algorithm>
#include <climits>
#include <cstdlib>

#include "platform/ASCIIText.h"

namespace {

/// Lower case without spaces, hyphens or underscores: "DejaVu Sans" and "DejaVuSans" meet.
std::string Folded(std::string_view text) {
    std::string folded;
    for (char c : text)
        if (c != ' ' && c != '-' && c != '_')
            folded += glyphwell::LowerASCII(c);
    return folded;
}

/// The weight and slant a style's words say ("Bold Italic": 700, italic).
void ParseStyle(std::string_view style, int* weight, bool* italic) {
    static const std::pair<const char*, int> kWeights[] = {
        {"extralight", 200}, {"ultralight", 200}, {"semibold", 600}, {"demibold", 600},
        {"extrabold", 800},  {"ultrabold", 800},  {"thin", 100},     {"light", 300},
        {"medium", 500},     {"bold", 700},       {"black", 900},    {"heavy", 900}};
    const std::string folded = Folded(style);
    *weight = 400;
    for (const auto& [word, value] : kWeights)
        if (folded.find(word) != std::string::npos) {
            *weight = value;
            break;
        }
    *italic =
        folded.find("italic") != std::string::npos || folded.find("oblique") != std::string::npos;
}

/// "BoldItalic" as "Bold Italic".
std::string SpacedWords(std::string_view text) {
    std::string spaced;
    for (size_t i = 0; i < text.size(); ++i) {
        if (i > 0 && text[i] >= 'A' && text[i] <= 'Z' && text[i - 1] >= 'a' && text[i - 1] <= 'z')
            spaced += ' ';
        spaced += text[i];
    }
    return spaced;
}

std::vector<const QZMatchableFace*> Select(const std::vector<QZMatchableFace>& faces,
                                           auto predicate) {
    std::vector<const QZMatchableFace*> selected;
    for (const QZMatchableFace& face : faces)
        if (predicate(face))
            selected.push_back(&face);
    return selected;
}

bool HasFamily(const QZMatchableFace& face, const std::string& folded) {
    return std::any_of(face.families.begin(), face.families.end(),
                       [&](const std::string& family) { return Folded(family) == folded; });
}

} // namespace

const char* QZDocumentFontStateName(QZDocumentFontState state) {
    switch (state) {
    case QZDocumentFontState::Embedded:
        return "embedded";
    case QZDocumentFontState::Installed:
        return "installed";
    case QZDocumentFontState::Offered:
        return "offered";
    case QZDocumentFontState::Missing:
        return "missing";
    }
    return "missing";
}

std::vector<const QZMatchableFace*> QZMatchDocumentFont(const QZDocumentFont& font,
                                                        const std::vector<QZMatchableFace>& faces,
                                                        QZFontMatchRule* rule) {
    QZFontMatchRule ignored;
    QZFontMatchRule& matched = rule ? *rule : ignored;
    matched = QZFontMatchRule::PostScriptName;
    auto found = Select(
        faces, [&](const QZMatchableFace& face) { return face.postScriptName == font.name; });
    if (!found.empty())
        return found;

    std::string family = Folded(font.name);
    std::string_view style = font.style;
    if (!style.empty()) {
        matched = QZFontMatchRule::FamilyAndStyle;
        found = Select(faces, [&](const QZMatchableFace& face) {
            return HasFamily(face, family) && glyphwell::EqualIgnoringASCIICase(face.style, style);
        });
        if (!found.empty())
            return found;
    }

    matched = QZFontMatchRule::FullName;
    found = Select(faces, [&](const QZMatchableFace& face) {
        // A full name that is also the face's family ("Lato") says no more than the family.
        return !HasFamily(face, family) &&
               std::any_of(face.fullNames.begin(), face.fullNames.end(),
                           [&](const std::string& full) { return Folded(full) == family; });
    });
    if (!found.empty())
        return found;

    // A PostScript name is family and style joined by a hyphen ("Lato-BoldItalic").
    std::string psStyle;
    if (font.kind == QZDocumentFontKind::PostScript) {
        if (const size_t hyphen = font.name.rfind('-'); hyphen != std::string::npos) {
            family = Folded(std::string_view(font.name).substr(0, hyphen));
            psStyle = SpacedWords(std::string_view(font.name).substr(hyphen + 1));
            style = psStyle;
        }
    }
    matched = QZFontMatchRule::NearestInFamily;
    // A family without a style stands for every face of it: the document may use any.
    if (style.empty()) {
        found = Select(faces, [&](const QZMatchableFace& face) { return HasFamily(face, family); });
        if (found.empty())
            matched = QZFontMatchRule::None;
        return found;
    }
    int weight;
    bool italic;
    ParseStyle(style, &weight, &italic);
    const QZMatchableFace* nearest = nullptr;
    int nearestDistance = INT_MAX;
    for (const QZMatchableFace& face : faces) {
        if (!HasFamily(face, family))
            continue;
        const int distance = std::abs(face.weight - weight) + (face.italic != italic ? 1000 : 0);
        if (distance < nearestDistance) {
            nearest = &face;
            nearestDistance = distance;
        }
    }
    if (nearest)
        return {nearest};
    matched = QZFontMatchRule::None;
    return {};
}

std::vector<QZMatchableFace> QZInstalledMatchableFaces() {
    std::vector<QZMatchableFace> faces;
    FcPattern* pattern = FcPatternCreate();
    FcObjectSet* objects = FcObjectSetBuild(FC_POSTSCRIPT_NAME, FC_FAMILY, FC_STYLE, FC_FULLNAME,
                                            FC_WEIGHT, FC_SLANT, nullptr);
    FcFontSet* fonts = pattern && objects ? FcFontList(nullptr, pattern, objects) : nullptr;
    for (int i = 0; fonts && i < fonts->nfont; ++i) {
        FcPattern* font = fonts->fonts[i];
        QZMatchableFace face;
        FcChar8* text = nullptr;
        if (FcPatternGetString(font, FC_POSTSCRIPT_NAME, 0, &text) == FcResultMatch)
            face.postScriptName = reinterpret_cast<const char*>(text);
        for (int n = 0; FcPatternGetString(font, FC_FAMILY, n, &text) == FcResultMatch; ++n)
            face.families.emplace_back(reinterpret_cast<const char*>(text));
        for (int n = 0; FcPatternGetString(font, FC_FULLNAME, n, &text) == FcResultMatch; ++n)
            face.fullNames.emplace_back(reinterpret_cast<const char*>(text));
        if (FcPatternGetString(font, FC_STYLE, 0, &text) == FcResultMatch)
            face.style = reinterpret_cast<const char*>(text);
        double weight = FC_WEIGHT_REGULAR;
        if (FcPatternGetDouble(font, FC_WEIGHT, 0, &weight) != FcResultMatch) {
            int integer = FC_WEIGHT_REGULAR;
            if (FcPatternGetInteger(font, FC_WEIGHT, 0, &integer) == FcResultMatch)
                weight = integer;
        }
        face.weight = FcWeightToOpenType(int(weight));
        int slant = FC_SLANT_ROMAN;
        FcPatternGetInteger(font, FC_SLANT, 0, &slant);
        face.italic = slant != FC_SLANT_ROMAN;
        faces.push_back(std::move(face));
    }
    if (fonts)
        FcFontSetDestroy(fonts);
    if (objects)
        FcObjectSetDestroy(objects);
    if (pattern)
        FcPatternDestroy(pattern);
    return faces;
}

std::vector<QZMatchableFace> QZCatalogMatchableFaces(const QZDownloadableFontCatalog& catalog) {
    std::vector<QZMatchableFace> faces;
    for (const QZDownloadableFontAsset& asset : catalog.assets) {
        for (const QZDownloadableFont& font : asset.fonts) {
            QZMatchableFace face;
            face.postScriptName = font.postScriptName;
            const std::string_view name = font.postScriptName;
            const size_t hyphen = name.rfind('-');
            face.style =
                hyphen == std::string_view::npos ? "Regular" : SpacedWords(name.substr(hyphen + 1));
            if (!font.family.empty())
                face.families.emplace_back(font.family);
            else
                face.families.emplace_back(name.substr(0, hyphen));
            for (const QZLocalizedName& localized : font.localizedFamilyNames)
                face.families.emplace_back(localized.name);
            const std::string& family = face.families.front();
            face.fullNames.push_back(face.style == "Regular" ? family : family + " " + face.style);
            ParseStyle(face.style, &face.weight, &face.italic);
            faces.push_back(std::move(face));
        }
    }
    return faces;
}

QZDocumentFontMatcher::QZDocumentFontMatcher(std::vector<QZMatchableFace> installed,
                                             std::vector<QZMatchableFace> offered)
    : installed_(std::move(installed)), offered_(std::move(offered)) {}

QZDocumentFontMatcher QZDocumentFontMatcher::ForThisMachine() {
    const std::shared_ptr<const QZDownloadableFontCatalog> catalog =
        QZCurrentDownloadableFontCatalog();
    return QZDocumentFontMatcher(QZInstalledMatchableFaces(),
                                 catalog ? QZCatalogMatchableFaces(*catalog)
                                         : std::vector<QZMatchableFace>());
}

QZDocumentFontMatch QZDocumentFontMatcher::Match(const QZDocumentFont& font) const {
    QZDocumentFontMatch match;
    if (font.embedded) {
        match.state = QZDocumentFontState::Embedded;
        return match;
    }
    if (!QZMatchDocumentFont(font, installed_, &match.rule).empty()) {
        match.state = QZDocumentFontState::Installed;
        return match;
    }
    for (const QZMatchableFace* face : QZMatchDocumentFont(font, offered_, &match.rule)) {
        if (std::find(match.postScriptNames.begin(), match.postScriptNames.end(),
                      face->postScriptName) != match.postScriptNames.end())
            continue;
        match.postScriptNames.push_back(face->postScriptName);
        match.families.push_back(face->families.front());
    }
    match.state =
        match.postScriptNames.empty() ? QZDocumentFontState::Missing : QZDocumentFontState::Offered;
    return match;
}

// Languages and fonts: whether the installed fonts cover a language (asked of fontconfig, so the
// answer is the one applications get), and which catalog fonts to offer for a language or a
// family. No Qt.
//
// Language tags are fontconfig's: lower case, a primary language and optional subtags joined by
// "-" (`ja`, `zh-cn`, `und-zsye`).
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "desktop/QZDownloadableFontCatalog.h"

struct _FcConfig;

/// `text` as a fontconfig language tag: ASCII letters lowered, "_" made "-". Empty when `text`
/// is not a tag (empty, over 32 bytes, characters other than letters, digits, "-" and "_", an
/// empty subtag, or a primary language that is not 2-3 letters).
std::string QZFontLanguageTag(std::string_view text);

/// Whether a font of `tag` serves `wanted` as fontconfig lists fonts: the same tag, or the same
/// primary language where one of the two has no further subtag (`zh` and `zh-cn`).
bool QZFontLanguageServes(std::string_view tag, std::string_view wanted);

/// The installed fonts as fontconfig sees them, loaded when made (the user's configuration and
/// font directories, as applications load them) and released when destroyed. The process's
/// default fontconfig configuration is not touched. A process that has not loaded fontconfig
/// gets it loaded for the view's life only (one view at a time, then). Not thread-safe; make one
/// per task and keep it only as long as the task, since a loaded configuration costs megabytes.
class QZInstalledFontView {
public:
    QZInstalledFontView();
    ~QZInstalledFontView();
    QZInstalledFontView(const QZInstalledFontView&) = delete;
    QZInstalledFontView& operator=(const QZInstalledFontView&) = delete;

    /// False when fontconfig could not load a configuration: nothing then counts as covered.
    bool IsValid() const { return config_ != nullptr; }
    /// Whether an installed font covers the language `tag` (fc-list :lang=TAG finds one).
    bool CoversLanguage(const std::string& tag) const;
    /// Whether an installed font has the family name `family` (in any of its languages).
    bool HasFamily(const std::string& family) const;

private:
    struct Library;
    bool Lists(const char* object, const std::string& value) const;
    std::unique_ptr<Library> library_;
    _FcConfig* config_ = nullptr;
};

/// The fonts to offer for the language `tag`: of the first family, in catalog order, with a font
/// that covers it, the upright regular and bold faces covering it (a family with one font: that
/// font). Empty when no catalog font covers it. The pointers point into `catalog`.
std::vector<const QZDownloadableFont*>
QZCatalogFontsForLanguage(const QZDownloadableFontCatalog& catalog, std::string_view tag);

/// The fonts to offer for the family named `family` (compared as fontconfig does, ignoring ASCII
/// case and blanks): its upright regular and bold faces, or its one font. Empty when the
/// catalog has no such family. The pointers point into `catalog`.
std::vector<const QZDownloadableFont*>
QZCatalogFontsForFamily(const QZDownloadableFontCatalog& catalog, std::string_view family);

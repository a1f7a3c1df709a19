// The worker's side of the font choice: the only code of the bridge that loads fontconfig and
// reads the catalog.
#include <algorithm>
#include <ctime>
#include <set>

#include "bridge/QZApplicationName.h"
#include "bridge/QZDeclinedLanguages.h"
#include "bridge/QZFontChoice.h"
#include "desktop/QZDownloadableFontCatalog.h"
#include "desktop/QZFontLanguages.h"

QZFontChoice QZChooseFonts(const QZFontChoiceRequest& request) {
    QZFontChoice choice;
    choice.desktopFile = QZDesktopEntryPath(request.desktopID);
    const std::string executable = QZExecutableName(request.pid);
    choice.application = !request.desktopID.empty() ? request.desktopID : executable;
    if (!choice.desktopFile.empty())
        choice.displayName = QZDesktopEntryName(choice.desktopFile);
    if (choice.displayName.empty())
        choice.displayName = !executable.empty() ? executable : request.sender;

    const auto catalog = QZCurrentDownloadableFontCatalog();
    const QZDeclinedLanguages declined(QZDeclinedLanguages::DefaultPath());
    std::vector<const QZDownloadableFont*> fonts;
    std::set<std::string> families;
    const auto offer = [&](const std::vector<const QZDownloadableFont*>& chosen) {
        for (const QZDownloadableFont* font : chosen)
            if (std::find(fonts.begin(), fonts.end(), font) == fonts.end()) {
                fonts.push_back(font);
                choice.fonts.emplace_back(font->postScriptName, font->family);
                if (families.emplace(font->family).second && !font->family.empty())
                    choice.fontNames +=
                        (choice.fontNames.empty() ? "" : ", ") + std::string(font->family);
            }
    };
    const QZInstalledFontView installed;
    const time_t now = time(nullptr);
    for (const std::string& language : request.wants.languages) {
        if (installed.CoversLanguage(language) ||
            declined.IsDeclined(choice.application, language, now))
            continue;
        const auto chosen = QZCatalogFontsForLanguage(*catalog, language);
        if (chosen.empty())
            choice.unserved += (choice.unserved.empty() ? "" : ", ") + language;
        else
            choice.askedLanguages.push_back(language);
        offer(chosen);
    }
    for (const std::string& family : request.wants.families) {
        if (installed.HasFamily(family))
            continue;
        const auto chosen = QZCatalogFontsForFamily(*catalog, family);
        if (chosen.empty())
            choice.unserved += (choice.unserved.empty() ? "" : ", ") + family;
        offer(chosen);
    }
    return choice;
}

// Reads arbitrary bytes as a fontconfig pattern sent on the session bus. What is taken must be
// fontconfig language tags and non-empty family names, within the limits.
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "FuzzSupport.h"
#include "bridge/QZFontResources.h"
#include "desktop/QZFontLanguages.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fuzz::Quiet();
    QZFontResourceWants wants;
    const bool served =
        QZAddFontResource(std::string_view(reinterpret_cast<const char*>(data), size), wants);
    fuzz::Check(served != wants.Empty());
    for (const std::string& language : wants.languages)
        fuzz::Check(QZFontLanguageTag(language) == language);
    for (const std::string& family : wants.families)
        fuzz::Check(!family.empty() && family.front() != ' ' && family.back() != ' ');
    fuzz::Check(wants.languages.size() <= QZFontResourceWants::kMaximumWanted &&
                wants.families.size() <= QZFontResourceWants::kMaximumWanted);
    return 0;
}

// Choosing the catalog fonts to offer for a burst of requests. The choice loads fontconfig and
// reads the catalog and desktop entries, so the bridge makes it in a short-lived worker process
// (glyphwell-bus-bridge-worker): the long-lived bridge never maps those libraries or keeps the
// pages they touch. The request travels as the worker's arguments, the answer as NUL-terminated
// "key=value" records on its standard output.
#pragma once

#include <string>
#include <string_view>
#include <sys/types.h>
#include <utility>
#include <vector>

#include "bridge/QZFontResources.h"

/// What a burst asks for, and of whom.
struct QZFontChoiceRequest {
    std::string sender;     ///< the caller's unique bus name, named when nothing better is known
    std::string desktopID;  ///< may be empty
    std::string executable; ///< the caller's executable name, may be empty
    std::string declinedPath;
    QZFontResourceWants wants;
};

/// The fonts chosen, and the names the question and the log use.
struct QZFontChoice {
    std::string application; ///< the key declined languages are remembered under
    std::string displayName;
    std::string desktopFile; ///< may be empty
    std::vector<std::string> askedLanguages;
    std::string fontNames; ///< the families offered, joined by ", "
    std::string unserved;  ///< languages and families no catalog font serves, joined by ", "
    std::vector<std::pair<std::string, std::string>> fonts; ///< PostScript name, family
};

/// `request` as the worker's arguments (after the program name).
std::vector<std::string> QZFontChoiceArguments(const QZFontChoiceRequest& request);
/// The request the arguments give; false for an unknown or repeated key.
bool QZParseFontChoiceArguments(int count, const char* const* arguments,
                                QZFontChoiceRequest* request);

std::string QZEncodeFontChoice(const QZFontChoice& choice);
/// The choice `text` holds; false when it is not a complete answer (the worker crashed or was
/// killed while writing it, or wrote something else).
bool QZDecodeFontChoice(std::string_view text, QZFontChoice* choice);

/// Makes the choice (fontconfig loaded for this call only, the catalog read).
QZFontChoice QZChooseFonts(const QZFontChoiceRequest& request);

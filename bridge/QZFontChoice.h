// Choosing the catalog fonts to offer for a burst of requests. The choice loads fontconfig and
// reads the catalog and desktop entries, so the bridge leaves it to a short-lived worker process
// (glyphwell-bus-bridge-worker), which then asks the agent, waits for the user and remembers a
// skipped language: the long-lived bridge never maps those libraries or runs the client's code,
// nor keeps the pages they touch. The request travels as the worker's arguments, the answer as
// NUL-terminated "key=value" records on its standard output: the choice, then "asking=" once
// the question is up, then the call's status, result and status text.
#pragma once

#include <string>
#include <string_view>
#include <sys/types.h>
#include <utility>
#include <vector>

#include "bridge/QZFontResources.h"

/// What a burst asks for, and of whom.
struct QZFontChoiceRequest {
    std::string sender;    ///< the caller's unique bus name, named when nothing better is known
    std::string desktopID; ///< may be empty
    QZFontResourceWants wants;
    pid_t pid = 0;            ///< the caller's process, for the agent to watch
    bool hasPortName = false; ///< false: the agent's own port
    std::string portName;
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

/// Whether process `pid` runs: it exists and is not a zombie waiting for its parent.
bool QZProcessRuns(pid_t pid);

/// `request` as the worker's arguments (after the program name).
std::vector<std::string> QZFontChoiceArguments(const QZFontChoiceRequest& request);
/// The request the arguments give; false for an unknown or repeated key.
bool QZParseFontChoiceArguments(int count, const char* const* arguments,
                                QZFontChoiceRequest* request);

std::string QZEncodeFontChoice(const QZFontChoice& choice);
/// The choice `text` holds; false when it is not a complete answer (the worker crashed or was
/// killed while writing it, or wrote something else).
bool QZDecodeFontChoice(std::string_view text, QZFontChoice* choice);

/// What the worker reports after the choice.
struct QZFontQuestionTail {
    bool asking = false; ///< the question was put to the agent
    bool ended = false;  ///< the call ended: status, result and text hold its outcome
    int status = 0;
    int result = 0;
    std::string statusText;
};

/// The records that end the worker's output: "asking=", or the call's outcome.
std::string QZEncodeQuestionAsking();
std::string QZEncodeQuestionOutcome(int status, int result, const std::string& statusText);
/// Where the choice in `text` ends (after its "end=" record); npos while it has not arrived.
size_t QZFontChoiceSize(std::string_view text);
/// Reads what follows the choice; false for anything but the records above in their order.
bool QZDecodeQuestionTail(std::string_view text, QZFontQuestionTail* tail);

/// Makes the choice (fontconfig loaded for this call only, the catalog read), leaving out the
/// languages the application's user declined lately.
QZFontChoice QZChooseFonts(const QZFontChoiceRequest& request);

// The download step of a message id 2 request, after the user agreed (or the request said not to
// ask): check the network, then match and download the requested fonts with the progress window.
#pragma once

#include "platform/CFArray.h"
#include "platform/CFDictionary.h"

class QZFontDownloadConfirmation;

/// Downloads the fonts of `descriptors` (an array of one-entry font attribute dictionaries
/// {"NSFontNameAttribute": PostScript name}, in request order) and returns how many fonts were
/// matched. `localizedNames` maps PostScript names to display names (may be null: no alert was
/// shown). Runs on the main thread and returns when the download has ended or was cancelled.
/// Does not retain beyond the call.
///
/// Nothing is shown, and 0 returned, when `descriptors` is empty or null. Otherwise the network
/// check comes first (its offline alert may cancel), then the progress window runs modally.
/// `confirmation` is the request's download confirmation (null when none was made): when the
/// requesting application it watches ends, the offline alert or the progress window of this
/// request ends with it (the transfer is cancelled). The same happens when the client of the
/// request being handled goes away. Either way nothing is matched.
CFIndex QZRunFontDownload(CFArrayRef descriptors, CFDictionaryRef localizedNames,
                          QZFontDownloadConfirmation* confirmation);

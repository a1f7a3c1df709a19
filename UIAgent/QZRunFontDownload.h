// The download step of a message id 2 request, after the user agreed (or the request said not to
// ask): check the network, then match and download the requested fonts with the progress window.
#pragma once

#include "platform/CFArray.h"
#include "platform/CFDictionary.h"

/// Downloads the fonts of `descriptors` (an array of one-entry font attribute dictionaries
/// {"NSFontNameAttribute": PostScript name}, in request order) and returns how many fonts were
/// matched. `localizedNames` maps PostScript names to display names (may be null: no alert was
/// shown). Runs on the main thread and returns when the download has ended or was cancelled.
/// Does not retain beyond the call.
CFIndex QZRunFontDownload(CFArrayRef descriptors, CFDictionaryRef localizedNames);

// Font matching with downloads: the agent's stand-in for the platform's downloadable-font
// matching. Given font descriptors, it finds each font among the installed ones (fontconfig) or
// downloads the catalog asset that holds it (QZDownloadableFontCatalog, QZFontDownloader), and
// tells a progress handler what happens, state by state, on a worker thread.
//
// Descriptors are font attribute dictionaries; the one attribute used is "NSFontNameAttribute",
// the PostScript name. A matched font is described by a new dictionary with its
// "NSFontNameAttribute" and, when fontconfig knows it, its "NSFontFamilyAttribute".
//
// The states of one run, in order:
//   0 DidBegin, once.
//   For each descriptor that has a PostScript name, in array order:
//     2 WillBeginQuerying; then
//     7 DidMatch at once when the font is installed already; or
//     4 WillBeginDownloading, 5 Downloading (repeatedly: when the first bytes arrive, at most
//       every 0.1 s, and when the last ones did), 6 DidFinishDownloading (the file is checked
//       and installed), 7 DidMatch; or
//     8 DidFailWithError in place of what is left of these when the font has no catalog asset,
//       the transfer fails, or the file does not match its catalog entry.
//   1 DidFinish, once, also after a cancellation.
// State 3 (stalled) is never reported. A handler answer of false ends the run at once: no later
// callback, the transfer in flight aborted and its file removed.
//
// Progress dictionary keys (property values, valid during the call; retain what you keep):
// - kCTFontDescriptorMatchingCancelDownloadHandler, every state: a QZCancelDownloadHandlerRef.
// - kCTFontDescriptorMatchingDescriptors, every state: an array of descriptors; in states 0 and
//   1 all the requested ones, in states 2 to 8 the one concerned (in state 7 the matched font's
//   new dictionary).
// - kCTFontDescriptorMatchingTotalDownloadedSize, states 4 to 6: an SInt64 number, the bytes of
//   this run's assets received so far (an asset that ended, whatever its outcome, counts whole).
// - kCTFontDescriptorMatchingTotalAssetSize, states 4 to 6: an SInt64 number, the total bytes of
//   the assets that this run downloads.
// - kCTFontDescriptorMatchingResult, state 1: the array of the matched fonts' new dictionaries,
//   in the order matched.
// - kCTFontDescriptorMatchingError, state 8: an error of the domain kQZFontDownloadErrorDomain;
//   its user info holds a description (kCFErrorLocalizedDescriptionKey) and a failure reason
//   (kCFErrorLocalizedFailureReasonKey), both sentences for the user.
//
// Cancel handler: calling it (QZCancelDownloadHandlerInvoke, from any thread, at any time, also
// after the run ended) aborts the transfer in flight at once and removes its file; the run then
// matches no further font and ends with state 1, whose result holds the fonts matched before.
#pragma once

#include <cstdint>
#include <functional>

#include "desktop/QZCancelDownloadHandler.h"
#include "platform/CFArray.h"
#include "platform/CFDictionary.h"
#include "platform/CFSet.h"
#include "platform/CFString.h"

typedef uint32_t QZFontDescriptorMatchingState;
enum : QZFontDescriptorMatchingState {
    kCTFontDescriptorMatchingDidBegin = 0,
    kCTFontDescriptorMatchingDidFinish = 1,
    kCTFontDescriptorMatchingWillBeginQuerying = 2,
    kCTFontDescriptorMatchingStalled = 3,
    kCTFontDescriptorMatchingWillBeginDownloading = 4,
    kCTFontDescriptorMatchingDownloading = 5,
    kCTFontDescriptorMatchingDidFinishDownloading = 6,
    kCTFontDescriptorMatchingDidMatch = 7,
    kCTFontDescriptorMatchingDidFailWithError = 8
};

/// Progress dictionary keys; each string holds the constant's name without the leading "k".
extern const CFStringRef kCTFontDescriptorMatchingCancelDownloadHandler;
extern const CFStringRef kCTFontDescriptorMatchingDescriptors;
extern const CFStringRef kCTFontDescriptorMatchingTotalDownloadedSize;
extern const CFStringRef kCTFontDescriptorMatchingTotalAssetSize;
extern const CFStringRef kCTFontDescriptorMatchingResult;
extern const CFStringRef kCTFontDescriptorMatchingError;

/// The domain of the errors of state 8, and their codes.
extern const CFStringRef kQZFontDownloadErrorDomain;
enum : CFIndex {
    kQZFontDownloadErrorNotDownloadable = 1, ///< no catalog asset holds the font
    kQZFontDownloadErrorDownloadFailed = 2,  ///< the transfer, its checks or the install failed
    kQZFontDownloadErrorNotInAsset = 3       ///< the asset was installed but lacks the font
};

/// Called with each state and its progress dictionary, on the run's worker thread, one call at a
/// time; true lets the run go on, false ends it. It must not throw. During states 4 to 6 the
/// transfer waits while the handler runs.
using QZFontDescriptorProgressHandler =
    std::function<bool(QZFontDescriptorMatchingState state, CFDictionaryRef progressParameter)>;

/// Starts matching `descriptors` (an array of font attribute dictionaries) on a new worker
/// thread and returns at once; the run reports to `handler` as described above. The descriptors
/// are copied (the array is retained, not the caller's); `mandatoryAttributes` is not used and
/// may be null. Elements that are not dictionaries with a non-empty string "NSFontNameAttribute"
/// are passed over without a callback. False, with no callback ever, when `descriptors` is not
/// an array, `handler` is empty or no thread can be started.
bool QZMatchFontDescriptorsWithProgressHandler(CFArrayRef descriptors, CFSetRef mandatoryAttributes,
                                               QZFontDescriptorProgressHandler handler);

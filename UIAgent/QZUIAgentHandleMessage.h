// QZUIAgentHandleMessage: the callback of the agent's local message port, through which every
// request reaches the agent. It reads the request dictionary, keeps the controller's alert count
// raised while it works, puts the question of the message id to the user, and answers with a
// flattened reply dictionary:
//
//   message id 1 (may an application use a font found on disk?): {QZUIPropertyResult,
//     QZUIPropertySuppress, QZUIPropertyCandidateFontURLs (the request's array passed back)}
//   message id 2 (may fonts be downloaded?): {QZUIPropertyResult, QZUIPropertySuppress}; fonts
//     that no catalog offers and that are not installed are left out before any window or
//     network check, so a request for none of them is answered no at once
//   any other id: the line "unknown msgid: %lu" and an empty reply
//
// Yes/no answers are numbers of type 7 (signed char) holding 1 or 0. A request that arrives
// while an alert is up is handled at once, nested inside the running one, and answered first.
// When the client of a pending request goes away, its question is withdrawn (answered no; the
// port discards the reply).
#pragma once

#include "platform/CFArray.h"
#include "platform/CFDictionary.h"
#include "platform/CFMessagePort.h"

/// Handles one request. `info` is the QZUIController whose count is raised during the call (may
/// be null: nothing is counted); `data` may be null or empty. Returns a new mutable data object,
/// never null, which the caller (the port) releases.
CFDataRef QZUIAgentHandleMessage(CFMessagePortRef local, SInt32 msgid, CFDataRef data, void* info);

/// The descriptors of the fonts a message id 2 `request` asks to download: one
/// {"NSFontNameAttribute": name} per element of its QZUIPropertyFontProperties, in order; only
/// the name is carried over. Elements that are not dictionaries or hold no string name are
/// skipped; a request without the array (or null) gives an empty array. Returns a new reference;
/// the caller releases it.
CFArrayRef QZCreateFontDescriptors(CFDictionaryRef request);

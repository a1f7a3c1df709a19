// Hooks that tests install into the agent: fixed inputs in place of the user's settings, the
// routing table and the environment, and a view of download progress. The product only reads
// them; each hook is process-wide.
#pragma once

#include <QStringList>
#include <chrono>
#include <functional>

#include "desktop/QZFontService.h"
#include "desktop/QZNetworkReachability.h"
#include "platform/CFDictionary.h"

/// Makes QZInputGuard::Duration answer `duration` (a negative value goes back to the
/// environment's).
void QZSetInputGuardDurationForTesting(std::chrono::milliseconds duration);

/// Where QZNetworkCheck::IsConnected reads its flags: by default the routing table
/// (QZGetDefaultRouteReachabilityFlags); null restores it.
using QZNetworkFlagsSource = bool (*)(QZNetworkReachabilityFlags* flags);
void QZSetNetworkFlagsSourceForTesting(QZNetworkFlagsSource source);

/// Called on the worker thread at the start of every progress callback of the download window's
/// matchings started from now on (the states in order); empty to remove.
using QZDownloadProgressTap = std::function<void(QZFontDescriptorMatchingState, CFDictionaryRef)>;
void QZSetDownloadProgressTapForTesting(QZDownloadProgressTap tap);

/// Makes QZPreferredLanguages answer `languages`; an empty list restores the user's.
void QZSetPreferredLanguagesForTesting(const QStringList& languages);

// The cancel-download handler: a property value that can be called. The font matching puts one
// into every progress dictionary (under kCTFontDescriptorMatchingCancelDownloadHandler), so that
// whoever receives the dictionary can keep the value (CFRetain) and later abort the transfer in
// flight from any thread, with QZCancelDownloadHandlerInvoke.
//
// A handler is an ordinary reference-counted value: CFRetain, CFRelease, CFGetTypeID,
// CFEqual (identity) and CFCopyDescription work on it. It cannot be flattened: it never leaves the
// process. Invoking it is thread-safe, may happen any number of times, and stays safe after the
// matching that made it has ended (it then does nothing).
#pragma once

#include <functional>

#include "platform/CFBase.h"

typedef const struct __QZCancelDownloadHandler* QZCancelDownloadHandlerRef;

/// The kind of every cancel-download handler; compare with CFGetTypeID.
CFTypeID QZCancelDownloadHandlerGetTypeID();

/// A new handler that runs `cancel` when invoked; `cancel` must be thread-safe and may run more
/// than once. Returns a new reference; the caller releases it. Null when `cancel` is empty.
QZCancelDownloadHandlerRef QZCancelDownloadHandlerCreate(std::function<void()> cancel);

/// Runs the handler `value` on the calling thread when it is one; null or a value of another
/// kind does nothing. Does not retain beyond the call.
void QZCancelDownloadHandlerInvoke(CFTypeRef value);

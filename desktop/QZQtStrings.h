// Conversions between property-value strings and Qt strings. Both hold UTF-16, so the conversions
// copy code units as they are, lone surrogates included.
#pragma once

#include <QString>

#include "platform/CFString.h"

/// The text of `string`; empty for null. Does not retain.
QString QZQString(CFStringRef string);
/// The text of `value` when it is a string, else an empty QString that isNull(). Does not retain.
QString QZQStringIfString(const void* value);
/// A new string with the text of `text`. Returns a new reference; the caller releases it.
CFStringRef QZCreateCFString(const QString& text);

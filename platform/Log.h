// Logging for every subsystem, and the assertion handler.
//
// Three channels carry the system's lines: the system log (syslog(3), used by the flattened
// value stream), the platform log (CFLog, error level 3; written to stderr) and the application
// log (NSLog-style lines of the agent; stderr). Every line goes to one process-wide sink. The
// default sink writes system-log lines to syslog(3) and the others to stderr; a test or a tool
// installs its own sink to see the exact texts.
//
// The formats take "%@" for a property value, which the compiler's printf checks do not know;
// that is why these functions carry no format attribute.
#pragma once

#include <cstdarg>
#include <functional>
#include <string>
#include <string_view>

#include "platform/CFBase.h"

enum { kCFLogLevelError = 3, kCFLogLevelWarning = 4, kCFLogLevelNotice = 5, kCFLogLevelDebug = 7 };

/// Logs one line on the platform log. `format` is printf-style; "%@" inserts a property value's
/// description (a CFTypeRef argument, "(null)" for null).
void CFLog(int level, const char* format, ...);

namespace glyphwell {

enum class LogChannel {
    System,     ///< syslog(3); `level` is the syslog priority (LOG_ERR = 3)
    Platform,   ///< CFLog; `level` is the CFLog level
    Application ///< the agent's own lines; `level` is 0
};

struct LogRecord {
    LogChannel channel;
    int level;
    std::string_view text; ///< the line without a trailing newline
};

using LogSink = std::function<void(const LogRecord&)>;

/// Installs `sink` for every later line and returns the previous one. An empty function
/// restores the default sink. Thread-safe; the sink may be called from any thread, one line at a
/// time.
///
/// NOTE: the sink runs under the logging lock, so once SetLogSink returns no thread is still in
/// the sink it replaced. A line logged from inside the sink, on its own thread, goes to the
/// default sink; the sink may call SetLogSink; it must not wait for another thread that logs.
LogSink SetLogSink(LogSink sink);

/// One line on the system log at `priority` (LOG_ERR, ...); printf-style with "%@".
void SystemLog(int priority, const char* format, ...);
/// One line on the application log; printf-style with "%@".
void AppLog(const char* format, ...);
/// Sends an already formatted line to the sink.
void LogLine(LogChannel channel, int level, std::string_view text);

/// printf-style formatting with "%@" for property values. Never fails: a broken directive is
/// copied as it stands.
std::string FormatV(const char* format, va_list arguments);
std::string Format(const char* format, ...);
/// The description of a value as UTF-8 ("(null)" for null).
std::string Describe(CFTypeRef value);

/// The assertion handler: logs "*** Assertion failure in <function>, <file>:<line>" and
/// "Invalid parameter not satisfying: <condition>" on the application log, and returns.
void AssertionFailure(const char* condition, const char* function, const char* file, int line);

} // namespace glyphwell

/// Checks an internal invariant; on failure reports it through the assertion handler and goes on.
#define GW_ASSERT(condition)                                                                       \
    ((condition) ? (void)0                                                                         \
                 : ::glyphwell::AssertionFailure(#condition, __func__, __FILE__, __LINE__))

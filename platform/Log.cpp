#include "platform/Log.h"

#include <syslog.h>

#include <climits>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <cwchar>
#include <memory>
#include <mutex>
#include <type_traits>
#include <utility>

#include "platform/CFRuntime.h"

namespace glyphwell {
namespace {

// The process-wide sink. Lines are handed to the sink while `mutex` is held, so lines never
// interleave and a caller of SetLogSink knows, once it returns, that no other thread is still
// inside the sink it replaced (LogCapture relies on this before it goes away). The mutex is
// recursive so that a sink may itself call SetLogSink; the sink being run is kept alive by the
// copy of `sink` that LogLine holds. A line logged from inside a sink, on the sink's own thread,
// goes to the default sink instead: no deadlock and no unbounded recursion through the sink.
struct SinkState {
    std::recursive_mutex mutex;
    std::shared_ptr<const LogSink> sink; ///< null: the default sink
};

/// Never destroyed, so that lines logged by static destructors still find it.
SinkState& State() {
    static SinkState* state = new SinkState;
    return *state;
}

thread_local bool insideSink = false;

void DefaultSink(const LogRecord& record) {
    int length = record.text.size() > size_t(INT_MAX) ? INT_MAX : int(record.text.size());
    if (record.channel == LogChannel::System) {
        syslog(record.level, "%.*s", length, record.text.data());
        return;
    }
    std::fprintf(stderr, "%.*s\n", length, record.text.data());
}

/// A va_list that can be passed by reference on every ABI (on some it is an array type).
struct Arguments {
    va_list list;
};

/// Appends `value` formatted by the single printf directive `directive`. A directive the C
/// library cannot format (a wide string that does not convert) is copied as it stands.
template <class T> void AppendDirective(std::string& out, const std::string& directive, T value) {
    char buffer[128];
    int needed = std::snprintf(buffer, sizeof buffer, directive.c_str(), value);
    if (needed < 0) {
        out += directive;
        return;
    }
    if (size_t(needed) < sizeof buffer) {
        out.append(buffer, size_t(needed));
        return;
    }
    size_t start = out.size();
    out.resize(start + size_t(needed) + 1);
    std::snprintf(out.data() + start, size_t(needed) + 1, directive.c_str(), value);
    out.resize(start + size_t(needed));
}

enum class Length { None, Char, Short, Long, LongLong, IntMax, Size, PtrDiff, LongDouble };

/// Reads a decimal field (a width or precision) into `value`; false when it does not fit an int.
bool ReadDecimal(const char*& p, long long& value) {
    value = 0;
    while (*p >= '0' && *p <= '9') {
        value = value * 10 + (*p++ - '0');
        if (value > INT_MAX)
            return false;
    }
    return true;
}

/// Reads the flags, width and precision of a directive at `p` into `directive` (which holds the
/// '%'), taking '*' fields from `arguments`; false when a field is too wide or positional.
bool ReadField(const char*& p, Arguments& arguments, std::string& directive) {
    while (*p && std::strchr("-+ #0", *p))
        directive += *p++;

    long long number = 0;
    if (*p == '*') {
        ++p;
        number = va_arg(arguments.list, int);
        if (number < 0) { // a negative width is the '-' flag with that width
            directive += '-';
            number = -number;
        }
        if (number > INT_MAX)
            return false;
        directive += std::to_string(number);
    } else {
        const char* digits = p;
        if (!ReadDecimal(p, number))
            return false;
        directive.append(digits, p);
    }
    if (*p == '$') // positional arguments are not supported
        return false;

    if (*p == '.') {
        ++p;
        if (*p == '*') {
            ++p;
            number = va_arg(arguments.list, int);
            if (number >= 0) // a negative precision counts as none
                directive += "." + std::to_string(number);
        } else {
            const char* digits = p;
            if (!ReadDecimal(p, number))
                return false;
            directive += '.';
            directive.append(digits, p);
        }
    }
    return true;
}

/// Reads a length modifier at `p`, appending it to `directive`.
Length ReadLength(const char*& p, std::string& directive) {
    const char* start = p;
    Length length = Length::None;
    switch (*p) {
    case 'h':
        length = p[1] == 'h' ? Length::Char : Length::Short;
        p += length == Length::Char ? 2 : 1;
        break;
    case 'l':
        length = p[1] == 'l' ? Length::LongLong : Length::Long;
        p += length == Length::LongLong ? 2 : 1;
        break;
    case 'j':
    case 'z':
    case 't':
    case 'L':
        length = *p == 'j'   ? Length::IntMax
                 : *p == 'z' ? Length::Size
                 : *p == 't' ? Length::PtrDiff
                             : Length::LongDouble;
        ++p;
        break;
    default:
        break;
    }
    directive.append(start, p);
    return length;
}

/// Formats an integer conversion: `Signed` chooses the signed or unsigned type of each length.
template <bool Signed>
bool AppendInteger(std::string& out, const std::string& directive, Length length,
                   Arguments& arguments) {
    using Int = std::conditional_t<Signed, int, unsigned int>;
    using Long = std::conditional_t<Signed, long, unsigned long>;
    using LongLong = std::conditional_t<Signed, long long, unsigned long long>;
    using IntMax = std::conditional_t<Signed, intmax_t, uintmax_t>;
    using Size = std::conditional_t<Signed, std::make_signed_t<size_t>, size_t>;
    using PtrDiff = std::conditional_t<Signed, ptrdiff_t, std::make_unsigned_t<ptrdiff_t>>;
    switch (length) {
    case Length::None:
    case Length::Char:
    case Length::Short:
        AppendDirective(out, directive, va_arg(arguments.list, Int));
        return true;
    case Length::Long:
        AppendDirective(out, directive, va_arg(arguments.list, Long));
        return true;
    case Length::LongLong:
        AppendDirective(out, directive, va_arg(arguments.list, LongLong));
        return true;
    case Length::IntMax:
        AppendDirective(out, directive, va_arg(arguments.list, IntMax));
        return true;
    case Length::Size:
        AppendDirective(out, directive, va_arg(arguments.list, Size));
        return true;
    case Length::PtrDiff:
        AppendDirective(out, directive, va_arg(arguments.list, PtrDiff));
        return true;
    case Length::LongDouble:
        return false;
    }
    return false;
}

/// Formats a 'c' or 's' conversion (wide with the 'l' length); a null string reads "(null)".
bool AppendText(std::string& out, const std::string& directive, char conversion, Length length,
                Arguments& arguments) {
    if (length != Length::None && length != Length::Long)
        return false;
    const bool wide = length == Length::Long;
    if (conversion == 'c') {
        if (wide)
            AppendDirective(out, directive, va_arg(arguments.list, wint_t));
        else
            AppendDirective(out, directive, va_arg(arguments.list, int));
    } else if (wide) {
        const wchar_t* text = va_arg(arguments.list, const wchar_t*);
        AppendDirective(out, directive, text ? text : L"(null)");
    } else {
        const char* text = va_arg(arguments.list, const char*);
        AppendDirective(out, directive, text ? text : "(null)");
    }
    return true;
}

/// Formats "%@": the description of a property value, with the field of `fieldPart` applied as
/// to a "%s" (a length modifier means nothing here and is dropped).
void AppendDescription(std::string& out, const std::string& fieldPart, Arguments& arguments) {
    std::string text = Describe(va_arg(arguments.list, CFTypeRef));
    if (fieldPart.size() == 1)
        out += text;
    else
        AppendDirective(out, fieldPart + "s", text.c_str());
}

/// Formats one directive that starts at `p` (just after the '%'), taking its arguments from
/// `arguments`. Returns false when the directive is broken (unknown conversion, positional
/// argument, a length that does not go with the conversion, too wide a field); the caller then
/// copies its text unchanged. `p` is left after the directive's last character.
bool FormatDirective(std::string& out, const char*& p, Arguments& arguments) {
    std::string directive = "%";
    if (!ReadField(p, arguments, directive))
        return false;
    const std::string fieldPart = directive; // '%', flags, width and precision
    const Length length = ReadLength(p, directive);
    const char conversion = *p;
    if (!conversion)
        return false;
    ++p;
    directive += conversion;

    switch (conversion) {
    case 'd':
    case 'i':
        return AppendInteger<true>(out, directive, length, arguments);
    case 'u':
    case 'o':
    case 'x':
    case 'X':
        return AppendInteger<false>(out, directive, length, arguments);
    case 'f':
    case 'F':
    case 'e':
    case 'E':
    case 'g':
    case 'G':
    case 'a':
    case 'A':
        if (length == Length::LongDouble)
            AppendDirective(out, directive, va_arg(arguments.list, long double));
        else if (length == Length::None || length == Length::Long)
            AppendDirective(out, directive, va_arg(arguments.list, double));
        else
            return false;
        return true;
    case 'c':
    case 's':
        return AppendText(out, directive, conversion, length, arguments);
    case 'p':
        if (length != Length::None)
            return false;
        AppendDirective(out, directive, va_arg(arguments.list, void*));
        return true;
    case 'n':
        // Writing through an argument is never wanted in a log line: the pointer is taken from
        // the arguments and nothing is written or printed.
        (void)va_arg(arguments.list, void*);
        return true;
    case '%':
        out += '%';
        return true;
    case '@':
        AppendDescription(out, fieldPart, arguments);
        return true;
    default:
        return false;
    }
}

} // namespace

std::string FormatV(const char* format, va_list list) {
    std::string out;
    if (!format)
        return out;
    Arguments arguments;
    va_copy(arguments.list, list);
    const char* p = format;
    while (*p) {
        const char* percent = std::strchr(p, '%');
        if (!percent) {
            out.append(p);
            break;
        }
        out.append(p, percent);
        p = percent + 1;
        if (!FormatDirective(out, p, arguments))
            out.append(percent, p);
    }
    va_end(arguments.list);
    return out;
}

LogSink SetLogSink(LogSink sink) {
    SinkState& state = State();
    std::shared_ptr<const LogSink> next;
    if (sink)
        next = std::make_shared<const LogSink>(std::move(sink));
    std::lock_guard<std::recursive_mutex> lock(state.mutex);
    std::shared_ptr<const LogSink> previous = std::exchange(state.sink, std::move(next));
    return previous ? *previous : LogSink();
}

void LogLine(LogChannel channel, int level, std::string_view text) {
    LogRecord record{channel, level, text};
    if (insideSink) {
        DefaultSink(record);
        return;
    }
    SinkState& state = State();
    std::lock_guard<std::recursive_mutex> lock(state.mutex);
    std::shared_ptr<const LogSink> sink = state.sink;
    if (!sink) {
        DefaultSink(record);
        return;
    }
    insideSink = true;
    try {
        (*sink)(record);
    } catch (...) {
        // A sink that throws loses its line; logging never throws into its caller.
    }
    insideSink = false;
}

std::string Format(const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    std::string text = FormatV(format, arguments);
    va_end(arguments);
    return text;
}

void SystemLog(int priority, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    std::string text = FormatV(format, arguments);
    va_end(arguments);
    LogLine(LogChannel::System, priority, text);
}

void AppLog(const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    std::string text = FormatV(format, arguments);
    va_end(arguments);
    LogLine(LogChannel::Application, 0, text);
}

std::string Describe(CFTypeRef value) {
    if (!value)
        return "(null)";
    return runtime::AsObject(value)->Description();
}

void AssertionFailure(const char* condition, const char* function, const char* file, int line) {
    LogLine(LogChannel::Application, 0,
            Format("*** Assertion failure in %s, %s:%d", function, file, line));
    LogLine(LogChannel::Application, 0, Format("Invalid parameter not satisfying: %s", condition));
}

} // namespace glyphwell

void CFLog(int level, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    std::string text = glyphwell::FormatV(format, arguments);
    va_end(arguments);
    glyphwell::LogLine(glyphwell::LogChannel::Platform, level, text);
}

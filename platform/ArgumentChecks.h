// Argument checks of the public platform functions (internal to platform/). A failed check is
// reported through the assertion handler, naming the public function that was called (helpers
// pass on the location of their caller), and the function then returns its documented result
// for bad input. The rule for every public function: an invalid argument (a null or foreign
// reference, a negative length, a range outside the value) gives null from a function that
// creates or copies, false/0 from one that reads, and changes nothing in one that modifies.
#pragma once

#include "platform/CFRuntime.h"

namespace glyphwell::runtime {

/// Where a public function was called from: the part of std::source_location the checks use,
/// built on the compiler builtins, which every compiler we build with has (std::source_location
/// does not compile with clang 14 over libstdc++ 12). The function is named without signature.
class SourceLocation {
public:
    static constexpr SourceLocation current(const char* function = __builtin_FUNCTION(),
                                            const char* file = __builtin_FILE(),
                                            unsigned line = __builtin_LINE()) noexcept {
        return SourceLocation(function, file, line);
    }
    constexpr const char* function_name() const noexcept { return function_; }
    constexpr const char* file_name() const noexcept { return file_; }
    constexpr unsigned line() const noexcept { return line_; }

private:
    constexpr SourceLocation(const char* function, const char* file, unsigned line) noexcept
        : function_(function), file_(file), line_(line) {}
    const char* function_;
    const char* file_;
    unsigned line_;
};

/// Reports a failed argument check through the assertion handler, naming the public function
/// in which it happened.
void ReportInvalidArgument(const char* condition, const SourceLocation& where);

/// The object behind `value` as kind T, or null (reported as `condition`) when `value` is null
/// or of another kind.
template <class T>
T* CheckedObject(const void* value, CFTypeID kind, const char* condition,
                 const SourceLocation& where) {
    T* object = AsMutable<T>(value, kind);
    if (!object)
        ReportInvalidArgument(condition, where);
    return object;
}

/// Whether `range` lies inside a sequence of `count` elements; reported as `condition` when it
/// does not.
bool CheckRange(CFRange range, CFIndex count, const SourceLocation& where,
                const char* condition = "range lies inside the collection");

/// Returns `valid`; reports `condition` as failed, naming the function at `where`, when it is
/// false.
inline bool CheckArgument(bool valid, const char* condition,
                          const SourceLocation& where = SourceLocation::current()) {
    if (!valid)
        ReportInvalidArgument(condition, where);
    return valid;
}

} // namespace glyphwell::runtime

/// Checks an argument of a public function, reporting the condition's text and the function when
/// it fails; evaluates to the condition.
#define GW_CHECK_ARGUMENT(condition) ::glyphwell::runtime::CheckArgument((condition), #condition)

#include "platform/ArgumentChecks.h"

#include "platform/Log.h"

namespace glyphwell::runtime {

void ReportInvalidArgument(const char* condition, const SourceLocation& where) {
    AssertionFailure(condition, where.function_name(), where.file_name(), int(where.line()));
}

bool CheckRange(CFRange range, CFIndex count, const SourceLocation& where, const char* condition) {
    bool inside = range.location >= 0 && range.length >= 0 && range.location <= count &&
                  range.length <= count - range.location;
    if (!inside)
        ReportInvalidArgument(condition, where);
    return inside;
}

} // namespace glyphwell::runtime

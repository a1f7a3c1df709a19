// Runs the command-line tool in-process with the given standard input.
#pragma once

#include <sstream>
#include <string>
#include <vector>

#include "tools/Commands.h"

namespace glyphwell::testing {

struct ToolResult {
    int status;
    std::string out;
    std::string err;
    bool operator==(const ToolResult&) const = default;
    friend std::ostream& operator<<(std::ostream& stream, const ToolResult& result) {
        return stream << result.status << " [" << result.out << "] [" << result.err << "]";
    }
};

inline ToolResult Invoke(const std::vector<std::string>& arguments, const std::string& input = "") {
    std::istringstream in(input);
    std::ostringstream out, err;
    const int status = glyphwell::tools::RunTool(arguments, in, out, err);
    return {status, out.str(), err.str()};
}

} // namespace glyphwell::testing

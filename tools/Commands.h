// The subcommands of the glyphwell tool, callable in-process (the tests drive them with string
// streams).
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

namespace glyphwell::tools {

/// `encode [FILE|-] [-o OUT] [--hex]`: tagged JSON to the flattened value stream. Exit status 0,
/// or 1 with a message on `err` and nothing on `out` (and no OUT file) for bad input.
int RunEncode(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
              std::ostream& err);

/// `decode [FILE|-] [--expect KIND] [--compact]`: the flattened value stream to tagged JSON.
/// Every log line of the reader goes to `err` as its bare text. Exit status 0 when a value came
/// back and the stream was not corrupt, 1 otherwise (a null result prints `null`).
int RunDecode(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
              std::ostream& err);

/// The whole tool: `arguments` without the program name.
int RunTool(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
            std::ostream& err);

} // namespace glyphwell::tools

// `glyphwell fonts`: the fonts that documents name, and whether this machine has them.
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

namespace glyphwell::tools {

/// `fonts [--json] [--ask] [--notify] [--app NAME] [--name PORT] FILE...`: for each file, every
/// font it names with its state: embedded, installed, offered (with the catalog's PostScript names)
/// or missing. Text: one line per font and a summary; `--json`: one document for all files.
/// `--ask` asks the agent (message id 2, as application NAME, default "Glyphwell") to download
/// every offered font of every file, then reports the states afterwards; `--notify` also shows
/// the text report as a desktop notification (for runs from a file manager). Exit status 0 when
/// every font is embedded or installed, 1 when some are offered or missing (or the question
/// failed), 2 when a file could not be read (named on `err` with the reason; the other files
/// are still reported) or for a usage error.
int RunFonts(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
             std::ostream& err);

/// The usage lines of the verb, for the tool's help text.
extern const char kFontsUsage[];

} // namespace glyphwell::tools

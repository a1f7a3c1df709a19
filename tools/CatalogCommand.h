// `glyphwell catalog`: writes, checks and lists the downloadable-font catalog that the agent
// reads (format: resources/catalog/README.md).
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

namespace glyphwell::tools {

/// `catalog add FONTFILE... --url-prefix URL [--catalog FILE]`: reads every face of each font
/// file and writes or updates its asset (the same LocalID or URL) in FILE, keeping every other
/// asset and member; the file is replaced atomically. `catalog check [FILE] [--fetch]`: reads
/// the catalog with the agent's reader, one line per problem and a summary; `--fetch` downloads
/// every asset and compares its size and SHA-256. `catalog list [FILE]`: one line per font
/// offered, tab-separated: installed or offered, PostScript name, family, LocalID, size.
/// FILE defaults to the catalog the agent would read. Exit status 0 when done (check: when
/// clean), 1 for failures and problems found, 2 for a usage error. With `progress`, check
/// --fetch shows a line per asset with bytes and rate on `out` (for a terminal).
int RunCatalog(const std::vector<std::string>& arguments, std::ostream& out, std::ostream& err,
               bool progress);

/// The usage lines of the verb, for the tool's help text.
extern const char kCatalogUsage[];

} // namespace glyphwell::tools

// The glyphwell verbs that talk to the agent over its message port: `send` for any request
// written as tagged JSON, and `ask-activation` / `ask-download`, which build the message id 1 and
// 2 requests from flags with the client library (client/glyphwell/client.h). Each prints the
// reply as tagged JSON.
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

namespace glyphwell::tools {

/// `send --msgid N [FILE|-] [--empty] [PORT OPTIONS]`: flattens the tagged JSON value of FILE
/// (or stdin) as the request, sends it with message id N and prints the reply as tagged JSON.
/// `--empty` sends a request without bytes. An empty reply prints nothing and says so on `err`.
///
/// Port options, shared by every verb here:
///   --name NAME          the port (default: the agent's)
///   --timeout SECONDS    how long to wait for the reply (default: no limit; users take time);
///                        for the ask verbs, the whole exchange
///   --send-timeout S     `send` only: how long writing the request may take (default 10)
///   --compact            one-line JSON
///   --dry-run            print the request as tagged JSON instead of sending it
///
/// Exit status 0 when a reply came (and, when not empty, could be read), 1 for any failure
/// (nothing listens, a port error, an unreadable reply), 2 for a usage error.
int RunSend(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
            std::ostream& err);

/// `ask-activation --candidate FILE... [--font NAME] [--family NAME] [--app NAME]
/// [--bundle PATH] [PORT OPTIONS]`: message id 1, may the application use a font found in the
/// candidate files.
int RunAskActivation(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
                     std::ostream& err);

/// `ask-download --font PSNAME[:FAMILY]... [--app NAME] [--bundle PATH] [--pid N] [--suppress]
/// [PORT OPTIONS]`: message id 2, may the system download these fonts. The process id defaults
/// to this tool's own, so that the question goes away when the tool is stopped.
int RunAskDownload(const std::vector<std::string>& arguments, std::istream& in, std::ostream& out,
                   std::ostream& err);

/// The usage lines of the verbs above, for the tool's help text.
extern const char kSendUsage[];

} // namespace glyphwell::tools

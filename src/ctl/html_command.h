// quorletctl logs html
#ifndef QUORLET_CTL_HTML_COMMAND_H_
#define QUORLET_CTL_HTML_COMMAND_H_

#include <string>

namespace CLI {
class App;
}

namespace quorlet {

struct Session;

// Where the log of that name, or the last aggregated one ("latest"), lies. Throws Failure when
// there is none.
std::string PathOfLog(const std::string& name);

// Adds "html" to the family `logs`. Parsing sets `session.command`; the session outlives the
// application.
void AddHtmlCommand(CLI::App& logs, Session& session);

}  // namespace quorlet

#endif  // QUORLET_CTL_HTML_COMMAND_H_

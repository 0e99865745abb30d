// quorletctl logs export
#ifndef QUORLET_CTL_EXPORT_COMMAND_H_
#define QUORLET_CTL_EXPORT_COMMAND_H_

namespace CLI {
class App;
}

namespace quorlet {

struct Session;

// Adds "export" to the family `logs`. Parsing sets `session.command`; the session outlives the
// application.
void AddExportCommand(CLI::App& logs, Session& session);

}  // namespace quorlet

#endif  // QUORLET_CTL_EXPORT_COMMAND_H_

// quorletctl tally listen: the recording socket.
#ifndef QUORLET_CTL_TALLY_LISTEN_H_
#define QUORLET_CTL_TALLY_LISTEN_H_

namespace CLI {
class App;
}

namespace quorlet {

struct Session;

// Adds the command to the family `tally`.
void AddListenCommand(CLI::App& tally, Session& session);

}  // namespace quorlet

#endif  // QUORLET_CTL_TALLY_LISTEN_H_

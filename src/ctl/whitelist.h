// What the device's whitelist holds, in short.
#ifndef QUORLET_CTL_WHITELIST_H_
#define QUORLET_CTL_WHITELIST_H_

#include <cstddef>
#include <string>
#include <string_view>

#include "ctl/session.h"
#include "report/key_options.h"

namespace quorlet {

struct WhitelistSummary {
  std::size_t entries = 0;  // keys and prefixes, of groups that are switched off too
  std::size_t faults = 0;   // what `whitelist check` says will not work
};

// Throws Failure when the file cannot be read or parsed.
WhitelistSummary SummariseWhitelist(const std::string& path);

// Tells whoever works at a terminal that what was counted will not be reported, when no entry of
// the device's whitelist names the key.
void NoteUnlisted(Session& session, std::string_view key, KeyKind kind);

}  // namespace quorlet

#endif  // QUORLET_CTL_WHITELIST_H_

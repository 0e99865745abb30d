// Which keys the recording socket takes.
#ifndef QUORLET_CTL_RECORD_WHITELIST_H_
#define QUORLET_CTL_RECORD_WHITELIST_H_

#include <cstddef>
#include <string_view>
#include <vector>

#include "platform/linux/base/files.h"
#include "report/config.h"

namespace quorlet {

class RecordWhitelist {
 public:
  enum class Match { kNone, kNamed, kNamedExactly };

  // The whitelist of the root, without the groups that do not count on this device. Where there is
  // no such file every key is named; one that cannot be used, after an error line, names none.
  static RecordWhitelist Load(const Root& root, Platform& platform);
  // One that names every key, and none exactly, or none at all.
  static RecordWhitelist Naming(bool every);

  // How an entry, of either kind, names the key. With `every`, keys without an entry are named too.
  Match match(std::string_view key) const;
  // From now on keys without an entry are named.
  void nameEvery() { every_ = true; }

 private:
  KeyTables tables_;
  std::vector<std::size_t> prefixLengths_;
  bool every_ = false;
};

}  // namespace quorlet

#endif  // QUORLET_CTL_RECORD_WHITELIST_H_

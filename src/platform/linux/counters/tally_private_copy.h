// A copy of a database and its journal or write-ahead log in a directory outside of the store, for
// a reader that must not, or cannot, change anything there.
#ifndef QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_PRIVATE_COPY_H_
#define QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_PRIVATE_COPY_H_

#include <string>

namespace quorlet {

class TallyPrivateCopy {
 public:
  // Copies `databasePath`, "-journal" and "-wal" to a new directory in $TMPDIR or /tmp.
  explicit TallyPrivateCopy(const std::string& databasePath);
  TallyPrivateCopy(const TallyPrivateCopy&) = delete;
  TallyPrivateCopy& operator=(const TallyPrivateCopy&) = delete;
  // Removes the directory; what is open stays readable.
  ~TallyPrivateCopy();

  // The copied database's path, empty when it could not be made, or when other processes kept
  // changing the original meanwhile; error() then says why.
  const std::string& path() const { return path_; }
  const std::string& error() const { return error_; }

 private:
  std::string directory_;
  std::string path_;
  std::string error_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_COUNTERS_TALLY_PRIVATE_COPY_H_

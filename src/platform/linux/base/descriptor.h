// A file descriptor that closes itself, and system calls that signals do not interrupt.
#ifndef QUORLET_PLATFORM_LINUX_BASE_DESCRIPTOR_H_
#define QUORLET_PLATFORM_LINUX_BASE_DESCRIPTOR_H_

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <string>
#include <string_view>
#include <utility>

namespace quorlet {

class Descriptor {
 public:
  Descriptor() = default;
  // Owns `descriptor`; a negative one stands for none.
  explicit Descriptor(int descriptor) : descriptor_(descriptor) {}
  Descriptor(Descriptor&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}
  Descriptor& operator=(Descriptor&& other) noexcept {
    std::swap(descriptor_, other.descriptor_);
    return *this;
  }
  ~Descriptor() {
    if (descriptor_ >= 0) close(descriptor_);
  }

  bool isOpen() const { return descriptor_ >= 0; }
  int get() const { return descriptor_; }
  int release() { return std::exchange(descriptor_, -1); }

 private:
  int descriptor_ = -1;
};

// Calls `call` until no signal interrupts it.
template <typename Call>
auto Uninterrupted(const Call& call) {
  decltype(call()) result;
  do {
    result = call();
  } while (result < 0 && errno == EINTR);
  return result;
}

// A closed standard stream must not become the descriptor of a file that is written. Opened the
// wrong way round, its use still fails. To be called before anything else is opened.
void OccupyStandardStreams();

// Who else may use a file that is created: nobody but its owner and readers of its group (0640), or
// whoever may write in its directory, where that hands its group on (0660 there).
enum class Sharing : std::uint8_t { kOwner, kGroupOfDirectory };

// Opens a regular file, and with O_CREAT creates it, whatever the umask; what root creates belongs
// to the owner and group of its directory. 0 or the errno. Anything else at `path` is refused:
// EISDIR for a directory, otherwise EINVAL; so are, to be written, a link (ELOOP) and a file that
// has a second name (EMLINK). Never waits on a FIFO or device.
[[nodiscard]] int OpenRegularFile(const std::string& path, int flags, Descriptor& opened,
                                  struct stat& status, Sharing sharing = Sharing::kOwner);

// Writes all bytes; 0 or the errno of what stopped it half-way.
[[nodiscard]] int WriteFully(int descriptor, std::string_view bytes);

// Makes the names in a directory durable; 0 or the errno.
[[nodiscard]] int SyncDirectory(const std::string& directory);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_BASE_DESCRIPTOR_H_

// Assembles the frames of one connection from the bytes that arrive.
//
// A frame is a u32 length (little-endian, at most 16 MiB) and that many bytes.
// Nobody vouches for what a peer sends: memory grows with what has arrived,
// never with what a length announces.
#ifndef QUORLET_PLATFORM_LINUX_SERVICE_FRAME_BUFFER_H_
#define QUORLET_PLATFORM_LINUX_SERVICE_FRAME_BUFFER_H_

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace quorlet {

inline constexpr std::size_t kFrameHeaderBytes = 4;
inline constexpr std::size_t kMaxFrameBytes = std::size_t{16} * 1024 * 1024;

// `payload` (at most kMaxFrameBytes) as a frame.
std::string MakeFrame(std::string_view payload);

class FrameBuffer {
 public:
  // Adds bytes that have arrived. Returns how many frames they completed.
  std::size_t append(std::string_view bytes);

  // Takes the next complete frame's payload, or nothing when there is none.
  std::optional<std::string> take();

  // A frame announced more than kMaxFrameBytes; what follows it cannot be told
  // apart any more. Frames before it can still be taken.
  bool isBroken() const { return broken_; }

  // How much is held of what has arrived.
  std::size_t size() const { return bytes_.size(); }

 private:
  void compact();

  std::string bytes_;
  std::size_t taken_ = 0;    // end of the frames that were taken
  std::size_t scanned_ = 0;  // end of the complete frames
  bool broken_ = false;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_SERVICE_FRAME_BUFFER_H_

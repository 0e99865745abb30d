// Frames that arrive in pieces come out as those that arrive at once.
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "platform/linux/service/frame_buffer.h"

namespace {

std::vector<std::string> Frames(std::string_view bytes, std::size_t step) {
  quorlet::FrameBuffer buffer;
  std::vector<std::string> frames;
  std::size_t completed = 0;
  for (std::size_t at = 0; at < bytes.size(); at += step) {
    completed += buffer.append(bytes.substr(at, step));
    // Taken now and then only, so that frames pile up.
    if (at % 3 == 0) {
      while (auto frame = buffer.take()) frames.push_back(*std::move(frame));
    }
  }
  while (auto frame = buffer.take()) frames.push_back(*std::move(frame));
  if (completed != frames.size()) __builtin_trap();
  return frames;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size < 2) return 0;
  const std::string_view bytes(reinterpret_cast<const char*>(data) + 1, size - 1);
  if (Frames(bytes, 1 + data[0] % 16) != Frames(bytes, bytes.size())) __builtin_trap();
  return 0;
}

#include "platform/linux/service/frame_buffer.h"

#include <cstdint>
#include <span>

#include "values/byte_reader.h"
#include "values/byte_writer.h"

namespace quorlet {
namespace {

// The length that the frame at `offset` announces; the header must have
// arrived.
std::size_t AnnouncedLength(const std::string& bytes, std::size_t offset) {
  ByteReader reader(std::as_bytes(std::span(bytes)).subspan(offset, kFrameHeaderBytes));
  return reader.little<std::uint32_t>();
}

}  // namespace

std::string MakeFrame(std::string_view payload) {
  std::string frame;
  frame.reserve(kFrameHeaderBytes + payload.size());
  frame.resize(kFrameHeaderBytes);
  WriteLittle(payload.size(), std::as_writable_bytes(std::span(frame)));
  return frame.append(payload);
}

std::size_t FrameBuffer::append(std::string_view bytes) {
  if (broken_) return 0;
  // By a quarter rather than by half: large frames must not cost twice their size.
  if (const std::size_t size = bytes_.size() + bytes.size(); size > bytes_.capacity()) {
    bytes_.reserve(size + size / 4);
  }
  bytes_.append(bytes);
  std::size_t completed = 0;
  while (bytes_.size() - scanned_ >= kFrameHeaderBytes) {
    const std::size_t length = AnnouncedLength(bytes_, scanned_);
    if (length > kMaxFrameBytes) {
      broken_ = true;
      bytes_.resize(scanned_);
      break;
    }
    if (bytes_.size() - scanned_ - kFrameHeaderBytes < length) break;
    scanned_ += kFrameHeaderBytes + length;
    ++completed;
  }
  return completed;
}

std::optional<std::string> FrameBuffer::take() {
  if (taken_ == scanned_) return std::nullopt;
  const std::size_t length = AnnouncedLength(bytes_, taken_);
  std::string payload = bytes_.substr(taken_ + kFrameHeaderBytes, length);
  taken_ += kFrameHeaderBytes + length;
  compact();
  return payload;
}

// Drops what was taken once that is at least half of what is held, so that each
// byte is moved a bounded number of times. A large frame's memory is given
// back.
void FrameBuffer::compact() {
  if (taken_ < bytes_.size() - taken_) return;
  bytes_.erase(0, taken_);
  scanned_ -= taken_;
  taken_ = 0;
  if (bytes_.capacity() > 2 * bytes_.size() + 65536) bytes_.shrink_to_fit();
}

}  // namespace quorlet

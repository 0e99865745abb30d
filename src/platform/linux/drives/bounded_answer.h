// Questions that a drive has to answer, with a time limit.
//
// A drive that does not answer keeps whoever asks it in the kernel, where no signal reaches. A time
// limit on the command itself would make the kernel reset the controller. So a child asks, and is
// left behind when it takes too long.
#ifndef QUORLET_PLATFORM_LINUX_DRIVES_BOUNDED_ANSWER_H_
#define QUORLET_PLATFORM_LINUX_DRIVES_BOUNDED_ANSWER_H_

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <functional>
#include <span>
#include <string>

#include "drvreport/property_value.h"

namespace quorlet {

// What the child does: it fills the buffer and says how much of it, or fails below 0. Only what may
// be called between fork and the end.
using BoundedQuestion = std::function<ssize_t(std::span<std::byte> answer)>;

struct BoundedAnswer {
  Data bytes;           // none when the child failed, or was late
  bool isLate = false;  // there was no answer within the limit
};

// `capacity` is at most 4096, what a pipe always takes at once.
BoundedAnswer AskWithin(std::chrono::milliseconds limit, std::size_t capacity,
                        const BoundedQuestion& question);

// The start of a file of the kernel for which the drive is asked; empty when it cannot be read, or
// not within `limit`.
std::string ReadAttributeWithin(const std::string& path, std::chrono::milliseconds limit);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_DRIVES_BOUNDED_ANSWER_H_

// Kernel parameters by name.
#ifndef QUORLET_PLATFORM_KERNEL_PARAMETERS_H_
#define QUORLET_PLATFORM_KERNEL_PARAMETERS_H_

#include <cstddef>
#include <span>
#include <string_view>

namespace quorlet {

class KernelParameters {
 public:
  virtual ~KernelParameters() = default;

  // Reads the parameter's bytes into `buffer` and sets `length` to their number. Returns 0, or an
  // error number: ENOENT when there is no such parameter (or its queue is empty), ENOMEM when
  // `buffer` is too small. A queue hands out its first value, and at the next read the next one;
  // what does not fit the buffer is not handed out, and what is larger than any event is moved out
  // of the way with an error line.
  virtual int sysctlbyname(std::string_view name, std::span<std::byte> buffer,
                           std::size_t& length) = 0;

  // What a queue hands out stays in it until it is removed, so that it is safe where it goes before
  // it is gone here. Removes all that was handed out; false, after an error line, when some of it
  // could not be.
  virtual bool removeTaken(std::string_view name) = 0;
  // Forgets what was handed out: the next read starts with the first value again.
  virtual void returnTaken(std::string_view name) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_KERNEL_PARAMETERS_H_

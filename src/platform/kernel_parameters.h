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
  // `buffer` is too small.
  virtual int sysctlbyname(std::string_view name, std::span<std::byte> buffer,
                           std::size_t& length) = 0;

  // What a queue handed out stays in it until it is removed here, so that it is never lost between
  // the queue and where it goes; the next read gives the next one all the same. False, after an
  // error line, when something could not be removed.
  virtual bool removeTaken(std::string_view name) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_KERNEL_PARAMETERS_H_

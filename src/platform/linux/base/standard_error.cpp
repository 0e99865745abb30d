#include "platform/standard_error.h"

#include <unistd.h>

#include "platform/linux/base/descriptor.h"
#include "platform/linux/base/services.h"

namespace quorlet {
namespace {

class LinuxStandardError : public StandardError {
 public:
  void write(std::string_view text) override { (void)WriteFully(STDERR_FILENO, text); }
};

}  // namespace

std::unique_ptr<StandardError> MakeLinuxStandardError() {
  return std::make_unique<LinuxStandardError>();
}

}  // namespace quorlet

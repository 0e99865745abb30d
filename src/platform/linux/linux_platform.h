// The Linux platform: every service of the bundle, made for one root.
#ifndef QUORLET_PLATFORM_LINUX_LINUX_PLATFORM_H_
#define QUORLET_PLATFORM_LINUX_LINUX_PLATFORM_H_

#include <memory>

#include "platform/linux/base/access.h"
#include "platform/linux/base/files.h"
#include "platform/linux/counters/counter_store.h"
#include "platform/platform.h"

namespace quorlet {

// Owns the services. Nothing is opened or read before it is asked for. The destructor makes
// pending preference changes durable.
class LinuxPlatform {
 public:
  // `log` replaces the root's system log when it is given. `options`: of the counter store.
  LinuxPlatform(Root root, Access access, std::unique_ptr<SystemLog> log = nullptr,
                const TallyOptions& options = {});
  LinuxPlatform(const LinuxPlatform&) = delete;
  LinuxPlatform& operator=(const LinuxPlatform&) = delete;
  ~LinuxPlatform();

  // Borrowed from this object.
  Platform& services();
  const Root& root() const;

 private:
  struct Services;
  std::unique_ptr<Services> services_;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_LINUX_PLATFORM_H_

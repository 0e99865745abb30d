// System-wide notifications.
#ifndef QUORLET_PLATFORM_NOTIFICATIONS_H_
#define QUORLET_PLATFORM_NOTIFICATIONS_H_

#include <string_view>

namespace quorlet {

class Notifications {
 public:
  virtual ~Notifications() = default;

  // Tells whoever watches `name`. A failure leaves one error line.
  virtual void PostNotification(std::string_view name) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_NOTIFICATIONS_H_

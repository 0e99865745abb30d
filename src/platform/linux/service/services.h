// Sockets that other programs reach us at, the frames on them, and the notifications we post.
// What the services are given by reference must outlive them; none of them opens or reads anything
// before it is used.
#ifndef QUORLET_PLATFORM_LINUX_SERVICE_SERVICES_H_
#define QUORLET_PLATFORM_LINUX_SERVICE_SERVICES_H_

#include <cstddef>
#include <memory>

#include "platform/linux/base/files.h"
#include "platform/named_service.h"
#include "platform/notifications.h"
#include "platform/system_log.h"

namespace quorlet {

// Connections at the same time. A newcomer beyond them takes the place of the one that has been
// silent longest, so that silent peers do not lock others out.
inline constexpr std::size_t kMaxConnections = 64;

// The service on a stream socket: one that the service manager passed, or /run/quorlet/<name> with
// mode 0600, where a stale socket is replaced and a live one is not. Only processes of root and of
// this process's own user are served. Not safe to use from several threads.
std::unique_ptr<NamedService> MakeLinuxNamedService(const Root& root, SystemLog& log);

// /run/quorlet/notify/<name> holds how often the notification was posted.
std::unique_ptr<Notifications> MakeLinuxNotifications(const Root& root, SystemLog& log);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_SERVICE_SERVICES_H_

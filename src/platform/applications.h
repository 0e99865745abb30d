// The registry of installed applications.
#ifndef QUORLET_PLATFORM_APPLICATIONS_H_
#define QUORLET_PLATFORM_APPLICATIONS_H_

#include <functional>

namespace quorlet {

enum class ApplicationBundleType { SystemApplicationBundleType, UserApplicationBundleType };

class Applications {
 public:
  virtual ~Applications() = default;

  // Visits every installed application bundle once. False, after an error line, when not all of
  // them could be looked for.
  virtual bool EnumerateApplicationBundles(
      const std::function<void(ApplicationBundleType)>& visit) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_APPLICATIONS_H_

// The OS version dictionary.
#ifndef QUORLET_PLATFORM_OS_VERSION_H_
#define QUORLET_PLATFORM_OS_VERSION_H_

#include <optional>
#include <string>

#include "drvreport/property_value.h"

namespace quorlet {

class OSVersion {
 public:
  virtual ~OSVersion() = default;

  // A new dictionary with the strings "ProductName", "ProductVersion" and "ProductBuildVersion", or
  // nothing when the version cannot be read.
  virtual std::optional<Dictionary> CopySystemVersionDictionary() = 0;
};

// "ProductName ProductVersion (ProductBuildVersion)", without what is missing; "unknown" when
// nothing is there.
std::string OSVersionText(OSVersion& osVersion);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_OS_VERSION_H_

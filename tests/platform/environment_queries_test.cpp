#include "platform/environment_queries.h"

#include <gtest/gtest.h>

#include "fakes/fake_platform.h"

namespace quorlet {
namespace {

TEST(EnvironmentQueries, TheOverrideFileCountsOnInternalDevicesOnly) {
  const char kForced[] =
      "Forcing Multi User Mode behavior due to the presence of /var/db/forceMultiUserMode";
  const struct {
    std::optional<std::int32_t> mode;
    bool internal;
    bool overrideFile;
    bool expected;
  } cases[] = {{std::nullopt, true, true, true},
               {0, true, true, true},
               {std::nullopt, false, true, false},
               {0, false, true, false},
               {1, false, true, true},
               {-1, true, false, true},
               {0, true, false, false},
               {std::nullopt, true, false, false}};
  for (const auto& c : cases) {
    FakePlatform platform;
    platform.deviceInfo.answers["InternalBuild"] = c.internal;
    if (c.overrideFile) platform.environment.sizes["/var/db/forceMultiUserMode"] = 0;
    platform.environment.userMode = c.mode;
    EXPECT_EQ(platform.queries.isMultiUserMode(), c.expected);
    // The answer is kept, whatever happens to its sources.
    platform.environment.sizes.clear();
    platform.environment.userMode = c.expected ? 0 : 1;
    EXPECT_EQ(platform.queries.isMultiUserMode(), c.expected);
    const bool forced = c.internal && c.overrideFile;
    EXPECT_EQ(platform.log.at(LogLevel::kDefault),
              std::vector<std::string>(forced ? 1 : 0, kForced));
  }
}

TEST(EnvironmentQueries, TheContainerIsLookedUpUntilItIsFound) {
  FakePlatform platform;
  platform.environment.userMode = 1;
  platform.environment.containerError = 2;
  const std::string line = "Error getting system group container: 2";
  EXPECT_EQ(platform.queries.dataHomePath(), std::nullopt);
  EXPECT_EQ(platform.queries.dataHomePath(), std::nullopt);
  EXPECT_EQ(platform.log.at(LogLevel::kDefault), (std::vector<std::string>{line, line}));
  platform.environment.containerError = 0;
  EXPECT_EQ(platform.queries.dataHomePath(), "/containers/systemgroup.nuvex.diagwell");
  platform.environment.containerError = 2;
  EXPECT_EQ(platform.queries.dataHomePath(), "/containers/systemgroup.nuvex.diagwell");
  EXPECT_EQ(FakePlatform().queries.dataHomePath(), "/var/mobile");
}

}  // namespace
}  // namespace quorlet

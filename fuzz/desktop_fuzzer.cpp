// Any desktop file is one application or none, whatever its line ends and comments.
#include "fakes/fake_system_log.h"
#include "fuzz_support.h"
#include "platform/linux/device/services.h"

namespace quorlet {
namespace {

std::size_t Count(std::string_view text) {
  static FuzzFiles files;
  static FakeSystemLog log;
  static const auto applications = MakeLinuxApplications(files.device().root(), log);
  files.set("/usr/share/applications/vendor/one.desktop", text);
  std::size_t count = 0;
  applications->EnumerateApplicationBundles([&count](ApplicationBundleType type) {
    Expect(type == ApplicationBundleType::SystemApplicationBundleType, "of another kind");
    ++count;
  });
  return count;
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  const std::string_view text = AsText(data, size);
  const std::size_t count = Count(text);
  Expect(count <= 1, "more than one application");
  std::string other = "# first\n\n";
  for (const char c : text) other.append(c == '\n' ? "\r\n" : std::string(1, c));
  Expect(Count(other) == count, "line ends or comments count");
  Expect(Count(std::string(text) + "\n[Desktop Action new]\nType=Link\n") == count,
         "another group counts");
  return 0;
}

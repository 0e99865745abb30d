// Any file of assignments, which os-release and locale.conf are: what is read can be written and
// read again as the same, and the version and the languages are among it.
#include <algorithm>

#include "fakes/fake_platform.h"
#include "fuzz_support.h"
#include "platform/linux/base/shell_assignments.h"
#include "platform/linux/device/language_tag.h"
#include "platform/linux/device/services.h"
#include "values/text.h"

namespace quorlet {
namespace {

std::string Quoted(std::string_view value) {
  std::string text = "\"";
  for (const char c : value) {
    if (std::string_view("\"\\$`").find(c) != std::string_view::npos) text += '\\';
    text += c;
  }
  return text + "\"";
}

void CheckAssignments(std::string_view text) {
  const ShellAssignments assignments = ParseShellAssignments(text);
  std::string written;
  std::size_t size = 0;
  for (const auto& [name, value] : assignments) {
    Expect(IsValidUtf8(value), "a value is not UTF-8", name);
    size += name.size() + value.size();
    written += name + "=" + Quoted(value) + "\n";
  }
  Expect(size <= 3 * text.size(), "the values are longer than the text");
  Expect(ParseShellAssignments(written) == assignments, "assignments have changed", written);
}

void CheckLocale(const Root& root, const std::string& variable) {
  const auto environment = [&](const char* name) -> const char* {
    return std::string_view(name) == "LANGUAGE" || std::string_view(name) == "LC_ALL"
               ? variable.c_str()
               : nullptr;
  };
  FakeSystemLog log;
  const auto locale = MakeLinuxLocale(LoggingRoot(root, log), environment);
  std::vector<std::string> languages = locale->PreferredLanguages();
  for (const std::string& language : languages) {
    const auto tag = ParseLocaleName(language);
    Expect(tag && tag->text() == language, "not a language", language);
  }
  const auto region = locale->CurrentRegionCode();
  Expect(!region || region->size() == 2 || region->size() == 3, "not a region");
  std::ranges::sort(languages);
  Expect(std::ranges::adjacent_find(languages) == languages.end(), "a language twice");
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  static FuzzFiles files;
  const std::string_view text = AsText(data, size);
  CheckAssignments(text);
  files.set("/etc/os-release", text);
  files.set("/etc/locale.conf", text);
  FakePlatform platform;
  const auto version = MakeLinuxOSVersion(files.device().root(), platform.log);
  Expect(OSVersionText(*version) == OSVersionText(*version), "another version the second time");
  Expect(version->CopySystemVersionDictionary().has_value() == platform.log.errors().empty(),
         "not one line for a file without version");
  CheckLocale(files.device().root(), std::string(text.substr(0, text.find('\0'))));
  return 0;
}

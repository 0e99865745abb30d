#include "platform/locale.h"

#include <sys/stat.h>

#include <algorithm>
#include <utility>

#include "platform/linux/base/shell_assignments.h"
#include "platform/linux/device/language_tag.h"
#include "platform/linux/device/services.h"

namespace quorlet {
namespace {

constexpr char kLocaleFile[] = "/etc/locale.conf";
constexpr std::size_t kMaxLocaleFileBytes = 64UL << 10;
constexpr char kTranslations[] = "/usr/share/locale";

class LanguageList {
 public:
  // Appends the language of each locale name in a list with colons, unless it is there already.
  void add(std::string_view names) {
    while (!names.empty()) {
      const std::string_view name = names.substr(0, names.find(':'));
      names.remove_prefix(std::min(names.size(), name.size() + 1));
      const auto tag = ParseLocaleName(name);
      if (tag && std::ranges::find(tags_, tag->text()) == tags_.end()) tags_.push_back(tag->text());
    }
  }
  std::vector<std::string> take() { return std::move(tags_); }

 private:
  std::vector<std::string> tags_;
};

class LinuxLocale : public LocaleService {
 public:
  LinuxLocale(const LoggingRoot& root, EnvironmentVariable environment)
      : root_(root), environment_(std::move(environment)) {}

  // Every source adds its languages after those of the sources before it.
  std::vector<std::string> PreferredLanguages() override {
    constexpr const char* kVariables[] = {"LANGUAGE", "LC_ALL", "LC_MESSAGES", "LANG"};
    LanguageList languages;
    for (const char* name : kVariables) languages.add(variable(name));
    const auto text = ReadWholeFile(root_.path(kLocaleFile), kMaxLocaleFileBytes);
    if (const auto* lines = std::get_if<std::string>(&text)) {
      const ShellAssignments assignments = ParseShellAssignments(*lines);
      for (const char* name : kVariables) {
        const auto found = assignments.find(name);
        if (found != assignments.end()) languages.add(found->second);
      }
    }
    return languages.take();
  }

  std::vector<std::string> SystemLanguages() override {
    LanguageList languages;
    const std::string directory = root_.path(kTranslations);
    for (const std::string& name : root_.names(directory)) {
      struct stat status = {};
      const std::string messages = JoinPath(directory, name) + "/LC_MESSAGES";
      if (stat(messages.c_str(), &status) == 0 && S_ISDIR(status.st_mode)) languages.add(name);
    }
    languages.add("en");
    return languages.take();
  }

  // Empty when no preferred language is available.
  std::vector<std::string> PreferredLocalizations(
      const std::vector<std::string>& available,
      const std::vector<std::string>& preferred) override {
    return LookUpLanguages(available, preferred);
  }

  std::optional<std::string> CurrentRegionCode() override {
    for (const char* name : {"LC_ALL", "LANG"}) {
      const auto tag = ParseLocaleName(variable(name));
      if (tag && !tag->region.empty()) return tag->region;
    }
    return std::nullopt;
  }

 private:
  std::string_view variable(const char* name) const {
    const char* value = environment_(name);
    return value != nullptr ? value : "";
  }

  const LoggingRoot root_;
  const EnvironmentVariable environment_;
};

}  // namespace

std::unique_ptr<LocaleService> MakeLinuxLocale(const LoggingRoot& root,
                                               EnvironmentVariable environment) {
  return std::make_unique<LinuxLocale>(root, std::move(environment));
}

}  // namespace quorlet

#include "platform/linux/base/kernel_text.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <climits>
#include <variant>

#include "values/digits.h"

namespace quorlet {
namespace {

constexpr std::string_view kBlanks = " \t\n";
constexpr std::size_t kMaxNameCharacters = 64;
// Of one directory; no machine has as many CPUs.
constexpr std::size_t kMaxNumberedNames = 16384;

bool IsDigit(char c) { return c >= '0' && c <= '9'; }

std::size_t DigitsAt(std::string_view text) {
  const auto end = std::find_if_not(text.begin(), text.end(), IsDigit);
  return static_cast<std::size_t>(end - text.begin());
}

// "0000:3d:00.0", the domain having four or more digits.
bool IsPciAddress(std::string_view component) {
  const std::size_t colon = component.find(':');
  if (colon == std::string_view::npos || colon < 4 || component.size() - colon != 8) return false;
  const std::string_view rest = component.substr(colon);
  return rest[3] == ':' && rest[6] == '.' && IsDigit(rest[7]);
}

// Directories that say what kind of thing follows, and devices that are numbered as they are found.
bool SaysNothingOfPlace(std::string_view component) {
  constexpr std::array<std::string_view, 9> kKinds = {"block",   "hwmon",          "mmc_host",
                                                      "nvme",    "nvme-subsystem", "platform",
                                                      "thermal", "virtual",        "scsi_host"};
  constexpr std::array<std::string_view, 9> kCounted = {
      "host", "hwmon", "i2c-", "mmc", "nvme", "nvme-subsys", "thermal_zone", "usb", "virtio"};
  return component.empty() || component == ".." || component.starts_with("target") ||
         std::ranges::find(kKinds, component) != kKinds.end() ||
         std::ranges::any_of(kCounted, [&](std::string_view prefix) {
           return NumberBehind(prefix, component).has_value();
         });
}

}  // namespace

std::optional<std::string> ReadKernelText(const std::string& path, std::size_t limit) {
  auto bytes = ReadWholeFile(path, limit);
  auto* text = std::get_if<std::string>(&bytes);
  if (text == nullptr) return std::nullopt;
  text->resize(text->find_last_not_of(kBlanks) + 1);
  text->erase(0, std::min(text->find_first_not_of(kBlanks), text->size()));
  return std::move(*text);
}

std::optional<std::uint64_t> ParseCounter(std::string_view text) {
  const auto number = ParseNumber<std::uint64_t>(text);
  return number && *number <= INT64_MAX ? number : std::nullopt;
}

std::optional<std::uint64_t> ReadCounter(const std::string& path) {
  const auto text = ReadKernelText(path);
  return text ? ParseCounter(*text) : std::nullopt;
}

std::optional<std::int64_t> ReadInteger(const std::string& path) {
  const auto text = ReadKernelText(path);
  return text ? ParseNumber<std::int64_t>(*text) : std::nullopt;
}

std::vector<std::string_view> Words(std::string_view line) {
  std::vector<std::string_view> words;
  while (true) {
    line.remove_prefix(std::min(line.find_first_not_of(kBlanks), line.size()));
    if (line.empty()) return words;
    words.push_back(line.substr(0, line.find_first_of(kBlanks)));
    line.remove_prefix(words.back().size());
  }
}

std::string_view TakeLine(std::string_view& rest) {
  const std::string_view line = rest.substr(0, rest.find('\n'));
  rest.remove_prefix(std::min(rest.size(), line.size() + 1));
  return line;
}

std::optional<std::uint64_t> NumberBehind(std::string_view prefix, std::string_view name) {
  if (!name.starts_with(prefix)) return std::nullopt;
  name.remove_prefix(prefix.size());
  if (name.size() > 1 && name.front() == '0') return std::nullopt;
  return ParseNumber<std::uint64_t>(name);
}

std::vector<std::pair<std::uint64_t, std::string>> NumberedNames(const LoggingRoot& root,
                                                                 const std::string& directory,
                                                                 std::string_view prefix) {
  std::vector<std::pair<std::uint64_t, std::string>> found;
  for (std::string& name : root.names(directory)) {
    const auto number = NumberBehind(prefix, name);
    if (number && found.size() < kMaxNumberedNames) found.emplace_back(*number, std::move(name));
  }
  std::ranges::sort(found);
  return found;
}

std::string CleanName(std::string_view text) {
  std::string name;
  for (const char c : text.substr(0, kMaxAttributeBytes)) {
    if (name.size() == kMaxNameCharacters) break;
    if (c == ' ' && (name.empty() || name.back() == ' ')) continue;
    name += c >= 0x20 && c < 0x7F ? c : '?';
  }
  if (name.ends_with(' ')) name.pop_back();
  return name;
}

std::string LinkTarget(const std::string& path) {
  std::array<char, PATH_MAX> target{};
  const ssize_t length = readlink(path.c_str(), target.data(), target.size());
  return length > 0 ? std::string(target.data(), static_cast<std::size_t>(length)) : std::string();
}

std::string DevicePlace(std::string_view linkTarget) {
  constexpr std::string_view kDevices = "devices/";
  const std::size_t start = linkTarget.find(kDevices);
  if (start == std::string_view::npos) return {};
  linkTarget.remove_prefix(start + kDevices.size());
  linkTarget = linkTarget.substr(0, linkTarget.rfind('/') + 1);  // not the device itself
  std::string place;
  while (!linkTarget.empty()) {
    std::string_view component = linkTarget.substr(0, linkTarget.find('/'));
    linkTarget.remove_prefix(component.size() + 1);
    if (IsPciAddress(component)) {
      place = component;
      continue;
    }
    if (SaysNothingOfPlace(component)) continue;
    // The number of the bus that it is on.
    const std::size_t digits = DigitsAt(component);
    if (digits != 0 && digits < component.size() &&
        (component[digits] == ':' || component[digits] == '-')) {
      component.remove_prefix(digits + 1);
    }
    if (!place.empty()) place += '/';
    place += component;
  }
  return CleanName(place);
}

std::uint64_t HashedID(std::string_view text) {
  std::uint64_t hash = 0xCBF2'9CE4'8422'2325;  // FNV-1a
  for (const char c : text) hash = (hash ^ static_cast<unsigned char>(c)) * 0x0000'0100'0000'01B3;
  return hash & INT64_MAX;
}

}  // namespace quorlet

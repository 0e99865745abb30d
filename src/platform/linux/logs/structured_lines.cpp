#include "platform/linux/logs/structured_lines.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <nlohmann/json.hpp>
#include <utility>

#include "platform/linux/base/descriptor.h"

namespace quorlet {
namespace {

constexpr std::size_t kMaxLineBytes = 1UL << 20;  // of a line whose time is looked at
constexpr std::size_t kChunkBytes = 64UL << 10;

std::string DayOfLine(std::string_view line) {
  if (line.size() > kMaxLineBytes) return "";
  const auto entry = nlohmann::json::parse(line, nullptr, /*allow_exceptions=*/false);
  if (!entry.is_object()) return "";
  const auto time = entry.find("time");
  if (time == entry.end() || !time->is_string()) return "";
  return DayOf(time->get_ref<const std::string&>());
}

}  // namespace

std::string DayOf(std::string_view time) {
  constexpr std::string_view kShape = "dddd-dd-ddTdd:dd:dd";
  if (time.size() <= kShape.size() || !time.ends_with('Z')) return "";
  std::string digits;
  for (std::size_t i = 0; i < kShape.size(); ++i) {
    const bool isDigit = time[i] >= '0' && time[i] <= '9';
    if (kShape[i] == 'd' ? !isDigit : time[i] != kShape[i]) return "";
    if (isDigit && i < 10) digits += time[i];
  }
  const int number = std::stoi(digits);
  const std::chrono::year_month_day date(
      std::chrono::year(number / 10000),
      std::chrono::month(static_cast<unsigned>(number) / 100 % 100),
      std::chrono::day(static_cast<unsigned>(number) % 100));
  return date.ok() ? digits : "";
}

int ReadRange(int descriptor, off_t begin, off_t end,
              const std::function<int(std::string_view)>& take) {
  std::array<char, kChunkBytes> chunk;
  while (begin < end) {
    const auto wanted = std::min(chunk.size(), static_cast<std::size_t>(end - begin));
    const ssize_t count =
        Uninterrupted([&] { return pread(descriptor, chunk.data(), wanted, begin); });
    if (count < 0) return errno;
    if (count == 0) return EIO;
    if (const int error = take({chunk.data(), static_cast<std::size_t>(count)})) return error;
    begin += count;
  }
  return 0;
}

void AddLine(std::vector<Lines>& all, Lines line) {
  const bool continues = !all.empty() && all.back().day == line.day && all.back().end == line.begin;
  if (continues) {
    all.back().end = line.end;
  } else {
    all.push_back(std::move(line));
  }
}

int ScanLines(int descriptor, off_t size, const std::function<void(Lines)>& take) {
  std::string line;
  off_t lineBegin = 0;
  off_t position = 0;
  const auto endLine = [&] {
    take({lineBegin, position, DayOfLine(line)});
    lineBegin = position;
    line.clear();
  };
  const int error = ReadRange(descriptor, 0, size, [&](std::string_view bytes) {
    while (!bytes.empty()) {
      const std::string_view part = bytes.substr(0, bytes.find('\n'));
      line += part.substr(0, kMaxLineBytes + 1 - std::min(line.size(), kMaxLineBytes + 1));
      const bool ends = part.size() < bytes.size();
      bytes.remove_prefix(part.size() + (ends ? 1 : 0));
      position += static_cast<off_t>(part.size() + (ends ? 1 : 0));
      if (ends) endLine();
    }
    return 0;
  });
  if (error == 0 && position > lineBegin) endLine();
  return error;
}

}  // namespace quorlet

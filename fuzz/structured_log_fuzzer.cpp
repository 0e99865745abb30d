// Moving the old days of any structured log keeps every line, once, with its neighbours in order;
// a second move does nothing.
#include <unistd.h>

#include <algorithm>

#include "fuzz_support.h"
#include "platform/linux/logs/structured_log.h"

namespace quorlet {
namespace {

constexpr char kDirectory[] = "/log";
constexpr Date kNow{20000 * 86400.0};  // 2024-10-04

using Lines = std::vector<std::string>;

Lines LinesOf(std::string_view text) {
  Lines lines;
  while (!text.empty()) {
    const std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(text.size(), line.size() + 1));
    lines.emplace_back(line);
  }
  return lines;
}

using Files = std::map<std::string, std::string>;

Files ReadAll(const TempRoot& device) {
  Files files;
  for (const std::string& name : device.list(kDirectory)) {
    if (name != ".structured.lock") {
      files[name] = device.read(std::string(kDirectory) + "/" + name);
    }
  }
  return files;
}

Lines AllLines(const Files& files) {
  Lines all;
  for (const auto& [name, text] : files) {
    const Lines lines = LinesOf(text);
    all.insert(all.end(), lines.begin(), lines.end());
  }
  std::ranges::sort(all);
  return all;
}

// Whether the lines of `part` stand in `whole` in this order, others between them.
bool IsInOrder(const Lines& part, const Lines& whole) {
  auto next = part.begin();
  for (const std::string& line : whole) {
    if (next != part.end() && *next == line) ++next;
  }
  return next == part.end();
}

}  // namespace
}  // namespace quorlet

// The log, and after a NUL byte what the file of one old day holds already.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  static const TempRoot device;
  const auto parts = Parts(AsText(data, size), 2);
  const std::string directory = std::string(kDirectory) + "/";
  for (const std::string& name : device.list(kDirectory)) {
    ::unlink(device.path(directory + name).c_str());
  }
  device.write(directory + "structured.jsonl", parts[0]);
  const std::string old = "structured-20240101.jsonl";
  if (!parts[1].empty()) device.write(directory + old, parts[1]);
  const Lines before = AllLines(ReadAll(device));

  StructuredLog log(device.path(kDirectory));
  Expect(log.moveOldLines(kNow) == 0, "a log cannot be moved");
  const Files moved = ReadAll(device);
  Expect(AllLines(moved) == before, "lines are lost, doubled or changed");
  const Lines present = LinesOf(parts[1]);
  const Lines original = LinesOf(parts[0]);
  for (const auto& [name, text] : moved) {
    Expect(!name.starts_with('.'), "a file is left behind", name);
    Lines lines = LinesOf(text);
    if (name == old) {
      Expect(std::ranges::equal(present, std::span(lines).first(present.size())),
             "what a day had is not at the start of its file");
      lines.erase(lines.begin(), lines.begin() + static_cast<std::ptrdiff_t>(present.size()));
    }
    Expect(IsInOrder(lines, original), "lines have changed places", name);
  }
  Expect(log.moveOldLines(kNow) == 0 && ReadAll(device) == moved,
         "a second move changes something");

  Expect(log.append("{}") == 0, "nothing can be appended");
  Lines appended = LinesOf(device.read(directory + "structured.jsonl"));
  Expect(!appended.empty() && appended.back() == "{}", "an appended line is not its own");
  appended.pop_back();
  Expect(appended == LinesOf(moved.at("structured.jsonl")), "an appended line changes others");
  return 0;
}

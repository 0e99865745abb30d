// What the targets share: checks that end the run, inputs of several parts, and files below a root.
// scripts/fuzz puts the root where files are memory.
#ifndef QUORLET_FUZZ_FUZZ_SUPPORT_H_
#define QUORLET_FUZZ_FUZZ_SUPPORT_H_

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "fakes/temp_root.h"

namespace quorlet {

inline void Expect(bool holds, const char* what, std::string_view detail = {}) {
  if (holds) return;
  std::fprintf(stderr, "%s: %.*s\n", what, static_cast<int>(detail.size()), detail.data());
  std::abort();
}

inline std::string_view AsText(const std::uint8_t* data, std::size_t size) {
  return {reinterpret_cast<const char*>(data), size};
}

// The parts of an input between NUL bytes, `count` of them: missing ones are empty, and the last
// one takes the rest.
inline std::vector<std::string_view> Parts(std::string_view input, std::size_t count) {
  std::vector<std::string_view> parts(count);
  for (std::size_t i = 0; i < count; ++i) {
    const std::size_t end = i + 1 < count ? input.find('\0') : std::string_view::npos;
    parts[i] = input.substr(0, end);
    input.remove_prefix(end == std::string_view::npos ? input.size() : end + 1);
  }
  return parts;
}

// Files that nobody else changes: only what is new is written.
class FuzzFiles {
 public:
  const TempRoot& device() const { return device_; }
  void set(const std::string& path, std::string_view text) {
    const auto [known, isNew] = written_.try_emplace(path, text);
    if (!isNew && known->second == text) return;
    known->second = text;
    if (isNew) {
      device_.write(path, text);
    } else {
      std::ofstream(device_.path(path), std::ios::binary)
          .write(text.data(), static_cast<std::streamsize>(text.size()));
    }
  }

 private:
  TempRoot device_;
  std::map<std::string, std::string> written_;
};

}  // namespace quorlet

#endif  // QUORLET_FUZZ_FUZZ_SUPPORT_H_

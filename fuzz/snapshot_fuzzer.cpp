// Any records with any header make a text that is as long as it says, the same for every buffer
// that it fits into, and none for one that is a byte too small.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "storage/snapshot.h"

namespace {

template <typename Render>
void Check(Render render) {
  constexpr std::size_t kCapacity = 1 << 16;
  std::vector<char> large(kCapacity, '#');
  const std::optional<std::size_t> length = render(large);
  if (!length) return;
  if (*length >= kCapacity || large[*length] != '\0') std::abort();
  const auto filled = std::span(large).first(*length + 1);
  std::vector<char> exact(*length + 1, '?');
  if (render(exact) != length || !std::ranges::equal(exact, filled)) std::abort();
  std::vector<char> small(*length);
  if (render(small)) std::abort();
}

}  // namespace

// The first byte says how long the header is, in units of 4 bytes.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  if (size == 0) return 0;
  const auto bytes = std::as_bytes(std::span(data, size)).subspan(1);
  const auto header = bytes.first(std::min<std::size_t>(std::size_t{data[0]} * 4, bytes.size()));
  const auto records = bytes.subspan(header.size());
  Check([&](std::span<char> out) { return FSPParseSnapshotBuffer(records, out); });
  Check([&](std::span<char> out) {
    return FSPParseSnapshotBufferWithInplaceParser(records, out, header);
  });
  return 0;
}

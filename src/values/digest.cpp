#include "values/digest.h"

#include <nettle/md5.h>
#include <nettle/sha1.h>
#include <nettle/sha2.h>

#include <array>
#include <cstdint>
#include <span>

#include "values/digits.h"

namespace quorlet {
namespace {

template <std::size_t Size, typename Context>
std::string Hex(std::string_view bytes, void (*init)(Context*),
                void (*update)(Context*, std::size_t, const std::uint8_t*),
                void (*finish)(Context*, std::size_t, std::uint8_t*)) {
  Context context;
  std::array<std::uint8_t, Size> digest{};
  init(&context);
  update(&context, bytes.size(), reinterpret_cast<const std::uint8_t*>(bytes.data()));
  finish(&context, digest.size(), digest.data());
  std::string text;
  for (const std::uint8_t byte : digest) AppendHex(text, std::byte{byte});
  return text;
}

}  // namespace

std::string HexDigest(DigestKind kind, std::string_view bytes) {
  switch (kind) {
    case DigestKind::kMd5:
      return Hex<MD5_DIGEST_SIZE>(bytes, md5_init, md5_update, md5_digest);
    case DigestKind::kSha1:
      return Hex<SHA1_DIGEST_SIZE>(bytes, sha1_init, sha1_update, sha1_digest);
    case DigestKind::kSha256:
      return Hex<SHA256_DIGEST_SIZE>(bytes, sha256_init, sha256_update, sha256_digest);
  }
  return {};
}

}  // namespace quorlet

// Digests as text.
#ifndef QUORLET_VALUES_DIGEST_H_
#define QUORLET_VALUES_DIGEST_H_

#include <string>
#include <string_view>

namespace quorlet {

// MD5 and SHA-1 name versions and devices here; neither guards anything.
enum class DigestKind { kMd5, kSha1, kSha256 };

// The digest of `bytes` in lower-case hexadecimal.
std::string HexDigest(DigestKind kind, std::string_view bytes);

}  // namespace quorlet

#endif  // QUORLET_VALUES_DIGEST_H_

#include "values/digest.h"

#include <openssl/crypto.h>
#include <openssl/evp.h>

#include <array>

namespace quorlet {
namespace {

const EVP_MD* Algorithm(DigestKind kind) {
  switch (kind) {
    case DigestKind::kMd5:
      return EVP_md5();
    case DigestKind::kSha1:
      return EVP_sha1();
    case DigestKind::kSha256:
      return EVP_sha256();
  }
  return nullptr;
}

}  // namespace

std::string HexDigest(DigestKind kind, std::string_view bytes) {
  // The machine's OpenSSL configuration may forbid MD5; here it only names a file's version.
  OPENSSL_init_crypto(OPENSSL_INIT_NO_LOAD_CONFIG, nullptr);
  std::array<unsigned char, EVP_MAX_MD_SIZE> digest{};
  unsigned int length = 0;
  if (EVP_Digest(bytes.data(), bytes.size(), digest.data(), &length, Algorithm(kind), nullptr) !=
      1) {
    return {};
  }
  constexpr std::string_view kDigits = "0123456789abcdef";
  std::string text;
  for (unsigned int i = 0; i < length; ++i) {
    text += kDigits[digest[i] >> 4];
    text += kDigits[digest[i] & 15];
  }
  return text;
}

}  // namespace quorlet

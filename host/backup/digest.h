#pragma once

#include <nettle/sha2.h>

#include <array>
#include <string>

#include "platform/bytes.h"

namespace appsync::host {

/// A SHA-256 digest being made. Used by one thread.
class Sha256 {
 public:
  Sha256() { ::nettle_sha256_init(&state_); }

  void add(ByteView bytes) {
    ::nettle_sha256_update(&state_, bytes.size(),
                           reinterpret_cast<const std::uint8_t*>(bytes.data()));
  }

  /// Lower-case hexadecimal; begins anew.
  std::string finish() {
    std::array<std::uint8_t, SHA256_DIGEST_SIZE> digest{};
    ::nettle_sha256_digest(&state_, digest.size(), digest.data());
    std::string text;
    for (const std::uint8_t byte : digest) {
      for (const int shift : {4, 0}) text += "0123456789abcdef"[byte >> shift & 15];
    }
    return text;
  }

 private:
  sha256_ctx state_;
};

}  // namespace appsync::host

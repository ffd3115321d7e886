#pragma once

#include <memory>
#include <optional>

#include "platform/bytes.h"
#include "platform/error.h"

namespace appsync {

/// A package's bytes without their compression, checked against the checksums that the compression
/// carries. Used by one thread.
class PackageStream {
 public:
  virtual ~PackageStream() = default;

  /// The next bytes, which stay valid until the next call; empty at the end. Data that is damaged
  /// or cut off gives an error.
  [[nodiscard]] virtual std::optional<Error> next(ByteView& bytes) = 0;
};

/// From the beginning of an open regular file, whose offset it moves: gzip, bzip2, compress, lzma,
/// xz, lzip, lz4, zstd, or no compression at all. Reads in this process only: no decompressor is
/// ever run as a program.
std::unique_ptr<PackageStream> openPackageStream(int packageFd);

}  // namespace appsync

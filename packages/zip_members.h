#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>
#include <vector>

#include "packages/zip_directory.h"
#include "platform/bytes.h"

struct libdeflate_decompressor;

namespace appsync {

/// Reads members of a zip archive in one piece, in half the time that the archive library takes for
/// them piece by piece. It takes only what is plain beyond doubt: what is large or unusual, or
/// where the archive does not say the same everywhere, is left to the library, which then decides
/// and gives the reason. Used by one thread.
class ZipMembers {
 public:
  /// Borrows the archive, whose offset it leaves as it is. `members` are in the order of the file;
  /// `largest` is the most that a member may take, packed or unpacked.
  ZipMembers(int packageFd, std::vector<ZipMember> members, std::uint64_t largest);
  ~ZipMembers();
  ZipMembers(const ZipMembers&) = delete;
  ZipMembers& operator=(const ZipMembers&) = delete;

  /// What the member at `index` holds, valid until the next call; nullopt when that is left to the
  /// archive library, also when the member does not have this name.
  std::optional<ByteView> contents(std::size_t index, std::string_view name);

 private:
  struct Free {
    void operator()(libdeflate_decompressor* decompressor) const;
  };

  bool isPlain(const ZipMember& member) const;
  std::optional<std::uint64_t> dataOffset(const ZipMember& member, std::string_view name) const;
  std::optional<std::string_view> packedBytes(const ZipMember& member, std::uint64_t offset);
  std::optional<ByteView> unpacked(const ZipMember& member, std::string_view packed);

  const int fd_;
  const std::vector<ZipMember> members_;
  const std::uint64_t largest_;
  const std::unique_ptr<libdeflate_decompressor, Free> decompressor_;
  std::vector<char> packed_;
  Bytes unpacked_;
};

}  // namespace appsync

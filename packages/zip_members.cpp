#include "packages/zip_members.h"

#include <libdeflate.h>

#include <array>
#include <span>
#include <string>

#include "base/file_descriptor.h"
#include "packages/zip_format.h"

namespace appsync {
namespace {

using namespace zip;

/// Grows the buffer when it is too small, and never clears what is in it.
template <class Buffer>
void makeRoom(Buffer& buffer, std::size_t size) {
  if (buffer.size() < size) buffer.resize(size);
}

bool readWhole(int fd, std::uint64_t offset, std::span<char> into) {
  return readAt(fd, std::as_writable_bytes(into), offset) == static_cast<std::int64_t>(into.size());
}

/// Whether checksum and sizes stand at `at` as the table of contents has them.
bool repeats(std::string_view bytes, std::size_t at, const ZipMember& member) {
  return number(bytes, at, 4) == member.checksum && number(bytes, at + 4, 4) == member.packed &&
         number(bytes, at + 8, 4) == member.size;
}

}  // namespace

void ZipMembers::Free::operator()(libdeflate_decompressor* decompressor) const {
  ::libdeflate_free_decompressor(decompressor);
}

ZipMembers::ZipMembers(int packageFd, std::vector<ZipMember> members, std::uint64_t largest)
    : fd_(packageFd),
      members_(std::move(members)),
      largest_(largest),
      decompressor_(::libdeflate_alloc_decompressor()) {}

ZipMembers::~ZipMembers() = default;

std::optional<ByteView> ZipMembers::contents(std::size_t index, std::string_view name) {
  if (!decompressor_ || index >= members_.size()) return std::nullopt;
  const ZipMember& member = members_[index];
  if (!isPlain(member)) return std::nullopt;
  const auto offset = dataOffset(member, name);
  const auto packed = offset ? packedBytes(member, *offset) : std::nullopt;
  const auto bytes = packed ? unpacked(member, *packed) : std::nullopt;
  if (!bytes || ::libdeflate_crc32(0, bytes->data(), bytes->size()) != member.checksum)
    return std::nullopt;
  return bytes;
}

bool ZipMembers::isPlain(const ZipMember& member) const {
  constexpr std::uint16_t known = CompressionLevel | DescriptorFollows | Utf8Name;
  const bool stored = member.method == Stored && member.packed == member.size;
  return (stored || member.method == Deflated) && (member.flags & ~known) == 0 &&
         member.packed <= largest_ && member.size <= largest_;
}

std::optional<std::uint64_t> ZipMembers::dataOffset(const ZipMember& member,
                                                    std::string_view name) const {
  std::string header(LocalSize + name.size(), '\0');
  if (!readWhole(fd_, member.offset, header)) return std::nullopt;
  const bool same = number(header, 0, 4) == LocalSignature &&
                    number(header, 6, 2) == member.flags && number(header, 8, 2) == member.method &&
                    number(header, 26, 2) == name.size() &&
                    std::string_view(header).substr(LocalSize) == name;
  if (!same) return std::nullopt;
  const bool told = (member.flags & DescriptorFollows) != 0 || repeats(header, 14, member);
  if (!told) return std::nullopt;
  return member.offset + header.size() + number(header, 28, 2);
}

std::optional<std::string_view> ZipMembers::packedBytes(const ZipMember& member,
                                                        std::uint64_t offset) {
  const bool described = (member.flags & DescriptorFollows) != 0;
  const std::size_t size = member.packed + (described ? DescriptorSize : 0);
  makeRoom(packed_, size);
  if (!readWhole(fd_, offset, std::span(packed_).first(size))) return std::nullopt;
  const std::string_view bytes(packed_.data(), size);
  const std::string_view descriptor = bytes.substr(member.packed);
  if (described &&
      (number(descriptor, 0, 4) != DescriptorSignature || !repeats(descriptor, 4, member)))
    return std::nullopt;
  return bytes.substr(0, member.packed);
}

std::optional<ByteView> ZipMembers::unpacked(const ZipMember& member, std::string_view packed) {
  if (member.method == Stored) return asBytes(packed);
  makeRoom(unpacked_, member.size);
  std::size_t used = 0, made = 0;
  const libdeflate_result result =
      ::libdeflate_deflate_decompress_ex(decompressor_.get(), packed.data(), packed.size(),
                                         unpacked_.data(), member.size, &used, &made);
  if (result != LIBDEFLATE_SUCCESS || used != member.packed || made != member.size)
    return std::nullopt;
  return ByteView(unpacked_).first(made);
}

}  // namespace appsync

#include "tests/device/package_archive.h"

#include <array>
#include <cstdio>
#include <cstring>
#include <span>

#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync::device {
namespace {

constexpr std::size_t Block = 512;

/// The header fields of the tar format: name, mode, owner, group, size, time, checksum, type.
std::string header(std::string_view name, std::size_t size) {
  std::array<char, Block> block{};
  const std::span<char> bytes(block);
  std::memcpy(bytes.data(), name.data(), name.size());
  const bool directory = name.ends_with('/');
  std::snprintf(&bytes[100], 8, "%07o", directory ? 0755U : 0644U);
  std::snprintf(&bytes[108], 8, "%07o", 0U);
  std::snprintf(&bytes[116], 8, "%07o", 0U);
  std::snprintf(&bytes[124], 12, "%011zo", size);
  std::snprintf(&bytes[136], 12, "%011o", 0U);
  std::memset(&bytes[148], ' ', 8);
  bytes[156] = directory ? '5' : '0';
  std::memcpy(&bytes[257],
              "ustar\0"
              "00",
              8);
  unsigned sum = 0;
  for (const char c : bytes) sum += static_cast<unsigned char>(c);
  std::snprintf(&bytes[148], 8, "%06o", sum);
  return {bytes.begin(), bytes.end()};
}

}  // namespace

PackageArchive& PackageArchive::add(std::string_view name, std::string_view contents) {
  entries_ += header(name, contents.size());
  entries_ += contents;
  entries_.append((Block - contents.size() % Block) % Block, '\0');
  return *this;
}

PackageArchive& PackageArchive::addApplication(std::string_view identifier,
                                               std::string_view version) {
  return addApplication(infoOf(identifier, version));
}

PackageArchive& PackageArchive::addApplication(const PropertyList::Dictionary& info) {
  add("Sample.app/", "");
  add("Sample.app/Info.plist", xml(info));
  return add("Sample.app/run.sh", "#!/bin/sh\necho hello\n");
}

Bytes PackageArchive::bytes() const { return toBytes(entries_ + std::string(2 * Block, '\0')); }

PropertyList::Dictionary infoOf(std::string_view identifier, std::string_view version) {
  return {{std::string(KBBundleIdentifier), identifier},
          {std::string(KBBundleVersion), version},
          {std::string(KBBundleDisplayName), "Sample"},
          {std::string(KBBundleExecutable), "run.sh"}};
}

std::string xml(const PropertyList& value) {
  const auto bytes = serializePropertyList(value, PropertyListFormat::Xml);
  return bytes ? std::string(asText(*bytes)) : std::string();
}

}  // namespace appsync::device

#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>

#include "packages/package_extractor.h"
#include "platform/error.h"

namespace appsync {

/// The error of a refusal: "<name of the refusal>: <detail>".
Error refusalError(PackageRefusal refusal, std::string_view detail);

/// An entry as its archive announces it.
struct ArchiveEntry {
  enum class Kind { File, Directory, Link, Special };
  std::string_view name;  ///< any bytes; empty when it could not be read
  Kind kind = Kind::File;
  std::uint32_t mode = 0;  ///< permission bits with set-id and sticky
  bool isEncrypted = false;
};

/// An entry that may be unpacked.
struct PackageItem {
  /// Plain names joined by single "/", beginning with the application's folder or being one of the
  /// two metadata files. Empty for the package's own top ("./").
  std::string path;
  bool isDirectory = false;
  bool isExecutable = false;
};

/// Decides, entry after entry and byte after byte, whether a package may be unpacked. What is
/// announced is never trusted: bytes are counted as they come. One object per package, used by one
/// thread; after the first refusal it is of no further use.
class PackageEntryRules {
 public:
  static constexpr std::size_t LongestName = 255;   ///< bytes of one component
  static constexpr std::size_t LongestPath = 1024;  ///< bytes
  static constexpr std::size_t DeepestPath = 32;    ///< components

  /// `packageBytes` is the size of the package file.
  PackageEntryRules(const PackageLimits& limits, std::uint64_t packageBytes);

  /// nullopt and the item, or the reason for refusing the package.
  [[nodiscard]] std::optional<Error> admit(const ArchiveEntry& entry, PackageItem& item);

  /// Bytes of files that have been unpacked.
  [[nodiscard]] std::optional<Error> admitFileBytes(std::uint64_t count);
  /// Bytes that a compressed package has given when it was uncompressed as a whole, its headers and
  /// padding with them.
  [[nodiscard]] std::optional<Error> admitStreamBytes(std::uint64_t count);

  /// The package is over: it must have held an application.
  [[nodiscard]] std::optional<Error> finish() const;

  /// "<Name>.app"; empty until its first entry has come.
  const std::string& bundleName() const { return bundleName_; }
  /// Whether a file of exactly this path was admitted.
  bool holdsFile(std::string_view path) const;
  std::uint64_t fileBytes() const { return fileBytes_; }

 private:
  struct Known {
    std::string path;
    bool isDirectory;
  };

  [[nodiscard]] std::optional<Error> checkName(std::string_view name) const;
  [[nodiscard]] std::optional<Error> checkKind(const ArchiveEntry& entry) const;
  [[nodiscard]] std::optional<Error> plainPath(std::string_view name, std::string& path) const;
  [[nodiscard]] std::optional<Error> checkTop(std::string_view path, bool isDirectory);
  [[nodiscard]] std::optional<Error> remember(std::string_view path, bool isDirectory);
  [[nodiscard]] std::optional<Error> countEntry();
  [[nodiscard]] std::optional<Error> checkSize(std::uint64_t bytes) const;

  const PackageLimits limits_;
  const std::uint64_t expandedLimit_;  ///< bytes that a package of this size may grow to
  std::uint64_t entries_ = 0;
  std::uint64_t fileBytes_ = 0;
  std::uint64_t streamBytes_ = 0;
  std::string bundleName_;
  std::unordered_map<std::string, Known> known_;  ///< by comparable path
};

}  // namespace appsync

#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "packages/package_entry_rules.h"
#include "packages/package_extractor.h"
#include "packages/package_stream.h"
#include "packages/zip_members.h"

struct archive;
struct archive_entry;

namespace appsync {

/// Goes through a package from its first entry to its last and lets pass only what
/// PackageEntryRules admits. Nothing of what a package holds reaches the file system through it.
/// Reads the descriptor as long as it lives and moves its offset. Used by one thread.
class PackageReader {
 public:
  /// Takes a piece of a file; the bytes between pieces are zero. An error ends the reading.
  using Sink = std::function<std::optional<Error>(std::uint64_t offset, ByteView bytes)>;

  PackageReader(int packageFd, const PackageLimits& limits);
  ~PackageReader();
  PackageReader(const PackageReader&) = delete;
  PackageReader& operator=(const PackageReader&) = delete;

  /// The next entry: true and the item; false at the end, or with `error` when the package is
  /// refused. Only after the end is it sure that the whole package is sound.
  [[nodiscard]] bool next(PackageItem& item, std::optional<Error>& error);

  /// The bytes of the file that `next` gave last, at most once; `size` is the file's whole size,
  /// which may lie past the last piece. A file that is not read is passed over.
  [[nodiscard]] std::optional<Error> readFile(const Sink& sink, std::uint64_t& size);

  const PackageEntryRules& rules() const { return rules_; }

 private:
  struct Free {
    void operator()(archive* a) const;
  };

  [[nodiscard]] std::optional<Error> openZip();
  void openTar();
  std::optional<ByteView> wholeFile();
  [[nodiscard]] std::optional<Error> finish();
  [[nodiscard]] std::optional<Error> drain();
  Error failure() const;
  static std::int64_t readStream(archive*, void* self, const void** block);

  const int fd_;
  const PackageLimits limits_;
  PackageEntryRules rules_;
  std::unique_ptr<PackageStream> stream_;  ///< of a tar archive
  std::unique_ptr<archive, Free> archive_;
  archive_entry* entry_ = nullptr;
  std::string_view name_;                ///< of the entry
  std::size_t entries_ = 0;              ///< so far, the current one included
  std::unique_ptr<ZipMembers> members_;  ///< of a zip archive
  ByteView block_;                    ///< of the stream, the one that the archive library got last
  std::uint64_t handed_ = 0;          ///< bytes of the stream that it got
  std::optional<Error> streamError_;  ///< what went wrong below the archive library
  std::uint64_t entryEnd_ = 0;        ///< in the stream, of the entry before the current one
  bool opened_ = false;
};

}  // namespace appsync

#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>

#include "platform/bytes.h"

struct archive;
struct archive_entry;

namespace appsync {

/// Walks the entries of a zip or tar archive of any compression. Used by one thread.
class ArchiveReader {
 public:
  explicit ArchiveReader(const std::filesystem::path& file);
  ~ArchiveReader();
  ArchiveReader(const ArchiveReader&) = delete;
  ArchiveReader& operator=(const ArchiveReader&) = delete;

  /// Goes on to the next entry. False at the end, at damage and where a limit is reached; `problem`
  /// is then none only at the end.
  bool next();
  /// Name of the current entry without "./" before it.
  const std::string& name() const { return name_; }
  bool isRegularFile() const;
  /// The current entry's contents; nullopt (with a problem) when they are damaged, encrypted or
  /// longer than `limit` bytes. After the latter two the walk can go on.
  std::optional<Bytes> contents(std::size_t limit);

  /// Whether the current entry's contents can be read; with a problem when they cannot.
  bool isReadable();

  /// Whether the file was recognised as an archive.
  bool recognised() const { return recognised_; }
  const std::optional<std::string>& problem() const { return problem_; }

 private:
  [[nodiscard]] bool readAll(const std::function<bool(std::span<const std::byte>)>& take);
  bool end(std::string reason);
  void note(std::string reason);
  std::string libraryReason() const;
  std::string openingReason() const;

  std::unique_ptr<archive, int (*)(archive*)> archive_;
  archive_entry* entry_ = nullptr;
  std::string name_;
  std::uint64_t entries_ = 0;
  bool recognised_ = false;
  bool ended_ = false;
  std::optional<std::string> problem_;
};

}  // namespace appsync

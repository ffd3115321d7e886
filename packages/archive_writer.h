#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>

struct archive;
struct archive_entry;

namespace appsync {

/// Writes a zip or tar archive whose bytes depend on nothing but what is added. Used by one thread.
class ArchiveWriter {
 public:
  /// `ending` is one of ".zip", ".tar", ".tar.gz", ".tgz", ".tar.xz", ".txz", ".tar.zst", ".tzst",
  /// ".tar.bz2" and ".tbz2"; `fd` stays the caller's.
  ArchiveWriter(int fd, std::string_view ending);
  ~ArchiveWriter();
  ArchiveWriter(const ArchiveWriter&) = delete;
  ArchiveWriter& operator=(const ArchiveWriter&) = delete;

  static bool knows(std::string_view ending);

  void addDirectory(const std::string& name);
  void addFile(const std::string& name, const std::filesystem::path& source, bool executable);
  /// Nothing more will be added. False when anything failed.
  [[nodiscard]] bool finish();
  /// The first failure; empty while all is well.
  const std::string& problem() const { return problem_; }

 private:
  bool check(int status);
  archive_entry* beginEntry(const std::string& name, unsigned type, unsigned mode);
  void copyFrom(int fd, std::uint64_t size, const std::filesystem::path& source);

  std::unique_ptr<archive, int (*)(archive*)> archive_;
  std::unique_ptr<archive_entry, void (*)(archive_entry*)> entry_;
  std::string problem_;
};

}  // namespace appsync

#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "host/backup/digest.h"

namespace appsync::host {

// A backup is a folder. Nothing in it depends on when or where it was made.
//
//   Manifest.plist              format version; size and SHA-256 of every other file
//   RestoreApplications.plist   what each application is restored from, by identifier
//   DemotedApps.plist           which applications are to stay placeholders, and why
//   IconState.plist             the order of the home screen
//   Data/<identifier>.tar       an application's own data; absent when there is none

inline constexpr std::string_view BackupApplicationsFile = "RestoreApplications.plist";
inline constexpr std::string_view BackupDemotionsFile = "DemotedApps.plist";
inline constexpr std::string_view BackupIconLayoutFile = "IconState.plist";

/// A file of a backup, as the manifest describes it.
struct BackupFile {
  std::filesystem::path path;
  std::uint64_t size = 0;  ///< bytes
  std::string digest;      ///< SHA-256, lower-case hexadecimal
};

/// A backup that has been read. The property lists have been checked against their digests; the
/// archives of data, which may be large, are looked at only when they are read, so that one that is
/// missing or damaged spoils nothing but itself.
struct Backup {
  Bytes applications;
  Bytes demotions;
  Bytes iconLayout;
  std::map<std::string, BackupFile, std::less<>> data;  ///< by identifier
};

/// Why a folder is not to be had as a backup, or for one: text for people.
struct BackupProblem {
  std::string text;
  bool isWrongFolder = false;  ///< another is to be named; else the system refuses this one
};

/// nullopt, with one line for people, for what is no backup, and where a property list is missing
/// or does not match its digest.
[[nodiscard]] std::optional<Backup> readBackup(const std::filesystem::path& folder,
                                               std::string& problem);

/// Reads a file of a backup a piece at a time and checks it on the way. Used by one thread.
class BackupFileReader {
 public:
  explicit BackupFileReader(const BackupFile& file);

  /// The next bytes, at most as many as fit; 0 at the end. -1, with a problem, when the file cannot
  /// be read, is longer or shorter than it should be, or turns out, at its end, not to match its
  /// digest: only a 0 tells that what came was right.
  std::int64_t read(std::uint8_t* bytes, std::size_t size);
  std::uint64_t position() const { return position_; }  ///< bytes read so far
  const std::string& problem() const { return problem_; }

 private:
  std::int64_t fail(const std::string& reason);
  std::int64_t checkEnd();

  const BackupFile file_;
  FileDescriptor descriptor_;
  Sha256 digest_;
  std::uint64_t position_ = 0;
  bool ended_ = false;
  std::string problem_;
};

/// Makes a backup beside where it is to be and moves it there when it is whole, in the place of an
/// older backup; until then, and when it is destroyed before, the older one stays. What a killed
/// process left beside the folder is removed. Used by one thread.
class BackupWriter {
 public:
  /// nullptr, with a problem of one line, when the folder cannot be made or holds something that is
  /// no backup. The folder that is to hold it must exist.
  static std::unique_ptr<BackupWriter> open(const std::filesystem::path& folder,
                                            BackupProblem& problem);
  virtual ~BackupWriter() = default;

  /// Whether the older backup, which this one is to replace, holds the application; true too when
  /// that cannot be told. False when there is no older one.
  virtual bool olderHolds(std::string_view identifier) = 0;
  /// The applications that the older backup holds; none when that cannot be told.
  virtual std::vector<std::string> olderApplications() = 0;

  // False when the file could not be written; problem() then tells why, and nothing more succeeds.

  [[nodiscard]] virtual bool addFile(std::string_view name, ByteView contents) = 0;
  /// Begins, goes on with and ends an application's archive of data.
  [[nodiscard]] virtual bool beginData(std::string_view identifier) = 0;
  [[nodiscard]] virtual bool append(ByteView contents) = 0;
  [[nodiscard]] virtual bool endData() = 0;
  /// Takes back the archive that was begun: the application has no data, or not all of it came.
  virtual void dropData() = 0;

  /// The backup is whole and on the disk.
  [[nodiscard]] virtual bool finish() = 0;
  virtual const std::string& problem() const = 0;
};

}  // namespace appsync::host

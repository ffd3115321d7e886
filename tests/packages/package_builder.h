#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/file_descriptor.h"
#include "packages/package_extractor.h"
#include "tests/fakes/temporary_folder.h"

namespace appsync::package_tests {

/// An entry of an archive, put down exactly as it says.
struct RawEntry {
  enum class Kind { File, Directory, SymbolicLink, HardLink, Pipe, CharacterDevice };

  std::string name;
  std::string contents;  ///< for links their target
  Kind kind = Kind::File;
  unsigned mode = 0644;

  static RawEntry folder(std::string name, unsigned mode = 0755) {
    return {std::move(name), "", Kind::Directory, mode};
  }
};

enum class ArchiveForm { Zip, StoredZip, Tar, TarGz, TarBz2, TarXz, TarZst, TarLz4, TarLzip };
std::string_view name(ArchiveForm form);

/// An archive with these entries. No entry is checked.
std::string buildArchive(ArchiveForm form, const std::vector<RawEntry>& entries);

/// Info.plist of the sample application.
std::string infoPlist(std::string_view identifier = "com.example.sample");
/// A whole sample package: Sample.app with a script and a picture, and both metadata files.
std::vector<RawEntry> sampleEntries();
/// The sample package with one more entry at its end.
std::vector<RawEntry> sampleEntriesAnd(RawEntry entry);

/// What came of unpacking.
struct Outcome {
  std::optional<ExtractedPackage> package;
  std::optional<Error> error;
  std::map<std::string, std::string> files;  ///< snapshot of the target
  bool outsideTouched = false;               ///< something beside the target has changed

  /// "ok", the name of the refusal, or the whole text of another error.
  std::string result() const;
  std::string reason() const { return error ? error->localizedDescription() : ""; }
};

Outcome unpack(std::string_view archive,
               std::optional<std::string_view> identifier = "com.example.sample",
               const PackageLimits& limits = {});
Outcome unpackFile(const std::filesystem::path& file,
                   std::optional<std::string_view> identifier = "com.example.sample",
                   const PackageLimits& limits = {});

/// The file with its bytes, in memory.
FileDescriptor memoryFile(std::string_view bytes);

}  // namespace appsync::package_tests

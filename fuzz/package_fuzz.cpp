// Unpacks arbitrary bytes as an application package. Whatever they are, only files and folders may
// come of them, and only in the folder meant for them; and the same ones, or the same refusal, when
// the archive library reads all of it.

#include <fcntl.h>
#include <stdlib.h>
#include <sys/mman.h>

#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>

#include "base/directory_tree.h"
#include "base/file_descriptor.h"
#include "base/identifiers.h"
#include "packages/package_extractor.h"

namespace {

namespace fs = std::filesystem;
using namespace appsync;

void require(bool condition) {
  if (!condition) std::abort();
}

/// A folder of this process, removed at its end.
class Arena {
 public:
  Arena() {
    std::string pattern = (fs::temp_directory_path() / "package-fuzz-XXXXXX").string();
    require(::mkdtemp(pattern.data()) != nullptr);
    path_ = pattern;
    folder_.reset(::open(pattern.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  }
  ~Arena() {
    std::error_code ignored;
    fs::remove_all(path_, ignored);
  }
  Arena(const Arena&) = delete;
  Arena& operator=(const Arena&) = delete;

  const fs::path& path() const { return path_; }
  int fd() const { return folder_.get(); }

 private:
  fs::path path_;
  FileDescriptor folder_;
};

void checkItems(const fs::path& target, const std::optional<ExtractedPackage>& package) {
  std::uint64_t bytes = 0;
  for (const fs::directory_entry& entry : fs::recursive_directory_iterator(target)) {
    const fs::file_status status = entry.symlink_status();
    require(fs::is_regular_file(status) || fs::is_directory(status));
    require((status.permissions() & fs::perms(07022)) == fs::perms::none);
    if (fs::is_regular_file(status)) bytes += entry.file_size();
  }
  if (!package) return;
  require(bytes == package->bytes);
  require(isUsableIdentifier(package->identifier));
  require(fs::is_regular_file(target / package->bundleName / "Info.plist"));
}

struct Unpacked {
  std::optional<ExtractedPackage> package;
  std::string refusal;
  std::map<std::string, std::string> files;
};

std::string contents(const fs::path& file) {
  std::ifstream stream(file, std::ios::binary);
  return {std::istreambuf_iterator<char>(stream), {}};
}

Unpacked unpack(const Arena& arena, int package, const PackageLimits& limits) {
  const fs::path folder = arena.path() / "target";
  fs::create_directory(folder);
  const FileDescriptor target(::openat(arena.fd(), "target", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  std::optional<appsync::Error> error;
  Unpacked result;
  result.package = extractPackage(package, target.get(), std::nullopt, limits, &error);
  require(result.package.has_value() != error.has_value());
  checkItems(folder, result.package);
  if (error) {
    result.refusal = error->localizedDescription();
  } else {
    for (const fs::directory_entry& entry : fs::recursive_directory_iterator(folder))
      if (entry.is_regular_file()) result.files[entry.path()] = contents(entry.path());
  }
  require(removeTree(arena.fd(), "target"));
  require(fs::is_empty(arena.path()));
  return result;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const Arena arena;
  FileDescriptor package(::memfd_create("package", MFD_CLOEXEC));
  require(writeAll(package.get(), std::as_bytes(std::span(data, size))));

  PackageLimits limits{300, std::uint64_t{4} << 20, 200};
  const Unpacked quickly = unpack(arena, package.get(), limits);
  limits.wholeFile = 0;
  const Unpacked slowly = unpack(arena, package.get(), limits);
  require(quickly.refusal == slowly.refusal);
  require(quickly.files == slowly.files);
  return 0;
}

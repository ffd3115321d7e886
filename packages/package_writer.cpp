#include "packages/package_writer.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <system_error>
#include <vector>

#include "base/file_descriptor.h"
#include "base/identifiers.h"
#include "base/text.h"
#include "packages/archive_writer.h"
#include "packages/package_extractor.h"
#include "packages/package_facts.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"
#include "platform/sync_files.h"
#include "platform/utf8.h"

namespace appsync {
namespace fs = std::filesystem;
namespace {

/// One file or folder to be packed, under the name that it gets.
struct Member {
  std::string name;
  fs::path source;
  bool isDirectory = false;
  bool isExecutable = false;
};

std::string systemReason(const fs::path& path, int errnoValue) {
  return fmt::format("{}: {}", printable(path.string()), systemText(errnoValue));
}

/// A folder that is removed with all in it.
class ScratchFolder {
 public:
  explicit ScratchFolder(const fs::path& beside) : path_(beside.string() + ".XXXXXX") {
    made_ = ::mkdtemp(path_.data()) != nullptr;
  }
  ~ScratchFolder() {
    std::error_code ignored;
    if (made_) fs::remove_all(path_, ignored);
  }
  ScratchFolder(const ScratchFolder&) = delete;
  ScratchFolder& operator=(const ScratchFolder&) = delete;
  bool made() const { return made_; }
  fs::path path() const { return path_; }

 private:
  std::string path_;
  bool made_ = false;
};

FileDescriptor openPath(const fs::path& path, int flags) {
  return FileDescriptor(::open(path.c_str(), flags | O_CLOEXEC, 0644));
}

class Packer {
 public:
  Packer(const fs::path& folder, const fs::path& output, std::string& problem)
      : folder_(folder), output_(output), problem_(problem) {}

  std::optional<WrittenPackage> run() {
    const bool ok = checkPlaces() && collect() && checkInfo();
    if (!ok) return std::nullopt;
    const ScratchFolder scratch(output_);
    if (!scratch.made()) return fail(systemReason(output_.parent_path(), errno)), std::nullopt;
    const fs::path file = scratch.path() / ("package" + ending_);
    if (!write(file) || !verify(file, scratch.path() / "unpacked")) return std::nullopt;
    std::error_code error;
    result_.bytes = fs::file_size(file, error);
    result_.entries = members_.size();
    fs::rename(file, output_, error);
    if (error) return fail(systemReason(output_, error.value())), std::nullopt;
    return result_;
  }

 private:
  bool fail(std::string reason) {
    problem_ = std::move(reason);
    return false;
  }

  bool checkPlaces() {
    std::error_code error;
    const fs::path folder = fs::canonical(folder_, error);
    if (error || !fs::is_directory(folder)) {
      return fail(printable(folder_.string()) + " is no folder");
    }
    folder_ = folder;
    if (folder_.extension() != ".app" || !isUtf8(folder_.filename().string())) {
      return fail(printable(folder_.string()) + " is not called NAME.app");
    }
    ending_ = packageEnding(output_.filename().string());
    if (!ArchiveWriter::knows(ending_)) {
      return fail(printable(output_.string()) +
                  " must end in .zip, .tar, .tar.gz, .tar.xz, .tar.zst or .tar.bz2");
    }
    const fs::path target = fs::weakly_canonical(output_, error);
    const auto [inside, rest] =
        std::mismatch(folder_.begin(), folder_.end(), target.begin(), target.end());
    if (inside == folder_.end()) return fail("the package cannot lie inside its own folder");
    return true;
  }

  bool add(const fs::path& path, const std::string& name) {
    std::error_code error;
    const fs::file_status status = fs::symlink_status(path, error);
    const std::string shown = printable(path.string());
    if (error) return fail(systemReason(path, error.value()));
    if (holdsControls(name)) return fail(shown + " has an unusable name");
    if (fs::is_symlink(status)) return fail(shown + " is a link, which packages may not hold");
    if (!fs::is_directory(status) && !fs::is_regular_file(status)) {
      return fail(shown + " is neither a file nor a folder");
    }
    constexpr auto Privileged = fs::perms::set_uid | fs::perms::set_gid | fs::perms::sticky_bit;
    if (fs::is_regular_file(status) && (status.permissions() & Privileged) != fs::perms::none) {
      return fail(shown + " has a set-id or sticky bit, which packages may not hold");
    }
    const bool executable = (status.permissions() & fs::perms::owner_exec) != fs::perms::none;
    members_.push_back({name, path, fs::is_directory(status), executable});
    return true;
  }

  bool collect() {
    const std::string top = folder_.filename().string();
    if (!add(folder_, top)) return false;
    std::error_code error;
    for (fs::recursive_directory_iterator item(folder_, error), end; !error && item != end;
         item.increment(error)) {
      const fs::path inside = item->path().lexically_relative(folder_);
      if (!add(item->path(), top + "/" + inside.generic_string())) return false;
    }
    if (error) return fail(systemReason(folder_, error.value()));
    for (const std::string_view name : {exchange::MetadataName, exchange::ArtworkName}) {
      const fs::path beside = folder_.parent_path() / name;
      if (fs::exists(fs::symlink_status(beside, error)) && !add(beside, std::string(name)))
        return false;
    }
    std::sort(members_.begin(), members_.end(),
              [](const Member& left, const Member& right) { return left.name < right.name; });
    return true;
  }

  bool checkInfo() {
    const fs::path path = folder_ / "Info.plist";
    std::ifstream file(path, std::ios::binary);
    if (!file) return fail(printable(folder_.string()) + " has no Info.plist");
    const std::string bytes{std::istreambuf_iterator<char>(file), {}};
    const auto info = parsePropertyList(asBytes(bytes));
    if (!info || !info->asDictionary()) {
      return fail(printable(path.string()) + " is no property list with a dictionary");
    }
    const std::string* identifier = findString(*info->asDictionary(), KBBundleIdentifier);
    if (!identifier || !isSendableIdentifier(*identifier)) {
      return fail(printable(path.string()) + " has no usable KBBundleIdentifier");
    }
    const std::string* executable = findString(*info->asDictionary(), KBBundleExecutable);
    if (executable && !fs::is_regular_file(folder_ / *executable)) {
      return fail(fmt::format("{} names the executable \"{}\", which is not there",
                              printable(path.string()), printable(*executable)));
    }
    const std::string* version = findString(*info->asDictionary(), KBBundleVersion);
    result_.identifier = *identifier;
    result_.version = version ? *version : "";
    return true;
  }

  bool write(const fs::path& file) {
    const FileDescriptor made = openPath(file, O_WRONLY | O_CREAT | O_EXCL);
    if (!made) return fail(systemReason(file, errno));
    ArchiveWriter writer(made.get(), ending_);
    for (const Member& member : members_) {
      if (member.isDirectory) {
        writer.addDirectory(member.name);
      } else {
        writer.addFile(member.name, member.source, member.isExecutable);
      }
    }
    if (!writer.finish()) return fail(printable(oneLine(writer.problem())));
    return syncToDisk(made.get()) || fail(systemReason(file, errno));
  }

  /// The phone's own rules have the last word.
  bool verify(const fs::path& file, const fs::path& target) {
    std::error_code failed;
    fs::create_directory(target, failed);
    const FileDescriptor package = openPath(file, O_RDONLY);
    const FileDescriptor directory = openPath(target, O_RDONLY | O_DIRECTORY);
    std::optional<Error> error;
    if (extractPackage(package.get(), directory.get(), result_.identifier, {}, &error)) return true;
    return fail("the phone would refuse this package: " +
                printable(oneLine(error->localizedDescription())));
  }

  fs::path folder_;
  const fs::path output_;
  std::string& problem_;
  std::string ending_;
  std::vector<Member> members_;
  WrittenPackage result_;
};

}  // namespace

std::optional<WrittenPackage> writePackage(const fs::path& folder, const fs::path& output,
                                           std::string& problem) {
  return Packer(folder, fs::absolute(output), problem).run();
}

}  // namespace appsync

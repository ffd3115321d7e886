#include "tests/packages/package_builder.h"

#include <archive.h>
#include <archive_entry.h>
#include <fcntl.h>
#include <sys/mman.h>

#include <stdexcept>

#include "platform/bundle.h"
#include "platform/installer_service.h"
#include "platform/property_list_codec.h"

namespace appsync::package_tests {

namespace {

void check(archive* a, int result) {
  if (result < ARCHIVE_WARN) throw std::runtime_error(::archive_error_string(a));
}

int addFilter(archive* a, ArchiveForm form) {
  switch (form) {
    case ArchiveForm::TarGz:
      return ::archive_write_add_filter_gzip(a);
    case ArchiveForm::TarBz2:
      return ::archive_write_add_filter_bzip2(a);
    case ArchiveForm::TarXz:
      return ::archive_write_add_filter_xz(a);
    case ArchiveForm::TarZst:
      return ::archive_write_add_filter_zstd(a);
    case ArchiveForm::TarLz4:
      return ::archive_write_add_filter_lz4(a);
    case ArchiveForm::TarLzip:
      return ::archive_write_add_filter_lzip(a);
    default:
      return ::archive_write_add_filter_none(a);
  }
}

unsigned fileType(RawEntry::Kind kind) {
  switch (kind) {
    case RawEntry::Kind::Directory:
      return AE_IFDIR;
    case RawEntry::Kind::SymbolicLink:
      return AE_IFLNK;
    case RawEntry::Kind::Pipe:
      return AE_IFIFO;
    case RawEntry::Kind::CharacterDevice:
      return AE_IFCHR;
    default:
      return AE_IFREG;
  }
}

void writeEntry(archive* a, const RawEntry& raw) {
  archive_entry* entry = ::archive_entry_new();
  ::archive_entry_set_pathname(entry, raw.name.c_str());
  ::archive_entry_set_filetype(entry, fileType(raw.kind));
  ::archive_entry_set_perm(entry, raw.mode);
  ::archive_entry_set_mtime(entry, 1'700'000'000, 0);
  if (raw.kind == RawEntry::Kind::SymbolicLink)
    ::archive_entry_set_symlink(entry, raw.contents.c_str());
  if (raw.kind == RawEntry::Kind::HardLink)
    ::archive_entry_set_hardlink(entry, raw.contents.c_str());
  const bool hasData = raw.kind == RawEntry::Kind::File;
  ::archive_entry_set_size(entry, hasData ? static_cast<la_int64_t>(raw.contents.size()) : 0);
  check(a, ::archive_write_header(a, entry));
  if (hasData) ::archive_write_data(a, raw.contents.data(), raw.contents.size());
  ::archive_entry_free(entry);
}

}  // namespace

std::string_view name(ArchiveForm form) {
  constexpr std::string_view names[] = {"zip",   "storedZip", "tar",    "tarGz",  "tarBz2",
                                        "tarXz", "tarZst",    "tarLz4", "tarLzip"};
  return names[static_cast<std::size_t>(form)];
}

std::string buildArchive(ArchiveForm form, const std::vector<RawEntry>& entries) {
  archive* a = ::archive_write_new();
  const bool zip = form == ArchiveForm::Zip || form == ArchiveForm::StoredZip;
  check(a, zip ? ::archive_write_set_format_zip(a) : ::archive_write_set_format_pax_restricted(a));
  if (form == ArchiveForm::StoredZip) check(a, ::archive_write_zip_set_compression_store(a));
  check(a, addFilter(a, form));
  check(a, ::archive_write_set_bytes_in_last_block(a, 1));

  std::string bytes;
  const auto write = [](archive*, void* target, const void* data, std::size_t size) -> la_ssize_t {
    static_cast<std::string*>(target)->append(static_cast<const char*>(data), size);
    return static_cast<la_ssize_t>(size);
  };
  check(a, ::archive_write_open(a, &bytes, nullptr, write, nullptr));
  for (const RawEntry& entry : entries) writeEntry(a, entry);
  check(a, ::archive_write_close(a));
  ::archive_write_free(a);
  return bytes;
}

std::string infoPlist(std::string_view identifier) {
  PropertyList::Dictionary info;
  info.emplace(KBBundleIdentifier, identifier);
  info.emplace(KBBundleVersion, "1.2");
  info.emplace(KBBundleDisplayName, "Sample");
  info.emplace(KBBundleExecutable, "run.sh");
  return std::string(asText(*serializePropertyList(info, PropertyListFormat::Xml)));
}

std::vector<RawEntry> sampleEntries() {
  return {RawEntry::folder("Sample.app/"),
          {"Sample.app/Info.plist", infoPlist()},
          {"Sample.app/run.sh", "#!/bin/sh\necho hello\n", RawEntry::Kind::File, 0755},
          {"Sample.app/Pages/one.txt", std::string(3000, 'x') + "end"},
          {"HalvoMetadata.plist", "metadata"},
          {"HalvoArtwork", "picture"}};
}

std::vector<RawEntry> sampleEntriesAnd(RawEntry entry) {
  std::vector<RawEntry> entries = sampleEntries();
  entries.push_back(std::move(entry));
  return entries;
}

std::string Outcome::result() const {
  if (package) return "ok";
  if (error->domain != InstallerServiceErrorDomain) return description(*error);
  return std::string(appsync::name(static_cast<PackageRefusal>(error->code)));
}

FileDescriptor memoryFile(std::string_view bytes) {
  FileDescriptor file(::memfd_create("package", MFD_CLOEXEC));
  if (!writeAll(file.get(), asBytes(bytes))) throw std::runtime_error("memory file");
  return file;
}

namespace {

Outcome unpackFrom(int fd, std::optional<std::string_view> identifier,
                   const PackageLimits& limits) {
  const fakes::TemporaryFolder arena;
  std::filesystem::create_directories(arena / "outer/target");
  fakes::putFile(arena / "outer/witness", "witness");
  fakes::putFile(arena / "witness", "witness");
  const auto beside = [&] {
    std::map<std::string, std::string> items = fakes::snapshot(arena.path());
    std::erase_if(items, [](const auto& item) { return item.first.starts_with("outer/target/"); });
    return items;
  };
  const auto before = beside();
  const FileDescriptor target(
      ::open((arena / "outer/target").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  Outcome outcome;
  outcome.package = extractPackage(fd, target.get(), identifier, limits, &outcome.error);
  outcome.files = fakes::snapshot(arena / "outer/target");
  outcome.outsideTouched = beside() != before;
  return outcome;
}

}  // namespace

Outcome unpack(std::string_view archive, std::optional<std::string_view> identifier,
               const PackageLimits& limits) {
  return unpackFrom(memoryFile(archive).get(), identifier, limits);
}

Outcome unpackFile(const std::filesystem::path& file, std::optional<std::string_view> identifier,
                   const PackageLimits& limits) {
  const FileDescriptor package(::open(file.c_str(), O_RDONLY | O_CLOEXEC));
  return unpackFrom(package.get(), identifier, limits);
}

}  // namespace appsync::package_tests

#include "packages/package_entry_rules.h"

#include <algorithm>

#include "base/temporary_file.h"
#include "base/text.h"
#include "packages/package_names.h"
#include "platform/installer_service.h"
#include "platform/sync_files.h"
#include "platform/utf8.h"

namespace appsync {

namespace {

constexpr std::uint64_t FreeExpansion = std::uint64_t{16} << 20;
/// Most that an archive format spends on an entry beside its bytes: headers, padding, long names.
constexpr std::uint64_t HeaderAllowance = std::uint64_t{8} << 10;
constexpr std::string_view BundleSuffix = ".app";

std::uint64_t saturatingProduct(std::uint64_t a, std::uint64_t b) {
  std::uint64_t product = 0;
  return __builtin_mul_overflow(a, b, &product) ? UINT64_MAX : product;
}

std::uint64_t saturatingSum(std::uint64_t a, std::uint64_t b) {
  return a > UINT64_MAX - b ? UINT64_MAX : a + b;
}

std::optional<Error> refuse(PackageRefusal reason, std::string_view detail) {
  return refusalError(reason, detail);
}

std::optional<Error> refuseEntry(PackageRefusal reason, std::string_view entry,
                                 std::string_view why) {
  return refusalError(reason, "\"" + shown(entry) + "\" " + std::string(why));
}

}  // namespace

std::string_view name(PackageRefusal refusal) {
  switch (refusal) {
    case PackageRefusal::NotAnArchive:
      return "not an archive";
    case PackageRefusal::Damaged:
      return "damaged";
    case PackageRefusal::NoApplication:
      return "no application";
    case PackageRefusal::SeveralApplications:
      return "several applications";
    case PackageRefusal::ForeignEntry:
      return "foreign entry";
    case PackageRefusal::Link:
      return "link";
    case PackageRefusal::SpecialFile:
      return "special file";
    case PackageRefusal::PrivilegedMode:
      return "privileged mode";
    case PackageRefusal::AbsoluteName:
      return "absolute name";
    case PackageRefusal::ParentName:
      return "parent name";
    case PackageRefusal::UnsafeName:
      return "unsafe name";
    case PackageRefusal::DuplicateName:
      return "duplicate name";
    case PackageRefusal::TooManyEntries:
      return "too many entries";
    case PackageRefusal::TooLarge:
      return "too large";
    case PackageRefusal::CompressionBomb:
      return "compression bomb";
    case PackageRefusal::Encrypted:
      return "encrypted";
    case PackageRefusal::BadInfo:
      return "bad information";
    case PackageRefusal::WrongIdentifier:
      return "wrong identifier";
  }
  return "unknown";
}

Error refusalError(PackageRefusal refusal, std::string_view detail) {
  return Error::withDescription(InstallerServiceErrorDomain, static_cast<std::int64_t>(refusal),
                                std::string(name(refusal)) + ": " + std::string(detail));
}

PackageEntryRules::PackageEntryRules(const PackageLimits& limits, std::uint64_t packageBytes)
    : limits_(limits),
      expandedLimit_(saturatingSum(saturatingProduct(packageBytes, limits.ratio), FreeExpansion)) {}

std::optional<Error> PackageEntryRules::admit(const ArchiveEntry& entry, PackageItem& item) {
  std::string path;
  if (auto refusal = countEntry()) return refusal;
  if (auto refusal = checkName(entry.name)) return refusal;
  if (auto refusal = plainPath(entry.name, path)) return refusal;
  if (auto refusal = checkKind(entry)) return refusal;
  const bool isDirectory = entry.kind == ArchiveEntry::Kind::Directory;
  if (path.empty()) {
    if (!isDirectory) return refuseEntry(PackageRefusal::UnsafeName, entry.name, "names no file");
  } else {
    if (auto refusal = checkTop(path, isDirectory)) return refusal;
    if (auto refusal = remember(path, isDirectory)) return refusal;
  }
  item = {std::move(path), isDirectory, !isDirectory && (entry.mode & 0100) != 0};
  return std::nullopt;
}

std::optional<Error> PackageEntryRules::checkName(std::string_view name) const {
  if (name.empty()) return refuse(PackageRefusal::UnsafeName, "an entry has no readable name");
  if (!isUtf8(name)) return refuseEntry(PackageRefusal::UnsafeName, name, "is not UTF-8");
  if (holdsControls(name))
    return refuseEntry(PackageRefusal::UnsafeName, name, "holds a control character");
  if (name.size() > LongestPath)
    return refuseEntry(PackageRefusal::UnsafeName, name, "is longer than 1024 bytes");
  if (name.front() == '/')
    return refuseEntry(PackageRefusal::AbsoluteName, name, "does not stay in the package");
  return std::nullopt;
}

std::optional<Error> PackageEntryRules::plainPath(std::string_view name, std::string& path) const {
  std::size_t depth = 0;
  for (std::string_view rest = name; !rest.empty();) {
    const std::size_t end = std::min(rest.find('/'), rest.size());
    const std::string_view component = rest.substr(0, end);
    rest.remove_prefix(std::min(end + 1, rest.size()));
    if (component.empty() || component == ".") continue;
    if (component == "..")
      return refuseEntry(PackageRefusal::ParentName, name, "leads to a parent folder");
    if (component.size() > LongestName)
      return refuseEntry(PackageRefusal::UnsafeName, name, "has a part longer than 255 bytes");
    if (isTemporaryName(component))
      return refuseEntry(PackageRefusal::UnsafeName, name,
                         "is called like the device's temporaries");
    if (++depth > DeepestPath)
      return refuseEntry(PackageRefusal::UnsafeName, name, "is nested deeper than 32 folders");
    if (!path.empty()) path += '/';
    path += component;
  }
  return std::nullopt;
}

std::optional<Error> PackageEntryRules::checkKind(const ArchiveEntry& entry) const {
  if (entry.kind == ArchiveEntry::Kind::Link)
    return refuseEntry(PackageRefusal::Link, entry.name, "is a link");
  if (entry.kind == ArchiveEntry::Kind::Special)
    return refuseEntry(PackageRefusal::SpecialFile, entry.name, "is no file and no folder");
  if ((entry.mode & 07000) != 0)
    return refuseEntry(PackageRefusal::PrivilegedMode, entry.name,
                       "has a set-user-id, set-group-id or sticky bit");
  if (entry.isEncrypted)
    return refuseEntry(PackageRefusal::Encrypted, entry.name, "can be read only with a password");
  return std::nullopt;
}

std::optional<Error> PackageEntryRules::checkTop(std::string_view path, bool isDirectory) {
  const std::size_t slash = path.find('/');
  const std::string_view top = path.substr(0, slash);
  const bool stands = slash == std::string_view::npos;  // at the top itself
  if (stands && !isDirectory && (top == exchange::MetadataName || top == exchange::ArtworkName))
    return std::nullopt;
  const bool isBundle =
      top.size() > BundleSuffix.size() && top.ends_with(BundleSuffix) && (isDirectory || !stands);
  if (!isBundle)
    return refuseEntry(PackageRefusal::ForeignEntry, path, "stands beside the application");
  if (bundleName_.empty()) bundleName_ = top;
  if (bundleName_ == top || comparableName(bundleName_) == comparableName(top)) return std::nullopt;
  return refuse(PackageRefusal::SeveralApplications,
                "\"" + shown(bundleName_) + "\" and \"" + shown(top) + "\"");
}

std::optional<Error> PackageEntryRules::remember(std::string_view path, bool isDirectory) {
  const std::size_t slash = path.rfind('/');
  if (slash != std::string_view::npos) {
    const std::string_view parent = path.substr(0, slash);
    const auto known = known_.find(comparableName(parent));
    if (known == known_.end()) {  // archives need not name the folders
      if (auto refusal = countEntry()) return refusal;
    }
    if (known == known_.end() || !known->second.isDirectory || known->second.path != parent)
      if (auto refusal = remember(parent, true)) return refusal;
  }
  const auto [place, isNew] =
      known_.try_emplace(comparableName(path), Known{std::string(path), isDirectory});
  const Known& first = place->second;
  if (isNew || (isDirectory && first.isDirectory && first.path == path)) return std::nullopt;
  if (first.path != path)
    return refuseEntry(
        PackageRefusal::DuplicateName, path,
        "differs from \"" + shown(first.path) + "\" only in case or in the form of its letters");
  return refuseEntry(
      PackageRefusal::DuplicateName, path,
      first.isDirectory == isDirectory ? "comes twice" : "is both a file and a folder");
}

std::optional<Error> PackageEntryRules::countEntry() {
  if (++entries_ <= limits_.entries) return std::nullopt;
  return refuse(PackageRefusal::TooManyEntries,
                "more than " + std::to_string(limits_.entries) + " files and folders");
}

std::optional<Error> PackageEntryRules::admitFileBytes(std::uint64_t count) {
  fileBytes_ = saturatingSum(fileBytes_, count);
  return checkSize(fileBytes_);
}

std::optional<Error> PackageEntryRules::admitStreamBytes(std::uint64_t count) {
  streamBytes_ = saturatingSum(streamBytes_, count);
  const std::uint64_t headers = saturatingProduct(entries_ + 64, HeaderAllowance);
  return checkSize(streamBytes_ > headers ? streamBytes_ - headers : 0);
}

std::optional<Error> PackageEntryRules::checkSize(std::uint64_t bytes) const {
  if (bytes > limits_.bytes)
    return refuse(PackageRefusal::TooLarge,
                  "more than " + std::to_string(limits_.bytes) + " bytes unpacked");
  if (bytes > expandedLimit_)
    return refuse(PackageRefusal::CompressionBomb,
                  "unpacks to more than " + std::to_string(limits_.ratio) + " times its size");
  return std::nullopt;
}

std::optional<Error> PackageEntryRules::finish() const {
  if (!bundleName_.empty()) return std::nullopt;
  return refuse(PackageRefusal::NoApplication, "it holds no folder \"<Name>.app\"");
}

bool PackageEntryRules::holdsFile(std::string_view path) const {
  const auto known = known_.find(comparableName(path));
  return known != known_.end() && !known->second.isDirectory && known->second.path == path;
}

}  // namespace appsync

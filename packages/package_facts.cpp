#include "packages/package_facts.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <map>

#include "base/identifiers.h"
#include "base/text.h"
#include "packages/archive_reader.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"
#include "platform/sync_files.h"
#include "platform/utf8.h"

namespace appsync {
namespace {

constexpr std::size_t MaximumInfo = std::size_t{1} << 20;
constexpr std::size_t MaximumPart = std::size_t{16} << 20;
constexpr PropertyListLimits InfoLimits{MaximumInfo, 50'000, 64};

constexpr std::array<std::string_view, 13> Endings = {
    ".zip",     ".tar",   ".tar.gz", ".tar.xz", ".tar.zst", ".tar.bz2", ".tar.lzma",
    ".tar.lz4", ".tar.z", ".tgz",    ".txz",    ".tzst",    ".tbz2"};

std::string lowered(std::string_view text) {
  std::string result(text);
  for (char& c : result) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return result;
}

/// A file that lies directly in an application's folder.
struct BundleFile {
  std::string bundle;  ///< the folder's name without ".app"
  std::string name;
};

std::optional<BundleFile> bundleFile(std::string_view entry) {
  constexpr std::string_view Suffix = ".app";
  const std::size_t slash = entry.find('/');
  if (slash == std::string_view::npos) return std::nullopt;
  const std::string_view bundle = entry.substr(0, slash);
  const std::string_view name = entry.substr(slash + 1);
  if (!bundle.ends_with(Suffix) || bundle.size() == Suffix.size()) return std::nullopt;
  if (name.empty() || name.find('/') != std::string_view::npos) return std::nullopt;
  return BundleFile{std::string(bundle.substr(0, bundle.size() - Suffix.size())),
                    std::string(name)};
}

std::optional<PropertyList::Dictionary> parseInfo(const Bytes& bytes) {
  auto plist = parsePropertyList(bytes, nullptr, InfoLimits);
  if (!plist || !plist->asDictionary()) return std::nullopt;
  return std::move(*plist->asDictionary());
}

std::optional<PackageFacts> describe(const std::filesystem::path& file, const Bytes& infoPlist,
                                     const std::string& bundleName, std::string& reason) {
  const auto info = parseInfo(infoPlist);
  if (!info) {
    reason = "its Info.plist is no property list that can be read";
    return std::nullopt;
  }
  const std::string* identifier = findString(*info, KBBundleIdentifier);
  if (!identifier) {
    reason = "its Info.plist names no KBBundleIdentifier";
    return std::nullopt;
  }
  if (!isSendableIdentifier(*identifier)) {
    reason = fmt::format("its identifier \"{}\" cannot be used", printable(*identifier));
    return std::nullopt;
  }
  const std::string* version = findString(*info, KBBundleVersion);
  if (version && holdsControls(*version)) {
    reason = fmt::format("its version \"{}\" cannot be used", printable(*version));
    return std::nullopt;
  }
  const std::string* name = findString(*info, KBBundleDisplayName);
  return PackageFacts{file, *identifier, version ? *version : std::string(),
                      printable(name && !name->empty() ? *name : bundleName)};
}

/// Whether the name is one plain file name that cannot hide another part.
bool isUsableIconName(std::string_view name) {
  return !name.empty() && name.size() <= 200 && name != "." && name != ".." &&
         name.find('/') == std::string_view::npos && name.find('\0') == std::string_view::npos &&
         name != "Info.plist" && name != exchange::MetadataName && name != exchange::ArtworkName &&
         isUtf8(name);
}

/// Pictures met before the Info.plist that says which of them is the icon.
class IconCandidates {
 public:
  void add(std::string name, Bytes&& bytes) {
    total_ += bytes.size();
    if (total_ <= 4 * MaximumPart) found_.try_emplace(std::move(name), std::move(bytes));
  }

  void choose(PackageParts& parts) {
    if (!parts.infoPlist) return;
    const auto info = parseInfo(*parts.infoPlist);
    const std::string* wanted = info ? findString(*info, KBBundleIconFile) : nullptr;
    if (!wanted || !isUsableIconName(*wanted)) return;
    for (const std::string& name : {*wanted, *wanted + ".png"}) {
      const auto icon = found_.find(name);
      if (icon == found_.end()) continue;
      parts.iconName = name;
      parts.icon = std::move(icon->second);
      return;
    }
  }

 private:
  std::map<std::string, Bytes> found_;
  std::size_t total_ = 0;
};

bool isPicture(std::string_view name) {
  const std::string lower = lowered(name);
  return lower.ends_with(".png") || lower.ends_with(".jpg") || lower.ends_with(".jpeg");
}

}  // namespace

std::span<const std::string_view> packageEndings() { return Endings; }

std::string_view packageEnding(std::string_view fileName) {
  const std::string lower = lowered(fileName);
  const auto ending = std::find_if(Endings.begin(), Endings.end(), [&](std::string_view candidate) {
    return lower.size() > candidate.size() && lower.ends_with(candidate);
  });
  return ending == Endings.end() ? std::string_view() : *ending;
}

std::optional<PackageFacts> readPackage(const std::filesystem::path& path,
                                        UnreadablePackage& failure) {
  failure = {path.filename().string(), false, {}};
  ArchiveReader reader(path);
  std::optional<PackageFacts> package;
  bool hasInfo = false;
  while (!hasInfo && reader.next()) {
    const auto file = bundleFile(reader.name());
    if (!file || file->name != "Info.plist" || !reader.isRegularFile()) continue;
    hasInfo = true;
    if (const auto info = reader.contents(MaximumInfo)) {
      package = describe(path, *info, file->bundle, failure.reason);
    }
  }
  if (package) return package;
  failure.looksLikePackage = reader.recognised() || !packageEnding(failure.file).empty();
  if (failure.reason.empty()) {
    failure.reason = reader.problem().value_or("it holds no application (Name.app/Info.plist)");
  }
  return std::nullopt;
}

std::optional<std::string> damageOf(const std::filesystem::path& path) {
  ArchiveReader reader(path);
  while (reader.next()) {
    if (reader.isRegularFile() && !reader.isReadable()) break;
  }
  return reader.problem();
}

PackageParts readPackageParts(const std::filesystem::path& path) {
  ArchiveReader reader(path);
  PackageParts parts;
  IconCandidates pictures;
  while (reader.next()) {
    if (!reader.isRegularFile()) continue;
    if (reader.name() == exchange::MetadataName) {
      parts.metadata = reader.contents(MaximumPart);
    } else if (reader.name() == exchange::ArtworkName) {
      parts.artwork = reader.contents(MaximumPart);
    } else if (const auto file = bundleFile(reader.name())) {
      if (file->name == "Info.plist" && !parts.infoPlist) {
        parts.infoPlist = reader.contents(MaximumInfo);
      } else if (isPicture(file->name)) {
        if (auto picture = reader.contents(MaximumPart)) {
          pictures.add(file->name, std::move(*picture));
        }
      }
    }
  }
  pictures.choose(parts);
  return parts;
}

}  // namespace appsync

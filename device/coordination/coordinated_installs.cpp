#include "device/coordination/coordinated_installs.h"

#include <fmt/format.h>

#include <cerrno>

#include "device/coordination/coordination_core.h"
#include "device/coordination/coordination_values.h"
#include "device/state/application_rows.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync::device {
namespace {

constexpr std::string_view IconFile = "Icon.png";
constexpr std::string_view MetadataFile = "HalvoMetadata.plist";
constexpr std::string_view LaunchProhibitedKey = "SWApplicationLaunchProhibited";
/// Between two looks whether an application has left the foreground: a file's worth of work.
constexpr std::chrono::milliseconds ForegroundPoll{200};

PropertyList::Dictionary infoOf(const PlaceholderRow& row) {
  const auto attributes =
      attributesFrom(row.attributes.value_or(Bytes{})).value_or(PlaceholderAttributes{});
  PropertyList::Dictionary info = attributes.infoDictionary;
  const auto set = [&info](std::string_view key, PropertyList value) {
    info.insert_or_assign(std::string(key), std::move(value));
  };
  set(KBBundleIdentifier, row.identifier);
  set(KBBundleDisplayName, row.name);
  set(KBBundleExecutable, row.name);
  set(KBBundleIconFile, IconFile);
  set(LaunchProhibitedKey, attributes.launchProhibited);
  if (attributes.bundleVersion) set(KBBundleVersion, *attributes.bundleVersion);
  return info;
}

/// The serialised dictionary; none when there is nothing in it.
std::optional<Bytes> metadataFile(const std::optional<StoreMetadata>& metadata) {
  if (!metadata || metadata->values.empty()) return std::nullopt;
  return serializePropertyList(metadata->values, PropertyListFormat::Binary);
}

PropertyList::Dictionary optionsOf(const PlaceholderRow& row) {
  PropertyList::Dictionary options{
      {std::string(SWPackageTypeKey), SWPackageTypePlaceholder},
      {std::string(KBBundleIdentifier), row.identifier},
      {std::string(SWInstallTypeKey), static_cast<std::uint64_t>(row.installType)}};
  if (auto metadata = metadataFile(metadataFrom(row.metadata.value_or(Bytes{})))) {
    options.emplace(SWHalvoMetadataKey, std::move(*metadata));
  }
  if (row.sinf) options.emplace(SWApplicationSINFKey, *row.sinf);
  return options;
}

bool isFile(FileManager& files, const std::string& path) {
  const auto attributes = files.attributesOfItem(path);
  return attributes && !attributes->isDirectory;
}

Error inForeground(std::string_view identifier) {
  return Error::withDescription(
      POSIXErrorDomain, EBUSY,
      fmt::format("{} is in the foreground and was not closed in time", identifier));
}

}  // namespace

void CoordinatedInstalls::hurry() {
  const std::lock_guard lock(mutex_);
  hurried_ = true;
}

void CoordinatedInstalls::leaveWaiting() {
  const std::lock_guard lock(mutex_);
  leaving_ = true;
}

bool CoordinatedInstalls::isLeaving() {
  const std::lock_guard lock(mutex_);
  return leaving_;
}

void CoordinatedInstalls::advance(const std::string& identifier) {
  tidyUp(identifier);
  for (bool more = true; more && !isLeaving();) {
    std::optional<CoordinatorState> state;
    core_.read([&](SQLite::Database& database) {
      const auto live = findLiveCoordinator(database, identifier);
      if (live) state = loadState(database, *live);
    });
    switch (state ? nextStep(*state) : Step::None) {
      case Step::None:
        more = false;
        break;
      case Step::InstallPlaceholder:
        more = installPlaceholder(*state);
        break;
      case Step::InstallPackage:
        more = installPackage(*state);
        break;
      case Step::Complete:
        more = completeDemoted(*state);
        break;
    }
  }
}

void CoordinatedInstalls::removePlaceholder(const std::string& identifier) {
  const PropertyList::Dictionary options{{std::string(UninstallPlaceholdersOnlyKey), true}};
  core_.registry().uninstallApplication(identifier, options);
}

void CoordinatedInstalls::tidyUp(const std::string& identifier) {
  Leftovers left;
  core_.read([&](SQLite::Database& database) { left = findLeftovers(database, identifier); });
  for (const PlaceholderRow& placeholder : left.placeholders) {
    removePlaceholder(identifier);
    core_.change(
        [&](SQLite::Database& database, Consequences&) {
          if (findApplication(database, identifier).placeholder) return;
          setPresence(database, placeholder, Presence::None);
        },
        nullptr);
  }
  FileManager& files = core_.device().files;
  for (PromiseRow& package : left.packages) {
    if (isFile(files, *package.path)) files.removeItem(*package.path);
    package.path.reset();
    core_.change([&](SQLite::Database& database, Consequences&) { put(database, package); },
                 nullptr);
  }
}

bool CoordinatedInstalls::installPlaceholder(const CoordinatorState& state) {
  const PlaceholderRow& placeholder = *state.placeholder;
  const std::int64_t coordinator = state.coordinator.number;
  const auto mark = [&](Presence presence) {
    bool wanted = false;
    const bool marked = core_.change(
        [&](SQLite::Database& database, Consequences& consequences) {
          const auto row = findCoordinator(database, coordinator);
          const auto present = findPlaceholder(database, placeholder.number);
          wanted = row && present && row->isLive() && row->placeholder == placeholder.number;
          if (!wanted) return;
          setPresence(database, *present, presence);
          if (presence != Presence::Installed) return;
          addEvent(database, *row, EventKind::PlaceholderInstalled);
          consequences.events = true;
        },
        nullptr);
    return marked && wanted;
  };
  // Noted first, so that whoever cancels meanwhile, or a crash, leaves no placeholder behind.
  if (!mark(Presence::Begun)) return false;
  const std::string directory = joinPath(PlaceholderBundles, std::to_string(placeholder.number));
  const std::string bundle = joinPath(directory, placeholder.identifier + ".app");
  std::optional<Error> error;
  const bool installed = buildBundle(state, bundle, &error) && installBundle(state, bundle, &error);
  core_.device().files.removeItem(directory);
  if (installed) return mark(Presence::Installed);
  finish(state, error);
  return false;
}

bool CoordinatedInstalls::buildBundle(const CoordinatorState& state, const std::string& bundle,
                                      std::optional<Error>* error) {
  FileManager& files = core_.device().files;
  const auto info =
      serializePropertyList(infoOf(*state.placeholder), PropertyListFormat::Binary, error);
  if (!info || !files.createDirectory(bundle, true, {}, error) ||
      !files.writeAtomically(joinPath(bundle, "Info.plist"), *info, error)) {
    return false;
  }
  copyIcon(state, bundle);
  return true;
}

/// A placeholder without an icon is better than none.
void CoordinatedInstalls::copyIcon(const CoordinatorState& state, const std::string& bundle) {
  if (!state.icon || state.icon->over || !state.icon->path) return;
  FileManager& files = core_.device().files;
  std::optional<Error> error = Error::posix(ENOENT, *state.icon->path);
  const bool copied = isFile(files, *state.icon->path) &&
                      files.copyItem(*state.icon->path, joinPath(bundle, IconFile), &error);
  if (copied) return;
  core_.log(fmt::format("The placeholder of {} goes without its icon: {}",
                        state.coordinator.identifier, error->localizedDescription()));
}

bool CoordinatedInstalls::installBundle(const CoordinatorState& state, const std::string& bundle,
                                        std::optional<Error>* error) {
  return core_.registry().installApplication(FileLocation::directory(bundle),
                                             optionsOf(*state.placeholder), error);
}

bool CoordinatedInstalls::completeDemoted(const CoordinatorState& state) {
  finish(state, std::nullopt);
  return false;
}

bool CoordinatedInstalls::installPackage(const CoordinatorState& state) {
  const std::string& identifier = state.coordinator.identifier;
  const Foreground::HoldResult held = core_.device().foreground.hold(identifier);
  if (!held.hold) {
    const std::optional<Error> error =
        held.isRunning ? waitForForeground(identifier) : Error::posix(EIO, identifier);
    if (error) finish(state, error);
    return false;
  }
  {
    const std::lock_guard lock(mutex_);
    waiting_.erase(identifier);
  }
  const Beginning beginning = begin(state);
  if (beginning != Beginning::Made) return beginning == Beginning::NotReady;
  const PropertyList::Dictionary options{{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
                                         {std::string(KBBundleIdentifier), identifier}};
  std::optional<Error> error;
  const FileLocation package{*state.package->path, state.package->pathIsDirectory};
  const bool installed =
      adoptOptions(state, &error) && core_.registry().installApplication(package, options, &error);
  finish(state, installed ? std::nullopt : error);
  return false;
}

CoordinatedInstalls::Beginning CoordinatedInstalls::begin(const CoordinatorState& state) {
  bool ready = false;
  const bool begun = core_.change(
      [&](SQLite::Database& database, Consequences&) {
        auto row = findCoordinator(database, state.coordinator.number);
        ready = row && row->package == state.coordinator.package &&
                nextStep(loadState(database, *row)) == Step::InstallPackage;
        if (!ready) return;
        row->stage = Stage::Installing;
        put(database, *row);
      },
      nullptr);
  if (!begun) return Beginning::Failed;
  return ready ? Beginning::Made : Beginning::NotReady;
}

bool CoordinatedInstalls::adoptOptions(const CoordinatorState& state, std::optional<Error>* error) {
  const auto options = optionsFrom(*state.coordinator.options);
  if (!options) return true;
  std::string container;
  const bool adopted = core_.change(
      [&](SQLite::Database& database, Consequences&) {
        auto row = findApplication(database, state.coordinator.identifier).placeholder;
        if (!row) return;
        container = row->container;
        if (options->installType != InstallType::None) row->installType = options->installType;
        if (options->sinfData) row->sinf = options->sinfData;
        putApplication(database, *row);
      },
      error);
  const std::optional<Bytes> metadata = metadataFile(options->storeMetadata);
  if (!adopted || container.empty() || !metadata) return adopted;
  FileManager& files = core_.device().files;
  const std::string file = joinPath(container, MetadataFile);
  if (!files.fileExists(file)) files.writeAtomically(file, *metadata);
  return true;
}

void CoordinatedInstalls::finish(const CoordinatorState& state, const std::optional<Error>& error) {
  if (error) {
    core_.log(fmt::format("The coordinated install of {} failed: {}", state.coordinator.identifier,
                          error->localizedDescription()));
    // Before anybody hears of it, so that whoever does finds the phone as it is to stay.
    removePlaceholder(state.coordinator.identifier);
  }
  // If this fails, what is still on record is carried on when the device is next opened.
  core_.change(
      [&](SQLite::Database& database, Consequences& consequences) {
        if (const auto row = findCoordinator(database, state.coordinator.number)) {
          complete(database, *row, error, consequences);
        }
      },
      nullptr, Database::Commit::OnDisk);
}

std::optional<Error> CoordinatedInstalls::waitForForeground(const std::string& identifier) {
  bool isNew = false;
  {
    const std::lock_guard lock(mutex_);
    if (hurried_) {
      waiting_.erase(identifier);
      return inForeground(identifier);
    }
    const auto [place, inserted] = waiting_.try_emplace(identifier, false);
    if (place->second) return std::nullopt;
    place->second = true;
    isNew = inserted;
  }
  if (isNew) core_.device().watcher.assertionDenied(identifier);
  const auto look = [this, identifier] {
    {
      const std::lock_guard lock(mutex_);
      if (const auto place = waiting_.find(identifier); place != waiting_.end()) {
        place->second = false;
      }
    }
    advance(identifier);
  };
  core_.workers().add(identifier, look, ForegroundPoll);
  return std::nullopt;
}

}  // namespace appsync::device

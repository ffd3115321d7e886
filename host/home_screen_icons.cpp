#include "host/home_screen_icons.h"

#include "device/icon_decoder.h"
#include "device/icon_renderer.h"
#include "platform/bundle.h"

namespace appsync::host {
namespace {

/// One of them at least, if the application is on the device.
struct Records {
  std::optional<AppRecord> installed;
  std::optional<AppRecord> placeholder;
};

Records recordsOf(AppRegistry& registry, std::string_view identifier) {
  Records records;
  records.installed = registry.recordForIdentifier(identifier, false);
  records.placeholder = registry.recordForIdentifier(identifier, true);
  if (records.installed && records.installed->isPlaceholder) records.installed.reset();
  return records;
}

bool isSame(const std::optional<AppRecord>& a, const std::optional<AppRecord>& b) {
  return a.has_value() == b.has_value() && (!a || a->bundlePath == b->bundlePath);
}

constexpr std::string_view Artwork = "HalvoArtwork";

std::optional<Image> artwork(FileManager& files, const AppRecord& record, std::uint32_t side) {
  if (!record.bundleContainerPath) return std::nullopt;
  const std::string path = joinPath(*record.bundleContainerPath, Artwork);
  const auto attributes = files.attributesOfItem(path);
  if (!attributes || attributes->isDirectory || attributes->size > device::MaximumIconBytes) {
    return std::nullopt;
  }
  const auto file = files.contentsAtPath(path);
  if (!file || file->size() > device::MaximumIconBytes) return std::nullopt;
  auto picture = device::decodePngIcon(*file, side);
  return picture ? picture : device::decodeJpegIcon(*file, side);
}

std::optional<Image> picture(device::EmbeddedDevice& device, const AppRecord& record,
                             std::uint32_t side) {
  FileManager& files = device.files();
  const auto bundle =
      record.bundlePath ? Bundle::open(files, {*record.bundlePath, true}) : std::nullopt;
  auto icon =
      bundle ? device::DeviceIconRenderer(files, side).renderHomeScreenIcon(*bundle) : std::nullopt;
  return icon ? icon : artwork(files, record, side);
}

/// A demoted application stays as it is until somebody asks for it.
bool isDemoted(const AppRecord& record) {
  return record.installType == InstallType::Downgrade ||
         record.installType == InstallType::IntentionalDowngrade;
}

/// Of the package; the whole of it is there once the phone installs it.
double shareOf(const InstallProgress& progress) {
  const InstallPhase phase = progress.installPhase();
  if (phase == InstallPhase::Installing || phase == InstallPhase::RestoringData) return 1;
  const auto total = static_cast<double>(progress.totalUnitCount());
  return total > 0 ? static_cast<double>(progress.completedUnitCount()) / total : 0;
}

ScreenIcon::State stateOf(InstallState state, bool demoted) {
  using State = ScreenIcon::State;
  switch (state) {
    case InstallState::Waiting:
      return demoted ? State::Away : State::Waiting;
    case InstallState::Active:
      return State::Loading;
    case InstallState::Paused:
      return demoted ? State::Away : State::Paused;
    case InstallState::Canceled:
    case InstallState::Failed:
    case InstallState::Finished:
      break;
  }
  return State::Away;
}

void showProgress(AppRegistry& registry, const AppRecord& placeholder, ScreenIcon& icon) {
  const auto progress = registry.installProgressSync(placeholder);
  icon.state = progress ? stateOf(progress->installState(), isDemoted(placeholder))
                        : ScreenIcon::State::Away;
  if (icon.state == ScreenIcon::State::Loading) icon.progress = shareOf(*progress);
}

ScreenIcon describe(device::EmbeddedDevice& device, const Records& records, std::uint32_t side) {
  ScreenIcon icon;
  for (const auto* record : {&records.placeholder, &records.installed}) {
    if (!*record) continue;
    if (icon.name.empty()) icon.name = (*record)->displayName;
    if (!icon.picture) icon.picture = picture(device, **record, side);
  }
  if (records.placeholder) showProgress(device.appRegistry(), *records.placeholder, icon);
  return icon;
}

}  // namespace

std::optional<ScreenIcon> iconOf(device::EmbeddedDevice& device, std::string_view identifier,
                                 std::uint32_t side) {
  constexpr int Attempts = 3;
  AppRegistry& registry = device.appRegistry();
  Records records = recordsOf(registry, identifier);
  std::optional<ScreenIcon> icon;
  for (int i = 0; i < Attempts; ++i) {
    if (!records.installed && !records.placeholder) return std::nullopt;
    icon = describe(device, records, side);
    if (icon->name.empty()) icon->name = identifier;
    // An install that has just ended has taken the files away that were looked for.
    Records now = recordsOf(registry, identifier);
    if (isSame(records.installed, now.installed) && isSame(records.placeholder, now.placeholder)) {
      break;
    }
    records = std::move(now);
  }
  return icon;
}

}  // namespace appsync::host

#include "host/home_screen_icons.h"

#include <map>

#include "device/icon_decoder.h"
#include "device/icon_renderer.h"
#include "platform/bundle.h"

namespace appsync::host {
namespace {

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

void showProgress(AppRegistry& registry, const AppRecord& placeholder, ScreenIcon& icon) {
  icon.state = ScreenIcon::State::Away;
  const auto progress = registry.installProgressSync(placeholder);
  if (!progress) return;
  switch (progress->installState()) {
    case InstallState::Waiting:
      if (!isDemoted(placeholder)) icon.state = ScreenIcon::State::Waiting;
      break;
    case InstallState::Active:
      icon.state = ScreenIcon::State::Loading;
      icon.progress = shareOf(*progress);
      break;
    case InstallState::Paused:
      icon.state = ScreenIcon::State::Paused;
      break;
    case InstallState::Canceled:
    case InstallState::Failed:
    case InstallState::Finished:
      break;
  }
}

}  // namespace

std::vector<ShownApplication> shownApplications(device::EmbeddedDevice& device) {
  std::map<std::string, ShownApplication> present;
  for (AppRecord& record : device.applications()) {
    ShownApplication& application = present[record.applicationIdentifier];
    (record.isPlaceholder ? application.placeholder : application.installed) = std::move(record);
  }
  std::vector<ShownApplication> shown;
  for (const std::string& identifier : device.homeScreenOrder()) {
    // What another process has put on the device since then comes with the next picture.
    const auto found = present.find(identifier);
    if (found != present.end()) shown.push_back(std::move(found->second));
  }
  return shown;
}

ScreenIcon iconOf(device::EmbeddedDevice& device, const ShownApplication& application,
                  std::uint32_t side) {
  ScreenIcon icon;
  for (const auto* record : {&application.placeholder, &application.installed}) {
    if (!*record) continue;
    if (icon.name.empty()) icon.name = (*record)->displayName;
    if (!icon.picture) icon.picture = picture(device, **record, side);
  }
  const auto& any = application.placeholder ? application.placeholder : application.installed;
  if (icon.name.empty() && any) icon.name = any->applicationIdentifier;
  if (application.placeholder) {
    showProgress(device.appRegistry(), *application.placeholder, icon);
  }
  return icon;
}

}  // namespace appsync::host

#include "host/home_screen/home_screen_icons.h"

#include "icons/icon_decoder.h"
#include "icons/icon_renderer.h"
#include "platform/bundle.h"
#include "platform/sync_files.h"

namespace appsync::host {
namespace {

bool isSame(const std::optional<AppRecord>& a, const std::optional<AppRecord>& b) {
  return a.has_value() == b.has_value() && (!a || a->bundlePath == b->bundlePath);
}

/// Of the package; the whole of it is there once the phone installs it.
double shareOf(const InstallProgress& progress) {
  const InstallPhase phase = progress.installPhase();
  if (phase == InstallPhase::Installing || phase == InstallPhase::RestoringData) return 1;
  const auto total = static_cast<double>(progress.totalUnitCount());
  return total > 0 ? static_cast<double>(progress.completedUnitCount()) / total : 0;
}

/// `heldBack`: until somebody asks for the application.
ScreenIcon::State stateOf(InstallState state, bool heldBack) {
  using State = ScreenIcon::State;
  switch (state) {
    case InstallState::Waiting:
      return heldBack ? State::Away : State::Waiting;
    case InstallState::Active:
      return State::Loading;
    case InstallState::Paused:
      return heldBack ? State::Away : State::Paused;
    case InstallState::Canceled:
    case InstallState::Failed:
    case InstallState::Finished:
      break;
  }
  return State::Away;
}

}  // namespace

/// What the registry has of one application.
struct HomeScreenIcons::Records {
  std::optional<AppRecord> installed;
  std::optional<AppRecord> placeholder;

  bool any() const { return installed || placeholder; }
  bool operator==(const Records& other) const {
    return isSame(installed, other.installed) && isSame(placeholder, other.placeholder);
  }
};

HomeScreenIcons::HomeScreenIcons(const Phone& phone, std::uint32_t side)
    : files_(phone.files), registry_(phone.apps), side_(side), demotions_(files_) {}

HomeScreenIcons::Records HomeScreenIcons::recordsOf(std::string_view identifier) const {
  Records records{registry_.recordForIdentifier(identifier, false),
                  registry_.recordForIdentifier(identifier, true)};
  if (records.installed && records.installed->isPlaceholder) records.installed.reset();
  return records;
}

std::optional<Image> HomeScreenIcons::artwork(const AppRecord& record) const {
  if (!record.bundleContainerPath) return std::nullopt;
  const std::string path = joinPath(*record.bundleContainerPath, exchange::ArtworkName);
  const auto attributes = files_.attributesOfItem(path);
  if (!attributes || attributes->isDirectory || attributes->size > MaximumIconBytes) {
    return std::nullopt;
  }
  const auto file = files_.contentsAtPath(path);
  if (!file || file->size() > MaximumIconBytes) return std::nullopt;
  auto picture = decodePngIcon(*file, side_);
  return picture ? picture : decodeJpegIcon(*file, side_);
}

std::optional<Image> HomeScreenIcons::picture(const AppRecord& record) const {
  const auto bundle =
      record.bundlePath ? Bundle::open(files_, {*record.bundlePath, true}) : std::nullopt;
  auto icon =
      bundle ? DeviceIconRenderer(files_, side_).renderHomeScreenIcon(*bundle) : std::nullopt;
  return icon ? icon : artwork(record);
}

void HomeScreenIcons::showProgress(const AppRecord& placeholder, ScreenIcon& icon) const {
  const auto progress = registry_.installProgressSync(placeholder);
  icon.state = progress ? stateOf(progress->installState(), demotions_.holdBack(placeholder))
                        : ScreenIcon::State::Away;
  if (icon.state == ScreenIcon::State::Loading) icon.progress = shareOf(*progress);
}

ScreenIcon HomeScreenIcons::describe(const Records& records) const {
  ScreenIcon icon;
  for (const auto* record : {&records.placeholder, &records.installed}) {
    if (!*record) continue;
    if (icon.name.empty()) icon.name = (*record)->displayName;
    if (!icon.picture) icon.picture = picture(**record);
  }
  if (records.placeholder) showProgress(*records.placeholder, icon);
  return icon;
}

std::optional<ScreenIcon> HomeScreenIcons::iconOf(std::string_view identifier) const {
  constexpr int Attempts = 3;
  Records records = recordsOf(identifier);
  std::optional<ScreenIcon> icon;
  for (int i = 0; i < Attempts; ++i) {
    if (!records.any()) return std::nullopt;
    icon = describe(records);
    if (icon->name.empty()) icon->name = identifier;
    // An install that has just ended has taken the files away that were looked for.
    Records now = recordsOf(identifier);
    if (records == now) break;
    records = std::move(now);
  }
  return icon;
}

}  // namespace appsync::host

#pragma once

#include "platform/file_manager.h"
#include "platform/icon_renderer.h"

namespace appsync {

/// Draws the icon file of a bundle: the PNG or JPEG picture named by KBBundleIconFile (".png" is
/// added to a name without an extension), or "Icon.png". The picture is fitted into the device's
/// icon square and its corners are rounded. Borrows the file manager; keeps no other state.
class DeviceIconRenderer final : public IconRenderer {
 public:
  /// `side`: width and height of an icon in pixels, from 1 to 1024.
  explicit DeviceIconRenderer(FileManager& files, std::uint32_t side = 180)
      : files_(files), side_(side) {}

  std::optional<Image> renderHomeScreenIcon(const Bundle& bundle) noexcept override;

 private:
  FileManager& files_;
  const std::uint32_t side_;
};

}  // namespace appsync

#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "device/embedded_device.h"
#include "host/home_screen_picture.h"

namespace appsync::host {

/// An application on the home screen; it has at least one of both.
struct ShownApplication {
  std::optional<AppRecord> installed;
  std::optional<AppRecord> placeholder;
};

/// In the order of their icons.
std::vector<ShownApplication> shownApplications(device::EmbeddedDevice& device);

/// What the device shows of it now. The picture, `side` pixels wide, is that of the bundle, else
/// the artwork beside the bundle; none when neither can be drawn.
ScreenIcon iconOf(device::EmbeddedDevice& device, const ShownApplication& application,
                  std::uint32_t side);

}  // namespace appsync::host

#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "device/embedded_device.h"
#include "host/home_screen_picture.h"

namespace appsync::host {

/// What the device shows of an application now, also while another process installs it; nullopt
/// when it is not on the device. The picture, `side` pixels wide, is that of its bundle or the
/// artwork beside the bundle; none when neither can be drawn.
std::optional<ScreenIcon> iconOf(device::EmbeddedDevice& device, std::string_view identifier,
                                 std::uint32_t side);

}  // namespace appsync::host

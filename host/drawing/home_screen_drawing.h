#pragma once

#include "host/home_screen/home_screen_picture.h"

namespace appsync::host {

/// Draws these pages side by side, and in several rows if there are many. `icons` are those of the
/// pages shown, in order. The same icons always give the same picture. Throws std::runtime_error
/// when it cannot be drawn.
Image drawHomeScreen(const ScreenView& view, const std::vector<ScreenIcon>& icons);

}  // namespace appsync::host

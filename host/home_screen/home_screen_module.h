#pragma once

#include "host/home_screen/home_screen_picture.h"

namespace appsync::host {

/// What the shared object exports: drawHomeScreen.
inline constexpr const char* DrawHomeScreenSymbol = "appsync_draw_home_screen";
using DrawHomeScreen = void(const ScreenView& view, const std::vector<ScreenIcon>& icons,
                            Image& picture);

/// Draws as drawHomeScreen does, by the shared object "HomeScreen.so" that came with the program:
/// to load the libraries that drawing needs takes longer than most commands do, so that they are
/// loaded only here. Throws std::runtime_error, also when that object cannot be used.
Image drawHomeScreenByModule(const ScreenView& view, const std::vector<ScreenIcon>& icons);

}  // namespace appsync::host

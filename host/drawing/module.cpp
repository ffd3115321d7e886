// What the shared object for drawing exports.

#include "host/drawing/home_screen_drawing.h"
#include "host/home_screen/home_screen_module.h"

extern "C" __attribute__((visibility("default"))) void appsync_draw_home_screen(
    const appsync::host::ScreenView& view, const std::vector<appsync::host::ScreenIcon>& icons,
    appsync::Image& picture) {
  picture = appsync::host::drawHomeScreen(view, icons);
}

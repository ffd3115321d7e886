#pragma once

#include <cairo.h>

#include <cstdint>
#include <memory>

#include "platform/icon_renderer.h"

namespace appsync::host {

/// Gives an object of a C library back.
template <auto Release>
struct Releaser {
  template <class T>
  void operator()(T* object) const {
    Release(object);
  }
};

/// Pixels that can be drawn on and drawn from.
using Surface = std::unique_ptr<cairo_surface_t, Releaser<cairo_surface_destroy>>;

// Each throws std::runtime_error for a size that cannot be had.

Surface makeSurface(std::uint32_t width, std::uint32_t height);
/// `image` holds as many pixels as it says.
Surface surfaceOf(const Image& image);
Image imageOf(const Surface& surface);

}  // namespace appsync::host

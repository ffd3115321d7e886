#include "host/drawing/home_screen_surface.h"

#include <algorithm>
#include <stdexcept>

namespace appsync::host {
namespace {

/// The drawing library's own form: native words of premultiplied ARGB.
std::uint32_t premultiplied(const std::byte* rgba) {
  const auto channel = [rgba](int i) { return std::to_integer<std::uint32_t>(rgba[i]); };
  const auto scaled = [&](int i) { return (channel(i) * channel(3) + 127) / 255; };
  return channel(3) << 24 | scaled(0) << 16 | scaled(1) << 8 | scaled(2);
}

void putStraight(std::uint32_t argb, std::byte* rgba) {
  const std::uint32_t alpha = argb >> 24;
  const auto straight = [&](int shift) {
    const std::uint32_t value = argb >> shift & 0xff;
    return static_cast<std::byte>(alpha ? std::min((value * 255 + alpha / 2) / alpha, 255u) : 0);
  };
  rgba[0] = straight(16);
  rgba[1] = straight(8);
  rgba[2] = straight(0);
  rgba[3] = static_cast<std::byte>(alpha);
}

std::uint32_t* rowOf(cairo_surface_t* surface, std::uint32_t row) {
  unsigned char* data = cairo_image_surface_get_data(surface);
  const auto stride = static_cast<std::size_t>(cairo_image_surface_get_stride(surface));
  return reinterpret_cast<std::uint32_t*>(data + row * stride);
}

}  // namespace

Surface makeSurface(std::uint32_t width, std::uint32_t height) {
  Surface surface(cairo_image_surface_create(CAIRO_FORMAT_ARGB32, static_cast<int>(width),
                                             static_cast<int>(height)));
  if (const auto status = cairo_surface_status(surface.get())) {
    throw std::runtime_error(cairo_status_to_string(status));
  }
  return surface;
}

Surface surfaceOf(const Image& image) {
  Surface surface = makeSurface(image.width, image.height);
  const std::byte* pixel = image.pixels.data();
  for (std::uint32_t y = 0; y < image.height; ++y) {
    std::uint32_t* row = rowOf(surface.get(), y);
    for (std::uint32_t x = 0; x < image.width; ++x, pixel += 4) row[x] = premultiplied(pixel);
  }
  cairo_surface_mark_dirty(surface.get());
  return surface;
}

Image imageOf(const Surface& surface) {
  cairo_surface_flush(surface.get());
  Image image;
  image.width = static_cast<std::uint32_t>(cairo_image_surface_get_width(surface.get()));
  image.height = static_cast<std::uint32_t>(cairo_image_surface_get_height(surface.get()));
  image.pixels.resize(std::size_t{image.width} * image.height * 4);
  std::byte* pixel = image.pixels.data();
  for (std::uint32_t y = 0; y < image.height; ++y) {
    const std::uint32_t* row = rowOf(surface.get(), y);
    for (std::uint32_t x = 0; x < image.width; ++x, pixel += 4) putStraight(row[x], pixel);
  }
  return image;
}

}  // namespace appsync::host

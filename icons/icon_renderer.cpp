#include "icons/icon_renderer.h"

#include <algorithm>
#include <cmath>

#include "icons/icon_decoder.h"

namespace appsync {
namespace {

constexpr std::uint32_t MaximumRenderedSide = 1024;
/// Corner radius of the home screen's icons, as a part of their side.
constexpr double CornerRadius = 0.225;

/// The name of the icon's file in its bundle; nullopt for a name that leads elsewhere.
std::optional<std::string> iconFileName(const Bundle& bundle) {
  const std::string* name = findString(bundle.infoDictionary(), KBBundleIconFile);
  if (!name || name->empty()) return "Icon.png";
  const bool isPlain = name->find('/') == name->npos && name->find('\0') == name->npos;
  if (!isPlain || *name == "." || *name == "..") return std::nullopt;
  const bool hasExtension = name->find('.', 1) != name->npos;
  return hasExtension ? *name : *name + ".png";
}

bool beginsWith(ByteView file, std::initializer_list<unsigned char> signature) {
  return file.size() >= signature.size() &&
         std::equal(signature.begin(), signature.end(), file.begin(),
                    [](unsigned char a, std::byte b) { return std::byte{a} == b; });
}

std::optional<Image> decode(ByteView file, std::uint32_t side) {
  if (beginsWith(file, {0x89, 'P', 'N', 'G', '\r', '\n', 0x1a, '\n'}))
    return decodePngIcon(file, side);
  if (beginsWith(file, {0xff, 0xd8, 0xff})) return decodeJpegIcon(file, side);
  return std::nullopt;
}

/// Lets the corners fade out along a quarter circle, half a pixel to each side of it.
void roundCorners(Image& image) {
  const auto side = static_cast<std::size_t>(image.width);
  const double radius = CornerRadius * double(side);
  const auto reach = static_cast<std::size_t>(std::ceil(radius));
  for (std::size_t y = 0; y < reach; ++y) {
    for (std::size_t x = 0; x < reach; ++x) {
      const double distance = std::hypot(radius - double(x) - 0.5, radius - double(y) - 0.5);
      const double coverage = std::clamp(radius + 0.5 - distance, 0.0, 1.0);
      const std::size_t right = side - 1 - x, bottom = side - 1 - y;
      for (const std::size_t pixel :
           {y * side + x, y * side + right, bottom * side + x, bottom * side + right}) {
        std::byte& alpha = image.pixels[pixel * 4 + 3];
        alpha = static_cast<std::byte>(std::lround(std::to_integer<int>(alpha) * coverage));
      }
    }
  }
}

}  // namespace

std::optional<Image> DeviceIconRenderer::renderHomeScreenIcon(const Bundle& bundle) noexcept try {
  const auto name = iconFileName(bundle);
  if (!name || side_ == 0 || side_ > MaximumRenderedSide) return std::nullopt;
  const std::string path = joinPath(bundle.path(), *name);
  // Asked first, so that a huge file is not read at all.
  const auto attributes = files_.attributesOfItem(path);
  if (!attributes || attributes->isDirectory || attributes->size > MaximumIconBytes)
    return std::nullopt;
  const auto file = files_.contentsAtPath(path);
  if (!file || file->size() > MaximumIconBytes) return std::nullopt;
  auto image = decode(*file, side_);
  if (image) roundCorners(*image);
  return image;
} catch (...) {
  return std::nullopt;  // out of memory
}

}  // namespace appsync

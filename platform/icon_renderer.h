#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/bundle.h"
#include "platform/bytes.h"

namespace appsync {

/// Uncompressed picture: 8-bit RGBA rows from top to bottom, straight (not premultiplied) alpha.
struct Image {
  std::uint32_t width = 0;
  std::uint32_t height = 0;
  Bytes pixels;  ///< width * height * 4 bytes
};

/// Draws icons the way this device's home screen shows them. Called from any thread.
class IconRenderer {
 public:
  virtual ~IconRenderer() = default;
  /// The bundle's icon in the device's size; nullopt when the bundle has no icon that can be drawn.
  virtual std::optional<Image> renderHomeScreenIcon(const Bundle& bundle) noexcept = 0;
};

/// Encodes one picture. Used by one thread.
class ImageEncoder {
 public:
  virtual ~ImageEncoder() = default;
  /// Borrows the image until finalize.
  virtual void addImage(const Image& image) noexcept = 0;
  /// Writes the file into the buffer; false when images are missing or cannot be encoded.
  [[nodiscard]] virtual bool finalize() noexcept = 0;
};

class ImageEncoderService {
 public:
  virtual ~ImageEncoderService() = default;
  /// An encoder of `imageCount` images that appends to `buffer`, which it borrows. nullptr when the
  /// type ("public.png" is always known) or the count is not supported. Called from any thread.
  virtual std::unique_ptr<ImageEncoder> create(Bytes& buffer, std::string_view type,
                                               std::size_t imageCount) noexcept = 0;
};

}  // namespace appsync

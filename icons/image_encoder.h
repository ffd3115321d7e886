#pragma once

#include "platform/icon_renderer.h"

namespace appsync {

/// Encodes "public.png", one picture per file.
class PngEncoderService final : public ImageEncoderService {
 public:
  std::unique_ptr<ImageEncoder> create(Bytes& buffer, std::string_view type,
                                       std::size_t imageCount) noexcept override;
};

}  // namespace appsync

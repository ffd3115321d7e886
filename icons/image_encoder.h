#pragma once

#include "platform/icon_renderer.h"

namespace appsync {

/// Encodes "public.png", one picture per file.
class PngEncoderService final : public ImageEncoderService {
 public:
  /// Quick: in a fifth of the time, for files that do not stay.
  enum class Compression { Small, Quick };

  explicit PngEncoderService(Compression compression = Compression::Small)
      : compression_(compression) {}

  std::unique_ptr<ImageEncoder> create(Bytes& buffer, std::string_view type,
                                       std::size_t imageCount) noexcept override;

 private:
  const Compression compression_;
};

}  // namespace appsync

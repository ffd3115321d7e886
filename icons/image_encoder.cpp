#include "icons/image_encoder.h"

#include <png.h>

#include <csetjmp>
#include <new>

#include "icons/png_errors.h"

namespace appsync {
namespace {

constexpr std::uint32_t MaximumSide = 16384;

void flushNothing(png_structp) {}

void appendBytes(png_structp png, png_bytep bytes, std::size_t size) {
  auto& buffer = *static_cast<Bytes*>(png_get_io_ptr(png));
  const auto* begin = reinterpret_cast<const std::byte*>(bytes);
  bool appended = false;
  try {
    buffer.insert(buffer.end(), begin, begin + size);
    appended = true;
  } catch (const std::bad_alloc&) {  // must not pass through the library
  }
  if (!appended) png_error(png, "out of memory");
}

bool isComplete(const Image& image) {
  return image.width > 0 && image.height > 0 && image.width <= MaximumSide &&
         image.height <= MaximumSide &&
         image.pixels.size() == std::size_t{image.width} * image.height * 4;
}

/// Leaves by longjmp on failure, so nothing here needs destruction.
bool write(png_structp png, png_infop info, const Image& image,
           PngEncoderService::Compression compression, Bytes& buffer) {
  if (setjmp(png_jmpbuf(png))) return false;
  png_set_write_fn(png, &buffer, appendBytes, flushNothing);
  png_set_user_limits(png, MaximumSide, MaximumSide);
  png_set_IHDR(png, info, image.width, image.height, 8, PNG_COLOR_TYPE_RGB_ALPHA,
               PNG_INTERLACE_NONE, PNG_COMPRESSION_TYPE_DEFAULT, PNG_FILTER_TYPE_DEFAULT);
  if (compression == PngEncoderService::Compression::Quick) {
    // Of all levels and filters the least time for photos and for flat pictures alike.
    png_set_compression_level(png, 1);
    png_set_filter(png, PNG_FILTER_TYPE_BASE, PNG_FILTER_UP);
  }
  png_write_info(png, info);
  const auto* pixels = reinterpret_cast<png_const_bytep>(image.pixels.data());
  for (std::size_t row = 0; row < image.height; ++row)
    png_write_row(png, pixels + row * image.width * 4);
  png_write_end(png, nullptr);
  return true;
}

class PngEncoder final : public ImageEncoder {
 public:
  PngEncoder(Bytes& buffer, PngEncoderService::Compression compression)
      : buffer_(buffer), compression_(compression) {}

  void addImage(const Image& image) noexcept override {
    image_ = &image;
    ++count_;
  }

  bool finalize() noexcept override {
    if (finalized_ || count_ != 1 || !isComplete(*image_)) return false;
    finalized_ = true;
    png_structp png =
        png_create_write_struct(PNG_LIBPNG_VER_STRING, nullptr, jumpOnPngError, ignorePngWarning);
    png_infop info = png ? png_create_info_struct(png) : nullptr;
    const std::size_t before = buffer_.size();
    const bool written = info && write(png, info, *image_, compression_, buffer_);
    png_destroy_write_struct(&png, &info);
    if (!written) buffer_.resize(before);
    return written;
  }

 private:
  Bytes& buffer_;
  const PngEncoderService::Compression compression_;
  const Image* image_ = nullptr;
  std::size_t count_ = 0;
  bool finalized_ = false;
};

}  // namespace

std::unique_ptr<ImageEncoder> PngEncoderService::create(Bytes& buffer, std::string_view type,
                                                        std::size_t imageCount) noexcept {
  if (type != "public.png" || imageCount != 1) return nullptr;
  return std::unique_ptr<ImageEncoder>(new (std::nothrow) PngEncoder(buffer, compression_));
}

}  // namespace appsync

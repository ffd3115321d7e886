#include <png.h>

#include <csetjmp>
#include <cstring>
#include <optional>
#include <vector>

#include "icons/icon_decoder.h"
#include "icons/icon_scaler.h"
#include "icons/png_errors.h"

namespace appsync {
namespace {

constexpr png_alloc_size_t MaximumChunkBytes = 4 << 20;
constexpr png_uint_32 MaximumChunks = 64;

/// The library leaves by longjmp. Frames between `setjmp` and the library hold nothing that would
/// need destruction: all that does lives here, outside of them.
class PngDecoder {
 public:
  PngDecoder(ByteView file, std::uint32_t side) : file_(file), side_(side) {
    png_ = png_create_read_struct(PNG_LIBPNG_VER_STRING, nullptr, jumpOnPngError, ignorePngWarning);
    if (png_) info_ = png_create_info_struct(png_);
  }
  ~PngDecoder() { png_destroy_read_struct(&png_, &info_, nullptr); }
  PngDecoder(const PngDecoder&) = delete;
  PngDecoder& operator=(const PngDecoder&) = delete;

  std::optional<Image> decode() {
    if (!info_ || !readHeader()) return std::nullopt;
    width_ = png_get_image_width(png_, info_);
    height_ = png_get_image_height(png_, info_);
    row_.resize(std::size_t{width_} * 4);
    scaler_.emplace(width_, height_, side_);
    if (!readPicture()) return std::nullopt;
    return scaler_->finish();
  }

 private:
  static void readBytes(png_structp png, png_bytep to, std::size_t size) {
    auto* self = static_cast<PngDecoder*>(png_get_io_ptr(png));
    if (size > self->file_.size()) png_error(png, "the file is cut off");
    std::memcpy(to, self->file_.data(), size);
    self->file_ = self->file_.subspan(size);
  }

  bool readHeader() {
    if (setjmp(png_jmpbuf(png_))) return false;
    png_set_read_fn(png_, this, readBytes);
    png_set_user_limits(png_, MaximumIconSide, MaximumIconSide);
    // Only the chunks that make the picture are read. The library takes memory for others as they
    // ask for it, also beyond the limit that it has for that.
    png_set_keep_unknown_chunks(png_, PNG_HANDLE_CHUNK_NEVER, nullptr, -1);
    png_set_chunk_malloc_max(png_, MaximumChunkBytes);
    png_set_chunk_cache_max(png_, MaximumChunks);
    png_read_info(png_, info_);
    png_set_expand(png_);
    png_set_scale_16(png_);
    png_set_gray_to_rgb(png_);
    png_set_add_alpha(png_, 0xff, PNG_FILLER_AFTER);
    png_read_update_info(png_, info_);
    return png_get_channels(png_, info_) == 4 && png_get_bit_depth(png_, info_) == 8;
  }

  bool readPicture() {
    if (setjmp(png_jmpbuf(png_))) return false;
    if (png_get_interlace_type(png_, info_) == PNG_INTERLACE_NONE) {
      for (std::uint32_t row = 0; row < height_; ++row) readRow(row, 0, 1, width_);
    } else {
      // Each pass is a thinned-out picture of its own; the scaler takes its pixels in any order.
      for (int pass = 0; pass < PNG_INTERLACE_ADAM7_PASSES; ++pass) readPass(pass);
    }
    png_read_end(png_, nullptr);
    return true;
  }

  void readPass(int pass) {
    const png_uint_32 columns = PNG_PASS_COLS(width_, pass);
    const png_uint_32 rows = PNG_PASS_ROWS(height_, pass);
    if (columns == 0) return;
    for (png_uint_32 row = 0; row < rows; ++row)
      readRow(PNG_ROW_FROM_PASS_ROW(row, pass), PNG_PASS_START_COL(pass),
              1u << PNG_PASS_COL_SHIFT(pass), columns);
  }

  void readRow(std::uint32_t row, std::uint32_t firstColumn, std::uint32_t step,
               std::uint32_t count) {
    png_read_row(png_, row_.data(), nullptr);
    scaler_->addRow(row, firstColumn, step, row_.data(), count);
  }

  ByteView file_;
  std::uint32_t side_;
  std::uint32_t width_ = 0;
  std::uint32_t height_ = 0;
  png_structp png_ = nullptr;
  png_infop info_ = nullptr;
  std::vector<png_byte> row_;
  std::optional<IconScaler> scaler_;
};

}  // namespace

std::optional<Image> decodePngIcon(ByteView file, std::uint32_t side) {
  return PngDecoder(file, side).decode();
}

}  // namespace appsync

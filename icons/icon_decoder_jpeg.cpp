// <jpeglib.h> needs what <cstdio> declares, and configures <jerror.h>.
// clang-format off
#include <cstdio>
#include <jpeglib.h>
#include <jerror.h>
// clang-format on

#include <algorithm>
#include <csetjmp>
#include <optional>
#include <vector>

#include "icons/icon_decoder.h"
#include "icons/icon_scaler.h"

namespace appsync {
namespace {

constexpr long MaximumMemory = 128l << 20;
/// A small file may ask for thousands of passes over a large picture.
constexpr int MaximumScans = 100;

/// Warnings after which the picture is not what was drawn; the others are about style.
bool meansDamage(int warning) {
  switch (warning) {
    case JWRN_ARITH_BAD_CODE:
    case JWRN_BOGUS_PROGRESSION:
    case JWRN_HIT_MARKER:
    case JWRN_HUFF_BAD_CODE:
    case JWRN_JPEG_EOF:
    case JWRN_MUST_RESYNC:
      return true;
    default:
      return false;
  }
}

/// Inverted inks over black, as every program that makes such files writes them.
void cmykToRgba(const std::uint8_t* from, std::uint8_t* to, std::size_t count, bool inverted) {
  for (std::size_t i = 0; i < count; ++i, from += 4, to += 4) {
    const unsigned flip = inverted ? 0 : 255;
    const unsigned black = from[3] ^ flip;
    for (int ink = 0; ink < 3; ++ink)
      to[ink] = static_cast<std::uint8_t>(((from[ink] ^ flip) * black + 127) / 255);
    to[3] = 255;
  }
}

/// The library leaves by longjmp. Frames between `setjmp` and the library hold nothing that would
/// need destruction: all that does lives here, outside of them.
class JpegDecoder {
 public:
  JpegDecoder(ByteView file, std::uint32_t side) : file_(file), side_(side) {
    jpeg_.err = jpeg_std_error(&errors_);
    errors_.error_exit = [](j_common_ptr jpeg) { leave(jpeg); };
    errors_.emit_message = [](j_common_ptr jpeg, int level) {
      if (level < 0 && meansDamage(jpeg->err->msg_code)) leave(jpeg);
    };
    progress_.progress_monitor = [](j_common_ptr jpeg) {
      if (reinterpret_cast<j_decompress_ptr>(jpeg)->input_scan_number > MaximumScans) leave(jpeg);
    };
    jpeg_.client_data = this;
  }
  ~JpegDecoder() {
    if (created_) jpeg_destroy_decompress(&jpeg_);
  }
  JpegDecoder(const JpegDecoder&) = delete;
  JpegDecoder& operator=(const JpegDecoder&) = delete;

  std::optional<Image> decode() {
    if (!readHeader()) return std::nullopt;
    row_.resize(std::size_t{jpeg_.output_width} * 4);
    if (isCmyk()) inks_.resize(row_.size());
    scaler_.emplace(jpeg_.output_width, jpeg_.output_height, side_);
    if (!readPicture()) return std::nullopt;
    return scaler_->finish();
  }

 private:
  [[noreturn]] static void leave(j_common_ptr jpeg) {
    std::longjmp(static_cast<JpegDecoder*>(jpeg->client_data)->jump_, 1);
  }

  bool isCmyk() const { return jpeg_.out_color_space == JCS_CMYK; }

  bool readHeader() {
    if (setjmp(jump_)) return false;
    jpeg_create_decompress(&jpeg_);
    created_ = true;
    jpeg_.mem->max_memory_to_use = MaximumMemory;
    jpeg_.progress = &progress_;
    jpeg_mem_src(&jpeg_, reinterpret_cast<const unsigned char*>(file_.data()),
                 static_cast<unsigned long>(file_.size()));
    jpeg_read_header(&jpeg_, TRUE);
    if (jpeg_.image_width > MaximumIconSide || jpeg_.image_height > MaximumIconSide) return false;
    const bool inks = jpeg_.jpeg_color_space == JCS_CMYK || jpeg_.jpeg_color_space == JCS_YCCK;
    jpeg_.out_color_space = inks ? JCS_CMYK : JCS_EXT_RGBA;
    chooseScale();
    return true;
  }

  /// The decoder shrinks by eighths at little cost; the scaler does the rest.
  void chooseScale() {
    jpeg_.scale_denom = 8;
    for (jpeg_.scale_num = 1; jpeg_.scale_num <= 8; ++jpeg_.scale_num) {
      jpeg_calc_output_dimensions(&jpeg_);
      if (std::max(jpeg_.output_width, jpeg_.output_height) >= side_) return;
    }
    jpeg_.scale_num = 8;
    jpeg_calc_output_dimensions(&jpeg_);
  }

  bool readPicture() {
    if (setjmp(jump_)) return false;
    jpeg_start_decompress(&jpeg_);
    while (jpeg_.output_scanline < jpeg_.output_height) readRow();
    jpeg_finish_decompress(&jpeg_);
    return true;
  }

  void readRow() {
    const std::uint32_t row = jpeg_.output_scanline;
    JSAMPROW into = isCmyk() ? inks_.data() : row_.data();
    jpeg_read_scanlines(&jpeg_, &into, 1);
    if (isCmyk()) cmykToRgba(inks_.data(), row_.data(), jpeg_.output_width, jpeg_.saw_Adobe_marker);
    scaler_->addRow(row, 0, 1, row_.data(), jpeg_.output_width);
  }

  ByteView file_;
  std::uint32_t side_;
  jpeg_decompress_struct jpeg_{};
  jpeg_error_mgr errors_{};
  jpeg_progress_mgr progress_{};
  std::jmp_buf jump_{};
  bool created_ = false;
  std::vector<JSAMPLE> row_;
  std::vector<JSAMPLE> inks_;
  std::optional<IconScaler> scaler_;
};

}  // namespace

std::optional<Image> decodeJpegIcon(ByteView file, std::uint32_t side) {
  return JpegDecoder(file, side).decode();
}

}  // namespace appsync

#include "tests/icons/icon_files.h"

#include <png.h>
#include <zlib.h>

// <jpeglib.h> needs what <cstdio> declares.
// clang-format off
#include <cstdio>
#include <jpeglib.h>
// clang-format on

#include <cstdlib>
#include <string>
#include <vector>

namespace appsync {
namespace {

using Row = std::vector<std::uint8_t>;

struct PngLayout {
  int colour;
  int depth;
};

PngLayout layoutOf(PngForm form) {
  switch (form) {
    case PngForm::Rgba:
      return {PNG_COLOR_TYPE_RGB_ALPHA, 8};
    case PngForm::Rgb:
      return {PNG_COLOR_TYPE_RGB, 8};
    case PngForm::Rgba16:
      return {PNG_COLOR_TYPE_RGB_ALPHA, 16};
    case PngForm::Gray:
      return {PNG_COLOR_TYPE_GRAY, 8};
    case PngForm::GrayAlpha:
      return {PNG_COLOR_TYPE_GRAY_ALPHA, 8};
    case PngForm::OneBit:
      return {PNG_COLOR_TYPE_GRAY, 1};
    case PngForm::Palette:
    case PngForm::PaletteTransparent:
      break;
  }
  return {PNG_COLOR_TYPE_PALETTE, 8};
}

void append(Row& row, PngForm form, const Pixel& pixel, std::uint32_t column) {
  switch (form) {
    case PngForm::Rgba:
      row.insert(row.end(), pixel.begin(), pixel.end());
      break;
    case PngForm::Rgb:
      row.insert(row.end(), pixel.begin(), pixel.begin() + 3);
      break;
    case PngForm::Rgba16:
      for (const std::uint8_t channel : pixel) row.insert(row.end(), {channel, channel});
      break;
    case PngForm::Gray:
      row.push_back(pixel[0]);
      break;
    case PngForm::GrayAlpha:
      row.insert(row.end(), {pixel[0], pixel[3]});
      break;
    case PngForm::Palette:
    case PngForm::PaletteTransparent:
      row.push_back(pixel[0] >> 7);
      break;
    case PngForm::OneBit:
      if (column % 8 == 0) row.push_back(0);
      row.back() = static_cast<std::uint8_t>(row.back() | (pixel[0] >> 7) << (7 - column % 8));
      break;
  }
}

void setExtras(png_structp png, png_infop info, PngForm form, std::string& text) {
  const png_color colours[2] = {{0, 0, 0}, {255, 255, 255}};
  const png_byte opacity[2] = {255, 0};
  if (form == PngForm::Palette || form == PngForm::PaletteTransparent)
    png_set_PLTE(png, info, colours, 2);
  if (form == PngForm::PaletteTransparent) png_set_tRNS(png, info, opacity, 2, nullptr);
  if (text.empty()) return;
  std::string key = "Comment";
  png_text chunk{};
  chunk.compression = PNG_TEXT_COMPRESSION_zTXt;
  chunk.key = key.data();
  chunk.text = text.data();
  chunk.text_length = text.size();
  png_set_text(png, info, &chunk, 1);
}

void putBigEndian(std::byte* to, std::uint32_t value) {
  for (int i = 0; i < 4; ++i) to[i] = static_cast<std::byte>(value >> (24 - 8 * i) & 0xff);
}

void append(Row& row, JpegForm form, const Pixel& pixel) {
  if (form == JpegForm::Gray) {
    row.push_back(pixel[0]);
  } else if (form == JpegForm::Cmyk) {  // inverted inks, no black, as is the custom
    row.insert(row.end(), {pixel[0], pixel[1], pixel[2], 255});
  } else {
    row.insert(row.end(), pixel.begin(), pixel.begin() + 3);
  }
}

}  // namespace

Drawing plain(Pixel pixel) {
  return [pixel](std::uint32_t, std::uint32_t) { return pixel; };
}

Drawing checker(Pixel even, Pixel odd) {
  return [even, odd](std::uint32_t x, std::uint32_t y) { return (x + y) % 2 ? odd : even; };
}

Pixel pixelAt(const Image& image, std::uint32_t column, std::uint32_t row) {
  Pixel pixel;
  for (std::size_t i = 0; i < 4; ++i)
    pixel[i] = std::to_integer<std::uint8_t>(
        image.pixels.at((std::size_t{row} * image.width + column) * 4 + i));
  return pixel;
}

Bytes pngFile(std::uint32_t width, std::uint32_t height, const Drawing& drawing, PngForm form,
              bool interlaced, std::size_t textBytes) {
  Bytes file;
  png_structp png = png_create_write_struct(PNG_LIBPNG_VER_STRING, nullptr, nullptr, nullptr);
  png_infop info = png_create_info_struct(png);
  const auto write = [](png_structp writer, png_bytep bytes, std::size_t size) {
    auto& out = *static_cast<Bytes*>(png_get_io_ptr(writer));
    const auto* begin = reinterpret_cast<const std::byte*>(bytes);
    out.insert(out.end(), begin, begin + size);
  };
  png_set_write_fn(png, &file, write, [](png_structp) {});
  const PngLayout layout = layoutOf(form);
  png_set_IHDR(png, info, width, height, layout.depth, layout.colour,
               interlaced ? PNG_INTERLACE_ADAM7 : PNG_INTERLACE_NONE, PNG_COMPRESSION_TYPE_DEFAULT,
               PNG_FILTER_TYPE_DEFAULT);
  std::string text(textBytes, 'x');
  setExtras(png, info, form, text);
  png_write_info(png, info);
  std::vector<Row> rows(height);
  std::vector<png_bytep> pointers;
  for (std::uint32_t y = 0; y < height; ++y) {
    for (std::uint32_t x = 0; x < width; ++x) append(rows[y], form, drawing(x, y), x);
    pointers.push_back(rows[y].data());
  }
  png_write_image(png, pointers.data());
  png_write_end(png, nullptr);
  png_destroy_write_struct(&png, &info);
  return file;
}

Bytes jpegFile(std::uint32_t width, std::uint32_t height, const Drawing& drawing, JpegForm form) {
  jpeg_compress_struct jpeg{};
  jpeg_error_mgr errors{};
  jpeg.err = jpeg_std_error(&errors);
  jpeg_create_compress(&jpeg);
  unsigned char* bytes = nullptr;
  unsigned long size = 0;
  jpeg_mem_dest(&jpeg, &bytes, &size);
  jpeg.image_width = width;
  jpeg.image_height = height;
  jpeg.input_components = form == JpegForm::Gray ? 1 : form == JpegForm::Cmyk ? 4 : 3;
  jpeg.in_color_space = form == JpegForm::Gray   ? JCS_GRAYSCALE
                        : form == JpegForm::Cmyk ? JCS_CMYK
                                                 : JCS_RGB;
  jpeg_set_defaults(&jpeg);
  jpeg_set_quality(&jpeg, 95, TRUE);
  if (form == JpegForm::Progressive) jpeg_simple_progression(&jpeg);
  jpeg_start_compress(&jpeg, TRUE);
  for (std::uint32_t y = 0; y < height; ++y) {
    Row row;
    for (std::uint32_t x = 0; x < width; ++x) append(row, form, drawing(x, y));
    JSAMPROW pointer = row.data();
    jpeg_write_scanlines(&jpeg, &pointer, 1);
  }
  jpeg_finish_compress(&jpeg);
  jpeg_destroy_compress(&jpeg);
  const auto* begin = reinterpret_cast<const std::byte*>(bytes);
  Bytes file(begin, begin + size);
  std::free(bytes);
  return file;
}

void setPngSize(Bytes& file, std::uint32_t width, std::uint32_t height) {
  constexpr std::size_t header = 12, headerSize = 17;  // "IHDR" and its contents
  putBigEndian(&file.at(header + 4), width);
  putBigEndian(&file.at(header + 8), height);
  const auto* chunk = reinterpret_cast<const Bytef*>(&file[header]);
  putBigEndian(&file.at(header + headerSize),
               static_cast<std::uint32_t>(crc32_z(0, chunk, headerSize)));
}

}  // namespace appsync

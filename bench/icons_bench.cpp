// What drawing one icon takes, beside decoding its picture.

// <jpeglib.h> needs what <cstdio> declares.
// clang-format off
#include <cstdio>
#include <jpeglib.h>
// clang-format on
#include <benchmark/benchmark.h>
#include <png.h>

#include <cmath>
#include <csetjmp>
#include <cstring>
#include <random>

#include "bench/bench_phone.h"
#include "bench/peak.h"
#include "icons/image_encoder.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync::bench {
namespace {

enum class Picture { FlatPng, PhotoPng, Jpeg };

/// A disc on a plain ground, or waves of colour with the noise of a camera.
Image drawn(Picture picture, std::uint32_t side) {
  Image image{side, side, Bytes(std::size_t{side} * side * 4, std::byte{255})};
  std::mt19937 random(1);
  std::uniform_int_distribution<int> noise(0, 15);
  const auto shade = [&](double wave) {
    return static_cast<std::byte>(120 + 80 * std::sin(wave * 30 / side) + noise(random));
  };
  const double middle = side / 2.0;
  for (std::uint32_t y = 0; y < side; ++y) {
    for (std::uint32_t x = 0; x < side; ++x) {
      std::byte* pixel = &image.pixels[(std::size_t{y} * side + x) * 4];
      if (picture != Picture::FlatPng) {
        pixel[0] = shade(x);
        pixel[1] = shade(y);
        pixel[2] = shade(x + y);
      } else if (std::hypot(x - middle, y - middle) > middle / 2) {
        pixel[0] = std::byte{30};
        pixel[1] = std::byte{120};
      }
    }
  }
  return image;
}

Bytes jpegOf(const Image& image) {
  jpeg_compress_struct jpeg{};
  jpeg_error_mgr errors{};
  jpeg.err = jpeg_std_error(&errors);
  jpeg_create_compress(&jpeg);
  unsigned char* file = nullptr;
  unsigned long size = 0;
  jpeg_mem_dest(&jpeg, &file, &size);
  jpeg.image_width = image.width;
  jpeg.image_height = image.height;
  jpeg.input_components = 4;
  jpeg.in_color_space = JCS_EXT_RGBA;
  jpeg_set_defaults(&jpeg);
  jpeg_start_compress(&jpeg, TRUE);
  Bytes pixels = image.pixels;
  while (jpeg.next_scanline < jpeg.image_height) {
    auto* row =
        reinterpret_cast<JSAMPROW>(&pixels[jpeg.next_scanline * std::size_t{4} * image.width]);
    jpeg_write_scanlines(&jpeg, &row, 1);
  }
  jpeg_finish_compress(&jpeg);
  const auto* begin = reinterpret_cast<const std::byte*>(file);
  Bytes bytes(begin, begin + size);
  jpeg_destroy_compress(&jpeg);
  std::free(file);
  return bytes;
}

Bytes fileOf(Picture picture, benchmark::State& state) {
  const Image image = drawn(picture, static_cast<std::uint32_t>(state.range(0)));
  if (picture == Picture::Jpeg) return jpegOf(image);
  Bytes png;
  const auto encoder = PngEncoderService().create(png, "public.png", 1);
  encoder->addImage(image);
  encoder->finalize();
  return png;
}

/// Read, fitted into the device's icon, and encoded again.
void renderIcon(benchmark::State& state, Picture picture) {
  BenchPhone phone;
  const PropertyList::Dictionary info{{std::string(KBBundleIconFile), "Icon.png"}};
  phone.put("/tmp/Bench.app/Info.plist", *serializePropertyList(info, PropertyListFormat::Xml));
  phone.put("/tmp/Bench.app/Icon.png", fileOf(picture, state));
  const Platform& platform = phone.platform();
  const auto bundle = Bundle::open(platform.files, FileLocation::directory("/tmp/Bench.app"));
  const PeakMeter memory;
  for (auto _ : state) {
    const std::optional<Image> icon = platform.iconRenderer.renderHomeScreenIcon(*bundle);
    Bytes png;
    const auto encoder = platform.imageEncoders.create(png, "public.png", 1);
    if (icon) encoder->addImage(*icon);
    if (!encoder->finalize()) state.SkipWithError("no icon");
  }
  state.counters["peak_mib"] = memory.mostMib();
}

bool decodePng(const Bytes& png) {
  std::vector<png_byte> row;
  ByteView left = png;
  png_structp reader = png_create_read_struct(PNG_LIBPNG_VER_STRING, nullptr, nullptr, nullptr);
  png_infop info = png_create_info_struct(reader);
  if (setjmp(png_jmpbuf(reader))) return false;
  png_set_read_fn(reader, &left, [](png_structp from, png_bytep target, std::size_t size) {
    auto& bytes = *static_cast<ByteView*>(png_get_io_ptr(from));
    std::memcpy(target, bytes.data(), size);
    bytes = bytes.subspan(size);
  });
  png_read_info(reader, info);
  row.resize(png_get_rowbytes(reader, info));
  for (png_uint_32 y = 0; y < png_get_image_height(reader, info); ++y) {
    png_read_row(reader, row.data(), nullptr);
  }
  png_destroy_read_struct(&reader, &info, nullptr);
  return true;
}

bool decodeJpeg(const Bytes& file) {
  jpeg_decompress_struct jpeg{};
  jpeg_error_mgr errors{};
  jpeg.err = jpeg_std_error(&errors);
  jpeg_create_decompress(&jpeg);
  jpeg_mem_src(&jpeg, reinterpret_cast<const unsigned char*>(file.data()), file.size());
  jpeg_read_header(&jpeg, TRUE);
  jpeg_start_decompress(&jpeg);
  Bytes row(std::size_t{jpeg.output_width} * 3);
  auto* into = reinterpret_cast<JSAMPROW>(row.data());
  while (jpeg.output_scanline < jpeg.output_height) jpeg_read_scanlines(&jpeg, &into, 1);
  jpeg_finish_decompress(&jpeg);
  jpeg_destroy_decompress(&jpeg);
  return true;
}

/// Decoding the same picture with the same library, row by row, and dropping it.
void renderIcon_floor(benchmark::State& state, Picture picture) {
  const Bytes file = fileOf(picture, state);
  for (auto _ : state) {
    const bool decoded = picture == Picture::Jpeg ? decodeJpeg(file) : decodePng(file);
    if (!decoded) return state.SkipWithError("no picture");
  }
}

void ofIcons(benchmark::internal::Benchmark* benchmark) {
  benchmark->Arg(1024)->Unit(benchmark::kMillisecond)->UseRealTime()->MeasureProcessCPUTime();
}

BENCHMARK_CAPTURE(renderIcon, flat, Picture::FlatPng)->Apply(ofIcons);
BENCHMARK_CAPTURE(renderIcon_floor, flat, Picture::FlatPng)->Apply(ofIcons);
BENCHMARK_CAPTURE(renderIcon, photo, Picture::PhotoPng)->Apply(ofIcons);
BENCHMARK_CAPTURE(renderIcon_floor, photo, Picture::PhotoPng)->Apply(ofIcons);
BENCHMARK_CAPTURE(renderIcon, jpeg, Picture::Jpeg)->Apply(ofIcons);
BENCHMARK_CAPTURE(renderIcon_floor, jpeg, Picture::Jpeg)->Apply(ofIcons);

}  // namespace
}  // namespace appsync::bench

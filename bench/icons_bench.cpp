// What drawing one icon takes, beside decoding its picture.

#include <benchmark/benchmark.h>
#include <png.h>

#include <csetjmp>
#include <cstring>

#include "bench/bench_phone.h"
#include "platform/property_list_codec.h"

namespace appsync::bench {
namespace {

void renderIcon(benchmark::State& state) {
  BenchPhone phone;
  const PropertyList::Dictionary info{{std::string(KBBundleIconFile), "Icon.png"}};
  phone.put("/tmp/Bench.app/Info.plist", *serializePropertyList(info, PropertyListFormat::Xml));
  phone.put("/tmp/Bench.app/Icon.png", pngOf(static_cast<std::uint32_t>(state.range(0))));
  for (auto _ : state) {
    if (!phone.client()._makeIconFromBundlePath("/tmp/Bench.app", "/tmp/icon.png")) {
      state.SkipWithError("no icon");
    }
  }
}

/// Decoding the same picture with the same library, row by row, and dropping it.
void renderIcon_floor(benchmark::State& state) {
  const Bytes png = pngOf(static_cast<std::uint32_t>(state.range(0)));
  std::vector<png_byte> row;
  for (auto _ : state) {
    std::size_t offset = 0;
    png_structp reader = png_create_read_struct(PNG_LIBPNG_VER_STRING, nullptr, nullptr, nullptr);
    png_infop info = png_create_info_struct(reader);
    if (setjmp(png_jmpbuf(reader))) {
      state.SkipWithError("no picture");
      break;
    }
    std::pair<const Bytes*, std::size_t*> source{&png, &offset};
    png_set_read_fn(reader, &source, [](png_structp from, png_bytep target, std::size_t size) {
      const auto& [bytes, at] =
          *static_cast<std::pair<const Bytes*, std::size_t*>*>(png_get_io_ptr(from));
      std::memcpy(target, bytes->data() + *at, size);
      *at += size;
    });
    png_read_info(reader, info);
    row.resize(png_get_rowbytes(reader, info));
    for (png_uint_32 y = 0; y < png_get_image_height(reader, info); ++y) {
      png_read_row(reader, row.data(), nullptr);
    }
    benchmark::DoNotOptimize(row.data());
    png_destroy_read_struct(&reader, &info, nullptr);
  }
}

BENCHMARK(renderIcon)->Arg(1024)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(renderIcon_floor)->Arg(1024)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace
}  // namespace appsync::bench

// What the embedded device does for one package and for one icon.

#include <archive.h>
#include <archive_entry.h>
#include <benchmark/benchmark.h>
#include <png.h>

#include <csetjmp>
#include <cstring>
#include <fstream>

#include "bench/bench_phone.h"
#include "platform/property_list_codec.h"

namespace appsync::bench {
namespace {

/// Into a new folder, straight to disk, by the library alone.
bool extractPlainly(const std::filesystem::path& package, const std::filesystem::path& folder) {
  archive* reader = archive_read_new();
  archive_read_support_format_zip(reader);
  archive* writer = archive_write_disk_new();
  archive_entry* entry = nullptr;
  bool good = archive_read_open_filename(reader, package.c_str(), 64 << 10) == ARCHIVE_OK;
  while (good && archive_read_next_header(reader, &entry) == ARCHIVE_OK) {
    archive_entry_set_pathname(entry, (folder / archive_entry_pathname(entry)).c_str());
    good = archive_read_extract2(reader, entry, writer) == ARCHIVE_OK;
  }
  archive_write_free(writer);
  archive_read_free(reader);
  return good;
}

void installPackage(benchmark::State& state) {
  BenchPhone phone;
  TemporaryFolder folder;
  const std::filesystem::path package = folder.path() / "bench.zip";
  writePackage(package, static_cast<std::size_t>(state.range(0)));
  std::ifstream stream(package, std::ios::binary);
  const std::string bytes(std::istreambuf_iterator<char>(stream), {});
  const std::string onPhone = "/var/mobile/Media/PublicStaging/bench.zip";
  phone.put(onPhone, asBytes(bytes));
  for (auto _ : state) {
    std::optional<Error> error;
    const bool installed = phone.registry().installApplication(
        FileLocation::file(onPhone),
        {{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
         {std::string(KBBundleIdentifier), "org.example.bench"}},
        &error);
    if (!installed) state.SkipWithError(description(*error).c_str());
  }
  state.SetBytesProcessed(state.iterations() * state.range(0) * 1024 * 1024);
}

/// Plain extraction. What an install adds: the checks, bringing it all to the disk, the switch, and
/// the removal of the version before.
void installPackage_floor(benchmark::State& state) {
  TemporaryFolder folder;
  const std::filesystem::path package = folder.path() / "bench.zip";
  writePackage(package, static_cast<std::size_t>(state.range(0)));
  int round = 0;
  for (auto _ : state) {
    const std::filesystem::path target = folder.path() / std::to_string(round++);
    if (!extractPlainly(package, target)) state.SkipWithError("cannot extract");
    state.PauseTiming();
    std::filesystem::remove_all(target);
    state.ResumeTiming();
  }
  state.SetBytesProcessed(state.iterations() * state.range(0) * 1024 * 1024);
}

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

BENCHMARK(installPackage)->Arg(1)->Arg(32)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(installPackage_floor)->Arg(1)->Arg(32)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(renderIcon)->Arg(1024)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(renderIcon_floor)->Arg(1024)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace
}  // namespace appsync::bench

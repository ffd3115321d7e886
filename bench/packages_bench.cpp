// What unpacking and installing one package takes, beside the archive library alone.

#include <archive.h>
#include <archive_entry.h>
#include <benchmark/benchmark.h>
#include <fcntl.h>

#include <fstream>

#include "base/file_descriptor.h"
#include "bench/bench_phone.h"
#include "bench/peak.h"
#include "packages/package_extractor.h"
#include "platform/installer_service.h"

namespace appsync::bench {
namespace {

namespace fs = std::filesystem;

/// A package of so many KiB, in a folder of its own: in memory, for a disk's own times would hide
/// what unpacking takes.
struct Sample {
  Sample(PackageForm form, benchmark::State& state) {
    writePackage(file, form, static_cast<std::size_t>(state.range(0)));
  }

  TemporaryFolder folder{"/dev/shm"};
  const fs::path file = folder.path() / "package";
};

/// Has `unpack` unpack into a new folder each time; the folder's end is not measured.
template <class Unpack>
void measureUnpacking(benchmark::State& state, const TemporaryFolder& folder, Unpack unpack) {
  int round = 0;
  for (auto _ : state) {
    const fs::path target = folder.path() / std::to_string(round++);
    fs::create_directory(target);
    if (!unpack(target)) state.SkipWithError("cannot unpack");
    state.PauseTiming();
    fs::remove_all(target);
    state.ResumeTiming();
  }
  state.SetBytesProcessed(state.iterations() * state.range(0) * 1024);
}

/// Checked and confined, but not brought to the disk.
void unpackPackage(benchmark::State& state, PackageForm form) {
  const Sample sample(form, state);
  const PeakMeter memory;
  measureUnpacking(state, sample.folder, [&](const fs::path& target) {
    const FileDescriptor package(::open(sample.file.c_str(), O_RDONLY | O_CLOEXEC));
    const FileDescriptor folder(::open(target.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return extractPackage(package.get(), folder.get(), std::nullopt, {}, nullptr).has_value();
  });
  state.counters["peak_mib"] = memory.mostMib();
}

/// Straight to the files, by the archive library alone.
bool unpackPlainly(const fs::path& package, const fs::path& target) {
  archive* reader = archive_read_new();
  archive_read_support_filter_all(reader);
  archive_read_support_format_zip(reader);
  archive_read_support_format_tar(reader);
  archive* writer = archive_write_disk_new();
  archive_entry* entry = nullptr;
  bool good = archive_read_open_filename(reader, package.c_str(), 64 << 10) == ARCHIVE_OK;
  while (good && archive_read_next_header(reader, &entry) == ARCHIVE_OK) {
    archive_entry_set_pathname(entry, (target / archive_entry_pathname(entry)).c_str());
    good = archive_read_extract2(reader, entry, writer) == ARCHIVE_OK;
  }
  archive_write_free(writer);
  archive_read_free(reader);
  return good;
}

void unpackPackage_floor(benchmark::State& state, PackageForm form) {
  const Sample sample(form, state);
  measureUnpacking(state, sample.folder,
                   [&](const fs::path& target) { return unpackPlainly(sample.file, target); });
}

/// What an install adds: bringing it all to the disk, the switch, and the removal of the version
/// before.
void installPackage(benchmark::State& state, PackageForm form) {
  const Sample sample(form, state);
  BenchPhone phone;
  std::ifstream stream(sample.file, std::ios::binary);
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
  state.SetBytesProcessed(state.iterations() * state.range(0) * 1024);
}

void ofPackages(benchmark::internal::Benchmark* benchmark) {
  benchmark->Arg(64)->Arg(32 << 10)->Unit(benchmark::kMillisecond)->UseRealTime();
  benchmark->MeasureProcessCPUTime();
}

BENCHMARK_CAPTURE(unpackPackage, deflate, PackageForm::Deflate)->Apply(ofPackages);
BENCHMARK_CAPTURE(unpackPackage_floor, deflate, PackageForm::Deflate)->Apply(ofPackages);
BENCHMARK_CAPTURE(unpackPackage, deflateLarge, PackageForm::DeflateLarge)->Apply(ofPackages);
BENCHMARK_CAPTURE(unpackPackage_floor, deflateLarge, PackageForm::DeflateLarge)->Apply(ofPackages);
BENCHMARK_CAPTURE(unpackPackage, store, PackageForm::Store)->Apply(ofPackages);
BENCHMARK_CAPTURE(unpackPackage_floor, store, PackageForm::Store)->Apply(ofPackages);
BENCHMARK_CAPTURE(unpackPackage, zst, PackageForm::TarZst)->Apply(ofPackages);
BENCHMARK_CAPTURE(unpackPackage_floor, zst, PackageForm::TarZst)->Apply(ofPackages);
BENCHMARK_CAPTURE(installPackage, deflate, PackageForm::Deflate)->Apply(ofPackages);

}  // namespace
}  // namespace appsync::bench

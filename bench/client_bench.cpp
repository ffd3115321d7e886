// What the client's own operations cost on an embedded device.

#include <benchmark/benchmark.h>

#include "bench/bench_phone.h"
#include "bench/memory.h"
#include "platform/property_list_codec.h"

namespace appsync::bench {
namespace {

void changeAssetID(benchmark::State& state) {
  BenchPhone phone;
  const auto entries = static_cast<std::size_t>(state.range(0));
  phone.putTodoList(entries, false);
  const std::string identifier = identifierOf(entries - 1);
  const MemoryMeter memory;
  phone.client().changeAssetID(identifier, "INSTALLED");  // the first one checks the list
  bool sent = false;
  for (auto _ : state) {
    sent = !sent;
    phone.client().changeAssetID(identifier, sent ? "DOWNLOADED" : "INSTALLED");
  }
  state.counters["bytes_per_entry"] = static_cast<double>(memory.most() / entries);
}

/// The same of a list that the client has not seen before, which it checks once.
void changeAssetID_ofANewList(benchmark::State& state) {
  BenchPhone phone;
  const auto entries = static_cast<std::size_t>(state.range(0));
  const std::string identifier = identifierOf(entries - 1);
  for (auto _ : state) {
    state.PauseTiming();
    phone.putTodoList(entries, false);
    state.ResumeTiming();
    phone.client().changeAssetID(identifier, "DOWNLOADED");
  }
}

void readOperation(benchmark::State& state) {
  BenchPhone phone;
  const auto entries = static_cast<std::size_t>(state.range(0));
  phone.putTodoList(entries, false);
  const std::string identifier = identifierOf(entries / 2);
  const MemoryMeter memory;
  phone.client()._operationStateForIdentifier(identifier);  // the first one checks the list
  for (auto _ : state) {
    if (phone.client()._operationStateForIdentifier(identifier) != "install")
      return state.SkipWithError("no operation");
  }
  state.counters["bytes_per_entry"] = static_cast<double>(memory.most() / entries);
}

/// Reading the file.
void readOperation_floor(benchmark::State& state) {
  BenchPhone phone;
  phone.putTodoList(static_cast<std::size_t>(state.range(0)), false);
  for (auto _ : state) benchmark::DoNotOptimize(phone.files().contentsAtPath(TodoList));
}

/// Reading the file and replacing it atomically with the same bytes.
void changeAssetID_floor(benchmark::State& state) {
  BenchPhone phone;
  phone.putTodoList(static_cast<std::size_t>(state.range(0)), false);
  for (auto _ : state) {
    const std::optional<Bytes> bytes = phone.files().contentsAtPath(TodoList);
    phone.files().writeAtomically(TodoList, *bytes);
  }
}

void outstandingAssetTransfers(benchmark::State& state) {
  const auto entries = static_cast<std::size_t>(state.range(0));
  for (auto _ : state) {
    state.PauseTiming();
    auto phone = std::make_unique<BenchPhone>();
    phone->putTodoList(entries, true);
    state.ResumeTiming();
    if (phone->client().outstandingAssetTransfers().size() != entries) {
      return state.SkipWithError("packages are missing");
    }
    state.PauseTiming();
    phone.reset();
    state.ResumeTiming();
  }
  state.counters["per_entry"] = benchmark::Counter(
      static_cast<double>(entries),
      benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

/// What each entry needs of the phone whoever asks: its icon drawn and saved, its bundle directory
/// and Info.plist written, and its placeholder installed.
void outstandingAssetTransfers_floor(benchmark::State& state) {
  const auto entries = static_cast<std::size_t>(state.range(0));
  for (auto _ : state) {
    state.PauseTiming();
    auto phone = std::make_unique<BenchPhone>();
    phone->putTodoList(entries, true);
    const Platform& platform = phone->platform();
    state.ResumeTiming();
    for (std::size_t index = 0; index < entries; ++index) {
      const std::string identifier = identifierOf(index);
      const std::string path = "/tmp/" + identifier + ".app";
      const auto bundle =
          Bundle::open(platform.files, FileLocation::directory(WorkArea + "/" + identifier));
      const std::optional<Image> icon = platform.iconRenderer.renderHomeScreenIcon(*bundle);
      Bytes png;
      const auto encoder = platform.imageEncoders.create(png, "public.png", 1);
      encoder->addImage(*icon);
      encoder->finalize();
      platform.files.createDirectory(path, true, {});
      platform.files.writeAtomically(path + "/Icon.png", png);
      platform.files.writeAtomically(
          path + "/Info.plist", *platform.files.contentsAtPath(bundle->path() + "/Info.plist"));
      const bool installed = platform.appRegistry.installApplication(
          FileLocation::directory(path),
          {{std::string(SWPackageTypeKey), SWPackageTypePlaceholder},
           {std::string(KBBundleIdentifier), identifier},
           {std::string(SWInstallTypeKey), 4}},
          nullptr);
      if (!installed) return state.SkipWithError("a placeholder was refused");
    }
    state.PauseTiming();
    phone.reset();
    state.ResumeTiming();
  }
}

void ofTodoLists(benchmark::internal::Benchmark* benchmark) {
  benchmark->RangeMultiplier(10)->Range(100, 100'000)->Unit(benchmark::kMicrosecond)->UseRealTime();
}

BENCHMARK(changeAssetID)->Apply(ofTodoLists);
BENCHMARK(changeAssetID_floor)->Apply(ofTodoLists);
BENCHMARK(changeAssetID_ofANewList)->Apply(ofTodoLists);
BENCHMARK(readOperation)->Apply(ofTodoLists);
BENCHMARK(readOperation_floor)->Apply(ofTodoLists);
BENCHMARK(outstandingAssetTransfers)
    ->Arg(100)
    ->Arg(1000)
    ->Arg(10000)
    ->Iterations(1)
    ->Repetitions(1)
    ->Unit(benchmark::kMillisecond)
    ->UseRealTime();
BENCHMARK(outstandingAssetTransfers_floor)
    ->Arg(100)
    ->Arg(1000)
    ->Arg(10000)
    ->Iterations(1)
    ->Repetitions(1)
    ->Unit(benchmark::kMillisecond)
    ->UseRealTime();

}  // namespace
}  // namespace appsync::bench

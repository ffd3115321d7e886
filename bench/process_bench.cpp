// A sync with nothing to do, from the start of the process to its end.

#include <benchmark/benchmark.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <vector>

#include "bench/bench_phone.h"

namespace appsync::bench {
namespace {

/// The exit code; -1 when it could not be run.
int run(std::vector<std::string> arguments) {
  std::vector<char*> argv;
  for (std::string& argument : arguments) argv.push_back(argument.data());
  argv.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", 1 /* O_WRONLY */, 0);
  pid_t child = 0;
  const int failed = posix_spawn(&child, APPSYNC_COMMAND, &actions, nullptr, argv.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  int status = 0;
  if (failed || waitpid(child, &status, 0) != child || !WIFEXITED(status)) return -1;
  return WEXITSTATUS(status);
}

void emptySync(benchmark::State& state) {
  TemporaryFolder folder;
  const std::string phone = folder.path() / "phone";
  const std::string library = folder.path() / "library";
  std::filesystem::create_directory(library);
  if (run({"appsync", "--device", phone, "init"}) != 0) state.SkipWithError("no device");
  for (auto _ : state) {
    if (run({"appsync", "--device", phone, "sync", library}) != 0) state.SkipWithError("no sync");
  }
}

/// The same process, linked and loaded, that only prints its version.
void emptySync_floor(benchmark::State& state) {
  for (auto _ : state) {
    if (run({"appsync", "--version"}) != 0) state.SkipWithError("no version");
  }
}

BENCHMARK(emptySync)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(emptySync_floor)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace
}  // namespace appsync::bench

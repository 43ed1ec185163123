// Rating a real file in-process: open it, sniff and rate it through the
// plug-in as the framework does, and count the bytes the plug-in read. A
// long file's rating reads its headers and jumps to the first Cluster, so
// its cost must not grow with the file.
//   KELVANE_PLUGIN=.../kelvane.so KELVANE_RATING_FILE=a.mkv rating_bench

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "host/graph_setup.h"
#include "host/input_streams.h"
#include "host/plugin_loader.h"

namespace {

void BM_Rating(benchmark::State& state) {
  const char* plugin_path = std::getenv("KELVANE_PLUGIN");
  const char* path = std::getenv("KELVANE_RATING_FILE");
  if (!plugin_path || !path) {
    state.SkipWithError("set KELVANE_PLUGIN and KELVANE_RATING_FILE");
    return;
  }
  std::string error;
  static std::unique_ptr<host::Plugin> plugin = host::Plugin::Load(plugin_path, &error);
  if (!plugin) {
    state.SkipWithError(error.c_str());
    return;
  }
  host::SetupOptions options;
  options.configure_outputs = false;
  uint64_t bytes = 0;
  int rating = 0;
  for (auto _ : state) {
    auto stream = host::OpenFileStream(path, true);
    if (!stream) {
      state.SkipWithError("cannot open the file");
      return;
    }
    {
      host::FilterGraph graph(*plugin, *stream, options);
      rating = graph.rating();
    }
    bytes = stream->counters().bytes_read;
  }
  state.counters["rating"] = rating;
  state.counters["bytes_read"] = static_cast<double>(bytes);
}

}  // namespace

BENCHMARK(BM_Rating)->Unit(benchmark::kMicrosecond);

BENCHMARK_MAIN();

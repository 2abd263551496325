// Streaming throughput of the `reliqa` tool as a model owner runs it: the
// built program, started once per iteration, reading JSON Lines of 50-asset
// collections from a file on standard input and writing its answers to
// /dev/null. `classify -` scores with the example model in a SQLite store;
// `features -` only reads and extracts. The goal: at least 20,000
// collections/s on one core. Wall time is measured (the work happens in the
// child), and the counter "collections/s" is the figure to read.
//
// Run the non-AVX-512 path of simdjson with SIMDJSON_FORCE_IMPLEMENTATION=haswell
// (or =fallback for no SIMD at all); the child inherits the environment.
#include <benchmark/benchmark.h>
#include <fmt/format.h>
#include <spawn.h>
#include <sys/wait.h>
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <fstream>
#include <random>
#include <stdexcept>
#include <string>
#include <vector>

#include "bench/cpu_flags.h"
#include "host/keystash/testing/TemporaryDirectory.h"

extern char** environ;

namespace {

using kestrova::mobile::xplat::keystash::TemporaryDirectory;

constexpr int kLines = 4000;        // per run of the tool
constexpr int kDistinct = 40;       // different collections, repeated in turn
constexpr int kAssets = 50;

// One collection as the app would log it: compact JSON on one line.
std::string collectionLine(std::mt19937_64& rng, int index) {
  std::uniform_int_distribution<int64_t> date(1500000000, 1700000000);
  std::uniform_real_distribution<double> unit(0.0, 1.0);
  std::string s = fmt::format(
      R"({{"collectionID":"bench-{}","timeSinceStory":{},"locationInfo":{{"name":"Harbour","isLandmark":true,)"
      R"("longitude":4.9,"latitude":52.4}},"assetCounts":{{"tileCount":12,"totalAssetsCount":{},"photosCount":40,)"
      R"("burstCount":1,"videosCount":10,"loopsCount":0,"totalAssetsWithinBurstsCount":3,)"
      R"("totalAssetsWithinLoopsCount":0,"facesCount":12,"photosWithFacesCount":9}},"assetDetails":[)",
      index, 3600.0 * (1 + index % 72), kAssets);
  for (int i = 0; i < kAssets; ++i) {
    int64_t created = date(rng);
    s += fmt::format(
        R"({}{{"assetID":"C{:05}-A{:03}","assetType":"{}","creationDateSinceEpoch":{},)"
        R"("modificationDateSinceEpoch":{},"pixelWidth":4032.0,"pixelHeight":3024.0,"latitude":{},)"
        R"("longitude":{},"videoDuration":{},"isFavorite":{},"isHidden":0,"mediaSubtypes":{},"sourceType":1,)"
        R"("blurrinessMetric":{{"isCalculated":{},"value":{}}},"darknessMetric":{{"isCalculated":{},"value":{}}}}})",
        i == 0 ? "" : ",", index, i, i % 5 == 0 ? "video" : "photo", created,
        i % 3 == 0 ? int64_t{-1} : created + 3600, 52.0 + unit(rng), 4.0 + unit(rng),
        i % 5 == 0 ? 12.5 : 0.0, i % 7 == 0 ? 1 : 0, i % 4, i % 2 == 0 ? "true" : "false", unit(rng),
        i % 3 != 0 ? "true" : "false", unit(rng));
  }
  s += R"(],"duplicateInfos":[)";
  for (int i = 0; i + 1 < kAssets; i += 10) {
    s += fmt::format(R"({}{{"assetIdA":"C{:05}-A{:03}","assetIdB":"C{:05}-A{:03}","dupeCoefficient":{}}})",
                     i == 0 ? "" : ",", index, i, index, i + 1, unit(rng));
  }
  return s + "]}\n";
}

// Runs the tool with `args`, standard input from `input` (or none), output
// discarded; throws unless it exits with 0.
void runTool(const std::vector<std::string>& args, const std::string& input) {
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 0, input.empty() ? "/dev/null" : input.c_str(), O_RDONLY, 0);
  posix_spawn_file_actions_addopen(&actions, 1, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addopen(&actions, 2, "/dev/null", O_WRONLY, 0);
  std::vector<char*> argv;
  std::string tool = RELIQA_TOOL;
  argv.push_back(tool.data());
  std::vector<std::string> copies(args);
  for (std::string& a : copies) argv.push_back(a.data());
  argv.push_back(nullptr);
  pid_t pid = 0;
  int rc = posix_spawn(&pid, tool.c_str(), &actions, nullptr, argv.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  if (rc != 0) throw std::runtime_error("cannot start " + tool);
  int status = 0;
  while (waitpid(pid, &status, 0) < 0) {
    if (errno != EINTR) throw std::runtime_error("cannot wait for " + tool);
  }
  if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) {
    throw std::runtime_error(tool + " " + args.front() + " failed");
  }
}

// The input file and the store, made once for every benchmark.
struct Fixture {
  TemporaryDirectory dir;
  std::string input = dir.file("collections.jsonl");
  std::string store = dir.file("store.db");
  size_t bytes = 0;

  Fixture() {
    std::mt19937_64 rng(7);
    std::vector<std::string> lines;
    for (int i = 0; i < kDistinct; ++i) lines.push_back(collectionLine(rng, i));
    std::ofstream out(input, std::ios::binary);
    for (int i = 0; i < kLines; ++i) {
      out << lines[i % kDistinct];
      bytes += lines[i % kDistinct].size();
    }
    out.close();
    if (!out) throw std::runtime_error("cannot write " + input);
    runTool({"set-model", "--store", store, "--model", EXAMPLE_MODEL, "--model-id", "example", "--threshold", "0.5"},
            "");
  }
};

Fixture& fixture() {
  static Fixture f;  // read-only once made
  return f;
}

void streamThroughTool(benchmark::State& state, bool classify) {
  Fixture& f = fixture();
  std::vector<std::string> args = classify ? std::vector<std::string>{"classify", "--store", f.store, "-"}
                                           : std::vector<std::string>{"features", "-"};
  for (auto _ : state) runTool(args, f.input);
  state.counters["collections/s"] =
      benchmark::Counter(static_cast<double>(state.iterations()) * kLines, benchmark::Counter::kIsRate);
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * f.bytes));
}

void BM_ClassifyStream50(benchmark::State& state) { streamThroughTool(state, true); }
BENCHMARK(BM_ClassifyStream50)->Unit(benchmark::kMillisecond)->UseRealTime()->MinTime(2.0);

void BM_FeaturesStream50(benchmark::State& state) { streamThroughTool(state, false); }
BENCHMARK(BM_FeaturesStream50)->Unit(benchmark::kMillisecond)->UseRealTime()->MinTime(2.0);

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  benchmark::AddCustomContext("cpu_flags", reliqa::bench::cpuFlags());
  const char* forced = std::getenv("SIMDJSON_FORCE_IMPLEMENTATION");
  benchmark::AddCustomContext("simdjson_implementation", forced ? forced : "best available");
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}

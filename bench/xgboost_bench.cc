// Side by side: XGBoost's own predictor (C API, one row per call) and our
// compiled forest, on the same models and the same float rows.
//
// The models are XGBoost models of 100 trees of depth 6, 500 of depth 6 and
// 2000 of depth 8 over 74 features, and their conversions by
// `reliqa convert xgboost`; build the target xgboost_bench_models to make
// them (or pass their directory as the first argument). Before timing, every
// row is scored by both, and the verdicts at 0.5 and the largest score
// difference are reported. After the run a table gives both times per row and
// their ratio, for the walk this CPU picks (BM_Reliqa) and for the scalar walk
// that machines without AVX-512 run (BM_ReliqaPortable, forced here).
//
// Model load, on m2000_d8: XGBoost reading its own UBJSON bytes
// (BM_XgboostLoad) against a BoostingModel built from the converted model text
// (BM_ReliqaLoad, laying the trees out for the walk this CPU picks;
// BM_ReliqaLoadPortable, for the scalar walk), both held in memory, each model
// freed again within the timing. The table uses wall time, so that work a
// library hands to other threads is counted.
#include <benchmark/benchmark.h>
#include <glog/logging.h>
#include <unistd.h>
#include <xgboost/c_api.h>

#include <cinttypes>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <map>
#include <memory>
#include <random>
#include <set>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "bench/cpu_flags.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsemble-inl.h"

namespace {

constexpr int kFeatures = 74;
constexpr int kRows = 1024;
const char* const kModels[] = {"m100_d6", "m500_d6", "m2000_d8"};
const char* const kLoadModel = "m2000_d8";

void check(int rc, const char* what) {
  if (rc != 0) throw std::runtime_error(std::string(what) + ": " + XGBGetLastError());
}

std::string readAll(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  if (!in) throw std::runtime_error("cannot read " + path + " (build the target xgboost_bench_models first)");
  std::ostringstream s;
  s << in.rdbuf();
  return s.str();
}

// The same rows for both sides: floats drawn like the training data.
std::vector<std::vector<float>> makeRows() {
  std::mt19937_64 rng(20261123);
  std::normal_distribution<float> normal;
  std::vector<std::vector<float>> rows(kRows, std::vector<float>(kFeatures));
  for (auto& row : rows) {
    for (float& v : row) v = normal(rng);
  }
  return rows;
}

class XgboostModel {
 public:
  explicit XgboostModel(const std::string& path) {
    check(XGBoosterCreate(nullptr, 0, &booster_), "XGBoosterCreate");
    check(XGBoosterLoadModel(booster_, path.c_str()), "XGBoosterLoadModel");
    check(XGBoosterSetParam(booster_, "nthread", "1"), "XGBoosterSetParam");
    check(XGProxyDMatrixCreate(&proxy_), "XGProxyDMatrixCreate");
  }
  ~XgboostModel() {
    XGDMatrixFree(proxy_);
    XGBoosterFree(booster_);
  }
  XgboostModel(const XgboostModel&) = delete;
  XgboostModel& operator=(const XgboostModel&) = delete;

  // The array-interface text of one row; made once per row, outside timing.
  static std::string arrayInterface(const std::vector<float>& row) {
    char buf[160];
    std::snprintf(buf, sizeof buf,
                  "{\"data\": [%" PRIuPTR ", true], \"shape\": [1, %d], \"typestr\": \"<f4\", \"version\": 3}",
                  reinterpret_cast<uintptr_t>(row.data()), kFeatures);
    return buf;
  }

  float predict(const std::string& rowInterface) const {
    static const char* config =
        "{\"type\": 0, \"training\": false, \"iteration_begin\": 0, \"iteration_end\": 0, "
        "\"strict_shape\": false, \"missing\": NaN, \"cache_id\": 0}";
    const bst_ulong* shape = nullptr;
    bst_ulong dim = 0;
    const float* result = nullptr;
    check(XGBoosterPredictFromDense(booster_, rowInterface.c_str(), config, proxy_, &shape, &dim, &result),
          "XGBoosterPredictFromDense");
    return result[0];
  }

 private:
  BoosterHandle booster_ = nullptr;
  DMatrixHandle proxy_ = nullptr;
};

// The model's forest compiled again, to be walked by `kernel`; null when the
// CPU cannot run it.
std::unique_ptr<thornvale::FastTreeEnsemble<float>> compiledFor(const thornvale::BoostingModel& model,
                                                                thornvale::WalkKernel kernel) {
  if (!thornvale::walkKernelSupported(kernel)) return nullptr;
  auto compile = [&](auto ensemble) -> std::unique_ptr<thornvale::FastTreeEnsemble<float>> {
    if (!ensemble->init(&model.getForest(), false)) return nullptr;
    return ensemble;
  };
  if (model.uses16BitForest()) {
    return compile(std::make_unique<thornvale::FastTreeEnsembleOOP<short, unsigned>>(kernel));
  }
  return compile(std::make_unique<thornvale::FastTreeEnsembleOOP<int, unsigned>>(kernel));
}

struct Pair {
  std::unique_ptr<XgboostModel> xgboost;
  std::unique_ptr<thornvale::BoostingModel> ours;
  std::unique_ptr<thornvale::FastTreeEnsemble<float>> portable;  // the scalar walk
};

std::string gModelDir = RELIQA_XGBOOST_BENCH_MODELS;
std::vector<std::vector<float>> gRows;
std::vector<std::string> gInterfaces;
std::map<std::string, Pair> gPairs;

Pair& pairFor(const std::string& name) {
  auto it = gPairs.find(name);
  if (it != gPairs.end()) return it->second;
  Pair p;
  p.xgboost = std::make_unique<XgboostModel>(gModelDir + "/" + name + ".json");
  p.ours = std::make_unique<thornvale::BoostingModel>(readAll(gModelDir + "/" + name + ".txt"));
  p.portable = compiledFor(*p.ours, thornvale::WalkKernel::kScalar);
  return gPairs.emplace(name, std::move(p)).first->second;
}

void BM_Xgboost(benchmark::State& state, const char* name) {
  Pair& p = pairFor(name);
  size_t i = 0;
  for (auto _ : state) {
    benchmark::DoNotOptimize(p.xgboost->predict(gInterfaces[i]));
    i = (i + 1) % gInterfaces.size();
  }
}

void scoreRows(benchmark::State& state, const thornvale::FastTreeEnsemble<float>& forest) {
  size_t i = 0;
  for (auto _ : state) {
    benchmark::DoNotOptimize(forest.score(gRows[i]));
    i = (i + 1) % gRows.size();
  }
}

void BM_Reliqa(benchmark::State& state, const char* name) { scoreRows(state, pairFor(name).ours->getEnsemble()); }

void BM_ReliqaPortable(benchmark::State& state, const char* name) {
  Pair& p = pairFor(name);
  if (!p.portable) return state.SkipWithError("the model cannot be compiled for the scalar walk");
  scoreRows(state, *p.portable);
}

void BM_XgboostLoad(benchmark::State& state, const char* name) {
  const std::string bytes = readAll(gModelDir + "/" + name + ".ubj");
  for (auto _ : state) {
    BoosterHandle booster = nullptr;
    check(XGBoosterCreate(nullptr, 0, &booster), "XGBoosterCreate");
    check(XGBoosterLoadModelFromBuffer(booster, bytes.data(), bytes.size()), "XGBoosterLoadModelFromBuffer");
    XGBoosterFree(booster);
  }
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * bytes.size()));
}

void loadModels(benchmark::State& state, const char* name, thornvale::WalkKernel kernel) {
  const std::string text = readAll(gModelDir + "/" + name + ".txt");
  for (auto _ : state) benchmark::DoNotOptimize(std::make_unique<thornvale::BoostingModel>(text, kernel));
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * text.size()));
}

void BM_ReliqaLoad(benchmark::State& state, const char* name) {
  loadModels(state, name, thornvale::bestWalkKernel());
}

void BM_ReliqaLoadPortable(benchmark::State& state, const char* name) {
  loadModels(state, name, thornvale::WalkKernel::kScalar);
}

// Verdicts at 0.5 and the largest score difference over all rows.
void compareScores() {
  std::printf("%-10s %8s %20s %18s\n", "model", "rows", "verdict mismatches", "max |score diff|");
  for (const char* name : kModels) {
    Pair& p = pairFor(name);
    int mismatches = 0;
    double worst = 0.0;
    for (size_t i = 0; i < gRows.size(); ++i) {
      double theirs = p.xgboost->predict(gInterfaces[i]);
      double ours = p.ours->getEnsemble().score(gRows[i]);
      mismatches += (theirs > 0.5) != (ours > 0.5);
      worst = std::max(worst, std::fabs(theirs - ours));
    }
    std::printf("%-10s %8zu %20d %18.3g\n", name, gRows.size(), mismatches, worst);
  }
  std::printf("\n");
}

// Prints the usual console output, then both times per row and their ratio.
class RatioReporter : public benchmark::ConsoleReporter {
 public:
  RatioReporter() : ConsoleReporter(isatty(STDOUT_FILENO) ? OO_ColorTabular : OO_Tabular) {}

  // With repetitions, the mean of the repetitions is used.
  void ReportRuns(const std::vector<Run>& runs) override {
    ConsoleReporter::ReportRuns(runs);
    for (const Run& r : runs) {
      if (!r.error_message.empty()) continue;
      bool mean = r.run_type == Run::RT_Aggregate && r.aggregate_name == "mean";
      if (mean || (r.run_type == Run::RT_Iteration && !means_.count(r.run_name.function_name))) {
        times_[r.run_name.function_name] = r.GetAdjustedRealTime();
        if (mean) means_.insert(r.run_name.function_name);
      }
    }
  }
  void Finalize() override {
    ConsoleReporter::Finalize();
    std::printf("\n%-10s %16s %16s %10s %22s %10s\n", "model", "XGBoost us/row", "reliqa us/row", "ratio",
                "reliqa portable us/row", "ratio");
    for (const char* name : kModels) {
      double x = timeOf("BM_Xgboost/", name), r = timeOf("BM_Reliqa/", name),
             p = timeOf("BM_ReliqaPortable/", name);
      if (x <= 0) continue;
      std::printf("%-10s %16.3f %16.3f %9.1fx %22.3f %9.1fx\n", name, x, r, r > 0 ? x / r : 0.0, p,
                  p > 0 ? x / p : 0.0);
    }
    double xl = timeOf("BM_XgboostLoad/", kLoadModel);
    for (auto [load, walk] : {std::pair{"BM_ReliqaLoad/", "this CPU's"}, std::pair{"BM_ReliqaLoadPortable/", "portable"}}) {
      double rl = timeOf(load, kLoadModel);
      if (xl > 0 && rl > 0) {
        std::printf("\nload %s: XGBoost (UBJSON) %.1f ms, reliqa (model text, %s walk) %.1f ms, reliqa/XGBoost %.2f",
                    kLoadModel, xl, walk, rl, rl / xl);
      }
    }
    std::printf("\n");
  }

 private:
  // Microseconds per row (milliseconds per load), 0 when it did not run.
  double timeOf(const char* benchmark, const char* model) const {
    auto it = times_.find(std::string(benchmark) + model);
    return it == times_.end() ? 0.0 : it->second;
  }

  std::map<std::string, double> times_;
  std::set<std::string> means_;
};

}  // namespace

int main(int argc, char** argv) {
  google::InitGoogleLogging(argv[0]);
  FLAGS_minloglevel = google::GLOG_WARNING;  // the engine logs each model load at INFO
  benchmark::Initialize(&argc, argv);
  benchmark::AddCustomContext("cpu_flags", reliqa::bench::cpuFlags());
  if (argc > 1) gModelDir = argv[1];
  gRows = makeRows();
  for (const auto& row : gRows) gInterfaces.push_back(XgboostModel::arrayInterface(row));
  try {
    compareScores();
  } catch (const std::exception& e) {
    std::fprintf(stderr, "xgboost_bench: %s\n", e.what());
    gPairs.clear();
    return 2;
  }
  for (const char* name : kModels) {
    benchmark::RegisterBenchmark((std::string("BM_Xgboost/") + name).c_str(), BM_Xgboost, name)
        ->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark((std::string("BM_Reliqa/") + name).c_str(), BM_Reliqa, name)
        ->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark((std::string("BM_ReliqaPortable/") + name).c_str(), BM_ReliqaPortable, name)
        ->Unit(benchmark::kMicrosecond);
  }
  benchmark::RegisterBenchmark((std::string("BM_XgboostLoad/") + kLoadModel).c_str(), BM_XgboostLoad, kLoadModel)
      ->Unit(benchmark::kMillisecond)
      ->UseRealTime();
  benchmark::RegisterBenchmark((std::string("BM_ReliqaLoad/") + kLoadModel).c_str(), BM_ReliqaLoad, kLoadModel)
      ->Unit(benchmark::kMillisecond)
      ->UseRealTime();
  benchmark::RegisterBenchmark((std::string("BM_ReliqaLoadPortable/") + kLoadModel).c_str(), BM_ReliqaLoadPortable,
                               kLoadModel)
      ->Unit(benchmark::kMillisecond)
      ->UseRealTime();
  RatioReporter reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);
  benchmark::Shutdown();
  gPairs.clear();  // before the XGBoost library's own globals go away
  return 0;
}

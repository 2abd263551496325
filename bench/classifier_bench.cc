// Feature extraction of 50 and 1000 assets; classify() end to end on a
// 50-asset collection with a 500-tree, depth-6 model over 74 inputs in the
// SQLite store, beside predict() alone on the same merged features. The goal:
// the whole classification costs at most 3 times the scoring.
#include <benchmark/benchmark.h>
#include <glog/logging.h>

#include <memory>
#include <random>
#include <string>

#include "host/keystash/SqliteKeyValueStore.h"
#include "host/keystash/testing/TemporaryDirectory.h"
#include "reliqaclassifier/FeatureExtraction.h"
#include "reliqaclassifier/ReliqasClassifier.h"
#include "bench/cpu_flags.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/RandomForests.h"

namespace {

using kestrova::mobile::xplat::keystash::SqliteKeyValueStore;
using kestrova::mobile::xplat::keystash::TemporaryDirectory;
using namespace kestrova::reliqaclassifier;

ReliqaClassifierInput collectionOf(int assets) {
  std::mt19937_64 rng(42);
  std::uniform_int_distribution<int64_t> date(1500000000, 1700000000);
  std::uniform_real_distribution<double> unit(0.0, 1.0);
  ReliqaClassifierInput input;
  input.timeSinceStory = 86400.0 * 3;
  input.locationInfo = LocationInfo{"Harbour", true, 4.9, 52.4};
  input.assetCounts = {assets, assets, assets - assets / 5, 1, assets / 5, 0, 3, 0, 12, 9};
  for (int i = 0; i < assets; ++i) {
    AssetDetail asset;
    asset.assetID = "asset-" + std::to_string(i);
    asset.creationDateSinceEpoch = date(rng);
    asset.modificationDateSinceEpoch = i % 3 == 0 ? -1 : asset.creationDateSinceEpoch + 3600;
    asset.pixelWidth = 4032;
    asset.pixelHeight = 3024;
    asset.latitude = 52.0 + unit(rng);
    asset.longitude = 4.0 + unit(rng);
    asset.videoDuration = i % 5 == 0 ? 12.5 : 0.0;
    asset.isFavorite = i % 7 == 0;
    asset.mediaSubtypes = i % 4;
    asset.sourceType = 1;
    asset.blurrinessMetric = {i % 2 == 0, unit(rng)};
    asset.darknessMetric = {i % 3 != 0, unit(rng)};
    input.assetDetails.push_back(asset);
  }
  for (int i = 0; i + 1 < assets; i += 10) input.duplicateInfos.push_back({"a", "b", unit(rng)});
  return input;
}

std::string benchmarkModel() {
  return thornvale::writeModel(thornvale::test::randomForest(7, 500, 6, 74), 3);
}

const FeatureMap kServerFeatures = {{4, 48.0}, {1001, 0.5}, {1002, 2.0}};

void BM_ExtractFeatures(benchmark::State& state) {
  const ReliqaClassifierInput input = collectionOf(static_cast<int>(state.range(0)));
  for (auto _ : state) benchmark::DoNotOptimize(extractFeatures(input));
}
BENCHMARK(BM_ExtractFeatures)->Arg(50)->Arg(1000);

void BM_Classify50(benchmark::State& state) {
  TemporaryDirectory dir;
  ReliqasClassifier classifier(std::make_shared<SqliteKeyValueStore>(dir.file("store.db")));
  classifier.setModelParams({benchmarkModel(), "bench-model", 0.5});
  classifier.setServerFeatures(kServerFeatures);
  const ReliqaClassifierInput input = collectionOf(50);
  for (auto _ : state) benchmark::DoNotOptimize(classifier.classify(input));
}
BENCHMARK(BM_Classify50);

void BM_Predict50(benchmark::State& state) {
  const thornvale::BoostingModel model(benchmarkModel());
  FeatureMap features = kServerFeatures;
  const FeatureMap computed = extractFeatures(collectionOf(50));
  for (const auto& [id, value] : computed) features.emplace(id, value);
  for (auto _ : state) benchmark::DoNotOptimize(model.predict(features));
}
BENCHMARK(BM_Predict50);

}  // namespace

int main(int argc, char** argv) {
  FLAGS_minloglevel = google::GLOG_WARNING;  // no per-prediction INFO lines in either benchmark
  benchmark::Initialize(&argc, argv);
  benchmark::AddCustomContext("cpu_flags", reliqa::bench::cpuFlags());
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}

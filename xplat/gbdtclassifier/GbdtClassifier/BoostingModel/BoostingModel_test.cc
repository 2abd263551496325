#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <thread>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/RandomForests.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/TreeBuilders.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/LogCapture.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/SmallStack.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/StdoutCapture.h"

namespace thornvale {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using test::leaf;
using test::LogCapture;
using test::split;
using test::weighted;

// A model from `text`, its version line on standard output discarded.
std::unique_ptr<BoostingModel> load(const std::string& text) {
  test::StdoutCapture discarded;  // ends with this function, however it ends
  return std::make_unique<BoostingModel>(text);
}

std::unique_ptr<BoostingModel> load(const Forest& f, int32_t version = 4) { return load(writeModel(f, version)); }

// Two features: position 0 is id 3, position 1 is id 17.
Forest twoFeatureForest() {
  Forest f;
  f.baseScore = 0.5;
  f.inputKeys = {"count", "span"};
  f.featureMapping = {3, 17};
  // f0 <= 1 ? (f1 <= 0 ? -1 : 2) : 4, weight 0.5
  f.trees.push_back(weighted(split(0, 1.0, split(1, 0.0, leaf(-1), leaf(2)), leaf(4)), 0.5));
  return f;
}

TEST(Construction, LogsOfAnEmptyForestAndItsScore) {
  LogCapture log;
  test::StdoutCapture out;
  Forest unknownVersion;  // written as version 2, then relabelled 5
  std::string text = writeModel(unknownVersion, 2);
  text = base64_encode(std::string("\x2c\xcb\x04\x00\x05\x00\x00\x00", 8)) +
         text.substr(text.find('\n'));
  BoostingModel model(text);
  EXPECT_EQ(out.take(), "Deseralization version: 5\n");

  std::vector<std::string> all;
  for (const auto& e : log.entries()) all.push_back(e.text);
  // glog hands sinks a message without its final line feed.
  EXPECT_THAT(all, ElementsAre("featureMapping of a forest:", "inputKeys of a forest:",
                               "Forest doesn't have input keys information. Falling back to "
                               "safer 32 bit version",
                               "Using 32 bit version",
                               "Feature metadata is not present in the forestCan't verify that "
                               "number of features is less thanint16_t maximum"));
  EXPECT_THAT(log.at(google::GLOG_ERROR), ::testing::SizeIs(1));
  EXPECT_THAT(log.at(google::GLOG_WARNING), ::testing::SizeIs(1));

  log.clear();
  EXPECT_EQ(model.predict({{1, 2.0}}), 0.5);
  EXPECT_THAT(log.at(google::GLOG_INFO), ElementsAre("unormalized score: 0"));
}

TEST(Construction, MetadataMessagesAndForestWidth) {
  LogCapture log;
  Forest f = twoFeatureForest();
  f.featureMapping = {3, 17, 4};
  auto model = load(f, 3);
  const auto info = log.at(google::GLOG_INFO);
  ASSERT_GE(info.size(), 3u);
  EXPECT_EQ(info[0], "featureMapping of a forest:\n3, 17, 4");
  EXPECT_EQ(info[1], "inputKeys of a forest:\ncount, span");
  EXPECT_EQ(info[2], "Using 16 bit version");
  EXPECT_TRUE(model->uses16BitForest());

  Forest wide;
  wide.inputKeys.assign(32765, "k");
  EXPECT_TRUE(load(wide, 2)->uses16BitForest());
  wide.inputKeys.push_back("k");
  log.clear();
  EXPECT_FALSE(load(wide, 2)->uses16BitForest());
  EXPECT_TRUE(log.at(google::GLOG_ERROR).empty());
}

TEST(Prediction, PlacesFeaturesByMapping) {
  auto model = load(twoFeatureForest());
  const double left = 0.5 + static_cast<float>(-1 * 0.5);
  const double mid = 0.5 + static_cast<float>(2 * 0.5);
  EXPECT_EQ(model->rawScore({{3, 1.0}, {17, 0.0}}), left);
  EXPECT_EQ(model->rawScore({}), left);                                // absent ids read 0.0
  EXPECT_EQ(model->rawScore({{17, 0.5}, {99, 100.0}, {-3, 9.0}}), mid);  // unknown ids ignored
  EXPECT_EQ(model->rawScore({{3, 1e300}}), 0.5 + 2.0);                 // becomes +inf
  EXPECT_EQ(model->predict({{17, 0.5}}), logistic(mid));
  EXPECT_EQ(model->featureVector({{17, 0.25}, {3, -1.0}}), (std::vector<float>{-1.0f, 0.25f}));
  EXPECT_EQ(model->treesKept(), 1u);
  EXPECT_EQ(model->treesDropped(), 0u);
}

TEST(Prediction, IdsBeyondTheDirectTableAndRepeatedIds) {
  Forest f = twoFeatureForest();
  f.featureMapping = {0xFFFFFFFDu, 200000};  // ids -3 and 200000
  auto model = load(f);
  EXPECT_EQ(model->featureVector({{-3, 7.0}, {200000, 1.0}, {3, 5.0}}),
            (std::vector<float>{7.0f, 1.0f}));

  f.featureMapping = {17, 17, 3};  // id 17 keeps its last position
  auto repeated = load(f);
  EXPECT_EQ(repeated->featureVector({{17, 1.0}, {3, 2.0}}), (std::vector<float>{0, 1, 2}));
}

TEST(Prediction, LoggedRawScoreIsTheReturnedOne) {
  auto model = load(twoFeatureForest());
  LogCapture log;
  const double p = model->predict({{3, 2.0}});
  EXPECT_EQ(p, logistic(0.5 + 2.0));
  EXPECT_THAT(log.at(google::GLOG_INFO), ElementsAre("unormalized score: 2.5"));
}

TEST(ConstantModels, NoFeatureMappingScoresZerosOnce) {
  Forest f;
  f.baseScore = 0.125;
  // Position 2147483646 must not make anything allocate; NaN thresholds follow
  // the plain walk (second child at the root, first below).
  const double nan = std::numeric_limits<double>::quiet_NaN();
  f.trees.push_back(weighted(split(2147483646, nan, leaf(1), split(5, nan, leaf(2), leaf(4))), 1));
  f.trees.push_back(weighted(split(-7, 0.0, leaf(8), leaf(16)), 1));  // negative: reads 0.0 too
  auto model = load(f, 2);
  EXPECT_TRUE(model->hasConstantScore());
  EXPECT_EQ(model->rawScore({}), 0.125 + 2 + 8);
  EXPECT_EQ(model->rawScore({{0, 100.0}, {5, -100.0}}), 0.125 + 2 + 8);
  EXPECT_EQ(model->predict({}), logistic(0.125 + 2 + 8));
}

// rawScores() of feature vectors must be rawScore() of the maps they come
// from, bit for bit, for both forest widths and every kernel, with a stride
// longer than the vector; a model without featureMapping fills its constant.
TEST(BlockScores, RowsScoreAsTheirMaps) {
  FLAGS_minloglevel = google::GLOG_WARNING;
  std::vector<WalkKernel> kernels{WalkKernel::kPortable, WalkKernel::kScalar};
  if (walkKernelSupported(WalkKernel::kAvx512)) kernels.push_back(WalkKernel::kAvx512);
  for (bool withKeys : {true, false}) {
    Forest f = test::randomForest(withKeys ? 3 : 4, 150, 6, 30, withKeys, 0.2);
    f.equalityFeatures = {4};
    const std::string text = writeModel(f, 4);
    std::vector<FeatureMap> maps(97);
    for (size_t r = 0; r < maps.size(); ++r) {
      for (int32_t id = 1; id <= 30; ++id) {
        if ((r + static_cast<size_t>(id)) % 7 != 0) maps[r].emplace(id, std::sin(static_cast<double>(r * 31 + id)));
      }
      maps[r].emplace(1000, 5.0);  // not a model feature
    }
    for (WalkKernel kernel : kernels) {
      test::StdoutCapture discarded;
      BoostingModel model(text, kernel);
      ASSERT_EQ(model.vectorLength(), 30u);
      ASSERT_EQ(model.uses16BitForest(), withKeys);
      const size_t stride = 33;
      std::vector<float> rows(maps.size() * stride, std::numeric_limits<float>::quiet_NaN());
      for (size_t r = 0; r < maps.size(); ++r) {
        const std::vector<float> x = model.featureVector(maps[r]);
        std::copy(x.begin(), x.end(), rows.begin() + static_cast<ptrdiff_t>(r * stride));
      }
      std::vector<double> out(maps.size());
      model.rawScores(rows.data(), maps.size(), stride, out.data());
      for (size_t r = 0; r < maps.size(); ++r) {
        ASSERT_EQ(out[r], model.rawScore(maps[r])) << "kernel " << static_cast<int>(kernel) << ", row " << r;
      }
      EXPECT_THROW(model.rawScores(rows.data(), 1, 29, out.data()), std::invalid_argument);
    }
  }

  Forest constant;
  constant.baseScore = 0.125;
  constant.trees.push_back(weighted(split(7, 0.0, leaf(8), leaf(16)), 1));
  auto model = load(constant, 2);
  ASSERT_TRUE(model->hasConstantScore());
  EXPECT_EQ(model->vectorLength(), 0u);
  double out[3] = {0, 0, 0};
  model->rawScores(nullptr, 3, 0, out);
  EXPECT_THAT(out, ElementsAre(0.125 + 8, 0.125 + 8, 0.125 + 8));
  FLAGS_minloglevel = google::GLOG_INFO;
}

TEST(Failures, ReaderAndCompilerErrorsLeaveTheConstructor) {
  const std::string truncated =
      base64_encode(std::string("\x2c\xcb\x04\x00\x02\x00\x00\x00", 8)) + "\n" +
      base64_encode(std::string(8, '\0') + std::string("\x05\x00\x00\x00", 4)) + "\n";
  {
    test::StdoutCapture discarded;
    EXPECT_THROW(BoostingModel{truncated}, std::runtime_error);
  }

  Forest wide = twoFeatureForest();
  wide.trees.push_back(weighted(split(40000, 0, leaf(0), leaf(1)), 1));
  EXPECT_THAT([&] { load(wide); },
              ::testing::ThrowsMessage<std::range_error>(
                  ::testing::StrEq("feature id > max size. Use large type for FeatureIdT")));

  Forest outside = twoFeatureForest();
  outside.trees.push_back(weighted(split(2, 0, leaf(0), leaf(1)), 1));
  EXPECT_THAT([&] { load(outside); },
              ::testing::ThrowsMessage<std::range_error>(HasSubstr("feature position 2")));

  LogCapture log;
  Forest decreasing = twoFeatureForest();
  decreasing.trees.push_back(weighted(leaf(1), 1));
  decreasing.modelSelector = weighted(leaf(0), 1);
  decreasing.modelIndexMap = {2, 1};
  auto model = load(decreasing);  // logged, then used as compiled
  EXPECT_THAT(log.at(google::GLOG_ERROR),
              ElementsAre("modelIndexMap is not monotonically increasing!"));
  EXPECT_EQ(model->rawScore({}), 0.5 + static_cast<float>(-0.5) + 1.0);
}

TEST(Concurrency, PredictFromSeveralThreads) {
  FLAGS_minloglevel = google::GLOG_WARNING;
  Forest f = test::randomForest(5, 64, 5, 20);
  auto model = load(f);
  FeatureMap x;
  for (int32_t id = 1; id <= 20; ++id) x.emplace(id, std::sin(id));
  const double expected = model->predict(x);
  std::vector<std::thread> threads;
  std::vector<int> mismatches(4, 0);
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < 200; ++i) mismatches[t] += model->predict(x) != expected;
    });
  }
  for (auto& th : threads) th.join();
  EXPECT_THAT(mismatches, ElementsAre(0, 0, 0, 0));
  FLAGS_minloglevel = google::GLOG_INFO;
}

// Writing, reading, copying, linking, compiling, scoring and destroying a
// model whose tree is a million levels deep, on a 256 KiB stack.
TEST(DeepModel, MillionLevelChainEndToEnd) {
  FLAGS_minloglevel = google::GLOG_WARNING;
  constexpr size_t kDepth = 1000000;
  Forest f;
  f.inputKeys = {"depth"};
  f.featureMapping = {1};
  f.trees.push_back(weighted(test::chain(kDepth), 1));
  f.modelSelector = weighted(test::chain(1000), 1);
  f.modelIndexMap = {1};
  test::runOnSmallStack([&] {
    const std::string text = writeModel(f, 3);
    f = Forest();
    auto model = load(text);
    // Selector leaf -1 selects model 0 (tree 0), which ends at leaf -1 too.
    EXPECT_EQ(model->rawScore({{1, 2e6}}), -1.0);
    EXPECT_EQ(model->rawScore({{1, 0.5}}), 0.0);  // selector leaf 1: model 1 is empty
    Forest copy = model->getForest();
    linkForest(copy);
    const Node& root = *copy.trees[0].tree->root;
    EXPECT_EQ(root.evaluate({999998.5}), 999999.0);
    model.reset();
  });
  FLAGS_minloglevel = google::GLOG_INFO;
}

}  // namespace
}  // namespace thornvale

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/ForestComparison.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/RandomForests.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/TreeBuilders.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/StdoutCapture.h"

namespace thornvale {
namespace {

using ::testing::HasSubstr;
using test::leaf;
using test::split;
using test::weighted;

std::unique_ptr<Forest> readBack(const std::string& text) {
  test::StdoutCapture discarded;
  return deserialize(text);
}

// A forest using every field, with awkward values: NaN with a payload,
// negative zero, infinities, keys of every length modulo three, binary keys.
Forest fullForest() {
  Forest f = test::randomForest(3, 5, 3, 6);
  f.baseScore = -0.0;
  uint64_t payload = 0x7FF0000000000123ull;
  double nan;
  std::memcpy(&nan, &payload, sizeof nan);
  f.trees.push_back(weighted(split(-7, nan, leaf(std::numeric_limits<double>::infinity()),
                                   leaf(-0.0)),
                             5e-324));
  f.trees.back().tree->featureValues = {{-3, 1.25}, {9, nan}};
  f.inputKeys = {"", "a", "ab", "abc", std::string("n\0l\xff", 4), "=", "with space"};
  f.modelSelector = weighted(split(0, 1.5, leaf(0), leaf(2.7)), 1.0);
  f.modelSelector.tree->featureValues = {{1, 2.0}};
  f.modelIndexMap = {2, 4, 4, 99};
  f.featureMapping = {3, 17, 4, 0xFFFFFFFFu, 17, 0};
  f.equalityFeatures = {2, 0x80000000u};
  f.averageFeatureValues = {{1, 0.5}, {0xFFFFFFFEu, -2.0}};
  return f;
}

TEST(ModelWriter, RoundTripKeepsEveryFieldInEachVersion) {
  for (int32_t version : {2, 3, 4}) {
    Forest f = fullForest();
    if (version < 4) f.averageFeatureValues.clear();
    if (version < 3) f.featureMapping.clear(), f.equalityFeatures.clear();
    const std::string text = writeModel(f, version);
    for (size_t i = 0; i < text.size(); ++i) {  // padding only at line ends
      if (text[i] == '=') {
        ASSERT_TRUE(text[i + 1] == '=' || text[i + 1] == '\n') << i;
      }
    }
    auto back = readBack(text);
    std::string why;
    EXPECT_TRUE(test::sameForest(f, *back, &why)) << "version " << version << ": " << why;
    EXPECT_EQ(writeModel(*back, version), text);
  }
}

TEST(ModelWriter, TrailerOnlyWhenNeeded) {
  Forest f;
  f.trees.push_back(weighted(leaf(1), 1));
  auto plain = readBack(writeModel(f, 2));
  EXPECT_EQ(plain->modelSelector.tree, nullptr);

  // Boundaries without a selector: a zero-weight leaf keeps the place.
  f.modelIndexMap = {1};
  auto back = readBack(writeModel(f, 3));
  EXPECT_EQ(back->modelIndexMap, std::vector<uint32_t>{1});
  ASSERT_NE(back->modelSelector.tree, nullptr);
  EXPECT_EQ(back->modelSelector.weight, 0.0);
}

TEST(ModelWriter, RefusesWhatItCannotWriteFaithfully) {
  auto refused = [](const Forest& f, int32_t version, const char* what) {
    EXPECT_THAT([&] { writeModel(f, version); },
                ::testing::ThrowsMessage<std::invalid_argument>(HasSubstr(what)))
        << what;
  };
  Forest ok;
  ok.trees.push_back(weighted(leaf(1), 1));
  refused(ok, 1, "version 1");
  refused(ok, 5, "version 5");

  Forest noTree;
  noTree.trees.emplace_back();
  refused(noTree, 2, "tree 0 has no nodes");

  Forest halfSplit;
  halfSplit.trees.push_back(weighted(split(0, 1, leaf(1), nullptr), 1));
  refused(halfSplit, 2, "without both children");

  Forest mapped = ok;
  mapped.featureMapping = {1};
  refused(mapped, 2, "version 2 has no featureMapping");
  Forest averaged = ok;
  averaged.averageFeatureValues = {{1, 1.0}};
  refused(averaged, 3, "need format version 4");
}

}  // namespace
}  // namespace thornvale

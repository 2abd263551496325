#include "xplat/gbdtclassifier/GbdtClassifier/CompleteTreeWalk.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <random>
#include <vector>

// How the walk scores is checked against the one-by-one sum in
// FastTreeEnsemble_test (every kernel, NaN, infinities, signed zeros, ties);
// here: the key order on its own, and the bound on padding.
namespace thornvale {
namespace {

constexpr float kInf = std::numeric_limits<float>::infinity();
const float kNaN = std::numeric_limits<float>::quiet_NaN();

TEST(CompleteKeys, OrderAsTheFloatsDoWithTheNaNRuleOfEachLevel) {
  std::vector<float> values = {-kInf, -std::numeric_limits<float>::max(), -1.5f, -1.0f,
                               -std::numeric_limits<float>::denorm_min(), -0.0f, 0.0f,
                               std::numeric_limits<float>::denorm_min(), std::numeric_limits<float>::min(),
                               1.0f, std::nextafter(1.0f, 2.0f), std::numeric_limits<float>::max(), kInf};
  std::mt19937 rng(5);
  for (int i = 0; i < 200; ++i) {
    uint32_t bits = static_cast<uint32_t>(rng());
    float v;
    std::memcpy(&v, &bits, sizeof v);
    if (!std::isnan(v)) values.push_back(v);
  }
  const float nans[] = {kNaN, -kNaN, std::numeric_limits<float>::signaling_NaN()};
  for (float x : values) {
    for (float t : values) {
      ASSERT_EQ(completeFeatureKey(x) > completeThresholdKey(t), x > t) << x << " " << t;
      ASSERT_EQ(completeRootFeatureKey(x) > completeRootThresholdKey(t), !(x <= t)) << x << " " << t;
    }
    for (float nan : nans) {
      // Below the root NaN goes first, at the root second, on either side.
      EXPECT_FALSE(completeFeatureKey(nan) > completeThresholdKey(x));
      EXPECT_TRUE(completeRootFeatureKey(nan) > completeRootThresholdKey(x));
      EXPECT_FALSE(completeFeatureKey(x) > completeThresholdKey(nan));
      EXPECT_TRUE(completeRootFeatureKey(x) > completeRootThresholdKey(nan));
    }
  }
  // completeKeys() gives the same keys, and NaN in the NaN slot.
  std::vector<float> features = values;
  features.push_back(kNaN);
  const size_t slots = features.size() + 1;
  std::vector<uint32_t> keys(2 * slots);
  completeKeys(features.data(), slots, keys.data());
  for (size_t i = 0; i < features.size(); ++i) {
    EXPECT_EQ(keys[i], completeFeatureKey(features[i])) << i;
    EXPECT_EQ(keys[slots + i], completeRootFeatureKey(features[i])) << i;
  }
  EXPECT_EQ(keys[slots - 1], completeFeatureKey(kNaN));
  EXPECT_EQ(keys[2 * slots - 1], completeRootFeatureKey(kNaN));
}

// Compiled trees as buildCompleteForest() reads them.
struct Node {
  int64_t featureId;
  uint32_t child;
  float value;
};
struct Tree {
  std::vector<Node> nodes;
  uint32_t depth;
};
constexpr int64_t kLeaf = -1;

Tree leafTree(float v) { return Tree{{{kLeaf, 0, v}}, 0}; }
Tree chain(uint32_t depth) {  // every left child a leaf
  Tree t{{}, depth};
  t.nodes.push_back({0, 1, 0.5f});
  for (uint32_t d = 0; d < depth; ++d) {
    const auto at = static_cast<uint32_t>(t.nodes.size());
    t.nodes.push_back({kLeaf, 0, static_cast<float>(d)});
    t.nodes.push_back(d + 1 < depth ? Node{0, at + 2, 0.5f} : Node{kLeaf, 0, 9.0f});
  }
  return t;
}

TEST(CompleteForestLayout, PaddingStaysWithinFourTimesTheNodes) {
  const auto all = [](const Tree&) { return true; };
  // A chain of depth 8 among single leaves would pad its group to
  // 32 * 255 splits for 48 nodes; it is left out, and the group keeps depth 1.
  std::vector<Tree> trees(40, leafTree(1.0f));
  trees[3] = chain(8);
  CompleteForest f = buildCompleteForest(trees, kLeaf, 1, all);
  ASSERT_EQ(f.depths.size(), 2u);
  EXPECT_EQ(f.depths[0], 1u);
  EXPECT_EQ(f.taken[0], kCompleteAllTaken & ~(1u << 3));
  EXPECT_EQ(f.taken[1], 0xFFu);  // 8 trees in the last group
  // Full depth-10 trees pay for their padding themselves; deeper ones are
  // never taken.
  std::vector<Tree> full(32, chain(6));
  full[0] = chain(11);
  f = buildCompleteForest(full, kLeaf, 1, all);
  EXPECT_EQ(f.depths[0], 6u);
  EXPECT_EQ(f.taken[0], kCompleteAllTaken & ~1u);
  EXPECT_LE(f.splits.size(), 4 * 32 * chain(6).nodes.size() + 63 * kCompleteGroup);
  // Nothing taken: an empty layout.
  EXPECT_TRUE(buildCompleteForest(trees, kLeaf, 1, [](const Tree&) { return false; }).empty());
}

}  // namespace
}  // namespace thornvale

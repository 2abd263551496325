#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsemble-inl.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>
#include <set>
#include <tuple>
#include <utility>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/ForestComparison.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/RandomForests.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/TreeBuilders.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/LogCapture.h"

namespace thornvale {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using test::leaf;
using test::split;
using test::weighted;

using Forest16 = FastTreeEnsembleOOP<short, unsigned int>;
using Forest32 = FastTreeEnsembleOOP<int, unsigned int>;

const float kNaN = std::numeric_limits<float>::quiet_NaN();

static_assert(sizeof(Forest16::FlatNode) <= 12 && sizeof(Forest32::FlatNode) <= 12);

template <typename E = Forest32>
std::unique_ptr<E> compiled(const Forest& f) {
  auto e = std::make_unique<E>();
  EXPECT_TRUE(e->init(&f, false));
  return e;
}

Forest mapped(size_t positions) {
  Forest f;
  for (size_t i = 0; i < positions; ++i) f.featureMapping.push_back(static_cast<uint32_t>(100 + i));
  return f;
}

// The scoring rules applied straight to the node objects, one tree after
// another, for comparison with the compiled forests. It walks the nodes
// itself: Node::evaluate() and findLeaf() send NaN right at every level,
// whereas the compiled plain walk sends it right only at the root and left
// below it.
//
// Sub-models are not derived from modelIndexMap here: `models[m]` is the range
// [first, end) of kept trees (those of non-zero weight) that model number m
// sums, written out by the caller, and the selector's leaf value, truncated,
// picks m.
using Ranges = std::vector<std::pair<size_t, size_t>>;
double referenceRaw(const Forest& f, const std::vector<float>& x, const Ranges& models = {}) {
  std::set<int32_t> eq;
  if (!f.featureMapping.empty()) eq.insert(f.equalityFeatures.begin(), f.equalityFeatures.end());
  auto walk = [&](const Node* n, bool equalityWalk) {
    for (bool root = true; !n->isLeaf(); root = false) {
      const auto* s = static_cast<const LinearNode*>(n);
      const float v = x[s->pivotIndex];
      const auto t = static_cast<float>(s->pivotValue);
      bool second;
      if (equalityWalk) {
        second = eq.count(s->pivotIndex) ? v != t : v > t;
      } else {
        second = root ? !(v <= t) : v > t;
      }
      n = second ? s->right.get() : s->left.get();
    }
    return static_cast<const ConstantNode*>(n)->value;
  };
  auto testsEquality = [&](const Node* root) {
    std::vector<const Node*> pending{root};
    while (!pending.empty()) {
      const Node* n = pending.back();
      pending.pop_back();
      if (n->isLeaf()) continue;
      const auto* s = static_cast<const LinearNode*>(n);
      if (eq.count(s->pivotIndex)) return true;
      pending.push_back(s->left.get());
      pending.push_back(s->right.get());
    }
    return false;
  };
  std::vector<const WeightedTree*> kept;
  for (const WeightedTree& t : f.trees) {
    if (t.weight != 0.0) kept.push_back(&t);
  }
  size_t first = 0, end = kept.size();
  if (f.modelSelector.tree && f.modelSelector.weight != 0.0) {
    const float v = static_cast<float>(walk(f.modelSelector.tree->root.get(), false));
    std::tie(first, end) = models.at(static_cast<size_t>(v));
  }
  double sum = f.baseScore;
  for (size_t i = first; i < end; ++i) {
    const Node* root = kept[i]->tree->root.get();
    sum += static_cast<float>(walk(root, testsEquality(root)) * kept[i]->weight);
  }
  return sum;
}

TEST(Compile, LayoutAndLeafValues) {
  Forest f = mapped(4);
  // root (f1 <= 0.1): A | B (f3 <= 2): C | D, compiled as root, A, B, C, D
  f.trees.push_back(weighted(split(1, 0.1, leaf(1.0), split(3, 2.0, leaf(2.0), leaf(3.0))), 0.1));
  f.trees.push_back(weighted(leaf(2.0), 0.1));
  auto e = compiled(f);
  std::vector<std::tuple<int, unsigned, float>> nodes;
  for (const auto& n : e->getTrees()[0].nodes) nodes.emplace_back(n.featureId, n.child, n.value);
  EXPECT_THAT(nodes, ElementsAre(std::make_tuple(1, 1u, 0.1f), std::make_tuple(-1, 0u, 0.1f),
                                 std::make_tuple(3, 3u, 2.0f), std::make_tuple(-1, 0u, 0.2f),
                                 std::make_tuple(-1, 0u, static_cast<float>(3.0 * 0.1))));
  const auto& single = e->getTrees()[1].nodes;
  ASSERT_EQ(single.size(), 1u);
  EXPECT_EQ(single[0].featureId, -1);
  EXPECT_EQ(single[0].child, 0u);  // compiled where the first tree's root was
  EXPECT_EQ(single[0].value, 0.2f);
  EXPECT_EQ(e->requiredFeatures(), 4u);
  EXPECT_THROW(e->unnormalizedScore({0, 0, 0}), std::invalid_argument);  // too short
}

TEST(Compile, ExactArithmeticOfLeafSumAndLogistic) {
  Forest f;
  f.baseScore = 0.5;
  f.trees.push_back(weighted(leaf(2.0), 0.1));
  auto e = compiled<Forest16>(f);
  EXPECT_EQ(static_cast<double>(e->getTrees()[0].nodes[0].value), 0.20000000298023224);
  EXPECT_EQ(e->unnormalizedScore({}), 0.7000000029802322);
  EXPECT_EQ(e->score({}), 0.6681877728289219);

  Forest32 empty;
  EXPECT_EQ(empty.unnormalizedScore({}), 0.0);
  EXPECT_EQ(empty.score({}), 0.5);
}

TEST(Compile, ZeroWeightTreesAreDropped) {
  Forest f;
  f.trees.push_back(weighted(leaf(1), 0.0));
  f.trees.push_back(weighted(leaf(1), -0.0));
  f.trees.push_back(weighted(leaf(1e300), 5e-324));
  f.trees.push_back(weighted(leaf(1), 1.0));
  auto e = compiled(f);
  EXPECT_EQ(e->numTrees(), 2u);
  EXPECT_EQ(e->getTrees()[0].nodes[0].value, static_cast<float>(1e300 * 5e-324));
}

TEST(Walks, PlainWalkNaNRuleAndEqualityWalk) {
  // f0 <= 1 ? (f1 <= 1 ? 1 : 2) : (f1 <= 1 ? 3 : 4)
  auto make = [] {
    return split(0, 1.0, split(1, 1.0, leaf(1), leaf(2)), split(1, 1.0, leaf(3), leaf(4)));
  };
  Forest f = mapped(3);
  f.trees.push_back(weighted(make(), 1));
  auto plain = compiled(f);
  EXPECT_FALSE(plain->getTrees()[0].hasEqualityFeature);
  EXPECT_EQ(plain->unnormalizedScore({1.0f, 1.0f, 0}), 1);     // equal goes first
  EXPECT_EQ(plain->unnormalizedScore({kNaN, 0.0f, 0}), 3);     // NaN at the root: second
  EXPECT_EQ(plain->unnormalizedScore({0.0f, kNaN, 0}), 1);     // NaN deeper: first
  EXPECT_EQ(plain->unnormalizedScore({kNaN, kNaN, 0}), 3);

  // Feature 1 is an equality feature: x == t first, anything else (NaN too)
  // second; the ordinary root split now sends NaN first.
  f.equalityFeatures = {1};
  auto eq = compiled(f);
  EXPECT_TRUE(eq->getTrees()[0].hasEqualityFeature);
  EXPECT_EQ(eq->unnormalizedScore({0.0f, 1.0f, 0}), 1);
  EXPECT_EQ(eq->unnormalizedScore({0.0f, 0.5f, 0}), 2);
  EXPECT_EQ(eq->unnormalizedScore({0.0f, 1.5f, 0}), 2);
  EXPECT_EQ(eq->unnormalizedScore({kNaN, kNaN, 0}), 2);
  EXPECT_EQ(eq->unnormalizedScore({1.0f, 1.0f, 0}), 1);

  // Without featureMapping no feature is an equality feature.
  Forest unmapped;
  unmapped.trees.push_back(weighted(make(), 1));
  unmapped.equalityFeatures = {1};
  auto none = compiled(unmapped);
  EXPECT_FALSE(none->getTrees()[0].hasEqualityFeature);
  EXPECT_TRUE(none->getEqualityMask().empty());
}

TEST(SubModels, SelectorChoosesTreeRanges) {
  Forest f = mapped(1);
  for (int i = 0; i < 3; ++i) f.trees.push_back(weighted(leaf(1 << i), 1));
  f.baseScore = 0.25;
  // Selector: f0 <= 0 ? 0 : f0 <= 1 ? 1.9 : f0 <= 2 ? 2.7 : f0 <= 3 ? -1.5 : 7
  f.modelSelector = weighted(
      split(0, 0, leaf(0),
            split(0, 1, leaf(1.9), split(0, 2, leaf(2.7), split(0, 3, leaf(-1.5), leaf(7))))),
      0.5);  // the weight only switches the selector on
  f.modelIndexMap = {2, 2};
  auto e = compiled(f);
  EXPECT_EQ(e->unnormalizedScore({0}), 0.25 + 1 + 2);  // model 0: trees 0, 1
  EXPECT_EQ(e->unnormalizedScore({1}), 0.25);          // model 1: empty
  EXPECT_EQ(e->unnormalizedScore({2}), 0.25 + 4);      // 2.7 -> model 2
  EXPECT_EQ(e->unnormalizedScore({3}), 0.25 + 1 + 2);  // -1.5 -> model 0
  EXPECT_EQ(e->unnormalizedScore({4}), 0.25 + 4);      // beyond the map: last model

  f.modelIndexMap = {1, 9};  // a boundary past the trees is clamped
  EXPECT_EQ(compiled(f)->unnormalizedScore({1}), 0.25 + 2 + 4);

  f.modelIndexMap.clear();  // only model 0, all trees
  EXPECT_EQ(compiled(f)->unnormalizedScore({2}), 0.25 + 7);

  f.modelSelector.tree->root = leaf(std::numeric_limits<double>::quiet_NaN());
  f.modelIndexMap = {1};
  EXPECT_EQ(compiled(f)->unnormalizedScore({0}), 0.25 + 1);
  f.modelSelector.tree->root = leaf(1e12);
  EXPECT_EQ(compiled(f)->unnormalizedScore({0}), 0.25 + 2 + 4);

  f.modelSelector.weight = 0.0;  // switched off: all trees
  EXPECT_TRUE(compiled(f)->getSelector().nodes.empty());
}

TEST(InitResults, NullDecreasingMapAndRemapWithoutMapping) {
  test::LogCapture log;
  Forest32 e;
  EXPECT_FALSE(e.init(nullptr, false));

  Forest f;
  f.trees.push_back(weighted(leaf(1), 1));
  f.modelIndexMap = {3, 1};
  EXPECT_FALSE(e.init(&f, false));
  EXPECT_EQ(e.numTrees(), 1u);
  EXPECT_THAT(e.getModelIndexMap(), ElementsAre(3, 1));
  f.modelIndexMap = {1, 1};
  EXPECT_TRUE(e.init(&f, true));
  EXPECT_THAT(log.at(google::GLOG_ERROR),
              ElementsAre("modelIndexMap is not monotonically increasing!",
                          "Wanted to remap but featureMapping empty"));
}

TEST(InitResults, RemapTranslatesPositions) {
  Forest f;
  f.featureMapping = {5, 2};
  f.equalityFeatures = {0};  // becomes feature id 5
  f.trees.push_back(weighted(split(0, 1.0, leaf(1), leaf(2)), 1));
  Forest32 e;
  EXPECT_TRUE(e.init(&f, true));
  EXPECT_EQ(e.getTrees()[0].nodes[0].featureId, 5);
  EXPECT_EQ(e.unnormalizedScore({0, 0, 0, 0, 0, 1.0f}), 1);  // equality split
  EXPECT_EQ(e.unnormalizedScore({0, 0, 0, 0, 0, 1.5f}), 2);
}

TEST(Limits, FeatureIdLimitsThenPositionChecks) {
  auto withSplitOn = [](int32_t position, size_t mappingSize) {
    Forest f = mapped(mappingSize);
    f.trees.push_back(weighted(split(position, 0, leaf(0), leaf(1)), 1));
    return f;
  };
  auto throwsRange = [](auto&& init, const char* text) {
    EXPECT_THAT(init, ::testing::ThrowsMessage<std::range_error>(HasSubstr(text))) << text;
  };
  const char* kFeatureId = "feature id > max size. Use large type for FeatureIdT";

  auto init = [](auto& e, Forest f) { return e.init(&f, false); };

  Forest16 e16;
  EXPECT_TRUE(init(e16, withSplitOn(32766, 32767)));
  EXPECT_EQ(e16.getTrees()[0].nodes[0].featureId, 32766);
  throwsRange([&] { init(e16, withSplitOn(32767, 40000)); }, kFeatureId);
  throwsRange([&] { init(e16, withSplitOn(70000, 10)); }, kFeatureId);  // checked before narrowing
  Forest32 e32;
  EXPECT_TRUE(init(e32, withSplitOn(2147483646, 0)));
  throwsRange([&] { init(e32, withSplitOn(2147483647, 0)); }, kFeatureId);

  // With a featureMapping, positions must lie inside its vector.
  throwsRange([&] { init(e32, withSplitOn(10, 10)); },
              "tests feature position 10, outside the feature vector of 10 positions");
  throwsRange([&] { init(e16, withSplitOn(-3, 10)); }, "feature position -3");
  Forest selector = withSplitOn(0, 2);
  selector.modelSelector = weighted(split(2, 0, leaf(0), leaf(1)), 1);
  throwsRange([&] { init(e32, std::move(selector)); }, "model selector tree");
}

TEST(Limits, EqualityMaskIsBoundedByTheVector) {
  Forest f = mapped(0);
  f.featureMapping = {7, 0xFFFFFFFFu, 3};
  f.trees.push_back(weighted(split(2, 0, leaf(0), leaf(1)), 1));
  f.equalityFeatures = {2, 5, 4000000000u};  // 5 and 4e9 lie past the vector: no effect
  Forest32 e;
  EXPECT_TRUE(e.init(&f, false));
  EXPECT_EQ(e.getEqualityMask().size(), 3u);
  EXPECT_TRUE(e.getTrees()[0].hasEqualityFeature);

  f.featureMapping = {7, 1, 3};
  f.equalityFeatures = {8};  // at the mask size (largest entry + 1)
  EXPECT_THAT([&] { e.init(&f, false); },
              ::testing::ThrowsMessage<std::range_error>(
                  HasSubstr("equality feature 8 is outside the equality mask of 8 features")));
}

// The interleaved walk must give exactly the one-by-one sum and the rules
// applied to the node objects, for any mix of plain and equality trees,
// tree counts that are not multiples of the block, NaN and equal features.
template <typename E>
void checkAgainstReference(uint64_t seed) {
  std::mt19937_64 rng(seed);
  for (int round = 0; round < 12; ++round) {
    const size_t count = 1 + rng() % 40;
    const int depth = 1 + static_cast<int>(rng() % 6);  // drawn apart: argument order varies
    Forest f = test::randomForest(rng(), count, depth, 10);
    f.trees[rng() % count].weight = 0.0;
    if (round % 3 != 0) f.equalityFeatures = {static_cast<uint32_t>(rng() % 10)};
    // The trees that the compiled forest keeps: all but the one of weight 0.
    const size_t kept = count - 1;
    Ranges models;
    if (round % 2 == 1) {
      f.modelSelector = weighted(test::randomFullTree(rng, 2, 10), 1);
      std::vector<Node*> pending{f.modelSelector.tree->root.get()};
      while (!pending.empty()) {  // selector leaves name models 0..3
        Node* n = pending.back();
        pending.pop_back();
        if (n->isLeaf()) {
          static_cast<ConstantNode*>(n)->value = static_cast<double>(rng() % 40) / 10.0;
        } else {
          pending.push_back(static_cast<LinearNode*>(n)->left.get());
          pending.push_back(static_cast<LinearNode*>(n)->right.get());
        }
      }
      const size_t a = count / 3, b = count / 2;  // both at most `kept`
      f.modelIndexMap = {static_cast<uint32_t>(a), static_cast<uint32_t>(b)};
      // Model 3 lies past the last boundary: it sums the last model's trees.
      models = {{0, a}, {a, b}, {b, kept}, {b, kept}};
    }
    auto e = compiled<E>(f);
    std::uniform_real_distribution<float> u(-1.2f, 1.2f);
    for (int v = 0; v < 50; ++v) {
      std::vector<float> x(10);
      for (float& xi : x) {
        const auto r = rng() % 10;
        xi = r == 0 ? kNaN : r == 1 ? 0.0f : u(rng);
      }
      if (v % 5 == 0) {  // hit some thresholds exactly
        const auto* root = static_cast<const LinearNode*>(f.trees[0].tree->root.get());
        if (!root->isLeaf()) x[root->pivotIndex] = static_cast<float>(root->pivotValue);
      }
      const double expected = referenceRaw(f, x, models);
      ASSERT_TRUE(test::sameBits(e->unnormalizedScore(x), expected)) << round << "/" << v;
      ASSERT_TRUE(test::sameBits(e->unnormalizedScoreOneByOne(x), expected)) << round;
      ASSERT_TRUE(test::sameBits(e->score(x), logistic(expected)));
    }
    const std::vector<float> zeros(10, 0.0f);
    EXPECT_TRUE(test::sameBits(e->unnormalizedScoreOfZeros(), referenceRaw(f, zeros, models)));
  }
}

TEST(Scoring, InterleavedEqualsReference16) { checkAgainstReference<Forest16>(1); }
TEST(Scoring, InterleavedEqualsReference32) { checkAgainstReference<Forest32>(2); }

// Every walk kernel this CPU runs must give the one-by-one sum bit for bit.
// The forests mix what the kernels treat differently: ragged and full trees
// of depth 1 to 10, single leaves, trees with equality splits and trees too
// deep for a group (walked apart), tree counts around the group size,
// sub-models that start inside a group, and feature counts on both sides of
// what the vector kernel keeps in registers. The inputs hit thresholds, NaN
// and infinities.
template <typename E>
void checkKernels(uint64_t seed, int32_t numFeatures) {
  std::vector<WalkKernel> kernels{WalkKernel::kPortable, WalkKernel::kScalar};
  if (walkKernelSupported(WalkKernel::kAvx512)) kernels.push_back(WalkKernel::kAvx512);
  std::mt19937_64 rng(seed);
  for (int round = 0; round < 6; ++round) {
    const size_t count = 1 + rng() % (2 * kWalkGroup + 20);
    const int depth = 1 + static_cast<int>(rng() % 10);  // drawn apart: argument order varies
    Forest f = test::randomForest(rng(), count, depth, numFeatures, false, round % 2 ? 0.3 : 0.0);
    for (size_t i = 0; i < count; i += 1 + rng() % 16) {
      switch (rng() % 4) {
        case 0: f.trees[i].tree->root = leaf(0.25 * static_cast<double>(i)); break;
        case 1: f.trees[i].weight = 0.0; break;
        case 2: f.trees[i].tree->root = test::randomFullTree(rng, 1 + rng() % 10, numFeatures, 0.4); break;
        default: f.trees[i].tree->root = test::chain(E::kMaxGatherDepth + 1 + rng() % 3, numFeatures - 1);
      }
    }
    int32_t plain = 0;  // a feature without an equality split
    if (round % 3 == 1) {
      const auto q = static_cast<int32_t>(rng() % numFeatures);
      f.equalityFeatures = {static_cast<uint32_t>(q)};
      plain = (q + 1) % numFeatures;
    }
    // Random trees may all be ones that the group walks leave out (too deep
    // for the padding budget, or splitting on the equality feature); this one
    // never is, so the group walk is always in use.
    f.trees.push_back(weighted(split(plain, 0.5, leaf(0.125), leaf(-0.125)), 1));
    if (round % 3 == 2) {  // selector leaves 0, 1, 2: the ranges start inside groups
      f.modelSelector = weighted(split(0, 0.0, leaf(0.5), split(1, 0.5, leaf(1.5), leaf(2.5))), 1);
      f.modelIndexMap = {static_cast<uint32_t>(count / 3), static_cast<uint32_t>(count / 3 + 37)};
    }
    auto e = compiled<E>(f);
    ASSERT_GT(e->gatherBytes(), 0u) << "round " << round << ", " << numFeatures << " features";
    std::vector<float> thresholds;
    for (const auto& t : e->getTrees()) {
      for (const auto& n : t.nodes) {
        if (n.featureId != E::kLeaf) thresholds.push_back(n.value);
      }
    }
    const float specials[] = {kNaN, std::numeric_limits<float>::infinity(),
                              -std::numeric_limits<float>::infinity(), 0.0f, -0.0f};
    std::uniform_real_distribution<float> u(-1.2f, 1.2f);
    for (int v = 0; v < 40; ++v) {
      std::vector<float> x(static_cast<size_t>(numFeatures));
      for (float& xi : x) {
        const auto r = rng() % 8;
        xi = r == 0   ? specials[rng() % 5]
             : r < 3 && !thresholds.empty() ? thresholds[rng() % thresholds.size()]
                                            : u(rng);
      }
      if (v % 4 == 0) x[static_cast<size_t>(numFeatures) - 1] = 100.0f;  // deep chains to the end
      const double expected = e->unnormalizedScoreOneByOne(x);
      for (WalkKernel k : kernels) {
        ASSERT_TRUE(e->useWalkKernel(k));
        ASSERT_TRUE(test::sameBits(e->unnormalizedScore(x), expected))
            << "kernel " << static_cast<int>(k) << ", round " << round << ", vector " << v;
      }
    }
  }
}

TEST(Kernels, AllKernelsGiveTheOneByOneSum16) {
  for (int32_t features : {2, 31, 74, 100, 127, 300}) checkKernels<Forest16>(features, features);
}
TEST(Kernels, AllKernelsGiveTheOneByOneSum32) {
  for (int32_t features : {3, 32, 64, 96, 128, 1000}) checkKernels<Forest32>(features + 7, features);
}

// Block scoring must give every row the one-row score, bit for bit, with
// every kernel: row counts of none, one, and past the block and the window
// that is sorted by sub-model without being multiples of them; strides longer
// than the rows (the extra entries hold values that would change the score
// were they read); rows that select different sub-models, one of them empty;
// plain and equality trees, single leaves, and trees too deep for the group
// walks; inputs on thresholds, NaN, infinities and signed zeros.
template <typename E>
void checkBlocks(uint64_t seed, int32_t numFeatures) {
  std::vector<WalkKernel> kernels{WalkKernel::kPortable, WalkKernel::kScalar};
  if (walkKernelSupported(WalkKernel::kAvx512)) kernels.push_back(WalkKernel::kAvx512);
  std::mt19937_64 rng(seed);
  for (int round = 0; round < 4; ++round) {
    const size_t count = 40 + rng() % 300;
    const int depth = 1 + static_cast<int>(rng() % 9);
    Forest f = test::randomForest(rng(), count, depth, numFeatures, false, round % 2 ? 0.3 : 0.0);
    for (size_t i = 0; i < count; i += 1 + rng() % 24) {
      switch (rng() % 3) {
        case 0: f.trees[i].tree->root = leaf(0.25 * static_cast<double>(i)); break;
        case 1: f.trees[i].tree->root = test::randomFullTree(rng, 10, numFeatures, 0.5); break;
        default: f.trees[i].tree->root = test::chain(E::kMaxGatherDepth + 1 + rng() % 3, numFeatures - 1);
      }
    }
    f.trees.push_back(weighted(split(1, 0.5, leaf(0.125), leaf(-0.125)), 1));
    if (round % 2 == 0) f.equalityFeatures = {0};
    if (round >= 1) {  // models 0 to 3, model 2 empty; 3.5 and NaN pick models 3 and 0
      f.modelSelector =
          weighted(split(1, 0.0, split(2, 0.0, leaf(0.5), leaf(1.5)), split(2, 0.0, leaf(2.5), leaf(3.5))), 1);
      const auto a = static_cast<uint32_t>(count / 3);
      f.modelIndexMap = {a, a + 37, a + 37};
    }
    auto e = compiled<E>(f);
    ASSERT_EQ(e->gatherBytes() > 0, numFeatures < 1000) << "round " << round;
    std::vector<float> values;  // thresholds and special values
    for (const auto& t : e->getTrees()) {
      for (const auto& n : t.nodes) {
        if (n.featureId != E::kLeaf) values.push_back(n.value);
      }
    }
    for (float special : {kNaN, std::numeric_limits<float>::infinity(), -std::numeric_limits<float>::infinity(),
                          0.0f, -0.0f}) {
      values.insert(values.end(), 8, special);
    }
    const size_t stride = static_cast<size_t>(numFeatures) + (round == 0 ? 0 : 1 + rng() % 5);
    const size_t kRows = 300;
    std::uniform_real_distribution<float> u(-1.2f, 1.2f);
    std::vector<float> rows(kRows * stride, kNaN);
    for (size_t r = 0; r < kRows; ++r) {
      for (size_t i = 0; i < static_cast<size_t>(numFeatures); ++i) {
        rows[r * stride + i] = rng() % 3 == 0 ? values[rng() % values.size()] : u(rng);
      }
      if (r % 4 == 0) rows[r * stride + static_cast<size_t>(numFeatures) - 1] = 100.0f;  // deep chains to the end
    }
    for (WalkKernel k : kernels) {
      ASSERT_TRUE(e->useWalkKernel(k));
      for (size_t n : {size_t{0}, size_t{1}, size_t{kBlockRows + 3}, kRows}) {
        std::vector<double> out(n + 1, -7.0);
        e->unnormalizedScores(rows.data(), n, stride, out.data());
        for (size_t r = 0; r < n; ++r) {
          const std::vector<float> x(rows.begin() + static_cast<ptrdiff_t>(r * stride),
                                     rows.begin() + static_cast<ptrdiff_t>((r + 1) * stride));
          ASSERT_TRUE(test::sameBits(out[r], e->unnormalizedScore(x)))
              << "kernel " << static_cast<int>(k) << ", round " << round << ", row " << r << " of " << n;
        }
        EXPECT_EQ(out[n], -7.0);  // nothing written past the rows
      }
    }
  }
}

TEST(Blocks, EveryRowGetsItsOneRowScore16) {
  for (int32_t features : {3, 74, 130}) checkBlocks<Forest16>(features, features);
}
TEST(Blocks, EveryRowGetsItsOneRowScore32) {
  for (int32_t features : {5, 33, 1100}) checkBlocks<Forest32>(features + 11, features);
}

TEST(Blocks, StrideShorterThanTheVectorThrows) {
  Forest f = mapped(4);
  f.trees.push_back(weighted(split(3, 0.5, leaf(1), leaf(2)), 1));
  auto e = compiled(f);
  const std::vector<float> rows(8, 1.0f);
  double out[2];
  EXPECT_THROW(e->unnormalizedScores(rows.data(), 2, 3, out), std::invalid_argument);
  e->unnormalizedScores(rows.data(), 0, 3, out);  // no rows, nothing read
  e->unnormalizedScores(rows.data(), 2, 4, out);
  EXPECT_EQ(out[0], 2.0);
  EXPECT_EQ(out[1], 2.0);
}

TEST(Kernels, ForestsWithoutGroupWalk) {
  // Leaves only: nothing is read from the (empty) vector.
  Forest leaves;
  leaves.baseScore = 0.125;
  for (int i = 0; i < 200; ++i) leaves.trees.push_back(weighted(leaf(i), 0.5));
  auto e = compiled(leaves);
  EXPECT_GT(e->gatherBytes(), 0u);
  EXPECT_TRUE(test::sameBits(e->unnormalizedScore({}), e->unnormalizedScoreOneByOne({})));

  // Too many feature positions for the copy on the stack, and only trees
  // that the group walk does not take: no walk nodes, the compiled walks.
  Forest wide = test::randomForest(5, 20, 4, 3000);
  auto w = compiled(wide);
  Forest eq = mapped(4);
  for (int i = 0; i < 20; ++i) eq.trees.push_back(weighted(split(3, 0.5, leaf(1), leaf(i)), 1));
  eq.equalityFeatures = {3};
  auto q = compiled(eq);
  EXPECT_EQ(w->gatherBytes(), 0u);
  EXPECT_EQ(q->gatherBytes(), 0u);
  std::vector<float> x(3000, 0.5f);
  EXPECT_TRUE(test::sameBits(w->unnormalizedScore(x), w->unnormalizedScoreOneByOne(x)));
  EXPECT_TRUE(test::sameBits(q->unnormalizedScore(x), q->unnormalizedScoreOneByOne(x)));
}

}  // namespace
}  // namespace thornvale

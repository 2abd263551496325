#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/TreeShap.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <memory>
#include <random>
#include <stdexcept>
#include <string>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/RandomForests.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/TreeBuilders.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsemble-inl.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/StdoutCapture.h"

namespace thornvale {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using test::leaf;
using test::split;
using test::weighted;

constexpr float kNaN = std::numeric_limits<float>::quiet_NaN();

std::unique_ptr<BoostingModel> load(const Forest& f) {
  test::StdoutCapture discarded;
  return std::make_unique<BoostingModel>(writeModel(f, 4));
}

double rawScore(const BoostingModel& model, const std::vector<float>& row) {
  double out = 0.0;
  model.rawScores(row.data(), 1, row.size(), &out);
  return out;
}

// The trees [first, end) among the compiled ones that scoring sums for `row`.
std::pair<size_t, size_t> selectedTrees(const BoostingModel& model, const std::vector<float>& row) {
  if (const auto* e = dynamic_cast<const FastTreeEnsembleOOP<short, unsigned>*>(&model.getEnsemble())) {
    return e->selectModel(row);
  }
  return dynamic_cast<const FastTreeEnsembleOOP<int, unsigned>&>(model.getEnsemble()).selectModel(row);
}

size_t subtreeSize(const Node* n) {
  if (n->isLeaf()) return 1;
  const auto* s = static_cast<const LinearNode*>(n);
  return 1 + subtreeSize(s->left.get()) + subtreeSize(s->right.get());
}

// The value of a coalition, straight from the definition: the row's branch at
// splits on positions in `known`, both children weighted by their share of
// the cover elsewhere (half each under a zero cover). Written apart from the
// code under test, over the model's own nodes.
struct Game {
  const Forest& forest;
  const TreeCovers& covers;
  std::vector<float> row;
  std::vector<size_t> trees;  // indices into forest.trees of the summed trees

  bool isEquality(int32_t p) const {
    for (uint32_t e : forest.equalityFeatures) {
      if (e == static_cast<uint32_t>(p)) return true;
    }
    return false;
  }
  bool hasEquality(const Node* n) const {
    if (n->isLeaf()) return false;
    const auto* s = static_cast<const LinearNode*>(n);
    return isEquality(s->pivotIndex) || hasEquality(s->left.get()) || hasEquality(s->right.get());
  }
  double expect(const Node* n, size_t index, bool root, bool eqWalk, double weight,
                const std::vector<double>& cover, unsigned known) const {
    if (n->isLeaf()) {
      return static_cast<float>(static_cast<const ConstantNode*>(n)->value * weight);
    }
    const auto* s = static_cast<const LinearNode*>(n);
    const size_t l = index + 1;
    const size_t r = l + subtreeSize(s->left.get());
    if (known & (1u << s->pivotIndex)) {
      const float x = row[static_cast<size_t>(s->pivotIndex)];
      const auto t = static_cast<float>(s->pivotValue);
      bool right = false;
      if (eqWalk) {
        right = isEquality(s->pivotIndex) ? x != t : x > t;
      } else {
        right = root ? !(x <= t) : x > t;
      }
      return right ? expect(s->right.get(), r, false, eqWalk, weight, cover, known)
                   : expect(s->left.get(), l, false, eqWalk, weight, cover, known);
    }
    const double c = cover[index];
    const double wl = c == 0.0 ? 0.5 : cover[l] / c;
    const double wr = c == 0.0 ? 0.5 : cover[r] / c;
    return wl * expect(s->left.get(), l, false, eqWalk, weight, cover, known) +
           wr * expect(s->right.get(), r, false, eqWalk, weight, cover, known);
  }
  double value(unsigned known) const {
    double v = forest.baseScore;
    for (size_t t : trees) {
      const WeightedTree& w = forest.trees[t];
      const Node* root = w.tree->root.get();
      v += expect(root, 0, true, hasEquality(root), w.weight, covers[t], known);
    }
    return v;
  }
};

std::vector<double> bruteShapley(const Game& g, size_t n) {
  std::vector<double> fact(n + 1, 1.0);
  for (size_t i = 1; i <= n; ++i) fact[i] = fact[i - 1] * static_cast<double>(i);
  std::vector<double> phi(n, 0.0);
  for (size_t i = 0; i < n; ++i) {
    for (unsigned s = 0; s < (1u << n); ++s) {
      if (s & (1u << i)) continue;
      const auto size = static_cast<size_t>(__builtin_popcount(s));
      const double w = fact[size] * fact[n - size - 1] / fact[n];
      phi[i] += w * (g.value(s | (1u << i)) - g.value(s));
    }
  }
  return phi;
}

// The compiled trees map to the forest's trees of non-zero weight.
std::vector<size_t> forestIndices(const Forest& f, std::pair<size_t, size_t> range) {
  std::vector<size_t> kept;
  for (size_t t = 0; t < f.trees.size(); ++t) {
    if (f.trees[t].weight != 0.0) kept.push_back(t);
  }
  return {kept.begin() + static_cast<ptrdiff_t>(range.first),
          kept.begin() + static_cast<ptrdiff_t>(range.second)};
}

// Covers that add up: a node's cover splits between its children, now and
// then all to one side, so that whole subtrees have none.
void addCovers(std::mt19937_64& rng, const Node* n, double cover, std::vector<double>& out) {
  out.push_back(cover);
  if (n->isLeaf()) return;
  std::uniform_real_distribution<double> unit(0.0, 1.0);
  const double u = unit(rng);
  const double left = u < 0.15 ? 0.0 : u > 0.85 ? cover : std::floor(cover * unit(rng));
  const auto* s = static_cast<const LinearNode*>(n);
  addCovers(rng, s->left.get(), left, out);
  addCovers(rng, s->right.get(), cover - left, out);
}

void collectPivots(Node* n, std::mt19937_64& rng, std::vector<float>& pivots) {
  if (n->isLeaf()) return;
  auto* s = static_cast<LinearNode*>(n);
  // Some splits at zero, so that +0 and -0 inputs sit on a threshold.
  if (std::uniform_int_distribution<int>(0, 4)(rng) == 0) s->pivotValue = 0.0;
  pivots.push_back(static_cast<float>(s->pivotValue));
  collectPivots(s->left.get(), rng, pivots);
  collectPivots(s->right.get(), rng, pivots);
}

TEST(AgainstBruteForce, SmallForestsWithNaNsThresholdsEqualityAndSelector) {
  for (uint64_t seed = 1; seed <= 120; ++seed) {
    std::mt19937_64 rng(seed);
    const auto n = static_cast<int32_t>(1 + seed % 8);
    const int depth = 1 + static_cast<int>(seed % 6);
    Forest f = test::randomForest(seed, 2 + seed % 4, depth, n, true, 0.3);
    std::vector<float> pivots;
    for (auto& w : f.trees) collectPivots(w.tree->root.get(), rng, pivots);
    if (seed % 3 == 0) f.equalityFeatures = {static_cast<uint32_t>(seed % static_cast<uint64_t>(n))};
    if (seed % 5 == 0) f.trees[1].weight = seed % 10 == 0 ? -0.0 : 0.0;
    if (seed % 4 == 1) {
      // Model 0 is the first tree kept, model 1 the rest.
      f.modelSelector = weighted(split(0, 0.0, leaf(0.0), leaf(1.5)), 1.0);
      f.modelIndexMap = {1};
    }
    TreeCovers covers;
    for (const auto& w : f.trees) {
      covers.emplace_back();
      addCovers(rng, w.tree->root.get(), seed % 7 == 0 ? 0.0 : 1000.0, covers.back());
    }
    const auto model = load(f);
    const TreeShap shap(*model, covers);
    TreeShap::Scratch scratch;
    std::uniform_int_distribution<int> kind(0, 4);
    std::uniform_real_distribution<float> uniform(-1.5f, 1.5f);
    std::uniform_int_distribution<size_t> pick(0, pivots.size() - 1);
    for (int r = 0; r < 6; ++r) {
      std::vector<float> row(static_cast<size_t>(n));
      for (float& x : row) {
        switch (kind(rng)) {
          case 0: x = kNaN; break;
          case 1: x = kind(rng) < 2 ? 0.0f : -0.0f; break;
          case 2: x = pivots[pick(rng)]; break;
          default: x = uniform(rng);
        }
      }
      const Game g{f, covers, row, forestIndices(f, selectedTrees(*model, row))};
      const size_t all = (1u << n) - 1;
      ASSERT_NEAR(g.value(static_cast<unsigned>(all)), rawScore(*model, row), 1e-12) << "seed " << seed;
      std::vector<double> phi(static_cast<size_t>(n));
      const double bias = shap.explain(row.data(), phi.data(), scratch);
      EXPECT_NEAR(bias, g.value(0), 1e-12) << "seed " << seed;
      const std::vector<double> expected = bruteShapley(g, static_cast<size_t>(n));
      for (size_t i = 0; i < phi.size(); ++i) {
        EXPECT_NEAR(phi[i], expected[i], 1e-12) << "seed " << seed << " row " << r << " position " << i;
      }
    }
  }
}

TEST(SumProperty, LargerForestsWithBackgroundCovers) {
  for (uint64_t seed : {11u, 12u, 13u}) {
    Forest f = test::randomForest(seed, 60, 6, 40, true, 0.2);
    f.equalityFeatures = {3};
    const auto model = load(f);
    std::mt19937_64 rng(seed);
    std::uniform_real_distribution<float> uniform(-1.2f, 1.2f);
    const size_t width = 40;
    std::vector<float> rows(200 * width);
    for (float& x : rows) x = uniform(rng) < -1.1f ? kNaN : uniform(rng);
    const TreeShap shap(*model, backgroundCovers(*model, rows.data(), 100, width));
    std::vector<double> out(100 * (width + 1));
    // Explain the rows that were not in the background.
    shap.explainRows(rows.data() + 100 * width, 100, width, out.data());
    std::vector<double> raw(100);
    model->rawScores(rows.data() + 100 * width, 100, width, raw.data());
    for (size_t r = 0; r < 100; ++r) {
      double sum = out[r * (width + 1) + width];
      double scale = 0.0;
      for (size_t i = 0; i < width; ++i) {
        sum += out[r * (width + 1) + i];
        scale += std::abs(out[r * (width + 1) + i]);
      }
      ASSERT_GT(scale, 0.0);
      EXPECT_NEAR(sum, raw[r], 1e-9 * scale) << "seed " << seed << " row " << r;
    }
  }
}

std::vector<float> randomRows(std::mt19937_64& rng, size_t count, size_t width, const std::vector<float>& pivots) {
  std::uniform_int_distribution<int> kind(0, 5);
  std::uniform_real_distribution<float> uniform(-1.2f, 1.2f);
  std::vector<float> rows(count * width);
  for (float& x : rows) {
    const int k = kind(rng);
    x = k == 0 ? kNaN : k == 1 && !pivots.empty() ? pivots[rng() % pivots.size()] : uniform(rng);
  }
  return rows;
}

TEST(Rows, BlocksOfRowsGiveTheBitsOfSingleRows) {
  // Three sub-models, so that rows are regrouped; 45 rows give full blocks,
  // padded ones and single rows.
  Forest f = test::randomForest(7, 30, 6, 12, true, 0.25);
  f.equalityFeatures = {2};
  f.modelSelector = weighted(split(0, -0.3, leaf(0.0), split(1, 0.4, leaf(1.0), leaf(2.9))), 1.0);
  f.modelIndexMap = {10, 20};
  std::mt19937_64 rng(7);
  std::vector<float> pivots;
  for (auto& w : f.trees) collectPivots(w.tree->root.get(), rng, pivots);
  const auto model = load(f);
  const size_t width = 12;
  const std::vector<float> background = randomRows(rng, 50, width, pivots);
  const TreeShap shap(*model, backgroundCovers(*model, background.data(), 50, width));
  for (const size_t count : {45u, 5u, 2u}) {
    // Rows 13 apart, to check the stride.
    std::vector<float> rows = randomRows(rng, count, 13, pivots);
    std::vector<double> out(count * (width + 1));
    shap.explainRows(rows.data(), count, 13, out.data());
    TreeShap::Scratch scratch;
    for (size_t r = 0; r < count; ++r) {
      std::vector<double> phi(width);
      const double bias = shap.explain(rows.data() + r * 13, phi.data(), scratch);
      EXPECT_EQ(out[r * (width + 1) + width], bias) << "row " << r;
      for (size_t i = 0; i < width; ++i) EXPECT_EQ(out[r * (width + 1) + i], phi[i]) << "row " << r;
    }
  }
}

// A tree whose path tests more than 32 positions takes another walk. Hang a
// chain of 40 splits on positions 6 to 45 below each tree, behind an edge
// without cover that no finite row takes: the contributions must stay those
// of the tree without it.
TEST(DeepTrees, ManyPositionsOnAPathExplainAsWithout) {
  const int32_t width = 46;
  Forest plain = test::randomForest(5, 8, 5, 6, false, 0.2);
  Forest deep = test::randomForest(5, 8, 5, 6, false, 0.2);
  deep.featureMapping.clear();
  for (int32_t i = 0; i < width; ++i) {
    deep.featureMapping.push_back(static_cast<uint32_t>(i + 1));
  }
  plain.featureMapping = deep.featureMapping;
  std::mt19937_64 rng(5);
  TreeCovers plainCovers;
  TreeCovers deepCovers;
  for (size_t t = 0; t < deep.trees.size(); ++t) {
    plainCovers.emplace_back();
    addCovers(rng, plain.trees[t].tree->root.get(), 500.0, plainCovers.back());
    std::unique_ptr<Node> chain = leaf(3.0);
    for (int32_t p = width - 1; p >= 6; --p) chain = split(p, 0.0, leaf(-2.0), std::move(chain));
    // Every finite row goes left at a split on the largest float.
    auto& root = deep.trees[t].tree->root;
    root = split(0, std::numeric_limits<float>::max(), std::move(root), std::move(chain));
    deepCovers.emplace_back(1, 500.0);
    deepCovers.back().insert(deepCovers.back().end(), plainCovers.back().begin(), plainCovers.back().end());
    deepCovers.back().resize(deepCovers.back().size() + 81, 0.0);
  }
  const auto plainModel = load(plain);
  const auto deepModel = load(deep);
  const TreeShap plainShap(*plainModel, plainCovers);
  const TreeShap deepShap(*deepModel, deepCovers);
  // Without NaN: the new root would send it into the chain, and the old root
  // would send it the other way.
  std::vector<float> rows = randomRows(rng, 20, static_cast<size_t>(width), {});
  for (float& x : rows) x = std::isnan(x) ? 0.5f : x;
  std::vector<double> expected(20 * (width + 1));
  std::vector<double> actual(20 * (width + 1));
  plainShap.explainRows(rows.data(), 20, width, expected.data());
  deepShap.explainRows(rows.data(), 20, width, actual.data());
  for (size_t i = 0; i < actual.size(); ++i) EXPECT_NEAR(actual[i], expected[i], 1e-12) << "entry " << i;
}

// baseScore 0.5; a zero-weight tree first, then
// f0 <= 1 ? (f1 <= 0 ? -1 : 2) : 4 with weight 0.5, in pre-order
// [root, f1 split, -1, 2, 4].
Forest handForest() {
  Forest f;
  f.baseScore = 0.5;
  f.inputKeys = {"count", "span"};
  f.featureMapping = {3, 17};
  f.trees.push_back(weighted(split(1, 0.0, leaf(9), leaf(9)), 0.0));
  f.trees.push_back(weighted(split(0, 1.0, split(1, 0.0, leaf(-1), leaf(2)), leaf(4)), 0.5));
  return f;
}

TEST(BackgroundCovers, HandTreeCountsAndContributions) {
  const auto model = load(handForest());
  // NaN goes right at the root and left below it.
  const std::vector<float> background = {0.5f, kNaN, 0.0f, 1.0f, 0.0f, 1.0f, kNaN, 0.0f};
  const TreeCovers covers = backgroundCovers(*model, background.data(), 4, 2);
  EXPECT_THAT(covers[0], ElementsAre(4, 1, 3));
  EXPECT_THAT(covers[1], ElementsAre(4, 3, 1, 2, 1));

  // Leaves -0.5, 1, 2 with shares 1/4, 2/4, 1/4: the mean is 0.875. For the
  // row (0, 1): v({}) = 0.875, v({0}) = 0.5, v({1}) = 1.25, v({0, 1}) = 1, so
  // position 0 gets -0.3125 and position 1 gets 0.4375.
  const TreeShap shap(*model, covers);
  TreeShap::Scratch scratch;
  const std::vector<float> row = {0.0f, 1.0f};
  double phi[2];
  EXPECT_DOUBLE_EQ(shap.explain(row.data(), phi, scratch), 1.375);
  EXPECT_DOUBLE_EQ(phi[0], -0.3125);
  EXPECT_DOUBLE_EQ(phi[1], 0.4375);
}

TEST(ZeroCovers, SplitsWithoutCoverWeighChildrenEqually) {
  const auto model = load(handForest());
  const std::vector<float> row = {0.0f, 1.0f};
  double phi[2];
  TreeShap::Scratch scratch;
  {
    // No cover anywhere: the mean is (-0.5 + 1) / 4 + 2 / 2 = 1.125.
    const TreeShap shap(*model, {{0, 0, 0}, {0, 0, 0, 0, 0}});
    const double bias = shap.explain(row.data(), phi, scratch);
    EXPECT_DOUBLE_EQ(bias, 1.625);
    EXPECT_DOUBLE_EQ(bias + phi[0] + phi[1], rawScore(*model, row));
  }
  {
    // The row's own branch has no cover: v({}) = 2, v({0}) = 0.25,
    // v({1}) = 2, v({0, 1}) = 1.
    const TreeShap shap(*model, {{1, 1, 0}, {4, 0, 0, 0, 4}});
    EXPECT_DOUBLE_EQ(shap.explain(row.data(), phi, scratch), 2.5);
    EXPECT_DOUBLE_EQ(phi[0], -1.375);
    EXPECT_DOUBLE_EQ(phi[1], 0.375);
  }
}

TEST(Covers, RefusedShapesAndValuesNameTheTreeAndNode) {
  const auto model = load(handForest());
  const auto message = [&](const TreeCovers& covers) {
    try {
      TreeShap shap(*model, covers);
    } catch (const std::invalid_argument& e) {
      return std::string(e.what());
    }
    return std::string("accepted");
  };
  const double inf = std::numeric_limits<double>::infinity();
  EXPECT_THAT(message({{1, 1, 1}}), HasSubstr("given for 1 trees but the model has 2"));
  EXPECT_THAT(message({{1, 1, 1}, {1, 1, 1, 1}}), HasSubstr("tree 1: the tree has 5 nodes but 4"));
  // A zero-weight tree is checked too.
  EXPECT_THAT(message({{1, 1}, {1, 1, 1, 1, 1}}), HasSubstr("tree 0: the tree has 3 nodes"));
  EXPECT_THAT(message({{1, 1, 1}, {1, 1, -1, 1, 1}}), HasSubstr("tree 1, node 2: cover -1"));
  EXPECT_THAT(message({{1, 1, 1}, {1, 1, 1, std::nan(""), 1}}), HasSubstr("tree 1, node 3"));
  EXPECT_THAT(message({{1, inf, 1}, {1, 1, 1, 1, 1}}), HasSubstr("tree 0, node 1"));
  EXPECT_THAT(message({{1, 1, 1}, {1, 1e-310, 1e300, 1, 1}}), HasSubstr("tree 1, node 1"));
  EXPECT_EQ(message({{1, 1, 1}, {1, 1, 1, 1, 1}}), "accepted");
}

TEST(Rows, ModelWithoutFeatureMappingHasOnlyItsConstantScore) {
  Forest f = handForest();
  f.featureMapping.clear();
  const auto model = load(f);
  const TreeShap shap(*model, {{1, 1, 1}, {1, 1, 1, 1, 1}});
  EXPECT_EQ(shap.numContributions(), 0u);
  double bias = 0.0;
  shap.explainRows(nullptr, 1, 0, &bias);
  EXPECT_EQ(bias, model->rawScore(FeatureMap{}));
}

TEST(Rows, ShortStrideIsRefused) {
  const auto model = load(handForest());
  const TreeShap shap(*model, {{1, 1, 1}, {1, 1, 1, 1, 1}});
  const float rows[2] = {0, 0};
  double out[3];
  EXPECT_THROW(shap.explainRows(rows, 1, 1, out), std::invalid_argument);
  EXPECT_THROW(backgroundCovers(*model, rows, 1, 1), std::invalid_argument);
}

}  // namespace
}  // namespace thornvale

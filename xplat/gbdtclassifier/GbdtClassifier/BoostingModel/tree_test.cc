#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>
#include <sstream>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/ForestComparison.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/RandomForests.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/TreeBuilders.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/SmallStack.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/StdoutCapture.h"

namespace thornvale {
namespace {

using test::chain;
using test::leaf;
using test::split;

const double kNaN = std::numeric_limits<double>::quiet_NaN();

// f0 <= 1 ? 10 : (f1 <= 2 ? 20 : 30)
std::unique_ptr<Tree> smallTree() {
  return test::tree(split(0, 1.0, leaf(10), split(1, 2.0, leaf(20), leaf(30))));
}

std::string rules(const Node& n) {
  std::ostringstream out;
  n.printRules(out);
  return out.str();
}

TEST(TreeRouting, EqualGoesLeftGreaterAndNaNGoRight) {
  auto t = smallTree();
  const Node& root = *t->root;
  EXPECT_EQ(root.evaluate({1.0, 0.0}), 10);
  EXPECT_EQ(root.evaluate({std::nextafter(1.0, 2.0), 2.0}), 20);
  EXPECT_EQ(root.evaluate({5.0, 2.5}), 30);
  EXPECT_EQ(root.evaluate({kNaN, 0.0}), 20);  // NaN right at f0, then left at f1
  EXPECT_EQ(root.evaluate({kNaN, kNaN}), 30);
  EXPECT_EQ(root.findLeaf({5.0, kNaN}),
            static_cast<const LinearNode&>(*static_cast<const LinearNode&>(root).right).right.get());

  auto nanPivot = split(0, kNaN, leaf(1), leaf(2));
  EXPECT_EQ(nanPivot->evaluate({-1e300}), 2);
}

TEST(TreeRouting, SingleLeafTree) {
  auto only = leaf(4.5);
  EXPECT_EQ(only->evaluate({}), 4.5);
  EXPECT_EQ(only->findLeaf({}), only.get());
  std::vector<const Node*> leaves;
  only->collectLeaves(leaves);
  ASSERT_EQ(leaves.size(), 1u);
  EXPECT_EQ(rules(*only), "4.5\t\n");
}

TEST(TreeSweep, MatchesOneEvaluationPerValue) {
  std::mt19937_64 rng(7);
  for (int round = 0; round < 20; ++round) {
    auto root = test::randomFullTree(rng, 5, 3);
    std::uniform_real_distribution<double> u(-1.5, 1.5);
    std::vector<double> features{u(rng), u(rng), u(rng)};
    std::vector<double> values;
    for (int i = 0; i < 40; ++i) values.push_back(u(rng));
    // Exact pivots and duplicates exercise the "not greater" boundary.
    auto* top = static_cast<const LinearNode*>(root.get());
    values.push_back(top->pivotValue);
    values.push_back(top->pivotValue);
    std::sort(values.begin(), values.end());
    const int32_t swept = round % 3;

    std::vector<double> out(values.size(), 1.0);
    root->accumulateSweep(0.5, features, swept, static_cast<int32_t>(values.size()),
                          values.data(), out.data());
    root->accumulateSweep(2.0, features, swept, static_cast<int32_t>(values.size()),
                          values.data(), out.data());
    for (size_t i = 0; i < values.size(); ++i) {
      std::vector<double> f = features;
      f[swept] = values[i];
      const double v = root->evaluate(f);
      EXPECT_EQ(out[i], 1.0 + 0.5 * v + 2.0 * v) << "round " << round << " value " << i;
    }
  }
}

TEST(TreePrinting, PrintTreeIndentsByDepthAndNamesFeatures) {
  auto t = smallTree();
  linkTree(*t, {"size", ""});  // an empty name falls back to the index
  std::ostringstream out;
  t->root->printTree(out, 0);
  EXPECT_EQ(out.str(),
            "If size <= 1 then\n"
            "\tFinal value = 10\n"
            "If size > 1 then\n"
            "\tIf 1 <= 2 then\n"
            "\t\tFinal value = 20\n"
            "\tIf 1 > 2 then\n"
            "\t\tFinal value = 30\n");
  std::ostringstream nested;
  t->root->printTree(nested, 1);
  EXPECT_EQ(nested.str().substr(0, 20), "\tIf size <= 1 then\n\t");
}

TEST(TreePrinting, PrintWritesOneLineDescriptions) {
  test::StdoutCapture out;
  leaf(0.5)->print();
  split(7, -2.25, leaf(0), leaf(1))->print();
  EXPECT_EQ(out.take(),
            "ConstantNode: value = 0.500000"
            "LinearNode: pivot index = 7, pivot value = -2.250000");
}

TEST(TreePrinting, RulesOrderedByValueWithAllBoundForms) {
  // f0 <= 1 ? 0.2 : (f0 <= 4 ? (f2 <= -3 ? 0.9 : 0.5) : 0.7)
  auto t = test::tree(split(0, 1.0, leaf(0.2),
                               split(0, 4.0, split(2, -3.0, leaf(0.9), leaf(0.5)), leaf(0.7))));
  linkTree(*t, {"a", "b", "c"});
  EXPECT_EQ(rules(*t->root),
            "0.9\t1 < a <= 4; c <= -3; \n"
            "0.7\t4 < a; \n"
            "0.5\t1 < a <= 4; -3 < c; \n"
            "0.2\ta <= 1; \n");

  // Going left at 4 and then at 2 keeps the tighter upper bound; a right
  // branch at a zero or negative pivot still prints its lower bound.
  auto u = test::tree(
      split(0, 4.0, split(0, 2.0, leaf(1), leaf(2)), split(1, -0.5, leaf(3), leaf(4))));
  linkTree(*u, {});
  EXPECT_EQ(rules(*u->root), "4\t4 < 0; -0.5 < 1; \n3\t4 < 0; 1 <= -0.5; \n2\t2 < 0 <= 4; \n1\t0 <= 2; \n");
}

// Leaves of equal value come out from left to right, whatever the standard
// library's sort would do with ties (64 leaves, past the sizes that are
// sorted by insertion); NaN values come last.
TEST(TreePrinting, RulesOfEqualLeavesComeLeftToRight) {
  std::mt19937_64 rng(5);
  auto t = test::tree(test::randomFullTree(rng, 6, 2));
  std::vector<const Node*> leaves;
  t->root->collectLeaves(leaves);
  ASSERT_EQ(leaves.size(), 64u);
  for (size_t i = 0; i < leaves.size(); ++i) {
    const_cast<ConstantNode*>(static_cast<const ConstantNode*>(leaves[i]))->value = i % 3 == 0 ? 2.0 : 1.0;
  }
  linkTree(*t, {"x", "y"});
  std::ostringstream expected;
  for (double value : {2.0, 1.0}) {
    for (const Node* l : leaves) {
      if (static_cast<const ConstantNode*>(l)->value == value) l->printRules(expected);
    }
  }
  EXPECT_EQ(rules(*t->root), expected.str());

  auto v = test::tree(split(0, 4.0, split(0, 2.0, leaf(kNaN), leaf(1)), split(0, 6.0, leaf(3), leaf(2))));
  linkTree(*v, {});
  EXPECT_EQ(rules(*v->root), "3\t4 < 0 <= 6; \n2\t6 < 0; \n1\t2 < 0 <= 4; \nnan\t0 <= 2; \n");
}

// A rule's bound is folded from the leaf upwards with std::max (lower) and
// std::min (upper): the deeper pivot wins a tie of +0 and -0, and a NaN pivot
// counts only when it is the deepest on its feature.
TEST(TreePrinting, RuleBoundsOfSignedZeroAndNaNPivots) {
  auto printed = [](std::unique_ptr<Node> root) {
    auto t = test::tree(std::move(root));
    linkTree(*t, {"x", "y"});
    return rules(*t->root);
  };
  EXPECT_EQ(printed(split(0, -0.0, split(0, 0.0, leaf(1), leaf(2)), split(0, 0.0, leaf(3), leaf(4)))),
            "4\t0 < x; \n"
            "3\t-0 < x <= 0; \n"
            "2\t0 < x <= -0; \n"
            "1\tx <= 0; \n");
  EXPECT_EQ(printed(split(0, 0.0, split(0, -0.0, leaf(1), leaf(2)), split(0, -0.0, leaf(3), leaf(4)))),
            "4\t-0 < x; \n"
            "3\t0 < x <= -0; \n"
            "2\t-0 < x <= 0; \n"
            "1\tx <= -0; \n");
  EXPECT_EQ(printed(split(1, kNaN, split(1, 1.0, leaf(5), leaf(6)), split(1, 2.0, leaf(7), leaf(8)))),
            "8\t2 < y; \n"
            "7\tnan < y <= 2; \n"
            "6\t1 < y <= nan; \n"
            "5\ty <= 1; \n");
  EXPECT_EQ(printed(split(1, 1.0, split(1, kNaN, leaf(9), leaf(10)), split(1, kNaN, leaf(11), leaf(12)))),
            "12\tnan < y; \n"
            "11\t1 < y <= nan; \n"
            "10\tnan < y <= 1; \n"
            "9\ty <= nan; \n");
}

// The root's printRules (one depth-first pass) must write exactly what the
// leaves' own printRules (a walk up the parent links each) write, in the same
// order, also for NaN and signed-zero pivots where the bound folds depend on
// order.
TEST(TreePrinting, RulesOfRootMatchRulesOfEachLeaf) {
  std::mt19937_64 rng(11);
  const double pivots[] = {kNaN, -kNaN, 0.0, -0.0, 1.0, -1.0, 0.5};
  for (int round = 0; round < 30; ++round) {
    auto t = test::tree(test::randomFullTree(rng, 6, 2));
    std::vector<const Node*> leaves;
    t->root->collectLeaves(leaves);
    // Distinct leaf values make the order unambiguous; pivots from a small set
    // make repeated, NaN and signed-zero bounds common.
    std::vector<Node*> pending{t->root.get()};
    double next = 0.0;
    while (!pending.empty()) {
      Node* n = pending.back();
      pending.pop_back();
      if (n->isLeaf()) {
        static_cast<ConstantNode*>(n)->value = (next += 1.0);
        continue;
      }
      auto* s = static_cast<LinearNode*>(n);
      s->pivotValue = pivots[rng() % 7];
      pending.push_back(s->left.get());
      pending.push_back(s->right.get());
    }
    linkTree(*t, {"x", "y"});
    std::ostringstream expected;
    std::vector<const Node*> byValue = leaves;
    std::sort(byValue.begin(), byValue.end(), [](const Node* a, const Node* b) {
      return static_cast<const ConstantNode*>(a)->value > static_cast<const ConstantNode*>(b)->value;
    });
    for (const Node* l : byValue) l->printRules(expected);
    ASSERT_EQ(rules(*t->root), expected.str()) << "round " << round;
  }
}

TEST(TreeCopies, CloneIsDeepIndependentAndUnlinked) {
  auto t = smallTree();
  std::vector<const Node*> leaves;
  t->root->collectLeaves(leaves);
  ASSERT_EQ(leaves.size(), 3u);
  EXPECT_EQ(leaves[0]->evaluate({}) + 2 * leaves[1]->evaluate({}), 50);  // left to right
  t->featureValues = {{3, 0.5}, {-1, 2.0}};
  linkTree(*t, {"p", "q"});
  Tree copy(*t);
  std::string why;
  EXPECT_TRUE(test::sameNodes(t->root.get(), copy.root.get(), &why)) << why;
  EXPECT_NE(copy.root.get(), t->root.get());
  EXPECT_EQ(copy.root->tree, nullptr);
  EXPECT_EQ(copy.featureValues, t->featureValues);
  EXPECT_EQ(copy.featureNames, t->featureNames);
  static_cast<LinearNode&>(*t->root).pivotValue = 100;
  EXPECT_EQ(static_cast<LinearNode&>(*copy.root).pivotValue, 1.0);

}

// Every operation on a tree a million levels deep, on a 256 KiB stack.
TEST(DeepTree, MillionLevelChainOnSmallStack) {
  constexpr size_t kDepth = 1000000;
  test::runOnSmallStack([] {
    auto t = test::tree(chain(kDepth));
    const std::vector<double> bottom{2e6};
    EXPECT_EQ(t->root->evaluate(bottom), -1.0);
    EXPECT_EQ(t->root->findLeaf({kDepth - 1.5})->evaluate({}), kDepth - 1.0);

    Tree copy(*t);
    EXPECT_EQ(copy.root->evaluate(bottom), -1.0);

    std::vector<const Node*> leaves;
    copy.root->collectLeaves(leaves);
    EXPECT_EQ(leaves.size(), kDepth + 1);

    const double values[3] = {-5.0, 10.5, 3e6};
    double out[3] = {0, 0, 0};
    t->root->accumulateSweep(2.0, {0.0}, 0, 3, values, out);
    EXPECT_EQ(out[0], 0.0);
    EXPECT_EQ(out[1], 22.0);
    EXPECT_EQ(out[2], -2.0);

    linkTree(*t, {"depth"});
    std::ostringstream text;
    t->root->printRules(text);
    const std::string all = text.str();
    EXPECT_EQ(std::count(all.begin(), all.end(), '\n'), static_cast<long>(kDepth + 1));
    EXPECT_EQ(all.substr(0, all.find('\n')), "999999\t999998 < depth <= 999999; ");
  });
}

TEST(DeepTree, PrintTreeOfDeepChainOnSmallStack) {
  test::runOnSmallStack([] {
    auto t = test::tree(chain(3000));
    std::ostringstream text;
    t->root->printTree(text, 0);
    const std::string all = text.str();
    EXPECT_EQ(std::count(all.begin(), all.end(), '\n'), 3 * 3000 + 1);
    EXPECT_NE(all.find(std::string(3000, '\t') + "Final value = -1\n"), std::string::npos);
  });
}

}  // namespace
}  // namespace thornvale

// For the engine's tests, benchmarks and sample generators: node trees and
// weighted trees built by hand, and a chain of any depth. Each builder returns
// a new tree that the caller owns; nodes come from the heap. Header-only; not
// part of the library.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <utility>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"

namespace thornvale::test {

inline std::unique_ptr<Node> leaf(double value) { return std::make_unique<ConstantNode>(value); }

inline std::unique_ptr<Node> split(int32_t index, double pivot, std::unique_ptr<Node> left,
                                   std::unique_ptr<Node> right) {
  auto n = std::make_unique<LinearNode>(index, pivot);
  n->left = std::move(left);
  n->right = std::move(right);
  return n;
}

inline std::unique_ptr<Tree> tree(std::unique_ptr<Node> root) {
  auto t = std::make_unique<Tree>();
  t->root = std::move(root);
  return t;
}

inline WeightedTree weighted(std::unique_ptr<Node> root, double weight) {
  return WeightedTree(tree(std::move(root)), weight);
}

// A chain of `depth` splits on `feature`: split i (from the top) has
// threshold i, a leaf of value i on the left and the next split on the
// right; the last split's right child is a leaf of value -1. An input above
// depth - 1 walks the whole chain.
inline std::unique_ptr<Node> chain(size_t depth, int32_t feature = 0) {
  std::unique_ptr<Node> below = leaf(-1.0);
  for (size_t i = depth; i-- > 0;) {
    below = split(feature, static_cast<double>(i), leaf(static_cast<double>(i)), std::move(below));
  }
  return below;
}

}  // namespace thornvale::test

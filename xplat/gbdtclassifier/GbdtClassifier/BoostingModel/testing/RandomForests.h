// For the engine's tests, benchmarks and sample generators: random trees and
// forests, the same for the same seed under every compiler and one standard
// library (the distributions are its own). The caller owns what they return; nodes come
// from the heap. Header-only; not part of the library.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/TreeBuilders.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"

namespace thornvale::test {

// A tree of the given depth with random features in [0, numFeatures),
// thresholds in [-1, 1) and leaves in [-0.5, 0.5). It is full unless
// `earlyLeaf` > 0: below the first two levels each node is then a leaf with
// that probability, giving the ragged shapes that trainers produce.
inline std::unique_ptr<Node> randomFullTree(std::mt19937_64& rng, int depth, int32_t numFeatures,
                                            double earlyLeaf = 0.0) {
  std::uniform_int_distribution<int32_t> feature(0, numFeatures - 1);
  std::uniform_real_distribution<double> pivot(-1.0, 1.0);
  std::uniform_real_distribution<double> value(-0.5, 0.5);
  std::uniform_real_distribution<double> chance(0.0, 1.0);
  std::unique_ptr<Node> root;
  std::vector<std::pair<std::unique_ptr<Node>*, int>> pending{{&root, depth}};
  while (!pending.empty()) {
    auto [slot, d] = pending.back();
    pending.pop_back();
    if (d == 0 || (earlyLeaf > 0.0 && depth - d >= 2 && chance(rng) < earlyLeaf)) {
      *slot = leaf(value(rng));
      continue;
    }
    // One draw per statement: the order of a call's arguments differs between
    // compilers.
    const double threshold = pivot(rng);
    const int32_t index = feature(rng);
    auto s = std::make_unique<LinearNode>(index, threshold);
    LinearNode* raw = s.get();
    *slot = std::move(s);
    pending.emplace_back(&raw->right, d - 1);
    pending.emplace_back(&raw->left, d - 1);
  }
  return root;
}

// A forest of `count` random trees (see randomFullTree) over `numFeatures`
// inputs, with input keys "f0".."f<n-1>" (or none when withKeys is false) and
// featureMapping 1..numFeatures (feature ids as the classifier numbers them).
inline Forest randomForest(uint64_t seed, size_t count, int depth, int32_t numFeatures,
                           bool withKeys = true, double earlyLeaf = 0.0) {
  std::mt19937_64 rng(seed);
  std::uniform_real_distribution<double> weight(0.05, 0.3);
  Forest f;
  f.baseScore = -0.25;
  for (size_t i = 0; i < count; ++i) {
    const double w = weight(rng);
    f.trees.push_back(weighted(randomFullTree(rng, depth, numFeatures, earlyLeaf), w));
  }
  for (int32_t i = 0; i < numFeatures; ++i) {
    if (withKeys) f.inputKeys.push_back("f" + std::to_string(i));
    f.featureMapping.push_back(static_cast<uint32_t>(i + 1));
  }
  return f;
}

}  // namespace thornvale::test

// Helpers for the engine's tests, benchmarks and sample generators: tree
// builders, random forests, structural comparison of forests, and a runner
// for code that must cope with a small thread stack (LogCapture.h records glog
// messages, StdoutCapture.h standard output). Header-only; not part of the
// library.
#pragma once

#include <glog/logging.h>
#include <pthread.h>

#include <cmath>
#include <cstdint>
#include <cstring>
#include <exception>
#include <functional>
#include <memory>
#include <mutex>
#include <random>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

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
    auto s = std::make_unique<LinearNode>(feature(rng), pivot(rng));
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
    f.trees.push_back(weighted(randomFullTree(rng, depth, numFeatures, earlyLeaf), weight(rng)));
  }
  for (int32_t i = 0; i < numFeatures; ++i) {
    if (withKeys) f.inputKeys.push_back("f" + std::to_string(i));
    f.featureMapping.push_back(static_cast<uint32_t>(i + 1));
  }
  return f;
}

inline bool sameBits(double a, double b) { return std::memcmp(&a, &b, sizeof a) == 0; }

// Compares two node trees node by node (bitwise values); `why` says where
// they first differ.
inline bool sameNodes(const Node* a, const Node* b, std::string* why) {
  std::vector<std::pair<const Node*, const Node*>> pending{{a, b}};
  while (!pending.empty()) {
    auto [x, y] = pending.back();
    pending.pop_back();
    if ((x == nullptr) != (y == nullptr)) return *why = "one node is absent", false;
    if (x == nullptr) continue;
    if (x->isLeaf() != y->isLeaf()) return *why = "leaf against split", false;
    if (x->isLeaf()) {
      if (!sameBits(static_cast<const ConstantNode*>(x)->value,
                    static_cast<const ConstantNode*>(y)->value)) {
        return *why = "leaf values differ", false;
      }
      continue;
    }
    const auto* sx = static_cast<const LinearNode*>(x);
    const auto* sy = static_cast<const LinearNode*>(y);
    if (sx->pivotIndex != sy->pivotIndex || !sameBits(sx->pivotValue, sy->pivotValue)) {
      return *why = "splits differ", false;
    }
    pending.emplace_back(sx->right.get(), sy->right.get());
    pending.emplace_back(sx->left.get(), sy->left.get());
  }
  return true;
}

inline bool sameWeightedTree(const WeightedTree& a, const WeightedTree& b, std::string* why) {
  if (!sameBits(a.weight, b.weight)) return *why = "weights differ", false;
  if ((a.tree == nullptr) != (b.tree == nullptr)) return *why = "one tree is absent", false;
  if (a.tree == nullptr) return true;
  if (a.tree->featureValues.size() != b.tree->featureValues.size()) {
    return *why = "featureValues differ", false;
  }
  auto ia = a.tree->featureValues.begin();
  for (const auto& [key, value] : b.tree->featureValues) {
    if (ia->first != key || !sameBits(ia->second, value)) return *why = "featureValues differ", false;
    ++ia;
  }
  return sameNodes(a.tree->root.get(), b.tree->root.get(), why);
}

inline bool sameForest(const Forest& a, const Forest& b, std::string* why) {
  if (!sameBits(a.baseScore, b.baseScore)) return *why = "baseScore differs", false;
  if (a.trees.size() != b.trees.size()) return *why = "tree counts differ", false;
  for (size_t i = 0; i < a.trees.size(); ++i) {
    if (!sameWeightedTree(a.trees[i], b.trees[i], why)) {
      *why = "tree " + std::to_string(i) + ": " + *why;
      return false;
    }
  }
  if (a.inputKeys != b.inputKeys) return *why = "inputKeys differ", false;
  if (!sameWeightedTree(a.modelSelector, b.modelSelector, why)) {
    *why = "modelSelector: " + *why;
    return false;
  }
  if (a.modelIndexMap != b.modelIndexMap) return *why = "modelIndexMap differs", false;
  if (a.equalityFeatures != b.equalityFeatures) return *why = "equalityFeatures differ", false;
  if (a.featureMapping != b.featureMapping) return *why = "featureMapping differs", false;
  if (a.averageFeatureValues.size() != b.averageFeatureValues.size()) {
    return *why = "averageFeatureValues differ", false;
  }
  auto ia = a.averageFeatureValues.begin();
  for (const auto& [id, value] : b.averageFeatureValues) {
    if (ia->first != id || !sameBits(ia->second, value)) {
      return *why = "averageFeatureValues differ", false;
    }
    ++ia;
  }
  return true;
}

// Runs `body` on a thread whose stack is `stackBytes` long and rethrows what
// it throws; code that recursed per tree level would overflow such a stack.
inline void runOnSmallStack(const std::function<void()>& body, size_t stackBytes = 256 * 1024) {
  struct Job {
    const std::function<void()>* body;
    std::exception_ptr error;
  } job{&body, nullptr};
  pthread_attr_t attr;
  pthread_attr_init(&attr);
  pthread_attr_setstacksize(&attr, stackBytes);
  pthread_t thread;
  const int rc = pthread_create(
      &thread, &attr,
      [](void* arg) -> void* {
        auto* j = static_cast<Job*>(arg);
        try {
          (*j->body)();
        } catch (...) {
          j->error = std::current_exception();
        }
        return nullptr;
      },
      &job);
  pthread_attr_destroy(&attr);
  if (rc != 0) throw std::runtime_error("cannot start a thread");
  pthread_join(thread, nullptr);
  if (job.error) std::rethrow_exception(job.error);
}

}  // namespace thornvale::test

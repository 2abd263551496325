// For the engine's tests: bit-exact comparison of doubles, node trees,
// weighted trees and whole forests. The comparisons return whether the two
// are the same and, when not, say in `why` where they first differ.
// Header-only; not part of the library.
#pragma once

#include <cstring>
#include <string>
#include <utility>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"

namespace thornvale::test {

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

}  // namespace thornvale::test

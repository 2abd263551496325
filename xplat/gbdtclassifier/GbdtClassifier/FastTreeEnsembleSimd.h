// The vector kernel that walks a group of compiled trees at once, in lock
// step, the format of the nodes it walks, and buildWalkForest(), which lays
// compiled trees out in that format. The choice among all walk kernels is
// WalkKernel.h's; walkKernelSupported() and bestWalkKernel() are defined in
// FastTreeEnsembleSimd.cc, beside the CPU test they need.
//
// The trees to walk live in one array of 8-byte WalkNode, so that a single
// gather base serves every lane and one 64-bit load brings a whole node; a
// lane's position is the index of its current node. A node holds the feature
// it tests and the distance to its first child in one word. Every node is a
// split: a leaf is a split on a feature slot that always holds NaN, whose
// first child is the leaf itself (distance 0; x > t is false for NaN, so it
// stays put) and whose threshold is the leaf value. Every root is a real
// split; a tree that is one leaf gets a root on the NaN slot whose two
// children are that leaf.
//
// walkGroup() runs `rounds` steps for kWalkGroup lanes (trees): the first step goes to
// the second child unless x <= t, the later ones when x > t (the plain walk's
// NaN rule), then stores the threshold of each lane's node, its leaf value.
// The caller guarantees that every root offset, every `next` and every
// feature id is in bounds (features has a slot for each id, the NaN slot
// included), and that every node index fits in a signed 32-bit integer: the
// gathers read nothing else.
//
// On x86-64 CPUs with AVX-512F the kernel walks 16 lanes per instruction,
// gathering the nodes and, for up to 128 feature slots, picking the features
// from registers. Other CPUs run the scalar walk of complete trees
// (CompleteTreeWalk.h). The kernel is chosen at run time; nothing needs
// AVX-512 at build time.
// Thread-safe: the functions have no state.
#pragma once

#include <cstddef>
#include <cstdint>
#include <limits>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/WalkKernel.h"

namespace thornvale {

struct WalkNode {
  // Bits 0-11: position in the feature buffer (the NaN slot for a leaf);
  // bits 12-31: index of the first child minus this node's index.
  uint32_t link;
  float value;  // threshold; leaf value for a leaf
};
static_assert(sizeof(WalkNode) == 8, "walk nodes are two words");

constexpr uint32_t kWalkFeatureBits = 12;
// Largest feature position and child distance a WalkNode can hold.
constexpr uint32_t kWalkMaxFeature = (1u << kWalkFeatureBits) - 1;
constexpr uint32_t kWalkMaxDistance = (1u << (32 - kWalkFeatureBits)) - 1;

constexpr WalkNode walkNode(uint32_t feature, uint32_t distance, float value) {
  return WalkNode{feature | (distance << kWalkFeatureBits), value};
}

// Trees walked per call of walkGroup().
constexpr size_t kWalkGroup = 128;

// The trees of a forest as the kernels walk them: the constant tree (value 0)
// at index 0 of `nodes`, then one tree after another. roots[i] is the index of
// tree i's root (0 for a tree that the kernels do not take), rootNodes[i] a
// copy of that node, both followed by kWalkGroup entries of the constant tree;
// depths[i] is tree i's number of steps (0 for a tree that the kernels do not
// take). All empty when the kernels take no tree.
struct WalkForest {
  std::vector<WalkNode> nodes;
  std::vector<uint32_t> roots;
  std::vector<WalkNode> rootNodes;
  std::vector<uint32_t> depths;

  bool empty() const { return roots.empty(); }
  size_t bytes() const {
    return (nodes.size() + rootNodes.size()) * sizeof(WalkNode) + (roots.size() + depths.size()) * sizeof(uint32_t);
  }
};

// Builds the walk nodes of compiled trees. A Tree has `nodes` (root first, the
// two children of a split adjacent, each node with `featureId`, `child` (index
// of its first child) and `value`, a leaf marked by featureId == leafId) and
// `depth`; `takes(tree)` says whether the kernels walk it. `nanSlot` is the
// feature position that always holds NaN. Returns an empty forest when no tree
// is taken or the nodes would not fit signed 32-bit indices (the gathers take
// signed indices).
template <typename Tree, typename Takes>
WalkForest buildWalkForest(const std::vector<Tree>& trees, int64_t leafId, uint32_t nanSlot, Takes takes) {
  WalkForest out;
  uint64_t count = 3;
  for (const Tree& t : trees) {
    if (takes(t)) count += t.nodes.size() + 2;
  }
  if (trees.empty() || count > uint64_t{std::numeric_limits<int32_t>::max()}) return out;
  std::vector<WalkNode>& nodes = out.nodes;
  nodes.reserve(count);
  // A root on the NaN slot goes to its second child; both children are the leaf.
  auto constantTree = [&](float value) {
    nodes.push_back(walkNode(nanSlot, 1, 0.0f));
    nodes.push_back(walkNode(nanSlot, 0, value));
    nodes.push_back(walkNode(nanSlot, 0, value));
  };
  constantTree(0.0f);
  out.roots.assign(trees.size() + kWalkGroup, 0);
  out.depths.assign(trees.size(), 0);
  bool any = false;
  for (size_t i = 0; i < trees.size(); ++i) {
    const Tree& t = trees[i];
    if (!takes(t)) continue;
    any = true;
    out.roots[i] = static_cast<uint32_t>(nodes.size());
    if (t.nodes[0].featureId == leafId) {
      constantTree(t.nodes[0].value);
      out.depths[i] = 1;
      continue;
    }
    out.depths[i] = t.depth;
    for (size_t j = 0; j < t.nodes.size(); ++j) {
      const auto& n = t.nodes[j];
      nodes.push_back(n.featureId == leafId ? walkNode(nanSlot, 0, n.value)
                                            : walkNode(static_cast<uint32_t>(n.featureId),
                                                       static_cast<uint32_t>(n.child - j), n.value));
    }
  }
  if (!any) return WalkForest{};
  out.rootNodes.reserve(out.roots.size());
  for (uint32_t root : out.roots) out.rootNodes.push_back(nodes[root]);
  return out;
}

// Walks kWalkGroup trees from `roots` (node indices; `rootNodes` holds copies
// of those nodes) for `rounds` >= 1 steps and stores their leaf values in
// `leaves`. `features` holds `slots` values
// and is readable up to the next multiple of 32 (kernels may load whole
// registers of it). `kernel` must be kAvx512, and supported.
void walkGroup(WalkKernel kernel, const WalkNode* nodes, const uint32_t* roots,
               const WalkNode* rootNodes, uint32_t rounds, const float* features, size_t slots,
               float* leaves);

}  // namespace thornvale

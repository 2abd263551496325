// Kernels that walk a group of compiled trees at once, in lock step.
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
// A scalar kernel runs on any CPU; on x86-64 CPUs with AVX-512F a vector
// kernel walks 16 lanes per instruction, gathering the nodes and, for up to
// 128 feature slots, picking the features from registers. The kernel is
// chosen at run time; nothing needs AVX-512 at build time.
// Thread-safe: the functions have no state.
#pragma once

#include <cstddef>
#include <cstdint>

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

enum class WalkKernel {
  kPortable,  // no walk nodes: 8 compiled trees in lock step (any CPU)
  kScalar,    // walkGroup() in scalar code (any CPU)
  kAvx512,    // walkGroup() with 16 lanes per vector
};

// Trees walked per call of walkGroup().
constexpr size_t kWalkGroup = 128;

// Whether this CPU (and build) can run `kernel`.
bool walkKernelSupported(WalkKernel kernel);
// The fastest kernel this CPU can run.
WalkKernel bestWalkKernel();

// Walks kWalkGroup trees from `roots` (node indices; `rootNodes` holds copies
// of those nodes) for `rounds` >= 1 steps and stores their leaf values in
// `leaves`. `features` holds `slots` values
// and is readable up to the next multiple of 32 (kernels may load whole
// registers of it). `kernel` must be supported and not kPortable.
void walkGroup(WalkKernel kernel, const WalkNode* nodes, const uint32_t* roots,
               const WalkNode* rootNodes, uint32_t rounds, const float* features, size_t slots,
               float* leaves);

}  // namespace thornvale

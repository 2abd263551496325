#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/NodeArena.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <memory>
#include <thread>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"

// Leaks, double frees and use after free show in the sanitizer builds; these
// tests make the allocator go through every path where they could happen.
namespace thornvale {
namespace {

TEST(NodeArena, BlocksAreAlignedDistinctAndWritable) {
  NodeArena arena;
  std::vector<void*> blocks;
  for (size_t i = 0; i < 5000; ++i) {  // several slabs
    const size_t bytes = 8 + 8 * (i % 7);
    void* b = arena.allocate(bytes);
    ASSERT_EQ(reinterpret_cast<uintptr_t>(b) % NodeArena::kNodeAlign, 0u);
    std::memset(b, static_cast<int>(i), bytes);
    blocks.push_back(b);
  }
  for (size_t i = 0; i < blocks.size(); ++i) {
    EXPECT_EQ(*static_cast<unsigned char*>(blocks[i]), static_cast<unsigned char>(i)) << i;
  }
  for (void* b : blocks) releaseNode(b);
  EXPECT_THROW(arena.allocate(NodeArena::kMaxNodeBytes + 1), std::bad_alloc);
}

// An arena that keeps its slabs frees them all when it goes: nodes freed
// before are only counted, and the nodes still in
// use then are gone with it without a destructor call.
TEST(NodeArena, ArenaLifetimeFreesEverySlabWithTheArena) {
  std::vector<std::unique_ptr<Node>> trees;
  NodeArena arena(NodeArena::Lifetime::kArena);
  for (int t = 0; t < 300; ++t) {  // several slabs
    std::unique_ptr<LinearNode> root(new (arena) LinearNode(t, 0.5));
    root->left.reset(new (arena) ConstantNode(t));
    root->right.reset(t % 2 ? new ConstantNode(-t) : new (arena) ConstantNode(-t));
    trees.push_back(std::move(root));
  }
  for (size_t t = 0; t < trees.size(); t += 3) trees[t].reset();
  for (auto& tree : trees) {
    // Heap nodes are the owner's to free; the arena's go with it.
    if (!tree) continue;
    auto& split = static_cast<LinearNode&>(*tree);
    if (split.pivotIndex % 2) {
      split.right.reset();
    } else {
      static_cast<void>(split.right.release());
    }
    static_cast<void>(split.left.release());
    static_cast<void>(tree.release());
  }
}

// Nodes from an arena and from the heap mixed in one tree, freed through
// unique_ptr after the arena is gone, some on other threads.
TEST(NodeArena, NodesOutliveTheirArenaAndMayBeFreedAnywhere) {
  std::vector<std::unique_ptr<Node>> trees;
  {
    NodeArena arena;
    for (int t = 0; t < 64; ++t) {
      std::unique_ptr<Node> root(new (arena) ConstantNode(t));
      for (int d = 0; d < 100; ++d) {
        std::unique_ptr<LinearNode> s(d % 3 == 0 ? new LinearNode(d, 0.5) : new (arena) LinearNode(d, 0.5));
        s->left = std::move(root);
        s->right.reset(d % 2 ? new ConstantNode(d) : new (arena) ConstantNode(d));
        root = std::move(s);
      }
      trees.push_back(std::move(root));
    }
  }
  // Clones come from the heap; the original and the clone are independent.
  std::unique_ptr<Node> copy = trees[0]->clone();
  std::vector<std::thread> threads;
  for (int k = 0; k < 4; ++k) {
    threads.emplace_back([&trees, k] {
      for (size_t t = static_cast<size_t>(k); t < trees.size(); t += 4) trees[t].reset();
    });
  }
  for (auto& th : threads) th.join();
  EXPECT_FALSE(copy->isLeaf());
  EXPECT_EQ(static_cast<const LinearNode&>(*copy).pivotIndex, 99);
}

}  // namespace
}  // namespace thornvale

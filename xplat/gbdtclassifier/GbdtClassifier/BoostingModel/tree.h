// Regression-tree nodes of the boosted-tree engine.
//
// A tree is a binary tree of polymorphic nodes: a LinearNode (split) compares
// one entry of a feature vector with its threshold and sends the input to
// `left` when the feature is less than or equal to `pivotValue`, to `right`
// otherwise (greater, or NaN on either side); a ConstantNode (leaf) holds the
// tree's output. A LinearNode owns both children, a Tree owns its root.
//
// NaN goes right at every split, the root and every level below it. The
// compiled forests (FastTreeEnsemble-inl.h) differ on purpose: their plain
// walk sends NaN right at the root but left below it. So evaluate() and
// findLeaf() are no reference for a compiled forest wherever a feature or a
// threshold is NaN.
//
// Nodes are immutable once built; every const operation may run on several
// threads at once. No operation recurses once per tree level: evaluation, the
// sweep, clone, the printers, leaf collection, linking and destruction all use
// explicit stacks or loops, so a tree of any depth that fits in memory is safe
// on a small thread stack.
//
// Preconditions, not checked: `features` has an entry for every pivotIndex
// that routing reaches; the values of a sweep are sorted ascending; every
// split has both children. Nothing here throws except std::bad_alloc.
//
// The `tree` and `parent` links are null on nodes made by the model reader
// and by clone(); linkTree() sets them and fills the tree's featureNames. The
// printers name a feature by featureNames[index], or by its index where there
// is no (non-empty) name or no tree link.
//
// Nodes come from the heap (plain new) or from a NodeArena (new (arena));
// either way `delete` (and so unique_ptr) frees them.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/NodeArena.h"

namespace thornvale {

class Tree;

class Node {
 public:
  Node() = default;
  Node(const Node&) = delete;
  Node& operator=(const Node&) = delete;
  virtual ~Node();

  static void* operator new(size_t bytes) { return allocateNodeOnHeap(bytes); }
  static void* operator new(size_t bytes, NodeArena& arena) { return arena.allocate(bytes); }
  static void operator delete(void* node) noexcept { releaseNode(node); }
  // Called only when a constructor throws after new (arena).
  static void operator delete(void* node, NodeArena&) noexcept { releaseNode(node); }

  // Deep copy of the subtree; links of the copy are unset.
  virtual std::unique_ptr<Node> clone() const = 0;
  // Output of the subtree for `features`.
  virtual double evaluate(const std::vector<double>& features) const = 0;
  // The leaf that `features` reach.
  virtual const Node* findLeaf(const std::vector<double>& features) const = 0;
  // One-line description on standard output, without a line end.
  virtual void print() const = 0;
  virtual bool isLeaf() const = 0;
  // For i in [0, count): out[i] += weight * (output for `features` with entry
  // `sweptFeature` replaced by values[i]). `values` is sorted ascending.
  virtual void accumulateSweep(double weight,
                               const std::vector<double>& features,
                               int32_t sweptFeature, int32_t count,
                               const double* values, double* out) const = 0;
  // Nested "If name <= t then" / "If name > t then" lines, indented by tabs.
  virtual void printTree(std::ostream& out, int32_t depth) const = 0;
  // One rule line per leaf below, leaves of larger value first.
  virtual void printRules(std::ostream& out) const = 0;
  // Appends the leaves below, left to right.
  virtual void collectLeaves(std::vector<const Node*>& leaves) const = 0;

  Tree* tree = nullptr;    // not owned
  Node* parent = nullptr;  // not owned; null at the root
};

class ConstantNode final : public Node {
 public:
  explicit ConstantNode(double v) : value(v) {}

  std::unique_ptr<Node> clone() const override;
  double evaluate(const std::vector<double>& features) const override;
  const Node* findLeaf(const std::vector<double>& features) const override;
  void print() const override;
  bool isLeaf() const override { return true; }
  void accumulateSweep(double weight, const std::vector<double>& features,
                       int32_t sweptFeature, int32_t count,
                       const double* values, double* out) const override;
  void printTree(std::ostream& out, int32_t depth) const override;
  void printRules(std::ostream& out) const override;
  void collectLeaves(std::vector<const Node*>& leaves) const override;

  double value;
};

class LinearNode final : public Node {
 public:
  LinearNode(int32_t index, double pivot) : pivotIndex(index), pivotValue(pivot) {}
  // Destroys the whole subtree iteratively, without allocating.
  ~LinearNode() override;

  std::unique_ptr<Node> clone() const override;
  double evaluate(const std::vector<double>& features) const override;
  const Node* findLeaf(const std::vector<double>& features) const override;
  void print() const override;
  bool isLeaf() const override { return false; }
  void accumulateSweep(double weight, const std::vector<double>& features,
                       int32_t sweptFeature, int32_t count,
                       const double* values, double* out) const override;
  void printTree(std::ostream& out, int32_t depth) const override;
  void printRules(std::ostream& out) const override;
  void collectLeaves(std::vector<const Node*>& leaves) const override;

  int32_t pivotIndex;
  double pivotValue;
  std::unique_ptr<Node> left;   // feature <= pivotValue
  std::unique_ptr<Node> right;  // feature > pivotValue, or NaN
};

// One regression tree. Copying clones the nodes (links unset on the copy) and
// copies the tables. A linked tree's nodes point at the Tree object, so keep
// it in place (hold it by unique_ptr) and link a copy again.
class Tree {
 public:
  Tree() = default;
  Tree(const Tree& other);
  Tree& operator=(const Tree& other);
  ~Tree() = default;

  std::unique_ptr<Node> root;  // absent only in a malformed tree
  std::map<int32_t, double> featureValues;
  std::vector<std::string> featureNames;
};

// Sets `tree` and `parent` on every node of `tree` and makes `names` its
// featureNames, so that printTree and printRules can be used on it.
void linkTree(Tree& tree, std::vector<std::string> names);

}  // namespace thornvale

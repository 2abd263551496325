#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"

#include <glog/logging.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <numeric>
#include <sstream>
#include <utility>

namespace thornvale {

namespace {

const ConstantNode& asLeaf(const Node& n) {
  return static_cast<const ConstantNode&>(n);
}
const LinearNode& asSplit(const Node& n) {
  return static_cast<const LinearNode&>(n);
}

// Child chosen by the routing rule: left when feature <= pivot, else right
// (NaN on either side goes right).
const Node* route(const LinearNode& split, const std::vector<double>& features) {
  return features[split.pivotIndex] <= split.pivotValue ? split.left.get()
                                                        : split.right.get();
}

const Node* walkToLeaf(const Node* node, const std::vector<double>& features) {
  while (!node->isLeaf()) node = route(asSplit(*node), features);
  return node;
}

// Destroys a subtree without recursion and without allocating: splits whose
// left child is a split are rotated right until the left child is a leaf,
// which is then freed together with the split; the walk continues down the
// right spine. Every node is rotated at most once.
void destroySubtree(std::unique_ptr<Node> cur) noexcept {
  while (cur) {
    if (cur->isLeaf()) return;  // unique_ptr frees it
    auto* split = static_cast<LinearNode*>(cur.get());
    if (split->left && !split->left->isLeaf()) {
      std::unique_ptr<Node> top = std::move(split->left);
      auto* l = static_cast<LinearNode*>(top.get());
      split->left = std::move(l->right);
      l->right = std::move(cur);
      cur = std::move(top);
    } else {
      split->left.reset();
      std::unique_ptr<Node> next = std::move(split->right);
      cur = std::move(next);  // frees `split`, now childless
    }
  }
}

void writeName(std::ostream& out, const Tree* tree, int32_t index) {
  if (tree != nullptr && index >= 0 &&
      static_cast<size_t>(index) < tree->featureNames.size() &&
      !tree->featureNames[index].empty()) {
    out << tree->featureNames[index];
  } else {
    out << index;
  }
}

void writeIndent(std::ostream& out, int32_t depth) {
  for (int32_t i = 0; i < depth; ++i) out << '\t';
}

// One bound of one feature on a rule. A rule defines it from the leaf upwards:
// the deepest pivot, then std::max (lower bound) or std::min (upper bound) of
// it and each pivot above. Those keep what they hold on a tie and when either
// side is NaN, so the bound is the deepest pivot when that is NaN, and
// otherwise the extreme of the pivots that are not NaN, the deepest of equal
// ones winning (+0 against -0). Pivots are added here from the top down.
class Bound {
 public:
  void addDeeper(double pivot, bool lower) {
    set_ = true;
    deepest_ = pivot;
    if (std::isnan(pivot)) return;
    if (!haveBest_ || (lower ? pivot >= best_ : pivot <= best_)) {
      best_ = pivot;
      haveBest_ = true;
    }
  }
  bool isSet() const { return set_; }
  double value() const { return std::isnan(deepest_) ? deepest_ : best_; }

 private:
  bool set_ = false;
  bool haveBest_ = false;
  double deepest_ = 0.0;
  double best_ = 0.0;
};

// The bounds that the splits on the way down to a node put on each feature,
// for the rule lines of the leaves. descend() adds the next split down;
// ascendTo() takes splits back off the bottom, so that one depth-first walk
// serves every leaf of a subtree.
class RulePath {
 public:
  // The way from the root down to `node`, by its parent links.
  static RulePath downTo(const Node& node) {
    std::vector<std::pair<const LinearNode*, bool>> up;  // parent, and whether `node` is on its right
    for (const Node *child = &node, *p = node.parent; p != nullptr; child = p, p = p->parent) {
      const LinearNode& split = asSplit(*p);
      up.emplace_back(&split, split.right.get() == child);
    }
    RulePath path;
    for (auto it = up.rbegin(); it != up.rend(); ++it) path.descend(*it->first, it->second);
    return path;
  }

  size_t depth() const { return undo_.size(); }

  void descend(const LinearNode& split, bool right) {
    auto found = bounds_.find(split.pivotIndex);
    if (found == bounds_.end()) {
      undo_.push_back({split.pivotIndex, false, {}});
      found = bounds_.emplace(split.pivotIndex, Bounds{}).first;
    } else {
      undo_.push_back({split.pivotIndex, true, found->second});
    }
    if (right) {
      found->second.lower.addDeeper(split.pivotValue, true);
    } else {
      found->second.upper.addDeeper(split.pivotValue, false);
    }
  }

  void ascendTo(size_t depth) {
    for (; undo_.size() > depth; undo_.pop_back()) {
      const Undo& u = undo_.back();
      if (u.existed) {
        bounds_[u.index] = u.saved;
      } else {
        bounds_.erase(u.index);
      }
    }
  }

  // The rule line of `leaf`, without its end: the value, a tab, then for each
  // feature in ascending index order "lower < name <= upper; ", leaving out
  // a bound that no split set.
  void writeRule(std::ostream& out, const ConstantNode& leaf) const {
    out << leaf.value << "\t";
    for (const auto& [index, b] : bounds_) {
      if (b.lower.isSet()) {
        out << b.lower.value() << " < ";
        writeName(out, leaf.tree, index);
        if (b.upper.isSet()) out << " <= " << b.upper.value();
        out << "; ";
      } else {
        writeName(out, leaf.tree, index);
        out << " <= " << b.upper.value() << "; ";
      }
    }
  }

 private:
  struct Bounds {
    Bound lower, upper;
  };
  // What descend() changed: the feature's bounds before it, if it had any.
  struct Undo {
    int32_t index;
    bool existed;
    Bounds saved;
  };
  std::map<int32_t, Bounds> bounds_;
  std::vector<Undo> undo_;
};

// Sorts leaf positions so that larger leaf values come first. NaN values go
// last so that the ordering stays a strict weak ordering.
class LeafOrder {
 public:
  explicit LeafOrder(const std::vector<const Node*>& nodes) : nodes_(nodes) {}
  bool operator()(size_t a, size_t b) const {
    CHECK(nodes_[a]);
    CHECK(nodes_[b]);
    const double va = asLeaf(*nodes_[a]).value;
    const double vb = asLeaf(*nodes_[b]).value;
    if (std::isnan(va)) return false;
    if (std::isnan(vb)) return true;
    return va > vb;
  }

 private:
  const std::vector<const Node*>& nodes_;
};

}  // namespace

Node::~Node() = default;

// ---------------------------------------------------------------- ConstantNode

std::unique_ptr<Node> ConstantNode::clone() const {
  return std::make_unique<ConstantNode>(value);
}

double ConstantNode::evaluate(const std::vector<double>&) const { return value; }

const Node* ConstantNode::findLeaf(const std::vector<double>&) const { return this; }

void ConstantNode::print() const { std::printf("ConstantNode: value = %f", value); }

void ConstantNode::accumulateSweep(double weight, const std::vector<double>&,
                                   int32_t, int32_t count, const double*,
                                   double* out) const {
  const double p = weight * value;
  for (int32_t i = 0; i < count; ++i) out[i] += p;
}

void ConstantNode::printTree(std::ostream& out, int32_t depth) const {
  writeIndent(out, depth);
  out << "Final value = " << value << std::endl;
}

void ConstantNode::printRules(std::ostream& out) const {
  RulePath::downTo(*this).writeRule(out, *this);
  out << std::endl;
}

void ConstantNode::collectLeaves(std::vector<const Node*>& leaves) const {
  leaves.push_back(this);
}

// ------------------------------------------------------------------ LinearNode

LinearNode::~LinearNode() {
  destroySubtree(std::move(left));
  destroySubtree(std::move(right));
}

std::unique_ptr<Node> LinearNode::clone() const {
  std::unique_ptr<Node> result;
  std::vector<std::pair<const Node*, std::unique_ptr<Node>*>> pending{{this, &result}};
  while (!pending.empty()) {
    auto [src, slot] = pending.back();
    pending.pop_back();
    if (src->isLeaf()) {
      *slot = std::make_unique<ConstantNode>(asLeaf(*src).value);
      continue;
    }
    const LinearNode& s = asSplit(*src);
    auto copy = std::make_unique<LinearNode>(s.pivotIndex, s.pivotValue);
    LinearNode* raw = copy.get();
    *slot = std::move(copy);
    // Left is cloned first: it is pushed last.
    if (s.right) pending.emplace_back(s.right.get(), &raw->right);
    if (s.left) pending.emplace_back(s.left.get(), &raw->left);
  }
  return result;
}

double LinearNode::evaluate(const std::vector<double>& features) const {
  return asLeaf(*walkToLeaf(this, features)).value;
}

const Node* LinearNode::findLeaf(const std::vector<double>& features) const {
  return walkToLeaf(this, features);
}

void LinearNode::print() const {
  std::printf("LinearNode: pivot index = %d, pivot value = %f", pivotIndex, pivotValue);
}

void LinearNode::accumulateSweep(double weight, const std::vector<double>& features,
                                 int32_t sweptFeature, int32_t count,
                                 const double* values, double* out) const {
  struct Step {
    const Node* node;
    int32_t count;
    const double* values;
    double* out;
  };
  std::vector<Step> pending{{this, count, values, out}};
  while (!pending.empty()) {
    Step s = pending.back();
    pending.pop_back();
    if (s.node->isLeaf()) {
      s.node->accumulateSweep(weight, features, sweptFeature, s.count, s.values, s.out);
      continue;
    }
    const LinearNode& split = asSplit(*s.node);
    if (split.pivotIndex != sweptFeature) {
      pending.push_back({route(split, features), s.count, s.values, s.out});
      continue;
    }
    // Leading values not greater than the pivot go left, the rest go right.
    const int32_t k = s.count <= 0
        ? 0
        : static_cast<int32_t>(
              std::upper_bound(s.values, s.values + s.count, split.pivotValue) - s.values);
    if (s.count - k > 0) {
      pending.push_back({split.right.get(), s.count - k, s.values + k, s.out + k});
    }
    if (k > 0) pending.push_back({split.left.get(), k, s.values, s.out});
  }
}

void LinearNode::printTree(std::ostream& out, int32_t depth) const {
  struct Step {
    const Node* node;
    int32_t depth;
    bool secondHalf;
  };
  std::vector<Step> pending{{this, depth, false}};
  while (!pending.empty()) {
    Step s = pending.back();
    pending.pop_back();
    if (s.node->isLeaf()) {
      s.node->printTree(out, s.depth);
      continue;
    }
    const LinearNode& split = asSplit(*s.node);
    writeIndent(out, s.depth);
    out << "If ";
    writeName(out, split.tree, split.pivotIndex);
    if (!s.secondHalf) {
      out << " <= " << split.pivotValue << " then" << std::endl;
      pending.push_back({s.node, s.depth, true});
      pending.push_back({split.left.get(), s.depth + 1, false});
    } else {
      out << " > " << split.pivotValue << " then" << std::endl;
      pending.push_back({split.right.get(), s.depth + 1, false});
    }
  }
}

void LinearNode::printRules(std::ostream& out) const {
  // One depth-first walk formats every leaf's rule into a buffer; leaves are
  // then written in order of value. The splits above this one bound every
  // leaf below it.
  RulePath path = RulePath::downTo(*this);

  std::ostringstream text;
  text.flags(out.flags());
  text.precision(out.precision());
  text.fill(out.fill());
  text.imbue(out.getloc());

  std::vector<const Node*> leaves;
  std::vector<size_t> lineStart;

  // A node to visit: the path's depth at the split above it, that split (none
  // for this node) and the side of it that the node is on.
  struct Visit {
    const Node* node;
    size_t depth;
    const LinearNode* above;
    bool right;
  };
  std::vector<Visit> pending{{this, path.depth(), nullptr, false}};
  while (!pending.empty()) {
    const Visit v = pending.back();
    pending.pop_back();
    path.ascendTo(v.depth);
    if (v.above != nullptr) path.descend(*v.above, v.right);
    if (v.node->isLeaf()) {
      leaves.push_back(v.node);
      lineStart.push_back(static_cast<size_t>(text.tellp()));
      path.writeRule(text, asLeaf(*v.node));
      text << '\n';
      continue;
    }
    const LinearNode& split = asSplit(*v.node);
    if (split.right) pending.push_back({split.right.get(), path.depth(), &split, true});
    if (split.left) pending.push_back({split.left.get(), path.depth(), &split, false});
  }

  const std::string all = text.str();
  lineStart.push_back(all.size());

  std::vector<size_t> order(leaves.size());
  std::iota(order.begin(), order.end(), size_t{0});
  // Stable: leaves of equal value keep their order from left to right, so
  // that every standard library writes the same lines.
  std::stable_sort(order.begin(), order.end(), LeafOrder(leaves));
  for (size_t i : order) {
    // Each buffered line ends with '\n'; write it without, then std::endl.
    out.write(all.data() + lineStart[i],
              static_cast<std::streamsize>(lineStart[i + 1] - lineStart[i] - 1));
    out << std::endl;
  }
}

void LinearNode::collectLeaves(std::vector<const Node*>& leaves) const {
  std::vector<const Node*> pending{this};
  while (!pending.empty()) {
    const Node* n = pending.back();
    pending.pop_back();
    if (n->isLeaf()) {
      leaves.push_back(n);
      continue;
    }
    const LinearNode& split = asSplit(*n);
    if (split.right) pending.push_back(split.right.get());
    if (split.left) pending.push_back(split.left.get());
  }
}

// ------------------------------------------------------------------------ Tree

Tree::Tree(const Tree& other)
    : root(other.root ? other.root->clone() : nullptr),
      featureValues(other.featureValues),
      featureNames(other.featureNames) {}

Tree& Tree::operator=(const Tree& other) {
  if (this != &other) {
    root = other.root ? other.root->clone() : nullptr;
    featureValues = other.featureValues;
    featureNames = other.featureNames;
  }
  return *this;
}

void linkTree(Tree& tree, std::vector<std::string> names) {
  tree.featureNames = std::move(names);
  if (!tree.root) return;
  std::vector<std::pair<Node*, Node*>> pending{{tree.root.get(), nullptr}};
  while (!pending.empty()) {
    auto [node, parent] = pending.back();
    pending.pop_back();
    node->tree = &tree;
    node->parent = parent;
    if (node->isLeaf()) continue;
    auto* split = static_cast<LinearNode*>(node);
    if (split->right) pending.emplace_back(split->right.get(), split);
    if (split->left) pending.emplace_back(split->left.get(), split);
  }
}

}  // namespace thornvale

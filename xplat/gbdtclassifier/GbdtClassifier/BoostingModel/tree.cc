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

// Bounds of one feature on a rule, as printed.
struct RuleBounds {
  bool hasLower = false;
  bool hasUpper = false;
  double lower = 0.0;
  double upper = 0.0;
};

void writeRuleEntry(std::ostream& out, const Tree* tree, int32_t index,
                    const RuleBounds& b) {
  if (b.hasLower) {
    out << b.lower << " < ";
    writeName(out, tree, index);
    if (b.hasUpper) out << " <= " << b.upper;
    out << "; ";
  } else if (b.hasUpper) {
    writeName(out, tree, index);
    out << " <= " << b.upper << "; ";
  }
}

// One bound of a feature while a depth-first walk descends: pivots arrive from
// the top down, yet the bound must equal the bottom-up fold of the leaf's
// parent walk (std::max for lower bounds, std::min for upper). That fold keeps
// its first (deepest) value on ties and when the deepest value is NaN, and
// otherwise ignores NaN, so it is the deepest value when that is NaN and
// else the extreme non-NaN value, the deepest winning ties (+0 versus -0).
struct DescentBound {
  bool set = false;
  bool haveBest = false;
  double deepest = 0.0;
  double best = 0.0;

  void addDeeper(double v, bool lower) {
    set = true;
    deepest = v;
    if (std::isnan(v)) return;
    if (!haveBest || (lower ? v >= best : v <= best)) {
      best = v;
      haveBest = true;
    }
  }
  double resolved() const { return std::isnan(deepest) ? deepest : best; }
};

struct DescentBounds {
  DescentBound lower, upper;
  RuleBounds resolved() const {
    RuleBounds r;
    r.hasLower = lower.set;
    r.hasUpper = upper.set;
    if (lower.set) r.lower = lower.resolved();
    if (upper.set) r.upper = upper.resolved();
    return r;
  }
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
  // Fold the pivots met on the way up, deepest first.
  std::map<int32_t, RuleBounds> bounds;
  const Node* child = this;
  for (const Node* p = parent; p != nullptr; child = p, p = p->parent) {
    const LinearNode& split = asSplit(*p);
    RuleBounds& b = bounds[split.pivotIndex];
    if (split.right.get() == child) {
      b.lower = b.hasLower ? std::max(b.lower, split.pivotValue) : split.pivotValue;
      b.hasLower = true;
    } else {
      b.upper = b.hasUpper ? std::min(b.upper, split.pivotValue) : split.pivotValue;
      b.hasUpper = true;
    }
  }
  out << value << "\t";
  for (const auto& [index, b] : bounds) writeRuleEntry(out, tree, index, b);
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
  // One depth-first walk formats every leaf's rule into a buffer, keeping the
  // bounds of the current path; leaves are then written in order of value.
  std::map<int32_t, DescentBounds> bounds;

  auto addBound = [&bounds](const LinearNode& split, bool wentRight) {
    DescentBounds& b = bounds[split.pivotIndex];
    if (wentRight) {
      b.lower.addDeeper(split.pivotValue, true);
    } else {
      b.upper.addDeeper(split.pivotValue, false);
    }
  };

  // Splits above this one bound every leaf below it; apply them top-down.
  std::vector<std::pair<const LinearNode*, bool>> above;
  for (const Node *child = this, *p = parent; p != nullptr; child = p, p = p->parent) {
    const LinearNode& split = asSplit(*p);
    above.emplace_back(&split, split.right.get() == child);
  }
  for (auto it = above.rbegin(); it != above.rend(); ++it) addBound(*it->first, it->second);

  std::ostringstream text;
  text.flags(out.flags());
  text.precision(out.precision());
  text.fill(out.fill());
  text.imbue(out.getloc());

  std::vector<const Node*> leaves;
  std::vector<size_t> lineStart;

  struct Step {
    const Node* node;
    int stage;  // splits: 0 go left, 1 go right, 2 done
    bool existed;
    DescentBounds saved;
  };
  std::vector<Step> pending{{this, 0, false, {}}};
  while (!pending.empty()) {
    Step& s = pending.back();
    if (s.node->isLeaf()) {
      leaves.push_back(s.node);
      lineStart.push_back(static_cast<size_t>(text.tellp()));
      text << asLeaf(*s.node).value << "\t";
      for (const auto& [index, b] : bounds) {
        writeRuleEntry(text, s.node->tree, index, b.resolved());
      }
      text << '\n';
      pending.pop_back();
      continue;
    }
    const LinearNode& split = asSplit(*s.node);
    if (s.stage == 0) {
      auto found = bounds.find(split.pivotIndex);
      s.existed = found != bounds.end();
      if (s.existed) s.saved = found->second;
    } else if (s.existed) {
      bounds[split.pivotIndex] = s.saved;
    } else {
      bounds.erase(split.pivotIndex);
    }
    if (s.stage == 2) {
      pending.pop_back();
      continue;
    }
    const bool right = s.stage == 1;
    ++s.stage;
    addBound(split, right);
    const Node* next = right ? split.right.get() : split.left.get();
    if (next != nullptr) pending.push_back({next, 0, false, {}});  // invalidates `s`
  }

  const std::string all = text.str();
  lineStart.push_back(all.size());

  std::vector<size_t> order(leaves.size());
  std::iota(order.begin(), order.end(), size_t{0});
  std::sort(order.begin(), order.end(), LeafOrder(leaves));
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

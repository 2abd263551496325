#include "tools/reliqa/inspect.h"

#include <algorithm>
#include <cstring>
#include <sstream>
#include <vector>

#include "tools/common/errors.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace reliqa::tool {

using thornvale::Forest;
using thornvale::LinearNode;
using thornvale::Node;

namespace {

struct Shape {
  int64_t depth = 0;   // a single leaf has depth 0
  int64_t leaves = 0;
  int64_t splits = 0;
};

Shape shapeOf(const Node* root, std::vector<bool>* usedPositions) {
  Shape s;
  std::vector<std::pair<const Node*, int64_t>> stack{{root, 0}};
  while (!stack.empty()) {
    auto [node, depth] = stack.back();
    stack.pop_back();
    s.depth = std::max(s.depth, depth);
    if (node->isLeaf()) {
      ++s.leaves;
      continue;
    }
    ++s.splits;
    auto* split = static_cast<const LinearNode*>(node);
    if (usedPositions && split->pivotIndex >= 0 &&
        static_cast<size_t>(split->pivotIndex) < usedPositions->size()) {
      (*usedPositions)[split->pivotIndex] = true;
    }
    stack.emplace_back(split->right.get(), depth + 1);
    stack.emplace_back(split->left.get(), depth + 1);
  }
  return s;
}

template <class T, class F>
std::string list(const std::vector<T>& items, F&& text) {
  std::string out = std::to_string(items.size());
  if (items.empty()) return "none";
  out += ": ";
  for (size_t i = 0; i < items.size(); ++i) {
    if (i) out += ", ";
    out += text(items[i]);
  }
  return out;
}

std::string mean(int64_t sum, size_t n) {
  return n == 0 ? "0" : thornvale::doubleToText(static_cast<double>(sum) / static_cast<double>(n));
}

void row(std::ostringstream& out, const char* label, const std::string& value) {
  out << label << std::string(17 - std::min<size_t>(16, std::strlen(label)), ' ') << value << '\n';
}

}  // namespace

thornvale::ModelHeader readModelHeader(const std::string& modelText) {
  std::istringstream in(modelText);
  return thornvale::read_header(in);
}

std::string describeModel(const std::string& name, const std::string& modelText, const Forest& forest,
                          bool sixteenBit) {
  std::ostringstream out;
  thornvale::ModelHeader header = readModelHeader(modelText);
  row(out, "model", name + " (" + std::to_string(modelText.size()) + " bytes)");
  std::string format = "version " + std::to_string(header.version);
  if (!thornvale::isReadableVersion(header.version)) format += " (unknown to the reader: the model is empty)";
  if (header.magic != thornvale::kModelMagic) format += ", wrong magic number " + std::to_string(header.magic);
  row(out, "format", format);
  row(out, "base score", thornvale::doubleToText(forest.baseScore));

  // Trees: kept ones are those the compiled forest keeps (weight not zero).
  std::vector<bool> used(forest.featureMapping.empty() ? forest.inputKeys.size() : forest.featureMapping.size());
  size_t kept = 0;
  int64_t minDepth = INT64_MAX, maxDepth = 0, depthSum = 0, minLeaves = INT64_MAX, maxLeaves = 0, leafSum = 0,
          splitSum = 0;
  bool unitWeights = true;
  for (const auto& wt : forest.trees) {
    if (wt.weight == 0.0 || !wt.tree || !wt.tree->root) continue;
    ++kept;
    unitWeights = unitWeights && wt.weight == 1.0;
    Shape s = shapeOf(wt.tree->root.get(), &used);
    minDepth = std::min(minDepth, s.depth);
    maxDepth = std::max(maxDepth, s.depth);
    depthSum += s.depth;
    minLeaves = std::min(minLeaves, s.leaves);
    maxLeaves = std::max(maxLeaves, s.leaves);
    leafSum += s.leaves;
    splitSum += s.splits;
  }
  row(out, "trees", std::to_string(forest.trees.size()) + " (" + std::to_string(kept) + " kept, " +
                        std::to_string(forest.trees.size() - kept) + " dropped for weight 0)");
  if (kept > 0) {
    row(out, "weights", unitWeights ? "all 1" : "mixed (leaf values are scaled by their tree's weight)");
    row(out, "depth", "min " + std::to_string(minDepth) + ", mean " + mean(depthSum, kept) + ", max " +
                          std::to_string(maxDepth));
    row(out, "leaves", std::to_string(leafSum) + " in all; per tree min " + std::to_string(minLeaves) + ", mean " +
                           mean(leafSum, kept) + ", max " + std::to_string(maxLeaves));
    row(out, "splits", std::to_string(splitSum) + " on " +
                           std::to_string(std::count(used.begin(), used.end(), true)) + " of " +
                           std::to_string(used.size()) + " input positions");
  }
  row(out, "input keys", list(forest.inputKeys, [](const std::string& k) { return k; }));
  row(out, "feature mapping", list(forest.featureMapping, [](uint32_t v) { return std::to_string(v); }));
  row(out, "equality", list(forest.equalityFeatures, [](uint32_t v) { return std::to_string(v); }));
  std::vector<std::pair<uint32_t, double>> averages(forest.averageFeatureValues.begin(),
                                                    forest.averageFeatureValues.end());
  row(out, "average values", list(averages, [](const std::pair<uint32_t, double>& p) {
        return std::to_string(p.first) + "=" + thornvale::doubleToText(p.second);
      }));

  const auto& sel = forest.modelSelector;
  if (sel.tree && sel.weight != 0.0) {
    Shape s = shapeOf(sel.tree->root.get(), nullptr);
    row(out, "selector", "a tree of depth " + std::to_string(s.depth) + " with " + std::to_string(s.leaves) +
                             " leaves chooses a sub-model");
    // Sub-model j covers kept trees [b(j-1), b(j)); boundaries past the kept
    // trees are clamped, as the engine does.
    const auto& b = forest.modelIndexMap;
    auto clamp = [&](uint32_t v) { return std::min<size_t>(v, kept); };
    for (size_t j = 0; j <= b.size(); ++j) {
      size_t first = j == 0 ? 0 : clamp(b[j - 1]);
      size_t end = j == b.size() ? kept : clamp(b[j]);
      std::string range = end > first ? "trees " + std::to_string(first) + " to " + std::to_string(end - 1)
                                      : std::string("no trees (base score only)");
      row(out, j == 0 ? "sub-models" : "", std::to_string(j) + ": " + range);
    }
    if (!std::is_sorted(b.begin(), b.end())) row(out, "", "warning: the boundaries decrease somewhere");
  } else {
    row(out, "selector", sel.tree ? "present with weight 0, so unused: one model of all kept trees"
                                  : "none: one model of all kept trees");
  }
  row(out, "compiled as", std::string(sixteenBit ? "16-bit" : "32-bit") + " forest (" +
                              std::to_string(forest.inputKeys.size()) + " input keys)");
  return out.str();
}

namespace {

// Links the trees for the printers. Input keys that are bare numbers (the
// feature ids of converted models) read as "feature 3", so that a rule never
// looks like a comparison of two numbers.
void linkForPrinting(Forest& forest) {
  std::vector<std::string> names = forest.inputKeys;
  for (std::string& n : names) {
    bool number = !n.empty() && n.find_first_not_of("-0123456789") == std::string::npos;
    if (number) n = "feature " + n;
  }
  std::swap(forest.inputKeys, names);
  thornvale::linkForest(forest);
  std::swap(forest.inputKeys, names);
}

void checkIndex(const std::string& name, const Forest& forest, int64_t index) {
  if (index < 0 || static_cast<size_t>(index) >= forest.trees.size()) {
    throw ToolError(name, 0, "there is no tree " + std::to_string(index) + "; the model has " +
                                 std::to_string(forest.trees.size()) + " trees, numbered from 0");
  }
}
}  // namespace

std::string printOneTree(const std::string& name, Forest& forest, int64_t index) {
  checkIndex(name, forest, index);
  linkForPrinting(forest);
  const auto& wt = forest.trees[index];
  std::ostringstream out;
  out << "tree " << index << ", weight " << thornvale::doubleToText(wt.weight) << '\n';
  wt.tree->root->printTree(out, 0);
  return out.str();
}

std::string printAllRules(const std::string& name, Forest& forest, int64_t only) {
  if (only >= 0) checkIndex(name, forest, only);
  linkForPrinting(forest);
  std::ostringstream out;
  for (size_t i = 0; i < forest.trees.size(); ++i) {
    if (only >= 0 && i != static_cast<size_t>(only)) continue;
    const auto& wt = forest.trees[i];
    out << "tree " << i << ", weight " << thornvale::doubleToText(wt.weight) << '\n';
    wt.tree->root->printRules(out);
  }
  return out.str();
}

}  // namespace reliqa::tool

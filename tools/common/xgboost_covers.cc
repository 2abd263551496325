#include "tools/common/xgboost_covers.h"

#include <double-conversion/double-conversion.h>

#include <cmath>
#include <limits>
#include <utility>
#include <vector>

#include "tools/common/errors.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"

namespace reliqa::tool {

namespace {

// Positions that the model tests for equality (x != t goes right), which no
// XGBoost split does.
std::vector<bool> equalityPositions(const thornvale::Forest& forest) {
  std::vector<bool> mask(forest.featureMapping.size(), false);
  for (uint32_t position : forest.equalityFeatures) {
    if (position < mask.size()) mask[position] = true;
  }
  return mask;
}

// The shortest text that reads back to the same float.
std::string floatText(float f) {
  char buffer[32];
  double_conversion::StringBuilder text(buffer, sizeof buffer);
  double_conversion::DoubleToStringConverter::EcmaScriptConverter().ToShortestSingle(f, &text);
  return text.Finalize();
}

// Covers of one pair of trees, walked side by side in pre-order.
std::vector<double> treeCovers(const XgbTree& xgb, const thornvale::Node* root, size_t treeIndex,
                               const std::vector<bool>& equality, const std::string& name) {
  const std::string tree = "tree " + std::to_string(treeIndex);
  if (xgb.sumHessian.empty()) {
    throw ToolError(name, xgb.line, tree + " has no sum_hessian, so its node covers are unknown");
  }
  if (root == nullptr) throw ToolError(name, xgb.line, tree + ": the model's tree has no nodes");
  std::vector<double> covers;
  std::vector<std::pair<const thornvale::Node*, int32_t>> stack{{root, 0}};
  while (!stack.empty()) {
    const auto [node, id] = stack.back();
    stack.pop_back();
    const size_t ours = covers.size();
    auto refuse = [&, id = id](const std::string& what) {
      throw ToolError(name, xgb.line,
                      tree + ", node " + std::to_string(id) + " (node " + std::to_string(ours) +
                          " of the model's tree in pre-order): " + what +
                          "; the model is not the conversion of this XGBoost model");
    };
    const bool xgbLeaf = xgb.left[id] == -1;
    if (node->isLeaf() != xgbLeaf) {
      refuse(xgbLeaf ? "XGBoost has a leaf where the model splits" : "XGBoost splits where the model has a leaf");
    }
    covers.push_back(static_cast<double>(xgb.sumHessian[id]));
    if (xgbLeaf) continue;
    const auto& split = static_cast<const thornvale::LinearNode&>(*node);
    if (split.pivotIndex != xgb.splitIndex[id]) {
      refuse("the model splits on position " + std::to_string(split.pivotIndex) + ", XGBoost on feature " +
             std::to_string(xgb.splitIndex[id]));
    }
    if (split.pivotIndex >= 0 && static_cast<size_t>(split.pivotIndex) < equality.size() &&
        equality[static_cast<size_t>(split.pivotIndex)]) {
      refuse("the model tests position " + std::to_string(split.pivotIndex) + " for equality");
    }
    // Scoring compares floats with the pivot value rounded to float.
    const float threshold = static_cast<float>(split.pivotValue);
    const float below = std::nextafter(xgb.splitCondition[id], -std::numeric_limits<float>::infinity());
    if (!(threshold == below)) {
      refuse("the model tests x <= " + floatText(threshold) + ", XGBoost x < " + floatText(xgb.splitCondition[id]) +
             " (x <= " + floatText(below) + ")");
    }
    if (!split.left || !split.right) refuse("the model's split lacks a child");
    stack.emplace_back(split.right.get(), xgb.right[id]);
    stack.emplace_back(split.left.get(), xgb.left[id]);
  }
  return covers;
}

}  // namespace

thornvale::TreeCovers xgboostCovers(const XgbModel& xgb, const thornvale::BoostingModel& model,
                                    const std::string& name) {
  const thornvale::Forest& forest = model.getForest();
  if (forest.trees.size() != xgb.trees.size()) {
    throw ToolError(name, 0,
                    "the XGBoost model has " + std::to_string(xgb.trees.size()) + " trees but the model " +
                        std::to_string(forest.trees.size()) +
                        "; the model is not the conversion of this XGBoost model");
  }
  const std::vector<bool> equality = equalityPositions(forest);
  thornvale::TreeCovers covers;
  covers.reserve(forest.trees.size());
  for (size_t i = 0; i < forest.trees.size(); ++i) {
    const thornvale::WeightedTree& entry = forest.trees[i];
    const thornvale::Node* root = entry.tree ? entry.tree->root.get() : nullptr;
    covers.push_back(treeCovers(xgb.trees[i], root, i, equality, name));
  }
  return covers;
}

}  // namespace reliqa::tool

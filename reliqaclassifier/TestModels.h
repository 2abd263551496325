// Model texts for the classifier's tests and tools, made with the engine's
// model writer. Header-only; not part of the library.
#pragma once

#include <cstdint>
#include <sstream>
#include <string>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"

namespace kestrova::reliqaclassifier::testing {

// One tree of one split on feature `featureId`: `leftLeaf` when the feature is
// at most `pivot` (a missing feature reads 0.0), `rightLeaf` otherwise.
inline std::string stumpModel(int32_t featureId, double pivot, double leftLeaf, double rightLeaf) {
  auto split = std::make_unique<thornvale::LinearNode>(0, pivot);
  split->left = std::make_unique<thornvale::ConstantNode>(leftLeaf);
  split->right = std::make_unique<thornvale::ConstantNode>(rightLeaf);
  auto tree = std::make_unique<thornvale::Tree>();
  tree->root = std::move(split);
  thornvale::Forest forest;
  forest.trees.emplace_back(std::move(tree), 1.0);
  forest.inputKeys = {"f" + std::to_string(featureId)};
  forest.featureMapping = {static_cast<uint32_t>(featureId)};
  return thornvale::writeModel(forest, 3);
}

// A model text that the reader rejects: a valid text whose first tree line
// is missing, so that the tree count promises more trees than follow.
inline std::string rejectedModel() {
  std::istringstream lines(stumpModel(4, 0.0, 0.0, 0.0));
  std::string text;
  std::string line;
  for (int index = 0; std::getline(lines, line); ++index) {
    if (index != 2) text += line + "\n";
  }
  return text;
}

}  // namespace kestrova::reliqaclassifier::testing

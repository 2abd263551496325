// Model texts for the classifier's tests and tools, made with the engine's
// model writer. Header-only; not part of the library.
#pragma once

#include <cstdint>
#include <sstream>
#include <string>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/TreeBuilders.h"

namespace kestrova::reliqaclassifier::test {

// One tree of one split on feature `featureId`: `leftLeaf` when the feature is
// at most `pivot` (a missing feature reads 0.0), `rightLeaf` otherwise.
inline std::string stumpModel(int32_t featureId, double pivot, double leftLeaf, double rightLeaf) {
  namespace t = thornvale::test;
  thornvale::Forest forest;
  forest.trees.push_back(t::weighted(t::split(0, pivot, t::leaf(leftLeaf), t::leaf(rightLeaf)), 1.0));
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

}  // namespace kestrova::reliqaclassifier::test

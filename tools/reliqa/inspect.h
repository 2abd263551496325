// Readable summaries of a model text (`reliqa inspect`).
//
// describeModel() reports the format version, the trees kept and dropped
// (weight zero), depths and leaf counts, base score, input keys, feature
// mapping, equality features, average values, the selector with its sub-model
// ranges, and which compiled forest (16- or 32-bit) the engine builds.
// printOneTree() and printAllRules() print trees with the nodes' own printers,
// after linking them so that features are named by their input keys (a key
// that is a bare number, such as a converted model's feature id, is shown as
// "feature 3").
// Trees of any depth are walked without recursion. Pure; any thread.
#pragma once

#include <cstdint>
#include <string>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"

namespace reliqa::tool {

// The header of a model text, as the model reader reads it (nothing logged).
thornvale::ModelHeader readModelHeader(const std::string& modelText);

// `sixteenBit` is the width the engine chose for this forest.
std::string describeModel(const std::string& name, const std::string& modelText, const thornvale::Forest& forest,
                          bool sixteenBit);

// Throws ToolError (naming `name`) when `index` is not a tree of the forest.
std::string printOneTree(const std::string& name, thornvale::Forest& forest, int64_t index);
// Rules of every tree, or of tree `only` when it is not negative.
std::string printAllRules(const std::string& name, thornvale::Forest& forest, int64_t only = -1);

}  // namespace reliqa::tool

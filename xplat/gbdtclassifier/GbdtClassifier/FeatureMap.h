// FeatureMap: feature id (signed 32-bit) to value.
//
// The one currency of the classifier: computed features, server features, the
// merged map that a model scores and the "feature_vector" logging value are all
// FeatureMaps. Inserting an id that is already present never overwrites it
// (use emplace/insert, never operator[] to "insert"). Iteration order is part
// of no contract.
#pragma once

#include <cstdint>
#include <unordered_map>

namespace thornvale {

using FeatureMap = std::unordered_map<int32_t, double>;

}  // namespace thornvale

// Writes a Forest as a model text, the inverse of deserialize().
//
// writeModel() produces format version 2, 3 or 4: header, base score and
// trees, input keys, then by version the feature mapping and equality
// features (3, 4) and the average feature values (4), and a trailer when the
// forest has a model selector or sub-model boundaries. Every line is written
// in the "complete groups, then one '=' per padding byte" form, which the
// reader decodes to exactly the bytes written, so input keys of any length
// arrive unchanged and deserialize(writeModel(f, v)) equals f.
//
// Throws std::invalid_argument, writing nothing, when the forest cannot be
// written faithfully: an unknown version, a tree or split child that is
// absent, or data the version has no place for (feature mapping or equality
// features in version 2, average values below version 4). A forest with
// sub-model boundaries but no selector gets a zero-weight single-leaf
// selector, which selects nothing (the reader needs a selector tree there).
//
// Pure functions; safe on any thread. No recursion per tree level.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"

namespace thornvale {

std::string writeModel(const Forest& forest, int32_t version);

// Encodes `bytes` so that base64_decode() returns exactly `bytes`: zero bytes
// pad them to a multiple of three, the groups are encoded, and one '='
// follows for each padding byte.
std::string base64_encode(std::string_view bytes);

}  // namespace thornvale

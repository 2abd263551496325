// The serialized model format and its reader.
//
// A model text is a sequence of lines, each base64 text of a little-endian
// record: a header (magic 314156, version), the base score and tree count, one
// line per tree, the input keys, then by version the feature mapping and the
// equality features (3, 4) and the average feature values (4), and finally an
// optional trailer (magic again, a model-selector tree, sub-model boundaries).
//
// deserialize() returns a Forest that the caller owns. Inconsistent but
// readable data (wrong magic, a model index beyond the trees) is logged
// through glog and kept. Unreadable data throws std::runtime_error before
// anything is allocated for it: a tree with an absent node (unknown node tag,
// or a record that ends inside its nodes; the message names the tree), or a
// count larger than the rest of the input could hold. An unknown version
// yields an empty Forest. deserialize() writes the line
// "Deseralization version: <v>" to standard output.
//
// The reader keeps no state apart from its decode tables, which are constant;
// separate streams may be read on separate threads. No step recurses per
// tree level.
#pragma once

#include <cstdint>
#include <istream>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelFormat.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"

namespace thornvale {

// A tree with its weight. Copying deep-copies the tree (links unset).
struct WeightedTree {
  WeightedTree() = default;
  WeightedTree(std::unique_ptr<Tree> t, double w) : tree(std::move(t)), weight(w) {}
  WeightedTree(const WeightedTree& other);
  WeightedTree& operator=(const WeightedTree& other);
  WeightedTree(WeightedTree&&) noexcept = default;
  WeightedTree& operator=(WeightedTree&&) noexcept = default;

  std::unique_ptr<Tree> tree;  // absent when there is none
  double weight = 0.0;
};

struct Forest {
  std::vector<WeightedTree> trees;
  double baseScore = 0.0;
  std::vector<std::string> inputKeys;
  WeightedTree modelSelector;
  std::vector<uint32_t> modelIndexMap;
  std::vector<uint32_t> equalityFeatures;
  std::vector<uint32_t> featureMapping;
  std::map<uint32_t, double> averageFeatureValues;
};

// Reads a whole model. The stream is read to its end.
std::unique_ptr<Forest> deserialize(std::istream& in);
// Same, over a text in memory.
std::unique_ptr<Forest> deserialize(std::string_view text);
// Same, with every node drawn from `arena`. An arena of Lifetime::kArena
// must outlive the Forest's nodes.
std::unique_ptr<Forest> deserialize(std::string_view text, NodeArena& arena);

// Reads the header line; returns the version. Problems are only logged.
int32_t is_header(std::istream& in);
// The numbers of the header line, as is_header reads them, without logging:
// missing bytes read as zero, and `complete` says whether the line held both.
struct ModelHeader {
  int32_t magic = 0;
  int32_t version = 0;
  bool complete = false;
};
ModelHeader read_header(std::istream& in);
// Fills `out` from one undecoded tree line: weight, nodes, and for versions
// above 1 the featureValues table. Throws std::runtime_error on an absent node
// or an impossible featureValues count.
void deserialize_tree(const std::string& line, WeightedTree& out, int32_t version);
// Reads one subtree (pre-order node records) from a decoded record. Returns
// null, after logging, when a node tag is unknown or missing.
std::unique_ptr<Node> deserialize_node(std::istream& in);
// The next line, base64-decoded; empty for an empty line or end of input.
std::string read_base64_line(std::istream& in);
// Fixed-width values from the next line; missing bytes read as zero.
uint32_t read_uint32(std::istream& in);
int32_t read_int32(std::istream& in);
double read_double(std::istream& in);
// Base64 with the format's rules: unknown characters (and "=" inside a
// complete group) decode as 0; after the last complete group each leading
// "=" removes one decoded byte; other left-over characters are ignored.
std::string base64_decode(std::string_view text);

// Links every tree of `forest` (and its selector) with linkTree(), naming
// features by forest.inputKeys.
void linkForest(Forest& forest);

}  // namespace thornvale

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"

#include <stdexcept>
#include <utility>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/LittleEndian.h"

namespace thornvale {

namespace {

// Little-endian record under construction.
class Record {
 public:
  template <typename T>
  Record& put(T value) {
    appendLittleEndian(bytes_, value);
    return *this;
  }
  Record& tag(uint8_t t) {
    bytes_.push_back(static_cast<char>(t));
    return *this;
  }
  const std::string& bytes() const { return bytes_; }

 private:
  std::string bytes_;
};

class Text {
 public:
  void line(std::string_view bytes) {
    out_ += base64_encode(bytes);
    out_ += '\n';
  }
  void line(const Record& r) { line(r.bytes()); }
  template <typename T>
  void value(T v) {
    line(Record().put(v));
  }
  std::string take() { return std::move(out_); }

 private:
  std::string out_;
};

void putNodes(Record& r, const Node& root, const std::string& label) {
  std::vector<const Node*> pending{&root};
  while (!pending.empty()) {
    const Node* n = pending.back();
    pending.pop_back();
    if (n == nullptr) throw std::invalid_argument(label + " has a split without both children");
    if (n->isLeaf()) {
      r.tag(kLeafTag).put(static_cast<const ConstantNode*>(n)->value);
      continue;
    }
    const auto* split = static_cast<const LinearNode*>(n);
    r.tag(kSplitTag).put(split->pivotIndex).put(split->pivotValue);
    pending.push_back(split->right.get());
    pending.push_back(split->left.get());
  }
}

std::string treeRecord(const WeightedTree& entry, const std::string& label) {
  if (!entry.tree || !entry.tree->root) throw std::invalid_argument(label + " has no nodes");
  Record r;
  r.put(entry.weight);
  putNodes(r, *entry.tree->root, label);
  r.put(static_cast<int32_t>(entry.tree->featureValues.size()));
  for (const auto& [key, value] : entry.tree->featureValues) r.put(key).put(value);
  return r.bytes();
}

}  // namespace

std::string base64_encode(std::string_view bytes) {
  std::string out;
  out.reserve((bytes.size() + 2) / 3 * 4 + 2);
  const auto* p = reinterpret_cast<const unsigned char*>(bytes.data());
  const size_t n = bytes.size();
  for (size_t i = 0; i < n; i += 3) {
    const uint32_t b0 = p[i];
    const uint32_t b1 = i + 1 < n ? p[i + 1] : 0;
    const uint32_t b2 = i + 2 < n ? p[i + 2] : 0;
    const uint32_t group = (b0 << 16) | (b1 << 8) | b2;
    out += kBase64Alphabet[(group >> 18) & 63];
    out += kBase64Alphabet[(group >> 12) & 63];
    out += kBase64Alphabet[(group >> 6) & 63];
    out += kBase64Alphabet[group & 63];
  }
  const size_t padding = (3 - n % 3) % 3;
  out.append(padding, kBase64Padding);
  return out;
}

std::string writeModel(const Forest& forest, int32_t version) {
  if (!isReadableVersion(version)) {
    throw std::invalid_argument("model format version " + std::to_string(version) +
                                " cannot be written; use 2, 3 or 4");
  }
  if (version < kFirstVersionWithMapping && (!forest.featureMapping.empty() || !forest.equalityFeatures.empty())) {
    throw std::invalid_argument(
        "format version 2 has no featureMapping or equalityFeatures; write version 3 or 4");
  }
  if (version < kNewestVersion && !forest.averageFeatureValues.empty()) {
    throw std::invalid_argument(
        "average feature values need format version 4; write version 4 or clear them");
  }
  if (forest.trees.size() > UINT32_MAX) throw std::invalid_argument("too many trees");

  Text text;
  text.line(Record().put(kModelMagic).put(version));
  text.line(Record().put(forest.baseScore).put(static_cast<uint32_t>(forest.trees.size())));
  for (size_t i = 0; i < forest.trees.size(); ++i) {
    text.line(treeRecord(forest.trees[i], "tree " + std::to_string(i)));
  }
  text.value(static_cast<uint32_t>(forest.inputKeys.size()));
  for (const std::string& key : forest.inputKeys) text.line(key);
  if (version >= kFirstVersionWithMapping) {
    text.value(static_cast<uint32_t>(forest.featureMapping.size()));
    for (uint32_t id : forest.featureMapping) text.value(id);
    text.value(static_cast<uint32_t>(forest.equalityFeatures.size()));
    for (uint32_t id : forest.equalityFeatures) text.value(id);
  }
  if (version == kNewestVersion) {
    text.value(static_cast<uint32_t>(forest.averageFeatureValues.size()));
    for (const auto& [id, average] : forest.averageFeatureValues) {
      text.value(id);
      text.value(average);
    }
  }
  if (forest.modelSelector.tree || !forest.modelIndexMap.empty()) {
    text.value(kModelMagic);
    if (forest.modelSelector.tree) {
      text.line(treeRecord(forest.modelSelector, "model selector tree"));
    } else {
      WeightedTree none(std::make_unique<Tree>(), 0.0);
      none.tree->root = std::make_unique<ConstantNode>(0.0);
      text.line(treeRecord(none, "model selector tree"));
    }
    text.value(static_cast<uint32_t>(forest.modelIndexMap.size()));
    for (uint32_t index : forest.modelIndexMap) text.value(index);
  }
  return text.take();
}

}  // namespace thornvale

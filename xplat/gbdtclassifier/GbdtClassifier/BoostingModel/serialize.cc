#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"

#include <glog/logging.h>

#include <array>
#include <cstring>
#include <iostream>
#include <iterator>
#include <stdexcept>
#include <utility>

namespace thornvale {

namespace {

// Decode table: the 64 characters of the alphabet map to 0..63, every other
// byte (the padding character included) to 0. Constant-initialised.
constexpr std::array<uint8_t, 256> makeDecodeTable() {
  std::array<uint8_t, 256> table{};
  for (int i = 0; i < 64; ++i) table[static_cast<unsigned char>(kBase64Alphabet[i])] = static_cast<uint8_t>(i);
  return table;
}
constexpr std::array<uint8_t, 256> kDecodeTable = makeDecodeTable();

// The same values placed where the k-th character of a group puts its six
// bits among the group's three bytes, as a word whose bytes lie in memory in
// that order on this host: the word of a group is the OR of its four
// characters' entries.
constexpr bool kLittleEndianHost = __BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__;
constexpr std::array<std::array<uint32_t, 256>, 4> makeWordTables() {
  std::array<std::array<uint32_t, 256>, 4> tables{};
  for (size_t k = 0; k < 4; ++k) {
    for (size_t c = 0; c < 256; ++c) {
      const uint32_t bits = uint32_t{kDecodeTable[c]} << (18 - 6 * k);  // in the group's 24 bits
      for (size_t i = 0; i < 3; ++i) {
        const uint32_t byte = (bits >> (16 - 8 * i)) & 0xFF;
        tables[k][c] |= byte << (kLittleEndianHost ? 8 * i : 24 - 8 * i);
      }
    }
  }
  return tables;
}
constexpr std::array<std::array<uint32_t, 256>, 4> kWordTables = makeWordTables();

void decodeInto(std::string_view text, std::string& out) {
  const size_t groups = text.size() / 4;
  const auto* in = reinterpret_cast<const unsigned char*>(text.data());
  // Each group is stored as a whole word; its fourth byte is overwritten by
  // the next group, or is the spare byte dropped at the end.
  out.resize(groups * 3 + 1);
  char* o = out.data();
  for (size_t g = 0; g < groups; ++g, in += 4, o += 3) {
    const uint32_t word = kWordTables[0][in[0]] | kWordTables[1][in[1]] | kWordTables[2][in[2]] |
                          kWordTables[3][in[3]];
    std::memcpy(o, &word, sizeof word);
  }
  out.resize(groups * 3);
  for (size_t i = groups * 4; i < text.size() && text[i] == kBase64Padding; ++i) {
    if (!out.empty()) out.pop_back();
  }
}

// Little-endian value from the start of `bytes`; missing bytes read as zero.
template <typename T>
T loadPrefix(const unsigned char* p, size_t available) {
  static_assert(sizeof(T) <= 8);
  uint64_t bits = 0;
  const size_t n = available < sizeof(T) ? available : sizeof(T);
  for (size_t i = 0; i < n; ++i) bits |= static_cast<uint64_t>(p[i]) << (8 * i);
  T value;
  if constexpr (sizeof(T) == 8) {
    std::memcpy(&value, &bits, 8);
  } else {
    const auto narrow = static_cast<uint32_t>(bits);
    std::memcpy(&value, &narrow, sizeof(T));
  }
  return value;
}

template <typename T>
T loadPrefix(const std::string& bytes) {
  return loadPrefix<T>(reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size());
}

// Byte cursor over a decoded record; reads past its end yield zero bytes.
class RecordBytes {
 public:
  explicit RecordBytes(const std::string& bytes)
      : p_(reinterpret_cast<const unsigned char*>(bytes.data())), n_(bytes.size()) {}

  bool tag(uint8_t& out) {
    if (pos_ >= n_) return false;
    out = p_[pos_++];
    return true;
  }
  template <typename T>
  T read() {
    const size_t avail = n_ - pos_;
    T v;
    if (avail >= sizeof(T)) {
#if defined(__BYTE_ORDER__) && __BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__
      std::memcpy(&v, p_ + pos_, sizeof(T));  // the record's byte order
#else
      v = loadPrefix<T>(p_ + pos_, sizeof(T));
#endif
      pos_ += sizeof(T);
    } else {
      v = loadPrefix<T>(p_ + pos_, avail);
      pos_ = n_;
    }
    return v;
  }
  size_t offset() const { return pos_; }
  size_t remaining() const { return n_ - pos_; }

 private:
  const unsigned char* p_;
  size_t n_;
  size_t pos_ = 0;
};

// The same over a stream (for deserialize_node on a stream).
class StreamBytes {
 public:
  explicit StreamBytes(std::istream& in) : in_(in) {}
  bool tag(uint8_t& out) {
    const int c = in_.get();
    if (c == std::char_traits<char>::eof()) return false;
    out = static_cast<uint8_t>(c);
    ++pos_;
    return true;
  }
  template <typename T>
  T read() {
    unsigned char buf[sizeof(T)] = {};
    in_.read(reinterpret_cast<char*>(buf), sizeof(T));
    const auto got = static_cast<size_t>(in_.gcount());
    pos_ += got;
    return loadPrefix<T>(buf, got);
  }
  size_t offset() const { return pos_; }

 private:
  std::istream& in_;
  size_t pos_ = 0;
};

struct NodeProblem {
  bool missing = false;  // the record ended where a tag was due
  uint8_t tag = 0;
  size_t offset = 0;     // byte offset of the tag within what was read
};

// Reads one subtree of pre-order node records with an explicit stack. Returns
// null (after the error message) when a tag is unknown or missing; the
// partly built subtree is discarded, so no absent node ever escapes.
template <typename Source>
std::unique_ptr<Node> readNodes(Source& src, NodeProblem* problem, NodeArena& arena) {
  std::unique_ptr<Node> root;
  std::vector<std::unique_ptr<Node>*> pending{&root};
  while (!pending.empty()) {
    std::unique_ptr<Node>* slot = pending.back();
    pending.pop_back();
    for (;;) {  // down the left spine; right children wait on the stack
      const size_t at = src.offset();
      uint8_t tag = 0;
      const bool present = src.tag(tag);
      if (present && tag == kLeafTag) {
        *slot = std::unique_ptr<Node>(new (arena) ConstantNode(src.template read<double>()));
        break;
      }
      if (present && tag == kSplitTag) {
        const auto index = src.template read<int32_t>();
        const auto pivot = src.template read<double>();
        std::unique_ptr<LinearNode> split(new (arena) LinearNode(index, pivot));
        LinearNode* raw = split.get();
        *slot = std::move(split);
        pending.push_back(&raw->right);
        slot = &raw->left;
        continue;
      }
      LOG(ERROR) << "ERROR: unsupported node type in deserialize_node()";
      if (problem != nullptr) *problem = NodeProblem{!present, tag, at};
      return nullptr;
    }
  }
  return root;
}

std::string hexByte(uint8_t b) {
  static constexpr char kDigits[] = "0123456789abcdef";
  return std::string("0x") + kDigits[b >> 4] + kDigits[b & 15];
}

// Fills `out` from one undecoded tree line; `label()` names the tree in errors.
template <typename Label>
void readTree(std::string_view line, WeightedTree& out, int32_t version, const Label& label,
              std::string& scratch, NodeArena& arena) {
  decodeInto(line, scratch);
  RecordBytes src(scratch);
  out.weight = src.read<double>();
  out.tree.reset();
  NodeProblem problem;
  std::unique_ptr<Node> root = readNodes(src, &problem, arena);
  if (!root) {
    throw std::runtime_error(
        label() + " is malformed: " +
        (problem.missing
             ? "its record ends at byte " + std::to_string(problem.offset) +
                   " where a node was due"
             : "unknown node tag " + hexByte(problem.tag) + " at byte " +
                   std::to_string(problem.offset) + " of its record"));
  }
  auto tree = std::make_unique<Tree>();
  tree->root = std::move(root);
  if (version >= kOldestVersion) {  // every readable version: the tree's feature values
    const auto count = src.read<int32_t>();
    if (count > 0) {
      const uint64_t needed = static_cast<uint64_t>(count) * kFeatureValueBytes;
      if (needed > src.remaining()) {
        throw std::runtime_error(
            label() + " is malformed: its featureValues count " + std::to_string(count) +
            " needs " + std::to_string(needed) + " bytes but its record has " +
            std::to_string(src.remaining()) + " left");
      }
      for (int32_t i = 0; i < count; ++i) {
        const auto key = src.read<int32_t>();
        const auto value = src.read<double>();
        tree->featureValues[key] = value;
      }
    }
  }
  out.tree = std::move(tree);
}

// Lines of a model text in memory, split as std::getline splits them.
class Lines {
 public:
  explicit Lines(std::string_view text) : text_(text) {}

  bool atEnd() const { return pos_ >= text_.size(); }

  std::string_view next() {
    if (pos_ >= text_.size()) return {};
    const size_t nl = text_.find('\n', pos_);
    std::string_view line;
    if (nl == std::string_view::npos) {
      line = text_.substr(pos_);
      pos_ = text_.size();
    } else {
      line = text_.substr(pos_, nl - pos_);
      pos_ = nl + 1;
    }
    return line;
  }

  // Number of lines left, counting no further than `limit`.
  uint64_t countUpTo(uint64_t limit) const {
    uint64_t n = 0;
    size_t p = pos_;
    while (n < limit && p < text_.size()) {
      const void* nl = std::memchr(text_.data() + p, '\n', text_.size() - p);
      p = nl == nullptr ? text_.size()
                        : static_cast<size_t>(static_cast<const char*>(nl) - text_.data()) + 1;
      ++n;
    }
    return n;
  }

  // Throws unless `needed` more lines follow.
  void require(uint64_t needed, uint64_t count, const char* what) const {
    const uint64_t available = countUpTo(needed);
    if (available < needed) {
      throw std::runtime_error("model text declares " + std::to_string(count) + " " + what +
                               " but only " + std::to_string(available) +
                               " lines remain for them");
    }
  }

 private:
  std::string_view text_;
  size_t pos_ = 0;
};

class Reader {
 public:
  Reader(std::string_view text, NodeArena& arena) : lines_(text), arena_(arena) {}

  std::unique_ptr<Forest> read();

 private:
  const std::string& decodeNext() {
    decodeInto(lines_.next(), buf_);
    return buf_;
  }
  template <typename T>
  T readValue() {
    return loadPrefix<T>(decodeNext());
  }

  void readTrees(Forest& forest, int32_t version);
  void readInputKeys(Forest& forest);
  void readFeatureMapping(Forest& forest);
  void readEqualityFeatures(Forest& forest);
  void readAverages(Forest& forest);
  void readTrailer(Forest& forest, int32_t version);

  Lines lines_;
  std::string buf_;
  NodeArena& arena_;  // every node of the model
};

// The numbers of a decoded header line, without a word about what is wrong.
ModelHeader headerOf(const std::string& decoded) {
  ModelHeader header;
  header.magic = loadPrefix<int32_t>(decoded);
  header.version =
      decoded.size() > 4
          ? loadPrefix<int32_t>(reinterpret_cast<const unsigned char*>(decoded.data()) + 4, decoded.size() - 4)
          : 0;
  header.complete = decoded.size() >= 8;
  return header;
}

int32_t parseHeader(const std::string& decoded) {
  const ModelHeader header = headerOf(decoded);
  if (decoded.size() < 4) {
    LOG(ERROR) << "is_header reached eof or fail bit is set when reading magic number";
  }
  if (header.magic != kModelMagic) {
    LOG(ERROR) << "magic number in header does not match! " << header.magic << " vs " << kModelMagic;
  }
  if (!header.complete) {
    LOG(ERROR) << "is_header reached eof or fail bit is set when reading version number";
  }
  return header.version;
}

std::unique_ptr<Forest> Reader::read() {
  const int32_t version = parseHeader(decodeNext());
  auto forest = std::make_unique<Forest>();
  std::cout << "Deseralization version: " << version << std::endl;
  if (!isReadableVersion(version)) return forest;
  readTrees(*forest, version);
  readInputKeys(*forest);
  if (version >= kFirstVersionWithMapping) {
    readFeatureMapping(*forest);
    readEqualityFeatures(*forest);
  }
  if (version == kNewestVersion) readAverages(*forest);
  readTrailer(*forest, version);
  return forest;
}

void Reader::readTrees(Forest& forest, int32_t version) {
  const std::string& head = decodeNext();
  const auto* p = reinterpret_cast<const unsigned char*>(head.data());
  forest.baseScore = loadPrefix<double>(p, head.size());
  const uint32_t count =
      head.size() > 8 ? loadPrefix<uint32_t>(p + 8, head.size() - 8) : 0;
  lines_.require(count, count, "trees");
  forest.trees.reserve(count);
  std::string scratch;
  for (uint32_t i = 0; i < count; ++i) {
    WeightedTree entry;
    readTree(
        lines_.next(), entry, version,
        [&] {
          return "tree " + std::to_string(i) + " (of " + std::to_string(count) +
                 ", counting from 0)";
        },
        scratch, arena_);
    forest.trees.push_back(std::move(entry));
  }
}

void Reader::readInputKeys(Forest& forest) {
  const auto count = readValue<uint32_t>();
  lines_.require(count, count, "input keys");
  std::vector<std::string> keys;
  keys.reserve(count);
  for (uint32_t i = 0; i < count; ++i) keys.push_back(decodeNext());
  forest.inputKeys = std::move(keys);
}

void Reader::readFeatureMapping(Forest& forest) {
  const auto count = readValue<uint32_t>();
  lines_.require(count, count, "featureMapping entries");
  std::vector<uint32_t> mapping(count, 0);
  for (uint32_t i = 0; i < count; ++i) mapping[i] = static_cast<uint32_t>(readValue<int32_t>());
  forest.featureMapping = std::move(mapping);
}

void Reader::readEqualityFeatures(Forest& forest) {
  const auto count = readValue<uint32_t>();
  lines_.require(count, count, "equality features");
  std::vector<uint32_t> features;
  features.reserve(count);
  for (uint32_t i = 0; i < count; ++i) {
    features.push_back(static_cast<uint32_t>(readValue<int32_t>()));
  }
  forest.equalityFeatures = std::move(features);
}

void Reader::readAverages(Forest& forest) {
  const auto count = readValue<uint32_t>();
  lines_.require(2 * static_cast<uint64_t>(count), count, "average feature values");
  LOG(INFO) << "Loaded " << count << " average feature values";
  std::map<uint32_t, double> averages;
  for (uint32_t i = 0; i < count; ++i) {
    const auto id = readValue<int32_t>();
    const auto average = readValue<double>();
    averages.emplace(static_cast<uint32_t>(id), average);  // the first pair for an id wins
  }
  forest.averageFeatureValues = std::move(averages);
}

void Reader::readTrailer(Forest& forest, int32_t version) {
  if (lines_.atEnd()) return;
  if (readValue<int32_t>() != kModelMagic) return;
  WeightedTree selector;
  std::string scratch;
  readTree(lines_.next(), selector, version, [] { return std::string("model selector tree"); },
           scratch, arena_);
  forest.modelSelector = std::move(selector);

  const auto count = readValue<uint32_t>();
  lines_.require(count, count, "model index entries");
  std::vector<uint32_t> indexMap(count, 0);
  for (uint32_t i = 0; i < count; ++i) {
    const auto index = readValue<uint32_t>();
    if (index > forest.trees.size()) {
      LOG(ERROR) << "the model index " << index << " is larger than the number of trees "
                 << forest.trees.size();
    }
    indexMap[i] = index;
  }
  forest.modelIndexMap = std::move(indexMap);
}

}  // namespace

WeightedTree::WeightedTree(const WeightedTree& other)
    : tree(other.tree ? std::make_unique<Tree>(*other.tree) : nullptr), weight(other.weight) {}

WeightedTree& WeightedTree::operator=(const WeightedTree& other) {
  if (this != &other) {
    tree = other.tree ? std::make_unique<Tree>(*other.tree) : nullptr;
    weight = other.weight;
  }
  return *this;
}

std::string base64_decode(std::string_view text) {
  std::string out;
  decodeInto(text, out);
  return out;
}

std::string read_base64_line(std::istream& in) {
  std::string line;
  std::getline(in, line);
  return line.empty() ? std::string() : base64_decode(line);
}

uint32_t read_uint32(std::istream& in) { return loadPrefix<uint32_t>(read_base64_line(in)); }

int32_t read_int32(std::istream& in) { return loadPrefix<int32_t>(read_base64_line(in)); }

double read_double(std::istream& in) { return loadPrefix<double>(read_base64_line(in)); }

int32_t is_header(std::istream& in) { return parseHeader(read_base64_line(in)); }

ModelHeader read_header(std::istream& in) { return headerOf(read_base64_line(in)); }

std::unique_ptr<Node> deserialize_node(std::istream& in) {
  StreamBytes src(in);
  NodeArena arena;
  return readNodes(src, nullptr, arena);
}

void deserialize_tree(const std::string& line, WeightedTree& out, int32_t version) {
  std::string scratch;
  NodeArena arena;
  readTree(line, out, version, [] { return std::string("tree"); }, scratch, arena);
}

std::unique_ptr<Forest> deserialize(std::string_view text) {
  NodeArena arena;
  return deserialize(text, arena);
}

std::unique_ptr<Forest> deserialize(std::string_view text, NodeArena& arena) { return Reader(text, arena).read(); }

std::unique_ptr<Forest> deserialize(std::istream& in) {
  const std::string text{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
  return deserialize(std::string_view(text));
}

void linkForest(Forest& forest) {
  for (WeightedTree& entry : forest.trees) {
    if (entry.tree) linkTree(*entry.tree, forest.inputKeys);
  }
  if (forest.modelSelector.tree) linkTree(*forest.modelSelector.tree, forest.inputKeys);
}

}  // namespace thornvale

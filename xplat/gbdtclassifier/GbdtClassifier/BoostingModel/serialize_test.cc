#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sstream>
#include <string>
#include <tuple>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/LittleEndian.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/ForestComparison.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/TreeBuilders.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/LogCapture.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/StdoutCapture.h"

namespace thornvale {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using test::LogCapture;

// Record builder for hand-made model lines, little-endian like the format.
struct Bytes {
  std::string b;
  template <typename T>
  Bytes& put(T v) {
    appendLittleEndian(b, v);
    return *this;
  }
  Bytes& i32(int32_t v) { return put(v); }
  Bytes& u32(uint32_t v) { return put(v); }
  Bytes& f64(double v) { return put(v); }
  Bytes& leaf(double v) { return tag('C').f64(v); }
  Bytes& split(int32_t index, double pivot) { return tag('L').i32(index).f64(pivot); }
  Bytes& tag(char t) {
    b.push_back(t);
    return *this;
  }
};

// A model text built line by line.
struct Model {
  std::string text;
  Model& line(const Bytes& bytes) { return raw(base64_encode(bytes.b)); }
  Model& raw(const std::string& line) {
    text += line;
    text += '\n';
    return *this;
  }
  Model& header(int32_t version, int32_t magic = kModelMagic) {
    return line(Bytes().i32(magic).i32(version));
  }
  Model& count(uint32_t n) { return line(Bytes().u32(n)); }
};

// Reads `text`, discarding the version line on standard output.
std::unique_ptr<Forest> read(const std::string& text) {
  test::StdoutCapture discarded;  // ends with this function, however it ends
  return deserialize(text);
}

// A one-leaf tree line.
Bytes leafTree(double weight, double value) {
  return Bytes().f64(weight).leaf(value).i32(0);
}

Model minimalV2(uint32_t trees = 1) {
  Model m;
  m.header(2).line(Bytes().f64(0.5).u32(trees));
  for (uint32_t i = 0; i < trees; ++i) m.line(leafTree(1.0, i));
  return m;
}

TEST(Base64, PaddingQuirks) {
  using namespace std::string_literals;
  EXPECT_EQ(base64_decode("QQ=="), "A\0\0"s);  // standard padding keeps zero bytes
  EXPECT_EQ(base64_decode("QQAA=="), "A");     // group, then one '=' per zero byte
  EXPECT_EQ(base64_decode("QUJD"), "ABC");
  EXPECT_EQ(base64_decode("QUJD\r"), "ABC");     // left-over characters are not decoded
  EXPECT_EQ(base64_decode("QUJD=x="), "AB");     // '=' removes a byte, 'x' stops
  EXPECT_EQ(base64_decode("QU*D"), "A@\x03"s);   // unknown characters decode as 0
  EXPECT_EQ(base64_decode("==="), "");           // nothing to remove
  EXPECT_EQ(base64_decode(""), "");
}

TEST(Base64, EncoderOutputDecodesExactly) {
  std::string bytes;
  for (int n = 0; n < 12; ++n) {
    EXPECT_EQ(base64_decode(base64_encode(bytes)), bytes) << n;
    bytes.push_back(static_cast<char>(n == 3 ? 0 : 0xF0 + n));
  }
}

// Every byte value in every place of a group, and runs of groups, against
// the bit layout of base64 written out plainly.
TEST(Base64, EveryCharacterInEveryPlaceOfAGroup) {
  const std::string alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  auto sixBits = [&](unsigned char c) -> unsigned {
    const size_t at = alphabet.find(static_cast<char>(c));
    return at == std::string::npos ? 0 : static_cast<unsigned>(at);
  };
  auto reference = [&](const std::string& text) {
    std::string out;
    for (size_t g = 0; g + 4 <= text.size(); g += 4) {
      unsigned bits = 0;
      for (size_t k = 0; k < 4; ++k) bits = bits << 6 | sixBits(static_cast<unsigned char>(text[g + k]));
      out += static_cast<char>(bits >> 16);
      out += static_cast<char>(bits >> 8 & 0xFF);
      out += static_cast<char>(bits & 0xFF);
    }
    return out;
  };
  std::string text;
  for (int c = 0; c < 256; ++c) {
    if (c == '=') continue;  // padding is covered above
    for (int place = 0; place < 4; ++place) {
      std::string group = "w9+B";
      group[place] = static_cast<char>(c);
      ASSERT_EQ(base64_decode(group), reference(group)) << c << " at " << place;
      text += group;
    }
  }
  EXPECT_EQ(base64_decode(text), reference(text));
}

TEST(StreamReaders, ReadLinesOneAtATime) {
  std::istringstream in(base64_encode(Bytes().u32(7).u32(99).b) + "\n\n" +
                        base64_encode(Bytes().f64(-2.5).b) + "\n" +
                        base64_encode(std::string("\x01\x02", 2)) + "\n");
  EXPECT_EQ(read_uint32(in), 7u);  // surplus bytes ignored
  EXPECT_EQ(read_uint32(in), 0u);  // empty line
  EXPECT_EQ(read_double(in), -2.5);
  EXPECT_EQ(read_int32(in), 0x0201);  // short line: missing bytes are zero
  EXPECT_EQ(read_base64_line(in), "");  // end of input

  std::istringstream nodes(Bytes().split(3, 1.5).leaf(1).leaf(2).tag('C').b);
  auto root = deserialize_node(nodes);
  ASSERT_NE(root, nullptr);
  EXPECT_EQ(root->evaluate({0, 0, 0, 2.0}), 2);
  EXPECT_EQ(deserialize_node(nodes)->evaluate({}), 0.0);  // value bytes missing: zero
}

TEST(Header, VersionsAndMessages) {
  LogCapture log;
  for (int32_t version : {1, 5}) {
    Model m = minimalV2();
    m.text = Model().header(version).text + m.text.substr(m.text.find('\n') + 1);
    test::StdoutCapture out;
    auto forest = deserialize(m.text);
    EXPECT_EQ(out.take(),
              "Deseralization version: " + std::to_string(version) + "\n");
    EXPECT_TRUE(forest->trees.empty());
    EXPECT_EQ(forest->baseScore, 0.0);
  }
  EXPECT_TRUE(log.at(google::GLOG_ERROR).empty());

  Model wrong = minimalV2();
  wrong.text = Model().header(2, 12345).text + wrong.text.substr(wrong.text.find('\n') + 1);
  EXPECT_EQ(read(wrong.text)->trees.size(), 1u);
  EXPECT_THAT(log.at(google::GLOG_ERROR),
              ElementsAre("magic number in header does not match! 12345 vs 314156"));

  log.clear();
  std::istringstream empty("\n");
  EXPECT_EQ(is_header(empty), 0);
  EXPECT_THAT(log.at(google::GLOG_ERROR),
              ElementsAre("is_header reached eof or fail bit is set when reading magic number",
                          "magic number in header does not match! 0 vs 314156",
                          "is_header reached eof or fail bit is set when reading version number"));

  // read_header gives the same numbers and says nothing.
  log.clear();
  for (const auto& [text, magic, version, complete] :
       {std::tuple{wrong.text, 12345, 2, true}, std::tuple{std::string("\n"), 0, 0, false},
        std::tuple{minimalV2().text, 314156, 2, true}}) {
    std::istringstream in(text);
    const ModelHeader header = read_header(in);
    EXPECT_EQ(header.magic, magic);
    EXPECT_EQ(header.version, version);
    EXPECT_EQ(header.complete, complete);
  }
  EXPECT_TRUE(log.at(google::GLOG_ERROR).empty());
}

TEST(Layout, OptionalPartsAndEmptyLines) {
  // Version 2 ending after its keys, with and without a final line feed.
  Model m = minimalV2();
  m.count(3).line(Bytes().tag('k')).raw("").line(Bytes().tag('j'));
  for (const std::string& text : {m.text, m.text.substr(0, m.text.size() - 1)}) {
    auto f = read(text);
    EXPECT_THAT(f->inputKeys, ElementsAre("k", "", "j"));
    EXPECT_EQ(f->baseScore, 0.5);
    EXPECT_EQ(f->modelSelector.tree, nullptr);
    EXPECT_TRUE(f->modelIndexMap.empty());
  }

  // Version 4: empty count lines mean zero entries; the first average per id wins.
  LogCapture log;
  Model v4;
  v4.header(4).line(Bytes().f64(0).u32(0)).raw("").raw("").raw("").count(3);
  v4.line(Bytes().i32(-1)).line(Bytes().f64(1.5));
  v4.line(Bytes().i32(2)).line(Bytes().f64(2.5));
  v4.line(Bytes().i32(-1)).line(Bytes().f64(9.5));
  auto f = read(v4.text);
  EXPECT_TRUE(f->inputKeys.empty());
  EXPECT_TRUE(f->featureMapping.empty());
  EXPECT_EQ(f->averageFeatureValues, (std::map<uint32_t, double>{{2, 2.5}, {0xFFFFFFFFu, 1.5}}));
  EXPECT_THAT(log.at(google::GLOG_INFO), ElementsAre("Loaded 3 average feature values"));
}

TEST(Layout, FeatureValuesTable) {
  Model m;
  m.header(2).line(Bytes().f64(0).u32(3));
  m.line(Bytes().f64(1).leaf(0));                         // count missing: empty table
  m.line(Bytes().f64(1).leaf(0).i32(-4));                 // negative count: none read
  m.line(Bytes().f64(1).leaf(0).i32(3).i32(5).f64(1).i32(-2).f64(2).i32(5).f64(3));
  auto f = read(m.text);
  EXPECT_TRUE(f->trees[0].tree->featureValues.empty());
  EXPECT_TRUE(f->trees[1].tree->featureValues.empty());
  EXPECT_EQ(f->trees[2].tree->featureValues, (std::map<int32_t, double>{{-2, 2}, {5, 3}}));
}

TEST(Layout, Trailer) {
  LogCapture log;
  Model m = minimalV2(2);
  m.count(0).count(kModelMagic).line(leafTree(0.5, 7)).count(3).count(2).count(3).count(1);
  auto f = read(m.text);
  ASSERT_NE(f->modelSelector.tree, nullptr);
  EXPECT_EQ(f->modelSelector.weight, 0.5);
  EXPECT_EQ(f->modelSelector.tree->root->evaluate({}), 7);
  EXPECT_THAT(f->modelIndexMap, ElementsAre(2, 3, 1));  // equal to the tree count is fine
  EXPECT_THAT(log.at(google::GLOG_ERROR),
              ElementsAre("the model index 3 is larger than the number of trees 2"));

  // A second magic number that does not match ends reading silently.
  log.clear();
  Model other = minimalV2();
  other.count(0).count(kModelMagic + 1).line(leafTree(0.5, 7)).count(1).count(0);
  auto g = read(other.text);
  EXPECT_EQ(g->modelSelector.tree, nullptr);
  EXPECT_TRUE(g->modelIndexMap.empty());
  EXPECT_TRUE(log.at(google::GLOG_ERROR).empty());
}

TEST(Malformed, AbsentNodesRejectTheModelNamingTheTree) {
  LogCapture log;
  Model bad = minimalV2(2);
  bad.line(Bytes().f64(1).split(0, 1).leaf(1).tag('Z').f64(0));  // tree 2 of 3
  bad.text = Model().header(2).line(Bytes().f64(0).u32(3)).text +
             bad.text.substr(bad.text.find('\n', bad.text.find('\n') + 1) + 1);
  try {
    read(bad.text);
    FAIL() << "accepted";
  } catch (const std::runtime_error& e) {
    EXPECT_THAT(e.what(), HasSubstr("tree 2 (of 3"));
    EXPECT_THAT(e.what(), HasSubstr("unknown node tag 0x5a at byte 30"));
  }
  EXPECT_THAT(log.at(google::GLOG_ERROR),
              ElementsAre("ERROR: unsupported node type in deserialize_node()"));

  Model shortRecord = minimalV2();
  shortRecord.text = Model().header(3).line(Bytes().f64(0).u32(1)).text;
  shortRecord.line(Bytes().f64(1).split(0, 1).leaf(1));
  EXPECT_THAT([&] { read(shortRecord.text); },
              ::testing::ThrowsMessage<std::runtime_error>(HasSubstr("where a node was due")));

  Model missingLine;
  missingLine.header(2).line(Bytes().f64(0).u32(1)).raw("");
  EXPECT_THROW(read(missingLine.text), std::runtime_error);

  Model selector = minimalV2();
  selector.count(0).count(kModelMagic).line(Bytes().f64(1).tag('?'));
  EXPECT_THAT([&] { read(selector.text); },
              ::testing::ThrowsMessage<std::runtime_error>(HasSubstr("model selector tree")));

  std::string line = base64_encode(Bytes().f64(1).tag('L').b);
  WeightedTree out;
  EXPECT_THROW(deserialize_tree(line, out, 2), std::runtime_error);
}

TEST(Malformed, CountsBeyondTheInputAreRefused) {
  auto expectRefused = [](const std::string& text, const char* what) {
    EXPECT_THAT([&] { read(text); },
                ::testing::ThrowsMessage<std::runtime_error>(HasSubstr(what)))
        << what;
  };
  Model trees;
  trees.header(2).line(Bytes().f64(0).u32(0xFFFFFFFFu)).line(leafTree(1, 1));
  expectRefused(trees.text, "declares 4294967295 trees but only 1 lines remain");

  expectRefused(Model(minimalV2()).count(3).raw("").raw("").text, "input keys");
  Model v4 = minimalV2();
  v4.text = Model().header(4).text + v4.text.substr(v4.text.find('\n') + 1);
  expectRefused(Model(v4).count(0).count(2).count(1).text, "featureMapping entries");
  expectRefused(Model(v4).count(0).count(0).count(2).count(1).text, "equality features");
  expectRefused(Model(v4).count(0).count(0).count(0).count(2).count(1).count(1).count(1).text,
                "average feature values");
  expectRefused(Model(minimalV2()).count(0).count(kModelMagic).line(leafTree(1, 0)).count(9).text,
                "model index entries");

  Model values;
  values.header(2).line(Bytes().f64(0).u32(1));
  values.line(Bytes().f64(1).leaf(0).i32(2).i32(1).f64(1).i32(2).f64(2).tag('x'));
  EXPECT_NO_THROW(read(values.text));  // 2 entries of 12 bytes fit
  Model tooMany;
  tooMany.header(2).line(Bytes().f64(0).u32(1));
  tooMany.line(Bytes().f64(1).leaf(0).i32(0x7FFFFFFF).i32(1));
  expectRefused(tooMany.text, "featureValues count 2147483647");
}

TEST(Forests, CopiesAreDeepAndLinkingNamesByInputKeys) {
  Forest f;
  f.trees.push_back(test::weighted(test::split(1, 0.5, test::leaf(1), test::leaf(2)), 2));
  f.modelSelector = test::weighted(test::leaf(3), 1);
  f.inputKeys = {"a", "b"};
  Forest copy = f;
  std::string why;
  EXPECT_TRUE(test::sameForest(f, copy, &why)) << why;
  EXPECT_NE(copy.trees[0].tree.get(), f.trees[0].tree.get());

  linkForest(copy);
  const Node& root = *copy.trees[0].tree->root;
  EXPECT_EQ(root.tree, copy.trees[0].tree.get());
  EXPECT_EQ(static_cast<const LinearNode&>(root).left->parent, &root);
  EXPECT_EQ(copy.modelSelector.tree->root->tree, copy.modelSelector.tree.get());
  std::ostringstream out;
  root.printTree(out, 0);
  EXPECT_THAT(out.str(), HasSubstr("If b <= 0.5 then"));
}

}  // namespace
}  // namespace thornvale

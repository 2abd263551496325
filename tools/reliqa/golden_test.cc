// Features and scores must be the same bits on every ABI we ship. The golden
// file (written by golden_data.py from a native build) holds a few hundred
// collections with the exact bits of their features, score and raw score
// under the example model; this test recomputes them on whatever ABI it was
// built for and compares bit for bit.
#include <simdjson.h>

#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <fstream>
#include <map>
#include <optional>
#include <sstream>
#include <string>

#include <glog/logging.h>
#include <gtest/gtest.h>

#include "reliqaclassifier/FeatureExtraction.h"
#include "tools/common/collection_reader.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"

namespace {

constexpr char kTimeZone[] = "Europe/Berlin";
constexpr int kMaxReported = 20;

std::string readFile(const char* path) {
  std::ifstream in(path, std::ios::binary);
  EXPECT_TRUE(in) << "cannot open " << path;
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

// Sets TZ for the lifetime of the object and puts the previous value back.
class ScopedTimeZone {
 public:
  explicit ScopedTimeZone(const char* zone) {
    if (const char* old = std::getenv("TZ")) previous_ = old;
    setenv("TZ", zone, 1);
    tzset();
  }
  ~ScopedTimeZone() {
    if (previous_) setenv("TZ", previous_->c_str(), 1);
    else unsetenv("TZ");
    tzset();
  }

 private:
  std::optional<std::string> previous_;
};

uint64_t bitsOf(double value) {
  uint64_t bits;
  std::memcpy(&bits, &value, sizeof bits);
  return bits;
}

std::string describe(uint64_t bits) {
  double value;
  std::memcpy(&value, &bits, sizeof value);
  char text[64];
  std::snprintf(text, sizeof text, "%016" PRIx64 " (%.17g)", bits, value);
  return text;
}

uint64_t parseBits(std::string_view hex) {
  std::string text(hex);
  char* end = nullptr;
  uint64_t bits = std::strtoull(text.c_str(), &end, 16);
  EXPECT_TRUE(text.size() == 16 && *end == '\0') << "bad bit pattern \"" << text << "\"";
  return bits;
}

struct Golden {
  std::map<int32_t, uint64_t> features;
  uint64_t score = 0;
  uint64_t rawScore = 0;
  kestrova::reliqaclassifier::ReliqaClassifierInput collection;
};

Golden parseLine(simdjson::ondemand::parser& parser, const std::string& line, int64_t lineNumber) {
  Golden g;
  simdjson::padded_string padded(line);
  simdjson::ondemand::document doc = parser.iterate(padded);
  for (auto field : doc["features"].get_object()) {
    std::string_view key = field.unescaped_key();
    std::string_view hex = field.value().get_string();
    g.features.emplace(std::stoi(std::string(key)), parseBits(hex));
  }
  g.score = parseBits(doc["score"].get_string().value());
  g.rawScore = parseBits(doc["rawScore"].get_string().value());
  std::string_view collection = doc["collection"].get_object().value().raw_json();
  g.collection = reliqa::tool::parseCollection(collection, GOLDEN_COLLECTIONS, lineNumber);
  return g;
}

TEST(GoldenCollections, SameBitsOnEveryAbi) {
  ScopedTimeZone zone(kTimeZone);
  // Without the zone's data the C library silently falls back to UTC; say so
  // rather than report a wall of hour mismatches.
  time_t midsummer = 1719835200;  // 2024-07-01 12:00:00 UTC
  std::tm local{};
  ASSERT_NE(localtime_r(&midsummer, &local), nullptr);
  ASSERT_EQ(local.tm_hour, 14) << "no time zone data for " << kTimeZone;

  // predict() logs every raw score at INFO: 300 lines of noise.
  const int logLevel = FLAGS_minloglevel;
  FLAGS_minloglevel = google::GLOG_WARNING;
  thornvale::BoostingModel model(readFile(GOLDEN_MODEL));
  std::istringstream lines(readFile(GOLDEN_COLLECTIONS));
  simdjson::ondemand::parser parser;

  int collections = 0, badCollections = 0, badValues = 0;
  auto report = [&](const std::string& message) {
    if (++badValues <= kMaxReported) ADD_FAILURE() << message;
  };
  std::string line;
  for (int64_t lineNumber = 1; std::getline(lines, line); ++lineNumber) {
    if (line.empty()) continue;
    const int index = collections++;
    const Golden g = parseLine(parser, line, lineNumber);
    const std::string where = "collection " + std::to_string(index) + " (" + g.collection.collectionID + ")";
    const int badBefore = badValues;

    const thornvale::FeatureMap features = kestrova::reliqaclassifier::extractFeatures(g.collection);
    for (const auto& [id, expected] : g.features) {
      auto found = features.find(id);
      if (found == features.end()) {
        report(where + ", feature " + std::to_string(id) + ": missing");
      } else if (bitsOf(found->second) != expected) {
        report(where + ", feature " + std::to_string(id) + ": expected " + describe(expected) + ", got " +
               describe(bitsOf(found->second)));
      }
    }
    for (const auto& [id, value] : features) {
      if (!g.features.count(id)) report(where + ", feature " + std::to_string(id) + ": not expected");
    }

    // No server features: the computed features are the merged ones.
    const uint64_t score = bitsOf(model.predict(features));
    const uint64_t rawScore = bitsOf(model.rawScore(features));
    if (score != g.score) report(where + ", score: expected " + describe(g.score) + ", got " + describe(score));
    if (rawScore != g.rawScore) {
      report(where + ", raw score: expected " + describe(g.rawScore) + ", got " + describe(rawScore));
    }
    if (badValues != badBefore) ++badCollections;
  }

  FLAGS_minloglevel = logLevel;
  EXPECT_EQ(collections, 300) << "the golden file is incomplete";
  EXPECT_EQ(badValues, 0) << badValues << " values in " << badCollections << " of " << collections
                          << " collections differ" << (badValues > kMaxReported ? " (first ones above)" : "");
}

}  // namespace

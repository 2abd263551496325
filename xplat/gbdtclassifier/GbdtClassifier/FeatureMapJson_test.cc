// The JSON writer and reader together: what is written reads back, and stored
// texts of every other shape read by the rules of FeatureMapJson.h.
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMapJson.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>

#include "xplat/gbdtclassifier/GbdtClassifier/ConversionError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace thornvale {
namespace {

constexpr double kInf = std::numeric_limits<double>::infinity();
const double kNaN = std::nan("");

template <typename Error, typename Action>
std::string errorOf(Action action) {
  try {
    action();
  } catch (const Error& error) {
    return error.what();
  }
  return "no error of the expected type";
}

std::string readError(std::string_view json) {
  try {
    featureMapFromJson(json);
  } catch (const std::exception& error) {
    return error.what();
  }
  return "no error";
}

TEST(JsonWriterTest, WritesCompactObjectsWithShortestNumbers) {
  EXPECT_EQ(featureMapToJson({}), "{}");
  EXPECT_EQ(featureMapToJson({{-3, -1.0}}), "{\"-3\":-1}");
  EXPECT_EQ(featureMapToJson({{7, 1e-7}}), "{\"7\":1E-7}");
  // Members by ascending id, negative ids first, whatever order they came in.
  EXPECT_EQ(featureMapToJson({{75, 1.0}, {48, 0.25}, {-1, 0.5}, {3, 2.0}}),
            "{\"-1\":0.5,\"3\":2,\"48\":0.25,\"75\":1}");
  EXPECT_EQ(doubleToJson(0.7), "0.7");
  EXPECT_EQ(doubleToJson(-0.0), "-0");
}

TEST(JsonWriterTest, RefusesNonFiniteNumbersNamingWhere) {
  EXPECT_EQ(errorOf<JsonPrintError>([] { doubleToJson(kNaN); }),
            "folly::toJson: JSON object value was a NaN when serializing <undefined location>");
  EXPECT_EQ(errorOf<JsonPrintError>([] { doubleToJson(-kInf); }),
            "folly::toJson: JSON object value was an INF when serializing <undefined location>");
  EXPECT_EQ(errorOf<JsonPrintError>([] { featureMapToJson({{7, kNaN}}); }),
            "folly::toJson: JSON object value was a NaN when serializing value at \"7\"");
  EXPECT_EQ(errorOf<JsonPrintError>([] { featureMapToJson({{-2, kInf}}); }),
            "folly::toJson: JSON object value was an INF when serializing value at \"-2\"");
}

TEST(FeatureMapJsonTest, WrittenMapsReadBack) {
  FeatureMap features{{1, 0.5}, {2, -1.0}, {3, 1e-7}, {4, 1e300}, {-5, 3.0}, {74, 0.0},
                      {2147483647, 1.0 / 3}, {-2147483647 - 1, 9007199254740992.0}};
  EXPECT_EQ(featureMapFromJson(featureMapToJson(features)), features);
  EXPECT_EQ(featureMapFromJson(" { } "), FeatureMap{});
}

// The writer sizes its text for the longest members before writing them.
// Here every member is as long as any can be (an 11-character id, a
// 25-character number), so the text fills that size to its last byte: a
// size one short would overrun, which the sanitizer builds report.
TEST(FeatureMapJsonTest, LongestMembersAreWrittenWhole) {
  FeatureMap features;
  for (int32_t i = 0; features.size() < 300; ++i) {
    const double value = -1.2345678901234567e-6 * (1.0 + i / 1e9);  // -0.0000012345678901234567
    if (doubleToText(value).size() == kMaxDoubleTextSize) {
      features.emplace(-2147483647 - 1 + static_cast<int32_t>(features.size()), value);
    }
  }
  std::string expected = "{";
  for (const auto& [id, value] : features) {
    if (expected.size() > 1) expected += ',';
    expected += '"' + std::to_string(id) + "\":" + doubleToText(value);
  }
  expected += '}';
  const std::string json = featureMapToJson(features);
  EXPECT_EQ(json, expected);
  EXPECT_EQ(json.size(), 2 + features.size() * (11 + 4 + kMaxDoubleTextSize) - 1);
  EXPECT_EQ(featureMapFromJson(json), features);
}

TEST(FeatureMapJsonTest, NamesAreIntegersAndDuplicatesResolveByDocumentOrder) {
  // Identical names: the last value counts.
  EXPECT_EQ(featureMapFromJson(R"({"4":1,"4":2})"), (FeatureMap{{4, 2.0}}));
  // Different names for one id: the first in the text wins...
  EXPECT_EQ(featureMapFromJson(R"({"4":1.5,"04":2.5})"), (FeatureMap{{4, 1.5}}));
  EXPECT_EQ(featureMapFromJson(R"({"04":2.5," 4":1.5,"+4":0})"), (FeatureMap{{4, 2.5}}));
  // ...also when the name comes back later with a new value (it keeps its place).
  EXPECT_EQ(featureMapFromJson(R"({"4":1,"04":2,"4":3})"), (FeatureMap{{4, 3.0}}));
  // Names are narrowed to 32 bits: 4294967300 is 4.
  EXPECT_EQ(featureMapFromJson(R"({"4294967300":1,"4":2})"), (FeatureMap{{4, 1.0}}));
  EXPECT_EQ(featureMapFromJson(R"({"99999999999":1})"), (FeatureMap{{1215752191, 1.0}}));
  EXPECT_EQ(featureMapFromJson(R"({"\u0034":1})"), (FeatureMap{{4, 1.0}}));

  EXPECT_EQ(readError(R"({"a":1})"), "Invalid leading character: \"a\"");
  EXPECT_EQ(readError(R"({"4.0":1})"), "Non-whitespace character found after end of conversion: \".0\"");
  EXPECT_EQ(readError(R"({"":1})"), "Empty input string");
}

TEST(FeatureMapJsonTest, IntegralNumbersGoThroughSixtyFourBitIntegers) {
  FeatureMap read = featureMapFromJson(R"({"1":-0,"2":0123,"3":18014398509481984,"4":-9223372036854775808})");
  EXPECT_EQ(read.at(1), 0.0);
  EXPECT_FALSE(std::signbit(read.at(1)));  // the sign of -0 is lost on the integer path
  EXPECT_EQ(read.at(2), 123.0);
  EXPECT_EQ(read.at(3), 18014398509481984.0);  // 2^54 is exact
  EXPECT_EQ(read.at(4), -9223372036854775808.0);

  EXPECT_EQ(readError(R"({"1":10000000000000000000})"),
            "Overflow during conversion: \"10000000000000000000\"");
  EXPECT_EQ(readError(R"({"1":-9223372036854775809})"),
            "Negative overflow during conversion: \"-9223372036854775809\"");
  EXPECT_EQ(readError(R"({"1":1152921504606847000})"),  // 2^60 as written
            "Loss of precision during arithmetic conversion: (double) 1152921504606847000");
  EXPECT_EQ(readError(R"({"1":9223372036854775807})"),
            "Loss of precision during arithmetic conversion: (double) 9223372036854775807");
}

TEST(FeatureMapJsonTest, OtherNumbersAndValueTypes) {
  FeatureMap read = featureMapFromJson(
      "{\"1\":1.,\"2\":1.e5,\"3\":1E400,\"4\":-1e400,\"5\":1e-400,\"6\":true,\"7\":false,"
      "\"8\":\" 0.7 \",\"9\":NaN,\"10\":Infinity,\"11\":-Infinity,\"12\":-0.0}\n");
  EXPECT_EQ(read.at(1), 1.0);
  EXPECT_EQ(read.at(2), 100000.0);
  EXPECT_EQ(read.at(3), kInf);
  EXPECT_EQ(read.at(4), -kInf);
  EXPECT_EQ(read.at(5), 0.0);
  EXPECT_EQ(read.at(6), 1.0);
  EXPECT_EQ(read.at(7), 0.0);
  EXPECT_EQ(read.at(8), 0.7);
  EXPECT_TRUE(std::isnan(read.at(9)));
  EXPECT_EQ(read.at(10), kInf);
  EXPECT_EQ(read.at(11), -kInf);
  EXPECT_TRUE(std::signbit(read.at(12)));

  EXPECT_EQ(readError(R"({"1":1e})"), "Non-whitespace character found after end of conversion: \"e\"");
  EXPECT_EQ(readError(R"({"1":"x"})"), "Unable to convert string to floating point value: \"x\"");
  EXPECT_EQ(readError(R"({"1":null})"),
            "TypeError: expected dynamic type 'int/double/bool/string', but had type 'null'");
  EXPECT_EQ(readError(R"({"1":[1]})"),
            "TypeError: expected dynamic type 'int/double/bool/string', but had type 'array'");
  EXPECT_EQ(readError(R"({"1":{}})"),
            "TypeError: expected dynamic type 'int/double/bool/string', but had type 'object'");
}

TEST(FeatureMapJsonTest, RejectsTextsThatAreNotOneObject) {
  EXPECT_EQ(readError("[1]"), "TypeError: expected dynamic type 'object', but had type 'array'");
  EXPECT_EQ(readError("5"), "TypeError: expected dynamic type 'object', but had type 'int64'");
  EXPECT_EQ(readError("\"s\""), "TypeError: expected dynamic type 'object', but had type 'string'");
  for (const char* malformed : {"", "  ", "{", "{\"1\":1,}", "{\"1\"}", "{1:1}", "{} x", "{}{}", "{\"1\":-}",
                                "{\"1\":1.2.3}", "{\"1\":tru}", "nope"}) {
    std::string error = readError(malformed);
    EXPECT_NE(error, "no error") << malformed;
  }
  EXPECT_EQ(errorOf<JsonParseError>([] { featureMapFromJson("{\"1\":-}"); }).rfind("json parse error", 0), 0u);
  // A NUL byte ends the text.
  EXPECT_EQ(featureMapFromJson(std::string_view("{\"1\":2}\0garbage", 15)), (FeatureMap{{1, 2.0}}));
}

}  // namespace
}  // namespace thornvale

#include "tools/reliqa/feature_rows.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/reliqa/errors.h"

namespace reliqa::tool {
namespace {

using ::testing::HasSubstr;
using thornvale::FeatureMap;

template <class F>
std::string errorOf(F&& f) {
  try {
    f();
  } catch (const ToolError& e) {
    return e.describe();
  }
  return "no error";
}

TEST(FeatureRows, ReadsIdsAndNumbers) {
  FeatureMap row = parseFeatureRow(R"({"3":0.25,"17":-1,"-4":1e-7})", "rows", 9);
  EXPECT_EQ(row, (FeatureMap{{3, 0.25}, {17, -1.0}, {-4, 1e-7}}));
  EXPECT_TRUE(parseFeatureRow("{}", "rows").empty());
}

TEST(FeatureRows, RefusesWhatIsNotAnIdToNumberMap) {
  EXPECT_THAT(errorOf([] { parseFeatureRow(R"({"3":1,"3":2})", "rows", 5); }),
              HasSubstr("rows:5: feature 3 appears twice"));
  EXPECT_THAT(errorOf([] { parseFeatureRow(R"({"x3":1})", "rows"); }), HasSubstr("\"x3\" is not a decimal"));
  EXPECT_THAT(errorOf([] { parseFeatureRow(R"({"2147483648":1})", "rows"); }), HasSubstr("not a decimal 32-bit"));
  EXPECT_THAT(errorOf([] { parseFeatureRow(R"({"3":"1"})", "rows"); }),
              HasSubstr("feature 3: expected a number, got a string"));
  EXPECT_THAT(errorOf([] { parseFeatureRow(R"({"3":null})", "rows"); }), HasSubstr("got null"));
}

TEST(ServerFeatures, KeysFollowTheCRules) {
  EXPECT_EQ(serverFeatureId("12"), 12);
  EXPECT_EQ(serverFeatureId("  7x"), 7);
  EXPECT_EQ(serverFeatureId("+3"), 3);
  EXPECT_EQ(serverFeatureId("-5"), -5);
  EXPECT_EQ(serverFeatureId("abc"), 0);
  EXPECT_EQ(serverFeatureId(""), 0);
  EXPECT_EQ(serverFeatureId("000000000007"), 7);  // leading zeros do not count
  EXPECT_EQ(serverFeatureId("2147483647"), 2147483647);
  EXPECT_EQ(serverFeatureId("-2147483648"), -2147483647 - 1);
  EXPECT_EQ(serverFeatureId("2147483648"), std::nullopt);
  EXPECT_EQ(serverFeatureId("99999999999999999999999"), std::nullopt);
}

TEST(ServerFeatures, ValuesFollowStrtodAndTheFirstKeyWins) {
  FeatureMap f = parseServerFeatures(
      R"({"12": "0.5", "5": "2.5kg", "05": "9", "7": "letters", "8": 1.25e2, "9": -0, "4294967296": "1"})", "sf");
  EXPECT_EQ(f, (FeatureMap{{12, 0.5}, {5, 2.5}, {7, 0.0}, {8, 125.0}, {9, 0.0}}));
  EXPECT_TRUE(std::signbit(f[9]));  // a JSON number is taken by its text
}

TEST(ServerFeatures, RefusesWhatTheStoreCannotHold) {
  EXPECT_THAT(errorOf([] { parseServerFeatures("{\n\"1\": \"nan\"}", "sf"); }),
              HasSubstr("sf:2: feature \"1\": value \"nan\" reads as NaN"));
  EXPECT_THAT(errorOf([] { parseServerFeatures(R"({"1": "1e400"})", "sf"); }), HasSubstr("infinity"));
  EXPECT_THAT(errorOf([] { parseServerFeatures(R"({"1": null})", "sf"); }),
              HasSubstr("expected a number text (\"0.5\") or a number, got null"));
  EXPECT_THAT(errorOf([] { parseServerFeatures(R"(["1"])", "sf"); }), HasSubstr("got an array"));
}

}  // namespace
}  // namespace reliqa::tool

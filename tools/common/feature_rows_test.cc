#include "tools/common/feature_rows.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/common/errors.h"

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

TEST(ServerFeatures, KeysAndValuesReadAsTheAppsMapIsRead) {
  // The classifier's own reader: atoi rules for keys, strtod in the "C"
  // locale for values, and a zero byte ends either.
  FeatureMap f = parseServerFeatures(
      R"({"  7x": "1", "+3": "2", "-5": "3", "abc": "4", "000000000011": "5", "2147483647": "6",
          "-2147483648": "7", "2147483648": "8", "99999999999999999999999": "9", "12": "1\u00005",
          "13\u00009": " \t+.5e1x"})",
      "sf");
  EXPECT_EQ(f, (FeatureMap{{7, 1.0}, {3, 2.0}, {-5, 3.0}, {0, 4.0}, {11, 5.0}, {2147483647, 6.0},
                           {-2147483647 - 1, 7.0}, {12, 1.0}, {13, 5.0}}));
}

TEST(ServerFeatures, ValuesFollowStrtodAndTheFirstKeyWins) {
  FeatureMap f = parseServerFeatures(
      R"({"12": "0.5", "5": "2.5kg", "05": "9", "7": "letters", "8": 1.25e2, "9": -0, "4294967296": "1"})", "sf");
  EXPECT_EQ(f, (FeatureMap{{12, 0.5}, {5, 2.5}, {7, 0.0}, {8, 125.0}, {9, 0.0}}));
  EXPECT_TRUE(std::signbit(f.at(9)));  // a JSON number is taken by its text
}

TEST(ServerFeatures, RefusesWhatTheStoreWouldNotGiveBack) {
  // Integral values are stored as their shortest text and read back through a
  // 64-bit integer, which must hold them exactly.
  EXPECT_EQ(errorOf([] { parseServerFeatures(R"({"12": "1152921504606846976"})", "sf"); }),
            "sf:1: feature \"12\": value \"1152921504606846976\" cannot be stored: it would not read back "
            "(Loss of precision during arithmetic conversion: (double) 1152921504606847000)");
  for (const char* map : {R"({"3": "9223372036854775808"})", R"({"3": "-9223372036854775809"})",
                          R"({"3": 9300000000000000000})"}) {
    EXPECT_THAT(errorOf([&] { parseServerFeatures(map, "sf"); }),
                HasSubstr("cannot be stored: it would not read back")) << map;
  }
  // What does come back: 2^53, a fraction, 1e21 and above (stored with an
  // exponent), and -0 (as 0, equal to it).
  FeatureMap kept = parseServerFeatures(
      R"({"1": "9007199254740992", "2": "0.1", "3": "1e21", "4": "-1.5e300", "5": "-0"})", "sf");
  EXPECT_EQ(kept, (FeatureMap{{1, 9007199254740992.0}, {2, 0.1}, {3, 1e21}, {4, -1.5e300}, {5, 0.0}}));
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

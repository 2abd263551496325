#include "reliqaclassifier/ServerFeatureText.h"

#include <cmath>

#include <gtest/gtest.h>

namespace kestrova::reliqaclassifier {
namespace {

TEST(ParseFeatureId, ReadsLikeAtoi) {
  EXPECT_EQ(parseFeatureId("12"), 12);
  EXPECT_EQ(parseFeatureId(" \t\n+7x"), 7);
  EXPECT_EQ(parseFeatureId("-42"), -42);
  EXPECT_EQ(parseFeatureId("05"), 5);
  EXPECT_EQ(parseFeatureId("000000000007"), 7);  // leading zeros do not count as digits of range
  EXPECT_EQ(parseFeatureId("abc"), 0);
  EXPECT_EQ(parseFeatureId(""), 0);
  EXPECT_EQ(parseFeatureId("-"), 0);
  EXPECT_EQ(parseFeatureId("+-5"), 0);  // one sign only
  EXPECT_EQ(parseFeatureId("-+5"), 0);
  EXPECT_EQ(parseFeatureId("\v\f\r-0"), 0);
  EXPECT_EQ(parseFeatureId("1 2"), 1);
  EXPECT_EQ(parseFeatureId(std::string_view("3\0" "9", 3)), 3);
}

TEST(ParseFeatureId, RejectsIdsOutsideTheSigned32BitRange) {
  EXPECT_EQ(parseFeatureId("2147483647"), 2147483647);
  EXPECT_EQ(parseFeatureId("-2147483648"), -2147483647 - 1);
  EXPECT_EQ(parseFeatureId("+2147483647"), 2147483647);
  EXPECT_EQ(parseFeatureId("-000000000002147483648"), -2147483647 - 1);
  EXPECT_EQ(parseFeatureId("2147483648"), std::nullopt);
  EXPECT_EQ(parseFeatureId("+2147483648"), std::nullopt);
  EXPECT_EQ(parseFeatureId("-2147483649"), std::nullopt);
  EXPECT_EQ(parseFeatureId("99999999999999999999999999"), std::nullopt);  // no wrap-around
  EXPECT_EQ(parseFeatureId("0000000000002147483647x"), 2147483647);
}

TEST(ParseFeatureValue, ReadsLikeStrtodInTheCLocale) {
  EXPECT_EQ(parseFeatureValue("0.5"), 0.5);
  EXPECT_EQ(parseFeatureValue("  2.5kg"), 2.5);
  EXPECT_EQ(parseFeatureValue("letters"), 0.0);
  EXPECT_EQ(parseFeatureValue("-1e3"), -1000.0);
  EXPECT_EQ(parseFeatureValue("0x1p3"), 8.0);
  EXPECT_TRUE(std::isinf(parseFeatureValue("1e999")));
  EXPECT_TRUE(std::isnan(parseFeatureValue("nan")));
  EXPECT_EQ(parseFeatureValue(std::string("1\0" "5", 3)), 1.0);
}

}  // namespace
}  // namespace kestrova::reliqaclassifier

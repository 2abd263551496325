#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

#include <double-conversion/double-conversion.h>
#include <gtest/gtest.h>

#include <cfloat>
#include <cmath>
#include <limits>
#include <random>
#include <string>

#include "xplat/gbdtclassifier/GbdtClassifier/ConversionError.h"

namespace thornvale {
namespace {

constexpr double kInf = std::numeric_limits<double>::infinity();

std::string conversionErrorOf(std::string_view text, bool asInteger) {
  try {
    if (asInteger) {
      textToInt64(text);
    } else {
      textToDouble(text);
    }
  } catch (const ConversionError& error) {
    return error.what();
  }
  return "no error";
}

TEST(NumberTextTest, WritesShortestTextWithoutTrailingZeroAndCapitalExponent) {
  const std::pair<double, const char*> cases[] = {
      {0.0, "0"},
      {-0.0, "-0"},
      {1.0, "1"},
      {-1.0, "-1"},
      {0.5, "0.5"},
      {0.7, "0.7"},
      {1.0 / 3, "0.3333333333333333"},
      {0.1 + 0.2, "0.30000000000000004"},
      {1e-6, "0.000001"},
      {1e-7, "1E-7"},
      {-1.25e-10, "-1.25E-10"},
      {1e20, "100000000000000000000"},
      {123456789012345678901.0, "123456789012345680000"},
      {1e21, "1E21"},
      {1.5e21, "1.5E21"},
      {5e-324, "5E-324"},
      {DBL_MAX, "1.7976931348623157E308"},
      {std::nan(""), "NaN"},
      {-std::nan(""), "NaN"},
      {kInf, "Infinity"},
      {-kInf, "-Infinity"},
  };
  for (const auto& [value, text] : cases) EXPECT_EQ(doubleToText(value), text) << text;

  std::string appended = "x=";
  appendDoubleText(2.5, appended);
  EXPECT_EQ(appended, "x=2.5");
}

TEST(NumberTextTest, IntegralValuesGiveTheSameTextAsTheGeneralConversion) {
  double_conversion::DoubleToStringConverter reference(double_conversion::DoubleToStringConverter::NO_FLAGS,
                                                       "Infinity", "NaN", 'E', -6, 21, 6, 1);
  auto referenceText = [&reference](double value) {
    char buffer[64];
    double_conversion::StringBuilder builder(buffer, sizeof buffer);
    reference.ToShortest(value, &builder);
    return std::string(buffer, static_cast<size_t>(builder.position()));
  };
  std::vector<double> values = {-0.0, 1.0, -1.0, 9007199254740991.0, -9007199254740991.0, 9007199254740992.0,
                                9007199254740994.0, 1e15, 1e16, 123456789012345.0, 4503599627370497.0};
  std::mt19937_64 rng(1);
  for (int i = 0; i < 2000; ++i) {
    values.push_back(static_cast<double>(static_cast<int64_t>(rng() >> (11 + i % 50))) * (i % 2 ? -1 : 1));
  }
  for (double value : values) EXPECT_EQ(doubleToText(value), referenceText(value)) << value;
}

TEST(NumberTextTest, ReadsDoublesWithSpaceWordsAndOutOfRangeExponents) {
  const std::pair<const char*, double> cases[] = {
      {"0.7", 0.7},      {" 1.5", 1.5},   {"1.5 ", 1.5}, {"\t1.5\n", 1.5}, {"1e3", 1000},
      {".5", 0.5},       {"-.5", -0.5},   {"+.5", 0.5},  {"5.", 5},        {"+1.5", 1.5},
      {"1e400", kInf},   {"-1e400", -kInf}, {"1e-400", 0}, {"inf", kInf},  {"INF", kInf},
      {"Infinity", kInf}, {"infinity ", kInf}, {"-infinity", -kInf},
  };
  for (const auto& [text, value] : cases) EXPECT_EQ(textToDouble(text), value) << text;
  EXPECT_TRUE(std::signbit(textToDouble("-0")));
  EXPECT_TRUE(std::isnan(textToDouble("nan")));
  EXPECT_TRUE(std::isnan(textToDouble("-nan")));
  EXPECT_TRUE(std::isnan(textToDouble("NaN")));

  // Every written text reads back to the same double.
  for (double value : {0.1, 1e-7, 1e21, 5e-324, DBL_MAX, -2.5e-300, 1.0 / 7}) {
    EXPECT_EQ(textToDouble(doubleToText(value)), value);
  }
}

TEST(NumberTextTest, RejectsDoubleTextsWithTheKnownMessages) {
  const std::pair<const char*, const char*> cases[] = {
      {"", "Empty input string"},
      {" ", "Empty input string: \" \""},
      {"abc", "Unable to convert string to floating point value: \"abc\""},
      {"-", "Unable to convert string to floating point value: \"-\""},
      {"- 1", "Unable to convert string to floating point value: \"- 1\""},
      {"+inf", "Unable to convert string to floating point value: \"+inf\""},
      {".", "Unable to convert string to floating point value: \".\""},
      {"0x10", "Non-whitespace character found after end of conversion: \"x10\""},
      {"0.7abc", "Non-whitespace character found after end of conversion: \"abc\""},
      {"1e", "Non-whitespace character found after end of conversion: \"e\""},
      {"1e+", "Non-whitespace character found after end of conversion: \"e+\""},
      {"1,5", "Non-whitespace character found after end of conversion: \",5\""},
      {"nan(1)", "Non-whitespace character found after end of conversion: \"(1)\""},
      {"infin", "Non-whitespace character found after end of conversion: \"in\""},
      {"nanx", "Non-whitespace character found after end of conversion: \"x\""},
  };
  for (const auto& [text, message] : cases) EXPECT_EQ(conversionErrorOf(text, false), message) << text;
}

TEST(NumberTextTest, ReadsIntegersWithSignsSpaceAndOverflowChecks) {
  const std::pair<const char*, int64_t> cases[] = {
      {"4", 4},    {"04", 4},  {"-7", -7}, {"+4", 4}, {" 4", 4}, {"4 ", 4}, {"\t4\n", 4},
      {"00000000000000000000004", 4},     {"99999999999", 99999999999},
      {"-0", 0},   {"+0", 0},
      {"9223372036854775807", std::numeric_limits<int64_t>::max()},
      {"+9223372036854775807", std::numeric_limits<int64_t>::max()},
      {"-9223372036854775808", std::numeric_limits<int64_t>::min()},
      {" -00000000000000000000009223372036854775808\n", std::numeric_limits<int64_t>::min()},
  };
  for (const auto& [text, value] : cases) EXPECT_EQ(textToInt64(text), value) << text;

  const std::pair<const char*, const char*> errors[] = {
      {"", "Empty input string"},
      {" ", "Empty input string: \" \""},
      {"abc", "Invalid leading character: \"abc\""},
      {"-", "No digits found in input string: \"-\""},
      {"- 4", "Non-digit character found: \"- 4\""},
      {"+-4", "Non-digit character found: \"+-4\""},
      {"4 x", "Non-whitespace character found after end of conversion: \" x\""},
      {"4.0", "Non-whitespace character found after end of conversion: \".0\""},
      {"1e3", "Non-whitespace character found after end of conversion: \"e3\""},
      {"0x10", "Non-whitespace character found after end of conversion: \"x10\""},
      {"9223372036854775808", "Overflow during conversion: \"9223372036854775808\""},
      {"+9223372036854775808", "Overflow during conversion: \"+9223372036854775808\""},
      {"18446744073709551616", "Overflow during conversion: \"18446744073709551616\""},
      {"00000000000000000009223372036854775808",
       "Overflow during conversion: \"00000000000000000009223372036854775808\""},
      {"99999999999999999999x", "Overflow during conversion: \"99999999999999999999x\""},
      {"-9223372036854775809", "Negative overflow during conversion: \"-9223372036854775809\""},
      {"-18446744073709551616", "Negative overflow during conversion: \"-18446744073709551616\""},
  };
  for (const auto& [text, message] : errors) EXPECT_EQ(conversionErrorOf(text, true), message) << text;
}

}  // namespace
}  // namespace thornvale

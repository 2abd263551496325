#include "reliqaclassifier/LoggingData.h"

#include <gtest/gtest.h>

#include <stdexcept>
#include <string>
#include <vector>

namespace kestrova::reliqaclassifier {
namespace {

std::vector<std::string> keysOf(const LoggingData& data) {
  std::vector<std::string> keys;
  for (const auto& [key, value] : data) keys.push_back(key);
  return keys;
}

TEST(LoggingDataTest, KeepsInsertionOrderAndTheFirstValueOfAKey) {
  LoggingData data;
  EXPECT_TRUE(data.emplace("score", "0.5"));
  EXPECT_TRUE(data.emplace("model_id", ""));
  EXPECT_TRUE(data.emplace("feature_vector", "{}"));
  EXPECT_FALSE(data.emplace("score", "0.9"));
  EXPECT_TRUE(data.emplace("threshold", "0"));
  EXPECT_EQ(keysOf(data), (std::vector<std::string>{"score", "model_id", "feature_vector", "threshold"}));
  EXPECT_EQ(data.size(), 4u);
  EXPECT_EQ(data.at("score"), "0.5");
  EXPECT_EQ(data.at("model_id"), "");
}

TEST(LoggingDataTest, UnknownKeysThrowTheMessageTheManagedSideKnows) {
  LoggingData data;
  data.emplace("score", "1");
  data.emplace(std::string("a\0b", 3), "nul");
  EXPECT_EQ(data.at(std::string("a\0b", 3)), "nul");
  for (std::string key : {"Score", "score ", "a", ""}) {
    try {
      data.at(key);
      ADD_FAILURE() << "found " << key;
    } catch (const std::out_of_range& error) {
      EXPECT_STREQ(error.what(), "_Map_base::at");
    }
  }
}

}  // namespace
}  // namespace kestrova::reliqaclassifier

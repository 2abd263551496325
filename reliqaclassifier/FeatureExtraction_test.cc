#include "reliqaclassifier/FeatureExtraction.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdlib>
#include <ctime>
#include <limits>
#include <map>
#include <new>
#include <set>

namespace kestrova::reliqaclassifier {
namespace {

using thornvale::FeatureMap;

AssetDetail asset(time_t created, time_t modified) {
  AssetDetail a;
  a.creationDateSinceEpoch = created;
  a.modificationDateSinceEpoch = modified;
  return a;
}

// The two-asset collection whose every feature is worked out by hand below.
ReliqaClassifierInput workedExample() {
  ReliqaClassifierInput input;
  input.timeSinceStory = 5.0;
  AssetDetail a = asset(3600, 7200);
  a.pixelWidth = 100;
  a.pixelHeight = 50;
  a.latitude = 10;
  a.longitude = 20;
  a.isFavorite = 1;
  a.sourceType = 1;
  a.blurrinessMetric = {true, 0.5};
  AssetDetail b = asset(7200, -1);
  b.pixelWidth = 300;
  b.pixelHeight = 150;
  b.latitude = 30;
  b.longitude = 40;
  b.videoDuration = 10;
  b.mediaSubtypes = 2;
  b.sourceType = 1;
  b.darknessMetric = {true, 0.2};
  input.assetDetails = {a, b};
  return input;
}

TEST(FeatureExtractionTest, WorkedExample) {
  FeatureMap features = extractFeatures(workedExample());
  const std::map<int32_t, double> expected = {
      {1, 5},       {13, 1},      {14, 1},     {15, 0},      {16, 1},     {17, 0},       {18, 1},
      {19, 0.5},    {20, 0.5},    {21, 0},     {22, 0},      {23, 0},     {24, 0},       {25, 200},
      {26, 100},    {27, 100},    {28, 50},    {60, 20000},  {29, 5},     {30, 5},       {31, 20},
      {32, 10},     {33, 30},     {34, 10},    {35, 1800},   {36, 3600},  {37, 3600.5},  {38, 0},
      {39, 0},      {40, 3600},   {41, 0},     {42, 1.5},    {43, 0.5},   {44, 1},       {45, 2},
      {46, 1},      {47, 1},      {48, 0.5},   {49, 0},      {50, 0.5},   {51, 0.5},     {52, 0},
      {53, 0.2},    {54, 0},      {55, 0.2},   {56, 0.2},    {57, 0},     {58, -1},      {59, -1},
      {61, 50.25},  {62, 49.75},  {63, 0.5},   {64, 100},    {65, 99.5},  {68, 0.2},     {69, 100},
      {71, 50},     {72, -1800.5}, {73, 5400.5}, {74, 0},
  };
  for (int32_t id = 3; id <= 12; ++id) EXPECT_EQ(features.at(id), 0.0) << id;
  for (const auto& [id, value] : expected) EXPECT_EQ(features.at(id), value) << "feature " << id;
  // Sums of 100 and 0.2 are exact only up to rounding.
  EXPECT_DOUBLE_EQ(features.at(66), 50.1);
  EXPECT_DOUBLE_EQ(features.at(67), 49.9);
  EXPECT_DOUBLE_EQ(features.at(70), 99.8);
  EXPECT_FALSE(features.contains(2));
  EXPECT_EQ(features.size(), 73u);
}

TEST(FeatureExtractionTest, EmptyCollectionGivesDefaultsCountsAndOptionalLandmark) {
  ReliqaClassifierInput input;
  input.assetCounts.totalAssetsCount = 3;
  input.assetCounts.videosCount = 7;
  input.assetCounts.photosWithFacesCount = -2;
  input.extraCount = 4294967295u;
  FeatureMap features = extractFeatures(input);
  EXPECT_EQ(features.size(), 73u);
  EXPECT_FALSE(features.contains(2));
  for (int32_t id = 13; id <= 73; ++id) {
    if (id != 60) {
      EXPECT_EQ(features.at(id), -1.0) << id;
    }
  }
  EXPECT_EQ(features.at(60), 1.0);
  EXPECT_EQ(features.at(4), 3.0);
  EXPECT_EQ(features.at(7), 7.0);
  EXPECT_EQ(features.at(8), 0.0);
  EXPECT_EQ(features.at(12), -2.0);
  EXPECT_EQ(features.at(74), 4294967295.0);

  input.locationInfo = LocationInfo{"Harbour", true, 1.0, 2.0};
  EXPECT_EQ(extractFeatures(input).at(2), 1.0);
  input.locationInfo->isLandmark = false;
  EXPECT_EQ(extractFeatures(input).at(2), 0.0);
}

// Duplicate pairs are counted on their own, also beyond the number of assets.
TEST(FeatureExtractionTest, DuplicatePairsNeedNoAssets) {
  ReliqaClassifierInput input;
  input.duplicateInfos = {{"a", "b", 0.5}, {"c", "d", 0.25}, {"e", "f", 0.75}};
  FeatureMap features = extractFeatures(input);
  EXPECT_EQ(features.at(58), 0.5);
  EXPECT_EQ(features.at(59), std::sqrt(0.125 / 3));
  EXPECT_EQ(features.at(61), -1.0);
  input.assetDetails = {asset(0, -1)};
  EXPECT_EQ(extractFeatures(input).at(59), std::sqrt(0.125 / 3));
}

TEST(FeatureExtractionTest, OneAssetHasNoSpread) {
  ReliqaClassifierInput input;
  AssetDetail only = asset(86400 + 5 * 3600, 86400 + 6 * 3600);
  only.pixelWidth = 640;
  only.blurrinessMetric = {true, 0.25};
  input.assetDetails = {only};
  input.duplicateInfos = {{"a", "b", 0.75}};
  FeatureMap features = extractFeatures(input);
  for (int32_t id : {14, 17, 20, 23, 26, 28, 30, 32, 34, 35, 36, 37, 38, 39, 41, 43, 47, 49, 52, 59,
                     62, 65, 67, 70, 73}) {
    EXPECT_EQ(features.at(id), 0.0) << id;
  }
  EXPECT_EQ(features.at(44), 5.0);
  EXPECT_EQ(features.at(45), 5.0);
  EXPECT_EQ(features.at(42), 5.0);
  EXPECT_EQ(features.at(50), 0.25);
  EXPECT_EQ(features.at(51), 0.25);
  EXPECT_EQ(features.at(58), 0.75);
  EXPECT_EQ(features.at(71), 100.0);
  EXPECT_EQ(features.at(53), -1.0);  // darkness never calculated...
  EXPECT_EQ(features.at(66), 100.0);  // ...so 100 stands in
}

TEST(FeatureExtractionTest, ModesPickTheSmallestOfTheMostFrequentValues) {
  ReliqaClassifierInput input;
  for (int hour : {7, 3, 5, 3, 5}) input.assetDetails.push_back(asset(hour * 3600, -1));
  const int favourites[] = {0, 1, 1, 0, 1};
  const int32_t subtypes[] = {1000000000, -5, 1000000000, 7, -5};  // sparse: a span of 10^9
  for (size_t i = 0; i < 5; ++i) {
    input.assetDetails[i].isFavorite = favourites[i];
    input.assetDetails[i].mediaSubtypes = subtypes[i];
  }
  FeatureMap features = extractFeatures(input);
  EXPECT_EQ(features.at(46), 3.0);
  EXPECT_DOUBLE_EQ(features.at(42), 4.6);
  EXPECT_EQ(features.at(47), 4.0);
  EXPECT_EQ(features.at(21), 1.0);
  EXPECT_DOUBLE_EQ(features.at(19), 0.6);
  EXPECT_EQ(features.at(15), -5.0);
  EXPECT_EQ(features.at(71), 0.0);  // every modification date unknown
}

TEST(FeatureExtractionTest, IntegerSpansOfTwoToTheThirtyAreRefused) {
  const int64_t limit = int64_t{1} << 30;
  auto withSubtypes = [](int32_t first, int32_t second) {
    ReliqaClassifierInput input;
    input.assetDetails = {asset(0, 0), asset(0, 0)};
    input.assetDetails[0].mediaSubtypes = first;
    input.assetDetails[1].mediaSubtypes = second;
    return input;
  };
  EXPECT_EQ(extractFeatures(withSubtypes(0, static_cast<int32_t>(limit - 2))).at(15), 0.0);
  EXPECT_THROW(extractFeatures(withSubtypes(0, static_cast<int32_t>(limit - 1))), std::bad_alloc);
  EXPECT_THROW(extractFeatures(withSubtypes(std::numeric_limits<int32_t>::min(),
                                            std::numeric_limits<int32_t>::max())),
               std::bad_alloc);

  // The same holds for every integer list with a mode.
  ReliqaClassifierInput input = withSubtypes(0, 0);
  input.assetDetails[1].sourceType = -1073741824;
  EXPECT_THROW(extractFeatures(input), std::bad_alloc);
  input.assetDetails[1].sourceType = 0;
  input.assetDetails[1].isHidden = 1073741823;
  EXPECT_THROW(extractFeatures(input), std::bad_alloc);
  input.assetDetails[1].isHidden = 0;
  input.assetDetails[0].isFavorite = std::numeric_limits<int32_t>::min();
  EXPECT_THROW(extractFeatures(input), std::bad_alloc);
}

TEST(FeatureExtractionTest, HoursFollowTheLocalTimeZone) {
  ReliqaClassifierInput input;
  input.assetDetails = {asset(0, -1), asset(22 * 3600, -1)};
  FeatureMap utc = extractFeatures(input);
  EXPECT_EQ(utc.at(44), 0.0);
  EXPECT_EQ(utc.at(45), 22.0);

  const char* saved = std::getenv("TZ");
  const std::string savedZone = saved ? saved : "";
  setenv("TZ", "XST-9", 1);  // nine hours east of UTC
  tzset();
  FeatureMap east = extractFeatures(input);
  if (saved) {
    setenv("TZ", savedZone.c_str(), 1);
  } else {
    unsetenv("TZ");
  }
  tzset();
  EXPECT_EQ(east.at(44), 7.0);  // 22:00 UTC is 07:00 there
  EXPECT_EQ(east.at(45), 9.0);
  EXPECT_EQ(east.at(46), 7.0);
  EXPECT_EQ(east.at(35), utc.at(35));  // the dates themselves do not move
}

TEST(FeatureExtractionTest, DatesThatCannotBeBrokenDownAddNoHour) {
  ReliqaClassifierInput input;
  input.assetDetails = {asset(std::numeric_limits<time_t>::max(), -1)};
  FeatureMap features = extractFeatures(input);
  if (sizeof(time_t) == 4) {
    // Every 32-bit date has a calendar hour: 2038-01-19 03:14:07 UTC.
    EXPECT_EQ(features.at(44), 3.0);
    return;
  }
  for (int32_t id = 42; id <= 47; ++id) EXPECT_EQ(features.at(id), -1.0) << id;
  EXPECT_EQ(features.at(35), 0.0);  // the creation date still counts
  EXPECT_TRUE(std::isfinite(features.at(73)));
}

// The app's dates are 64-bit. Where time_t has 32 bits they keep their low
// 32 bits, and a modification date is unknown when those bits are -1.
TEST(FeatureExtractionTest, AppDatesKeepTheLowBitsOfA32BitTimeT) {
  const int64_t lowBitsAllSet = 0xFFFFFFFF;  // 2106-02-07 with 64 bits, -1 with 32
  ReliqaClassifierInput input;
  input.assetDetails = {asset(recordDateOf(0), recordDateOf(lowBitsAllSet))};
  FeatureMap features = extractFeatures(input);
  if (sizeof(time_t) == 4) {
    EXPECT_EQ(features.at(71), 0.0);   // unknown
    EXPECT_EQ(features.at(72), -1.0);  // -1 minus the creation date
  } else {
    EXPECT_EQ(features.at(71), 100.0);
    EXPECT_EQ(features.at(72), 4294967295.0);
  }
  EXPECT_EQ(int64_t{recordDateOf(int64_t{1} << 32)}, sizeof(time_t) == 4 ? 0 : int64_t{1} << 32);
}

}  // namespace
}  // namespace kestrova::reliqaclassifier

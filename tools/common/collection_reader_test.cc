#include "tools/common/collection_reader.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/common/errors.h"
#include "tools/common/testing/record_difference.h"

namespace reliqa::tool {
namespace {

using ::testing::HasSubstr;

const char* kAsset = R"({"assetID": "a1", "assetType": "photo",
 "creationDateSinceEpoch": 4102444800, "modificationDateSinceEpoch": -1,
 "pixelWidth": 4032, "pixelHeight": 3024.5, "latitude": 38.7, "longitude": -9.1,
 "videoDuration": 0, "isFavorite": 1, "isHidden": 0, "mediaSubtypes": 10, "sourceType": 2,
 "blurrinessMetric": {"isCalculated": true, "value": 0.25},
 "darknessMetric": {"isCalculated": false, "value": 0}})";

std::string collection(const std::string& assets, const std::string& location = "null",
                       const std::string& counts = "null") {
  return R"({"collectionID": "c", "timeSinceStory": 12.5, "locationInfo": )" + location +
         R"(, "assetCounts": )" + counts + R"(, "assetDetails": [)" + assets +
         R"(], "duplicateInfos": [{"assetIdA": "a1", "assetIdB": "a2", "dupeCoefficient": 0.93}]})";
}

// The message of the ToolError that parsing `json` throws.
std::string errorOf(const std::string& json, int64_t firstLine = 1) {
  try {
    parseCollection(json, "f.json", firstLine);
  } catch (const ToolError& e) {
    return e.describe();
  }
  return "no error";
}

TEST(CollectionReader, ReadsEveryField) {
  auto in = parseCollection(collection(kAsset, R"({"name": "Sintra", "isLandmark": true, "longitude": -9.39,
      "latitude": 38.8})", R"({"tileCount": 1, "totalAssetsCount": 2, "photosCount": 3, "burstCount": 4,
      "videosCount": 5, "loopsCount": 6, "totalAssetsWithinBurstsCount": 7, "totalAssetsWithinLoopsCount": 8,
      "facesCount": 9, "photosWithFacesCount": 10})"),
                            "f.json");
  EXPECT_EQ(in.collectionID, "c");
  EXPECT_EQ(in.timeSinceStory, 12.5);
  ASSERT_TRUE(in.locationInfo.has_value());
  EXPECT_EQ(in.locationInfo->name, "Sintra");
  EXPECT_TRUE(in.locationInfo->isLandmark);
  EXPECT_EQ(in.locationInfo->latitude, 38.8);
  EXPECT_EQ(in.assetCounts.videosCount, 5);  // order of the counts is binding
  EXPECT_EQ(in.assetCounts.loopsCount, 6);
  EXPECT_EQ(in.assetCounts.photosWithFacesCount, 10);
  ASSERT_EQ(in.assetDetails.size(), 1u);
  const auto& a = in.assetDetails[0];
  // 2100-01-01: a 64-bit time_t keeps it, a 32-bit one its low 32 bits.
  const int64_t year2100 = 4102444800;
  if (sizeof(time_t) == 8) {
    EXPECT_EQ(int64_t{a.creationDateSinceEpoch}, year2100);
  } else {
    EXPECT_EQ(int64_t{a.creationDateSinceEpoch}, year2100 - (int64_t{1} << 32));
  }
  EXPECT_EQ(a.modificationDateSinceEpoch, time_t{-1});
  EXPECT_EQ(a.pixelWidth, 4032.0);
  EXPECT_EQ(a.pixelHeight, 3024.5);
  EXPECT_EQ(a.longitude, -9.1);
  EXPECT_EQ(a.mediaSubtypes, 10);
  EXPECT_EQ(a.sourceType, 2);
  EXPECT_TRUE(a.blurrinessMetric.isCalculated);
  EXPECT_EQ(a.blurrinessMetric.value, 0.25);
  EXPECT_FALSE(a.darknessMetric.isCalculated);
  ASSERT_EQ(in.duplicateInfos.size(), 1u);
  EXPECT_EQ(in.duplicateInfos[0].assetIdB, "a2");
  EXPECT_EQ(in.duplicateInfos[0].dupeCoefficient, 0.93);
}

TEST(CollectionReader, NullLocationAndCountsMeanAbsentAndZero) {
  auto in = parseCollection(collection(""), "f.json");
  EXPECT_FALSE(in.locationInfo.has_value());
  EXPECT_EQ(in.assetCounts.totalAssetsCount, 0);
  EXPECT_TRUE(in.assetDetails.empty());
}

TEST(CollectionReader, TypeErrorsNameTheMemberAndItsLine) {
  std::string bad = collection(std::string(kAsset).replace(std::string(kAsset).find("4032"), 4, "\"wide\""));
  EXPECT_THAT(errorOf(bad), HasSubstr("f.json:3: assetDetails[0].pixelWidth: expected a number, got a string"));
  // A JSON Lines stream places the message on the line of the collection.
  EXPECT_THAT(errorOf(R"({"collectionID": 7})", 41), HasSubstr("f.json:41: collectionID: expected a string"));
  std::string fraction = collection(std::string(kAsset).replace(std::string(kAsset).find("-1"), 2, "-1.5"));
  EXPECT_THAT(errorOf(fraction), HasSubstr("modificationDateSinceEpoch: expected an integer, got -1.5"));
  std::string wide = collection(std::string(kAsset).replace(std::string(kAsset).find("\"isFavorite\": 1"), 15,
                                                             "\"isFavorite\": 3000000000"));
  EXPECT_THAT(errorOf(wide), HasSubstr("isFavorite: integer 3000000000 is out of range"));
  EXPECT_THAT(errorOf(collection("", "true")), HasSubstr("locationInfo: expected an object, got a boolean"));
  EXPECT_THAT(errorOf("[1, 2]"), HasSubstr("f.json:1: expected a collection (a JSON object), got an array"));
  EXPECT_THAT(errorOf("\n56"), HasSubstr("f.json:2: expected a collection (a JSON object), got a number"));
}

TEST(CollectionReader, MembersMustBeKnownPresentAndUnique) {
  std::string c = collection("");
  EXPECT_THAT(errorOf(R"({"collectionId": "x"})"), HasSubstr("unknown member \"collectionId\""));
  EXPECT_THAT(errorOf(c.substr(0, c.size() - 1) + R"(, "timeSinceStory": 1})"),
              HasSubstr("member timeSinceStory appears twice"));
  std::string noDupes = c.substr(0, c.find(", \"duplicateInfos\"")) + "}";
  EXPECT_THAT(errorOf(noDupes), HasSubstr("missing member duplicateInfos"));
  EXPECT_THAT(errorOf(collection(R"({"assetID": "a"})")), HasSubstr("missing member assetDetails[0].assetType"));
}

TEST(CollectionReader, MalformedJsonIsAnErrorWithAPosition) {
  std::string c = collection(kAsset);
  EXPECT_THAT(errorOf(c + "\n\n  x"), HasSubstr("f.json:8: unexpected text after the end"));
  EXPECT_THAT(errorOf(c.substr(0, c.size() / 2)), HasSubstr("f.json:"));
  EXPECT_THAT(errorOf(""), HasSubstr("f.json:1: no JSON value"));
  EXPECT_THAT(errorOf("{\n\"a\\"), HasSubstr("f.json:2: unterminated string"));
  EXPECT_THAT(errorOf("{\"collectionID\": [}"), HasSubstr("f.json:1: unexpected '}'"));
  EXPECT_THAT(errorOf("{\"collectionID\": \"\xff\"}"), HasSubstr("UTF-8"));
  EXPECT_THAT(errorOf(std::string(5000, '[') + std::string(5000, ']')), HasSubstr("f.json:1: "));
}

// The quick pass vouches for a text only when it reads exactly what the
// careful pass reads; numbers are compared by their bits.
TEST(CollectionReader, BothPassesReadTheSameBits) {
  auto with = [](const std::string& from, const std::string& to) {
    std::string c = collection(kAsset);
    return c.replace(c.find(from), from.size(), to);
  };
  const std::string texts[] = {
      collection(kAsset),
      with("\"latitude\": 38.7", "\"latitude\": -0"),           // the DOM reads -0 as the integer 0
      with("\"videoDuration\": 0", "\"videoDuration\": -0 "),
      with("\"videoDuration\": 0", "\"videoDuration\": -0.0"),
      with("\"collectionID\": \"c\"", "\"collectionID\": \"c-0\""),  // -0 in a string only
      with("\"pixelWidth\": 4032", "\"pixelWidth\": 18446744073709551615"),
      with("\"pixelWidth\": 4032", "\"pixelWidth\": 1E2"),
      with("\"pixelWidth\": 4032", "\"pixelWidth\": 123456789012345678901234567890"),
      with("\"longitude\": -9.1", "\"longitude\": 2.2250738585072011e-308"),
      with("\"creationDateSinceEpoch\": 4102444800", "\"creationDateSinceEpoch\": -0"),
      with("\"assetID\": \"a1\"", "\"assetID\": \"\\u00e9\\n\\\"\""),
      // Twenty digits or more in a row: simdjson's On-Demand reader gets such
      // numbers wrong, so the careful pass reads them itself.
      with("\"latitude\": 38.7", "\"latitude\": -0.25000000000000000000"),
      with("\"timeSinceStory\": 12.5", "\"timeSinceStory\": 1e-99999999999999999999"),
      with("\"timeSinceStory\": 12.5", "\"timeSinceStory\": 1e-0000000000000000000000001"),
  };
  CollectionReader reader;
  for (const std::string& text : texts) {
    kestrova::reliqaclassifier::ReliqaClassifierInput quick, careful;
    CollectionReader::readCarefully(text, "f.json", 1, careful);
    if (reader.readQuickly(text, quick)) {
      EXPECT_EQ(test::recordDifference(quick, careful), "") << text;
    }
    kestrova::reliqaclassifier::ReliqaClassifierInput read;
    reader.read(text, "f.json", 1, read);
    EXPECT_EQ(test::recordDifference(read, careful), "") << text;
  }
  kestrova::reliqaclassifier::ReliqaClassifierInput longDigits;
  reader.read(texts[11], "f.json", 1, longDigits);
  EXPECT_EQ(longDigits.assetDetails[0].latitude, -0.25);
  reader.read(texts[13], "f.json", 1, longDigits);
  EXPECT_EQ(longDigits.timeSinceStory, 0.1);
  // The quick pass does its work on ordinary text.
  kestrova::reliqaclassifier::ReliqaClassifierInput out;
  EXPECT_TRUE(reader.readQuickly(texts[0], out));
  EXPECT_TRUE(reader.readQuickly(texts[4], out));
}

TEST(CollectionReader, AReusedRecordKeepsNothingOfTheCollectionBefore) {
  CollectionReader reader;
  kestrova::reliqaclassifier::ReliqaClassifierInput reused;
  std::string big = collection(std::string(kAsset) + "," + kAsset + "," + kAsset,
                               R"({"name": "Sintra", "isLandmark": true, "longitude": 1, "latitude": 2})",
                               R"({"tileCount": 1, "totalAssetsCount": 2, "photosCount": 3, "burstCount": 4,
      "videosCount": 5, "loopsCount": 6, "totalAssetsWithinBurstsCount": 7, "totalAssetsWithinLoopsCount": 8,
      "facesCount": 9, "photosWithFacesCount": 10})");
  std::string small = collection(R"({"assetID": "b", "assetType": "video",
 "creationDateSinceEpoch": 1, "modificationDateSinceEpoch": 2, "pixelWidth": 3, "pixelHeight": 4,
 "latitude": 5, "longitude": 6, "videoDuration": 7, "isFavorite": 0, "isHidden": 1, "mediaSubtypes": 0,
 "sourceType": 0, "blurrinessMetric": {"isCalculated": false, "value": 0},
 "darknessMetric": {"isCalculated": true, "value": 1}})");
  reader.read(big, "f.json", 1, reused);
  ASSERT_EQ(reused.assetDetails.size(), 3u);
  reader.read(small, "f.json", 2, reused);
  EXPECT_EQ(test::recordDifference(reused, parseCollection(small, "f.json")), "");
  EXPECT_FALSE(reused.locationInfo.has_value());
  EXPECT_EQ(reused.assetCounts.facesCount, 0);
  // After a refused text the next one still reads whole.
  EXPECT_THROW(reader.read("{\"collectionID\": 1}", "f.json", 3, reused), ToolError);
  reader.read(big, "f.json", 4, reused);
  EXPECT_EQ(test::recordDifference(reused, parseCollection(big, "f.json")), "");
}

}  // namespace
}  // namespace reliqa::tool

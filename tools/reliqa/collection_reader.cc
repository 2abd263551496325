#include "tools/reliqa/collection_reader.h"

#include <limits>

#include "tools/reliqa/json_doc.h"

namespace reliqa::tool {

namespace rc = kestrova::reliqaclassifier;
using simdjson::ondemand::array;
using simdjson::ondemand::field;
using simdjson::ondemand::object;
using simdjson::ondemand::value;

namespace {

constexpr int64_t kInt32Min = std::numeric_limits<int32_t>::min();
constexpr int64_t kInt32Max = std::numeric_limits<int32_t>::max();
constexpr int64_t kInt64Min = std::numeric_limits<int64_t>::min();
constexpr int64_t kInt64Max = std::numeric_limits<int64_t>::max();

// Calls `onMember(index, key, value)` for every member of `obj`, checked
// against `members`, then requires that all were present.
template <class F>
void readObject(JsonDoc& doc, object obj, const char* at, MemberSet& members, F&& onMember) {
  for (auto member : obj) {
    field f = doc.take(std::move(member), "");
    std::string_view key = doc.take(f.unescaped_key(), "");
    value v = f.value();
    size_t index = members.accept(doc, key, v);
    onMember(index, members.pathOf(key), v);
  }
  members.requireAll(doc, at);
}

rc::OptionalImageMetricValue readMetric(JsonDoc& doc, value& v, const std::string& path) {
  rc::OptionalImageMetricValue m;
  const char* at = v.raw_json_token().data();
  MemberSet members(path, {"isCalculated", "value"});
  readObject(doc, doc.getObject(v, path), at, members, [&](size_t i, const std::string& p, value& x) {
    if (i == 0) m.isCalculated = doc.getBool(x, p);
    else m.value = doc.getDouble(x, p);
  });
  return m;
}

rc::AssetDetail readAsset(JsonDoc& doc, value& v, const std::string& path) {
  rc::AssetDetail a;
  const char* at = v.raw_json_token().data();
  MemberSet members(path, {"assetID", "assetType", "creationDateSinceEpoch", "modificationDateSinceEpoch",
                           "pixelWidth", "pixelHeight", "latitude", "longitude", "videoDuration",
                           "isFavorite", "isHidden", "mediaSubtypes", "sourceType", "blurrinessMetric",
                           "darknessMetric"});
  readObject(doc, doc.getObject(v, path), at, members, [&](size_t i, const std::string& p, value& x) {
    switch (i) {
      case 0: a.assetID = doc.getString(x, p); break;
      case 1: a.assetType = doc.getString(x, p); break;
      case 2: a.creationDateSinceEpoch = rc::recordDateOf(doc.getInt(x, p, kInt64Min, kInt64Max)); break;
      case 3: a.modificationDateSinceEpoch = rc::recordDateOf(doc.getInt(x, p, kInt64Min, kInt64Max)); break;
      case 4: a.pixelWidth = doc.getDouble(x, p); break;
      case 5: a.pixelHeight = doc.getDouble(x, p); break;
      case 6: a.latitude = doc.getDouble(x, p); break;
      case 7: a.longitude = doc.getDouble(x, p); break;
      case 8: a.videoDuration = doc.getDouble(x, p); break;
      case 9: a.isFavorite = static_cast<int32_t>(doc.getInt(x, p, kInt32Min, kInt32Max)); break;
      case 10: a.isHidden = static_cast<int32_t>(doc.getInt(x, p, kInt32Min, kInt32Max)); break;
      case 11: a.mediaSubtypes = static_cast<int32_t>(doc.getInt(x, p, kInt32Min, kInt32Max)); break;
      case 12: a.sourceType = static_cast<int32_t>(doc.getInt(x, p, kInt32Min, kInt32Max)); break;
      case 13: a.blurrinessMetric = readMetric(doc, x, p); break;
      default: a.darknessMetric = readMetric(doc, x, p); break;
    }
  });
  return a;
}

rc::DuplicateInfo readDuplicate(JsonDoc& doc, value& v, const std::string& path) {
  rc::DuplicateInfo d;
  const char* at = v.raw_json_token().data();
  MemberSet members(path, {"assetIdA", "assetIdB", "dupeCoefficient"});
  readObject(doc, doc.getObject(v, path), at, members, [&](size_t i, const std::string& p, value& x) {
    if (i == 0) d.assetIdA = doc.getString(x, p);
    else if (i == 1) d.assetIdB = doc.getString(x, p);
    else d.dupeCoefficient = doc.getDouble(x, p);
  });
  return d;
}

rc::LocationInfo readLocation(JsonDoc& doc, value& v, const std::string& path) {
  rc::LocationInfo l;
  const char* at = v.raw_json_token().data();
  MemberSet members(path, {"name", "isLandmark", "longitude", "latitude"});
  readObject(doc, doc.getObject(v, path), at, members, [&](size_t i, const std::string& p, value& x) {
    switch (i) {
      case 0: l.name = doc.getString(x, p); break;
      case 1: l.isLandmark = doc.getBool(x, p); break;
      case 2: l.longitude = doc.getDouble(x, p); break;
      default: l.latitude = doc.getDouble(x, p); break;
    }
  });
  return l;
}

rc::AssetCounts readCounts(JsonDoc& doc, value& v, const std::string& path) {
  rc::AssetCounts c;
  const char* at = v.raw_json_token().data();
  int32_t* fields[] = {&c.tileCount, &c.totalAssetsCount, &c.photosCount, &c.burstCount,
                       &c.videosCount, &c.loopsCount, &c.totalAssetsWithinBurstsCount,
                       &c.totalAssetsWithinLoopsCount, &c.facesCount, &c.photosWithFacesCount};
  MemberSet members(path, {"tileCount", "totalAssetsCount", "photosCount", "burstCount", "videosCount",
                           "loopsCount", "totalAssetsWithinBurstsCount", "totalAssetsWithinLoopsCount",
                           "facesCount", "photosWithFacesCount"});
  readObject(doc, doc.getObject(v, path), at, members, [&](size_t i, const std::string& p, value& x) {
    *fields[i] = static_cast<int32_t>(doc.getInt(x, p, kInt32Min, kInt32Max));
  });
  return c;
}

template <class T, class ReadOne>
std::vector<T> readList(JsonDoc& doc, value& v, const std::string& path, ReadOne&& readOne) {
  std::vector<T> out;
  size_t index = 0;
  for (auto element : doc.getArray(v, path)) {
    std::string p = path + "[" + std::to_string(index++) + "]";
    value x = doc.take(std::move(element), p);
    out.push_back(readOne(doc, x, p));
  }
  return out;
}

}  // namespace

rc::ReliqaClassifierInput parseCollection(std::string_view json, const std::string& name, int64_t firstLine) {
  JsonDoc doc(json, name, firstLine);
  rc::ReliqaClassifierInput in;
  object root = doc.rootObject("a collection");
  MemberSet members("", {"collectionID", "timeSinceStory", "locationInfo", "assetCounts", "assetDetails",
                         "duplicateInfos"});
  readObject(doc, root, nullptr, members, [&](size_t i, const std::string& p, value& x) {
    switch (i) {
      case 0: in.collectionID = doc.getString(x, p); break;
      case 1: in.timeSinceStory = doc.getDouble(x, p); break;
      case 2:
        if (!doc.isNull(x, p)) in.locationInfo = readLocation(doc, x, p);
        break;
      case 3:
        if (!doc.isNull(x, p)) in.assetCounts = readCounts(doc, x, p);
        break;
      case 4: in.assetDetails = readList<rc::AssetDetail>(doc, x, p, readAsset); break;
      default: in.duplicateInfos = readList<rc::DuplicateInfo>(doc, x, p, readDuplicate); break;
    }
  });
  doc.expectEnd();
  return in;
}

}  // namespace reliqa::tool

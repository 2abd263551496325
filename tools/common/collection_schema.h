// The JSON form of a collection, written once for every way of reading it.
//
// readCollectionWith(reader, out) walks one collection through a reader that
// supplies the JSON access; the schema (member names, their types and ranges,
// which record field each fills) lives only here. A reader R provides:
//
//   using Value = ...;                         // one JSON value
//   void root(MemberNames, F)                  // members of the root object
//   void members(Value&, const MemberPath&, MemberNames, F)
//       calls F(index, Value&, const MemberPath&) for each member of an
//       object, in document order; every name must be one of the given names,
//       once, and all of them must be present;
//   void elements(Value&, const MemberPath&, F)   F(Value&, const MemberPath&)
//   double number(Value&, const MemberPath&);
//   int64_t integer(Value&, const MemberPath&, int64_t min, int64_t max);
//   bool boolean(Value&, const MemberPath&);
//   void string(Value&, const MemberPath&, std::string& out);
//   bool null(Value&, const MemberPath&);
//
// and throws when the text does not fit. The record `out` is filled in place,
// reusing its strings and vectors, so that reading many collections into one
// record allocates almost nothing; on a throw its contents are unspecified.
//
// A MemberPath names a value ("assetDetails[3].pixelWidth") without building
// the text: readers spell it out only for a message.
#pragma once

#include <cstdint>
#include <limits>
#include <string>
#include <string_view>
#include <vector>

#include "reliqaclassifier/ReliqaClassifierInput.h"

namespace reliqa::tool {

// A value's place in the collection, as a chain of stack-allocated links.
struct MemberPath {
  const MemberPath* parent = nullptr;
  std::string_view member;  // empty for an array element
  size_t index = 0;         // the element's index
  bool element = false;

  MemberPath child(std::string_view name) const { return MemberPath{this, name, 0, false}; }
  MemberPath item(size_t i) const { return MemberPath{this, {}, i, true}; }

  // "" for the root, "locationInfo", "assetDetails[3].pixelWidth".
  std::string text() const {
    if (parent == nullptr) return {};
    std::string out = parent->text();
    if (element) return out + "[" + std::to_string(index) + "]";
    if (!out.empty()) out += '.';
    return out.append(member);
  }
};

// The names of an object's members, in the order the readers number them.
class MemberNames {
 public:
  template <size_t N>
  constexpr MemberNames(const std::string_view (&names)[N]) : names_(names), size_(N) {  // NOLINT: implicit
    static_assert(N <= 32, "readers keep the members seen in a 32-bit mask");
  }
  constexpr const std::string_view* begin() const { return names_; }
  constexpr const std::string_view* end() const { return names_ + size_; }
  constexpr size_t size() const { return size_; }
  constexpr std::string_view operator[](size_t i) const { return names_[i]; }

 private:
  const std::string_view* names_;
  size_t size_;
};

namespace schema {

inline constexpr int64_t kInt32Min = std::numeric_limits<int32_t>::min();
inline constexpr int64_t kInt32Max = std::numeric_limits<int32_t>::max();
inline constexpr int64_t kInt64Min = std::numeric_limits<int64_t>::min();
inline constexpr int64_t kInt64Max = std::numeric_limits<int64_t>::max();

inline constexpr std::string_view kCollection[] = {"collectionID", "timeSinceStory", "locationInfo",
                                            "assetCounts",  "assetDetails",   "duplicateInfos"};
inline constexpr std::string_view kMetric[] = {"isCalculated", "value"};
inline constexpr std::string_view kAsset[] = {
    "assetID",    "assetType",  "creationDateSinceEpoch", "modificationDateSinceEpoch", "pixelWidth",
    "pixelHeight", "latitude",  "longitude",              "videoDuration",              "isFavorite",
    "isHidden",   "mediaSubtypes", "sourceType",          "blurrinessMetric",           "darknessMetric"};
inline constexpr std::string_view kDuplicate[] = {"assetIdA", "assetIdB", "dupeCoefficient"};
inline constexpr std::string_view kLocation[] = {"name", "isLandmark", "longitude", "latitude"};
// In the order of the fields of AssetCounts.
inline constexpr std::string_view kCounts[] = {"tileCount",  "totalAssetsCount", "photosCount",
                                        "burstCount", "videosCount",      "loopsCount",
                                        "totalAssetsWithinBurstsCount", "totalAssetsWithinLoopsCount",
                                        "facesCount", "photosWithFacesCount"};

namespace rc = kestrova::reliqaclassifier;

template <class R>
int32_t int32Of(R& r, typename R::Value& v, const MemberPath& p) {
  return static_cast<int32_t>(r.integer(v, p, kInt32Min, kInt32Max));
}

template <class R>
void readMetric(R& r, typename R::Value& v, const MemberPath& path, rc::OptionalImageMetricValue& m) {
  r.members(v, path, kMetric, [&](size_t i, typename R::Value& x, const MemberPath& p) {
    if (i == 0) m.isCalculated = r.boolean(x, p);
    else m.value = r.number(x, p);
  });
}

template <class R>
void readAsset(R& r, typename R::Value& v, const MemberPath& path, rc::AssetDetail& a) {
  r.members(v, path, kAsset, [&](size_t i, typename R::Value& x, const MemberPath& p) {
    switch (i) {
      case 0: r.string(x, p, a.assetID); break;
      case 1: r.string(x, p, a.assetType); break;
      case 2: a.creationDateSinceEpoch = rc::recordDateOf(r.integer(x, p, kInt64Min, kInt64Max)); break;
      case 3: a.modificationDateSinceEpoch = rc::recordDateOf(r.integer(x, p, kInt64Min, kInt64Max)); break;
      case 4: a.pixelWidth = r.number(x, p); break;
      case 5: a.pixelHeight = r.number(x, p); break;
      case 6: a.latitude = r.number(x, p); break;
      case 7: a.longitude = r.number(x, p); break;
      case 8: a.videoDuration = r.number(x, p); break;
      case 9: a.isFavorite = int32Of(r, x, p); break;
      case 10: a.isHidden = int32Of(r, x, p); break;
      case 11: a.mediaSubtypes = int32Of(r, x, p); break;
      case 12: a.sourceType = int32Of(r, x, p); break;
      case 13: readMetric(r, x, p, a.blurrinessMetric); break;
      default: readMetric(r, x, p, a.darknessMetric); break;
    }
  });
}

template <class R>
void readDuplicate(R& r, typename R::Value& v, const MemberPath& path, rc::DuplicateInfo& d) {
  r.members(v, path, kDuplicate, [&](size_t i, typename R::Value& x, const MemberPath& p) {
    if (i == 0) r.string(x, p, d.assetIdA);
    else if (i == 1) r.string(x, p, d.assetIdB);
    else d.dupeCoefficient = r.number(x, p);
  });
}

template <class R>
void readLocation(R& r, typename R::Value& v, const MemberPath& path, rc::LocationInfo& l) {
  r.members(v, path, kLocation, [&](size_t i, typename R::Value& x, const MemberPath& p) {
    switch (i) {
      case 0: r.string(x, p, l.name); break;
      case 1: l.isLandmark = r.boolean(x, p); break;
      case 2: l.longitude = r.number(x, p); break;
      default: l.latitude = r.number(x, p); break;
    }
  });
}

template <class R>
void readCounts(R& r, typename R::Value& v, const MemberPath& path, rc::AssetCounts& c) {
  int32_t* fields[] = {&c.tileCount, &c.totalAssetsCount, &c.photosCount, &c.burstCount,
                       &c.videosCount, &c.loopsCount, &c.totalAssetsWithinBurstsCount,
                       &c.totalAssetsWithinLoopsCount, &c.facesCount, &c.photosWithFacesCount};
  r.members(v, path, kCounts, [&](size_t i, typename R::Value& x, const MemberPath& p) {
    *fields[i] = int32Of(r, x, p);
  });
}

// Fills `out` with the array's elements, reusing the records already there.
template <class R, class T, class ReadOne>
void readList(R& r, typename R::Value& v, const MemberPath& path, std::vector<T>& out, ReadOne readOne) {
  size_t n = 0;
  r.elements(v, path, [&](typename R::Value& x, const MemberPath& p) {
    if (n == out.size()) out.emplace_back();
    readOne(r, x, p, out[n++]);
  });
  out.resize(n);
}

}  // namespace schema

template <class R>
void readCollectionWith(R& r, kestrova::reliqaclassifier::ReliqaClassifierInput& out) {
  using namespace schema;
  out.extraCount = 0;
  r.root(kCollection, [&](size_t i, typename R::Value& x, const MemberPath& p) {
    switch (i) {
      case 0: r.string(x, p, out.collectionID); break;
      case 1: out.timeSinceStory = r.number(x, p); break;
      case 2:
        if (r.null(x, p)) {
          out.locationInfo.reset();
        } else {
          if (!out.locationInfo) out.locationInfo.emplace();
          readLocation(r, x, p, *out.locationInfo);
        }
        break;
      case 3:
        out.assetCounts = {};
        if (!r.null(x, p)) readCounts(r, x, p, out.assetCounts);
        break;
      case 4: readList(r, x, p, out.assetDetails, readAsset<R>); break;
      default: readList(r, x, p, out.duplicateInfos, readDuplicate<R>); break;
    }
  });
}

}  // namespace reliqa::tool

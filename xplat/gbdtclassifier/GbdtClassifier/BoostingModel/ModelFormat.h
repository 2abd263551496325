// The model text, as the reader (serialize.h), the writer (ModelWriter.h) and
// the tools that check or convert models all take it: constants only.
//
// A model text is lines of base64 (the standard alphabet with '=' padding),
// each line one record of little-endian fields:
//   header      int32 magic (kModelMagic), int32 version
//   base score  double; then the tree count, int32
//   a tree      double weight, then its nodes in pre-order:
//                 leaf   kLeafTag,  double value          (kLeafRecordBytes)
//                 split  kSplitTag, int32 feature position, double threshold
//                                                          (kSplitRecordBytes)
//               the left subtree of a split comes before its right one;
//               then int32 count and that many (int32 id, double value)
//               feature values (kFeatureValueBytes each)
//   then the input keys, and by version the feature mapping and equality
//   features (from kFirstVersionWithMapping), the average feature values
//   (kNewestVersion), and a trailer that may start with the magic again and
//   hold the model selector.
// A version outside [kOldestVersion, kNewestVersion] reads as an empty model.
#pragma once

#include <cstddef>
#include <cstdint>

namespace thornvale {

inline constexpr int32_t kModelMagic = 314156;

inline constexpr int32_t kOldestVersion = 2;
inline constexpr int32_t kFirstVersionWithMapping = 3;
inline constexpr int32_t kNewestVersion = 4;

inline constexpr bool isReadableVersion(int32_t version) {
  return version >= kOldestVersion && version <= kNewestVersion;
}

inline constexpr uint8_t kLeafTag = 'C';
inline constexpr uint8_t kSplitTag = 'L';
inline constexpr size_t kLeafRecordBytes = 1 + 8;
inline constexpr size_t kSplitRecordBytes = 1 + 4 + 8;
inline constexpr size_t kFeatureValueBytes = 4 + 8;

// The 64 characters in the order of their values, then the padding character.
inline constexpr char kBase64Alphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
inline constexpr char kBase64Padding = '=';
static_assert(sizeof(kBase64Alphabet) == 65, "64 characters and the terminator");

}  // namespace thornvale

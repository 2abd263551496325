// Reading candidate collections from JSON.
//
// A collection is a JSON object with the field names of the managed input
// classes: collectionID, timeSinceStory, locationInfo (object or null),
// assetCounts (object or null), assetDetails (array of assets) and
// duplicateInfos (array of {assetIdA, assetIdB, dupeCoefficient}). Every member
// must be present; unknown or repeated members, wrong types and integers out of
// their range are refused with a ToolError naming the file, the line and the
// member ("assetDetails[3].pixelWidth"). A null locationInfo means "no
// location"; a null assetCounts means all counts are 0, as on the managed side.
// Dates are whole seconds since the epoch (64-bit); -1 as a modification date
// means "unknown".
//
// CollectionReader reads a stream of collections quickly: it keeps its parser
// and buffers from one text to the next, and fills the caller's record in
// place. It reads each text in one of two ways with the same result: a quick
// pass over a fully validated document, which vouches only for text it fully
// accepts, and, for everything else, a careful pass that finds and explains
// the first problem. One reader per thread.
#pragma once

#include <simdjson.h>

#include <cstdint>
#include <string>
#include <string_view>

#include "reliqaclassifier/ReliqaClassifierInput.h"

namespace reliqa::tool {

class CollectionReader {
 public:
  // Reads one collection into `out`, reusing its storage. `name` and
  // `firstLine` place messages (the line of the text's first byte, for one
  // line of a JSON Lines stream). Throws ToolError; `out` is then unspecified.
  void read(std::string_view json, const std::string& name, int64_t firstLine,
            kestrova::reliqaclassifier::ReliqaClassifierInput& out);

  // The two passes on their own, for tests that compare them. readQuickly
  // returns false, with `out` unspecified, for any text it does not vouch for.
  bool readQuickly(std::string_view json, kestrova::reliqaclassifier::ReliqaClassifierInput& out);
  static void readCarefully(std::string_view json, const std::string& name, int64_t firstLine,
                            kestrova::reliqaclassifier::ReliqaClassifierInput& out);

 private:
  simdjson::dom::parser parser_;
  std::string padded_;  // the text and simdjson's padding
};

// Reads one collection with a reader of its own.
kestrova::reliqaclassifier::ReliqaClassifierInput parseCollection(std::string_view json,
                                                                    const std::string& name,
                                                                    int64_t firstLine = 1);

}  // namespace reliqa::tool

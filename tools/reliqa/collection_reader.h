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
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "reliqaclassifier/ReliqaClassifierInput.h"

namespace reliqa::tool {

// Parses one collection. `name` and `firstLine` place messages (the line of the
// text's first byte, for one line of a JSON Lines stream).
kestrova::reliqaclassifier::ReliqaClassifierInput parseCollection(std::string_view json,
                                                                    const std::string& name,
                                                                    int64_t firstLine = 1);

}  // namespace reliqa::tool

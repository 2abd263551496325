// Replaying logged classifications: a block of JSON Lines in, one row of
// arrays out per line that could be read, with a candidate model's score.
//
// A line is one of:
//  - a classification result as `reliqa classify` prints it:
//      {"score":S,"isOverThreshold":B,"loggingData":{"score":"S","model_id":"M",
//       "feature_vector":"{\"3\":0.25,...}","threshold":"T"}}
//    with the four logging values in any order;
//  - the four logging values on their own ({"score":"S","model_id":"M",
//    "feature_vector":...,"threshold":"T"}), as a log pipeline stores them;
//  - a bare feature row ({"3":0.25,...}), which has no logged score.
// Any of them may carry more members (a user or collection id), which are
// skipped; the member named `label`, when asked for, must be true, false, 0
// or 1. The logged score and threshold are number texts (the phone's) or JSON
// numbers; the feature vector is its JSON text or the object itself, read
// exactly as `reliqa score` reads a feature row, so that the candidate's
// score is that command's, bit for bit.
//
// A line that cannot be read is refused with the reason, and the block goes
// on. Blank lines are skipped. Nothing here throws for bad input.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"

namespace reliqa::tool {

struct LogBlock {
  // One entry per row read, in the order of the lines.
  std::vector<double> candidate;  // the candidate's probability
  std::vector<double> logged;     // the logged score; NaN for a bare row
  std::vector<double> threshold;  // the logged threshold; NaN for a bare row
  std::vector<int32_t> model;     // index into `models`; -1 for a bare row
  std::vector<int8_t> label;      // 0 or 1; -1 without a label
  std::vector<int64_t> line;      // the row's line number

  std::vector<std::string> models;  // the logged model ids, in order of appearance

  int64_t lines = 0;    // lines in the block, blank ones included
  int64_t read = 0;     // lines that are not blank
  int64_t refused = 0;  // lines that are not rows
  std::vector<std::pair<int64_t, std::string>> reasons;  // the first few refusals: line, why
};

// Reads and scores the lines of `data`; the first line is numbered
// `firstLine`. `label` names the label member (none: rows have no label).
// A line longer than `maxLine` bytes is refused unread. Keeps at most
// `maxReasons` reasons. `careful` reads every line the slow way that explains
// refusals (the quick way gives the same results; tests compare them).
// Only reads `model`: threads may score blocks with one model at once, without
// the interpreter's lock.
LogBlock replayBlock(const thornvale::BoostingModel& model, std::string_view data,
                     const std::optional<std::string>& label, int64_t firstLine, size_t maxLine,
                     size_t maxReasons, bool careful = false);

}  // namespace reliqa::tool

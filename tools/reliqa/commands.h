// The subcommands of the `reliqa` tool, one function each.
//
// Each takes its parsed options and the writer for results, does its work and
// returns normally, or throws ToolError (bad input, refused model, unreadable
// file) or UsageError (bad option values); main() turns those into one line on
// standard error and exit status 2. A command that refuses its input changes
// nothing in the store.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "tools/reliqa/io.h"

namespace reliqa::tool {

// $XDG_DATA_HOME/reliqa/store.db, else ~/.local/share/reliqa/store.db.
std::string defaultStorePath();

struct SetModelOptions {
  std::string store;
  std::optional<std::string> model;  // "-" is standard input
  std::string modelId;
  double threshold = 0.0;
};
void setModel(const SetModelOptions& o);

void setServerFeatures(const std::string& store, const std::string& file);

void printModelId(const std::string& store, ResultWriter& out);

void classify(const std::string& store, const std::string& input, ResultWriter& out);

void features(const std::string& input, ResultWriter& out);

void score(const std::string& model, const std::string& rows, bool raw, ResultWriter& out);

// Exactly one covers source and exactly one input; at most one of the files
// may be "-" (standard input).
struct ExplainOptions {
  std::string model;
  std::optional<std::string> xgboost;     // the XGBoost JSON model it was converted from
  std::optional<std::string> background;  // feature rows, JSON Lines
  std::optional<std::string> input;       // a collection file, or "-" for JSON Lines
  std::optional<std::string> rows;        // feature rows, JSON Lines
  std::optional<std::string> svg;
};
void explain(const ExplainOptions& o, ResultWriter& out);

struct InspectOptions {
  std::string model;
  std::optional<int64_t> tree;
  bool rules = false;
};
void inspect(const InspectOptions& o, ResultWriter& out);

struct PdpOptions {
  std::string model;
  int32_t feature = 0;
  double from = 0.0;
  double to = 0.0;
  int64_t steps = 0;
  std::optional<std::string> features;
  std::optional<std::string> svg;
};
void pdp(const PdpOptions& o, ResultWriter& out);

struct ConvertOptions {
  std::string input;
  std::vector<std::string> featureIds;  // split at commas; none: from the feature names
  std::string output;      // "-" is standard output
};
void convertXgboost(const ConvertOptions& o, ResultWriter& out, bool verbose);

// Writes `bytes` to `path` through a temporary file and a rename, so that a
// failure never leaves a partly written file behind.
void writeFileAtomically(const std::string& path, const std::string& bytes);

}  // namespace reliqa::tool

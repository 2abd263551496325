// Feeds arbitrary bytes to the model reader and, when a model results, to
// BoostingModel construction, prediction and the node operations. Malformed
// models must end in std::runtime_error (std::range_error included); any
// crash, hang, leak, sanitizer report or other exception is a finding.
#include <glog/logging.h>

#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <iostream>
#include <limits>
#include <sstream>
#include <stdexcept>
#include <string>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"

namespace {

using namespace thornvale;

// Discards what is written to it.
class NullBuffer : public std::streambuf {
 protected:
  int overflow(int c) override { return c; }
  std::streamsize xsputn(const char*, std::streamsize n) override { return n; }
};

NullBuffer nullBuffer;

// Values for the model's inputs, taken from the input bytes.
double valueFor(const uint8_t* data, size_t size, size_t i) {
  static const double kSpecial[] = {0.0, -0.0, 1.0, -1.0, 0.5,
                                    std::numeric_limits<double>::quiet_NaN(),
                                    std::numeric_limits<double>::infinity(), 1e300, 1e-310};
  if (size == 0) return 0.0;
  const uint8_t b = data[(i * 7) % size];
  return b < 9 * 16 ? kSpecial[b % 9] : (static_cast<double>(b) - 200.0) / 8.0;
}

void exerciseTrees(const Forest& forest) {
  Forest copy = forest;  // clone every tree
  linkForest(copy);
  std::ostream out(&nullBuffer);
  size_t nodes = 0;
  for (const WeightedTree& t : copy.trees) {
    if (!t.tree || !t.tree->root) continue;
    const Node& root = *t.tree->root;
    std::vector<const Node*> leaves;
    root.collectLeaves(leaves);
    nodes += 2 * leaves.size();
    if (nodes > 20000) break;  // the printers' output grows with depth squared
    root.printRules(out);
    root.printTree(out, 0);
  }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  std::cout.rdbuf(&nullBuffer);  // the reader's version line
  google::InitGoogleLogging("fuzz_model_reader");
  for (int s = google::GLOG_INFO; s < google::NUM_SEVERITIES; ++s) {
    google::SetLogDestination(s, "");  // no log files
  }
  FLAGS_logtostderr = false;
  FLAGS_stderrthreshold = google::GLOG_FATAL;
  FLAGS_minloglevel = google::GLOG_INFO;  // format every message, show none
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  try {
    BoostingModel model(text);
    const Forest& forest = model.getForest();
    FeatureMap features;
    for (size_t i = 0; i < forest.featureMapping.size() && i < 512; ++i) {
      features.emplace(static_cast<int32_t>(forest.featureMapping[i]), valueFor(data, size, i));
    }
    // predict is the logistic of the raw score, in [0, 1] (NaN only for a NaN sum).
    const double raw = model.rawScore(features);
    const double p = model.predict(features);
    if (std::isnan(raw) ? !std::isnan(p) : !(p == logistic(raw) && p >= 0.0 && p <= 1.0)) {
      __builtin_trap();
    }
    model.predict({});
    model.predict({{-1, 1.0}, {0, std::numeric_limits<double>::quiet_NaN()}});
    exerciseTrees(forest);
  } catch (const std::runtime_error&) {
    // malformed model: the expected outcome for most inputs
  }
  return 0;
}

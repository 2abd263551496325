// XGBoost models come from users: any bytes given to `reliqa convert xgboost`
// must either convert or be refused with a ToolError whose line lies inside
// the text. What converts must be written and read back as a working model,
// which scores a row of zeros like the forest it came from, and whose nodes
// pair with the XGBoost model's when covers are taken from it.
#include <glog/logging.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <string_view>
#include <vector>

#include "tools/common/errors.h"
#include "tools/common/xgboost_covers.h"
#include "tools/common/xgboost_model.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"

namespace {

[[noreturn]] void finding(const char* what) {
  std::fprintf(stderr, "%s\n", what);
  std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  FLAGS_minloglevel = google::GLOG_WARNING;  // one INFO block per converted model otherwise
  std::cout.setstate(std::ios::badbit);      // and the reader's version line
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  std::unique_ptr<thornvale::Forest> forest;
  reliqa::tool::XgbModel model;
  try {
    model = reliqa::tool::readXgboostModel(text, "fuzz");
    // Without feature names the ids are given, as --feature-ids gives them.
    std::vector<int64_t> given;
    if (model.featureNames.empty() && model.numFeature <= 1000) {
      for (int64_t i = 1; i <= model.numFeature; ++i) given.push_back(i);
    }
    std::vector<int32_t> ids = reliqa::tool::featureIdsOf(model, given, "fuzz", "--feature-ids");
    forest = reliqa::tool::toForest(model, ids);
  } catch (const reliqa::tool::ToolError& e) {
    int64_t lines = 1;
    for (char c : text) lines += c == '\n';
    if (e.file() != "fuzz" || e.line() < 0 || e.line() > lines) finding("a refusal placed outside the text");
    return 0;
  }
  // The converter writes the newest version and checks that it loads; a
  // conversion that does not load is a finding.
  std::unique_ptr<thornvale::BoostingModel> converted;
  try {
    converted = std::make_unique<thornvale::BoostingModel>(thornvale::writeModel(*forest, thornvale::kNewestVersion));
    thornvale::FeatureMap zeros;
    (void)converted->rawScore(zeros);
  } catch (const std::exception& e) {
    std::fprintf(stderr, "the converted model does not load: %s\n", e.what());
    std::abort();
  }
  // A conversion always pairs with its source; only missing hessian sums
  // keep the covers from being taken.
  bool hessians = true;
  for (const reliqa::tool::XgbTree& tree : model.trees) hessians = hessians && !tree.sumHessian.empty();
  if (hessians) {
    try {
      (void)reliqa::tool::xgboostCovers(model, *converted, "fuzz");
    } catch (const reliqa::tool::ToolError& e) {
      std::fprintf(stderr, "a conversion does not pair with its source: %s\n", e.describe().c_str());
      std::abort();
    }
  }
  return 0;
}

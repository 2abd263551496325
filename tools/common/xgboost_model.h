// XGBoost JSON models and their conversion to our model format.
//
// readXgboostModel reads what XGBoost's save_model writes as JSON (learner,
// gradient booster, trees) into XgbModel and checks that it is a model we can
// represent: a `gbtree` booster with the `binary:logistic` or `reg:logistic`
// objective, one output (no multi-class, no vector leaves), numerical splits
// only, and well-formed trees (child indices in range, every node reached once,
// split features below num_feature, finite values). Anything else is refused
// with a ToolError that says what and where. A tree's sum_hessian (the
// training weight that reached each node) is optional; when present it must
// have one finite, non-negative entry per node.
//
// toForest maps an XgbModel onto our Forest: one tree of weight 1 per XGBoost
// tree, the base score as the logit of XGBoost's base_score, and XGBoost's
// strict test `x < split` as our `x <= t` with t the largest float below the
// split, which agrees for every float x. Missing values cannot be represented:
// XGBoost sends them in each split's default direction, our trees send NaN by
// their own rule. featureMapping takes the given feature ids (one per XGBoost
// feature, in order); inputKeys the feature names, or the ids when the model has
// no names.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace thornvale {
struct Forest;
}

namespace reliqa::tool {

struct XgbTree {
  std::vector<int32_t> left;            // child index, or -1 at a leaf
  std::vector<int32_t> right;
  std::vector<int32_t> splitIndex;      // feature of a split
  std::vector<float> splitCondition;    // threshold of a split; value of a leaf
  std::vector<int32_t> splitType;       // 0 numerical, 1 categorical (may be empty)
  std::vector<float> sumHessian;        // cover of each node, finite and >= 0 (may be empty)
  int64_t line = 0;                     // where the tree starts, for messages
};

struct XgbModel {
  std::string objective;
  std::string booster;                  // "gbtree", "dart", "gblinear"
  float baseScore = 0.5f;               // a probability for the logistic objectives
  int64_t numFeature = 0;
  std::vector<std::string> featureNames;  // empty when trained without names
  std::vector<XgbTree> trees;
};

// Reads and checks an XGBoost JSON model; `name` is used in messages.
XgbModel readXgboostModel(std::string_view json, const std::string& name);

// The feature ids of the XGBoost features: `given` (one per feature) or, when
// empty, the integers of the feature names. Throws ToolError (naming `name`)
// when neither gives distinct 32-bit ids; its message tells how to give them
// with `option` (the front end's way: "--feature-ids 1,2,...").
std::vector<int32_t> featureIdsOf(const XgbModel& model, const std::vector<int64_t>& given,
                                  const std::string& name, const std::string& option);

std::unique_ptr<thornvale::Forest> toForest(const XgbModel& model, const std::vector<int32_t>& featureIds);

// A model text converted from an XGBoost JSON model, and what it holds.
struct ConvertedModel {
  std::string text;                 // our model text, newest format version
  size_t trees = 0;                 // XGBoost trees converted
  std::vector<int32_t> featureIds;  // the model's featureMapping
};

// The whole conversion: reads and checks `json`, maps its features to
// `featureIds` (see featureIdsOf), converts, writes the newest format and
// makes sure that the text loads. Throws ToolError naming `name`; `option`
// is as for featureIdsOf().
ConvertedModel convertXgboostJson(std::string_view json, const std::string& name,
                                  const std::vector<int64_t>& featureIds, const std::string& option);

// The ids of --feature-ids, one item each as the option splits its text at
// commas: an optional sign and at most 18 decimal digits, with spaces around;
// empty items are skipped. Throws UsageError naming the item.
std::vector<int64_t> parseIdList(const std::vector<std::string>& items);

}  // namespace reliqa::tool

// Node covers of a model converted from XGBoost, taken from the XGBoost model
// it was converted from.
//
// Tree explanations need each node's cover (how much training weight reached
// it). Our model text has none, but XGBoost keeps it per node as sum_hessian.
// xgboostCovers() pairs the two models: tree i of the model's
// getForest().trees (zero-weight trees included, as the model text lists
// them) with XGBoost tree i, and the nodes of each pair in pre-order (split,
// its left subtree, then its right subtree), which is the order toForest()
// builds and TreeCovers expects. The result is indexed like
// getForest().trees, ready for thornvale::TreeShap.
//
// Only a pair that toForest() could have made is accepted: the same number
// of trees, a leaf where XGBoost has a leaf and a split where it has a split,
// each split on the vector position of XGBoost's feature, with the threshold
// that scoring compares (the pivot value rounded to float) equal to the
// largest float below XGBoost's split value, and not on an equality feature.
// So every row of floats reaches the same leaf in both. Leaf values are not
// compared: a model may weigh its trees differently. Anything else is a
// ToolError that names `name` (the XGBoost model), the line where the tree
// starts, the tree and the node (XGBoost's node id and its place in
// pre-order). A tree without sum_hessian is refused too.
//
// `xgb` must be what readXgboostModel() returned (its trees are checked
// there). Pure; any thread.
#pragma once

#include <string>

#include "tools/common/xgboost_model.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/TreeShap.h"

namespace reliqa::tool {

thornvale::TreeCovers xgboostCovers(const XgbModel& xgb, const thornvale::BoostingModel& model,
                                    const std::string& name);

}  // namespace reliqa::tool

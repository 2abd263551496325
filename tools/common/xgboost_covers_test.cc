#include "tools/common/xgboost_covers.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "tools/common/errors.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"

namespace reliqa::tool {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

// Tree 0: one split on feature 1. Tree 1: XGBoost numbers its nodes level by
// level, so pre-order visits them as 0, 1, 3, 4, 2, 5, 6.
const char* kTree0 =
    R"({"left_children":[1,-1,-1],"right_children":[2,-1,-1],"split_indices":[1,0,0],
 "split_conditions":[5.618943E-1,-1.3175677E-1,6.7027557E-1],"split_type":[0,0,0],"sum_hessian":[42,22.5,19.5],
 "tree_param":{"num_nodes":"3","size_leaf_vector":"0"}})";
const char* kTree1 =
    R"({"left_children":[1,3,5,-1,-1,-1,-1],"right_children":[2,4,6,-1,-1,-1,-1],"split_indices":[0,1,2,0,0,0,0],
 "split_conditions":[0.25,0.5,2E0,-1E-1,3E-1,5E-1,7E-1],"sum_hessian":[40,25,15,1E1,15,5,10],
 "tree_param":{"num_nodes":"7","size_leaf_vector":"0"}})";

std::string xgboostJson(const std::string& trees = std::string(kTree0) + "," + kTree1) {
  return R"({"learner":{"feature_names":["5","7","9"],"gradient_booster":{"model":{"trees":[)" + trees +
         R"(]},"name":"gbtree"},"learner_model_param":{"base_score":"5E-1","num_feature":"3"},
 "objective":{"name":"binary:logistic"}},"version":[1,7,4]})";
}

// The conversion of xgboostJson(), changed by `edit` before it is written.
std::unique_ptr<thornvale::BoostingModel> converted(const std::function<void(thornvale::Forest&)>& edit = nullptr) {
  auto forest = toForest(readXgboostModel(xgboostJson(), "m.json"), {5, 7, 9});
  if (edit) edit(*forest);
  return std::make_unique<thornvale::BoostingModel>(thornvale::writeModel(*forest, thornvale::kNewestVersion));
}

std::string refusal(const thornvale::BoostingModel& model, const std::string& json = xgboostJson()) {
  try {
    xgboostCovers(readXgboostModel(json, "m.json"), model, "m.json");
  } catch (const ToolError& e) {
    return e.describe();
  }
  return "no error";
}

thornvale::LinearNode& split(const std::unique_ptr<thornvale::Node>& node) {
  return static_cast<thornvale::LinearNode&>(*node);
}

TEST(XgboostCovers, AreTheHessianSumsInPreorderForEveryTree) {
  // Zero-weight trees keep their place, and leaf values are not compared.
  auto model = converted([](thornvale::Forest& f) {
    f.trees[0].weight = 0.0;
    f.trees[1].weight = 0.5;
  });
  ASSERT_EQ(model->treesDropped(), 1u);
  const thornvale::TreeCovers covers = xgboostCovers(readXgboostModel(xgboostJson(), "m.json"), *model, "m.json");
  EXPECT_EQ(covers, (thornvale::TreeCovers{{42, 22.5, 19.5}, {40, 25, 10, 15, 15, 5, 10}}));

  // They fit the explainer, and the explanation adds up to the raw score.
  thornvale::TreeShap shap(*model, covers);
  const thornvale::FeatureMap row{{5, 0.1}, {7, 0.6}, {9, 3.0}};
  std::vector<float> x = model->featureVector(row);
  std::vector<double> contributions(shap.numContributions());
  thornvale::TreeShap::Scratch scratch;
  double sum = shap.explain(x.data(), contributions.data(), scratch);
  for (double c : contributions) sum += c;
  EXPECT_NEAR(sum, model->rawScore(row), 1e-12);
}

TEST(XgboostCovers, RefuseAModelThatIsNotTheConversion) {
  EXPECT_EQ(refusal(*converted([](thornvale::Forest& f) { f.trees.pop_back(); })),
            "m.json: the XGBoost model has 2 trees but the model 1; the model is not the conversion of this "
            "XGBoost model");
  // A split where XGBoost's node 3 (the third in pre-order) is a leaf.
  EXPECT_THAT(refusal(*converted([](thornvale::Forest& f) {
                auto deeper = std::make_unique<thornvale::LinearNode>(0, 1.0);
                deeper->left = std::make_unique<thornvale::ConstantNode>(1.0);
                deeper->right = std::make_unique<thornvale::ConstantNode>(2.0);
                split(split(f.trees[1].tree->root).left).left = std::move(deeper);
              })),
              AllOf(StartsWith("m.json:3: tree 1, node 3 (node 2 of the model's tree in pre-order): "),
                    HasSubstr("XGBoost has a leaf where the model splits")));
  EXPECT_THAT(refusal(*converted([](thornvale::Forest& f) { split(f.trees[1].tree->root).pivotIndex = 2; })),
              HasSubstr("tree 1, node 0 (node 0 of the model's tree in pre-order): the model splits on position 2, "
                        "XGBoost on feature 0"));
  // XGBoost's split value itself, not the float below it, as threshold.
  EXPECT_THAT(refusal(*converted([](thornvale::Forest& f) {
                split(split(f.trees[1].tree->root).right).pivotValue = 2.0;
              })),
              HasSubstr("tree 1, node 2 (node 4 of the model's tree in pre-order): the model tests x <= 2, "
                        "XGBoost x < 2 (x <= 1.9999999)"));
  EXPECT_THAT(refusal(*converted([](thornvale::Forest& f) { f.equalityFeatures = {1}; })),
              HasSubstr("tree 0, node 0 (node 0 of the model's tree in pre-order): the model tests position 1 "
                        "for equality"));

  std::string noHessians = kTree1;
  noHessians.erase(noHessians.find("\"sum_hessian\""), std::string("\"sum_hessian\":[40,25,15,1E1,15,5,10],").size());
  EXPECT_EQ(refusal(*converted(), xgboostJson(std::string(kTree0) + "," + noHessians)),
            "m.json:3: tree 1 has no sum_hessian, so its node covers are unknown");
}

TEST(XgboostCovers, HessianSumsAreCheckedWhenRead) {
  auto readError = [](const std::string& from, const std::string& to) {
    std::string tree = kTree1;
    tree.replace(tree.find(from), from.size(), to);
    try {
      readXgboostModel(xgboostJson(std::string(kTree0) + "," + tree), "m.json");
    } catch (const ToolError& e) {
      return e.describe();
    }
    return std::string("no error");
  };
  EXPECT_THAT(readError("[40,25,15,1E1,", "[40,25,15,"),
              HasSubstr("m.json:3: learner.gradient_booster.model.trees[1]: sum_hessian has 6 entries, "
                        "left_children 7"));
  EXPECT_THAT(readError("[40,25,15,1E1,", "[40,25,15,-1E1,"),
              HasSubstr("m.json:4: learner.gradient_booster.model.trees[1].sum_hessian[3]: -10 is negative"));
  EXPECT_THAT(readError("[40,25,15,1E1,", "[40,25,15,1E40,"), HasSubstr("outside the range of a float"));
}

}  // namespace
}  // namespace reliqa::tool

#include "tools/common/xgboost_model.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "tools/common/errors.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"

namespace reliqa::tool {
namespace {

using ::testing::HasSubstr;

// Tree 0 splits feature 1 at 0.5618943 (leaves -0.13175677 / 0.67027557);
// tree 1 splits feature 0 at 0.25 and then feature 2 at 2.
const char* kTree0 =
    R"({"base_weights":[0.8,-0.4,2.2],"categories":[],"categories_nodes":[],"categories_segments":[],
 "categories_sizes":[],"default_left":[1,0,0],"id":0,"left_children":[1,-1,-1],"loss_changes":[77.5,0,0],
 "parents":[2147483647,0,0],"right_children":[2,-1,-1],"split_conditions":[5.618943E-1,-1.3175677E-1,6.7027557E-1],
 "split_indices":[1,0,0],"split_type":[0,0,0],"sum_hessian":[42,22.6,19.3],
 "tree_param":{"num_deleted":"0","num_feature":"3","num_nodes":"3","size_leaf_vector":"0"}})";
const char* kTree1 =
    R"({"left_children":[1,-1,3,-1,-1],"right_children":[2,-1,4,-1,-1],"split_indices":[0,0,2,0,0],
 "split_conditions":[0.25,-1E-1,2E0,3E-1,5E-1],"split_type":[0,0,0,0,0],
 "tree_param":{"num_nodes":"5","size_leaf_vector":"0"}})";

std::string model(const std::string& trees = std::string(kTree0) + "," + kTree1,
                  const std::string& names = R"(["5","7","9"])", const std::string& objective = "binary:logistic",
                  const std::string& booster = "gbtree", const std::string& numClass = "0") {
  return R"({"learner":{"attributes":{},"feature_names":)" + names +
         R"(,"feature_types":[],"gradient_booster":{"model":{"gbtree_model_param":{"num_parallel_tree":"1"},
 "tree_info":[0,0],"trees":[)" + trees + R"(]},"name":")" + booster +
         R"("},"learner_model_param":{"base_score":"3E-1","num_class":")" + numClass +
         R"(","num_feature":"3","num_target":"1"},"objective":{"name":")" + objective + R"("}},"version":[1,7,4]})";
}

std::string errorOf(const std::string& json, std::vector<int64_t> ids = {}) {
  try {
    XgbModel m = readXgboostModel(json, "m.json");
    featureIdsOf(m, ids, "m.json", "--feature-ids");
  } catch (const ToolError& e) {
    return e.describe();
  }
  return "no error";
}

TEST(XgboostModel, ConvertsTreesBaseScoreAndFeatureMetadata) {
  XgbModel m = readXgboostModel(model(), "m.json");
  ASSERT_EQ(m.trees.size(), 2u);
  std::vector<int32_t> ids = featureIdsOf(m, {}, "m.json", "--feature-ids");
  EXPECT_EQ(ids, (std::vector<int32_t>{5, 7, 9}));
  auto forest = toForest(m, ids);
  double p = 0.3f;  // XGBoost keeps base_score as a float
  EXPECT_EQ(forest->baseScore, std::log(p / (1 - p)));
  EXPECT_EQ(forest->featureMapping, (std::vector<uint32_t>{5, 7, 9}));
  EXPECT_EQ(forest->inputKeys, (std::vector<std::string>{"5", "7", "9"}));
  ASSERT_EQ(forest->trees.size(), 2u);
  EXPECT_EQ(forest->trees[0].weight, 1.0);
  auto* root = dynamic_cast<const thornvale::LinearNode*>(forest->trees[0].tree->root.get());
  ASSERT_NE(root, nullptr);
  EXPECT_EQ(root->pivotIndex, 1);
  EXPECT_EQ(root->pivotValue, static_cast<double>(std::nextafter(0.5618943f, 0.0f)));
  auto* leaf = dynamic_cast<const thornvale::ConstantNode*>(root->left.get());
  ASSERT_NE(leaf, nullptr);
  EXPECT_EQ(leaf->value, static_cast<double>(-0.13175677f));  // the float XGBoost holds, widened
}

TEST(XgboostModel, SplitsAgreeWithStrictLessThanForEveryFloat) {
  auto forest = toForest(readXgboostModel(model(), "m.json"), {5, 7, 9});
  thornvale::BoostingModel converted(thornvale::writeModel(*forest, 4));
  float split = 0.5618943f;
  // XGBoost: x < split goes left. On the split value itself and just below it.
  for (float x : {split, std::nextafter(split, 0.0f), std::nextafter(split, 1.0f), 0.0f, 1.0f}) {
    double expected = std::log(0.3 / 0.7) + (x < split ? -0.13175677f : 0.67027557f) + 0.5f;  // tree 1: x0 > .25, x2 > 2
    EXPECT_NEAR(converted.rawScore({{5, 1.0}, {7, x}, {9, 3.0}}), expected, 1e-7) << x;
  }
  // Tree 1 on its second level: x2 == 2 is not below 2, so it goes right.
  EXPECT_NEAR(converted.rawScore({{5, 1.0}, {7, 0.0}, {9, 2.0}}) - converted.rawScore({{5, 1.0}, {7, 0.0}, {9, 1.9}}),
              0.5f - 0.3f, 1e-7);
}

TEST(XgboostModel, FeatureIdsComeFromNamesOrTheCommandLine) {
  XgbModel unnamed = readXgboostModel(model(kTree0, "[]"), "m.json");
  EXPECT_THAT(errorOf(model(kTree0, "[]")), HasSubstr("no feature names"));
  EXPECT_THAT(errorOf(model(kTree0, "[]")), HasSubstr("--feature-ids"));
  auto forest = toForest(unnamed, featureIdsOf(unnamed, {11, -2, 40}, "m.json", "--feature-ids"));
  EXPECT_EQ(forest->inputKeys, (std::vector<std::string>{"11", "-2", "40"}));
  EXPECT_EQ(forest->featureMapping[1], static_cast<uint32_t>(-2));
  EXPECT_THAT(errorOf(model(kTree0, R"(["a","b","c"])")), HasSubstr("feature name \"a\" is not an integer"));
  EXPECT_THAT(errorOf(model(kTree0, R"(["1","2","1"])")), HasSubstr("feature id 1 is given twice"));
  EXPECT_THAT(errorOf(model(kTree0), {1, 2}), HasSubstr("gives 2 ids but the model has 3 features"));
  EXPECT_THAT(errorOf(model(kTree0), {1, 2, 4294967296}), HasSubstr("not a 32-bit integer"));
}

TEST(XgboostModel, FeatureIdItemsAreDecimalIntegers) {
  // Items as CLI11 hands them over after splitting at commas.
  EXPECT_EQ(parseIdList({" 1", " 2 ", "-3", "+4", "010", "", "-123456789012345678"}),
            (std::vector<int64_t>{1, 2, -3, 4, 10, -123456789012345678}));
  EXPECT_TRUE(parseIdList({""}).empty());
  for (const char* bad : {"1;2", " ", "+", "-", "+-5", "1 2", "\t1", "0x10", "1e3", "1234567890123456789"}) {
    EXPECT_THROW(parseIdList({"1", bad}), UsageError) << bad;
  }
}

TEST(XgboostModel, ReadsParametersAsXgboostWritesThem) {
  auto withParams = [](const std::string& baseScore, const std::string& numFeature) {
    std::string m = model(kTree0);
    m.replace(m.find("\"3E-1\""), 6, baseScore);
    m.replace(m.find("\"num_feature\":\"3\"", m.find("learner_model_param")), 17, "\"num_feature\":" + numFeature);
    return m;
  };
  EXPECT_EQ(readXgboostModel(withParams("\"[2.5E-1]\"", "3 "), "m.json").baseScore, 0.25f);
  EXPECT_EQ(readXgboostModel(withParams("0.1", "\" +3\""), "m.json").baseScore, 0.1f);  // as a float, not a double
  EXPECT_THAT(errorOf(withParams("\"0.5x\"", "3")), HasSubstr("base_score: expected a number, got \"0.5x\""));
  EXPECT_THAT(errorOf(withParams("\"[0.5,0.5]\"", "3")), HasSubstr("one base score per output"));
  EXPECT_THAT(errorOf(withParams("\"1.5\"", "3")), HasSubstr("base_score 1.5 is not a probability"));
  EXPECT_THAT(errorOf(withParams("0.5", "\"3.0\"")), HasSubstr("num_feature: expected an integer, got \"3.0\""));
  EXPECT_THAT(errorOf(withParams("0.5", "\"99999999999999999999\"")), HasSubstr("expected an integer"));
}

TEST(XgboostModel, RefusesWhatCannotBeRepresented) {
  EXPECT_THAT(errorOf(model(kTree0, R"(["5","7","9"])", "reg:squarederror")),
              HasSubstr("objective \"reg:squarederror\" cannot be converted"));
  EXPECT_THAT(errorOf(model(kTree0, R"(["5","7","9"])", "multi:softprob", "gbtree", "3")),
              HasSubstr("cannot be converted"));
  EXPECT_THAT(errorOf(model(kTree0, R"(["5","7","9"])", "binary:logistic", "gbtree", "3")),
              HasSubstr("multi-class models (num_class 3)"));
  EXPECT_THAT(errorOf(model(kTree0, R"(["5","7","9"])", "binary:logistic", "gblinear")), HasSubstr("gblinear"));
  EXPECT_THAT(errorOf(model(kTree0, R"(["5","7","9"])", "binary:logistic", "dart")), HasSubstr("dart"));
  std::string categorical = std::string(kTree1);
  std::string plain = "\"split_type\":[0,0,0";
  categorical.replace(categorical.find(plain), plain.size(), "\"split_type\":[0,0,1");
  EXPECT_THAT(errorOf(model(categorical)), HasSubstr("tree 0, node 2: categorical split"));
  EXPECT_THAT(errorOf(R"({"version":[1]})"), HasSubstr("no \"learner\" member"));
}

TEST(XgboostModel, RefusesMalformedTrees) {
  auto withTree1 = [](const std::string& from, const std::string& to) {
    std::string t = kTree1;
    t.replace(t.find(from), from.size(), to);
    return model(t);
  };
  EXPECT_THAT(errorOf(withTree1("\"right_children\":[2,-1,4", "\"right_children\":[2,-1,9")),
              HasSubstr("tree 0, node 2: child index 9 is out of range"));
  EXPECT_THAT(errorOf(withTree1("\"right_children\":[2,-1,4", "\"right_children\":[2,-1,2")),
              HasSubstr("is reached twice"));
  EXPECT_THAT(errorOf(withTree1("\"right_children\":[2,-1,4", "\"right_children\":[2,-1,-1")),
              HasSubstr("one child is missing"));
  EXPECT_THAT(errorOf(withTree1("\"split_indices\":[0,0,2", "\"split_indices\":[0,0,3")),
              HasSubstr("split feature 3 is outside the model's 3 features"));
  EXPECT_THAT(errorOf(withTree1("\"num_nodes\":\"5\"", "\"num_nodes\":\"6\"")),
              HasSubstr("num_nodes is 6 but left_children has 5"));
  EXPECT_THAT(errorOf(withTree1("0.25,-1E-1", "0.25")), HasSubstr("split_conditions has 4 entries"));
  EXPECT_THAT(errorOf(withTree1("[1,-1,3,-1,-1]", "[1,-1,3,-1,\"x\"]")),
              HasSubstr("left_children[4]: expected an integer, got a string"));
  // Beyond the float range is refused; below it, the subnormal float stays.
  EXPECT_THAT(errorOf(withTree1("2E0,3E-1", "1E39,3E-1")),
              HasSubstr("split_conditions[2]: 1E39 is outside the range of a float"));
  XgbModel tiny = readXgboostModel(withTree1("3E-1,5E-1", "1E-45,5E-1"), "m.json");
  EXPECT_EQ(tiny.trees[0].splitCondition[3], std::numeric_limits<float>::denorm_min());
}

}  // namespace
}  // namespace reliqa::tool

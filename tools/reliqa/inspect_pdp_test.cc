#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/reliqa/chart.h"
#include "tools/common/errors.h"
#include "tools/reliqa/inspect.h"
#include "tools/reliqa/pdp.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/TreeBuilders.h"

namespace reliqa::tool {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using thornvale::ConstantNode;
using thornvale::Forest;
using thornvale::LinearNode;

// A tree that splits position `pos` at `pivot` into leaves `l` and `r`.
std::unique_ptr<thornvale::Tree> stump(int32_t pos, double pivot, double l, double r) {
  namespace t = thornvale::test;
  return t::tree(t::split(pos, pivot, t::leaf(l), t::leaf(r)));
}

Forest twoInputForest() {
  Forest f;
  f.baseScore = 0.25;
  f.inputKeys = {"age", "size"};
  f.featureMapping = {10, 20};
  f.trees.emplace_back(stump(1, 0.5, 1.0, 2.0), 1.0);
  f.trees.emplace_back(stump(0, 3.0, 10.0, 20.0), 0.5);
  f.trees.emplace_back(stump(1, 0.5, 99.0, 99.0), 0.0);  // dropped
  return f;
}

TEST(Pdp, SweepsOneFeatureWithTheOthersFixed) {
  Forest f = twoInputForest();
  PdpCurve c = partialDependence("m", f, 20, {{10, 4.0}}, 0.0, 1.0, 3);
  EXPECT_THAT(c.values, ElementsAre(0.0, 0.5, 1.0));
  // 0.25 + (1 or 2) + 0.5 * 20; a value equal to the pivot goes left.
  EXPECT_THAT(c.rawScores, ElementsAre(11.25, 11.25, 12.25));
  EXPECT_EQ(c.featureName, "size");
  EXPECT_EQ(pdpCsv(c), "value,raw_score\n0,11.25\n0.5,11.25\n1,12.25\n");
  // Features absent from --features read 0.
  EXPECT_THAT(partialDependence("m", f, 10, {}, 2.0, 4.0, 2).rawScores, ElementsAre(6.25, 11.25));
}

TEST(Pdp, RefusesUnknownFeaturesAndSelectors) {
  Forest f = twoInputForest();
  EXPECT_THROW(partialDependence("m", f, 30, {}, 0, 1, 2), ToolError);
  f.modelSelector = thornvale::WeightedTree(stump(0, 1.0, 0.0, 1.0), 1.0);
  try {
    partialDependence("m", f, 10, {}, 0, 1, 2);
    FAIL();
  } catch (const ToolError& e) {
    EXPECT_THAT(e.describe(), HasSubstr("m: the model chooses among sub-models"));
  }
}

TEST(Chart, SvgHasTitleAxesAndCurve) {
  PdpCurve c = partialDependence("m", twoInputForest(), 20, {}, 0.0, 1.0, 11);
  std::string svg = pdpSvg(c, 20, "model.txt");
  EXPECT_THAT(svg, HasSubstr("<svg"));
  EXPECT_THAT(svg, HasSubstr("Partial dependence of the raw score on feature 20 (size)"));
  EXPECT_THAT(svg, HasSubstr("<polyline"));
  EXPECT_THAT(svg, HasSubstr("raw score (model.txt)"));
  EXPECT_THAT(niceTicks(0.0, 1.0, 5), ElementsAre(0.0, 0.2, 0.4, 0.6000000000000001, 0.8, 1.0));
}

TEST(Chart, TextIsEscapedAndKeptToCharactersThatXmlHolds) {
  // Input keys are bytes: markup, control characters and malformed UTF-8
  // (a lone continuation byte, an overlong '/', a surrogate, a cut sequence)
  // must not break the document; well-formed characters stay.
  WaterfallChart c;
  c.title = "a<b>&\"c\x01\x80\xC0\xAF\xED\xA0\x80 \xC3\xA9\xF0\x9F\x99\x82 \xE2\x86";
  c.endNote = "score 1";
  const std::string replacement = "\xEF\xBF\xBD";
  EXPECT_THAT(renderSvg(c), HasSubstr(">a&lt;b&gt;&amp;&quot;c" + replacement + replacement + replacement + replacement +
                                      replacement + replacement + replacement + " \xC3\xA9\xF0\x9F\x99\x82 " +
                                      replacement + replacement + "</text>"));
}

TEST(Inspect, SummaryCountsTreesAndNamesTheForestWidth) {
  Forest f = twoInputForest();
  std::string text = thornvale::writeModel(f, 4);
  std::string s = describeModel("m.txt", text, f, true);
  EXPECT_THAT(s, HasSubstr("version 4"));
  EXPECT_THAT(s, HasSubstr("3 (2 kept, 1 dropped for weight 0)"));
  EXPECT_THAT(s, HasSubstr("min 1, mean 1, max 1"));
  EXPECT_THAT(s, HasSubstr("input keys       2: age, size"));
  EXPECT_THAT(s, HasSubstr("feature mapping  2: 10, 20"));
  EXPECT_THAT(s, HasSubstr("none: one model of all kept trees"));
  EXPECT_THAT(s, HasSubstr("16-bit forest (2 input keys)"));
  thornvale::ModelHeader h = readModelHeader(text);
  EXPECT_TRUE(h.complete);
  EXPECT_EQ(h.version, 4);
}

TEST(Inspect, SummaryListsSubModelRangesOverKeptTrees) {
  Forest f = twoInputForest();  // trees 0 and 1 kept, tree 2 dropped
  f.modelSelector = thornvale::WeightedTree(stump(0, 1.0, 0.0, 1.0), 1.0);
  f.modelIndexMap = {1, 5};  // 5 lies past the kept trees and is clamped
  std::string s = describeModel("m.txt", thornvale::writeModel(f, 4), f, true);
  EXPECT_THAT(s, HasSubstr("a tree of depth 1 with 2 leaves chooses a sub-model"));
  EXPECT_THAT(s, HasSubstr("sub-models       0: trees 0 to 0\n                 1: trees 1 to 1\n"
                           "                 2: no trees (base score only)\n"));
}

TEST(Inspect, PrintsTreesAndRulesWithInputNames) {
  Forest f = twoInputForest();
  EXPECT_EQ(printOneTree("m", f, 0),
            "tree 0, weight 1\nIf size <= 0.5 then\n\tFinal value = 1\nIf size > 0.5 then\n\tFinal value = 2\n");
  EXPECT_THAT(printAllRules("m", f, 1), "tree 1, weight 0.5\n20\t3 < age; \n10\tage <= 3; \n");
  EXPECT_THROW(printOneTree("m", f, 3), ToolError);
  f.inputKeys = {"10", "20"};  // ids as names read as features, not numbers
  EXPECT_THAT(printAllRules("m", f, 1), "tree 1, weight 0.5\n20\t3 < feature 10; \n10\tfeature 10 <= 3; \n");
}

}  // namespace
}  // namespace reliqa::tool

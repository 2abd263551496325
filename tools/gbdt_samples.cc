// gbdt-samples: writes the seed models of the model reader's fuzz target,
// made with the model writer.
//
//   gbdt-samples REPO_ROOT
//
// writes REPO_ROOT/fuzz/corpus/model_reader/*.txt. The output is
// deterministic.
#include <fstream>
#include <iostream>
#include <random>
#include <string>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/RandomForests.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/testing/TreeBuilders.h"

namespace {

using namespace thornvale;
using test::leaf;
using test::split;
using test::weighted;

void save(const std::string& path, const std::string& text) {
  std::ofstream out(path, std::ios::binary);
  out << text;
  if (!out) throw std::runtime_error("cannot write " + path);
  std::cout << path << " (" << text.size() << " bytes)\n";
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::cerr << "usage: gbdt-samples REPO_ROOT\n";
    return 2;
  }
  const std::string root = argv[1];
  const std::string seeds = root + "/fuzz/corpus/model_reader/";
  try {
    // Version 2: no metadata, so a constant-score model.
    Forest v2 = test::randomForest(1, 3, 2, 3);
    v2.featureMapping.clear();
    save(seeds + "v2_plain.txt", writeModel(v2, 2));

    // Version 3 with an equality feature, a zero-weight and a subnormal-weight tree.
    Forest v3 = test::randomForest(2, 4, 2, 4);
    v3.equalityFeatures = {1};
    v3.trees[1].weight = -0.0;
    v3.trees[2].weight = 5e-324;
    v3.trees.push_back(weighted(split(1, 0.5, leaf(1), split(2, -0.5, leaf(2), leaf(3))), 0.5));
    save(seeds + "v3_equality.txt", writeModel(v3, 3));

    // Version 4 with averages and a trailer: selector and sub-model boundaries.
    Forest v4 = test::randomForest(3, 6, 2, 5);
    v4.averageFeatureValues = {{1, 0.25}, {5, -1.0}};
    v4.modelSelector = weighted(split(0, 0.0, leaf(0.5), split(2, 0.3, leaf(1.5), leaf(2.7))), 1);
    v4.modelIndexMap = {2, 4};
    save(seeds + "v4_selector.txt", writeModel(v4, 4));

    // Version 2 with a trailer and feature values on the trees.
    Forest v2t = test::randomForest(4, 3, 1, 2);
    v2t.featureMapping.clear();
    v2t.trees[0].tree->featureValues = {{0, 1.5}, {1, -2.0}};
    v2t.modelSelector = weighted(leaf(1.0), 1);
    v2t.modelIndexMap = {1};
    save(seeds + "v2_trailer.txt", writeModel(v2t, 2));

    // A single leaf, no keys (32-bit forest), and a deeper chain.
    Forest single;
    single.baseScore = 0.5;
    single.trees.push_back(weighted(leaf(2.0), 0.1));
    save(seeds + "v3_single_leaf.txt", writeModel(single, 3));
    Forest deep;
    deep.inputKeys = {"depth"};
    deep.featureMapping = {1};
    deep.trees.push_back(weighted(test::chain(40), 1));
    save(seeds + "v3_chain.txt", writeModel(deep, 3));
  } catch (const std::exception& e) {
    std::cerr << "gbdt-samples: " << e.what() << "\n";
    return 1;
  }
  return 0;
}

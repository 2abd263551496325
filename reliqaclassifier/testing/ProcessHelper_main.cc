// A second process for the persistence test: opens the classifier over a
// database file, checks what an earlier process left there, and leaves new
// parameters for the next one.
//
// Usage: reliqa_classifier_process_helper DB EXPECTED_MODEL_ID EXPECTED_SCORE
//            NEW_MODEL_ID NEW_THRESHOLD
// EXPECTED_SCORE is the "score" logging text of an empty collection. The new
// parameters keep the stored model; the server features become {4: 1}.
// Exits 0 when the checks passed, 2 when they did not, 1 on an error.
#include <cstdlib>
#include <exception>
#include <iostream>
#include <memory>
#include <string>

#include "host/keystash/SqliteKeyValueStore.h"
#include "reliqaclassifier/ReliqasClassifier.h"

using kestrova::mobile::xplat::keystash::SqliteKeyValueStore;
using namespace kestrova::reliqaclassifier;

int main(int argc, char** argv) {
  if (argc != 6) {
    std::cerr << "usage: " << argv[0] << " DB EXPECTED_MODEL_ID EXPECTED_SCORE NEW_MODEL_ID NEW_THRESHOLD\n";
    return 1;
  }
  try {
    ReliqasClassifier classifier(std::make_shared<SqliteKeyValueStore>(argv[1]));
    const std::string modelId = classifier.currentlyUsedModelId();
    const std::string score = classifier.classify(ReliqaClassifierInput{}).loggingData.at("score");
    int status = 0;
    if (modelId != argv[2]) {
      std::cerr << "model id: expected '" << argv[2] << "', found '" << modelId << "'\n";
      status = 2;
    }
    if (score != argv[3]) {
      std::cerr << "score: expected " << argv[3] << ", found " << score << "\n";
      status = 2;
    }
    classifier.setModelParams({"", argv[4], std::strtod(argv[5], nullptr)});
    classifier.setServerFeatures({{4, 1.0}});
    return status;
  } catch (const std::exception& error) {
    std::cerr << "error: " << error.what() << "\n";
    return 1;
  }
}

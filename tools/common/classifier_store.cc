#include "tools/common/classifier_store.h"

#include <cmath>
#include <filesystem>
#include <sstream>
#include <system_error>

#include "host/keystash/SqliteKeyValueStore.h"
#include "reliqaclassifier/ModelParamsPersistence.h"
#include "tools/common/errors.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelFormat.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/CacheManager.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace reliqa::tool {

namespace rc = kestrova::reliqaclassifier;
using kestrova::mobile::xplat::keystash::PersistentKeyValueStore;

namespace {

// Creates every missing directory above `path`.
void makeParents(const std::string& path) {
  const std::filesystem::path parent = std::filesystem::path(path).parent_path();
  std::error_code error;
  if (!parent.empty()) std::filesystem::create_directories(parent, error);
  if (error) throw ToolError(path, 0, "cannot create the directory " + parent.string() + ": " + error.message());
}

// Warns about a model text that loads but is probably not what was meant.
void warnAboutDoubtfulModel(const std::string& name, const std::string& text, const thornvale::BoostingModel& model,
                            const Warn& warn) {
  std::istringstream in(text);
  const thornvale::ModelHeader header = thornvale::read_header(in);
  if (!header.complete || header.magic != thornvale::kModelMagic) {
    warn(name, "the magic number is " + std::to_string(header.magic) + ", not " +
                   std::to_string(thornvale::kModelMagic) + "; stored all the same, as the classifier reads it");
  }
  if (!thornvale::isReadableVersion(header.version)) {
    warn(name, "format version " + std::to_string(header.version) +
                   " is not 2, 3 or 4: the model reads as empty and every score will be 0.5; stored all the same");
  } else if (model.getForest().trees.empty()) {
    warn(name, "the model has no trees: every score will be the logistic of its base score; stored all the same");
  }
}

}  // namespace

std::shared_ptr<PersistentKeyValueStore> openStore(const std::string& path) {
  makeParents(path);
  try {
    return std::make_shared<kestrova::mobile::xplat::keystash::SqliteKeyValueStore>(path);
  } catch (const std::exception& e) {
    throw ToolError(path, 0, std::string("cannot open the store: ") + e.what());
  }
}

std::unique_ptr<rc::ReliqasClassifier> openClassifier(const std::string& path,
                                                      std::shared_ptr<PersistentKeyValueStore> store) {
  if (!store) store = openStore(path);
  try {
    return std::make_unique<rc::ReliqasClassifier>(store);
  } catch (const std::exception& e) {
    throw ToolError(path, 0,
                    std::string("the stored model cannot be loaded (") + e.what() +
                        "); replace it with 'reliqa set-model --model FILE --model-id ID --threshold T'");
  }
}

std::unique_ptr<thornvale::BoostingModel> loadModel(const std::string& name, const std::string& text,
                                                    thornvale::WalkKernel kernel) {
  try {
    return std::make_unique<thornvale::BoostingModel>(text, kernel);
  } catch (const std::exception& e) {
    throw ToolError(name, 0, std::string("the model cannot be loaded: ") + e.what());
  }
}

void setModel(const std::string& storePath, const rc::ReliqaClassifierModelParams& params,
              const std::string& modelName, const std::string& replaceHint, const Warn& warn) {
  if (!std::isfinite(params.mThreshold)) {
    throw ToolError(storePath, 0, "the threshold must be a finite number, got " +
                                      thornvale::doubleToText(params.mThreshold));
  }
  if (!params.mSerializedModel.empty()) {
    // Load it once here: a model that the classifier cannot load must never
    // reach the store, where it would stop every later classifier.
    auto model = loadModel(modelName, params.mSerializedModel);
    warnAboutDoubtfulModel(modelName, params.mSerializedModel, *model, warn);
  }
  auto store = openStore(storePath);
  std::unique_ptr<rc::ReliqasClassifier> classifier;
  try {
    classifier = std::make_unique<rc::ReliqasClassifier>(store);
  } catch (const std::exception& e) {
    // The store holds a model that no classifier can load (written by some
    // other means). A new model, checked above, replaces it; write the
    // parameters as the classifier would, then make sure a classifier starts.
    if (params.mSerializedModel.empty()) {
      throw ToolError(storePath, 0,
                      std::string("the stored model cannot be loaded (") + e.what() +
                          "); " + replaceHint);
    }
    warn(storePath, std::string("the stored model cannot be loaded (") + e.what() + "); replacing it");
    thornvale::CacheManager cache(store, rc::kDefaultKeyPrefix);  // the classifier's own prefix
    rc::storeModelParams(cache, params);
    classifier = openClassifier(storePath, store);
  }
  try {
    classifier->setModelParams(params);
  } catch (const std::exception& e) {
    throw ToolError(storePath, 0, std::string("storing the model parameters failed: ") + e.what());
  }
  if (classifier->currentlyUsedModelId() != params.mModelId) {
    throw ToolError(storePath, 0, "the store did not keep the model parameters (see the messages above)");
  }
}

void setServerFeatures(const std::string& storePath, const thornvale::FeatureMap& features) {
  auto classifier = openClassifier(storePath);
  try {
    classifier->setServerFeatures(features);
  } catch (const std::exception& e) {
    throw ToolError(storePath, 0, std::string("storing the server features failed: ") + e.what());
  }
}

}  // namespace reliqa::tool

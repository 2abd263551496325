// A classifier over the SQLite store at a path, as the tool and the Python
// package both use it.
//
// openStore() opens (creating it and the directories above it) the store at
// `path`; openClassifier() starts a classifier on it, with the classifier's
// default key prefix, so that every front end reads and writes the same
// entries. setModel() stores new model parameters the careful way: a model
// text that the classifier cannot load is refused before anything is written
// (in the store it would stop every later classifier), and a store whose own
// model cannot be loaded is repaired by the new parameters. Doubtful but
// loadable texts (another magic number, an unreadable version, no trees) are
// stored with a warning through `warn`. setServerFeatures() replaces the
// stored server features.
//
// Every failure throws ToolError naming the store's path (or the model's
// name); a refused call leaves the store as it was. Functions, no state: any
// thread may call them, but two writers of one store file race as two
// processes would.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "host/keystash/PersistentKeyValueStore.h"
#include "reliqaclassifier/ReliqaClassifierInput.h"
#include "reliqaclassifier/ReliqasClassifier.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"
#include "xplat/gbdtclassifier/GbdtClassifier/WalkKernel.h"

namespace reliqa::tool {

// Receives a warning: the file it concerns (may be empty) and what is wrong.
using Warn = std::function<void(const std::string& file, const std::string& what)>;

std::shared_ptr<kestrova::mobile::xplat::keystash::PersistentKeyValueStore> openStore(const std::string& path);

// `store` is the store at `path` when the caller has opened it already.
std::unique_ptr<kestrova::reliqaclassifier::ReliqasClassifier> openClassifier(
    const std::string& path,
    std::shared_ptr<kestrova::mobile::xplat::keystash::PersistentKeyValueStore> store = nullptr);

// Reads a model text, laid out for `kernel`; `name` names it in the message
// of the ToolError.
std::unique_ptr<thornvale::BoostingModel> loadModel(const std::string& name, const std::string& text,
                                                    thornvale::WalkKernel kernel = thornvale::bestWalkKernel());

// Stores `params` (an empty mSerializedModel keeps the model and changes only
// the identifier and the threshold). `modelName` names the text in messages;
// `replaceHint` says how to give a model text ("give a replacement with
// --model FILE") when the stored model cannot be loaded and none was given.
void setModel(const std::string& storePath, const kestrova::reliqaclassifier::ReliqaClassifierModelParams& params,
              const std::string& modelName, const std::string& replaceHint, const Warn& warn);

void setServerFeatures(const std::string& storePath, const thornvale::FeatureMap& features);

}  // namespace reliqa::tool

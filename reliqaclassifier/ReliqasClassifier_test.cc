#include "reliqaclassifier/ReliqasClassifier.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/wait.h>

#include <atomic>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <set>
#include <thread>
#include <tuple>
#include <vector>

#include "host/keystash/testing/FaultInjectingKeyValueStore.h"
#include "host/keystash/InMemoryKeyValueStore.h"
#include "host/keystash/SqliteKeyValueStore.h"
#include "host/keystash/PersistentKeyValueStore.h"
#include "host/keystash/testing/TemporaryDirectory.h"
#include "reliqaclassifier/FeatureExtraction.h"
#include "reliqaclassifier/testing/TestModels.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/ConversionError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMapJson.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/LogCapture.h"

extern char** environ;

namespace kestrova::reliqaclassifier {
namespace {

using kestrova::mobile::xplat::keystash::FaultInjectingKeyValueStore;
using kestrova::mobile::xplat::keystash::InMemoryKeyValueStore;
using kestrova::mobile::xplat::keystash::SqliteKeyValueStore;
using kestrova::mobile::xplat::keystash::TemporaryDirectory;
using test::rejectedModel;
using test::stumpModel;
using thornvale::test::LogCapture;
using ::testing::ElementsAre;
using ::testing::UnorderedElementsAre;

// A collection of three assets; totalAssetsCount (feature 4) is 3.
ReliqaClassifierInput collection() {
  ReliqaClassifierInput input;
  input.timeSinceStory = 2.5;
  input.assetCounts.totalAssetsCount = 3;
  for (int i = 0; i < 3; ++i) {
    AssetDetail asset;
    asset.creationDateSinceEpoch = 1700000000 + i * 600;
    asset.modificationDateSinceEpoch = i == 0 ? -1 : 1700003600;
    asset.pixelWidth = 4000;
    asset.pixelHeight = 3000;
    asset.mediaSubtypes = i;
    asset.blurrinessMetric = {i != 1, 0.1 * i};
    input.assetDetails.push_back(asset);
  }
  input.duplicateInfos.push_back({"a0", "a1", 0.93});
  return input;
}

FeatureMap featureVectorOf(const ReliqaClassifierResult& result) {
  return thornvale::featureMapFromJson(result.loggingData.at("feature_vector"));
}

// The score that `modelText` gives `features`.
double scoreOf(const std::string& modelText, const FeatureMap& features) {
  return thornvale::BoostingModel(modelText).predict(features);
}

// Server features, then the computed features they do not replace.
FeatureMap merged(const FeatureMap& server, const ReliqaClassifierInput& input) {
  FeatureMap features = server;
  FeatureMap computed = extractFeatures(input);
  for (const auto& [id, value] : computed) features.emplace(id, value);
  return features;
}

class ReliqasClassifierTest : public ::testing::Test {
 protected:
  std::shared_ptr<InMemoryKeyValueStore> memory = std::make_shared<InMemoryKeyValueStore>();
  std::shared_ptr<FaultInjectingKeyValueStore> store = std::make_shared<FaultInjectingKeyValueStore>(memory);
  // Leaf -2 when feature 4 is at most 5, else +2.
  const std::string modelA = stumpModel(4, 5.0, -2.0, 2.0);
  const std::string modelB = stumpModel(4, 5.0, 1.0, -1.0);
};

TEST_F(ReliqasClassifierTest, WithoutModelEverythingIsAcceptedWithDefaultLoggingValues) {
  ReliqasClassifier classifier(store);
  EXPECT_EQ(classifier.currentlyUsedModelId(), "");
  ReliqaClassifierResult result = classifier.classify(collection());
  EXPECT_EQ(result.score, 1.0);
  EXPECT_TRUE(result.isOverThreshold);
  std::vector<std::string> keys;
  for (const auto& [key, value] : result.loggingData) keys.push_back(key);
  EXPECT_THAT(keys, ElementsAre("score", "model_id", "feature_vector", "threshold"));
  EXPECT_EQ(result.loggingData.at("score"), "1");
  EXPECT_EQ(result.loggingData.at("threshold"), "0");
  EXPECT_EQ(result.loggingData.at("model_id"), "");
  EXPECT_EQ(featureVectorOf(result), extractFeatures(collection()));
  EXPECT_EQ(result.loggingData.at("feature_vector").find(' '), std::string::npos);

  // 1.0 is not greater than a threshold of 1.0.
  classifier.setModelParams({"", "no-model", 1.0});
  result = classifier.classify(collection());
  EXPECT_FALSE(result.isOverThreshold);
  EXPECT_EQ(result.loggingData.at("threshold"), "1");
  EXPECT_EQ(result.loggingData.at("model_id"), "no-model");
}

TEST_F(ReliqasClassifierTest, ServerFeaturesReplaceComputedOnesAndAreReplacedAsAWhole) {
  ReliqasClassifier classifier(store);
  classifier.setModelParams({modelA, "a", 0.5});
  classifier.setServerFeatures({{4, 9.0}, {1000, 2.5}, {-1, 0.5}});
  ReliqaClassifierResult result = classifier.classify(collection());
  // Members by ascending id: server ids below and above the computed ones
  // take their places around them.
  const std::string& text = result.loggingData.at("feature_vector");
  EXPECT_THAT(text, ::testing::StartsWith("{\"-1\":0.5,\"1\":2.5,"));
  EXPECT_THAT(text, ::testing::HasSubstr(",\"3\":0,\"4\":9,\"5\":0,"));
  EXPECT_THAT(text, ::testing::EndsWith(",\"74\":0,\"1000\":2.5}"));
  FeatureMap vector = featureVectorOf(result);
  EXPECT_EQ(vector.at(4), 9.0);      // not the computed 3
  EXPECT_EQ(vector.at(1000), 2.5);   // unused by the model, still logged
  EXPECT_EQ(vector.at(1), 2.5);      // computed features stay
  EXPECT_EQ(vector.size(), 75u);
  EXPECT_EQ(result.score, scoreOf(modelA, {{4, 9.0}}));
  EXPECT_NE(result.score, scoreOf(modelA, {{4, 3.0}}));
  EXPECT_TRUE(result.isOverThreshold);
  EXPECT_EQ(result.loggingData.at("score"), thornvale::doubleToText(result.score));

  classifier.setServerFeatures({{2000, 1.0}});
  vector = featureVectorOf(classifier.classify(collection()));
  EXPECT_EQ(vector.at(4), 3.0);
  EXPECT_FALSE(vector.contains(1000));
  EXPECT_EQ(memory->peek("RELIQA_server_features"), "{\"2000\":1}");
}

TEST_F(ReliqasClassifierTest, ModelIsKeptOnEmptyTextReplacedOnNewTextAndKeptWhenRejected) {
  ReliqasClassifier classifier(store);
  const FeatureMap features = merged({}, collection());
  classifier.setModelParams({modelA, "a", 0.5});
  EXPECT_EQ(classifier.classify(collection()).score, scoreOf(modelA, features));

  // Empty text: identifier and threshold change, the model stays.
  classifier.setModelParams({"", "b", 0.05});
  ReliqaClassifierResult result = classifier.classify(collection());
  EXPECT_EQ(result.score, scoreOf(modelA, features));
  EXPECT_EQ(result.loggingData.at("model_id"), "b");
  EXPECT_EQ(result.loggingData.at("threshold"), "0.05");
  EXPECT_TRUE(result.isOverThreshold);
  EXPECT_EQ(memory->peek("RELIQA_model"), modelA);

  classifier.setModelParams({modelB, "c", 0.5});
  EXPECT_EQ(classifier.classify(collection()).score, scoreOf(modelB, features));

  // A rejected text is stored with its identifier and threshold, but the
  // previous model goes on scoring; a new classifier cannot load it.
  EXPECT_THROW(classifier.setModelParams({rejectedModel(), "d", 0.7}), std::runtime_error);
  result = classifier.classify(collection());
  EXPECT_EQ(result.score, scoreOf(modelB, features));
  EXPECT_EQ(result.loggingData.at("model_id"), "d");
  EXPECT_EQ(result.loggingData.at("threshold"), "0.7");
  EXPECT_EQ(memory->peek("RELIQA_model"), rejectedModel());
  EXPECT_THROW(ReliqasClassifier{store}, std::runtime_error);

  // A model that cannot be read back from the store leaves no model at all.
  store->failFetches(FaultInjectingKeyValueStore::Failure::kInGet);
  classifier.setModelParams({modelA, "e", 0.25});
  store->failFetches(FaultInjectingKeyValueStore::Failure::kNone);
  EXPECT_EQ(classifier.classify(collection()).score, 1.0);
  EXPECT_EQ(memory->peek("RELIQA_model"), modelA);
  EXPECT_EQ(ReliqasClassifier(store).classify(collection()).score, scoreOf(modelA, features));
}

TEST_F(ReliqasClassifierTest, CustomPrefixKeepsItsOwnEntries) {
  ReliqasClassifier first(store, "FIRST");
  ReliqasClassifier second(store);
  first.setModelParams({modelA, "first", 0.5});
  EXPECT_EQ(second.currentlyUsedModelId(), "");
  EXPECT_EQ(memory->peek("FIRST_model_id"), "first");
  EXPECT_EQ(memory->peek("FIRST_threshold"), "0.5");
}

TEST_F(ReliqasClassifierTest, NonFiniteValuesFailTheCallAndLeaveTheClassifierUsable) {
  ReliqasClassifier classifier(store);
  classifier.setModelParams({modelA, "a", 0.5});

  // The identifier is written before the threshold is refused; nothing after.
  try {
    classifier.setModelParams({modelB, "nan", std::nan("")});
    FAIL() << "expected a JSON error";
  } catch (const thornvale::JsonPrintError& error) {
    EXPECT_STREQ(error.what(), "folly::toJson: JSON object value was a NaN when serializing <undefined location>");
  }
  EXPECT_EQ(classifier.currentlyUsedModelId(), "nan");
  EXPECT_EQ(memory->peek("RELIQA_threshold"), "0.5");
  EXPECT_EQ(memory->peek("RELIQA_model"), modelA);

  ReliqaClassifierInput input = collection();
  input.assetDetails[1].latitude = std::numeric_limits<double>::quiet_NaN();
  try {
    classifier.classify(input);
    FAIL() << "expected a JSON error";
  } catch (const thornvale::JsonPrintError& error) {
    // Mean and deviation of the latitudes (31, 32) are both NaN; either may be met first.
    EXPECT_THAT(error.what(), ::testing::MatchesRegex("folly::toJson: JSON object value was a NaN when "
                                                      "serializing value at \"3[12]\""));
  }
  EXPECT_EQ(classifier.classify(collection()).loggingData.at("model_id"), "nan");  // the lock was released
}

TEST_F(ReliqasClassifierTest, UndecodableStoredValuesThrowAndReleaseTheLock) {
  ReliqasClassifier classifier(store);
  memory->put("RELIQA_threshold", "seven");
  EXPECT_THROW(classifier.classify(collection()), thornvale::ConversionError);
  EXPECT_EQ(classifier.currentlyUsedModelId(), "");
  memory->put("RELIQA_threshold", "0.25");
  memory->put("RELIQA_server_features", "{\"4\":null}");
  EXPECT_THROW(classifier.classify(collection()), thornvale::JsonTypeError);
  classifier.setServerFeatures({});
  EXPECT_EQ(classifier.classify(collection()).loggingData.at("threshold"), "0.25");
}

TEST_F(ReliqasClassifierTest, StoreFailuresOnlyLogAndUseDefaults) {
  LogCapture log;
  ReliqasClassifier detached(nullptr);
  detached.setModelParams({modelA, "a", 0.5});
  detached.setServerFeatures({{4, 9.0}});
  ReliqaClassifierResult result = detached.classify(collection());
  EXPECT_EQ(result.score, 1.0);
  EXPECT_EQ(result.loggingData.at("threshold"), "0");
  EXPECT_EQ(detached.currentlyUsedModelId(), "");
  EXPECT_THAT(log.messages(),
              ElementsAre("cache not initiated, tried to fetch: RELIQA_model",
                          "cache not initiated, tried to store with key: RELIQA_model_id",
                          "cache not initiated, tried to store with key: RELIQA_threshold",
                          "cache not initiated, tried to store with key: RELIQA_model",
                          "cache not initiated, tried to fetch: RELIQA_model",
                          "cache not initiated, tried to store with key: RELIQA_server_features",
                          "cache not initiated, tried to fetch: RELIQA_server_features",
                          "cache not initiated, tried to fetch: RELIQA_model_id",
                          "cache not initiated, tried to fetch: RELIQA_threshold",
                          "cache not initiated, tried to fetch: RELIQA_model_id"));

  ReliqasClassifier classifier(store);
  classifier.setModelParams({modelA, "a", 0.5});
  store->failFetches(FaultInjectingKeyValueStore::Failure::kInCall,
                     std::make_exception_ptr(std::runtime_error("database is locked")));
  result = classifier.classify(collection());
  EXPECT_EQ(result.score, scoreOf(modelA, merged({}, collection())));  // the loaded model still scores
  EXPECT_EQ(result.loggingData.at("model_id"), "");
  EXPECT_EQ(result.loggingData.at("threshold"), "0");
}

// Persistence through the SQLite store: a new classifier over the same file,
// and a second process.
TEST(ReliqasClassifierPersistenceTest, ParametersSurviveANewClassifierAndANewProcess) {
  TemporaryDirectory dir;
  const std::string path = dir.file("store.db");
  const std::string model = stumpModel(4, 5.0, -2.0, 2.0);
  const ReliqaClassifierInput empty;
  std::string firstScore;
  {
    ReliqasClassifier classifier(std::make_shared<SqliteKeyValueStore>(path));
    classifier.setModelParams({model, "parent", 0.25});
    classifier.setServerFeatures({{4, 9.0}});
    firstScore = classifier.classify(empty).loggingData.at("score");
  }
  {
    ReliqasClassifier reopened(std::make_shared<SqliteKeyValueStore>(path));
    EXPECT_EQ(reopened.currentlyUsedModelId(), "parent");
    ReliqaClassifierResult result = reopened.classify(empty);
    EXPECT_EQ(result.loggingData.at("score"), firstScore);
    EXPECT_EQ(result.loggingData.at("threshold"), "0.25");
    EXPECT_EQ(featureVectorOf(result).at(4), 9.0);
  }

  // The helper checks what we left, then stores its own identifier, threshold
  // and server features.
  // A cross build runs the helper, like this test, through its emulator.
  std::vector<std::string> args = {PROCESS_HELPER, path, "parent", firstScore, "child", "0.75"};
  const char* emulator = std::getenv("RELIQA_EMULATOR");
  if (emulator != nullptr && *emulator != '\0') args.insert(args.begin(), emulator);
  std::vector<char*> argv;
  for (std::string& arg : args) argv.push_back(arg.data());
  argv.push_back(nullptr);
  pid_t pid = 0;
  ASSERT_EQ(posix_spawn(&pid, argv[0], nullptr, nullptr, argv.data(), environ), 0);
  int status = 0;
  ASSERT_EQ(waitpid(pid, &status, 0), pid);
  ASSERT_TRUE(WIFEXITED(status));
  ASSERT_EQ(WEXITSTATUS(status), 0) << "the helper process found other parameters";

  ReliqasClassifier afterChild(std::make_shared<SqliteKeyValueStore>(path));
  EXPECT_EQ(afterChild.currentlyUsedModelId(), "child");
  ReliqaClassifierResult result = afterChild.classify(empty);
  EXPECT_EQ(result.loggingData.at("threshold"), "0.75");
  EXPECT_EQ(featureVectorOf(result).at(4), 1.0);
  EXPECT_EQ(result.score, scoreOf(model, {{4, 1.0}}));  // the parent's model, the child's features
}

// Classifications racing with updates: every result must be the answer for
// some model-parameter state and some server-feature state that existed.
TEST(ReliqasClassifierConcurrencyTest, ResultsMatchSomeStateThatExisted) {
  const int savedLevel = FLAGS_minloglevel;
  FLAGS_minloglevel = google::GLOG_WARNING;  // no per-prediction INFO lines

  const std::vector<std::string> models = {stumpModel(4, 5.0, -2.0, 2.0), stumpModel(1000, 0.5, 0.5, -0.5)};
  struct Params {
    std::string modelText;  // empty, a model, or rejected
    std::string id;
    double threshold;
  };
  const std::vector<Params> updates = {
      {models[0], "m0", 0.3}, {models[1], "m1", 0.6}, {"", "keep", 0.1}, {rejectedModel(), "bad", 0.9}};
  const std::vector<FeatureMap> serverStates = {{}, {{4, 9.0}}, {{1000, 1.0}, {4, -1.0}}};
  const std::vector<ReliqaClassifierInput> inputs = {collection(), ReliqaClassifierInput{}};

  // Every answer that a state which existed could give. For the updated
  // classifier: an update's model (or, when its text is empty or rejected,
  // either earlier model) with that update's identifier and threshold. For a
  // second classifier over the same store: the model it loaded with any
  // stored identifier and any stored threshold. The entries are written one
  // by one, and its own lock does not keep the other classifier from writing
  // between its two reads, so the pair need not come from one update.
  using Key = std::tuple<std::string, std::string, std::string, std::vector<std::pair<int32_t, double>>>;
  auto key = [](const ReliqaClassifierResult& result) {
    FeatureMap vector = featureVectorOf(result);
    return Key(result.loggingData.at("score"), result.loggingData.at("model_id"),
               result.loggingData.at("threshold") + (result.isOverThreshold ? ">" : "<="),
               std::vector<std::pair<int32_t, double>>(vector.begin(), vector.end()));
  };
  std::set<Key> updatedAnswers;
  std::set<Key> sharingAnswers;
  for (const std::string& model : models) {
    for (const Params& params : updates) {
      for (const FeatureMap& server : serverStates) {
        for (bool keepModel : {false, true}) {
          auto reference = std::make_shared<InMemoryKeyValueStore>();
          ReliqasClassifier classifier(reference);
          classifier.setModelParams({model, "", 0.0});
          try {
            classifier.setModelParams({keepModel ? "" : params.modelText, params.id, params.threshold});
          } catch (const std::runtime_error&) {
          }
          classifier.setServerFeatures(server);
          for (const ReliqaClassifierInput& input : inputs) {
            if (!keepModel) updatedAnswers.insert(key(classifier.classify(input)));
          }
          if (!keepModel || model != models[0]) continue;
          for (const Params& thresholdFrom : updates) {
            classifier.setModelParams({"", params.id, thresholdFrom.threshold});
            for (const ReliqaClassifierInput& input : inputs) sharingAnswers.insert(key(classifier.classify(input)));
          }
        }
      }
    }
  }

  TemporaryDirectory dir;
  auto store = std::make_shared<SqliteKeyValueStore>(dir.file("store.db"));
  ReliqasClassifier classifier(store);
  classifier.setModelParams({models[0], updates[0].id, updates[0].threshold});
  ReliqasClassifier sharingTheStore(store);  // keeps model 0, reads the same entries

  std::atomic<bool> stop{false};
  std::atomic<int> unexpected{0};
  std::atomic<int> classified{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < 8; ++t) {
    threads.emplace_back([&, t] {
      ReliqasClassifier& target = t == 7 ? sharingTheStore : classifier;
      for (int i = 0; i < 40; ++i) {
        ReliqaClassifierResult result = target.classify(inputs[(t + i) % inputs.size()]);
        if (!(t == 7 ? sharingAnswers : updatedAnswers).count(key(result))) {
          if (++unexpected == 1) {
            ADD_FAILURE() << "unexpected result: score " << result.loggingData.at("score") << ", model_id "
                          << result.loggingData.at("model_id") << ", threshold "
                          << result.loggingData.at("threshold") << ", features "
                          << result.loggingData.at("feature_vector");
          }
        }
        ++classified;
      }
    });
  }
  threads.emplace_back([&] {
    for (int i = 0; !stop; ++i) {
      const Params& params = updates[i % updates.size()];
      try {
        classifier.setModelParams({params.modelText, params.id, params.threshold});
      } catch (const std::runtime_error&) {
      }
    }
  });
  threads.emplace_back([&] {
    for (int i = 0; !stop; ++i) classifier.setServerFeatures(serverStates[i % serverStates.size()]);
  });
  while (classified < 8 * 40) std::this_thread::yield();
  stop = true;
  for (auto& thread : threads) thread.join();
  FLAGS_minloglevel = savedLevel;
  EXPECT_EQ(unexpected, 0);
}

}  // namespace
}  // namespace kestrova::reliqaclassifier

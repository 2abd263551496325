#include "xplat/gbdtclassifier/GbdtClassifier/CacheManager.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include "host/keystash/testing/FaultInjectingKeyValueStore.h"
#include "host/keystash/InMemoryKeyValueStore.h"
#include "xplat/gbdtclassifier/GbdtClassifier/ConversionError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/LogCapture.h"

namespace thornvale {
namespace {

using kestrova::mobile::xplat::keystash::FaultInjectingKeyValueStore;
using kestrova::mobile::xplat::keystash::FutureError;
using kestrova::mobile::xplat::keystash::InMemoryKeyValueStore;
using Failure = FaultInjectingKeyValueStore::Failure;
using ::testing::ElementsAre;
using test::LogCapture;

// Where a message was logged, as "file:line".
std::string where(const LogCapture::Entry& entry) { return entry.file + ":" + std::to_string(entry.line); }

// Said when a log call has moved: the lines are fixed on purpose.
constexpr const char* kFixedLines =
    "The source lines of the log calls in CacheManager.cc (105, 113, 131, 140) are part of its "
    "contract: existing log queries select messages by file and line. Put the edit below line 140, "
    "or keep the number of lines above each log call as it was.";

class CacheManagerTest : public ::testing::Test {
 protected:
  // The cache's store: entries in memory, behind a wrapper that can fail calls.
  std::shared_ptr<InMemoryKeyValueStore> memory = std::make_shared<InMemoryKeyValueStore>();
  std::shared_ptr<FaultInjectingKeyValueStore> store = std::make_shared<FaultInjectingKeyValueStore>(memory);
  CacheManager cache{store, "RELIQA"};
  LogCapture log;
};

TEST_F(CacheManagerTest, EncodesEachTypeUnderThePrefixedKey) {
  EXPECT_EQ(cache.makeKey("server_features"), "RELIQA_server_features");

  cache.store("threshold", 0.5);
  cache.store("one", 1.0);
  cache.store("model", std::string("line1\nline2\0\xff", 13));
  cache.store("server_features", FeatureMap{{4, 9.0}});
  EXPECT_EQ(memory->peek("RELIQA_threshold"), "0.5");
  EXPECT_EQ(memory->peek("RELIQA_one"), "1");
  EXPECT_EQ(memory->peek("RELIQA_model"), std::string("line1\nline2\0\xff", 13));
  EXPECT_EQ(memory->peek("RELIQA_server_features"), "{\"4\":9}");

  EXPECT_EQ(cache.fetch("threshold", 0.0), 0.5);
  EXPECT_EQ(cache.fetch("model", ""), std::string("line1\nline2\0\xff", 13));
  EXPECT_EQ(cache.fetch("server_features", FeatureMap{}), (FeatureMap{{4, 9.0}}));

  // Absent keys give the defaults, silently.
  EXPECT_EQ(cache.fetch("absent", 0.25), 0.25);
  EXPECT_EQ(cache.fetch("absent", "dflt"), "dflt");
  EXPECT_EQ(cache.fetch("absent", FeatureMap{{1, 1.0}}), (FeatureMap{{1, 1.0}}));
  EXPECT_TRUE(log.entries().empty());
}

// A stored map may hold its members in any order, with ids written in more than
// one way: it reads back by the reader's rules and is written back by ascending
// id.
TEST_F(CacheManagerTest, ServerFeaturesOfAnyMemberOrderReadBackAndAreRewrittenInOrder) {
  memory->put("RELIQA_server_features", R"({"1000":1,"4":2,"-3":0.5,"04":9,"71":7,"4":3})");
  const FeatureMap read = cache.fetch("server_features", FeatureMap{});
  EXPECT_EQ(read, (FeatureMap{{-3, 0.5}, {4, 3.0}, {71, 7.0}, {1000, 1.0}}));
  cache.store("server_features", read);
  EXPECT_EQ(memory->peek("RELIQA_server_features"), R"({"-3":0.5,"4":3,"71":7,"1000":1})");
}

TEST_F(CacheManagerTest, UndecodableValuesThrowInsteadOfDefaultingAndLogNothing) {
  memory->put("RELIQA_threshold", "abc");
  EXPECT_THROW(cache.fetch("threshold", 0.0), ConversionError);
  memory->put("RELIQA_threshold", " 0.7\n");
  EXPECT_EQ(cache.fetch("threshold", 0.0), 0.7);
  memory->put("RELIQA_server_features", "[1]");
  EXPECT_THROW(cache.fetch("server_features", FeatureMap{}), JsonTypeError);
  memory->put("RELIQA_server_features", "{\"4\":");
  EXPECT_THROW(cache.fetch("server_features", FeatureMap{}), JsonParseError);
  EXPECT_TRUE(log.entries().empty());
}

TEST_F(CacheManagerTest, NonFiniteNumbersAreRefusedBeforeTheStoreIsCalled) {
  cache.store("threshold", 0.5);
  int stores = store->storeCount();
  EXPECT_THROW(cache.store("threshold", std::nan("")), JsonPrintError);
  EXPECT_THROW(cache.store("server_features", FeatureMap{{1, -std::numeric_limits<double>::infinity()}}),
               JsonPrintError);
  EXPECT_EQ(store->storeCount(), stores);
  EXPECT_EQ(memory->peek("RELIQA_threshold"), "0.5");
}

TEST_F(CacheManagerTest, WithoutAStoreEveryCallLogsAndDefaults) {
  CacheManager detached(nullptr, "RELIQA");
  EXPECT_EQ(detached.fetch("model_id", "none"), "none");
  detached.store("threshold", std::nan(""));  // nothing to store into: not even encoded
  std::vector<LogCapture::Entry> lines = log.entries();
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_EQ(lines[0].severity, google::GLOG_ERROR);
  EXPECT_EQ(lines[0].text, "cache not initiated, tried to fetch: RELIQA_model_id");
  EXPECT_EQ(where(lines[0]), "CacheManager.cc:105") << kFixedLines;
  EXPECT_EQ(lines[1].severity, google::GLOG_ERROR);
  EXPECT_EQ(lines[1].text, "cache not initiated, tried to store with key: RELIQA_threshold");
  EXPECT_EQ(where(lines[1]), "CacheManager.cc:131") << kFixedLines;
}

TEST_F(CacheManagerTest, StoreFailuresAreLoggedAndAbsorbedWhereverTheyArise) {
  memory->put("RELIQA_threshold", "0.5");
  for (Failure where : {Failure::kInCall, Failure::kInGet}) {
    store->failFetches(where, std::make_exception_ptr(std::runtime_error("disk gone")));
    store->failStores(where, std::make_exception_ptr(FutureError(FutureError::kNoValueSource)));
    EXPECT_EQ(cache.fetch("threshold", 0.125), 0.125);
    cache.store("threshold", 0.75);
  }
  store->failFetches(Failure::kNone);
  EXPECT_EQ(cache.fetch("threshold", 0.0), 0.5);  // the failed stores changed nothing

  EXPECT_THAT(log.messages(), ElementsAre("error fetching: RELIQA_threshold, exception: disk gone",
                                          "error storing: RELIQA_threshold, exception: Unknown error",
                                          "error fetching: RELIQA_threshold, exception: disk gone",
                                          "error storing: RELIQA_threshold, exception: Unknown error"));
  std::vector<LogCapture::Entry> lines = log.entries();
  EXPECT_EQ(where(lines[0]), "CacheManager.cc:113") << kFixedLines;
  EXPECT_EQ(where(lines[1]), "CacheManager.cc:140") << kFixedLines;
  EXPECT_EQ(lines[0].severity, google::GLOG_ERROR);
}

TEST_F(CacheManagerTest, ExceptionsThatAreNotStdExceptionsPassThrough) {
  store->failFetches(Failure::kInGet, std::make_exception_ptr(42));
  EXPECT_THROW(cache.fetch("threshold", 0.0), int);
  store->failStores(Failure::kInCall, std::make_exception_ptr(7));
  EXPECT_THROW(cache.store("model", "m"), int);
  EXPECT_TRUE(log.entries().empty());
}

}  // namespace
}  // namespace thornvale

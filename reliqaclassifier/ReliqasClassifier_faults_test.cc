// The classifier over the real SQLite store while SQLite's own file operations
// fail: for k = 1, 2, ... the k-th open, read, write, sync or lock of a run
// fails (once, or from then on), until a run passes without any failure. A run
// stores new model parameters and server features over old ones, classifies,
// opens a second classifier over the file and classifies again. At every k:
// nothing escapes the classifier, the database is intact once reopened, every
// entry holds its old value or a value a store call was given (never a torn
// one), and every store reported done is there unless a later store of the
// same entry was tried.
#include <gtest/gtest.h>
#include <sqlite3.h>

#include <cstdio>
#include <cstdlib>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "host/keystash/testing/FaultySqliteVfs.h"
#include "host/keystash/SqliteKeyValueStore.h"
#include "host/keystash/testing/TemporaryDirectory.h"
#include "reliqaclassifier/ReliqasClassifier.h"
#include "reliqaclassifier/testing/TestModels.h"
#include "xplat/gbdtclassifier/GbdtClassifier/testing/LogCapture.h"

namespace kestrova::reliqaclassifier {
namespace {

using kestrova::mobile::xplat::keystash::FaultySqliteVfs;
using kestrova::mobile::xplat::keystash::PersistentKeyValueStore;
using kestrova::mobile::xplat::keystash::SqliteKeyValueStore;
using kestrova::mobile::xplat::keystash::TemporaryDirectory;
namespace FileUtils = kestrova::mobile::xplat::keystash::FileUtils;
using kestrova::mobile::xplat::keystash::Future;
using kestrova::mobile::xplat::keystash::makeFailedFuture;
using kestrova::mobile::xplat::keystash::makeReadyFuture;

// What the store was asked to write, key by key, and which writes it reported
// done: a store in front of the SQLite one that waits for each write.
class Journal final : public PersistentKeyValueStore {
 public:
  struct Writes {
    std::vector<std::string> tried;      // in order
    std::optional<size_t> lastDone;      // index into `tried`
  };

  explicit Journal(std::shared_ptr<PersistentKeyValueStore> store) : store_(std::move(store)) {}

  Future<std::optional<Entry>> fetch(const std::string& key, std::optional<std::string> option) override {
    return store_->fetch(key, std::move(option));
  }

  Future<void> store(const std::string& key, const FileUtils::BinaryData& value,
                     FileUtils::BinaryData&& extra) override {
    Writes& w = writes_[key];
    w.tried.push_back(value.toString());
    try {
      store_->store(key, value, std::move(extra)).get();
    } catch (...) {
      return makeFailedFuture<void>(std::current_exception());
    }
    w.lastDone = w.tried.size() - 1;
    return makeReadyFuture();
  }

  const std::map<std::string, Writes>& writes() const { return writes_; }

 private:
  std::shared_ptr<PersistentKeyValueStore> store_;
  std::map<std::string, Writes> writes_;
};

// Every entry of the database file, read with SQLite directly; fails the test
// unless the integrity check passes.
std::map<std::string, std::string> entriesOf(const std::string& path) {
  std::map<std::string, std::string> out;
  sqlite3* db = nullptr;
  EXPECT_EQ(sqlite3_open_v2(path.c_str(), &db, SQLITE_OPEN_READONLY, nullptr), SQLITE_OK);
  sqlite3_stmt* check = nullptr;
  sqlite3_prepare_v2(db, "PRAGMA integrity_check", -1, &check, nullptr);
  EXPECT_EQ(sqlite3_step(check), SQLITE_ROW);
  EXPECT_STREQ(reinterpret_cast<const char*>(sqlite3_column_text(check, 0)), "ok");
  sqlite3_finalize(check);
  sqlite3_stmt* all = nullptr;
  if (sqlite3_prepare_v2(db, "SELECT key, value FROM entries", -1, &all, nullptr) == SQLITE_OK) {
    while (sqlite3_step(all) == SQLITE_ROW) {
      const char* value = static_cast<const char*>(sqlite3_column_blob(all, 1));
      out[reinterpret_cast<const char*>(sqlite3_column_text(all, 0))] =
          std::string(value ? value : "", static_cast<size_t>(sqlite3_column_bytes(all, 1)));
    }
  }
  sqlite3_finalize(all);
  sqlite3_close(db);
  return out;
}

ReliqaClassifierInput collection() {
  ReliqaClassifierInput in;
  in.collectionID = "c";
  in.assetCounts.videosCount = 3;
  in.assetDetails.resize(2);
  in.assetDetails[0].creationDateSinceEpoch = 1700000000;
  in.assetDetails[1].creationDateSinceEpoch = 1700003600;
  return in;
}

// The state before each run, written without faults.
void writeOldState(const std::string& path) {
  ReliqasClassifier classifier(std::make_shared<SqliteKeyValueStore>(path));
  classifier.setModelParams({test::stumpModel(4, 5.0, -2.0, 2.0), "old", 0.25});
  classifier.setServerFeatures({{4, 1.0}});
}

// One run with the k-th operation failing; true when a failure was injected.
bool runWithFault(FaultySqliteVfs& vfs, uint64_t k, bool sticky, const std::string& path) {
  const std::map<std::string, std::string> before = entriesOf(path);
  auto journal = std::make_shared<Journal>(nullptr);
  vfs.arm(k, sticky);
  const std::string where = "fault at operation " + std::to_string(k) + (sticky ? " and after" : "");
  try {
    auto store = std::make_shared<SqliteKeyValueStore>(path);
    journal = std::make_shared<Journal>(store);
  } catch (const std::runtime_error&) {
    journal.reset();  // the host could not open its store: nothing to run
  }
  if (journal) {
    try {
      ReliqasClassifier classifier(journal);
      classifier.setModelParams({test::stumpModel(4, 5.0, 1.0, -1.0), "new", 0.75});
      classifier.setServerFeatures({{4, 9.0}, {7, 0.5}});
      classifier.classify(collection());
      std::shared_ptr<SqliteKeyValueStore> second;
      try {
        second = std::make_shared<SqliteKeyValueStore>(path);
      } catch (const std::runtime_error&) {
      }
      if (second) {
        ReliqasClassifier again(second);
        again.classify(collection());
      }
    } catch (const std::exception& e) {
      ADD_FAILURE() << where << ": the classifier let through: " << e.what();
    }
  }
  const bool fired = vfs.fired();
  vfs.disarm();

  const std::map<std::string, std::string> after = entriesOf(path);
  for (const auto& [key, value] : after) {
    auto old = before.find(key);
    std::set<std::string> allowed;
    if (old != before.end()) allowed.insert(old->second);
    if (journal && journal->writes().count(key)) {
      const Journal::Writes& w = journal->writes().at(key);
      size_t from = w.lastDone ? *w.lastDone : 0;
      if (w.lastDone) allowed = {};  // the old value was replaced for sure
      for (size_t i = from; i < w.tried.size(); ++i) allowed.insert(w.tried[i]);
    }
    EXPECT_TRUE(allowed.count(value)) << where << ": " << key << " holds a value it was never given";
  }
  for (const auto& [key, value] : before) EXPECT_TRUE(after.count(key)) << where << ": " << key << " was lost";
  if (journal) {
    for (const auto& [key, w] : journal->writes()) {
      EXPECT_TRUE(!w.lastDone || after.count(key)) << where << ": " << key << " was reported stored but is absent";
    }
  }
  return fired;
}

void sweep(bool sticky) {
  thornvale::test::LogCapture quiet;  // the store's failures are logged by the cache
  TemporaryDirectory dir;
  const std::string path = dir.file("store.db");
  writeOldState(path);
  FaultySqliteVfs vfs;
  uint64_t k = 1;
  for (; k < 100000; ++k) {
    if (!runWithFault(vfs, k, sticky, path)) break;
    if (::testing::Test::HasFailure()) return;
  }
  ::testing::Test::RecordProperty(sticky ? "runs_sticky" : "runs_once", static_cast<int>(k));
  std::printf("[ sweep    ] %s: %llu runs, the last without a failure\n", sticky ? "every later operation fails too" : "one operation fails",
              static_cast<unsigned long long>(k));
  EXPECT_LT(k, 100000u) << "the sweep did not end";
}

TEST(SqliteFaultSweep, OneFailingOperation) { sweep(false); }

TEST(SqliteFaultSweep, EveryOperationFailsFromTheKth) { sweep(true); }

}  // namespace
}  // namespace kestrova::reliqaclassifier

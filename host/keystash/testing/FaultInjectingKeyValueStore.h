// FaultInjectingKeyValueStore: wraps any PersistentKeyValueStore and makes
// chosen calls fail, for tests of what sits on top of a store.
//
// failFetches / failStores arm a failure of that kind of call: from the
// `nth` call counted from now (1: the next one) on, each call fails, or only
// that one call with `once`. Where it fails: Failure::kInCall throws from the
// call itself, Failure::kInGet from the returned future's get();
// Failure::kNone disarms. A failing call never reaches the wrapped store, so a
// store that fails changes nothing. Any exception may be injected, also one
// that is not a std::exception; without one it is a std::runtime_error. Calls
// that do not fail go to the wrapped store unchanged. fetchCount / storeCount
// count every call made, failed or not.
//
// Thread-safe: all members may be called from any thread.
#pragma once

#include <cstdint>
#include <exception>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "host/keystash/PersistentKeyValueStore.h"
#include "host/sync/Mutex.h"

namespace kestrova::mobile::xplat::keystash {

class FaultInjectingKeyValueStore final : public PersistentKeyValueStore {
 public:
  enum class Failure { kNone, kInCall, kInGet };

  explicit FaultInjectingKeyValueStore(std::shared_ptr<PersistentKeyValueStore> wrapped);

  Future<std::optional<Entry>> fetch(const std::string& key, std::optional<std::string> option) override;
  Future<void> store(const std::string& key, const FileUtils::BinaryData& value,
                     FileUtils::BinaryData&& extra) override;

  void failFetches(Failure where, std::exception_ptr error = nullptr, uint64_t nth = 1, bool once = false);
  void failStores(Failure where, std::exception_ptr error = nullptr, uint64_t nth = 1, bool once = false);

  uint64_t fetchCount() const;
  uint64_t storeCount() const;

 private:
  struct Plan {
    Failure where = Failure::kNone;
    std::exception_ptr error;
    uint64_t first = 0;  // number of the first call that fails
    bool once = false;
    uint64_t calls = 0;  // calls made so far

    void arm(Failure w, std::exception_ptr e, uint64_t nth, bool onlyOnce, const char* kind);
    // Counts one call; where it fails, if it does.
    Failure next();
  };

  // Counts a call of one kind (fetches_ or stores_); where it fails, and with what.
  std::pair<Failure, std::exception_ptr> nextCall(Plan FaultInjectingKeyValueStore::*kind) EXCLUDES(mutex_);

  const std::shared_ptr<PersistentKeyValueStore> wrapped_;
  mutable sync::Mutex mutex_;
  Plan fetches_ GUARDED_BY(mutex_);
  Plan stores_ GUARDED_BY(mutex_);
};

}  // namespace kestrova::mobile::xplat::keystash

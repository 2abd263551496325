// FakePersistentKeyValueStore: an in-memory PersistentKeyValueStore for tests,
// which can be told to fail.
//
// Without failures it behaves like the real store (last write wins, entries
// returned byte for byte) but keeps nothing beyond its own lifetime. With
// failFetches / failStores every later call of that kind throws the given
// exception, either from the call itself (Failure::kInCall) or from the returned
// future's get() (Failure::kInGet); a store that fails changes nothing. Any
// exception may be injected, also one that is not a std::exception, and also a
// FutureError. peek/put bypass failures and counters.
//
// Thread-safe: all members may be called from any thread.
#pragma once

#include <exception>
#include <map>
#include <mutex>
#include <optional>
#include <string>

#include "host/keystash/PersistentKeyValueStore.h"

namespace kestrova::mobile::xplat::keystash {

class FakePersistentKeyValueStore : public PersistentKeyValueStore {
 public:
  enum class Failure { kNone, kInCall, kInGet };

  FakePersistentKeyValueStore() = default;

  Future<std::optional<Entry>> fetch(const std::string& key, std::optional<std::string> option) override;
  Future<void> store(const std::string& key, const FileUtils::BinaryData& value,
                     FileUtils::BinaryData&& extra) override;

  void failFetches(Failure where, std::exception_ptr error = nullptr);
  void failStores(Failure where, std::exception_ptr error = nullptr);

  // The bytes stored under `key`, if any.
  std::optional<std::string> peek(const std::string& key) const;
  void put(const std::string& key, const std::string& bytes);

  int fetchCount() const;
  int storeCount() const;

 private:
  mutable std::mutex mutex_;
  std::map<std::string, Entry> entries_;
  Failure fetchFailure_ = Failure::kNone;
  std::exception_ptr fetchError_;
  Failure storeFailure_ = Failure::kNone;
  std::exception_ptr storeError_;
  int fetchCount_ = 0;
  int storeCount_ = 0;
};

}  // namespace kestrova::mobile::xplat::keystash

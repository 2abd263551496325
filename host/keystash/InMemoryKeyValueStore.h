// InMemoryKeyValueStore: the PersistentKeyValueStore kept in memory only, for
// tests and for hosts without storage. Behaves like the SQLite store (last
// write wins, entries returned byte for byte, futures complete before the call
// returns) and never fails, but keeps nothing beyond its own lifetime.
// peek and put read and write entries directly, as a test arranging or
// checking the store does.
//
// Thread-safe: all members may be called from any thread.
#pragma once

#include <map>
#include <optional>
#include <string>

#include "host/keystash/PersistentKeyValueStore.h"
#include "host/sync/Mutex.h"

namespace kestrova::mobile::xplat::keystash {

class InMemoryKeyValueStore final : public PersistentKeyValueStore {
 public:
  InMemoryKeyValueStore() = default;

  Future<std::optional<Entry>> fetch(const std::string& key, std::optional<std::string> option) override;
  Future<void> store(const std::string& key, const FileUtils::BinaryData& value,
                     FileUtils::BinaryData&& extra) override;

  // The bytes stored under `key`, if any.
  std::optional<std::string> peek(const std::string& key) const;
  void put(const std::string& key, const std::string& bytes);

 private:
  mutable sync::Mutex mutex_;
  std::map<std::string, Entry> entries_ GUARDED_BY(mutex_);
};

}  // namespace kestrova::mobile::xplat::keystash

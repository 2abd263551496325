// PersistentKeyValueStore: the host application's store of byte values under
// string keys, as the classifier sees it. An interface; its implementations:
//   SqliteKeyValueStore          the real one: an SQLite file that survives
//                                restarts and crashes of the process;
//   InMemoryKeyValueStore        the same behaviour, kept only in memory;
//   FaultInjectingKeyValueStore  wraps any store and fails chosen calls.
//
// Contract of every implementation:
//   - fetch(key, option) yields the entry most recently stored under `key`, or
//     no entry when nothing was stored. `option` is accepted for compatibility
//     and not used; pass std::nullopt.
//   - store(key, value, extra) replaces the entry under `key` with `value` and
//     `extra` (returned as Entry::extra). Once the returned future's get()
//     returns normally, later fetches see the new entry.
//   - Failures arrive as exceptions from the call or from the future's get();
//     a store that fails leaves the entry as it was or replaced whole, never
//     torn. A store used from another shared library than its own (the host's
//     store is) reports them only through the future, which carries them
//     across C++ runtimes (Future.h); SqliteKeyValueStore does.
//   - Any number of threads may call fetch and store at once.
#pragma once

#include <optional>
#include <string>

#include "host/keystash/BinaryData.h"
#include "host/keystash/Future.h"

namespace kestrova::mobile::xplat::keystash {

class PersistentKeyValueStore {
 public:
  struct Entry {
    FileUtils::BinaryData data;  // the bytes stored under the key
    std::string extra;           // the `extra` bytes of the store call
  };

  virtual ~PersistentKeyValueStore() = default;

  virtual Future<std::optional<Entry>> fetch(const std::string& key, std::optional<std::string> option) = 0;

  virtual Future<void> store(const std::string& key, const FileUtils::BinaryData& value,
                             FileUtils::BinaryData&& extra) = 0;

 protected:
  PersistentKeyValueStore() = default;
  PersistentKeyValueStore(const PersistentKeyValueStore&) = delete;
  PersistentKeyValueStore& operator=(const PersistentKeyValueStore&) = delete;
};

}  // namespace kestrova::mobile::xplat::keystash

// PersistentKeyValueStore: byte values under string keys, kept in an SQLite
// database file so that they survive restarts and crashes of the process.
//
// Contract:
//   - fetch(key, option) yields the entry most recently stored under `key` (also
//     by an earlier process, or by another store object over the same file), or
//     no entry when nothing was stored. `option` is accepted for compatibility
//     and not used; pass std::nullopt.
//   - store(key, value, extra) replaces the entry under `key` with `value` and
//     `extra` (returned as Entry::extra). Once the returned future completes
//     normally the write is atomic and durable: a reader never sees a torn value
//     and a crash after completion does not lose it.
//   - Both complete before they return; failures (an unreadable or read-only
//     database, a full disk, a database locked by another process for more than
//     five seconds) arrive as std::runtime_error from the future's get().
//   - Reads are cheap: small entries are kept in memory and served from there
//     until any store object over the file (in any process) begins a write,
//     which it announces through a counter in the file "<databasePath>-changes"
//     before it commits (so also a writer killed right after its commit has
//     announced it). Write the database only through this class, and keep the
//     two files together, or other live stores may go on serving what they had
//     read. A read that has to go to the file waits for a write in progress.
//
// Thread-safety: any number of threads may call fetch and store at once; calls
// on one object are serialised internally. Several objects, also in several
// processes, may use one file.
//
// The constructor creates the file if needed and throws std::runtime_error when
// the database cannot be opened or set up. fetch and store are virtual so that
// tests can substitute a double (see FakePersistentKeyValueStore.h).
#pragma once

#include <memory>
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

  explicit PersistentKeyValueStore(const std::string& databasePath);
  virtual ~PersistentKeyValueStore();

  PersistentKeyValueStore(const PersistentKeyValueStore&) = delete;
  PersistentKeyValueStore& operator=(const PersistentKeyValueStore&) = delete;

  virtual Future<std::optional<Entry>> fetch(const std::string& key, std::optional<std::string> option);

  virtual Future<void> store(const std::string& key, const FileUtils::BinaryData& value,
                             FileUtils::BinaryData&& extra);

 protected:
  // For test doubles that override fetch and store: no database behind it.
  PersistentKeyValueStore();

 private:
  class Database;
  std::unique_ptr<Database> database_;
};

}  // namespace kestrova::mobile::xplat::keystash

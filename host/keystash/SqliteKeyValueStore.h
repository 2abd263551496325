// SqliteKeyValueStore: the PersistentKeyValueStore kept in an SQLite database
// file, so that values survive restarts and crashes of the process.
//
// Beyond the interface's contract:
//   - fetch also sees what an earlier process, or another store object over the
//     same file, stored.
//   - A store whose future completes normally is atomic and durable: a crash
//     after completion does not lose it.
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
// Thread-safety: calls on one object are serialised internally. Several
// objects, also in several processes, may use one file.
//
// The constructor creates the file if needed and throws std::runtime_error when
// the database cannot be opened or set up.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "host/keystash/PersistentKeyValueStore.h"

namespace kestrova::mobile::xplat::keystash {

class SqliteKeyValueStore final : public PersistentKeyValueStore {
 public:
  explicit SqliteKeyValueStore(const std::string& databasePath);
  ~SqliteKeyValueStore() override;

  Future<std::optional<Entry>> fetch(const std::string& key, std::optional<std::string> option) override;
  Future<void> store(const std::string& key, const FileUtils::BinaryData& value,
                     FileUtils::BinaryData&& extra) override;

 private:
  class Database;
  std::unique_ptr<Database> database_;
};

}  // namespace kestrova::mobile::xplat::keystash

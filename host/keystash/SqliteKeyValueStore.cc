#include "host/keystash/SqliteKeyValueStore.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <stdexcept>
#include <unordered_map>
#include <utility>

#include "host/sync/Mutex.h"

namespace kestrova::mobile::xplat::keystash {
namespace {

// A 64-bit counter in a small file beside the database, mapped into memory and
// shared by every store over that database in every process. Every write
// increments it while it holds SQLite's write lock, before it commits, so a
// store can tell without any system call whether the entries it has cached may
// be out of date, and a writer that dies after its commit has already told.
class ChangeCounter {
 public:
  // Null when the counter file cannot be set up; the store then reads the
  // database every time.
  static std::unique_ptr<ChangeCounter> open(const std::string& path) {
    int fd = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
    if (fd < 0) return nullptr;
    struct stat info;
    void* mapping = MAP_FAILED;
    if (fstat(fd, &info) == 0 &&
        (info.st_size >= static_cast<off_t>(sizeof(uint64_t)) || ftruncate(fd, sizeof(uint64_t)) == 0)) {
      mapping = mmap(nullptr, sizeof(uint64_t), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    }
    ::close(fd);
    if (mapping == MAP_FAILED) return nullptr;
    return std::unique_ptr<ChangeCounter>(new ChangeCounter(static_cast<uint64_t*>(mapping)));
  }

  ~ChangeCounter() { munmap(value_, sizeof(uint64_t)); }
  ChangeCounter(const ChangeCounter&) = delete;
  ChangeCounter& operator=(const ChangeCounter&) = delete;

  uint64_t load() const { return __atomic_load_n(value_, __ATOMIC_SEQ_CST); }
  // Returns the value before the increment.
  uint64_t increment() { return __atomic_fetch_add(value_, 1, __ATOMIC_SEQ_CST); }

 private:
  explicit ChangeCounter(uint64_t* value) : value_(value) {}
  uint64_t* value_;
};

// More distinct keys than this and the cache starts over.
constexpr size_t kMaxCachedKeys = 1024;
// Larger values (model texts) are read when asked for, never kept.
constexpr size_t kMaxCachedValueBytes = 64 * 1024;

bool cacheable(const std::optional<PersistentKeyValueStore::Entry>& entry) {
  return !entry || entry->data.size() + entry->extra.size() <= kMaxCachedValueBytes;
}

}  // namespace

// One SQLite connection with its prepared statements, used under `mutex`.
class SqliteKeyValueStore::Database {
 public:
  explicit Database(const std::string& path) : path_(path), counter_(ChangeCounter::open(path + "-changes")) {
    int rc = sqlite3_open_v2(path.c_str(), &db_,
                             SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX, nullptr);
    if (rc != SQLITE_OK) {
      std::string reason = db_ ? sqlite3_errmsg(db_) : sqlite3_errstr(rc);
      sqlite3_close(db_);
      throw std::runtime_error("cannot open key-value store '" + path + "': " + reason);
    }
    try {
      sqlite3_busy_timeout(db_, 5000);
      // WAL with FULL synchronisation: every committed write is on disk when
      // the statement returns, and readers never block the writer.
      execute("PRAGMA journal_mode=WAL");
      execute("PRAGMA synchronous=FULL");
      execute(
          "CREATE TABLE IF NOT EXISTS entries ("
          "key TEXT PRIMARY KEY NOT NULL, value BLOB NOT NULL, extra BLOB NOT NULL) WITHOUT ROWID");
      select_ = prepare("SELECT value, extra FROM entries WHERE key = ?1");
      upsert_ = prepare(
          "INSERT INTO entries(key, value, extra) VALUES(?1, ?2, ?3) "
          "ON CONFLICT(key) DO UPDATE SET value = excluded.value, extra = excluded.extra");
      begin_ = prepare("BEGIN IMMEDIATE");
      commit_ = prepare("COMMIT");
      rollback_ = prepare("ROLLBACK");
    } catch (...) {
      close();
      throw;
    }
  }

  ~Database() { close(); }

  // Served from memory while the counter shows that no write has begun since
  // memory was filled. Memory is filled under SQLite's write lock: no write is
  // then between its announcement and its commit, so the counter read there
  // belongs exactly to the state that is read. Should the lock not be had (a
  // read-only file, a writer holding it too long), the entry is read without
  // being kept.
  std::optional<Entry> fetch(const std::string& key) {
    sync::MutexLock lock(mutex_);
    if (!counter_) return read(key);
    if (counter_->load() != cachedChanges_ || cache_.size() >= kMaxCachedKeys) {
      cache_.clear();
      cachedChanges_ = kNotCached;
    } else {
      auto cached = cache_.find(key);
      if (cached != cache_.end()) return cached->second;
    }
    if (!step(begin_)) return read(key);
    uint64_t changes;
    std::optional<Entry> entry;
    try {
      changes = counter_->load();
      entry = read(key);
    } catch (...) {
      step(rollback_);
      throw;
    }
    step(rollback_);  // nothing was written
    if (changes != cachedChanges_) {
      cache_.clear();
      cachedChanges_ = changes;
    }
    if (cacheable(entry)) cache_.emplace(key, entry);
    return entry;
  }

  // One transaction that announces itself on the counter before it commits.
  // When nobody else wrote since memory was filled, memory stays valid with
  // this entry replaced.
  void store(const std::string& key, const FileUtils::BinaryData& value, const FileUtils::BinaryData& extra) {
    sync::MutexLock lock(mutex_);
    if (!counter_) {
      write(key, value, extra);
      return;
    }
    if (!step(begin_)) fail("store", key);
    uint64_t before;
    try {
      write(key, value, extra);
      before = counter_->increment();
      if (!step(commit_)) fail("store", key);
    } catch (...) {
      step(rollback_);
      cache_.clear();
      cachedChanges_ = kNotCached;
      throw;
    }
    if (before != cachedChanges_) {
      cache_.clear();
      cachedChanges_ = kNotCached;
      return;
    }
    cachedChanges_ = before + 1;
    std::optional<Entry> entry = Entry{value, extra.toString()};
    if (cacheable(entry)) {
      cache_[key] = std::move(entry);
    } else {
      cache_.erase(key);
    }
  }

 private:
  std::optional<Entry> read(const std::string& key) REQUIRES(mutex_) {
    Reset reset{select_};
    bindText(select_, 1, key);
    int rc = sqlite3_step(select_);
    if (rc == SQLITE_DONE) return std::nullopt;
    if (rc != SQLITE_ROW) fail("fetch", key);
    Entry entry;
    entry.data = FileUtils::BinaryData(sqlite3_column_blob(select_, 0),
                                       static_cast<size_t>(sqlite3_column_bytes(select_, 0)));
    auto extra = static_cast<const char*>(sqlite3_column_blob(select_, 1));
    entry.extra.assign(extra ? extra : "", static_cast<size_t>(sqlite3_column_bytes(select_, 1)));
    return entry;
  }

  void write(const std::string& key, const FileUtils::BinaryData& value, const FileUtils::BinaryData& extra)
      REQUIRES(mutex_) {
    Reset reset{upsert_};
    bindText(upsert_, 1, key);
    bindBlob(upsert_, 2, value);
    bindBlob(upsert_, 3, extra);
    if (sqlite3_step(upsert_) != SQLITE_DONE) fail("store", key);
  }

  // Runs a statement without result rows; false when SQLite refused it.
  bool step(sqlite3_stmt* statement) REQUIRES(mutex_) {
    Reset reset{statement};
    return sqlite3_step(statement) == SQLITE_DONE;
  }

  // Leaves a statement ready for its next use, whatever happened.
  struct Reset {
    sqlite3_stmt* statement;
    ~Reset() {
      sqlite3_reset(statement);
      sqlite3_clear_bindings(statement);
    }
  };

  void execute(const char* sql) {
    char* message = nullptr;
    if (sqlite3_exec(db_, sql, nullptr, nullptr, &message) != SQLITE_OK) {
      std::string reason = message ? message : sqlite3_errmsg(db_);
      sqlite3_free(message);
      throw std::runtime_error("cannot set up key-value store '" + path_ + "': " + reason);
    }
  }

  sqlite3_stmt* prepare(const char* sql) {
    sqlite3_stmt* statement = nullptr;
    if (sqlite3_prepare_v3(db_, sql, -1, SQLITE_PREPARE_PERSISTENT, &statement, nullptr) != SQLITE_OK) {
      throw std::runtime_error("cannot set up key-value store '" + path_ + "': " + sqlite3_errmsg(db_));
    }
    return statement;
  }

  void bindText(sqlite3_stmt* statement, int index, const std::string& text) {
    if (sqlite3_bind_text64(statement, index, text.data(), text.size(), SQLITE_STATIC, SQLITE_UTF8) !=
        SQLITE_OK) {
      fail("bind", text);
    }
  }

  // An empty value is bound as a zero-length blob, never as NULL.
  void bindBlob(sqlite3_stmt* statement, int index, const FileUtils::BinaryData& data) {
    int rc = data.empty() ? sqlite3_bind_zeroblob(statement, index, 0)
                          : sqlite3_bind_blob64(statement, index, data.data(), data.size(), SQLITE_STATIC);
    if (rc != SQLITE_OK) fail("bind a value for", "");
  }

  [[noreturn]] void fail(const char* action, const std::string& key) {
    throw std::runtime_error("key-value store '" + path_ + "' cannot " + action + " '" + key +
                             "': " + sqlite3_errmsg(db_));
  }

  void close() {
    sqlite3_finalize(select_);
    sqlite3_finalize(upsert_);
    sqlite3_finalize(begin_);
    sqlite3_finalize(commit_);
    sqlite3_finalize(rollback_);
    sqlite3_close(db_);
    select_ = upsert_ = begin_ = commit_ = rollback_ = nullptr;
    db_ = nullptr;
  }

  std::string path_;
  std::unique_ptr<ChangeCounter> counter_;
  // Guards the memory of entries and, by the REQUIRES of the functions that
  // run statements, the connection (checked by clang's -Wthread-safety).
  sync::Mutex mutex_;
  std::unordered_map<std::string, std::optional<Entry>> cache_ GUARDED_BY(mutex_);
  static constexpr uint64_t kNotCached = UINT64_MAX;
  uint64_t cachedChanges_ GUARDED_BY(mutex_) = kNotCached;  // counter value that cache_ is current for
  sqlite3* db_ = nullptr;
  sqlite3_stmt* select_ = nullptr;
  sqlite3_stmt* upsert_ = nullptr;
  sqlite3_stmt* begin_ = nullptr;
  sqlite3_stmt* commit_ = nullptr;
  sqlite3_stmt* rollback_ = nullptr;
};

SqliteKeyValueStore::SqliteKeyValueStore(const std::string& databasePath)
    : database_(std::make_unique<Database>(databasePath)) {}

SqliteKeyValueStore::~SqliteKeyValueStore() = default;

Future<std::optional<PersistentKeyValueStore::Entry>> SqliteKeyValueStore::fetch(
    const std::string& key, std::optional<std::string> /*option*/) {
  Promise<std::optional<Entry>> promise;
  auto future = promise.getFuture();
  try {
    promise.setValue(database_->fetch(key));
  } catch (...) {
    promise.setException(std::current_exception());
  }
  return future;
}

Future<void> SqliteKeyValueStore::store(const std::string& key, const FileUtils::BinaryData& value,
                                        FileUtils::BinaryData&& extra) {
  Promise<void> promise;
  auto future = promise.getFuture();
  try {
    database_->store(key, value, extra);
    promise.setValue();
  } catch (...) {
    promise.setException(std::current_exception());
  }
  return future;
}

}  // namespace kestrova::mobile::xplat::keystash

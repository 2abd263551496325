#include "host/keystash/PersistentKeyValueStore.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <mutex>
#include <stdexcept>
#include <unordered_map>
#include <utility>

namespace kestrova::mobile::xplat::keystash {
namespace {

// A 64-bit counter in a small file beside the database, mapped into memory and
// shared by every store over that database in every process. Each completed
// write increments it, so a store can tell without any system call whether the
// entries it has cached may be out of date.
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

// One SQLite connection with its two prepared statements, used under `mutex`.
class PersistentKeyValueStore::Database {
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
    } catch (...) {
      close();
      throw;
    }
  }

  ~Database() { close(); }

  // Served from the cache while no write has completed since it was filled
  // (the change counter is read before the database, so a write that lands
  // in between only makes the cache newer than its mark, never older).
  std::optional<Entry> fetch(const std::string& key) {
    std::lock_guard<std::mutex> lock(mutex_);
    if (!counter_) return read(key);
    const uint64_t changes = counter_->load();
    if (changes != cachedChanges_ || cache_.size() >= kMaxCachedKeys) {
      cache_.clear();
      cachedChanges_ = changes;
    }
    auto cached = cache_.find(key);
    if (cached != cache_.end()) return cached->second;
    std::optional<Entry> entry = read(key);
    if (cacheable(entry)) cache_.emplace(key, entry);
    return entry;
  }

  void store(const std::string& key, const FileUtils::BinaryData& value, const FileUtils::BinaryData& extra) {
    std::lock_guard<std::mutex> lock(mutex_);
    write(key, value, extra);
    if (!counter_) return;
    // Committed: announce it. When nobody else wrote since the cache was
    // filled, the cache stays valid with this entry replaced.
    if (counter_->increment() == cachedChanges_) {
      ++cachedChanges_;
      std::optional<Entry> entry = Entry{value, extra.toString()};
      if (cacheable(entry)) {
        cache_[key] = std::move(entry);
      } else {
        cache_.erase(key);
      }
    } else {
      cache_.clear();
    }
  }

 private:
  std::optional<Entry> read(const std::string& key) {
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

  void write(const std::string& key, const FileUtils::BinaryData& value, const FileUtils::BinaryData& extra) {
    Reset reset{upsert_};
    bindText(upsert_, 1, key);
    bindBlob(upsert_, 2, value);
    bindBlob(upsert_, 3, extra);
    if (sqlite3_step(upsert_) != SQLITE_DONE) fail("store", key);
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
    sqlite3_close(db_);
    select_ = upsert_ = nullptr;
    db_ = nullptr;
  }

  std::string path_;
  std::unique_ptr<ChangeCounter> counter_;
  std::mutex mutex_;
  std::unordered_map<std::string, std::optional<Entry>> cache_;
  uint64_t cachedChanges_ = UINT64_MAX;  // counter value that cache_ is current for
  sqlite3* db_ = nullptr;
  sqlite3_stmt* select_ = nullptr;
  sqlite3_stmt* upsert_ = nullptr;
};

PersistentKeyValueStore::PersistentKeyValueStore(const std::string& databasePath)
    : database_(std::make_unique<Database>(databasePath)) {}

PersistentKeyValueStore::PersistentKeyValueStore() = default;

PersistentKeyValueStore::~PersistentKeyValueStore() = default;

Future<std::optional<PersistentKeyValueStore::Entry>> PersistentKeyValueStore::fetch(
    const std::string& key, std::optional<std::string> /*option*/) {
  Promise<std::optional<Entry>> promise;
  auto future = promise.getFuture();
  try {
    if (!database_) throw std::logic_error("key-value store has no database");
    promise.setValue(database_->fetch(key));
  } catch (const std::exception&) {
    promise.setException(std::current_exception());
  }
  return future;
}

Future<void> PersistentKeyValueStore::store(const std::string& key, const FileUtils::BinaryData& value,
                                            FileUtils::BinaryData&& extra) {
  Promise<void> promise;
  auto future = promise.getFuture();
  try {
    if (!database_) throw std::logic_error("key-value store has no database");
    database_->store(key, value, extra);
    promise.setValue();
  } catch (const std::exception&) {
    promise.setException(std::current_exception());
  }
  return future;
}

}  // namespace kestrova::mobile::xplat::keystash

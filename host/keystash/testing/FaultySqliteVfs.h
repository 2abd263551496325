// FaultySqliteVfs: for tests, a VFS shim that makes SQLite's own file
// operations fail. While an object lives it is SQLite's default VFS (it wraps
// the default it replaced), so every database opened meanwhile goes through
// it; the destructor restores the previous default. One at a time.
//
// It counts the operations on those files: opens, reads, writes, syncs and
// locks (file locks and the WAL's shared-memory locks). arm(k, sticky) makes
// the k-th operation counted from then fail, and with `sticky` every later one
// as well, with the error a real failure of that kind gives: an open or a read
// SQLITE_IOERR, a write SQLITE_FULL, a sync SQLITE_IOERR (fsync), a lock
// SQLITE_BUSY. fired() tells whether a failure was injected since arm().
// Its sleeps return at once, so that a busy timeout runs out without delay.
//
// Not thread-safe beyond the atomicity of its counters; meant for one test
// thread.
#pragma once

#include <sqlite3.h>

#include <atomic>
#include <cstdint>

namespace kestrova::mobile::xplat::keystash {

class FaultySqliteVfs {
 public:
  FaultySqliteVfs();
  ~FaultySqliteVfs();
  FaultySqliteVfs(const FaultySqliteVfs&) = delete;
  FaultySqliteVfs& operator=(const FaultySqliteVfs&) = delete;

  void arm(uint64_t k, bool sticky);
  void disarm();
  bool fired() const { return fired_.load(); }
  uint64_t operations() const { return count_.load(); }

  // For the shim's callbacks: whether the next operation fails (counting
  // it), and the VFS that does the real work.
  bool failNext();
  sqlite3_vfs* wrapped() const { return wrapped_; }

 private:
  sqlite3_vfs vfs_{};
  sqlite3_vfs* wrapped_ = nullptr;
  std::atomic<uint64_t> count_{0};
  std::atomic<uint64_t> failAt_{0};  // 0: not armed
  std::atomic<bool> sticky_{false};
  std::atomic<bool> fired_{false};
};

}  // namespace kestrova::mobile::xplat::keystash

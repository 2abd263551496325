#include "host/keystash/testing/FaultySqliteVfs.h"

#include <cstring>
#include <stdexcept>

namespace kestrova::mobile::xplat::keystash {

namespace {

constexpr char kName[] = "reliqa-faulty";

// Our file: the shim's methods, then the wrapped VFS's file right behind.
struct File {
  sqlite3_file base;
  FaultySqliteVfs* shim;
  sqlite3_file* real() { return reinterpret_cast<sqlite3_file*>(this + 1); }
};

File* fileOf(sqlite3_file* f) { return reinterpret_cast<File*>(f); }
FaultySqliteVfs* shimOf(sqlite3_vfs* vfs) { return static_cast<FaultySqliteVfs*>(vfs->pAppData); }
sqlite3_vfs* wrappedOf(sqlite3_vfs* vfs) { return shimOf(vfs)->wrapped(); }

int xClose(sqlite3_file* f) { return fileOf(f)->real()->pMethods->xClose(fileOf(f)->real()); }

int xRead(sqlite3_file* f, void* buf, int amount, sqlite3_int64 offset) {
  if (fileOf(f)->shim->failNext()) return SQLITE_IOERR_READ;
  return fileOf(f)->real()->pMethods->xRead(fileOf(f)->real(), buf, amount, offset);
}

int xWrite(sqlite3_file* f, const void* buf, int amount, sqlite3_int64 offset) {
  if (fileOf(f)->shim->failNext()) return SQLITE_FULL;
  return fileOf(f)->real()->pMethods->xWrite(fileOf(f)->real(), buf, amount, offset);
}

int xTruncate(sqlite3_file* f, sqlite3_int64 size) {
  return fileOf(f)->real()->pMethods->xTruncate(fileOf(f)->real(), size);
}

int xSync(sqlite3_file* f, int flags) {
  if (fileOf(f)->shim->failNext()) return SQLITE_IOERR_FSYNC;
  return fileOf(f)->real()->pMethods->xSync(fileOf(f)->real(), flags);
}

int xFileSize(sqlite3_file* f, sqlite3_int64* size) {
  return fileOf(f)->real()->pMethods->xFileSize(fileOf(f)->real(), size);
}

int xLock(sqlite3_file* f, int level) {
  if (fileOf(f)->shim->failNext()) return SQLITE_BUSY;
  return fileOf(f)->real()->pMethods->xLock(fileOf(f)->real(), level);
}

int xUnlock(sqlite3_file* f, int level) { return fileOf(f)->real()->pMethods->xUnlock(fileOf(f)->real(), level); }

int xCheckReservedLock(sqlite3_file* f, int* out) {
  return fileOf(f)->real()->pMethods->xCheckReservedLock(fileOf(f)->real(), out);
}

int xFileControl(sqlite3_file* f, int op, void* arg) {
  return fileOf(f)->real()->pMethods->xFileControl(fileOf(f)->real(), op, arg);
}

int xSectorSize(sqlite3_file* f) { return fileOf(f)->real()->pMethods->xSectorSize(fileOf(f)->real()); }

int xDeviceCharacteristics(sqlite3_file* f) {
  return fileOf(f)->real()->pMethods->xDeviceCharacteristics(fileOf(f)->real());
}

int xShmMap(sqlite3_file* f, int page, int pageSize, int extend, void volatile** out) {
  return fileOf(f)->real()->pMethods->xShmMap(fileOf(f)->real(), page, pageSize, extend, out);
}

int xShmLock(sqlite3_file* f, int offset, int n, int flags) {
  // Only taking a lock can be refused; releasing one always works.
  if ((flags & SQLITE_SHM_LOCK) != 0 && fileOf(f)->shim->failNext()) return SQLITE_BUSY;
  return fileOf(f)->real()->pMethods->xShmLock(fileOf(f)->real(), offset, n, flags);
}

void xShmBarrier(sqlite3_file* f) { fileOf(f)->real()->pMethods->xShmBarrier(fileOf(f)->real()); }

int xShmUnmap(sqlite3_file* f, int deleteFlag) {
  return fileOf(f)->real()->pMethods->xShmUnmap(fileOf(f)->real(), deleteFlag);
}

// Memory-mapped reads are left to the ordinary read path.
int xFetch(sqlite3_file*, sqlite3_int64, int, void** out) {
  *out = nullptr;
  return SQLITE_OK;
}

int xUnfetch(sqlite3_file*, sqlite3_int64, void*) { return SQLITE_OK; }

const sqlite3_io_methods kMethods = {
    3,          xClose,      xRead,      xWrite,        xTruncate, xSync,      xFileSize,
    xLock,      xUnlock,     xCheckReservedLock,        xFileControl,          xSectorSize,
    xDeviceCharacteristics,  xShmMap,    xShmLock,      xShmBarrier,           xShmUnmap,
    xFetch,     xUnfetch};

int xOpen(sqlite3_vfs* vfs, const char* name, sqlite3_file* f, int flags, int* outFlags) {
  File* file = fileOf(f);
  file->base.pMethods = nullptr;  // until the real open succeeds
  file->shim = shimOf(vfs);
  if (file->shim->failNext()) return SQLITE_IOERR;
  sqlite3_vfs* wrapped = wrappedOf(vfs);
  int rc = wrapped->xOpen(wrapped, name, file->real(), flags, outFlags);
  if (rc == SQLITE_OK && file->real()->pMethods != nullptr) file->base.pMethods = &kMethods;
  return rc;
}

// The rest of the VFS goes to the wrapped one unchanged.
int xDelete(sqlite3_vfs* vfs, const char* name, int syncDir) {
  return wrappedOf(vfs)->xDelete(wrappedOf(vfs), name, syncDir);
}
int xAccess(sqlite3_vfs* vfs, const char* name, int flags, int* out) {
  return wrappedOf(vfs)->xAccess(wrappedOf(vfs), name, flags, out);
}
int xFullPathname(sqlite3_vfs* vfs, const char* name, int n, char* out) {
  return wrappedOf(vfs)->xFullPathname(wrappedOf(vfs), name, n, out);
}
void* xDlOpen(sqlite3_vfs* vfs, const char* name) { return wrappedOf(vfs)->xDlOpen(wrappedOf(vfs), name); }
void xDlError(sqlite3_vfs* vfs, int n, char* out) { wrappedOf(vfs)->xDlError(wrappedOf(vfs), n, out); }
void (*xDlSym(sqlite3_vfs* vfs, void* handle, const char* symbol))(void) {
  return wrappedOf(vfs)->xDlSym(wrappedOf(vfs), handle, symbol);
}
void xDlClose(sqlite3_vfs* vfs, void* handle) { wrappedOf(vfs)->xDlClose(wrappedOf(vfs), handle); }
int xRandomness(sqlite3_vfs* vfs, int n, char* out) { return wrappedOf(vfs)->xRandomness(wrappedOf(vfs), n, out); }
// Time passes at once: a busy timeout waiting for a lock that the shim keeps
// refusing runs out without delaying the test.
int xSleep(sqlite3_vfs*, int micros) { return micros; }
int xCurrentTime(sqlite3_vfs* vfs, double* out) { return wrappedOf(vfs)->xCurrentTime(wrappedOf(vfs), out); }
int xGetLastError(sqlite3_vfs* vfs, int n, char* out) {
  return wrappedOf(vfs)->xGetLastError(wrappedOf(vfs), n, out);
}
int xCurrentTimeInt64(sqlite3_vfs* vfs, sqlite3_int64* out) {
  return wrappedOf(vfs)->xCurrentTimeInt64(wrappedOf(vfs), out);
}

}  // namespace

FaultySqliteVfs::FaultySqliteVfs() : wrapped_(sqlite3_vfs_find(nullptr)) {
  if (wrapped_ == nullptr || wrapped_->iVersion < 2) throw std::runtime_error("no usable default SQLite VFS to wrap");
  vfs_.iVersion = 2;
  vfs_.szOsFile = static_cast<int>(sizeof(File)) + wrapped_->szOsFile;
  vfs_.mxPathname = wrapped_->mxPathname;
  vfs_.zName = kName;
  vfs_.pAppData = this;
  vfs_.xOpen = xOpen;
  vfs_.xDelete = xDelete;
  vfs_.xAccess = xAccess;
  vfs_.xFullPathname = xFullPathname;
  vfs_.xDlOpen = xDlOpen;
  vfs_.xDlError = xDlError;
  vfs_.xDlSym = xDlSym;
  vfs_.xDlClose = xDlClose;
  vfs_.xRandomness = xRandomness;
  vfs_.xSleep = xSleep;
  vfs_.xCurrentTime = xCurrentTime;
  vfs_.xGetLastError = xGetLastError;
  vfs_.xCurrentTimeInt64 = xCurrentTimeInt64;
  if (sqlite3_vfs_register(&vfs_, 1) != SQLITE_OK) throw std::runtime_error("cannot register the faulty SQLite VFS");
}

FaultySqliteVfs::~FaultySqliteVfs() {
  sqlite3_vfs_unregister(&vfs_);
  sqlite3_vfs_register(wrapped_, 1);
}

void FaultySqliteVfs::arm(uint64_t k, bool sticky) {
  fired_ = false;
  sticky_ = sticky;
  count_ = 0;
  failAt_ = k == 0 ? 1 : k;
}

void FaultySqliteVfs::disarm() { failAt_ = 0; }

bool FaultySqliteVfs::failNext() {
  const uint64_t at = failAt_.load();
  const uint64_t n = ++count_;
  if (at == 0 || n < at || (n > at && !sticky_.load())) return false;
  fired_ = true;
  return true;
}

}  // namespace kestrova::mobile::xplat::keystash

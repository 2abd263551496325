// A mutex and its scoped lock that clang's thread-safety analysis understands
// (-Wthread-safety): members declared GUARDED_BY(mutex) may only be touched
// with the mutex held, and functions declared REQUIRES(mutex) only called so.
// The macros expand to nothing for other compilers. Same semantics as
// std::mutex and std::lock_guard; any thread.
#pragma once

#include <mutex>

#if defined(__clang__)
#define RELIQA_THREAD_ANNOTATION(x) __attribute__((x))
#else
#define RELIQA_THREAD_ANNOTATION(x)
#endif

#define CAPABILITY(name) RELIQA_THREAD_ANNOTATION(capability(name))
#define SCOPED_CAPABILITY RELIQA_THREAD_ANNOTATION(scoped_lockable)
#define GUARDED_BY(m) RELIQA_THREAD_ANNOTATION(guarded_by(m))
#define PT_GUARDED_BY(m) RELIQA_THREAD_ANNOTATION(pt_guarded_by(m))
#define REQUIRES(...) RELIQA_THREAD_ANNOTATION(requires_capability(__VA_ARGS__))
#define ACQUIRE(...) RELIQA_THREAD_ANNOTATION(acquire_capability(__VA_ARGS__))
#define RELEASE(...) RELIQA_THREAD_ANNOTATION(release_capability(__VA_ARGS__))
#define EXCLUDES(...) RELIQA_THREAD_ANNOTATION(locks_excluded(__VA_ARGS__))

namespace kestrova::sync {

class CAPABILITY("mutex") Mutex {
 public:
  void lock() ACQUIRE() { mutex_.lock(); }
  void unlock() RELEASE() { mutex_.unlock(); }

 private:
  std::mutex mutex_;
};

// Holds `mutex` from construction to destruction.
class SCOPED_CAPABILITY MutexLock {
 public:
  explicit MutexLock(Mutex& mutex) ACQUIRE(mutex) : mutex_(mutex) { mutex_.lock(); }
  ~MutexLock() RELEASE() { mutex_.unlock(); }
  MutexLock(const MutexLock&) = delete;
  MutexLock& operator=(const MutexLock&) = delete;

 private:
  Mutex& mutex_;
};

}  // namespace kestrova::sync

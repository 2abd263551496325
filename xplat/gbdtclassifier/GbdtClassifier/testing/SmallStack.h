// For tests: a runner for code that must cope with a small thread stack.
// Header-only; not part of the library.
#pragma once

#include <pthread.h>

#include <cstddef>
#include <exception>
#include <functional>
#include <stdexcept>

namespace thornvale::test {

// Runs `body` on a thread whose stack is `stackBytes` long and rethrows what
// it throws; code that recursed per tree level would overflow such a stack.
inline void runOnSmallStack(const std::function<void()>& body, size_t stackBytes = 256 * 1024) {
  struct Job {
    const std::function<void()>* body;
    std::exception_ptr error;
  } job{&body, nullptr};
  pthread_attr_t attr;
  pthread_attr_init(&attr);
  pthread_attr_setstacksize(&attr, stackBytes);
  pthread_t thread;
  const int rc = pthread_create(
      &thread, &attr,
      [](void* arg) -> void* {
        auto* j = static_cast<Job*>(arg);
        try {
          (*j->body)();
        } catch (...) {
          j->error = std::current_exception();
        }
        return nullptr;
      },
      &job);
  pthread_attr_destroy(&attr);
  if (rc != 0) throw std::runtime_error("cannot start a thread");
  pthread_join(thread, nullptr);
  if (job.error) std::rethrow_exception(job.error);
}

}  // namespace thornvale::test

// Future<T> and Promise<T>: a single-use result handed from a producer to a
// consumer, possibly on another thread. T may be void.
//
// The consumer either calls get() once, which blocks until the result is there,
// returns the value or rethrows the producer's exception, and leaves the handle
// invalid; or it calls setCallback() once, which runs the callback with a ready
// Future holding the result (at once if the result is there, else on the
// producer's thread when it sets the result). Misuse throws FutureError (codes
// in FutureError.h). A Promise destroyed without a result makes get() throw
// FutureError 4 instead of blocking forever.
//
// Producer and consumer may live in different shared libraries, each with its
// own copy of the C++ runtime (see host/jni/Api.h), where the producer's
// exception could only be caught by catch (...). So get() rethrows the
// producer's very exception only when both share a runtime; otherwise it
// throws a copy made by the consumer's runtime: a FutureError with the same
// code, a std::bad_alloc, or a std::runtime_error with the same what() for any
// other std::exception. An exception that is no std::exception is rethrown as
// it is.
//
// Both handles are movable, not copyable. One Future or Promise handle must not
// be used by two threads at once; the producer and the consumer may run on
// different threads.
#pragma once

#include <condition_variable>
#include <exception>
#include <functional>
#include <memory>
#include <mutex>
#include <new>
#include <optional>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <typeinfo>
#include <utility>
#include <variant>

#include "host/keystash/FutureError.h"

namespace kestrova::mobile::xplat::keystash {

template <typename T>
class Future;

namespace detail {

template <typename T>
using StoredValue = std::conditional_t<std::is_void_v<T>, std::monostate, T>;

// The copy of the C++ runtime that compiled the calling code. Each copy
// defines the type information of std::exception once, so its address tells
// copies apart, and code that shares a copy sees the same address.
inline const void* runtimeIdentity() noexcept { return &typeid(std::exception); }

// A producer's exception, as thrown and as another runtime can make it anew.
struct Failure {
  enum class Kind { kFutureError, kBadAlloc, kStdException, kOther };

  std::exception_ptr error;  // null: no failure
  const void* runtime = nullptr;
  Kind kind = Kind::kOther;
  int futureErrorCode = 0;
  std::string what;

  explicit operator bool() const noexcept { return error != nullptr; }

  // Runs in the producer's runtime, which can still tell the types apart.
  static Failure of(std::exception_ptr error) {
    Failure failure;
    if (!error) return failure;
    failure.error = error;
    failure.runtime = runtimeIdentity();
    try {
      std::rethrow_exception(error);
    } catch (const FutureError& e) {
      failure.kind = Kind::kFutureError;
      failure.futureErrorCode = e.code();
    } catch (const std::bad_alloc&) {
      failure.kind = Kind::kBadAlloc;
    } catch (const std::exception& e) {
      failure.kind = Kind::kStdException;
      failure.what = e.what();
    } catch (...) {
      failure.kind = Kind::kOther;
    }
    return failure;
  }

  // Runs in the consumer's runtime.
  [[noreturn]] void rethrow() const {
    if (runtime == runtimeIdentity() || kind == Kind::kOther) std::rethrow_exception(error);
    switch (kind) {
      case Kind::kFutureError: throw FutureError(futureErrorCode);
      case Kind::kBadAlloc: throw std::bad_alloc();
      default: throw std::runtime_error(what);
    }
  }
};

template <typename T>
struct SharedState {
  std::mutex mutex;
  std::condition_variable ready;
  bool done = false;  // a value, an exception or abandonment is in
  std::optional<StoredValue<T>> value;
  Failure error;
  bool hasCallback = false;
  std::function<void(Future<T>)> callback;
};

}  // namespace detail

template <typename T>
class Future {
 public:
  using Callback = std::function<void(Future<T>)>;

  Future() noexcept = default;  // invalid: get() throws FutureError 1
  Future(Future&&) noexcept = default;
  Future& operator=(Future&&) noexcept = default;
  Future(const Future&) = delete;
  Future& operator=(const Future&) = delete;

  bool valid() const noexcept { return state_ != nullptr; }

  // True when get() would not block.
  bool isReady() const {
    if (!state_) throw FutureError(FutureError::kInvalidState);
    std::lock_guard<std::mutex> lock(state_->mutex);
    return state_->done;
  }

  T get() {
    if (!state_) throw FutureError(FutureError::kInvalidState);
    std::shared_ptr<detail::SharedState<T>> state = state_;  // outlives the lock below
    {
      std::unique_lock<std::mutex> lock(state->mutex);
      if (state->hasCallback) throw FutureError(FutureError::kCallbackIsSet);
      state->ready.wait(lock, [&state] { return state->done; });
    }
    state_.reset();  // single use
    // The result is complete and nobody writes it any more.
    if (state->error) state->error.rethrow();
    if (!state->value) throw FutureError(FutureError::kNoValueSource);
    if constexpr (std::is_void_v<T>) {
      return;
    } else {
      return std::move(*state->value);
    }
  }

  void setCallback(Callback callback) {
    if (!state_) throw FutureError(FutureError::kInvalidState);
    std::unique_lock<std::mutex> lock(state_->mutex);
    if (state_->hasCallback) throw FutureError(FutureError::kCallbackAlreadySet);
    state_->hasCallback = true;
    if (!state_->done) {
      state_->callback = std::move(callback);
      return;
    }
    Future<T> ready = takeResult(*state_);
    lock.unlock();
    callback(std::move(ready));
  }

 private:
  template <typename U>
  friend class Promise;

  explicit Future(std::shared_ptr<detail::SharedState<T>> state) : state_(std::move(state)) {}

  // Moves the finished result of `state` into a new ready Future.
  static Future<T> takeResult(detail::SharedState<T>& state) {
    auto result = std::make_shared<detail::SharedState<T>>();
    result->done = true;
    result->value = std::move(state.value);
    result->error = state.error;
    state.value.reset();
    return Future<T>(std::move(result));
  }

  std::shared_ptr<detail::SharedState<T>> state_;
};

template <typename T>
class Promise {
 public:
  Promise() : state_(std::make_shared<detail::SharedState<T>>()) {}
  Promise(Promise&&) noexcept = default;
  Promise& operator=(Promise&& other) noexcept {
    if (this != &other) {
      abandon();
      state_ = std::move(other.state_);
      futureTaken_ = other.futureTaken_;
    }
    return *this;
  }
  Promise(const Promise&) = delete;
  Promise& operator=(const Promise&) = delete;
  ~Promise() { abandon(); }

  // May be called once.
  Future<T> getFuture() {
    if (!state_ || futureTaken_) throw std::logic_error("Promise::getFuture called twice");
    futureTaken_ = true;
    return Future<T>(state_);
  }

  template <typename U = T, typename = std::enable_if_t<!std::is_void_v<U>>>
  void setValue(U value) {
    finish([&](detail::SharedState<T>& state) { state.value.emplace(std::move(value)); });
  }

  template <typename U = T, typename = std::enable_if_t<std::is_void_v<U>>>
  void setValue() {
    finish([](detail::SharedState<T>& state) { state.value.emplace(); });
  }

  void setException(std::exception_ptr error) {
    detail::Failure failure = detail::Failure::of(std::move(error));
    finish([&](detail::SharedState<T>& state) { state.error = std::move(failure); });
  }

 private:
  template <typename Fill>
  void finish(Fill fill) {
    if (!state_) throw std::logic_error("Promise has no shared state");
    std::unique_lock<std::mutex> lock(state_->mutex);
    if (state_->done) throw std::logic_error("Promise already satisfied");
    fill(*state_);
    state_->done = true;
    auto state = std::move(state_);
    if (state->callback) {
      Future<T> ready = Future<T>::takeResult(*state);
      auto callback = std::move(state->callback);
      lock.unlock();
      callback(std::move(ready));
      return;
    }
    lock.unlock();
    state->ready.notify_all();
  }

  // A promise that goes away without a result leaves its future with no value
  // source.
  void abandon() noexcept {
    if (!state_) return;
    auto state = std::move(state_);
    std::unique_lock<std::mutex> lock(state->mutex);
    if (state->done) return;
    state->done = true;
    if (state->callback) {
      Future<T> ready = Future<T>::takeResult(*state);
      auto callback = std::move(state->callback);
      lock.unlock();
      try {
        callback(std::move(ready));
      } catch (...) {
        // A callback that throws while its promise is dropped has nobody to
        // report to.
      }
      return;
    }
    lock.unlock();
    state->ready.notify_all();
  }

  std::shared_ptr<detail::SharedState<T>> state_;
  bool futureTaken_ = false;
};

// A Future that already holds `value` (or, for void, completion).
template <typename T>
Future<T> makeReadyFuture(detail::StoredValue<T> value) {
  Promise<T> promise;
  Future<T> future = promise.getFuture();
  if constexpr (std::is_void_v<T>) {
    promise.setValue();
  } else {
    promise.setValue(std::move(value));
  }
  return future;
}

inline Future<void> makeReadyFuture() { return makeReadyFuture<void>(std::monostate{}); }

// A Future whose get() rethrows `error`.
template <typename T>
Future<T> makeFailedFuture(std::exception_ptr error) {
  Promise<T> promise;
  Future<T> future = promise.getFuture();
  promise.setException(std::move(error));
  return future;
}

}  // namespace kestrova::mobile::xplat::keystash

#include "host/keystash/testing/FaultInjectingKeyValueStore.h"

#include <stdexcept>
#include <utility>

namespace kestrova::mobile::xplat::keystash {

void FaultInjectingKeyValueStore::Plan::arm(Failure w, std::exception_ptr e, uint64_t nth, bool onlyOnce,
                                            const char* kind) {
  where = w;
  error = e ? std::move(e) : std::make_exception_ptr(std::runtime_error(std::string("injected ") + kind + " failure"));
  first = calls + (nth == 0 ? 1 : nth);
  once = onlyOnce;
}

FaultInjectingKeyValueStore::Failure FaultInjectingKeyValueStore::Plan::next() {
  const uint64_t call = ++calls;
  if (where == Failure::kNone || call < first || (once && call > first)) return Failure::kNone;
  return where;
}

std::pair<FaultInjectingKeyValueStore::Failure, std::exception_ptr> FaultInjectingKeyValueStore::nextCall(Plan FaultInjectingKeyValueStore::*kind) {
  sync::MutexLock lock(mutex_);
  Plan& plan = this->*kind;
  const Failure failure = plan.next();
  return {failure, plan.error};
}

FaultInjectingKeyValueStore::FaultInjectingKeyValueStore(std::shared_ptr<PersistentKeyValueStore> wrapped)
    : wrapped_(std::move(wrapped)) {
  if (!wrapped_) throw std::invalid_argument("FaultInjectingKeyValueStore needs a store to wrap");
}

Future<std::optional<PersistentKeyValueStore::Entry>> FaultInjectingKeyValueStore::fetch(
    const std::string& key, std::optional<std::string> option) {
  auto [failure, error] = nextCall(&FaultInjectingKeyValueStore::fetches_);
  if (failure == Failure::kInCall) std::rethrow_exception(error);
  if (failure == Failure::kInGet) return makeFailedFuture<std::optional<Entry>>(error);
  return wrapped_->fetch(key, std::move(option));
}

Future<void> FaultInjectingKeyValueStore::store(const std::string& key, const FileUtils::BinaryData& value,
                                                FileUtils::BinaryData&& extra) {
  auto [failure, error] = nextCall(&FaultInjectingKeyValueStore::stores_);
  if (failure == Failure::kInCall) std::rethrow_exception(error);
  if (failure == Failure::kInGet) return makeFailedFuture<void>(error);
  return wrapped_->store(key, value, std::move(extra));
}

void FaultInjectingKeyValueStore::failFetches(Failure where, std::exception_ptr error, uint64_t nth, bool once) {
  sync::MutexLock lock(mutex_);
  fetches_.arm(where, std::move(error), nth, once, "fetch");
}

void FaultInjectingKeyValueStore::failStores(Failure where, std::exception_ptr error, uint64_t nth, bool once) {
  sync::MutexLock lock(mutex_);
  stores_.arm(where, std::move(error), nth, once, "store");
}

uint64_t FaultInjectingKeyValueStore::fetchCount() const {
  sync::MutexLock lock(mutex_);
  return fetches_.calls;
}

uint64_t FaultInjectingKeyValueStore::storeCount() const {
  sync::MutexLock lock(mutex_);
  return stores_.calls;
}

}  // namespace kestrova::mobile::xplat::keystash

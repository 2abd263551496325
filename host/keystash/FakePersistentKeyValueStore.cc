#include "host/keystash/FakePersistentKeyValueStore.h"

#include <utility>

namespace kestrova::mobile::xplat::keystash {

Future<std::optional<PersistentKeyValueStore::Entry>> FakePersistentKeyValueStore::fetch(
    const std::string& key, std::optional<std::string> /*option*/) {
  std::unique_lock<std::mutex> lock(mutex_);
  ++fetchCount_;
  if (fetchFailure_ == Failure::kInCall) std::rethrow_exception(fetchError_);
  if (fetchFailure_ == Failure::kInGet) return makeFailedFuture<std::optional<Entry>>(fetchError_);
  auto it = entries_.find(key);
  if (it == entries_.end()) return makeReadyFuture<std::optional<Entry>>(std::nullopt);
  return makeReadyFuture<std::optional<Entry>>(it->second);
}

Future<void> FakePersistentKeyValueStore::store(const std::string& key, const FileUtils::BinaryData& value,
                                                FileUtils::BinaryData&& extra) {
  std::unique_lock<std::mutex> lock(mutex_);
  ++storeCount_;
  if (storeFailure_ == Failure::kInCall) std::rethrow_exception(storeError_);
  if (storeFailure_ == Failure::kInGet) return makeFailedFuture<void>(storeError_);
  entries_[key] = Entry{value, extra.toString()};
  return makeReadyFuture();
}

void FakePersistentKeyValueStore::failFetches(Failure where, std::exception_ptr error) {
  std::lock_guard<std::mutex> lock(mutex_);
  fetchFailure_ = where;
  fetchError_ = error ? error : std::make_exception_ptr(std::runtime_error("injected fetch failure"));
}

void FakePersistentKeyValueStore::failStores(Failure where, std::exception_ptr error) {
  std::lock_guard<std::mutex> lock(mutex_);
  storeFailure_ = where;
  storeError_ = error ? error : std::make_exception_ptr(std::runtime_error("injected store failure"));
}

std::optional<std::string> FakePersistentKeyValueStore::peek(const std::string& key) const {
  std::lock_guard<std::mutex> lock(mutex_);
  auto it = entries_.find(key);
  if (it == entries_.end()) return std::nullopt;
  return it->second.data.toString();
}

void FakePersistentKeyValueStore::put(const std::string& key, const std::string& bytes) {
  std::lock_guard<std::mutex> lock(mutex_);
  entries_[key] = Entry{FileUtils::BinaryData(bytes), std::string()};
}

int FakePersistentKeyValueStore::fetchCount() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return fetchCount_;
}

int FakePersistentKeyValueStore::storeCount() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return storeCount_;
}

}  // namespace kestrova::mobile::xplat::keystash

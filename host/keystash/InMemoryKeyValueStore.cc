#include "host/keystash/InMemoryKeyValueStore.h"

namespace kestrova::mobile::xplat::keystash {

Future<std::optional<PersistentKeyValueStore::Entry>> InMemoryKeyValueStore::fetch(
    const std::string& key, std::optional<std::string> /*option*/) {
  sync::MutexLock lock(mutex_);
  auto it = entries_.find(key);
  if (it == entries_.end()) return makeReadyFuture<std::optional<Entry>>(std::nullopt);
  return makeReadyFuture<std::optional<Entry>>(it->second);
}

Future<void> InMemoryKeyValueStore::store(const std::string& key, const FileUtils::BinaryData& value,
                                          FileUtils::BinaryData&& extra) {
  sync::MutexLock lock(mutex_);
  entries_[key] = Entry{value, extra.toString()};
  return makeReadyFuture();
}

std::optional<std::string> InMemoryKeyValueStore::peek(const std::string& key) const {
  sync::MutexLock lock(mutex_);
  auto it = entries_.find(key);
  if (it == entries_.end()) return std::nullopt;
  return it->second.data.toString();
}

void InMemoryKeyValueStore::put(const std::string& key, const std::string& bytes) {
  sync::MutexLock lock(mutex_);
  entries_[key] = Entry{FileUtils::BinaryData(bytes), std::string()};
}

}  // namespace kestrova::mobile::xplat::keystash

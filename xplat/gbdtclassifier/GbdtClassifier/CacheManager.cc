// CacheManager: see CacheManager.h for the contract; this file adds how it is
// kept.
//
// Messages are formatted with "{}" placeholders; they are read
// by people and by log scrapers, so their texts are fixed:
//   "cache not initiated, tried to fetch: {}"          (full key)
//   "error fetching: {}, exception: {}"                (full key, what())
//   "cache not initiated, tried to store with key: {}" (full key)
//   "error storing: {}, exception: {}"                 (full key, what())
// all at ERROR severity. The full key is always the first placeholder, so one
// query finds every message about one entry, whatever went wrong with it.
#include "xplat/gbdtclassifier/GbdtClassifier/CacheManager.h"

#include <fmt/format.h>
#include <glog/logging.h>

#include <exception>
#include <utility>

#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMapJson.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace thornvale {

using kestrova::mobile::xplat::keystash::FileUtils::BinaryData;

CacheManager::CacheManager(std::shared_ptr<PersistentKeyValueStore> store, const std::string& keyPrefix)
    : keyValueStore(std::move(store)), keyPrefix(keyPrefix) {}

// Prefix "RELIQA" and key "threshold" give "RELIQA_threshold".
std::string CacheManager::makeKey(const std::string& key) const {
  return keyPrefix + '_' + key;  // made for every fetch: cheaper than formatting
}

// The bytes exactly as stored; they need not be text.
std::string CacheManager::fetch(const std::string& key, const std::string& defaultValue) const {
  std::optional<std::string> bytes = fetchBytes(key);
  return bytes ? std::move(*bytes) : defaultValue;
}

// A number text, white space around it allowed (" 0.7\n" reads as 0.7); the
// words nan and inf are numbers too. Anything else throws ConversionError,
// even though a default was given: a corrupt entry is not an absent one.
double CacheManager::fetch(const std::string& key, double defaultValue) const {
  std::optional<std::string> bytes = fetchBytes(key);
  return bytes ? textToDouble(*bytes) : defaultValue;
}

// A JSON object of id -> number, its members in any order. An integral value
// is read through a 64-bit integer and must convert to a double exactly;
// FeatureMapJson.h has every rule.
FeatureMap CacheManager::fetch(const std::string& key, const FeatureMap& defaultValue) const {
  std::optional<std::string> bytes = fetchBytes(key);
  return bytes ? featureMapFromJson(*bytes) : defaultValue;
}

// The bytes unchanged, no terminator.
void CacheManager::store(const std::string& key, const std::string& value) const {
  storeEncoded(key, [&value] { return BinaryData(value); });
}

// 0.7 is stored as the three bytes 0.7, 1.0 as the one byte 1.
void CacheManager::store(const std::string& key, double value) const {
  storeEncoded(key, [value] { return BinaryData(doubleToJson(value)); });
}

// {"3":2,"48":0.25}: the same text as the "feature_vector" logging value.
void CacheManager::store(const std::string& key, const FeatureMap& value) const {
  storeEncoded(key, [&value] { return BinaryData(featureMapToJson(value)); });
}

// The two operations below are the only places that talk to the store. Their
// log statements keep fixed positions in this file (fetch: lines 105 and 113;
// store: lines 131 and 140), because every log line carries file and line and
// existing log queries select on them. Keep that in mind when editing above.
//
// What a caller sees, by case:
//
//   case                                   fetch                 store
//   store handle empty                     ERROR log, default    ERROR log, no-op
//   store call or its future throws a      ERROR log, default    ERROR log, no-op
//     std::exception (FutureError too)
//   key absent                             default, no log       -
//   stored bytes cannot be decoded         exception, no log     -
//   value cannot be encoded (NaN, inf)     -                     exception, no log,
//                                                                store not called
//   anything thrown that is not a          passes through        passes through
//     std::exception
//
// The store handle is copied for each call, so a manager keeps working with the
// store it was given even while other owners of the handle go away.
//
// Both operations wait for the store's future at once; the store may complete
// it on another thread, the manager does not care which.

// Returns the bytes under the full key, or nothing when the key is absent or the
// store is missing or failed (which is logged). An absent key is not logged: it
// is the normal state of a fresh store. The bytes are copied out of the entry
// once, into the string that the decoders read.
std::optional<std::string> CacheManager::fetchBytes(const std::string& key) const {
  const std::string fullKey = makeKey(key);
  std::shared_ptr<PersistentKeyValueStore> store = keyValueStore;
  if (!store) {
    LOG(ERROR) << fmt::format("cache not initiated, tried to fetch: {}", fullKey);
    return std::nullopt;
  }
  std::optional<PersistentKeyValueStore::Entry> entry;
  try {
    entry = store->fetch(fullKey, std::nullopt).get();
  } catch (const std::exception& error) {
    // Store failures are absorbed: the caller gets its default value.
    LOG(ERROR) << fmt::format("error fetching: {}, exception: {}", fullKey, error.what());
    return std::nullopt;
  }
  if (!entry) return std::nullopt;
  return entry->data.toString();
}

// Encoding happens after the store handle is checked and before the store is
// called, so that a value that cannot be encoded reaches no store; its error
// leaves the call. Without a store nothing is encoded at all, so even a NaN
// "stored" into a missing store is only logged.
//
// `encode` returns the bytes to store as a BinaryData.
template <typename Encode>
void CacheManager::storeEncoded(const std::string& key, Encode encode) const {
  const std::string fullKey = makeKey(key);
  std::shared_ptr<PersistentKeyValueStore> store = keyValueStore;
  if (!store) {
    LOG(ERROR) << fmt::format("cache not initiated, tried to store with key: {}", fullKey);
    return;
  }
  BinaryData data = encode();
  // The manager keeps no metadata beside a value: `extra` is always empty.
  try {
    store->store(fullKey, data, BinaryData()).get();
  } catch (const std::exception& error) {
    // Store failures are absorbed: the previous entry stays as it was.
    LOG(ERROR) << fmt::format("error storing: {}, exception: {}", fullKey, error.what());
  }
}

}  // namespace thornvale

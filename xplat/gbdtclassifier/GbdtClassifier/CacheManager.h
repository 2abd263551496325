// CacheManager: typed, prefixed, failure-tolerant access to the host's
// persistent key-value store.
//
// Every key is stored as "<keyPrefix>_<key>". Three value types are encoded:
//   std::string  the bytes unchanged;
//   double       the JSON number text ("0.7", "1"); read back as a number text
//                (NumberText.h);
//   FeatureMap   a compact JSON object {"<id>":<number>,...}, members by
//                ascending id (JsonWriter.h), read back as FeatureMapJson.h
//                describes (members in any order).
//
// Failures of the store never leave the cache: a missing store handle or a
// std::exception thrown by the store (or by its future) is logged at ERROR and
// fetch returns the given default, store does nothing. Encoding and decoding
// errors do leave it, unlogged: storing NaN or an infinity throws JsonPrintError
// before the store is called; a stored value that cannot be decoded throws
// ConversionError, JsonParseError or JsonTypeError. Exceptions that are not
// std::exceptions pass through unchanged.
//
// The manager shares the store handle (which may be empty) and never changes its
// members. It takes no lock: the caller serialises its use, or relies on the
// store being thread-safe. Each call blocks until the store's future completes.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "host/keystash/PersistentKeyValueStore.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

namespace thornvale {

using kestrova::mobile::xplat::keystash::PersistentKeyValueStore;

class CacheManager {
 public:
  CacheManager(std::shared_ptr<PersistentKeyValueStore> store, const std::string& keyPrefix);

  std::string makeKey(const std::string& key) const;

  std::string fetch(const std::string& key, const std::string& defaultValue) const;
  double fetch(const std::string& key, double defaultValue) const;
  FeatureMap fetch(const std::string& key, const FeatureMap& defaultValue) const;

  void store(const std::string& key, const std::string& value) const;
  void store(const std::string& key, double value) const;
  void store(const std::string& key, const FeatureMap& value) const;

 private:
  // The stored bytes, or nothing when the key is absent or the store failed.
  std::optional<std::string> fetchBytes(const std::string& key) const;
  template <typename Encode>
  void storeEncoded(const std::string& key, Encode encode) const;

  std::shared_ptr<PersistentKeyValueStore> keyValueStore;
  std::string keyPrefix;
};

}  // namespace thornvale

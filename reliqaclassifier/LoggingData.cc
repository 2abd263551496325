#include "reliqaclassifier/LoggingData.h"

#include <stdexcept>

namespace kestrova::reliqaclassifier {

// A handful of keys: a scan is the cheapest lookup.
const LoggingData::value_type* LoggingData::find(std::string_view key) const {
  for (const value_type& entry : entries_) {
    if (entry.first == key) return &entry;
  }
  return nullptr;
}

bool LoggingData::emplace(std::string key, std::string value) {
  if (find(key) != nullptr) return false;
  entries_.emplace_back(std::move(key), std::move(value));
  return true;
}

const std::string& LoggingData::at(std::string_view key) const {
  const value_type* entry = find(key);
  if (entry == nullptr) throw std::out_of_range("_Map_base::at");
  return entry->second;
}

}  // namespace kestrova::reliqaclassifier

// LoggingData: the logging values of one classification, text under text keys,
// kept in the order in which the keys were added.
//
// The classifier adds "score", "model_id", "feature_vector" and "threshold", in
// that order, and every reader enumerates them in it (the managed side's list
// of keys among them), with every standard library. Adding a key that is
// present changes nothing. Keys match byte for byte.
//
// at() throws std::out_of_range with the message "_Map_base::at" for a key that
// is absent: the message the managed side has always been given for an unknown
// key. A plain value: copies are independent, and concurrent reads are safe.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace kestrova::reliqaclassifier {

class LoggingData {
 public:
  using value_type = std::pair<std::string, std::string>;
  using const_iterator = std::vector<value_type>::const_iterator;

  // Adds `key` with `value` unless `key` is present; returns whether it was added.
  bool emplace(std::string key, std::string value);

  const std::string& at(std::string_view key) const;

  size_t size() const { return entries_.size(); }
  bool empty() const { return entries_.empty(); }
  const_iterator begin() const { return entries_.begin(); }
  const_iterator end() const { return entries_.end(); }

 private:
  const value_type* find(std::string_view key) const;

  std::vector<value_type> entries_;
};

}  // namespace kestrova::reliqaclassifier

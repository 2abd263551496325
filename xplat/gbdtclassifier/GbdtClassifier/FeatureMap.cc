#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

#include <algorithm>
#include <stdexcept>
#include <string>

namespace thornvale {

FeatureMap::FeatureMap(std::initializer_list<value_type> entries) {
  for (const auto& [id, value] : entries) emplace(id, value);
}

size_t FeatureMap::lowerBoundOfOther(int32_t id) const {
  auto found = std::lower_bound(others_.begin(), others_.end(), id,
                                [](const value_type& entry, int32_t wanted) { return entry.first < wanted; });
  return static_cast<size_t>(found - others_.begin());
}

std::pair<FeatureMap::const_iterator, bool> FeatureMap::emplaceOther(int32_t id, double value) {
  const size_t index = lowerBoundOfOther(id);
  if (index < others_.size() && others_[index].first == id) return {const_iterator(this, otherPosition(index)), false};
  others_.insert(others_.begin() + static_cast<std::ptrdiff_t>(index), value_type(id, value));
  if (id < kFirstSlotId) ++othersBelow_;
  ++size_;
  return {const_iterator(this, otherPosition(index)), true};
}

FeatureMap::const_iterator FeatureMap::find(int32_t id) const {
  if (hasSlot(id)) {
    const size_t slot = slotOf(id);
    return present_[slot] ? const_iterator(this, slotPosition(slot)) : end();
  }
  const size_t index = lowerBoundOfOther(id);
  if (index < others_.size() && others_[index].first == id) return const_iterator(this, otherPosition(index));
  return end();
}

bool FeatureMap::contains(int32_t id) const { return find(id) != end(); }

double FeatureMap::at(int32_t id) const {
  const_iterator entry = find(id);
  if (entry == end()) throw std::out_of_range("the feature map holds no feature " + std::to_string(id));
  return entry->second;
}

bool operator==(const FeatureMap& a, const FeatureMap& b) {
  if (a.size_ != b.size_ || a.present_ != b.present_ || a.others_ != b.others_) return false;
  for (size_t slot = 0; slot < FeatureMap::kSlots; ++slot) {
    if (a.present_[slot] && !(a.values_[slot] == b.values_[slot])) return false;
  }
  return true;
}

}  // namespace thornvale

// FeatureMap: feature id (signed 32-bit) to value, iterated by ascending id.
//
// The one currency of the classifier: computed features, server features, the
// merged map that a model scores and the "feature_vector" logging value are all
// FeatureMaps.
//
// Order: iteration visits the ids in ascending order, compared as signed 32-bit
// integers (so -5, 0, 1, ..., 74, 75, 1000), on every platform and with every
// standard library. This is the map's own order, not a sort made by whoever
// writes it out: the "feature_vector" logging value and the stored server
// features list their members in it, and so the same features give the same
// bytes from every build.
//
// Inserting: emplace never overwrites: an id that is present keeps its first
// value (so does the initializer-list constructor for repeated ids).
// insert_or_assign is the one operation that replaces a value.
//
// Layout: ids 1 to 74, those of the computed features, have a slot each with a
// present flag (feature 2 is absent without a location, and a server feature
// may fill any slot); any other id lives in a small vector kept sorted by id.
// Slot ids are found and inserted in constant time without allocating.
//
// Iterators yield std::pair<int32_t, double> by value, for
// `for (const auto& [id, value] : map)`; any insertion invalidates them.
//
// A value type like a standard container: copies are independent, concurrent
// reads of one map are safe, a map that is being changed must not be read.
// Throws std::bad_alloc when an id outside 1 to 74 cannot be stored, and
// std::out_of_range from at() for an absent id.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <iterator>
#include <utility>
#include <vector>

namespace thornvale {

class FeatureMap {
 public:
  using value_type = std::pair<int32_t, double>;
  class const_iterator;
  using iterator = const_iterator;

  // The ids that have a slot of their own: those of the computed features.
  static constexpr int32_t kFirstSlotId = 1;
  static constexpr int32_t kLastSlotId = 74;

  FeatureMap() = default;
  // The entries in list order; a repeated id keeps its first value.
  FeatureMap(std::initializer_list<value_type> entries);

  // Adds `id` with `value` unless `id` is present. Returns the entry of `id`
  // and whether it was added.
  std::pair<const_iterator, bool> emplace(int32_t id, double value);
  // Adds `id` with `value`, or replaces the value that `id` has.
  void insert_or_assign(int32_t id, double value);

  const_iterator find(int32_t id) const;  // end() when absent
  bool contains(int32_t id) const;
  double at(int32_t id) const;  // throws std::out_of_range when absent

  size_t size() const { return size_; }
  bool empty() const { return size_ == 0; }
  const_iterator begin() const;
  const_iterator end() const;

  // Same ids with equal values (so a NaN value makes two maps unequal).
  friend bool operator==(const FeatureMap& a, const FeatureMap& b);
  friend bool operator!=(const FeatureMap& a, const FeatureMap& b) { return !(a == b); }

 private:
  static constexpr size_t kSlots = kLastSlotId - kFirstSlotId + 1;

  static bool hasSlot(int32_t id) { return id >= kFirstSlotId && id <= kLastSlotId; }
  static size_t slotOf(int32_t id) { return static_cast<size_t>(id - kFirstSlotId); }

  // Iteration positions run through others_[0, othersBelow_), then the slots
  // (present or not), then the rest of others_.
  size_t endPosition() const { return others_.size() + kSlots; }
  size_t slotPosition(size_t slot) const { return othersBelow_ + slot; }
  size_t otherPosition(size_t index) const { return index < othersBelow_ ? index : index + kSlots; }
  bool isAbsentSlotAt(size_t position) const {
    const size_t slot = position - othersBelow_;  // wraps to a large value below the slots
    return slot < kSlots && !present_[slot];
  }
  value_type entryAt(size_t position) const {
    if (position < othersBelow_) return others_[position];
    const size_t slot = position - othersBelow_;
    if (slot < kSlots) return {kFirstSlotId + static_cast<int32_t>(slot), values_[slot]};
    return others_[position - kSlots];
  }

  // The index in others_ where `id` is or would be inserted.
  size_t lowerBoundOfOther(int32_t id) const;
  std::pair<const_iterator, bool> emplaceOther(int32_t id, double value);

  std::array<double, kSlots> values_{};
  std::array<bool, kSlots> present_{};
  std::vector<value_type> others_;  // ids outside the slots, ascending
  size_t othersBelow_ = 0;          // how many of others_ lie below the slots
  size_t size_ = 0;
};

class FeatureMap::const_iterator {
 public:
  // Dereferencing gives a value, not a reference, so the iterator is an input
  // iterator to the standard library, although it may be copied and reread.
  using iterator_category = std::input_iterator_tag;
  using value_type = FeatureMap::value_type;
  using difference_type = std::ptrdiff_t;
  using reference = value_type;
  struct pointer {
    value_type entry;
    const value_type* operator->() const { return &entry; }
  };

  const_iterator() = default;

  value_type operator*() const { return map_->entryAt(position_); }
  pointer operator->() const { return pointer{**this}; }
  const_iterator& operator++() {
    ++position_;
    skipAbsentSlots();
    return *this;
  }
  const_iterator operator++(int) {
    const_iterator before = *this;
    ++*this;
    return before;
  }
  friend bool operator==(const const_iterator& a, const const_iterator& b) { return a.position_ == b.position_; }
  friend bool operator!=(const const_iterator& a, const const_iterator& b) { return a.position_ != b.position_; }

 private:
  friend class FeatureMap;
  const_iterator(const FeatureMap* map, size_t position) : map_(map), position_(position) {}
  void skipAbsentSlots() {
    while (map_->isAbsentSlotAt(position_)) ++position_;
  }

  const FeatureMap* map_ = nullptr;
  size_t position_ = 0;
};

inline std::pair<FeatureMap::const_iterator, bool> FeatureMap::emplace(int32_t id, double value) {
  if (!hasSlot(id)) return emplaceOther(id, value);
  const size_t slot = slotOf(id);
  const bool added = !present_[slot];
  if (added) {
    values_[slot] = value;
    present_[slot] = true;
    ++size_;
  }
  return {const_iterator(this, slotPosition(slot)), added};
}

inline void FeatureMap::insert_or_assign(int32_t id, double value) {
  if (emplace(id, value).second) return;
  if (hasSlot(id)) {
    values_[slotOf(id)] = value;
  } else {
    others_[lowerBoundOfOther(id)].second = value;
  }
}

inline FeatureMap::const_iterator FeatureMap::begin() const {
  const_iterator first(this, 0);
  first.skipAbsentSlots();
  return first;
}

inline FeatureMap::const_iterator FeatureMap::end() const { return const_iterator(this, endPosition()); }

}  // namespace thornvale

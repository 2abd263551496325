// ValueList: a list of values written into room that its owner set aside,
// with the running sum of its values.
//
// The lists of a collection's statistics each take at most one value per
// asset (or per duplicate pair), so their owner sets aside the room for all of
// them at once and hands each list its share; push_back past that room is a
// bug of the owner. A list does not own its values: it lives no longer than
// the room it was given. Not thread-safe while being filled.
//
// sum() is the sum of the values as doubles, added in list order starting
// from 0.0: the sum that a pass over the list would give, kept as the values
// come in so that the lists' sums are added side by side while a collection
// is gathered, not one after another afterwards.
#pragma once

#include <cstddef>

namespace kestrova::reliqaclassifier {

template <typename T>
class ValueList {
 public:
  ValueList() = default;
  // An empty list whose values go to `room` onwards.
  explicit ValueList(T* room) : begin_(room), end_(room) {}

  void push_back(T value) {
    *end_++ = value;
    sum_ += static_cast<double>(value);
  }

  const T* begin() const { return begin_; }
  const T* end() const { return end_; }
  size_t size() const { return static_cast<size_t>(end_ - begin_); }
  bool empty() const { return begin_ == end_; }
  double sum() const { return sum_; }

 private:
  T* begin_ = nullptr;
  T* end_ = nullptr;
  double sum_ = 0.0;
};

}  // namespace kestrova::reliqaclassifier

// ValueList: a list of values written into room that its owner set aside.
//
// The lists of a collection's statistics each take at most one value per
// asset (or per duplicate pair), so their owner sets aside the room for all of
// them at once and hands each list its share; push_back past that room is a
// bug of the owner. A list does not own its values: it lives no longer than
// the room it was given. Not thread-safe while being filled.
#pragma once

#include <cstddef>

namespace kestrova::reliqaclassifier {

template <typename T>
class ValueList {
 public:
  ValueList() = default;
  // An empty list whose values go to `room` onwards.
  explicit ValueList(T* room) : begin_(room), end_(room) {}

  void push_back(T value) { *end_++ = value; }

  const T* begin() const { return begin_; }
  const T* end() const { return end_; }
  size_t size() const { return static_cast<size_t>(end_ - begin_); }
  bool empty() const { return begin_ == end_; }

 private:
  T* begin_ = nullptr;
  T* end_ = nullptr;
};

}  // namespace kestrova::reliqaclassifier

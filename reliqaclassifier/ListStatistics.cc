#include "reliqaclassifier/ListStatistics.h"

#include <algorithm>
#include <cmath>
#include <new>
#include <vector>

namespace kestrova::reliqaclassifier {
namespace {

constexpr double kEmpty = -1.0;

// The largest value span whose counters could ever be allocated.
constexpr int64_t kMaxModeSpan = int64_t{1} << 30;

template <typename T>
double meanOf(const ValueList<T>& values) {
  if (values.empty()) return kEmpty;
  return values.sum() / static_cast<double>(values.size());
}

template <typename T>
MeanAndDeviation meanAndDeviationOf(const ValueList<T>& values) {
  if (values.empty()) return {kEmpty, kEmpty};
  const double average = meanOf(values);
  double sumOfSquares = 0.0;
  for (T value : values) {
    const double difference = static_cast<double>(value) - average;
    sumOfSquares += difference * difference;
  }
  return {average, std::sqrt(sumOfSquares / static_cast<double>(values.size()))};
}

template <typename T>
double minimumOf(const ValueList<T>& values) {
  if (values.empty()) return kEmpty;
  return static_cast<double>(*std::min_element(values.begin(), values.end()));
}

template <typename T>
double maximumOf(const ValueList<T>& values) {
  if (values.empty()) return kEmpty;
  return static_cast<double>(*std::max_element(values.begin(), values.end()));
}

// The smallest of the most frequent values, counted in a dense histogram of
// the span [lowest, lowest + span) at `counts` (zeroed).
double denseMode(const ValueList<int32_t>& values, int32_t lowest, size_t span, uint32_t* counts) {
  for (int32_t value : values) ++counts[static_cast<size_t>(int64_t{value} - lowest)];
  size_t best = 0;
  for (size_t i = 1; i < span; ++i) {
    if (counts[i] > counts[best]) best = i;
  }
  return static_cast<double>(int64_t{lowest} + static_cast<int64_t>(best));
}

// The same answer for sparse values, from a sorted copy.
double sortedMode(std::vector<int32_t> values) {
  std::sort(values.begin(), values.end());
  int32_t best = values.front();
  size_t bestCount = 0;
  for (size_t start = 0; start < values.size();) {
    size_t end = start + 1;
    while (end < values.size() && values[end] == values[start]) ++end;
    if (end - start > bestCount) {  // strictly more: ties keep the smaller value
      best = values[start];
      bestCount = end - start;
    }
    start = end;
  }
  return static_cast<double>(best);
}

}  // namespace

double mean(const ValueList<double>& values) { return meanOf(values); }
double mean(const ValueList<int32_t>& values) { return meanOf(values); }
double standardDeviation(const ValueList<double>& values) { return meanAndDeviationOf(values).deviation; }
double standardDeviation(const ValueList<int32_t>& values) { return meanAndDeviationOf(values).deviation; }
MeanAndDeviation meanAndDeviation(const ValueList<double>& values) { return meanAndDeviationOf(values); }
MeanAndDeviation meanAndDeviation(const ValueList<int32_t>& values) { return meanAndDeviationOf(values); }
double minimum(const ValueList<double>& values) { return minimumOf(values); }
double minimum(const ValueList<int32_t>& values) { return minimumOf(values); }
double maximum(const ValueList<double>& values) { return maximumOf(values); }
double maximum(const ValueList<int32_t>& values) { return maximumOf(values); }

double range(const ValueList<double>& values) {
  if (values.empty()) return kEmpty;
  return maximumOf(values) - minimumOf(values);
}

double range(const ValueList<int32_t>& values) {
  if (values.empty()) return kEmpty;
  auto [lowest, highest] = std::minmax_element(values.begin(), values.end());
  return static_cast<double>(int64_t{*highest} - int64_t{*lowest});
}

double mode(const ValueList<int32_t>& values) {
  if (values.empty()) return kEmpty;
  auto [lowest, highest] = std::minmax_element(values.begin(), values.end());
  const int64_t span = int64_t{*highest} - int64_t{*lowest} + 1;
  if (span >= kMaxModeSpan) throw std::bad_alloc();
  // A histogram a few times the list's size is cheapest (on the stack when
  // small: flags, hours and subtype codes); wider spans are sparse, and
  // sorting gives the same answer in memory linear in the list.
  constexpr size_t kStackCounters = 256;
  if (span <= static_cast<int64_t>(kStackCounters)) {
    uint32_t counts[kStackCounters];
    std::fill_n(counts, static_cast<size_t>(span), 0u);
    return denseMode(values, *lowest, static_cast<size_t>(span), counts);
  }
  if (span <= static_cast<int64_t>(4 * values.size() + 1024)) {
    std::vector<uint32_t> counts(static_cast<size_t>(span), 0);
    return denseMode(values, *lowest, counts.size(), counts.data());
  }
  return sortedMode(std::vector<int32_t>(values.begin(), values.end()));
}

}  // namespace kestrova::reliqaclassifier

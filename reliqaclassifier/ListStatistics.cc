#include "reliqaclassifier/ListStatistics.h"

#include <algorithm>
#include <cmath>
#include <new>

namespace kestrova::reliqaclassifier {
namespace {

constexpr double kEmpty = -1.0;

// The largest value span whose counters could ever be allocated.
constexpr int64_t kMaxModeSpan = int64_t{1} << 30;

template <typename T>
double meanOf(const std::vector<T>& values) {
  if (values.empty()) return kEmpty;
  double sum = 0.0;
  for (T value : values) sum += static_cast<double>(value);
  return sum / static_cast<double>(values.size());
}

template <typename T>
double deviationOf(const std::vector<T>& values) {
  if (values.empty()) return kEmpty;
  const double average = meanOf(values);
  double sumOfSquares = 0.0;
  for (T value : values) {
    const double difference = static_cast<double>(value) - average;
    sumOfSquares += difference * difference;
  }
  return std::sqrt(sumOfSquares / static_cast<double>(values.size()));
}

template <typename T>
double minimumOf(const std::vector<T>& values) {
  if (values.empty()) return kEmpty;
  return static_cast<double>(*std::min_element(values.begin(), values.end()));
}

template <typename T>
double maximumOf(const std::vector<T>& values) {
  if (values.empty()) return kEmpty;
  return static_cast<double>(*std::max_element(values.begin(), values.end()));
}

// The smallest of the most frequent values, counted in a dense histogram of
// the span [lowest, lowest + span).
double denseMode(const std::vector<int32_t>& values, int32_t lowest, int64_t span) {
  std::vector<uint32_t> counts(static_cast<size_t>(span), 0);
  for (int32_t value : values) ++counts[static_cast<size_t>(int64_t{value} - lowest)];
  size_t best = 0;
  for (size_t i = 1; i < counts.size(); ++i) {
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

double mean(const std::vector<double>& values) { return meanOf(values); }
double mean(const std::vector<int32_t>& values) { return meanOf(values); }
double standardDeviation(const std::vector<double>& values) { return deviationOf(values); }
double standardDeviation(const std::vector<int32_t>& values) { return deviationOf(values); }
double minimum(const std::vector<double>& values) { return minimumOf(values); }
double minimum(const std::vector<int32_t>& values) { return minimumOf(values); }
double maximum(const std::vector<double>& values) { return maximumOf(values); }
double maximum(const std::vector<int32_t>& values) { return maximumOf(values); }

double range(const std::vector<double>& values) {
  if (values.empty()) return kEmpty;
  return maximumOf(values) - minimumOf(values);
}

double range(const std::vector<int32_t>& values) {
  if (values.empty()) return kEmpty;
  auto [lowest, highest] = std::minmax_element(values.begin(), values.end());
  return static_cast<double>(int64_t{*highest} - int64_t{*lowest});
}

double mode(const std::vector<int32_t>& values) {
  if (values.empty()) return kEmpty;
  auto [lowest, highest] = std::minmax_element(values.begin(), values.end());
  const int64_t span = int64_t{*highest} - int64_t{*lowest} + 1;
  if (span >= kMaxModeSpan) throw std::bad_alloc();
  // A histogram a few times the list's size is cheapest; wider spans are
  // sparse and sorting gives the same answer in memory linear in the list.
  if (span <= static_cast<int64_t>(4 * values.size() + 1024)) return denseMode(values, *lowest, span);
  return sortedMode(values);
}

}  // namespace kestrova::reliqaclassifier

#include "xplat/gbdtclassifier/GbdtClassifier/CompleteTreeWalk.h"

#include <glog/logging.h>

#include <array>
#include <utility>

namespace thornvale {
namespace {

// Lanes walked together: enough independent walks to keep the loads of a
// step in flight, few enough that their positions stay in registers.
constexpr size_t kLanes = 32;
static_assert(kCompleteGroup % kLanes == 0, "a group is a whole number of lane sets");

template <uint32_t kDepth>
void walkDepth(const CompleteSplit* splits, const float* leaves, const float* x, float* out) {
  constexpr size_t kSplits = (size_t{1} << kDepth) - 1;
  constexpr size_t kLeaves = size_t{1} << kDepth;
  for (size_t lane = 0; lane < kCompleteGroup; lane += kLanes) {
    const CompleteSplit* s = splits + lane * kSplits;
    size_t at[kLanes];
#pragma GCC unroll 32
    for (size_t k = 0; k < kLanes; ++k) {
      const CompleteSplit& n = s[k * kSplits];
      at[k] = 1 + static_cast<size_t>(!(x[n.feature] <= n.threshold));
    }
#pragma GCC unroll 10
    for (uint32_t r = 1; r < kDepth; ++r) {
#pragma GCC unroll 32
      for (size_t k = 0; k < kLanes; ++k) {
        const CompleteSplit& n = s[k * kSplits + at[k]];
        at[k] = 2 * at[k] + 1 + static_cast<size_t>(x[n.feature] > n.threshold);
      }
    }
    // at[k] is now a position on the last level, which starts at kSplits.
    const float* l = leaves + lane * kLeaves - kSplits;
#pragma GCC unroll 32
    for (size_t k = 0; k < kLanes; ++k) out[lane + k] = l[k * kLeaves + at[k]];
  }
}

using Walk = void (*)(const CompleteSplit*, const float*, const float*, float*);

template <uint32_t... kDepths>
constexpr std::array<Walk, sizeof...(kDepths)> walkTable(std::integer_sequence<uint32_t, kDepths...>) {
  return {&walkDepth<kDepths + 1>...};
}

}  // namespace

void walkComplete(uint32_t depth, const CompleteSplit* splits, const float* leaves, const float* features,
                  float* out) {
  static constexpr auto kWalks = walkTable(std::make_integer_sequence<uint32_t, kCompleteMaxDepth>());
  CHECK(depth >= 1 && depth <= kCompleteMaxDepth) << "walkComplete: depth " << depth;
  kWalks[depth - 1](splits, leaves, features, out);
}

}  // namespace thornvale

#include "xplat/gbdtclassifier/GbdtClassifier/CompleteTreeWalk.h"

#include <glog/logging.h>


namespace thornvale {
namespace {

// Lanes walked together: enough independent walks to keep the loads of a
// step in flight, few enough that their positions mostly stay in registers.
// Trees deeper than 6 levels rarely fit the caches, and more of their loads
// need to be in flight.
constexpr size_t lanesFor(uint32_t depth) { return depth <= 6 ? 16 : 32; }
static_assert(kCompleteGroup % lanesFor(1) == 0 && kCompleteGroup % lanesFor(kCompleteMaxDepth) == 0,
              "a group is a whole number of lane sets");
static_assert(kCompleteMaxDepth == 10, "walkComplete() has a case for each depth");

// Stores the leaf values in out, or, when kSum, adds them to *sum in order.
// Each depth is a function of its own: inlined into one, the twenty unrolled
// walks took the instrumenting compilers (sanitizers, fuzzing) 5 to 13 minutes
// to build, against 40 seconds apart; the call per group costs nothing
// measurable.
template <uint32_t kDepth, bool kSum>
__attribute__((noinline)) void walkDepth(const CompleteSplit* splits, const float* leaves, const uint32_t* x,
                                         float* out, double* sum) {
  constexpr size_t kSplits = (size_t{1} << kDepth) - 1;
  constexpr size_t kLeaves = size_t{1} << kDepth;
  constexpr size_t kLanes = lanesFor(kDepth);
  for (size_t lane = 0; lane < kCompleteGroup; lane += kLanes) {
    const CompleteSplit* s = splits + lane * kSplits;
    size_t at[kLanes];
#pragma GCC unroll 32
    for (size_t k = 0; k < kLanes; ++k) {
      const CompleteSplit& n = s[k * kSplits];
      at[k] = 1 + static_cast<size_t>(x[n.feature] > n.threshold);
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
    if constexpr (kSum) {
      double total = *sum;
#pragma GCC unroll 32
      for (size_t k = 0; k < kLanes; ++k) total += static_cast<double>(l[k * kLeaves + at[k]]);
      *sum = total;
    } else {
#pragma GCC unroll 32
      for (size_t k = 0; k < kLanes; ++k) out[lane + k] = l[k * kLeaves + at[k]];
    }
  }
}

template <bool kSum>
void walkGroups(const CompleteForest& forest, size_t firstGroup, size_t endGroup, const uint32_t* keys,
                float* out, double* sum) {
  for (size_t g = firstGroup; g < endGroup; ++g) {
    const CompleteSplit* splits = forest.splits.data() + forest.splitStart[g];
    const float* leaves = forest.leaves.data() + forest.leafStart[g];
    float* to = kSum ? nullptr : out + (g - firstGroup) * kCompleteGroup;
    switch (forest.depths[g]) {
      case 1: walkDepth<1, kSum>(splits, leaves, keys, to, sum); break;
      case 2: walkDepth<2, kSum>(splits, leaves, keys, to, sum); break;
      case 3: walkDepth<3, kSum>(splits, leaves, keys, to, sum); break;
      case 4: walkDepth<4, kSum>(splits, leaves, keys, to, sum); break;
      case 5: walkDepth<5, kSum>(splits, leaves, keys, to, sum); break;
      case 6: walkDepth<6, kSum>(splits, leaves, keys, to, sum); break;
      case 7: walkDepth<7, kSum>(splits, leaves, keys, to, sum); break;
      case 8: walkDepth<8, kSum>(splits, leaves, keys, to, sum); break;
      case 9: walkDepth<9, kSum>(splits, leaves, keys, to, sum); break;
      case 10: walkDepth<10, kSum>(splits, leaves, keys, to, sum); break;
      default: LOG(FATAL) << "walkComplete: group " << g << " has depth " << forest.depths[g];
    }
  }
}

}  // namespace

void walkComplete(const CompleteForest& forest, size_t firstGroup, size_t endGroup, const uint32_t* keys,
                  float* out) {
  walkGroups<false>(forest, firstGroup, endGroup, keys, out, nullptr);
}

double sumComplete(const CompleteForest& forest, size_t firstGroup, size_t endGroup, const uint32_t* keys,
                   double sum) {
  walkGroups<true>(forest, firstGroup, endGroup, keys, nullptr, &sum);
  return sum;
}

}  // namespace thornvale

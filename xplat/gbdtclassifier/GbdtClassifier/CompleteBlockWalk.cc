#include "xplat/gbdtclassifier/GbdtClassifier/CompleteBlockWalk.h"

#include <glog/logging.h>

#include <algorithm>

#include "xplat/gbdtclassifier/GbdtClassifier/X86Intrinsics.h"

namespace thornvale {

void completeBlockKeys(const float* const* rows, size_t numRows, size_t slots, uint32_t* keys) {
  uint32_t* nanLanes = keys + slots * kBlockRows;
  std::fill(nanLanes, nanLanes + slots * (kBlockRows / 16), 0u);
  for (size_t r = 0; r < kBlockRows; ++r) {
    const float* x = rows[r < numRows ? r : 0];
    uint32_t* lanes = nanLanes + r / 16;
    const uint32_t bit = uint32_t{1} << (r % 16);
    for (size_t i = 0; i + 1 < slots; ++i) {
      const uint32_t bits = bitsOf(x[i]);
      const uint32_t nan = 0u - static_cast<uint32_t>(isNaNBits(bits));
      keys[i * kBlockRows + r] = completeKeyOfBits(bits) & ~nan;
      lanes[i * (kBlockRows / 16)] |= bit & nan;
    }
    keys[(slots - 1) * kBlockRows + r] = 0;
  }
}

#ifdef RELIQA_X86_INTRINSICS
namespace {

constexpr int kVectors = static_cast<int>(kBlockRows / 16);
constexpr int kRowShift = 6;
// Levels of up to 2^kLoadLevels splits load their splits' keys rather than
// gather them.
constexpr uint32_t kLoadLevels = 3;
static_assert(size_t{1} << kRowShift == kBlockRows, "a slot's keys are kBlockRows apart");
static_assert(kCompleteMaxDepth == 10, "sumTrees() has a case for each depth");

// The feature slots and thresholds of the splits that the lanes stand at,
// `j` being each lane's place on level `kLevel` (splits `s`, 2^kLevel of
// them). Small levels are picked from registers; larger ones are gathered.
template <uint32_t kLevel>
__attribute__((target("avx512f"))) inline void levelSplits(const CompleteSplit* s, const __m512i* j,
                                                           __m512i* feature, __m512i* threshold) {
  constexpr uint32_t kCount = uint32_t{1} << kLevel;
  const __m512i one = _mm512_set1_epi32(1);
  if constexpr (kCount <= 8) {
    const __m512i a = _mm512_maskz_loadu_epi32(static_cast<__mmask16>((1u << (2 * kCount)) - 1), s);
    for (int v = 0; v < kVectors; ++v) {
      const __m512i q = _mm512_add_epi32(j[v], j[v]);
      feature[v] = _mm512_permutexvar_epi32(q, a);
      threshold[v] = _mm512_permutexvar_epi32(_mm512_add_epi32(q, one), a);
    }
  } else if constexpr (kCount == 16) {
    const __m512i a = _mm512_loadu_si512(s);
    const __m512i b = _mm512_loadu_si512(s + 8);
    for (int v = 0; v < kVectors; ++v) {
      const __m512i q = _mm512_add_epi32(j[v], j[v]);
      feature[v] = _mm512_permutex2var_epi32(a, q, b);
      threshold[v] = _mm512_permutex2var_epi32(a, _mm512_add_epi32(q, one), b);
    }
  } else if constexpr (kCount == 32) {
    // The index's low five bits pick within a pair of registers; lanes on
    // the second half take the second pair.
    const __m512i a0 = _mm512_loadu_si512(s), a1 = _mm512_loadu_si512(s + 8);
    const __m512i a2 = _mm512_loadu_si512(s + 16), a3 = _mm512_loadu_si512(s + 24);
    for (int v = 0; v < kVectors; ++v) {
      const __m512i q = _mm512_add_epi32(j[v], j[v]);
      const __m512i q1 = _mm512_add_epi32(q, one);
      const __mmask16 high = _mm512_cmpge_epu32_mask(j[v], _mm512_set1_epi32(16));
      feature[v] = _mm512_mask_mov_epi32(_mm512_permutex2var_epi32(a0, q, a1), high,
                                         _mm512_permutex2var_epi32(a2, q, a3));
      threshold[v] = _mm512_mask_mov_epi32(_mm512_permutex2var_epi32(a0, q1, a1), high,
                                           _mm512_permutex2var_epi32(a2, q1, a3));
    }
  } else {
    const __m512i even = _mm512_setr_epi32(0, 2, 4, 6, 8, 10, 12, 14, 16, 18, 20, 22, 24, 26, 28, 30);
    const __m512i odd = _mm512_setr_epi32(1, 3, 5, 7, 9, 11, 13, 15, 17, 19, 21, 23, 25, 27, 29, 31);
    for (int v = 0; v < kVectors; ++v) {
      const __m512i lo = _mm512_mask_i32gather_epi64(_mm512_setzero_si512(), 0xFF,
                                                     _mm512_castsi512_si256(j[v]), s, 8);
      const __m512i hi = _mm512_mask_i32gather_epi64(_mm512_setzero_si512(), 0xFF,
                                                     _mm512_extracti64x4_epi64(j[v], 1), s, 8);
      feature[v] = _mm512_permutex2var_epi32(lo, even, hi);
      threshold[v] = _mm512_permutex2var_epi32(lo, odd, hi);
    }
  }
}

// One level below the root: each lane compares its row's key of its split's
// feature and moves to its place on the next level.
template <uint32_t kLevel>
__attribute__((target("avx512f"))) inline void levelStep(const CompleteSplit* tree, const uint32_t* keys,
                                                         __m512i* j) {
  __m512i feature[kVectors], threshold[kVectors];
  levelSplits<kLevel>(tree + (size_t{1} << kLevel) - 1, j, feature, threshold);
  const __m512i iota = _mm512_setr_epi32(0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15);
  const CompleteSplit* level = tree + (size_t{1} << kLevel) - 1;
  for (int v = 0; v < kVectors; ++v) {
    __m512i key;
    if constexpr (kLevel <= kLoadLevels) {
      // Few splits: load each one's keys in a row and keep the lanes at it.
      key = _mm512_loadu_si512(keys + (size_t{level[0].feature} << kRowShift) + 16 * v);
      for (uint32_t n = 1; n < (uint32_t{1} << kLevel); ++n) {
        const __mmask16 here = _mm512_cmpeq_epi32_mask(j[v], _mm512_set1_epi32(static_cast<int>(n)));
        key = _mm512_mask_loadu_epi32(key, here, keys + (size_t{level[n].feature} << kRowShift) + 16 * v);
      }
    } else {
      const __m512i lane = _mm512_add_epi32(iota, _mm512_set1_epi32(16 * v));
      const __m512i at = _mm512_add_epi32(_mm512_slli_epi32(feature[v], kRowShift), lane);
      key = _mm512_mask_i32gather_epi32(_mm512_setzero_si512(), 0xFFFF, at, keys, 4);
    }
    const __mmask16 second = _mm512_cmpgt_epu32_mask(key, threshold[v]);
    const __m512i twice = _mm512_add_epi32(j[v], j[v]);
    j[v] = _mm512_mask_add_epi32(twice, second, twice, _mm512_set1_epi32(1));
  }
}

template <uint32_t kDepth, uint32_t kLevel>
__attribute__((target("avx512f"))) inline void levelsFrom(const CompleteSplit* tree, const uint32_t* keys,
                                                          __m512i* j) {
  if constexpr (kLevel < kDepth) {
    levelStep<kLevel>(tree, keys, j);
    levelsFrom<kDepth, kLevel + 1>(tree, keys, j);
  }
}

// Walks `count` consecutive trees of one group, all of depth kDepth, and
// adds their leaves to the sums. One function per depth, as in
// CompleteTreeWalk.cc.
template <uint32_t kDepth>
__attribute__((target("avx512f"), noinline)) void sumTrees(const CompleteSplit* splits, const float* leaves,
                                                          size_t count, size_t slots, const uint32_t* keys,
                                                          double* sums) {
  constexpr size_t kSplits = (size_t{1} << kDepth) - 1;
  constexpr size_t kLeaves = size_t{1} << kDepth;
  __m512d sum[2 * kVectors];
  for (int v = 0; v < 2 * kVectors; ++v) sum[v] = _mm512_loadu_pd(sums + 8 * v);
  for (size_t t = 0; t < count; ++t) {
    const CompleteSplit* s = splits + t * kSplits;
    const float* l = leaves + t * kLeaves;
    // The root: one split for every lane, its keys in a row. A root split
    // names the root key of its feature (slots past the feature's); a NaN
    // feature goes second there (its key is below every threshold key, and a
    // NaN threshold's root key is 0). A tree that is one leaf has a padding
    // root on the NaN slot, whose lanes all go first.
    __m512i j[kVectors];
    const size_t feature = s->feature >= slots ? s->feature - slots : s->feature;
    const uint32_t* rootKeys = keys + (feature << kRowShift);
    const uint32_t* rootNaN = keys + slots * kBlockRows + feature * kVectors;
    const __m512i rootThreshold = _mm512_set1_epi32(static_cast<int>(s->threshold));
    for (int v = 0; v < kVectors; ++v) {
      const __mmask16 above = _mm512_cmpgt_epu32_mask(_mm512_loadu_si512(rootKeys + 16 * v), rootThreshold);
      const __mmask16 second = static_cast<__mmask16>(above | rootNaN[v]);
      j[v] = _mm512_maskz_mov_epi32(second, _mm512_set1_epi32(1));
    }
    levelsFrom<kDepth, 1>(s, keys, j);
    for (int v = 0; v < kVectors; ++v) {
      __m512 value;
      if constexpr (kLeaves <= 16) {
        value = _mm512_permutexvar_ps(j[v], _mm512_maskz_loadu_ps(static_cast<__mmask16>((1u << kLeaves) - 1), l));
      } else if constexpr (kLeaves == 32) {
        value = _mm512_permutex2var_ps(_mm512_loadu_ps(l), j[v], _mm512_loadu_ps(l + 16));
      } else if constexpr (kLeaves == 64) {
        const __mmask16 high = _mm512_cmpge_epu32_mask(j[v], _mm512_set1_epi32(32));
        value = _mm512_mask_mov_ps(_mm512_permutex2var_ps(_mm512_loadu_ps(l), j[v], _mm512_loadu_ps(l + 16)), high,
                                   _mm512_permutex2var_ps(_mm512_loadu_ps(l + 32), j[v], _mm512_loadu_ps(l + 48)));
      } else {
        value = _mm512_mask_i32gather_ps(_mm512_setzero_ps(), 0xFFFF, j[v], l, 4);
      }
      const __m256 lo = _mm512_castps512_ps256(value);
      const __m256 hi = _mm256_castpd_ps(_mm512_extractf64x4_pd(_mm512_castps_pd(value), 1));
      sum[2 * v] = _mm512_add_pd(sum[2 * v], _mm512_cvtps_pd(lo));
      sum[2 * v + 1] = _mm512_add_pd(sum[2 * v + 1], _mm512_cvtps_pd(hi));
    }
  }
  for (int v = 0; v < 2 * kVectors; ++v) _mm512_storeu_pd(sums + 8 * v, sum[v]);
}

}  // namespace

bool completeBlockSupported() { return __builtin_cpu_supports("avx512f"); }

void sumCompleteRows(const CompleteForest& forest, size_t firstTree, size_t endTree, size_t slots,
                     const uint32_t* keys, double* sums) {
  for (size_t i = firstTree; i < endTree;) {
    const size_t g = i / kCompleteGroup;
    const size_t k = i - g * kCompleteGroup;
    const size_t count = std::min(endTree, (g + 1) * kCompleteGroup) - i;
    const uint32_t depth = forest.depths[g];
    const CompleteSplit* splits = forest.splits.data() + forest.splitStart[g] + k * ((size_t{1} << depth) - 1);
    const float* leaves = forest.leaves.data() + forest.leafStart[g] + k * (size_t{1} << depth);
    switch (depth) {
      case 1: sumTrees<1>(splits, leaves, count, slots, keys, sums); break;
      case 2: sumTrees<2>(splits, leaves, count, slots, keys, sums); break;
      case 3: sumTrees<3>(splits, leaves, count, slots, keys, sums); break;
      case 4: sumTrees<4>(splits, leaves, count, slots, keys, sums); break;
      case 5: sumTrees<5>(splits, leaves, count, slots, keys, sums); break;
      case 6: sumTrees<6>(splits, leaves, count, slots, keys, sums); break;
      case 7: sumTrees<7>(splits, leaves, count, slots, keys, sums); break;
      case 8: sumTrees<8>(splits, leaves, count, slots, keys, sums); break;
      case 9: sumTrees<9>(splits, leaves, count, slots, keys, sums); break;
      case 10: sumTrees<10>(splits, leaves, count, slots, keys, sums); break;
      default: LOG(FATAL) << "sumCompleteRows: group " << g << " has depth " << depth;
    }
    i += count;
  }
}

#else

bool completeBlockSupported() { return false; }

void sumCompleteRows(const CompleteForest&, size_t, size_t, size_t, const uint32_t*, double*) {
  LOG(FATAL) << "sumCompleteRows: no vector kernel here";
}

#endif

}  // namespace thornvale

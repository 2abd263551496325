#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsembleSimd.h"

#include <glog/logging.h>

#include "xplat/gbdtclassifier/GbdtClassifier/X86Intrinsics.h"

namespace thornvale {

#ifdef RELIQA_X86_INTRINSICS
namespace {

// Many independent vectors per group keep enough loads in flight to hide
// their latency; each step of a lane depends on the one before.
constexpr int kAvx512Vectors = kWalkGroup / 16;

// The feature values that a step compares: gathered from memory, or, for
// up to 32 * kPairs slots, picked from registers that hold them all.
template <int kPairs>
struct FeaturesAvx512 {
  __m512 table[2 * kPairs > 0 ? 2 * kPairs : 1];
  const float* x;

  __attribute__((target("avx512f"))) explicit FeaturesAvx512(const float* features) : x(features) {
    for (int i = 0; i < 2 * kPairs; ++i) table[i] = _mm512_loadu_ps(features + 16 * i);
  }
  __attribute__((target("avx512f"))) __m512 operator()(__m512i feature) const {
    if constexpr (kPairs == 0) {
      // The masked form with a zero source: the plain one leaves its source
      // undefined, which some compilers warn about.
      return _mm512_mask_i32gather_ps(_mm512_setzero_ps(), 0xFFFF, feature, x, 4);
    } else {
      __m512 v = _mm512_permutex2var_ps(table[0], feature, table[1]);
      for (int p = 1; p < kPairs; ++p) {
        const __mmask16 above = _mm512_cmpge_epu32_mask(feature, _mm512_set1_epi32(32 * p));
        v = _mm512_mask_mov_ps(v, above, _mm512_permutex2var_ps(table[2 * p], feature, table[2 * p + 1]));
      }
      return v;
    }
  }
};

// One step of 16 lanes: gather the 16 nodes (two 64-bit gathers), split them
// into links and thresholds, fetch the features, compare, move on.
// The roots need no gather: they are the given copies, 16 in a row.
template <bool kRoot, typename Features>
__attribute__((target("avx512f"))) inline __m512i stepAvx512(__m512i at, const WalkNode* nodes,
                                                             const WalkNode* roots,
                                                             const Features& x) {
  const __m512i even = _mm512_setr_epi32(0, 2, 4, 6, 8, 10, 12, 14, 16, 18, 20, 22, 24, 26, 28, 30);
  const __m512i odd = _mm512_setr_epi32(1, 3, 5, 7, 9, 11, 13, 15, 17, 19, 21, 23, 25, 27, 29, 31);
  __m512i lo, hi;
  if constexpr (kRoot) {
    lo = _mm512_loadu_si512(roots);
    hi = _mm512_loadu_si512(roots + 8);
  } else {
    lo = _mm512_mask_i32gather_epi64(_mm512_setzero_si512(), 0xFF, _mm512_castsi512_si256(at),
                                     nodes, 8);
    hi = _mm512_mask_i32gather_epi64(_mm512_setzero_si512(), 0xFF,
                                     _mm512_extracti64x4_epi64(at, 1), nodes, 8);
  }
  const __m512i link = _mm512_permutex2var_epi32(lo, even, hi);
  const __m512 threshold = _mm512_castsi512_ps(_mm512_permutex2var_epi32(lo, odd, hi));
  const __m512 value = x(_mm512_and_si512(link, _mm512_set1_epi32(kWalkMaxFeature)));
  // The root sends NaN to the second child, deeper splits to the first.
  const __mmask16 second = kRoot ? _mm512_cmp_ps_mask(value, threshold, _CMP_NLE_UQ)
                                 : _mm512_cmp_ps_mask(value, threshold, _CMP_GT_OQ);
  const __m512i first = _mm512_add_epi32(at, _mm512_srli_epi32(link, kWalkFeatureBits));
  return _mm512_mask_add_epi32(first, second, first, _mm512_set1_epi32(1));
}

template <int kPairs>
__attribute__((target("avx512f"))) void walkAvx512(const WalkNode* nodes, const uint32_t* roots,
                                                  const WalkNode* rootNodes, uint32_t rounds,
                                                  const float* features, float* leaves) {
  const FeaturesAvx512<kPairs> x(features);
  __m512i at[kAvx512Vectors];
#pragma GCC unroll 8
  for (int v = 0; v < kAvx512Vectors; ++v) {
    at[v] = stepAvx512<true>(_mm512_loadu_si512(roots + 16 * v), nodes, rootNodes + 16 * v, x);
  }
  for (uint32_t r = 1; r < rounds; ++r) {
#pragma GCC unroll 8
    for (int v = 0; v < kAvx512Vectors; ++v) at[v] = stepAvx512<false>(at[v], nodes, nullptr, x);
  }
  const float* values = &nodes->value;
#pragma GCC unroll 8
  for (int v = 0; v < kAvx512Vectors; ++v) {
    _mm512_storeu_ps(leaves + 16 * v, _mm512_mask_i32gather_ps(_mm512_setzero_ps(), 0xFFFF,
                                                               at[v], values, 8));
  }
}

}  // namespace
#endif

bool walkKernelSupported(WalkKernel kernel) {
  switch (kernel) {
    case WalkKernel::kPortable:
    case WalkKernel::kScalar:
      return true;
#ifdef RELIQA_X86_INTRINSICS
    case WalkKernel::kAvx512:
      return __builtin_cpu_supports("avx512f");
#endif
    default:
      return false;
  }
}

WalkKernel bestWalkKernel() {
  return walkKernelSupported(WalkKernel::kAvx512) ? WalkKernel::kAvx512 : WalkKernel::kScalar;
}

void walkGroup(WalkKernel kernel, const WalkNode* nodes, const uint32_t* roots,
               const WalkNode* rootNodes, uint32_t rounds, const float* features, size_t slots,
               float* leaves) {
  switch (kernel) {
#ifdef RELIQA_X86_INTRINSICS
    case WalkKernel::kAvx512:
      // Few features are picked from registers rather than gathered.
      switch ((slots + 31) / 32) {
        case 1:
          return walkAvx512<1>(nodes, roots, rootNodes, rounds, features, leaves);
        case 2:
          return walkAvx512<2>(nodes, roots, rootNodes, rounds, features, leaves);
        case 3:
          return walkAvx512<3>(nodes, roots, rootNodes, rounds, features, leaves);
        case 4:
          return walkAvx512<4>(nodes, roots, rootNodes, rounds, features, leaves);
        default:
          return walkAvx512<0>(nodes, roots, rootNodes, rounds, features, leaves);
      }
#endif
    default:
      LOG(FATAL) << "walkGroup: no vector kernel " << static_cast<int>(kernel) << " here";
  }
}

}  // namespace thornvale

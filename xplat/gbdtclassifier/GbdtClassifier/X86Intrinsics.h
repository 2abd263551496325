// The x86-64 vector intrinsics for the AVX-512 walks, where the compiler has
// them: defines RELIQA_X86_INTRINSICS and includes <immintrin.h>. Include it
// from a kernel's .cc file only; elsewhere nothing is defined and the kernels
// fall back to their portable code.
#pragma once

#if defined(__x86_64__) && (defined(__GNUC__) || defined(__clang__))
#define RELIQA_X86_INTRINSICS 1
#if defined(__GNUC__) && !defined(__clang__)
// Some GCC versions warn inside their own AVX-512 intrinsics, whose unused
// pass-through operands are deliberately undefined.
#pragma GCC diagnostic ignored "-Wuninitialized"
#pragma GCC diagnostic ignored "-Wmaybe-uninitialized"
#endif
#include <immintrin.h>
#endif

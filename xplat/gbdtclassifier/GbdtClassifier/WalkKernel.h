// The ways a compiled forest (FastTreeEnsemble-inl.h) can walk its trees, and
// which of them this CPU runs. The kernels themselves live in
// FastTreeEnsembleSimd.h and CompleteTreeWalk.h; every kernel gives the same
// sums, bit for bit. Thread-safe: the functions have no state.
#pragma once

namespace thornvale {

enum class WalkKernel {
  kPortable,  // no copy of the trees: 8 compiled trees in lock step (any CPU)
  kScalar,    // walkComplete() over complete trees (any CPU)
  kAvx512,    // walkGroup() with 16 lanes per vector (x86-64 with AVX-512F)
};

// Whether this CPU (and build) can run `kernel`.
bool walkKernelSupported(WalkKernel kernel);
// The fastest kernel this CPU can run.
WalkKernel bestWalkKernel();

}  // namespace thornvale

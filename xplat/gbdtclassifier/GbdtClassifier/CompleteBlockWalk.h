// The walk of complete trees (CompleteTreeWalk.h) turned around for blocks
// of rows: each tree is walked by kBlockRows rows at once, rows in the
// vector lanes, so that a tree's splits are loaded once per block and the
// rows' walks overlap. Every row adds its leaves in tree order to a double
// sum of its own, so a row gets the same sum, bit for bit, as the walk of
// that row alone.
//
// completeBlockKeys() lays the rows' keys out by slot: keys[s * kBlockRows +
// r] is the key of slot s (the features, then the NaN slot) of row r, as
// completeKeys() gives it below the root. The root keys are not kept: the
// root's feature is the same in every lane, so the kernel loads its keys in
// a row, and adds the lanes whose feature is NaN from one 16-bit mask per
// slot and vector, kept after the keys. sumCompleteRows() walks a run of
// trees that the layout takes.
//
// The kernel needs AVX-512F (x86-64); completeBlockSupported() says whether
// this CPU and build have it. Thread-safe: the functions have no state.
#pragma once

#include <cstddef>
#include <cstdint>

#include "xplat/gbdtclassifier/GbdtClassifier/CompleteTreeWalk.h"

namespace thornvale {

// Rows walked together: four vectors of 16 lanes.
constexpr size_t kBlockRows = 64;

// Whether this CPU (and build) can run sumCompleteRows().
bool completeBlockSupported();

// Words of completeBlockKeys() for `slots` slots.
constexpr size_t completeBlockKeyWords(size_t slots) { return slots * (kBlockRows + kBlockRows / 16); }

// Fills keys[0, completeBlockKeyWords(slots)) with the keys of rows[0,
// numRows) (1 <= numRows <= kBlockRows), each row read at [0, slots - 1); the
// lanes past numRows get the keys of row 0.
void completeBlockKeys(const float* const* rows, size_t numRows, size_t slots, uint32_t* keys);

// Walks trees [firstTree, endTree) of `forest`, every one of them taken by
// the layout for `slots` slots, over the rows whose keys are `keys`, and adds each tree's leaf
// to sums[r] (kBlockRows entries), in tree order. completeBlockSupported()
// must hold.
void sumCompleteRows(const CompleteForest& forest, size_t firstTree, size_t endTree, size_t slots,
                     const uint32_t* keys, double* sums);

}  // namespace thornvale

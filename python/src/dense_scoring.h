// Scoring a dense matrix of feature values with a BoostingModel, exactly as
// the model scores a FeatureMap holding each row's present cells.
//
// Matrix describes the caller's 2-D array without copying it: float or
// double cells, any strides (C or Fortran order, or a slice). `columns[p]` is
// the column that feeds position p of the model's feature vector, or -1 when
// no column does (the position reads 0.0, as an id absent from a map does).
// A cell equal to `missing` (NaN matching NaN; compared in the cell's own
// type, so float cells match the float nearest to `missing`) is absent and
// reads 0.0; with no `missing`, every cell is a value and NaN takes the
// forest's NaN branches. Present cells are converted to float as the map's
// doubles are.
//
// isMissing() is that rule for one cell.
//
// featureVectors() writes `n` rows from `first` on as feature vectors of
// columns.size() floats each, by the same rule.
//
// scoreDense() fills `out[r]` with the raw score (or, with `probability`, its
// logistic) of row r, splitting the rows across `threads` threads (0: one per
// core). The result does not depend on the thread count. Each thread holds
// one block of float vectors; nothing else is copied. Reads the matrix and
// writes `out` only; the caller keeps both alive and unchanged during the
// call, which may run without the Python interpreter's lock. Throws what
// the model throws; a thread's failure is rethrown in the caller, and a
// thread that cannot be started leaves its rows to the caller's thread.
//
// explainDense() does the same for contributions: row r's
// shap.numContributions() contributions and then its bias go to
// out[r * (numContributions() + 1) ...], by the same threads and rules.
#pragma once

#include <cmath>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/TreeShap.h"

namespace reliqa::python {

struct Matrix {
  const char* data = nullptr;
  bool isDouble = false;  // double cells, else float
  size_t rows = 0;
  size_t cols = 0;
  ptrdiff_t rowStride = 0;  // in bytes
  ptrdiff_t colStride = 0;  // in bytes
};

// The columns of a model's feature vector: for each position, the index in
// `columnIds` of the column whose id is featureMapping[p], or -1. A position
// whose id appears again later in featureMapping reads nothing (the model
// reads that id at its last position). Ids are the maps' signed 32-bit ids.
std::vector<int64_t> columnsForModel(const thornvale::BoostingModel& model, const std::vector<int32_t>& columnIds);

template <typename Cell>
bool isMissing(Cell v, std::optional<double> missing) {
  if (!missing) return false;
  return std::isnan(*missing) ? std::isnan(v) : v == static_cast<Cell>(*missing);
}

void featureVectors(const Matrix& x, const std::vector<int64_t>& columns, std::optional<double> missing,
                    size_t first, size_t n, float* out);

void scoreDense(const thornvale::BoostingModel& model, const Matrix& x, const std::vector<int64_t>& columns,
                std::optional<double> missing, bool probability, unsigned threads, double* out);

void explainDense(const thornvale::TreeShap& shap, const Matrix& x, const std::vector<int64_t>& columns,
                  std::optional<double> missing, unsigned threads, double* out);

}  // namespace reliqa::python

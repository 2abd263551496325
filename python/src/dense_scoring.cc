#include "python/src/dense_scoring.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <exception>
#include <stdexcept>
#include <string>
#include <system_error>
#include <thread>
#include <unordered_map>

#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsemble.h"

namespace reliqa::python {

namespace {

// Rows scored together: the block of float vectors stays in the first cache
// levels while the trees walk it.
constexpr size_t kBlockRows = 64;

template <typename Cell>
Cell cellAt(const Matrix& x, size_t r, size_t c) {
  Cell v;
  std::memcpy(&v, x.data + static_cast<ptrdiff_t>(r) * x.rowStride + static_cast<ptrdiff_t>(c) * x.colStride,
              sizeof v);
  return v;
}

// Writes rows [first, first + n) as feature vectors of `length` floats.
template <typename Cell>
void fillBlock(const Matrix& x, const std::vector<int64_t>& columns, std::optional<double> missing, size_t first,
               size_t n, float* block) {
  const size_t length = columns.size();
  for (size_t r = 0; r < n; ++r) {
    float* vector = block + r * length;
    for (size_t p = 0; p < length; ++p) {
      const int64_t c = columns[p];
      if (c < 0) {
        vector[p] = 0.0f;
        continue;
      }
      const Cell v = cellAt<Cell>(x, first + r, static_cast<size_t>(c));
      vector[p] = isMissing(v, missing) ? 0.0f : static_cast<float>(v);
    }
  }
}

void scoreRange(const thornvale::BoostingModel& model, const Matrix& x, const std::vector<int64_t>& columns,
                std::optional<double> missing, bool probability, size_t first, size_t end, double* out) {
  if (model.vectorLength() == 0) {
    model.rawScores(nullptr, end - first, 0, out + first);
  } else {
    const size_t length = columns.size();
    std::vector<float> block(std::min(kBlockRows, end - first) * length);
    for (size_t at = first; at < end; at += kBlockRows) {
      const size_t n = std::min(kBlockRows, end - at);
      featureVectors(x, columns, missing, at, n, block.data());
      model.rawScores(block.data(), n, length, out + at);
    }
  }
  if (probability) {
    for (size_t r = first; r < end; ++r) out[r] = thornvale::logistic(out[r]);
  }
}

}  // namespace

std::vector<int64_t> columnsForModel(const thornvale::BoostingModel& model, const std::vector<int32_t>& columnIds) {
  std::unordered_map<int32_t, int64_t> columnOf;
  for (size_t c = 0; c < columnIds.size(); ++c) {
    const auto [at, inserted] = columnOf.emplace(columnIds[c], static_cast<int64_t>(c));
    if (!inserted) {
      throw std::invalid_argument("feature id " + std::to_string(columnIds[c]) + " names two columns (" +
                                  std::to_string(at->second) + " and " + std::to_string(c) + ")");
    }
  }
  const std::vector<uint32_t>& mapping = model.getForest().featureMapping;
  const auto& lastPosition = model.getFeatureIndex();
  std::vector<int64_t> columns(mapping.size(), -1);
  for (size_t p = 0; p < mapping.size(); ++p) {
    if (lastPosition.at(mapping[p]) != p) continue;
    const auto found = columnOf.find(static_cast<int32_t>(mapping[p]));
    if (found != columnOf.end()) columns[p] = found->second;
  }
  return columns;
}

void featureVectors(const Matrix& x, const std::vector<int64_t>& columns, std::optional<double> missing,
                    size_t first, size_t n, float* out) {
  if (x.isDouble) {
    fillBlock<double>(x, columns, missing, first, n, out);
  } else {
    fillBlock<float>(x, columns, missing, first, n, out);
  }
}

namespace {

// Runs work(first, end) over `rows` rows cut into one range per thread (0:
// one per core), with at least `minRows` rows a thread. The ranges depend
// only on the thread count, and each row's result on nothing but the row.
template <typename Work>
void inThreads(size_t rows, unsigned threads, size_t minRows, const Work& work) {
  // Asking costs a read of /sys each time; the answer does not change.
  static const unsigned cores = std::max(1u, std::thread::hardware_concurrency());
  if (threads == 0) threads = cores;
  const size_t useful = std::max<size_t>(1, rows / minRows);
  const size_t count = std::min<size_t>(threads, useful);
  if (count <= 1) {
    work(0, rows);
    return;
  }
  std::vector<std::exception_ptr> failures(count);
  const auto run = [&](size_t t) {
    try {
      work(rows * t / count, rows * (t + 1) / count);
    } catch (...) {
      failures[t] = std::current_exception();
    }
  };
  std::vector<std::thread> workers;
  workers.reserve(count);
  size_t started = 1;  // range 0 is this thread's
  try {
    for (; started < count; ++started) workers.emplace_back(run, started);
  } catch (const std::system_error&) {
    // No more threads to be had: this one takes the ranges left over.
  }
  run(0);
  for (size_t t = started; t < count; ++t) run(t);
  for (auto& w : workers) w.join();
  for (const auto& f : failures) {
    if (f) std::rethrow_exception(f);
  }
}

// Rows explained per call of explainRows(): a few lanes' worth.
constexpr size_t kExplainRows = 32;

}  // namespace

void scoreDense(const thornvale::BoostingModel& model, const Matrix& x, const std::vector<int64_t>& columns,
                std::optional<double> missing, bool probability, unsigned threads, double* out) {
  // At least a few blocks per thread, or threads cost more than they give.
  inThreads(x.rows, threads, 4 * kBlockRows, [&](size_t first, size_t end) {
    scoreRange(model, x, columns, missing, probability, first, end, out);
  });
}

void explainDense(const thornvale::TreeShap& shap, const Matrix& x, const std::vector<int64_t>& columns,
                  std::optional<double> missing, unsigned threads, double* out) {
  const size_t length = columns.size();
  const size_t width = shap.numContributions() + 1;
  // A row costs far more to explain than to score: threads pay off early.
  inThreads(x.rows, threads, 8, [&](size_t first, size_t end) {
    std::vector<float> block(std::min(kExplainRows, end - first) * length);
    for (size_t at = first; at < end; at += kExplainRows) {
      const size_t n = std::min(kExplainRows, end - at);
      featureVectors(x, columns, missing, at, n, block.data());
      shap.explainRows(block.data(), n, length, out + at * width);
    }
  });
}

}  // namespace reliqa::python

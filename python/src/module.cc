// reliqa._native: the library's model, features and classifier for the
// Python package (python/reliqa/), which gives them their public API.
//
// Every refused input raises ValueError with a message that names what and
// where; nothing here may crash the interpreter. Native work (scoring many
// rows, classifying) runs without the interpreter's lock.
#include <glog/logging.h>
#include <pybind11/numpy.h>
#include <pybind11/pybind11.h>
#include <pybind11/stl.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <optional>
#include <sstream>
#include <stdexcept>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#include "python/src/dense_scoring.h"
#include "tools/common/log_block.h"
#include "reliqaclassifier/FeatureExtraction.h"
#include "reliqaclassifier/ReliqasClassifier.h"
#include "tools/common/classifier_store.h"
#include "tools/common/collection_reader.h"
#include "tools/common/errors.h"
#include "tools/common/feature_rows.h"
#include "tools/common/quiet_stdout.h"
#include "tools/common/xgboost_covers.h"
#include "tools/common/xgboost_model.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/TreeShap.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/tree.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsemble.h"
#include "xplat/gbdtclassifier/GbdtClassifier/WalkKernel.h"

namespace py = pybind11;

namespace reliqa::python {
namespace {

namespace rc = kestrova::reliqaclassifier;
using thornvale::FeatureMap;

// Number of computed features: ids 1 to kFeatureCount.
constexpr int32_t kFeatureCount = 74;

// Model reading prints on standard output; the interpreter's lock keeps
// other Python threads out while it is quieted.
using tool::QuietStdout;

// The walk named `walk` ("" for the best one this CPU runs).
thornvale::WalkKernel walkNamed(const std::string& walk) {
  if (walk.empty()) return thornvale::bestWalkKernel();
  thornvale::WalkKernel kernel;
  if (walk == "portable") {
    kernel = thornvale::WalkKernel::kPortable;
  } else if (walk == "scalar") {
    kernel = thornvale::WalkKernel::kScalar;
  } else if (walk == "avx512") {
    kernel = thornvale::WalkKernel::kAvx512;
  } else {
    throw std::invalid_argument("walk must be 'portable', 'scalar' or 'avx512', got '" + walk + "'");
  }
  if (!thornvale::walkKernelSupported(kernel)) {
    throw std::invalid_argument("this CPU cannot run the " + walk + " walk");
  }
  return kernel;
}

std::unique_ptr<thornvale::BoostingModel> readModel(const std::string& text, const std::string& name,
                                                    const std::string& walk) {
  const thornvale::WalkKernel kernel = walkNamed(walk);
  QuietStdout quiet;
  return tool::loadModel(name, text, kernel);
}

// A Python int or decimal string as a signed 32-bit feature id.
int32_t featureId(const py::handle& key, const std::string& where) {
  if (py::isinstance<py::str>(key)) {
    const std::string s = key.cast<std::string>();
    int32_t id = 0;
    const auto [end, error] = std::from_chars(s.data(), s.data() + s.size(), id);
    if (error == std::errc() && end == s.data() + s.size() && !s.empty()) return id;
    throw std::invalid_argument(where + ": feature id '" + s + "' is not a decimal signed 32-bit integer");
  }
  if (!py::isinstance<py::bool_>(key) && PyIndex_Check(key.ptr())) {
    const auto big = py::int_(py::reinterpret_borrow<py::object>(key));
    const long long v = PyLong_AsLongLong(big.ptr());
    if (v == -1 && PyErr_Occurred()) PyErr_Clear();
    else if (v >= INT32_MIN && v <= INT32_MAX) return static_cast<int32_t>(v);
    throw std::invalid_argument(where + ": feature id " + py::str(key).cast<std::string>() +
                                " is outside the signed 32-bit range");
  }
  throw std::invalid_argument(where + ": a feature id is an int or a decimal string, not " +
                              py::str(key.get_type().attr("__name__")).cast<std::string>());
}

double featureValue(const py::handle& value, const std::string& where) {
  if (py::isinstance<py::str>(value) || py::isinstance<py::bytes>(value) || value.is_none()) {
    throw std::invalid_argument(where + ": a feature value is a number, not " +
                                py::str(value.get_type().attr("__name__")).cast<std::string>());
  }
  const double v = PyFloat_AsDouble(value.ptr());
  if (v == -1.0 && PyErr_Occurred()) {
    PyErr_Clear();
    throw std::invalid_argument(where + ": a feature value is a number, not " +
                                py::str(value.get_type().attr("__name__")).cast<std::string>());
  }
  return v;
}


class Model {
 public:
  // `walk` picks how the trees are walked ("" for the best walk; every walk
  // gives the same bits, so it matters only to benchmarks).
  Model(std::string text, std::string name, const std::string& walk)
      : text_(std::move(text)), model_(readModel(text_, name, walk)) {}

  // A converted XGBoost model keeps the trainer's node covers, for
  // contributions().
  static Model fromXgboost(const std::string& json, const std::string& name, const std::vector<int64_t>& ids) {
    std::string text;
    {
      QuietStdout quiet;  // the conversion reads its model back
      text = tool::convertXgboostJson(json, name, ids, "feature_ids=[...]").text;
    }
    Model model(std::move(text), name, "");
    // A hand-written model may lack the hessian sums; it converts all the
    // same and explains only over a background.
    const tool::XgbModel xgb = tool::readXgboostModel(json, name);
    const bool covered = std::all_of(xgb.trees.begin(), xgb.trees.end(),
                                     [](const tool::XgbTree& t) { return !t.sumHessian.empty(); });
    if (covered) model.covers_ = tool::xgboostCovers(xgb, *model.model_, name);
    return model;
  }

  py::bytes text() const { return py::bytes(text_); }

  py::array_t<int32_t> featureIds() const {
    const auto& mapping = model_->getForest().featureMapping;
    py::array_t<int32_t> out(static_cast<py::ssize_t>(mapping.size()));
    auto w = out.mutable_unchecked<1>();
    for (size_t i = 0; i < mapping.size(); ++i) w(static_cast<py::ssize_t>(i)) = static_cast<int32_t>(mapping[i]);
    return out;
  }
  size_t numTrees() const { return model_->getForest().trees.size(); }
  double baseScore() const { return model_->getForest().baseScore; }

  py::array_t<double> predict(const py::array& x, std::optional<std::vector<int32_t>> columnIds,
                              std::optional<double> missing, bool outputMargin, unsigned nthread) const {
    const Matrix m = matrixOf(x, "X");
    const std::vector<int64_t> columns = columnsOf(m, columnIds, "X");
    py::array_t<double> out(static_cast<py::ssize_t>(m.rows));
    double* o = out.mutable_data();
    {
      py::gil_scoped_release release;
      scoreDense(*model_, m, columns, missing, !outputMargin, nthread, o);
    }
    return out;
  }

  // Contributions of each row of `x` to its raw score, one column per
  // position of the feature vector and then the bias. Node covers come from
  // `background` (rows counted through the trees, with their own column ids)
  // or from the XGBoost model this one was converted from.
  py::array_t<double> contributions(const py::array& x, std::optional<std::vector<int32_t>> columnIds,
                                    std::optional<py::array> background,
                                    std::optional<std::vector<int32_t>> backgroundIds,
                                    std::optional<double> missing, unsigned nthread) {
    const Matrix m = matrixOf(x, "X");
    const std::vector<int64_t> columns = columnsOf(m, columnIds, "X");
    std::shared_ptr<const thornvale::TreeShap> shap;
    if (background) {
      const Matrix b = matrixOf(*background, "background");
      const std::vector<int64_t> backgroundColumns = columnsOf(b, backgroundIds, "background");
      if (b.rows == 0) {
        throw std::invalid_argument("background has no rows; covers are counted over its rows");
      }
      const size_t length = backgroundColumns.size();
      py::gil_scoped_release release;
      std::vector<float> rows(b.rows * length);
      featureVectors(b, backgroundColumns, missing, 0, b.rows, rows.data());
      shap = std::make_shared<const thornvale::TreeShap>(
          *model_, thornvale::backgroundCovers(*model_, rows.data(), b.rows, length));
    } else if (covers_) {
      if (!shap_) shap_ = std::make_shared<const thornvale::TreeShap>(*model_, *covers_);
      shap = shap_;
    } else {
      throw std::invalid_argument(
          "contributions need the cover of every tree node, which a model text does not hold: give background= "
          "rows (a node's cover is then how many of them reach it), or convert the model with "
          "Model.from_xgboost(), which keeps the trainer's covers (its sum_hessian)");
    }
    const size_t width = shap->numContributions() + 1;
    py::array_t<double> out({static_cast<py::ssize_t>(m.rows), static_cast<py::ssize_t>(width)});
    double* o = out.mutable_data();
    {
      py::gil_scoped_release release;
      explainDense(*shap, m, columns, missing, nthread, o);
    }
    return out;
  }

  // The trainer's covers, one per node of every tree in pre-order, trees in
  // the order of the model text; None when the model has none.
  std::optional<py::array_t<double>> covers() const {
    if (!covers_) return std::nullopt;
    std::vector<double> flat;
    for (const auto& tree : *covers_) flat.insert(flat.end(), tree.begin(), tree.end());
    return py::array_t<double>(static_cast<py::ssize_t>(flat.size()), flat.data());
  }

  // Bytes held for contributions over the trainer's covers: the covers and
  // the explainer's tables (made here if not yet). For benchmarks.
  size_t explainerBytes() {
    if (!covers_) return 0;
    if (!shap_) shap_ = std::make_shared<const thornvale::TreeShap>(*model_, *covers_);
    size_t bytes = shap_->tableBytes();
    for (const auto& tree : *covers_) bytes += tree.capacity() * sizeof(double);
    return bytes;
  }

  void setCovers(const py::array_t<double, py::array::c_style | py::array::forcecast>& flat) {
    if (flat.ndim() != 1) throw std::invalid_argument("covers must be a 1-D array");
    const auto& trees = model_->getForest().trees;
    thornvale::TreeCovers covers(trees.size());
    size_t at = 0;
    const auto total = static_cast<size_t>(flat.shape(0));
    for (size_t t = 0; t < trees.size(); ++t) {
      const size_t n = trees[t].tree ? nodeCount(trees[t].tree->root.get()) : 0;
      if (total - at < n) {
        throw std::invalid_argument("covers has " + std::to_string(total) + " entries, too few for the model's " +
                                    "trees");
      }
      covers[t].assign(flat.data() + at, flat.data() + at + n);
      at += n;
    }
    if (at != total) {
      throw std::invalid_argument("covers has " + std::to_string(total) + " entries but the model's trees have " +
                                  std::to_string(at) + " nodes");
    }
    shap_ = std::make_shared<const thornvale::TreeShap>(*model_, covers);  // checks them
    covers_ = std::move(covers);
  }

  py::array_t<double> predictRows(const py::iterable& rows, std::optional<double> missing, bool outputMargin) const {
    std::vector<FeatureMap> maps;
    size_t index = 0;
    for (const py::handle row : rows) {
      const std::string where = "row " + std::to_string(index);
      FeatureMap map;
      if (py::isinstance<py::str>(row) || py::isinstance<py::bytes>(row)) {
        for (const auto& [id, value] : tool::parseFeatureRow(row.cast<std::string>(), where)) {
          if (!isMissing(value, missing)) map.emplace(id, value);
        }
      } else if (py::isinstance<py::dict>(row)) {
        for (const auto& [key, value] : row.cast<py::dict>()) {
          const int32_t id = featureId(key, where);
          const double v = featureValue(value, where + ", feature " + std::to_string(id));
          if (isMissing(v, missing)) continue;
          if (!map.emplace(id, v).second) {
            throw std::invalid_argument(where + ": feature id " + std::to_string(id) + " is given twice");
          }
        }
      } else {
        throw std::invalid_argument(where + ": a row is a dict or a JSON text, not " +
                                    py::str(row.get_type().attr("__name__")).cast<std::string>());
      }
      maps.push_back(std::move(map));
      ++index;
    }
    std::vector<double> scores(maps.size());
    {
      py::gil_scoped_release release;
      for (size_t i = 0; i < maps.size(); ++i) {
        const double raw = model_->rawScore(maps[i]);
        scores[i] = outputMargin ? raw : thornvale::logistic(raw);
      }
    }
    return py::array_t<double>(static_cast<py::ssize_t>(scores.size()), scores.data());
  }

  // Reads and scores a block of logged lines (see log_block.h) into a dict of
  // numpy arrays and counts.
  py::dict replayBlock(const py::buffer& data, std::optional<std::string> label, int64_t firstLine,
                       size_t maxLine, size_t maxReasons, bool careful) const {
    // The buffer stays exported (so it cannot be resized) until `view` goes.
    const py::buffer_info view = data.request();
    if (view.ndim > 1 || (view.ndim == 1 && view.strides[0] != view.itemsize)) {
      throw std::invalid_argument("the lines must be one run of bytes");
    }
    const auto size = static_cast<size_t>(view.size * view.itemsize);
    tool::LogBlock block;
    {
      py::gil_scoped_release release;
      block = tool::replayBlock(*model_, std::string_view(static_cast<const char*>(view.ptr), size), label,
                                          firstLine, maxLine, maxReasons, careful);
    }
    py::dict out;
    out["candidate"] = asArray(block.candidate);
    out["logged"] = asArray(block.logged);
    out["threshold"] = asArray(block.threshold);
    out["model"] = asArray(block.model);
    out["label"] = asArray(block.label);
    out["line"] = asArray(block.line);
    py::list models;
    for (const auto& id : block.models) models.append(utf8Text(id));
    out["models"] = models;
    out["lines"] = block.lines;
    out["read"] = block.read;
    out["refused"] = block.refused;
    py::list reasons;
    for (const auto& [line, why] : block.reasons) reasons.append(py::make_tuple(line, utf8Text(why)));
    out["reasons"] = reasons;
    return out;
  }

 private:
  // `x` as a Matrix, without a copy; `what` names it in messages.
  static Matrix matrixOf(const py::array& x, const std::string& what) {
    if (x.ndim() != 2) {
      throw std::invalid_argument(what + " must be a 2-D array, got " + std::to_string(x.ndim()) + " dimensions");
    }
    Matrix m;
    if (x.dtype().is(py::dtype::of<double>())) {
      m.isDouble = true;
    } else if (!x.dtype().is(py::dtype::of<float>())) {
      throw std::invalid_argument(what + " must hold float32 or float64 values, got " +
                                  py::str(x.dtype()).cast<std::string>());
    }
    m.data = static_cast<const char*>(x.data());
    m.rows = static_cast<size_t>(x.shape(0));
    m.cols = static_cast<size_t>(x.shape(1));
    m.rowStride = x.strides(0);
    m.colStride = x.strides(1);
    return m;
  }

  // The column of `m` that feeds each position of the feature vector.
  std::vector<int64_t> columnsOf(const Matrix& m, const std::optional<std::vector<int32_t>>& columnIds,
                                 const std::string& what) const {
    if (columnIds) {
      if (columnIds->size() != m.cols) {
        throw std::invalid_argument(what + " has " + std::to_string(m.cols) + " columns but feature_ids names " +
                                    std::to_string(columnIds->size()));
      }
      return columnsForModel(*model_, *columnIds);
    }
    const auto& mapping = model_->getForest().featureMapping;
    if (mapping.size() != m.cols) {
      throw std::invalid_argument(what + " has " + std::to_string(m.cols) + " columns but the model reads " +
                                  std::to_string(mapping.size()) + " features; give feature_ids to name the columns");
    }
    std::vector<int64_t> columns(mapping.size(), -1);
    for (size_t p = 0; p < mapping.size(); ++p) {
      if (model_->getFeatureIndex().at(mapping[p]) == p) columns[p] = static_cast<int64_t>(p);
    }
    return columns;
  }

  static size_t nodeCount(const thornvale::Node* root) {
    size_t count = 0;
    std::vector<const thornvale::Node*> pending;
    if (root != nullptr) pending.push_back(root);
    while (!pending.empty()) {
      const thornvale::Node* n = pending.back();
      pending.pop_back();
      ++count;
      if (n->isLeaf()) continue;
      const auto* s = static_cast<const thornvale::LinearNode*>(n);
      if (s->left) pending.push_back(s->left.get());
      if (s->right) pending.push_back(s->right.get());
    }
    return count;
  }

  template <typename T>
  static py::array_t<T> asArray(const std::vector<T>& v) {
    return py::array_t<T>(static_cast<py::ssize_t>(v.size()), v.data());
  }

  // Logged text as str; bytes that are not UTF-8 (a cut message) are replaced.
  static py::str utf8Text(const std::string& s) {
    PyObject* o = PyUnicode_DecodeUTF8(s.data(), static_cast<py::ssize_t>(s.size()), "replace");
    if (o == nullptr) throw py::error_already_set();
    return py::reinterpret_steal<py::str>(o);
  }

  std::string text_;
  std::unique_ptr<thornvale::BoostingModel> model_;
  std::optional<thornvale::TreeCovers> covers_;
  // Explainer over covers_, made on first use with the interpreter's lock held.
  std::shared_ptr<const thornvale::TreeShap> shap_;
};

// The computed features of collection texts, as rows of 74 columns (ids 1 to
// 74); a feature that a collection does not have is NaN. `firstLines` gives
// each text's line in the file `name`; when it is empty, messages name a
// text "<name> <index>".
py::array_t<double> extractFeatures(const std::vector<std::string>& texts, const std::string& name,
                                    const std::vector<int64_t>& firstLines) {
  py::array_t<double> out({static_cast<py::ssize_t>(texts.size()), static_cast<py::ssize_t>(kFeatureCount)});
  double* o = out.mutable_data();
  {
    py::gil_scoped_release release;
    tool::CollectionReader reader;
    rc::ReliqaClassifierInput collection;
    for (size_t i = 0; i < texts.size(); ++i) {
      // A file's texts are named by their lines, others by their index.
      const int64_t line = i < firstLines.size() ? firstLines[i] : 0;
      const std::string where = firstLines.empty() ? name + " " + std::to_string(i) : name;
      reader.read(texts[i], where, line, collection);
      FeatureMap features;
      try {
        features = rc::extractFeatures(collection);
      } catch (const std::exception& e) {
        throw tool::ToolError(where, line, std::string("feature extraction failed: ") + e.what());
      }
      double* row = o + i * kFeatureCount;
      std::fill(row, row + kFeatureCount, std::nan(""));
      for (const auto& [id, value] : features) {
        if (id >= 1 && id <= kFeatureCount) row[id - 1] = value;
      }
    }
  }
  return out;
}

// A classifier over the store at a path. Python threads may share one: each
// call takes its own reference to the classifier in use (under the
// interpreter's lock) before it lets go of the lock, so that set_model()
// replacing it never pulls it from under a classification in progress.
class Classifier {
 public:
  explicit Classifier(std::string store) : store_(std::move(store)) { current(); }

  // Returns the warnings to raise in Python.
  std::vector<std::string> setModel(const std::string& text, const std::string& modelId, double threshold) {
    rc::ReliqaClassifierModelParams params;
    params.mSerializedModel = text;
    params.mModelId = modelId;
    params.mThreshold = threshold;
    std::vector<std::string> warnings;
    {
      QuietStdout quiet;
      tool::setModel(store_, params, "the model text", "give a replacement model text to set_model()",
                     [&](const std::string& file, const std::string& what) {
                       warnings.push_back(file.empty() ? what : file + ": " + what);
                     });
    }
    classifier_.reset();  // the next call reads the new parameters
    current();
    return warnings;
  }

  void setServerFeatures(const std::string& json) {
    const FeatureMap features = tool::parseServerFeatures(json, "server features");
    const auto classifier = current();
    py::gil_scoped_release release;
    try {
      classifier->setServerFeatures(features);
    } catch (const std::exception& e) {
      throw tool::ToolError(store_, 0, std::string("storing the server features failed: ") + e.what());
    }
  }

  py::dict classify(const std::string& json) {
    const rc::ReliqaClassifierInput collection = tool::parseCollection(json, "the collection");
    const auto classifier = current();
    rc::ReliqaClassifierResult r;
    {
      py::gil_scoped_release release;
      try {
        r = classifier->classify(collection);
      } catch (const std::exception& e) {
        throw tool::ToolError("the collection", 0, std::string("classification failed: ") + e.what());
      }
    }
    py::dict logging;
    for (const auto& [key, value] : r.loggingData) logging[py::str(key)] = py::str(value);
    py::dict out;
    out["score"] = r.score;
    out["isOverThreshold"] = r.isOverThreshold;
    out["loggingData"] = logging;
    return out;
  }

  std::string modelId() {
    const auto classifier = current();
    py::gil_scoped_release release;
    return classifier->currentlyUsedModelId();
  }

 private:
  // The classifier in use, opened when there is none (after a failure).
  // Call with the interpreter's lock held.
  std::shared_ptr<rc::ReliqasClassifier> current() {
    if (!classifier_) {
      QuietStdout quiet;
      classifier_ = tool::openClassifier(store_);
    }
    return classifier_;
  }

  std::string store_;
  std::shared_ptr<rc::ReliqasClassifier> classifier_;
};

void quietLogging() {
  if (!google::IsGoogleLoggingInitialized()) google::InitGoogleLogging("reliqa");
  // INFO (every model load, every score) is off unless asked for.
  if (std::getenv("GLOG_minloglevel") == nullptr) FLAGS_minloglevel = google::GLOG_WARNING;
  FLAGS_logtostderr = true;
}

}  // namespace
}  // namespace reliqa::python

PYBIND11_MODULE(_native, m) {
  using namespace reliqa::python;
  m.doc() = "Native part of the reliqa package; use the reliqa module instead.";
  quietLogging();
  py::register_exception_translator([](std::exception_ptr p) {
    try {
      if (p) std::rethrow_exception(p);
    } catch (const reliqa::tool::ToolError& e) {
      PyErr_SetString(PyExc_ValueError, e.describe().c_str());
    } catch (const std::invalid_argument& e) {
      PyErr_SetString(PyExc_ValueError, e.what());
    }
  });

  py::class_<Model>(m, "Model")
      .def(py::init<std::string, std::string, std::string>(), py::arg("text"), py::arg("name"),
           py::arg("walk") = "")
      .def_static("from_xgboost", &Model::fromXgboost, py::arg("json"), py::arg("name"), py::arg("feature_ids"))
      .def_property_readonly("text", &Model::text)
      .def_property_readonly("feature_ids", &Model::featureIds)
      .def_property_readonly("num_trees", &Model::numTrees)
      .def_property_readonly("base_score", &Model::baseScore)
      .def("predict", &Model::predict, py::arg("x"), py::arg("column_ids"), py::arg("missing"),
           py::arg("output_margin"), py::arg("nthread"))
      .def("predict_rows", &Model::predictRows, py::arg("rows"), py::arg("missing"), py::arg("output_margin"))
      .def("contributions", &Model::contributions, py::arg("x"), py::arg("column_ids"), py::arg("background"),
           py::arg("background_ids"), py::arg("missing"), py::arg("nthread"))
      .def_property_readonly("covers", &Model::covers)
      .def("set_covers", &Model::setCovers, py::arg("covers"))
      .def("explainer_bytes", &Model::explainerBytes)
      .def("replay_block", &Model::replayBlock, py::arg("data"), py::arg("label"), py::arg("first_line"),
           py::arg("max_line"), py::arg("max_reasons"), py::arg("careful") = false);

  m.def("extract_features", &extractFeatures, py::arg("texts"), py::arg("name"), py::arg("first_lines"));
  m.attr("FEATURE_COUNT") = kFeatureCount;

  py::class_<Classifier>(m, "Classifier")
      .def(py::init<std::string>(), py::arg("store"))
      .def("set_model", &Classifier::setModel, py::arg("text"), py::arg("model_id"), py::arg("threshold"))
      .def("set_server_features", &Classifier::setServerFeatures, py::arg("json"))
      .def("classify", &Classifier::classify, py::arg("json"))
      .def_property_readonly("model_id", &Classifier::modelId);
}

#include "tools/common/xgboost_model.h"

#include <double-conversion/double-conversion.h>

#include <algorithm>
#include <charconv>
#include <climits>
#include <cmath>
#include <limits>
#include <optional>
#include <set>
#include <system_error>

#include "tools/common/errors.h"
#include "tools/common/json_doc.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/ModelWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace reliqa::tool {

using simdjson::ondemand::array;
using simdjson::ondemand::field;
using simdjson::ondemand::json_type;
using simdjson::ondemand::object;
using simdjson::ondemand::value;

namespace {

std::string join(const std::string& path, std::string_view key) {
  return path.empty() ? std::string(key) : path + "." + std::string(key);
}

// Calls onMember(key, path, value) for every member; members it ignores are
// skipped by the parser.
template <class F>
void forEachMember(JsonDoc& doc, object obj, const std::string& path, F&& onMember) {
  for (auto member : obj) {
    field f = doc.take(std::move(member), path);
    std::string_view key = doc.take(f.unescaped_key(), path);
    value v = f.value();
    onMember(key, join(path, key), v);
  }
}

template <class F>
void forEachElement(JsonDoc& doc, array arr, const std::string& path, F&& onElement) {
  size_t i = 0;
  for (auto element : arr) {
    std::string p = path + "[" + std::to_string(i) + "]";
    value v = doc.take(std::move(element), p);
    onElement(i++, p, v);
  }
}

// A float as C's strtof reads a whole text in the "C" locale: white space, an
// optional sign, then decimal or hexadecimal ("0x1p-1") digits with an
// optional exponent, correctly rounded to a float (not through a double), and
// nothing after them. A value beyond the float range reads as an infinity; the
// words inf and nan are not numbers here.
std::optional<float> textToFloat(std::string_view text) {
  using double_conversion::StringToDoubleConverter;
  static const StringToDoubleConverter converter(
      StringToDoubleConverter::ALLOW_LEADING_SPACES | StringToDoubleConverter::ALLOW_HEX |
          StringToDoubleConverter::ALLOW_HEX_FLOATS,
      std::numeric_limits<double>::quiet_NaN(), std::numeric_limits<double>::quiet_NaN(), nullptr, nullptr);
  // Longer texts than the converter takes are never numbers.
  if (text.size() > static_cast<size_t>(INT_MAX)) return std::nullopt;
  int used = 0;
  const float f = converter.StringToFloat(text.data(), static_cast<int>(text.size()), &used);
  if (std::isnan(f) || static_cast<size_t>(used) != text.size()) return std::nullopt;
  return f;
}

// A float exactly as XGBoost wrote it (parsed as float, not via double). A
// number beyond the float range is refused; one below it keeps its rounded
// value (XGBoost writes subnormal floats).
float readFloat(JsonDoc& doc, value& v, const std::string& path) {
  doc.getDouble(v, path);  // type and syntax check
  const std::string token(JsonDoc::tokenOf(v));
  std::optional<float> f = textToFloat(token);
  if (!f) doc.fail(v, path + ": malformed number " + quoteForMessage(token));
  if (std::isinf(*f)) doc.fail(v, path + ": " + token + " is outside the range of a float");
  return *f;
}

// XGBoost writes its scalar parameters as strings ("74", "5E-1"); newer
// versions write base_score as "[5E-1]".
std::string paramText(JsonDoc& doc, value& v, const std::string& path) {
  json_type t;
  if (auto err = v.type().get(t)) doc.failSyntax(err, path);
  if (t == json_type::number) return std::string(v.raw_json_token());
  return doc.getString(v, path);
}

// The whole text as a decimal int64 with an optional '+' or '-'; none when it
// is anything else or out of range.
std::optional<int64_t> wholeDecimal(std::string_view text) {
  // from_chars itself takes a '-' only.
  if (text.size() > 1 && text[0] == '+' && text[1] >= '0' && text[1] <= '9') text.remove_prefix(1);
  int64_t value = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return value;
}

// An integer parameter: C white space, an optional sign and decimal digits,
// then only JSON white space. The text ends at a zero byte; a non-empty text
// of JSON white space alone reads as 0.
int64_t paramInt(JsonDoc& doc, value& v, const std::string& path) {
  const std::string text = paramText(doc, v, path);
  std::string_view number = std::string_view(text).substr(0, text.find('\0'));
  std::optional<int64_t> x;
  if (number.find_first_not_of(" \t\n\r") == std::string_view::npos) {
    if (!text.empty()) x = 0;
  } else {
    const size_t end = number.find_last_not_of(" \t\n\r") + 1;
    const size_t start = std::min(number.find_first_not_of(" \t\n\v\f\r"), end);
    x = wholeDecimal(number.substr(start, end - start));
  }
  if (!x) doc.fail(v, path + ": expected an integer, got " + quoteForMessage(text));
  return *x;
}

std::vector<int32_t> readInts(JsonDoc& doc, value& v, const std::string& path) {
  std::vector<int32_t> out;
  forEachElement(doc, doc.getArray(v, path), path, [&](size_t, const std::string& p, value& x) {
    out.push_back(static_cast<int32_t>(
        doc.getInt(x, p, std::numeric_limits<int32_t>::min(), std::numeric_limits<int32_t>::max())));
  });
  return out;
}

std::vector<float> readFloats(JsonDoc& doc, value& v, const std::string& path) {
  std::vector<float> out;
  forEachElement(doc, doc.getArray(v, path), path,
                 [&](size_t, const std::string& p, value& x) { out.push_back(readFloat(doc, x, p)); });
  return out;
}

// Hessian sums are weights: finite (readFloat refuses what a float cannot
// hold) and not negative.
std::vector<float> readHessians(JsonDoc& doc, value& v, const std::string& path) {
  std::vector<float> out;
  forEachElement(doc, doc.getArray(v, path), path, [&](size_t, const std::string& p, value& x) {
    const float h = readFloat(doc, x, p);
    if (h < 0.0f) doc.fail(x, p + ": " + thornvale::doubleToText(h) + " is negative; a hessian sum cannot be");
    out.push_back(h);
  });
  return out;
}

XgbTree readTree(JsonDoc& doc, value& v, const std::string& path) {
  XgbTree tree;
  tree.line = doc.lineOf(v);
  const char* at = v.raw_json_token().data();
  int64_t numNodes = -1;
  int64_t leafVector = 0;
  bool categorical = false;
  forEachMember(doc, doc.getObject(v, path), path, [&](std::string_view key, const std::string& p, value& x) {
    if (key == "left_children") tree.left = readInts(doc, x, p);
    else if (key == "right_children") tree.right = readInts(doc, x, p);
    else if (key == "split_indices") tree.splitIndex = readInts(doc, x, p);
    else if (key == "split_conditions") tree.splitCondition = readFloats(doc, x, p);
    else if (key == "split_type") tree.splitType = readInts(doc, x, p);
    else if (key == "sum_hessian") tree.sumHessian = readHessians(doc, x, p);
    else if (key == "categories_nodes") categorical = !readInts(doc, x, p).empty() || categorical;
    else if (key == "tree_param") {
      forEachMember(doc, doc.getObject(x, p), p, [&](std::string_view k, const std::string& q, value& y) {
        if (k == "num_nodes") numNodes = paramInt(doc, y, q);
        else if (k == "size_leaf_vector") leafVector = paramInt(doc, y, q);
      });
    }
  });
  if (leafVector > 1) {
    doc.fail(at, path + ": vector leaves (multi-output trees) cannot be converted; only one output per tree is supported");
  }
  if (categorical) {
    doc.fail(at, path + ": categorical splits cannot be converted; train with numerical features only");
  }
  size_t n = tree.left.size();
  if (numNodes >= 0 && static_cast<size_t>(numNodes) != n) {
    doc.fail(at, path + ": tree_param.num_nodes is " + std::to_string(numNodes) + " but left_children has " +
                     std::to_string(n) + " entries");
  }
  auto sameSize = [&](size_t size, const char* what) {
    if (size != n) {
      doc.fail(at, path + ": " + what + " has " + std::to_string(size) + " entries, left_children " +
                       std::to_string(n));
    }
  };
  if (n == 0) doc.fail(at, path + ": the tree has no nodes (left_children missing or empty)");
  sameSize(tree.right.size(), "right_children");
  sameSize(tree.splitIndex.size(), "split_indices");
  sameSize(tree.splitCondition.size(), "split_conditions");
  if (!tree.splitType.empty()) sameSize(tree.splitType.size(), "split_type");
  if (!tree.sumHessian.empty()) sameSize(tree.sumHessian.size(), "sum_hessian");
  return tree;
}

// Checks that the nodes reachable from the root form a tree over valid
// indices; the walk uses an explicit stack, so any depth is fine.
void checkTree(JsonDoc& doc, const XgbTree& t, const std::string& path, int64_t numFeature) {
  const int32_t n = static_cast<int32_t>(t.left.size());
  std::vector<bool> seen(n, false);
  std::vector<int32_t> stack{0};
  seen[0] = true;
  auto fail = [&](int32_t node, const std::string& what) {
    throw ToolError(doc.name(), t.line, path + ", node " + std::to_string(node) + ": " + what);
  };
  while (!stack.empty()) {
    int32_t id = stack.back();
    stack.pop_back();
    int32_t l = t.left[id], r = t.right[id];
    float c = t.splitCondition[id];
    if (l == -1 || r == -1) {
      if (l != r) fail(id, "one child is missing (left " + std::to_string(l) + ", right " + std::to_string(r) + ")");
      if (!std::isfinite(c)) fail(id, "leaf value is not finite");
      continue;
    }
    if (!t.splitType.empty() && t.splitType[id] != 0) {
      fail(id, "categorical split; only numerical splits can be converted");
    }
    if (t.splitIndex[id] < 0 || t.splitIndex[id] >= numFeature) {
      fail(id, "split feature " + std::to_string(t.splitIndex[id]) + " is outside the model's " +
                   std::to_string(numFeature) + " features");
    }
    if (std::isnan(c) || c == -std::numeric_limits<float>::infinity()) {
      fail(id, "split condition is not a usable number");
    }
    for (int32_t child : {l, r}) {
      if (child <= 0 || child >= n) fail(id, "child index " + std::to_string(child) + " is out of range");
      if (seen[child]) fail(id, "node " + std::to_string(child) + " is reached twice");
      seen[child] = true;
      stack.push_back(child);
    }
  }
}

// Reads the members of an XGBoost model that the conversion needs, one
// function per JSON object; members it does not know are skipped.
class XgbReader {
 public:
  explicit XgbReader(JsonDoc& doc) : doc_(doc) {}

  XgbModel read() {
    forEachMember(doc_, doc_.rootObject("an XGBoost JSON model"), "",
                  [&](std::string_view key, const std::string& p, value& v) {
                    if (key == "learner") readLearner(v, p);
                  });
    doc_.expectEnd();
    checkModel();
    return std::move(m_);
  }

 private:
  void readLearner(value& v, const std::string& path) {
    haveLearner_ = true;
    forEachMember(doc_, doc_.getObject(v, path), path, [&](std::string_view k, const std::string& p, value& x) {
      if (k == "feature_names") readStrings(x, p, m_.featureNames);
      else if (k == "feature_types") readStrings(x, p, featureTypes_);
      else if (k == "objective") readObjective(x, p);
      else if (k == "learner_model_param") readLearnerParam(x, p);
      else if (k == "gradient_booster") readBooster(x, p);
    });
  }

  void readStrings(value& v, const std::string& path, std::vector<std::string>& out) {
    forEachElement(doc_, doc_.getArray(v, path), path,
                   [&](size_t, const std::string& p, value& s) { out.push_back(doc_.getString(s, p)); });
  }

  void readObjective(value& v, const std::string& path) {
    forEachMember(doc_, doc_.getObject(v, path), path, [&](std::string_view k, const std::string& p, value& x) {
      if (k == "name") {
        m_.objective = doc_.getString(x, p);
        haveObjective_ = true;
      }
    });
  }

  void readLearnerParam(value& v, const std::string& path) {
    forEachMember(doc_, doc_.getObject(v, path), path, [&](std::string_view k, const std::string& p, value& x) {
      if (k == "base_score") {
        readBaseScore(x, p);
      } else if (k == "num_feature") {
        m_.numFeature = paramInt(doc_, x, p);
        haveNumFeature_ = true;
      } else if (k == "num_class") {
        numClass_ = paramInt(doc_, x, p);
      } else if (k == "num_target") {
        numTarget_ = paramInt(doc_, x, p);
      }
    });
  }

  // "5E-1", or "[5E-1]" from newer versions.
  void readBaseScore(value& v, const std::string& path) {
    baseScoreText_ = paramText(doc_, v, path);
    if (baseScoreText_.size() >= 2 && baseScoreText_.front() == '[' && baseScoreText_.back() == ']') {
      baseScoreText_ = baseScoreText_.substr(1, baseScoreText_.size() - 2);
      if (baseScoreText_.find(',') != std::string::npos) {
        doc_.fail(v, path + ": one base score per output; multi-output models cannot be converted");
      }
    }
    // The text ends at a zero byte.
    std::optional<float> score = textToFloat(std::string_view(baseScoreText_).substr(0, baseScoreText_.find('\0')));
    if (baseScoreText_.empty() || !score) {
      doc_.fail(v, path + ": expected a number, got " + quoteForMessage(baseScoreText_));
    }
    m_.baseScore = *score;
  }

  void readBooster(value& v, const std::string& path) {
    forEachMember(doc_, doc_.getObject(v, path), path, [&](std::string_view k, const std::string& p, value& x) {
      if (k == "name") m_.booster = doc_.getString(x, p);
      else if (k == "model") readBoosterModel(x, p);
    });
  }

  void readBoosterModel(value& v, const std::string& path) {
    forEachMember(doc_, doc_.getObject(v, path), path, [&](std::string_view k, const std::string& p, value& x) {
      if (k == "trees") {
        haveTrees_ = true;
        treesAt_ = x.raw_json_token().data();
        forEachElement(doc_, doc_.getArray(x, p), p, [&](size_t, const std::string& q, value& tree) {
          m_.trees.push_back(readTree(doc_, tree, q));
        });
      } else if (k == "gbtree_model_param") {
        forEachMember(doc_, doc_.getObject(x, p), p, [&](std::string_view g, const std::string& q, value& y) {
          if (g == "num_trees") numTrees_ = paramInt(doc_, y, q);
        });
      }
    });
  }

  // What a model must be to be converted, once it has been read.
  void checkModel() const {
    auto whole = [&](const std::string& what) { throw ToolError(doc_.name(), 0, what); };
    if (!haveLearner_) whole("not an XGBoost JSON model (no \"learner\" member); save it with save_model(\"model.json\")");
    if (m_.booster == "gblinear") whole("linear boosters (gblinear) cannot be converted; only gbtree models");
    if (m_.booster == "dart") whole("dart boosters cannot be converted; only gbtree models");
    if (m_.booster != "gbtree") whole("booster " + quoteForMessage(m_.booster) + " cannot be converted; only gbtree models");
    if (!haveObjective_) whole("the model names no objective (learner.objective.name)");
    if (m_.objective != "binary:logistic" && m_.objective != "reg:logistic") {
      whole("objective " + quoteForMessage(m_.objective) +
            " cannot be converted; only binary:logistic and reg:logistic models");
    }
    if (numClass_ > 1) whole("multi-class models (num_class " + std::to_string(numClass_) + ") cannot be converted");
    if (numTarget_ > 1) whole("multi-output models (num_target " + std::to_string(numTarget_) + ") cannot be converted");
    if (!haveNumFeature_ || m_.numFeature <= 0) whole("learner_model_param.num_feature is missing or not positive");
    if (m_.numFeature > std::numeric_limits<int32_t>::max()) whole("too many features");
    if (!haveTrees_) whole("the model has no trees (gradient_booster.model.trees)");
    if (numTrees_ >= 0 && static_cast<size_t>(numTrees_) != m_.trees.size()) {
      throw ToolError(doc_.name(), doc_.lineOf(treesAt_),
                      "gbtree_model_param.num_trees is " + std::to_string(numTrees_) + " but there are " +
                          std::to_string(m_.trees.size()) + " trees");
    }
    if (!(m_.baseScore > 0.0f && m_.baseScore < 1.0f)) {
      whole("base_score " + baseScoreText_ + " is not a probability strictly between 0 and 1");
    }
    if (!m_.featureNames.empty() && static_cast<int64_t>(m_.featureNames.size()) != m_.numFeature) {
      whole("the model has " + std::to_string(m_.featureNames.size()) + " feature names for " +
            std::to_string(m_.numFeature) + " features");
    }
    for (const std::string& t : featureTypes_) {
      if (t == "c") whole("the model has categorical features, which cannot be converted");
    }
    for (size_t i = 0; i < m_.trees.size(); ++i) {
      checkTree(doc_, m_.trees[i], "tree " + std::to_string(i), m_.numFeature);
    }
  }

  JsonDoc& doc_;
  XgbModel m_;
  std::string baseScoreText_;
  std::vector<std::string> featureTypes_;
  bool haveLearner_ = false, haveTrees_ = false, haveObjective_ = false, haveNumFeature_ = false;
  int64_t numClass_ = 0, numTarget_ = 1, numTrees_ = -1;
  const char* treesAt_ = nullptr;
};

}  // namespace

XgbModel readXgboostModel(std::string_view json, const std::string& name) {
  JsonDoc doc(json, name);
  return XgbReader(doc).read();
}

std::vector<int64_t> parseIdList(const std::vector<std::string>& items) {
  std::vector<int64_t> ids;
  for (const std::string& item : items) {
    if (item.empty()) continue;
    const size_t end = item.find_last_not_of(' ') + 1;  // 0 for spaces alone
    const size_t start = std::min(item.find_first_not_of(' '), end);
    const std::string_view text = std::string_view(item).substr(start, end - start);
    const size_t digits = text.size() - (!text.empty() && (text[0] == '-' || text[0] == '+') ? 1 : 0);
    std::optional<int64_t> id = wholeDecimal(text);
    if (!id || digits > 18) {
      throw UsageError("--feature-ids: expected comma-separated integers, got " + quoteForMessage(item));
    }
    ids.push_back(*id);
  }
  return ids;
}

std::vector<int32_t> featureIdsOf(const XgbModel& model, const std::vector<int64_t>& given, const std::string& name,
                                  const std::string& option) {
  std::vector<int64_t> ids = given;
  if (ids.empty()) {
    if (model.featureNames.empty()) {
      throw ToolError(name, 0,
                      "the model has no feature names, so its feature ids are unknown; give one id per feature "
                      "with " + option + " (" + std::to_string(model.numFeature) + " ids)");
    }
    for (const std::string& n : model.featureNames) {
      // As long as the longest 32-bit id ("-2147483648") at most; the range
      // is checked below.
      int64_t id = 0;
      const auto [end, error] = std::from_chars(n.data(), n.data() + n.size(), id);
      if (error != std::errc() || end != n.data() + n.size() || n.size() > 11) {
        throw ToolError(name, 0,
                        "feature name " + quoteForMessage(n) +
                            " is not an integer feature id; give one id per feature with " + option + " (" +
                            std::to_string(model.numFeature) + " ids, in the order of the model's features)");
      }
      ids.push_back(id);
    }
  } else if (static_cast<int64_t>(ids.size()) != model.numFeature) {
    throw ToolError(name, 0, option.substr(0, option.find(' ')) + " gives " + std::to_string(ids.size()) +
                                 " ids but the model has " + std::to_string(model.numFeature) + " features");
  }
  std::vector<int32_t> out;
  std::set<int32_t> seen;
  for (int64_t id : ids) {
    if (id < std::numeric_limits<int32_t>::min() || id > std::numeric_limits<int32_t>::max()) {
      throw ToolError(given.empty() ? name : "", 0, "feature id " + std::to_string(id) + " is not a 32-bit integer");
    }
    if (!seen.insert(static_cast<int32_t>(id)).second) {
      throw ToolError(given.empty() ? name : "", 0, "feature id " + std::to_string(id) + " is given twice");
    }
    out.push_back(static_cast<int32_t>(id));
  }
  return out;
}

}  // namespace reliqa::tool

namespace reliqa::tool {

std::unique_ptr<thornvale::Forest> toForest(const XgbModel& model, const std::vector<int32_t>& featureIds) {
  auto forest = std::make_unique<thornvale::Forest>();
  double p = static_cast<double>(model.baseScore);
  forest->baseScore = std::log(p / (1.0 - p));
  for (const XgbTree& t : model.trees) {
    // Build top-down with an explicit stack: each entry is an XGBoost node and
    // the owner slot that receives its converted node.
    auto tree = std::make_unique<thornvale::Tree>();
    std::vector<std::pair<int32_t, std::unique_ptr<thornvale::Node>*>> stack{{0, &tree->root}};
    while (!stack.empty()) {
      auto [id, slot] = stack.back();
      stack.pop_back();
      if (t.left[id] == -1) {
        *slot = std::make_unique<thornvale::ConstantNode>(static_cast<double>(t.splitCondition[id]));
        continue;
      }
      // XGBoost goes left when x < split; with t the largest float below the
      // split, x <= t holds for exactly the same floats x.
      float below = std::nextafter(t.splitCondition[id], -std::numeric_limits<float>::infinity());
      auto split = std::make_unique<thornvale::LinearNode>(t.splitIndex[id], static_cast<double>(below));
      stack.emplace_back(t.right[id], &split->right);
      stack.emplace_back(t.left[id], &split->left);
      *slot = std::move(split);
    }
    forest->trees.emplace_back(std::move(tree), 1.0);
  }
  for (size_t i = 0; i < featureIds.size(); ++i) {
    forest->featureMapping.push_back(static_cast<uint32_t>(featureIds[i]));
    forest->inputKeys.push_back(model.featureNames.empty() ? std::to_string(featureIds[i]) : model.featureNames[i]);
  }
  return forest;
}

ConvertedModel convertXgboostJson(std::string_view json, const std::string& name,
                                  const std::vector<int64_t>& featureIds, const std::string& option) {
  const XgbModel xgb = readXgboostModel(json, name);
  ConvertedModel out;
  out.featureIds = featureIdsOf(xgb, featureIds, name, option);
  out.trees = xgb.trees.size();
  const std::unique_ptr<thornvale::Forest> forest = toForest(xgb, out.featureIds);
  try {
    out.text = thornvale::writeModel(*forest, thornvale::kNewestVersion);
    thornvale::BoostingModel check(out.text);  // what we write must load
  } catch (const std::exception& e) {
    throw ToolError(name, 0, std::string("the converted model is not usable: ") + e.what());
  }
  return out;
}

}  // namespace reliqa::tool

#include "tools/reliqa/xgboost_model.h"

#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <set>

#include "tools/reliqa/errors.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/serialize.h"
#include "tools/reliqa/json_doc.h"

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

// A float exactly as XGBoost wrote it (parsed as float, not via double).
float readFloat(JsonDoc& doc, value& v, const std::string& path) {
  doc.getDouble(v, path);  // type and syntax check
  std::string token(v.raw_json_token());
  errno = 0;
  float f = std::strtof(token.c_str(), nullptr);
  return f;
}

// XGBoost writes its scalar parameters as strings ("74", "5E-1"); newer
// versions write base_score as "[5E-1]".
std::string paramText(JsonDoc& doc, value& v, const std::string& path) {
  json_type t;
  if (auto err = v.type().get(t)) doc.failSyntax(err, path);
  if (t == json_type::number) return std::string(v.raw_json_token());
  return doc.getString(v, path);
}

int64_t paramInt(JsonDoc& doc, value& v, const std::string& path) {
  std::string text = paramText(doc, v, path);
  char* end = nullptr;
  errno = 0;
  long long x = std::strtoll(text.c_str(), &end, 10);
  while (end && (*end == ' ' || *end == '\n' || *end == '\t' || *end == '\r')) ++end;
  if (text.empty() || errno != 0 || *end != '\0') {
    doc.fail(v, path + ": expected an integer, got " + quoteForMessage(text));
  }
  return x;
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

}  // namespace

XgbModel readXgboostModel(std::string_view json, const std::string& name) {
  JsonDoc doc(json, name);
  XgbModel m;
  std::string baseScoreText;
  bool haveLearner = false, haveTrees = false, haveObjective = false, haveNumFeature = false;
  int64_t numClass = 0, numTarget = 1, numTrees = -1;
  std::vector<std::string> featureTypes;
  const char* treesAt = nullptr;

  object root = doc.rootObject("an XGBoost JSON model");
  forEachMember(doc, root, "", [&](std::string_view key, const std::string& p, value& learner) {
    if (key != "learner") return;
    haveLearner = true;
    forEachMember(doc, doc.getObject(learner, p), p, [&](std::string_view k, const std::string& q, value& x) {
      if (k == "feature_names") {
        forEachElement(doc, doc.getArray(x, q), q, [&](size_t, const std::string& r, value& s) {
          m.featureNames.push_back(doc.getString(s, r));
        });
      } else if (k == "feature_types") {
        forEachElement(doc, doc.getArray(x, q), q, [&](size_t, const std::string& r, value& s) {
          featureTypes.push_back(doc.getString(s, r));
        });
      } else if (k == "objective") {
        forEachMember(doc, doc.getObject(x, q), q, [&](std::string_view o, const std::string& r, value& y) {
          if (o == "name") {
            m.objective = doc.getString(y, r);
            haveObjective = true;
          }
        });
      } else if (k == "learner_model_param") {
        forEachMember(doc, doc.getObject(x, q), q, [&](std::string_view o, const std::string& r, value& y) {
          if (o == "base_score") {
            baseScoreText = paramText(doc, y, r);
            if (baseScoreText.size() >= 2 && baseScoreText.front() == '[' && baseScoreText.back() == ']') {
              baseScoreText = baseScoreText.substr(1, baseScoreText.size() - 2);
              if (baseScoreText.find(',') != std::string::npos) {
                doc.fail(y, r + ": one base score per output; multi-output models cannot be converted");
              }
            }
            char* end = nullptr;
            m.baseScore = std::strtof(baseScoreText.c_str(), &end);
            if (baseScoreText.empty() || *end != '\0') {
              doc.fail(y, r + ": expected a number, got " + quoteForMessage(baseScoreText));
            }
          } else if (o == "num_feature") {
            m.numFeature = paramInt(doc, y, r);
            haveNumFeature = true;
          } else if (o == "num_class") {
            numClass = paramInt(doc, y, r);
          } else if (o == "num_target") {
            numTarget = paramInt(doc, y, r);
          }
        });
      } else if (k == "gradient_booster") {
        forEachMember(doc, doc.getObject(x, q), q, [&](std::string_view o, const std::string& r, value& y) {
          if (o == "name") {
            m.booster = doc.getString(y, r);
          } else if (o == "model") {
            forEachMember(doc, doc.getObject(y, r), r, [&](std::string_view t, const std::string& s, value& z) {
              if (t == "trees") {
                haveTrees = true;
                treesAt = z.raw_json_token().data();
                forEachElement(doc, doc.getArray(z, s), s, [&](size_t, const std::string& u, value& tree) {
                  m.trees.push_back(readTree(doc, tree, u));
                });
              } else if (t == "gbtree_model_param") {
                forEachMember(doc, doc.getObject(z, s), s, [&](std::string_view g, const std::string& u, value& w) {
                  if (g == "num_trees") numTrees = paramInt(doc, w, u);
                });
              }
            });
          }
        });
      }
    });
  });
  doc.expectEnd();

  auto whole = [&](const std::string& what) { throw ToolError(name, 0, what); };
  if (!haveLearner) whole("not an XGBoost JSON model (no \"learner\" member); save it with save_model(\"model.json\")");
  if (m.booster == "gblinear") whole("linear boosters (gblinear) cannot be converted; only gbtree models");
  if (m.booster == "dart") whole("dart boosters cannot be converted; only gbtree models");
  if (m.booster != "gbtree") whole("booster " + quoteForMessage(m.booster) + " cannot be converted; only gbtree models");
  if (!haveObjective) whole("the model names no objective (learner.objective.name)");
  if (m.objective != "binary:logistic" && m.objective != "reg:logistic") {
    whole("objective " + quoteForMessage(m.objective) +
          " cannot be converted; only binary:logistic and reg:logistic models");
  }
  if (numClass > 1) whole("multi-class models (num_class " + std::to_string(numClass) + ") cannot be converted");
  if (numTarget > 1) whole("multi-output models (num_target " + std::to_string(numTarget) + ") cannot be converted");
  if (!haveNumFeature || m.numFeature <= 0) whole("learner_model_param.num_feature is missing or not positive");
  if (m.numFeature > std::numeric_limits<int32_t>::max()) whole("too many features");
  if (!haveTrees) whole("the model has no trees (gradient_booster.model.trees)");
  if (numTrees >= 0 && static_cast<size_t>(numTrees) != m.trees.size()) {
    throw ToolError(name, doc.lineOf(treesAt),
                    "gbtree_model_param.num_trees is " + std::to_string(numTrees) + " but there are " +
                        std::to_string(m.trees.size()) + " trees");
  }
  if (!(m.baseScore > 0.0f && m.baseScore < 1.0f)) {
    whole("base_score " + baseScoreText + " is not a probability strictly between 0 and 1");
  }
  if (!m.featureNames.empty() && static_cast<int64_t>(m.featureNames.size()) != m.numFeature) {
    whole("the model has " + std::to_string(m.featureNames.size()) + " feature names for " +
          std::to_string(m.numFeature) + " features");
  }
  for (const std::string& t : featureTypes) {
    if (t == "c") whole("the model has categorical features, which cannot be converted");
  }
  for (size_t i = 0; i < m.trees.size(); ++i) {
    checkTree(doc, m.trees[i], "tree " + std::to_string(i), m.numFeature);
  }
  return m;
}

std::vector<int64_t> parseIdList(const std::string& text) {
  std::vector<int64_t> out;
  size_t i = 0;
  while (true) {
    while (i < text.size() && text[i] == ' ') ++i;
    size_t start = i;
    if (i < text.size() && (text[i] == '-' || text[i] == '+')) ++i;
    size_t digits = i;
    while (i < text.size() && text[i] >= '0' && text[i] <= '9') ++i;
    if (i == digits || i - digits > 18) {
      throw UsageError("--feature-ids: expected comma-separated integers, got " + quoteForMessage(text));
    }
    out.push_back(std::strtoll(text.substr(start, i - start).c_str(), nullptr, 10));
    while (i < text.size() && text[i] == ' ') ++i;
    if (i == text.size()) break;
    if (text[i] != ',') throw UsageError("--feature-ids: expected comma-separated integers, got " + quoteForMessage(text));
    ++i;
  }
  return out;
}

std::vector<int32_t> featureIdsOf(const XgbModel& model, const std::vector<int64_t>& given, const std::string& name) {
  std::vector<int64_t> ids = given;
  if (ids.empty()) {
    if (model.featureNames.empty()) {
      throw ToolError(name, 0,
                      "the model has no feature names, so its feature ids are unknown; give one id per feature "
                      "with --feature-ids 1,2,... (" + std::to_string(model.numFeature) + " ids)");
    }
    for (const std::string& n : model.featureNames) {
      bool integer = !n.empty() && n.size() <= 11;
      for (size_t i = 0; i < n.size() && integer; ++i) {
        integer = (n[i] >= '0' && n[i] <= '9') || (i == 0 && n[i] == '-' && n.size() > 1);
      }
      if (!integer) {
        throw ToolError(name, 0,
                        "feature name " + quoteForMessage(n) +
                            " is not an integer feature id; give one id per feature with --feature-ids 1,2,... (" +
                            std::to_string(model.numFeature) + " ids, in the order of the model's features)");
      }
      ids.push_back(std::strtoll(n.c_str(), nullptr, 10));
    }
  } else if (static_cast<int64_t>(ids.size()) != model.numFeature) {
    throw UsageError("--feature-ids gives " + std::to_string(ids.size()) + " ids but the model has " +
                     std::to_string(model.numFeature) + " features");
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

}  // namespace reliqa::tool

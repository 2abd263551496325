#include "tools/common/log_block.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <unordered_map>
#include <utility>

#include "tools/common/errors.h"
#include "tools/common/feature_rows.h"
#include "tools/common/json_doc.h"
#include "xplat/gbdtclassifier/GbdtClassifier/FastTreeEnsemble.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace reliqa::tool {

namespace {

using simdjson::ondemand::field;
using simdjson::ondemand::json_type;
using simdjson::ondemand::object;
using simdjson::ondemand::value;




// Rows scored together, as the dense scorer does.
constexpr size_t kBlockRows = 64;
// Feature ids below this are checked for repeats in a table; others by sorting.
constexpr uint32_t kTableIds = 4096;

bool isBlank(std::string_view text) {
  return text.find_first_not_of(" \t\r") == std::string_view::npos;
}

// A logged number text, read as the store reads its threshold.
std::optional<double> numberText(std::string_view text) {
  try {
    return thornvale::textToDouble(text);
  } catch (const std::exception&) {
    return std::nullopt;
  }
}

// A DOM parser that reads a text in place when simdjson's padding after it
// can be read (`readable` bytes from its start), else a padded copy.
class QuickParser {
 public:
  simdjson::error_code parse(std::string_view text, size_t readable, simdjson::dom::element& root) {
    if (readable >= text.size() + simdjson::SIMDJSON_PADDING) {
      return parser_.parse(text.data(), text.size(), false).get(root);
    }
    if (padded_.size() < text.size() + simdjson::SIMDJSON_PADDING) {
      padded_.resize(text.size() + simdjson::SIMDJSON_PADDING);
    }
    std::memcpy(padded_.data(), text.data(), text.size());
    return parser_.parse(padded_.data(), text.size(), false).get(root);
  }

 private:
  simdjson::dom::parser parser_;
  std::string padded_;
};

// What one line gives besides its feature vector.
struct Row {
  double logged = std::nan("");
  double threshold = std::nan("");
  std::optional<std::string> modelId;  // none for a bare row
  int8_t label = -1;
};

// The four logging values, one bit each, to see each once.
enum LoggingValue : unsigned { kScore = 1, kModelId = 2, kFeatureVector = 4, kThreshold = 8, kAll = 15 };

unsigned loggingValueOf(std::string_view key) {
  if (key == "score") return kScore;
  if (key == "model_id") return kModelId;
  if (key == "feature_vector") return kFeatureVector;
  if (key == "threshold") return kThreshold;
  return 0;
}

const char* loggingKey(unsigned bit) {
  switch (bit) {
    case kScore: return "score";
    case kModelId: return "model_id";
    case kFeatureVector: return "feature_vector";
    default: return "threshold";
  }
}

// Reads lines into feature vectors of a model (positions as the model places
// a feature map's ids) and what else they log. Keeps its parsers and tables
// from one line to the next.
//
// Each line is read in one of two ways with the same result: a quick pass
// over simdjson's DOM, which has validated the whole text (and the feature
// vector's text), gives up at the first thing it cannot vouch for; the
// careful pass through JsonDoc reads everything else and explains the first
// problem. The quick pass must never accept a line that the careful one
// refuses, nor read a different value.
class LineReader {
 public:
  LineReader(const thornvale::BoostingModel& model, const std::optional<std::string>& label)
      : model_(model), label_(label), outer_(""), inner_(""), seen_(kTableIds, 0) {
    table_.assign(kTableIds, kNoPosition);
    for (const auto& [id, position] : model.getFeatureIndex()) {
      if (id < kTableIds) table_[id] = position;
    }
  }

  // Reads `text` (line `line`; `readable` bytes from its start may be read),
  // filling `vector` (vectorLength floats). Throws ToolError for a line that
  // is not a row. `careful` skips the quick pass (to compare the two).
  Row read(std::string_view text, size_t readable, int64_t line, float* vector, bool careful) {
    Row row;
    if (!careful && readQuickly(text, readable, vector, row)) return row;
    return readCarefully(text, line, vector);
  }

 private:
  static constexpr uint32_t kNoPosition = UINT32_MAX;
  // Longer lines go straight to the careful pass: the DOM needs several times
  // the text's size.
  static constexpr size_t kQuickLimit = size_t{1} << 20;
  struct GiveUp {};

  bool readQuickly(std::string_view text, size_t readable, float* vector, Row& row) {
    if (text.size() > kQuickLimit) return false;
    vector_ = vector;
    std::fill(vector, vector + model_.vectorLength(), 0.0f);
    startVector();
    try {
      simdjson::dom::element root;
      if (quickOuter_.parse(text, readable, root)) return false;
      simdjson::dom::object members;
      if (root.get_object().get(members)) return false;
      DomNumbers numbers(text);
      unsigned given = 0;
      unsigned givenOutside = 0;
      bool loggingData = false;
      std::optional<double> topScore;
      size_t ids = 0;
      size_t extra = 0;
      std::string_view vectorText;
      bool vectorAsText = false;
      auto logging = [&](unsigned bit, simdjson::dom::element v) {
        switch (bit) {
          case kScore: row.logged = quickLoggedNumber(v, numbers); break;
          case kThreshold: row.threshold = quickLoggedNumber(v, numbers); break;
          case kModelId: row.modelId = std::string(quickString(v)); break;
          default:
            if (v.is_string()) {
              vectorText = quickString(v);
              vectorAsText = true;
            } else {
              quickVector(v, numbers);
            }
        }
      };
      for (simdjson::dom::key_value_pair member : members) {
        const std::string_view key = member.key;
        if (label_ && key == *label_) {
          if (row.label >= 0) return false;
          row.label = quickLabel(member.value, numbers);
        } else if (key == "loggingData") {
          simdjson::dom::object inside;
          if (loggingData || member.value.get_object().get(inside)) return false;
          loggingData = true;
          for (simdjson::dom::key_value_pair m : inside) {
            const unsigned bit = loggingValueOf(m.key);
            if (bit == 0) continue;
            if (given & bit) return false;
            given |= bit;
            logging(bit, m.value);
          }
        } else if (const unsigned bit = loggingValueOf(key)) {
          if (givenOutside & bit) return false;
          givenOutside |= bit;
          if (bit == kScore) {
            topScore = quickLoggedNumber(member.value, numbers);
          } else {
            if (given & bit) return false;
            given |= bit;
            logging(bit, member.value);
          }
        } else if (key == "isOverThreshold") {
          // The verdict follows from the score and the threshold.
        } else if (const std::optional<int32_t> id = featureRowId(key)) {
          const std::optional<double> x = numbers.read(member.value);
          if (!x || !addFeature(*id, *x)) return false;
          ++ids;
        } else {
          ++extra;
        }
      }
      if (topScore && !(given & kScore)) {
        row.logged = *topScore;
        given |= kScore;
      }
      if (given != 0 || loggingData) {
        if (ids != 0 || given != kAll) return false;
        if (vectorAsText && !quickVectorText(vectorText)) return false;
      } else if (ids == 0 && extra != 0) {
        return false;
      }
      if (!endsWithoutRepeats()) return false;
      if (label_ && row.label < 0) return false;
    } catch (const GiveUp&) {
      return false;
    }
    return true;
  }

  std::string_view quickString(simdjson::dom::element v) {
    std::string_view s;
    if (v.get_string().get(s)) throw GiveUp{};
    return s;
  }

  double quickLoggedNumber(simdjson::dom::element v, DomNumbers& numbers) {
    double x = 0.0;
    if (v.is_string()) {
      const std::optional<double> read = numberText(v.get_string().value_unsafe());
      if (!read) throw GiveUp{};
      x = *read;
    } else {
      const std::optional<double> number = numbers.read(v);
      if (!number) throw GiveUp{};
      x = *number;
    }
    if (!std::isfinite(x)) throw GiveUp{};
    return x;
  }

  int8_t quickLabel(simdjson::dom::element v, DomNumbers& numbers) {
    if (v.is_bool()) return v.get_bool().value_unsafe() ? 1 : 0;
    const std::optional<double> x = numbers.read(v);
    if (x && (*x == 0.0 || *x == 1.0)) return static_cast<int8_t>(*x);
    throw GiveUp{};
  }

  void quickVector(simdjson::dom::element v, DomNumbers& numbers) {
    simdjson::dom::object members;
    if (v.get_object().get(members)) throw GiveUp{};
    for (simdjson::dom::key_value_pair member : members) {
      const std::optional<int32_t> id = featureRowId(member.key);
      if (!id) throw GiveUp{};
      const std::optional<double> x = numbers.read(member.value);
      if (!x || !addFeature(*id, *x)) throw GiveUp{};
    }
  }

  // Twenty digits in a row or more: On-Demand misreads such numbers, which
  // the careful pass reads itself.
  static bool hasLongDigitRun(std::string_view token) {
    if (token.size() < 20) return false;
    size_t run = 0;
    for (char c : token) {
      run = c >= '0' && c <= '9' ? run + 1 : 0;
      if (run >= 20) return true;
    }
    return false;
  }

  // The feature vector's text, read with simdjson On-Demand: every member is
  // read, so the object is checked to its end; numbers with long runs of
  // digits are left to the careful pass.
  bool quickVectorText(std::string_view text) {
    if (text.size() > kQuickLimit) return false;
    if (innerPadded_.size() < text.size() + simdjson::SIMDJSON_PADDING) {
      innerPadded_.resize(text.size() + simdjson::SIMDJSON_PADDING);
    }
    std::memcpy(innerPadded_.data(), text.data(), text.size());
    simdjson::ondemand::document doc;
    if (quickInner_.iterate(innerPadded_.data(), text.size(), innerPadded_.size()).get(doc)) return false;
    object members;
    if (doc.get_object().get(members)) return false;
    for (auto member : members) {
      field f;
      std::string_view key;
      if (std::move(member).get(f) || f.unescaped_key().get(key)) return false;
      int32_t id;
      if (!readFeatureRowId(key, id)) return false;
      value v = f.value();
      double x;
      if (hasLongDigitRun(v.raw_json_token()) || v.get_double().get(x) || !addFeature(id, x)) return false;
    }
    const char* at = nullptr;
    return doc.current_location().get(at) != simdjson::SUCCESS;  // nothing after the object
  }

  Row readCarefully(std::string_view text, int64_t line, float* vector) {
    vector_ = vector;
    std::fill(vector, vector + model_.vectorLength(), 0.0f);
    startVector();
    outer_.reset(text, line);
    Row row;
    unsigned given = 0;          // logging values read, wherever they were
    unsigned givenOutside = 0;   // ... outside loggingData
    bool loggingData = false;
    double topScore = 0.0;
    size_t ids = 0;
    size_t extra = 0;
    std::string vectorText;
    bool vectorAsText = false;

    auto logging = [&](unsigned bit, value& v, const std::string& path) {
      switch (bit) {
        case kScore: row.logged = loggedNumber(v, path); break;
        case kThreshold: row.threshold = loggedNumber(v, path); break;
        case kModelId: row.modelId = outer_.getString(v, path); break;
        default: {
          json_type t;
          if (auto err = v.type().get(t)) outer_.failSyntax(err, path);
          if (t == json_type::string) {
            vectorText = outer_.getString(v, path);
            vectorAsText = true;
          } else if (t == json_type::object) {
            try {
              readVector(outer_, outer_.getObject(v, path));
            } catch (const ToolError& e) {
              throw ToolError("", line, path + ": " + e.what());
            }
          } else {
            outer_.fail(v, path + ": expected a feature vector (its JSON text or an object), got " +
                               outer_.typeName(v, path));
          }
        }
      }
    };

    for (auto member : outer_.rootObject("a classification result or a feature row")) {
      field f = outer_.take(std::move(member), "");
      std::string_view key = outer_.take(f.unescaped_key(), "");
      value v = f.value();
      if (label_ && key == *label_) {
        if (row.label >= 0) outer_.fail(v, "the label " + quoteForMessage(key) + " appears twice");
        row.label = readLabel(v);
      } else if (key == "loggingData") {
        if (loggingData) outer_.fail(v, "loggingData appears twice");
        loggingData = true;
        for (auto inside : outer_.getObject(v, "loggingData")) {
          field g = outer_.take(std::move(inside), "loggingData");
          std::string_view name = outer_.take(g.unescaped_key(), "loggingData");
          value w = g.value();
          const unsigned bit = loggingValueOf(name);
          if (bit == 0) continue;  // a logging value of another version
          if (given & bit) outer_.fail(w, "loggingData." + std::string(name) + " appears twice");
          given |= bit;
          logging(bit, w, "loggingData." + std::string(name));
        }
      } else if (const unsigned bit = loggingValueOf(key)) {
        if (givenOutside & bit) outer_.fail(v, std::string(key) + " appears twice");
        givenOutside |= bit;
        if (bit == kScore) {
          topScore = loggedNumber(v, "score");  // the result's own score; the logged text comes first
        } else {
          if (given & bit) outer_.fail(v, std::string(key) + " is given in loggingData and outside it");
          given |= bit;
          logging(bit, v, std::string(key));
        }
      } else if (key == "isOverThreshold") {
        // The verdict follows from the score and the threshold.
      } else if (featureRowId(key)) {
        const FeatureMember m = readFeatureMember(outer_, key, v);
        if (!addFeature(m.id, m.value)) outer_.fail(v, "feature " + std::to_string(m.id) + " appears twice");
        ++ids;
      } else {
        ++extra;  // a user id, a collection id, ...
      }
    }
    outer_.expectEnd();

    if ((givenOutside & kScore) && !(given & kScore)) {
      row.logged = topScore;
      given |= kScore;
    }
    if (given != 0 || loggingData) {
      if (ids != 0) throw ToolError("", line, "a line holds logging values or feature ids, not both");
      for (unsigned bit = 1; bit < kAll; bit <<= 1) {
        if (!(given & bit)) throw ToolError("", line, std::string("no logged ") + loggingKey(bit));
      }
      if (vectorAsText) {
        inner_.reset(vectorText, line);
        try {
          readVector(inner_, inner_.rootObject("a feature vector"));
          inner_.expectEnd();
        } catch (const ToolError& e) {
          throw ToolError("", line, std::string("feature_vector: ") + e.what());
        }
      }
    } else if (ids == 0 && extra != 0) {
      throw ToolError("", line, "neither a classification result (no feature_vector) nor a feature row");
    }
    endVector(line);
    if (label_ && row.label < 0) throw ToolError("", line, "no label " + quoteForMessage(*label_));
    return row;
  }

  void startVector() {
    if (++stamp_ == 0) {  // after 2^32 rows: start the table afresh
      std::fill(seen_.begin(), seen_.end(), 0);
      stamp_ = 1;
    }
    others_.clear();
  }

  // Places one feature as the model places a map's entry; false when the id
  // was given before in this row.
  bool addFeature(int32_t id, double x) {
    const auto key = static_cast<uint32_t>(id);
    uint32_t position = kNoPosition;
    if (key < kTableIds) {
      if (seen_[key] == stamp_) return false;
      seen_[key] = stamp_;
      position = table_[key];
    } else {
      others_.push_back(id);
      const auto& index = model_.getFeatureIndex();
      const auto found = index.find(key);
      if (found != index.end()) position = found->second;
    }
    if (position != kNoPosition) vector_[position] = static_cast<float>(x);
    return true;
  }

  // Repeats among the ids outside the table, found by sorting them.
  void endVector(int64_t line) {
    if (!endsWithoutRepeats()) {
      throw ToolError("", line, "feature " + std::to_string(*std::adjacent_find(others_.begin(), others_.end())) +
                                    " appears twice");
    }
  }

  bool endsWithoutRepeats() {
    if (others_.size() < 2) return true;
    std::sort(others_.begin(), others_.end());
    return std::adjacent_find(others_.begin(), others_.end()) == others_.end();
  }

  void readVector(JsonDoc& doc, object row) {
    readFeatureRow(doc, row, [&](int32_t id, double x) { return addFeature(id, x); });
  }

  // A logged score or threshold: the phone's number text, or a JSON number.
  double loggedNumber(value& v, const std::string& path) {
    json_type t;
    if (auto err = v.type().get(t)) outer_.failSyntax(err, path);
    double x = 0.0;
    if (t == json_type::string) {
      const std::string text = outer_.getString(v, path);
      const std::optional<double> read = numberText(text);
      if (!read) outer_.fail(v, path + ": expected a number text, got " + quoteForMessage(text));
      x = *read;
    } else if (t == json_type::number) {
      x = outer_.getDouble(v, path);
    } else {
      outer_.fail(v, path + ": expected a number text or a number, got " + outer_.typeName(v, path));
    }
    if (!std::isfinite(x)) outer_.fail(v, path + ": " + thornvale::doubleToText(x) + " is not a finite number");
    return x;
  }

  int8_t readLabel(value& v) {
    const std::string path = "label " + quoteForMessage(*label_);
    json_type t;
    if (auto err = v.type().get(t)) outer_.failSyntax(err, path);
    if (t == json_type::boolean) return outer_.getBool(v, path) ? 1 : 0;
    if (t == json_type::number) {
      const double x = outer_.getDouble(v, path);
      if (x == 0.0 || x == 1.0) return static_cast<int8_t>(x);
    }
    outer_.fail(v, path + ": expected true, false, 0 or 1, got " + quoteForMessage(JsonDoc::tokenOf(v)));
  }

  const thornvale::BoostingModel& model_;
  const std::optional<std::string>& label_;
  JsonDoc outer_;  // the line
  JsonDoc inner_;  // the feature vector's text
  QuickParser quickOuter_;
  simdjson::ondemand::parser quickInner_;
  std::string innerPadded_;
  std::vector<uint32_t> table_;  // position of each small id
  std::vector<uint32_t> seen_;   // the stamp of the row that last gave each small id
  uint32_t stamp_ = 0;
  std::vector<int32_t> others_;  // the row's other ids
  float* vector_ = nullptr;
};

}  // namespace

LogBlock replayBlock(const thornvale::BoostingModel& model, std::string_view data,
                     const std::optional<std::string>& label, int64_t firstLine, size_t maxLine,
                     size_t maxReasons, bool careful) {
  LogBlock out;
  LineReader reader(model, label);
  const size_t length = model.vectorLength();
  std::vector<float> vectors(kBlockRows * std::max<size_t>(length, 1));
  std::unordered_map<std::string, int32_t> modelIndex;
  int32_t lastModel = -1;
  size_t pending = 0;  // rows read into `vectors`, not yet scored
  auto score = [&] {
    if (pending == 0) return;
    model.rawScores(length == 0 ? nullptr : vectors.data(), pending, length,
                    out.candidate.data() + out.candidate.size() - pending);
    pending = 0;
  };

  const char* p = data.data();
  const char* const end = p + data.size();
  int64_t line = firstLine;
  while (p < end) {
    const char* newline = static_cast<const char*>(std::memchr(p, '\n', static_cast<size_t>(end - p)));
    const char* stop = newline != nullptr ? newline : end;
    const std::string_view text(p, static_cast<size_t>(stop - p));
    p = newline != nullptr ? newline + 1 : end;
    const int64_t here = line++;
    ++out.lines;
    if (isBlank(text)) continue;
    ++out.read;
    Row row;
    try {
      if (text.size() > maxLine) {
        throw ToolError("", here, "the line is longer than " + std::to_string(maxLine) + " bytes");
      }
      row = reader.read(text, static_cast<size_t>(end - text.data()), here, vectors.data() + pending * length,
                        careful);
    } catch (const ToolError& e) {
      ++out.refused;
      if (out.reasons.size() < maxReasons) out.reasons.emplace_back(here, e.what());
      continue;
    }
    int32_t index = -1;
    if (row.modelId) {
      if (lastModel >= 0 && *row.modelId == out.models[static_cast<size_t>(lastModel)]) {
        index = lastModel;  // logs come mostly in runs of one model
      } else {
        index = modelIndex.emplace(*row.modelId, static_cast<int32_t>(out.models.size())).first->second;
        if (index == static_cast<int32_t>(out.models.size())) out.models.push_back(std::move(*row.modelId));
        lastModel = index;
      }
    }
    out.logged.push_back(row.logged);
    out.threshold.push_back(row.threshold);
    out.model.push_back(index);
    out.label.push_back(row.label);
    out.line.push_back(here);
    out.candidate.push_back(0.0);
    if (++pending == kBlockRows) score();
  }
  score();
  for (double& s : out.candidate) s = thornvale::logistic(s);
  return out;
}

}  // namespace reliqa::tool

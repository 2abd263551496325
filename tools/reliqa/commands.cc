#include "tools/reliqa/commands.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <memory>
#include <optional>
#include <stdexcept>

#include "reliqaclassifier/FeatureExtraction.h"
#include "reliqaclassifier/ReliqasClassifier.h"
#include "tools/common/classifier_store.h"
#include "tools/common/collection_reader.h"
#include "tools/common/errors.h"
#include "tools/common/feature_rows.h"
#include "tools/common/xgboost_covers.h"
#include "tools/common/xgboost_model.h"
#include "tools/reliqa/explain.h"
#include "tools/reliqa/inspect.h"
#include "tools/reliqa/pdp.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonError.h"
#include "xplat/gbdtclassifier/GbdtClassifier/JsonWriter.h"
#include "xplat/gbdtclassifier/GbdtClassifier/NumberText.h"

namespace reliqa::tool {

namespace rc = kestrova::reliqaclassifier;

namespace {

void warn(const std::string& file, const std::string& what) {
  std::cerr << "reliqa: warning: " << (file.empty() ? "" : file + ": ") << what << std::endl;
}

// Calls `onDocument(text, name, firstLine)` for the input: the whole file for
// a path, each non-blank line for standard input (JSON Lines).
template <class F>
void forEachDocument(const std::string& input, ResultWriter& out, F&& onDocument) {
  if (input != "-") {
    onDocument(std::string_view(readFile(input)), displayName(input), int64_t{1});
    return;
  }
  LineReader lines(input, &out);
  std::string line;
  while (lines.next(line)) {
    if (line.find_first_not_of(" \t") == std::string::npos) continue;
    onDocument(std::string_view(line), lines.name(), lines.lineNumber());
  }
}

// Calls `onCollection(collection, name, line)` for every collection of the
// input, read into one reused record.
template <class F>
void forEachCollection(const std::string& input, ResultWriter& out, F&& onCollection) {
  CollectionReader reader;
  rc::ReliqaClassifierInput collection;
  forEachDocument(input, out, [&](std::string_view text, const std::string& name, int64_t line) {
    reader.read(text, name, line, collection);
    onCollection(collection, name, line);
  });
}

// Calls `onRow(row, name, line)` for every non-blank line of a JSON Lines
// file of feature rows ("-" for standard input).
template <class F>
void forEachRow(const std::string& rows, ResultWriter& out, F&& onRow) {
  LineReader lines(rows, &out);
  std::string line;
  while (lines.next(line)) {
    if (line.find_first_not_of(" \t") == std::string::npos) continue;
    onRow(parseFeatureRow(line, lines.name(), lines.lineNumber()), lines.name(), lines.lineNumber());
  }
}

// Binary XGBoost models are told apart by their file name.
void refuseBinaryXgboost(const std::string& path) {
  if (path.size() > 4 && path.compare(path.size() - 4, 4, ".ubj") == 0) {
    throw ToolError(displayName(path), 0,
                    "binary (UBJSON) models cannot be read; save the model as JSON: save_model(\"model.json\")");
  }
}

// {"score":S,"isOverThreshold":B,"loggingData":{...}} into `s`.
void writeResultJson(const rc::ReliqaClassifierResult& r, std::string& s) {
  s.assign("{\"score\":");
  s += thornvale::doubleToJson(r.score);
  s += ",\"isOverThreshold\":";
  s += r.isOverThreshold ? "true" : "false";
  s += ",\"loggingData\":{";
  bool first = true;
  for (const auto& [key, value] : r.loggingData) {
    if (!first) s += ',';
    first = false;
    appendJsonString(s, key);
    s += ':';
    appendJsonString(s, value);
  }
  s += "}}";
}

}  // namespace

std::string defaultStorePath() {
  const char* xdg = std::getenv("XDG_DATA_HOME");
  if (xdg != nullptr && xdg[0] == '/') return std::string(xdg) + "/reliqa/store.db";
  const char* home = std::getenv("HOME");
  if (home == nullptr || home[0] == '\0') {
    throw UsageError("neither XDG_DATA_HOME nor HOME is set; give the store with --store PATH");
  }
  return std::string(home) + "/.local/share/reliqa/store.db";
}

void setModel(const SetModelOptions& o) {
  if (!std::isfinite(o.threshold)) {
    throw UsageError("--threshold must be a finite number, got " + thornvale::doubleToText(o.threshold));
  }
  rc::ReliqaClassifierModelParams params;
  params.mModelId = o.modelId;
  params.mThreshold = o.threshold;
  std::string name;
  if (o.model) {
    name = displayName(*o.model);
    params.mSerializedModel = readFile(*o.model);
  }
  tool::setModel(o.store, params, name, "give a replacement with --model FILE", warn);
}

void setServerFeatures(const std::string& store, const std::string& file) {
  tool::setServerFeatures(store, parseServerFeatures(readFile(file), displayName(file)));
}

void printModelId(const std::string& store, ResultWriter& out) {
  auto classifier = openClassifier(store);
  out.line(classifier->currentlyUsedModelId());
}

void classify(const std::string& store, const std::string& input, ResultWriter& out) {
  auto classifier = openClassifier(store);
  std::string json;
  forEachCollection(input, out, [&](const rc::ReliqaClassifierInput& collection, const std::string& name,
                                    int64_t line) {
    try {
      writeResultJson(classifier->classify(collection), json);
    } catch (const std::exception& e) {
      throw ToolError(name, line, std::string("classification failed: ") + e.what());
    }
    out.line(json);
  });
}

void features(const std::string& input, ResultWriter& out) {
  forEachCollection(input, out, [&](const rc::ReliqaClassifierInput& collection, const std::string& name,
                                    int64_t line) {
    std::string json;
    try {
      json = thornvale::featureMapToJson(rc::extractFeatures(collection));
    } catch (const std::exception& e) {
      throw ToolError(name, line, std::string("feature extraction failed: ") + e.what());
    }
    out.line(json);
  });
}

void score(const std::string& modelPath, const std::string& rows, bool raw, ResultWriter& out) {
  if (modelPath == "-" && rows == "-") throw UsageError("the model and the rows cannot both come from standard input");
  auto model = loadModel(displayName(modelPath), readFile(modelPath));
  forEachRow(rows, out, [&](const thornvale::FeatureMap& row, const std::string&, int64_t) {
    out.line(thornvale::doubleToText(raw ? model->rawScore(row) : model->predict(row)));
  });
}

void explain(const ExplainOptions& o, ResultWriter& out) {
  if (!o.xgboost && !o.background) {
    throw UsageError("node covers are needed and never guessed: give --xgboost MODEL.json (the XGBoost model that "
                     "the model was converted from) or --background ROWS.jsonl (feature rows to count them over)");
  }
  if (o.xgboost && o.background) throw UsageError("--xgboost and --background both give the covers; give one");
  if (!o.input && !o.rows) throw UsageError("give a collection (FILE, or - for JSON Lines) or --rows FILE");
  if (o.input && o.rows) throw UsageError("give a collection or --rows, not both");
  int fromStdin = 0;
  for (const auto* path : {&o.xgboost, &o.background, &o.input, &o.rows}) fromStdin += *path == "-";
  if (fromStdin + (o.model == "-") > 1) throw UsageError("only one input can come from standard input");

  const std::string modelName = displayName(o.model);
  auto model = loadModel(modelName, readFile(o.model));
  thornvale::TreeCovers covers;
  std::string coversName;
  if (o.xgboost) {
    coversName = displayName(*o.xgboost);
    refuseBinaryXgboost(*o.xgboost);
    covers = xgboostCovers(readXgboostModel(readFile(*o.xgboost), coversName), *model, coversName);
  } else {
    coversName = displayName(*o.background);
    CoverCounter counter(*model);
    forEachRow(*o.background, out, [&](const thornvale::FeatureMap& row, const std::string&, int64_t) {
      counter.add(row);
    });
    if (counter.rows() == 0) throw ToolError(coversName, 0, "the background has no rows to count covers over");
    covers = counter.covers();
  }
  std::optional<ScoreExplainer> explainer;
  try {
    explainer.emplace(*model, covers);
  } catch (const std::invalid_argument& e) {
    throw ToolError(coversName, 0, std::string("the covers cannot be used: ") + e.what());
  }

  // With --svg the one input is drawn once the input has ended: a second
  // input is refused and no chart is written.
  int64_t inputs = 0;
  std::string svg;
  auto onInput = [&](const thornvale::FeatureMap& features, const std::string& name, int64_t line) {
    if (o.svg && ++inputs > 1) {
      throw ToolError(name, line, "--svg draws one input, and this is a second one; give one collection or row");
    }
    const Explanation e = explainer->explain(features);
    try {
      out.line(explainer->json(e));
      if (o.svg) {
        const std::string where = name + (o.rows || *o.input == "-" ? ":" + std::to_string(line) : "");
        svg = explainer->waterfallSvg(e, "Contributions to the raw score of " + where + " (" + modelName + ")");
      }
    } catch (const thornvale::JsonPrintError& error) {
      throw ToolError(name, line, std::string("the explanation cannot be written: ") + error.what());
    }
  };
  if (o.rows) {
    forEachRow(*o.rows, out, onInput);
  } else {
    forEachCollection(*o.input, out, [&](const rc::ReliqaClassifierInput& collection, const std::string& name,
                                         int64_t line) {
      thornvale::FeatureMap features;
      try {
        features = rc::extractFeatures(collection);
      } catch (const std::exception& e) {
        throw ToolError(name, line, std::string("feature extraction failed: ") + e.what());
      }
      onInput(features, name, line);
    });
  }
  if (o.svg) {
    if (inputs == 0) throw ToolError(displayName(o.rows ? *o.rows : *o.input), 0, "--svg: there is no input to draw");
    writeFileAtomically(*o.svg, svg);
  }
}

void inspect(const InspectOptions& o, ResultWriter& out) {
  if (o.tree && *o.tree < 0) throw UsageError("--tree: trees are numbered from 0");
  std::string name = displayName(o.model);
  std::string text = readFile(o.model);
  auto model = loadModel(name, text);
  if (!o.tree && !o.rules) {
    out.write(describeModel(name, text, model->getForest(), model->uses16BitForest()));
    return;
  }
  thornvale::Forest forest = model->getForest();  // a copy that the printers may link
  if (o.rules) {
    out.write(printAllRules(name, forest, o.tree ? *o.tree : -1));
  } else {
    out.write(printOneTree(name, forest, *o.tree));
  }
}

void pdp(const PdpOptions& o, ResultWriter& out) {
  if (!std::isfinite(o.from) || !std::isfinite(o.to) || !(o.from < o.to)) {
    throw UsageError("--from and --to must be finite numbers with --from below --to");
  }
  if (o.steps < 2 || o.steps > 1000000) throw UsageError("--steps must be between 2 and 1000000");
  std::string name = displayName(o.model);
  auto model = loadModel(name, readFile(o.model));
  thornvale::FeatureMap fixed;
  if (o.features) fixed = parseFeatureRow(readFile(*o.features), displayName(*o.features));
  PdpCurve curve = partialDependence(name, model->getForest(), o.feature, fixed, o.from, o.to, o.steps);
  if (o.svg) writeFileAtomically(*o.svg, pdpSvg(curve, o.feature, name));
  out.write(pdpCsv(curve));
}

void convertXgboost(const ConvertOptions& o, ResultWriter& out, bool verbose) {
  const std::string name = displayName(o.input);
  const std::vector<int64_t> given = parseIdList(o.featureIds);
  refuseBinaryXgboost(o.input);
  const ConvertedModel converted = convertXgboostJson(readFile(o.input), name, given, "--feature-ids 1,2,...");
  if (o.output == "-") {
    out.write(converted.text);
  } else {
    writeFileAtomically(o.output, converted.text);
  }
  if (verbose) {
    std::cerr << "reliqa: converted " << converted.trees << " trees over " << converted.featureIds.size()
              << " features into " << o.output << std::endl;
  }
}

void writeFileAtomically(const std::string& path, const std::string& bytes) {
  std::string tmp = path + ".tmp-" + std::to_string(::getpid());
  int fd = ::open(tmp.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
  if (fd < 0) throw ToolError(path, 0, std::string("cannot write: ") + std::strerror(errno));
  size_t done = 0;
  while (done < bytes.size()) {
    ssize_t n = ::write(fd, bytes.data() + done, bytes.size() - done);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) {
      int e = errno;
      ::close(fd);
      ::unlink(tmp.c_str());
      throw ToolError(path, 0, std::string("cannot write: ") + std::strerror(e));
    }
    done += static_cast<size_t>(n);
  }
  if (::fsync(fd) != 0 || ::close(fd) != 0 || ::rename(tmp.c_str(), path.c_str()) != 0) {
    int e = errno;
    ::unlink(tmp.c_str());
    throw ToolError(path, 0, std::string("cannot write: ") + std::strerror(e));
  }
}

}  // namespace reliqa::tool

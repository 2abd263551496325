// reliqa: classify candidate collections, manage the model parameters kept in
// the persistent store, score and inspect models, convert XGBoost models.
//
// Exit status: 0 on success, 2 when the command line or an input is refused
// (one line "reliqa: FILE:LINE: what is wrong" on standard error). Results are
// the only thing written to standard output; log messages and whatever the
// libraries print go to standard error.
#include <glog/logging.h>

#include <CLI/CLI.hpp>
#include <ctime>
#include <iostream>

#include "tools/reliqa/commands.h"
#include "tools/reliqa/errors.h"
#include "tools/reliqa/io.h"

namespace {

using namespace reliqa::tool;

std::string oneLine(std::string s) {
  for (char& c : s) {
    if (c == '\n') c = ' ';
  }
  while (!s.empty() && s.back() == ' ') s.pop_back();
  return s;
}

// The subcommand path named on the command line ("convert xgboost"), for the
// pointer to --help in usage errors.
std::string commandPath(const CLI::App& app, int argc, char** argv) {
  std::string path;
  const CLI::App* at = &app;
  for (int i = 1; i < argc; ++i) {
    const CLI::App* sub = nullptr;
    for (const CLI::App* s : at->get_subcommands([](const CLI::App*) { return true; })) {
      if (s->get_name() == argv[i]) sub = s;
    }
    if (sub == nullptr) continue;
    path += " " + sub->get_name();
    at = sub;
  }
  return path;
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{
      "reliqa: decide whether a candidate collection of photos and videos is worth showing.\n"
      "Model parameters and server features live in a persistent store (SQLite); results go to\n"
      "standard output, messages to standard error. Exit status 2 means the input was refused."};
  app.name("reliqa");
  app.footer("Run 'reliqa COMMAND --help' for the details of a command.");
  app.require_subcommand(1);
  app.fallthrough();  // --store and --verbose also after the command
  std::string store;
  bool verbose = false;
  app.add_option("--store", store,
                 "the store database, created if missing (default $XDG_DATA_HOME/reliqa/store.db, "
                 "else ~/.local/share/reliqa/store.db)");
  app.add_flag("-v,--verbose", verbose, "also write INFO log messages to standard error");

  SetModelOptions setModelOptions;
  std::string modelFile;
  auto* setModelCmd = app.add_subcommand("set-model", "Store a model, its identifier and its threshold")->footer(
      "Store model parameters (as the app's setModelParams call does). The model is loaded here first: a model "
      "the classifier would reject is never stored.\nExample: reliqa set-model --model model.txt --model-id v7 "
      "--threshold 0.5");
  auto* modelOpt = setModelCmd->add_option("--model", modelFile,
                                           "model text (- for standard input); without it, or when it is empty, "
                                           "only the identifier and the threshold change");
  setModelCmd->add_option("--model-id", setModelOptions.modelId, "model identifier")->required();
  setModelCmd->add_option("--threshold", setModelOptions.threshold,
                          "decision threshold: a collection is accepted when its score is greater")
      ->required();

  std::string serverFeaturesFile;
  auto* serverCmd = app.add_subcommand("set-server-features", "Replace the stored server features")->footer(
      "Replace the stored server features. FILE holds a JSON object of feature-id text to number text, like the "
      "app's map ({\"12\": \"0.5\"}); keys are read by the C atoi rules, values by strtod, the first key for an "
      "id wins, keys beyond 32 bits are dropped with a warning.\nExample: reliqa set-server-features "
      "server_features.json");
  serverCmd->add_option("FILE", serverFeaturesFile, "JSON file (- for standard input)")->required();

  auto* modelIdCmd = app.add_subcommand("model-id", "Print the stored model identifier");

  std::string classifyInput;
  auto* classifyCmd = app.add_subcommand("classify", "Classify collections with the stored parameters")->footer(
      "Classify a collection with the stored parameters; prints {\"score\":S,\"isOverThreshold\":B,"
      "\"loggingData\":{...}} on one line. With -, reads JSON Lines (one collection per line; blank lines are "
      "skipped) and answers each line as it arrives; a refused line ends the run with status 2 after the answers "
      "to the lines before it. Hour features use the process's time zone (TZ).\nExample: reliqa classify "
      "collection.json");
  classifyCmd->add_option("FILE", classifyInput, "collection JSON file, or - for JSON Lines on standard input")
      ->required();

  std::string featuresInput;
  auto* featuresCmd = app.add_subcommand("features", "Print the computed features of collections")->footer(
      "Print the computed features of a collection as a compact JSON object (no store needed). With -, reads "
      "JSON Lines, as classify does. Feature 2 is absent without a location.\nExample: reliqa features "
      "collection.json");
  featuresCmd->add_option("FILE", featuresInput, "collection JSON file, or - for JSON Lines on standard input")
      ->required();

  std::string scoreModel, scoreRows = "-";
  bool raw = false;
  auto* scoreCmd = app.add_subcommand("score", "Score feature rows with a model (no store)")->footer(
      "Score feature rows with a model, no store: each input line is a JSON object of feature id to number "
      "({\"3\":0.25,\"17\":-1}); each output line is the score. Absent features read as 0; blank lines are "
      "skipped; a refused line ends the run with status 2.\nExample: reliqa "
      "score --model model.txt rows.jsonl");
  scoreCmd->add_option("--model", scoreModel, "model text")->required();
  scoreCmd->add_option("ROWS", scoreRows, "JSON Lines file of feature rows (default -, standard input)");
  scoreCmd->add_flag("--raw", raw, "print the raw score (the sum before the logistic)");

  InspectOptions inspectOptions;
  int64_t treeIndex = 0;
  auto* inspectCmd = app.add_subcommand("inspect", "Summarise or print a model")->footer(
      "Summarise a model text: format version, trees kept and dropped, depths and leaves, base score, input keys, "
      "feature mapping, equality features, selector and sub-models, 16- or 32-bit compiled forest.\nExample: "
      "reliqa inspect model.txt --tree 0");
  inspectCmd->add_option("MODEL", inspectOptions.model, "model text")->required();
  auto* treeOpt = inspectCmd->add_option("--tree", treeIndex, "print tree N (numbered from 0) instead");
  inspectCmd->add_flag("--rules", inspectOptions.rules,
                       "print one rule line per leaf, leaves of larger value first (of every tree, or of --tree N)");

  PdpOptions pdpOptions;
  std::string pdpFeatures, pdpSvg;
  auto* pdpCmd = app.add_subcommand("pdp", "Partial dependence of the raw score on one feature")->footer(
      "Partial dependence: the raw score as one feature sweeps --steps values from --from to --to, the other "
      "features from --features (else 0). Computed on the model's trees with comparisons in double, as the "
      "tree nodes compare (the compiled forest used by score and classify compares floats). Prints CSV; models "
      "with a selector are refused.\nExample: reliqa pdp model.txt --feature 4 --from 0 --to 100 --steps 50 "
      "--svg pdp.svg");
  pdpCmd->add_option("MODEL", pdpOptions.model, "model text")->required();
  pdpCmd->add_option("--feature", pdpOptions.feature, "feature id to sweep")->required();
  pdpCmd->add_option("--from", pdpOptions.from, "first value")->required();
  pdpCmd->add_option("--to", pdpOptions.to, "last value (above --from)")->required();
  pdpCmd->add_option("--steps", pdpOptions.steps, "number of values, 2 to 1000000")->required();
  auto* pdpFeaturesOpt = pdpCmd->add_option("--features", pdpFeatures, "JSON object of the other features' values");
  auto* pdpSvgOpt = pdpCmd->add_option("--svg", pdpSvg, "also draw the curve as an SVG line chart into this file");

  auto* convertCmd = app.add_subcommand("convert", "Convert a model from another trainer");
  convertCmd->require_subcommand(1);
  ConvertOptions convertOptions;
  auto* xgboostCmd = convertCmd->add_subcommand("xgboost", "Convert an XGBoost JSON model")->footer(
      "Convert an XGBoost JSON model (gbtree booster, binary:logistic or reg:logistic) into a model text of "
      "format version 4. XGBoost's `x < split` becomes `x <= t` with t the largest float below the split, the "
      "base score the logit of base_score. Missing values cannot be represented: a converted model sends NaN by "
      "its own rule, not by XGBoost's default directions, so give every feature a value. Other objectives, "
      "linear or dart boosters, categorical splits and multi-class models are refused.\nExample: reliqa convert "
      "xgboost model.json -o model.txt");
  xgboostCmd->add_option("MODEL", convertOptions.input, "XGBoost JSON model (save_model(\"model.json\"))")
      ->required();
  xgboostCmd->add_option("--feature-ids", convertOptions.featureIds,
                         "comma-separated feature ids, one per XGBoost feature in order (default: the feature "
                         "names, which must then be integers)");
  xgboostCmd->add_option("-o,--output", convertOptions.output, "output model text (- for standard output)")
      ->required();

  try {
    app.parse(argc, argv);
  } catch (const CLI::Success& e) {
    return app.exit(e);  // --help
  } catch (const CLI::ParseError& e) {
    std::string cmd = commandPath(app, argc, argv);
    std::string what = oneLine(e.what());
    if (cmd.empty()) {
      // CLI11 reports an unknown command as a missing one; name it instead.
      for (int i = 1; i < argc; ++i) {
        std::string arg = argv[i];
        if (arg == "--store") ++i;
        if (arg.empty() || arg[0] == '-') continue;
        what = "unknown command '" + arg + "'";
        break;
      }
    }
    std::cerr << "reliqa:" << cmd << (cmd.empty() ? " " : ": ") << what << "; see 'reliqa" << cmd << " --help'"
              << std::endl;
    return 2;
  }

  google::InitGoogleLogging("reliqa");
  FLAGS_logtostderr = true;
  FLAGS_minloglevel = verbose ? google::GLOG_INFO : google::GLOG_WARNING;
  tzset();

  ResultWriter out;
  try {
    auto storePath = [&] { return store.empty() ? defaultStorePath() : store; };
    if (setModelCmd->parsed()) {
      setModelOptions.store = storePath();
      if (*modelOpt) setModelOptions.model = modelFile;
      setModel(setModelOptions);
    } else if (serverCmd->parsed()) {
      setServerFeatures(storePath(), serverFeaturesFile);
    } else if (modelIdCmd->parsed()) {
      printModelId(storePath(), out);
    } else if (classifyCmd->parsed()) {
      classify(storePath(), classifyInput, out);
    } else if (featuresCmd->parsed()) {
      features(featuresInput, out);
    } else if (scoreCmd->parsed()) {
      score(scoreModel, scoreRows, raw, out);
    } else if (inspectCmd->parsed()) {
      if (*treeOpt) inspectOptions.tree = treeIndex;
      inspect(inspectOptions, out);
    } else if (pdpCmd->parsed()) {
      if (*pdpFeaturesOpt) pdpOptions.features = pdpFeatures;
      if (*pdpSvgOpt) pdpOptions.svg = pdpSvg;
      pdp(pdpOptions, out);
    } else if (xgboostCmd->parsed()) {
      convertXgboost(convertOptions, out, verbose);
    }
    out.flush();
  } catch (const UsageError& e) {
    std::string cmd = commandPath(app, argc, argv);
    std::cerr << "reliqa:" << cmd << ": " << e.what() << "; see 'reliqa" << cmd << " --help'" << std::endl;
    return 2;
  } catch (const ToolError& e) {
    try {
      out.flush();  // the results before the refused input
    } catch (const ToolError&) {
    }
    std::cerr << "reliqa: " << e.describe() << std::endl;
    return 2;
  } catch (const std::exception& e) {
    std::cerr << "reliqa: " << e.what() << std::endl;
    return 2;
  }
  return 0;
}

// reliqa: classify candidate collections, manage the model parameters kept in
// the persistent store, score, explain and inspect models, convert XGBoost
// models.
//
// Exit status: 0 on success, 2 when the command line or an input is refused
// (one line "reliqa: FILE:LINE: what is wrong" on standard error). Results are
// the only thing written to standard output; log messages and whatever the
// libraries print go to standard error.
#include <glog/logging.h>

#include <CLI/CLI.hpp>
#include <ctime>
#include <functional>
#include <iostream>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "tools/reliqa/commands.h"
#include "tools/common/errors.h"
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

// What a command's handler is given once the command line has been read.
struct Context {
  std::string store;  // --store, or empty for the default
  bool verbose = false;
  ResultWriter* out = nullptr;

  std::string storePath() const { return store.empty() ? defaultStorePath() : store; }
};
using Handler = std::function<void(Context&)>;

// One command: where it sits, how `--help` describes it, and a function that
// declares its options on its CLI11 subcommand and returns its handler (which
// owns the variables those options fill).
struct Command {
  const char* parent;  // nullptr, or the command it is a subcommand of
  const char* name;
  const char* summary;
  const char* footer;
  std::function<Handler(CLI::App&)> define;
};

Handler defineSetModel(CLI::App& cmd) {
  auto o = std::make_shared<SetModelOptions>();
  auto file = std::make_shared<std::string>();
  auto* model = cmd.add_option("--model", *file,
                               "model text (- for standard input); without it, or when it is empty, "
                               "only the identifier and the threshold change");
  cmd.add_option("--model-id", o->modelId, "model identifier")->required();
  cmd.add_option("--threshold", o->threshold, "decision threshold: a collection is accepted when its score is greater")
      ->required();
  return [o, file, model](Context& c) {
    o->store = c.storePath();
    if (*model) o->model = *file;
    setModel(*o);
  };
}

Handler defineSetServerFeatures(CLI::App& cmd) {
  auto file = std::make_shared<std::string>();
  cmd.add_option("FILE", *file, "JSON file (- for standard input)")->required();
  return [file](Context& c) { setServerFeatures(c.storePath(), *file); };
}

Handler defineModelId(CLI::App&) {
  return [](Context& c) { printModelId(c.storePath(), *c.out); };
}

Handler defineClassify(CLI::App& cmd) {
  auto input = std::make_shared<std::string>();
  cmd.add_option("FILE", *input, "collection JSON file, or - for JSON Lines on standard input")->required();
  return [input](Context& c) { classify(c.storePath(), *input, *c.out); };
}

Handler defineFeatures(CLI::App& cmd) {
  auto input = std::make_shared<std::string>();
  cmd.add_option("FILE", *input, "collection JSON file, or - for JSON Lines on standard input")->required();
  return [input](Context& c) { features(*input, *c.out); };
}

Handler defineScore(CLI::App& cmd) {
  struct Options {
    std::string model, rows = "-";
    bool raw = false;
  };
  auto o = std::make_shared<Options>();
  cmd.add_option("--model", o->model, "model text")->required();
  cmd.add_option("ROWS", o->rows, "JSON Lines file of feature rows (default -, standard input)");
  cmd.add_flag("--raw", o->raw, "print the raw score (the sum before the logistic)");
  return [o](Context& c) { score(o->model, o->rows, o->raw, *c.out); };
}

Handler defineExplain(CLI::App& cmd) {
  struct Options {
    ExplainOptions o;
    std::string xgboost, background, input, rows, svg;
  };
  auto h = std::make_shared<Options>();
  cmd.add_option("--model", h->o.model, "model text")->required();
  auto* xgboost = cmd.add_option("--xgboost", h->xgboost,
                                 "covers from the XGBoost JSON model that the model was converted from");
  auto* background = cmd.add_option("--background", h->background,
                                    "covers counted over these feature rows (JSON Lines, - for standard input)");
  auto* input = cmd.add_option("FILE", h->input, "collection JSON file, or - for JSON Lines on standard input");
  auto* rows =
      cmd.add_option("--rows", h->rows, "explain these feature rows instead (JSON Lines, - for standard input)");
  auto* svg = cmd.add_option("--svg", h->svg, "also draw the one input as an SVG waterfall chart into this file");
  return [h, xgboost, background, input, rows, svg](Context& c) {
    if (*xgboost) h->o.xgboost = h->xgboost;
    if (*background) h->o.background = h->background;
    if (*input) h->o.input = h->input;
    if (*rows) h->o.rows = h->rows;
    if (*svg) h->o.svg = h->svg;
    explain(h->o, *c.out);
  };
}

Handler defineInspect(CLI::App& cmd) {
  auto o = std::make_shared<InspectOptions>();
  auto tree = std::make_shared<int64_t>(0);
  cmd.add_option("MODEL", o->model, "model text")->required();
  auto* treeOpt = cmd.add_option("--tree", *tree, "print tree N (numbered from 0) instead");
  cmd.add_flag("--rules", o->rules,
               "print one rule line per leaf, leaves of larger value first (of every tree, or of --tree N)");
  return [o, tree, treeOpt](Context& c) {
    if (*treeOpt) o->tree = *tree;
    inspect(*o, *c.out);
  };
}

Handler definePdp(CLI::App& cmd) {
  auto o = std::make_shared<PdpOptions>();
  auto features = std::make_shared<std::string>();
  auto svg = std::make_shared<std::string>();
  cmd.add_option("MODEL", o->model, "model text")->required();
  cmd.add_option("--feature", o->feature, "feature id to sweep")->required();
  cmd.add_option("--from", o->from, "first value")->required();
  cmd.add_option("--to", o->to, "last value (above --from)")->required();
  cmd.add_option("--steps", o->steps, "number of values, 2 to 1000000")->required();
  auto* featuresOpt = cmd.add_option("--features", *features, "JSON object of the other features' values");
  auto* svgOpt = cmd.add_option("--svg", *svg, "also draw the curve as an SVG line chart into this file");
  return [o, features, svg, featuresOpt, svgOpt](Context& c) {
    if (*featuresOpt) o->features = *features;
    if (*svgOpt) o->svg = *svg;
    pdp(*o, *c.out);
  };
}

Handler defineConvert(CLI::App& cmd) {
  cmd.require_subcommand(1);
  return nullptr;  // only its subcommands run
}

Handler defineConvertXgboost(CLI::App& cmd) {
  auto o = std::make_shared<ConvertOptions>();
  cmd.add_option("MODEL", o->input, "XGBoost JSON model (save_model(\"model.json\"))")->required();
  cmd.add_option("--feature-ids", o->featureIds,
                 "comma-separated feature ids, one per XGBoost feature in order (default: the feature "
                 "names, which must then be integers)")
      ->delimiter(',')
      ->allow_extra_args(false);  // one list per occurrence: MODEL may follow
  cmd.add_option("-o,--output", o->output, "output model text (- for standard output)")->required();
  return [o](Context& c) { convertXgboost(*o, *c.out, c.verbose); };
}

const Command kCommands[] = {
    {nullptr, "set-model", "Store a model, its identifier and its threshold",
     "Store model parameters (as the app's setModelParams call does). The model is loaded here first: a model "
     "the classifier would reject is never stored.\nExample: reliqa set-model --model model.txt --model-id v7 "
     "--threshold 0.5",
     defineSetModel},
    {nullptr, "set-server-features", "Replace the stored server features",
     "Replace the stored server features. FILE holds a JSON object of feature-id text to number text, like the "
     "app's map ({\"12\": \"0.5\"}); keys are read by the C atoi rules, values by strtod, the first key for an "
     "id wins, keys beyond 32 bits are dropped with a warning. A value that the store would not give back as "
     "the same number is refused, and nothing is stored.\nExample: reliqa set-server-features "
     "server_features.json",
     defineSetServerFeatures},
    {nullptr, "model-id", "Print the stored model identifier", "", defineModelId},
    {nullptr, "classify", "Classify collections with the stored parameters",
     "Classify a collection with the stored parameters; prints {\"score\":S,\"isOverThreshold\":B,"
     "\"loggingData\":{...}} on one line. With -, reads JSON Lines (one collection per line; blank lines are "
     "skipped) and answers each line as it arrives; a refused line ends the run with status 2 after the answers "
     "to the lines before it. Hour features use the process's time zone (TZ).\nExample: reliqa classify "
     "collection.json",
     defineClassify},
    {nullptr, "features", "Print the computed features of collections",
     "Print the computed features of a collection as a compact JSON object (no store needed). With -, reads "
     "JSON Lines, as classify does. Feature 2 is absent without a location.\nExample: reliqa features "
     "collection.json",
     defineFeatures},
    {nullptr, "score", "Score feature rows with a model (no store)",
     "Score feature rows with a model, no store: each input line is a JSON object of feature id to number "
     "({\"3\":0.25,\"17\":-1}); each output line is the score. Absent features read as 0; blank lines are "
     "skipped; a refused line ends the run with status 2.\nExample: reliqa "
     "score --model model.txt rows.jsonl",
     defineScore},
    {nullptr, "explain", "Per-feature contributions to the raw score (no store)",
     "Explain scores feature by feature, no store: for each input, one line {\"bias\":B,\"contributions\":"
     "{\"ID\":C,...},\"raw_score\":R,\"score\":S} with every feature id of the model, where B plus the "
     "contributions is R (up to rounding) and R and S are what score prints. The contributions are exact "
     "Shapley values of the trees (tree SHAP), which need each node's cover: from --xgboost, the XGBoost model "
     "the model was converted from (refused unless the trees match node for node), or from --background, "
     "feature rows whose count at each node is its cover. One of them is required. The input is a collection "
     "(its computed features only, no server features; - reads JSON Lines as classify does) or, with --rows, "
     "feature rows as score reads them, such as a logged feature_vector. --svg draws a waterfall chart of one "
     "input (a second input is refused and no chart is written).\nExample: reliqa explain --model model.txt "
     "--xgboost model.json collection.json --svg why.svg",
     defineExplain},
    {nullptr, "inspect", "Summarise or print a model",
     "Summarise a model text: format version, trees kept and dropped, depths and leaves, base score, input keys, "
     "feature mapping, equality features, selector and sub-models, 16- or 32-bit compiled forest.\nExample: "
     "reliqa inspect model.txt --tree 0",
     defineInspect},
    {nullptr, "pdp", "Partial dependence of the raw score on one feature",
     "Partial dependence: the raw score as one feature sweeps --steps values from --from to --to, the other "
     "features from --features (else 0). Computed on the model's trees with comparisons in double, as the "
     "tree nodes compare (the compiled forest used by score and classify compares floats). Prints CSV; models "
     "with a selector are refused.\nExample: reliqa pdp model.txt --feature 4 --from 0 --to 100 --steps 50 "
     "--svg pdp.svg",
     definePdp},
    {nullptr, "convert", "Convert a model from another trainer", "", defineConvert},
    {"convert", "xgboost", "Convert an XGBoost JSON model",
     "Convert an XGBoost JSON model (gbtree booster, binary:logistic or reg:logistic) into a model text of "
     "format version 4. XGBoost's `x < split` becomes `x <= t` with t the largest float below the split, the "
     "base score the logit of base_score. Missing values cannot be represented: a converted model sends NaN by "
     "its own rule, not by XGBoost's default directions, so give every feature a value. Other objectives, "
     "linear or dart boosters, categorical splits and multi-class models are refused.\nExample: reliqa convert "
     "xgboost model.json -o model.txt",
     defineConvertXgboost},
};

// Prints a refused command line as one line and returns the exit status.
int refuseCommandLine(const CLI::App& app, const CLI::ParseError& e, int argc, char** argv) {
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

// Runs the handler; turns what it throws into one line and exit status 2.
int runHandler(const Handler& handler, Context& context, const CLI::App& app, int argc, char** argv) {
  try {
    handler(context);
    context.out->flush();
  } catch (const UsageError& e) {
    std::string cmd = commandPath(app, argc, argv);
    std::cerr << "reliqa:" << cmd << ": " << e.what() << "; see 'reliqa" << cmd << " --help'" << std::endl;
    return 2;
  } catch (const ToolError& e) {
    try {
      context.out->flush();  // the results before the refused input
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
  Context context;
  app.add_option("--store", context.store,
                 "the store database, created if missing (default $XDG_DATA_HOME/reliqa/store.db, "
                 "else ~/.local/share/reliqa/store.db)");
  app.add_flag("-v,--verbose", context.verbose, "also write INFO log messages to standard error");

  std::map<std::string, CLI::App*> apps;
  std::vector<std::pair<CLI::App*, Handler>> handlers;
  for (const Command& c : kCommands) {
    CLI::App* parent = c.parent == nullptr ? &app : apps.at(c.parent);
    CLI::App* sub = parent->add_subcommand(c.name, c.summary);
    if (c.footer[0] != '\0') sub->footer(c.footer);
    apps[c.name] = sub;
    if (Handler h = c.define(*sub)) handlers.emplace_back(sub, std::move(h));
  }

  try {
    app.parse(argc, argv);
  } catch (const CLI::Success& e) {
    return app.exit(e);  // --help
  } catch (const CLI::ParseError& e) {
    return refuseCommandLine(app, e, argc, argv);
  }

  google::InitGoogleLogging("reliqa");
  FLAGS_logtostderr = true;
  FLAGS_minloglevel = context.verbose ? google::GLOG_INFO : google::GLOG_WARNING;
  tzset();

  ResultWriter out;
  context.out = &out;
  for (const auto& [sub, handler] : handlers) {
    if (sub->parsed()) return runHandler(handler, context, app, argc, argv);
  }
  return 0;
}

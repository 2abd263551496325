// gbdt-demo: reads a serialized model and scores one feature vector.
//
//   gbdt-demo MODEL [ID=VALUE ...] [--verbose]
//
// Each ID=VALUE sets feature ID (a signed 32-bit integer) to VALUE (any number
// strtod reads, nan and inf included). Features the model does not use are
// ignored; those not given read 0. Prints the raw score (the sum before the
// logistic) and the score. --verbose also shows the engine's INFO log.
// Exit status: 0 on success, 1 when the model cannot be read or scored, 2 for
// a usage error.
#include <double-conversion/double-conversion.h>
#include <glog/logging.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <fstream>
#include <iostream>
#include <sstream>
#include <string>

#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"

namespace {

std::string shortest(double v) {
  char buf[64];
  double_conversion::StringBuilder builder(buf, sizeof buf);
  double_conversion::DoubleToStringConverter::EcmaScriptConverter().ToShortest(v, &builder);
  return builder.Finalize();
}

int usage(const std::string& problem) {
  std::cerr << "gbdt-demo: " << problem << "\n"
            << "usage: gbdt-demo MODEL [ID=VALUE ...] [--verbose]\n";
  return 2;
}

// Parses "ID=VALUE"; returns false with a message on error.
bool parseFeature(const std::string& arg, int32_t& id, double& value, std::string& error) {
  const size_t eq = arg.find('=');
  if (eq == std::string::npos || eq == 0 || eq + 1 == arg.size()) {
    error = "expected ID=VALUE, got \"" + arg + "\"";
    return false;
  }
  const std::string idText = arg.substr(0, eq);
  const std::string valueText = arg.substr(eq + 1);
  char* end = nullptr;
  errno = 0;
  const long long parsedId = std::strtoll(idText.c_str(), &end, 10);
  if (*end != '\0' || errno != 0 || parsedId < INT32_MIN || parsedId > INT32_MAX) {
    error = "feature id \"" + idText + "\" is not a 32-bit integer";
    return false;
  }
  errno = 0;
  value = std::strtod(valueText.c_str(), &end);
  if (*end != '\0') {
    error = "feature value \"" + valueText + "\" is not a number";
    return false;
  }
  id = static_cast<int32_t>(parsedId);
  return true;
}

}  // namespace

int main(int argc, char** argv) {
  google::InitGoogleLogging(argv[0]);
  FLAGS_logtostderr = true;
  FLAGS_minloglevel = google::GLOG_WARNING;

  std::string modelPath;
  thornvale::FeatureMap features;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--verbose") {
      FLAGS_minloglevel = google::GLOG_INFO;
    } else if (arg == "--help" || arg == "-h") {
      std::cout << "usage: gbdt-demo MODEL [ID=VALUE ...] [--verbose]\n";
      return 0;
    } else if (modelPath.empty()) {
      modelPath = arg;
    } else {
      int32_t id = 0;
      double value = 0;
      std::string error;
      if (!parseFeature(arg, id, value, error)) return usage(error);
      if (!features.emplace(id, value).second) {
        return usage("feature " + std::to_string(id) + " is given twice");
      }
    }
  }
  if (modelPath.empty()) return usage("no model file given");

  std::ifstream in(modelPath, std::ios::binary);
  if (!in) {
    std::cerr << "gbdt-demo: cannot open " << modelPath << "\n";
    return 1;
  }
  std::ostringstream text;
  text << in.rdbuf();

  try {
    const thornvale::BoostingModel model(text.str());
    const double raw = model.rawScore(features);
    const double score = model.predict(features);  // the logistic of the same sum
    std::cout << "raw score: " << shortest(raw) << "\n"
              << "score: " << shortest(score) << "\n";
  } catch (const std::exception& e) {
    std::cerr << "gbdt-demo: " << modelPath << ": " << e.what() << "\n";
    return 1;
  }
  return 0;
}

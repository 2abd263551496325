// Logged lines come from phones and log pipelines: any bytes must read into
// rows or be refused line by line with a reason. Nothing may escape, crash,
// hang or leak.
//
// Each line is read by a quick pass that gives up on what it cannot vouch
// for, and a careful one; the quick pass must never accept a line that the
// careful one refuses, and both must read the same rows, bit for bit.
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>
#include <string_view>

#include "tools/common/log_block.h"
#include "xplat/gbdtclassifier/GbdtClassifier/BoostingModel/BoostingModel.h"

namespace {

std::unique_ptr<thornvale::BoostingModel> model;

template <typename T>
bool sameBits(const std::vector<T>& a, const std::vector<T>& b) {
  return a.size() == b.size() && (a.empty() || std::memcmp(a.data(), b.data(), a.size() * sizeof(T)) == 0);
}

void agree(std::string_view text, const std::optional<std::string>& label) {
  using reliqa::tool::replayBlock;
  const auto quick = replayBlock(*model, text, label, 1, 4096, 1000, false);
  const auto careful = replayBlock(*model, text, label, 1, 4096, 1000, true);
  const bool same = sameBits(quick.candidate, careful.candidate) && sameBits(quick.logged, careful.logged) &&
                    sameBits(quick.threshold, careful.threshold) && quick.model == careful.model &&
                    quick.label == careful.label && quick.line == careful.line && quick.models == careful.models &&
                    quick.lines == careful.lines && quick.read == careful.read &&
                    quick.refused == careful.refused && quick.reasons == careful.reasons;
  if (!same) {
    std::fprintf(stderr, "the quick pass and the careful one read the lines differently\n");
    std::abort();
  }
  if (quick.read != quick.refused + static_cast<int64_t>(quick.candidate.size())) std::abort();
  for (const auto& [line, why] : quick.reasons) {
    if (line < 1 || line > quick.lines || why.empty()) std::abort();
  }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  std::ifstream in(RELIQA_EXAMPLE_MODEL, std::ios::binary);
  std::stringstream text;
  text << in.rdbuf();
  model = std::make_unique<thornvale::BoostingModel>(text.str());
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  std::string_view text(reinterpret_cast<const char*>(data), size);
  agree(text, std::nullopt);
  agree(text, std::string("opened"));
  return 0;
}

// Collection files and feature rows come from users: any bytes must either
// read into a record or be refused with a ToolError whose line lies inside the
// text. Nothing else may escape, and nothing may crash, hang or leak.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "tools/reliqa/collection_reader.h"
#include "tools/reliqa/errors.h"
#include "tools/reliqa/feature_rows.h"

namespace {

template <class F>
void expectReadOrRefused(std::string_view text, F&& read) {
  try {
    read();
  } catch (const reliqa::tool::ToolError& e) {
    int64_t lines = 1;
    for (char c : text) lines += c == '\n';
    if (e.line() < 1 || e.line() > lines || e.file() != "fuzz") std::abort();
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  std::string_view text(reinterpret_cast<const char*>(data), size);
  expectReadOrRefused(text, [&] { reliqa::tool::parseCollection(text, "fuzz"); });
  expectReadOrRefused(text, [&] { reliqa::tool::parseFeatureRow(text, "fuzz"); });
  return 0;
}

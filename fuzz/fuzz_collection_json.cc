// Collection files and feature rows come from users: any bytes must either
// read into a record or be refused with a ToolError whose line lies inside the
// text. Nothing else may escape, and nothing may crash, hang or leak.
//
// The collection reader has a quick pass and a careful one; the quick pass
// must never accept a text that the careful one refuses, and both must read
// the same bits.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string_view>

#include "tools/common/collection_reader.h"
#include "tools/common/errors.h"
#include "tools/common/feature_rows.h"
#include "tools/common/testing/record_difference.h"

namespace {

namespace rc = kestrova::reliqaclassifier;

// Whether `read` read the text; aborts on anything but a well-placed refusal.
template <class F>
bool readOrRefused(std::string_view text, F&& read) {
  try {
    read();
    return true;
  } catch (const reliqa::tool::ToolError& e) {
    int64_t lines = 1;
    for (char c : text) lines += c == '\n';
    if (e.line() < 1 || e.line() > lines || e.file() != "fuzz") std::abort();
    return false;
  }
}

void quickAgreesWithCareful(std::string_view text) {
  // One reader and one record for every input, as a stream uses them: what a
  // text leaves behind must never show in the next one.
  static reliqa::tool::CollectionReader reader;
  static rc::ReliqaClassifierInput quick, streamed;
  rc::ReliqaClassifierInput careful;
  bool vouched = reader.readQuickly(text, quick);
  bool read = readOrRefused(text, [&] { reliqa::tool::CollectionReader::readCarefully(text, "fuzz", 1, careful); });
  if (vouched && !read) {
    std::fprintf(stderr, "the quick pass read a text that the careful one refuses\n");
    std::abort();
  }
  if (vouched) {
    std::string difference = reliqa::tool::test::recordDifference(quick, careful);
    if (!difference.empty()) {
      std::fprintf(stderr, "the two passes read %s differently\n", difference.c_str());
      std::abort();
    }
  }
  bool readStreamed = readOrRefused(text, [&] { reader.read(text, "fuzz", 1, streamed); });
  if (readStreamed != read ||
      (read && !reliqa::tool::test::recordDifference(streamed, careful).empty())) {
    std::fprintf(stderr, "the reused reader and record read the text differently\n");
    std::abort();
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  std::string_view text(reinterpret_cast<const char*>(data), size);
  quickAgreesWithCareful(text);
  readOrRefused(text, [&] { reliqa::tool::parseFeatureRow(text, "fuzz"); });
  return 0;
}

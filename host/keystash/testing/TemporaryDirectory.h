// TemporaryDirectory: a fresh directory under $TMPDIR (or /tmp) for tests that
// need database files; removed with its contents when the object goes away.
// Throws std::runtime_error when the directory cannot be created.
#pragma once

#include <cstdlib>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <system_error>

namespace kestrova::mobile::xplat::keystash {

class TemporaryDirectory {
 public:
  TemporaryDirectory() {
    const char* base = std::getenv("TMPDIR");
    std::string pattern = std::string(base && *base ? base : "/tmp") + "/reliqa-test-XXXXXX";
    if (!mkdtemp(pattern.data())) throw std::runtime_error("cannot create a directory like " + pattern);
    path_ = pattern;
  }
  ~TemporaryDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  TemporaryDirectory(const TemporaryDirectory&) = delete;
  TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

  const std::string& path() const { return path_; }
  std::string file(const std::string& name) const { return path_ + "/" + name; }

 private:
  std::string path_;
};

}  // namespace kestrova::mobile::xplat::keystash

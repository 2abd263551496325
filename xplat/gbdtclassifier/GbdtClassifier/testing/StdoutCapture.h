// For tests: collects what the process writes to its standard output (the
// descriptor, so printf and std::cout alike) while alive; take() ends the
// capture and returns it. Not for use by two threads or nested captures.
// Throws std::runtime_error when the descriptor cannot be redirected.
#pragma once

#include <unistd.h>

#include <cstdio>
#include <iostream>
#include <stdexcept>
#include <string>

namespace thornvale::test {

class StdoutCapture {
 public:
  StdoutCapture() {
    flushAll();
    file_ = std::tmpfile();
    saved_ = ::dup(STDOUT_FILENO);
    if (file_ == nullptr || saved_ < 0 || ::dup2(::fileno(file_), STDOUT_FILENO) < 0) {
      throw std::runtime_error("cannot capture standard output");
    }
  }
  ~StdoutCapture() { restore(); }
  StdoutCapture(const StdoutCapture&) = delete;
  StdoutCapture& operator=(const StdoutCapture&) = delete;

  std::string take() {
    restore();
    return text_;
  }

 private:
  static void flushAll() {
    std::cout.flush();
    std::fflush(stdout);
  }

  void restore() {
    if (saved_ < 0) return;
    flushAll();
    ::dup2(saved_, STDOUT_FILENO);
    ::close(saved_);
    saved_ = -1;
    std::rewind(file_);
    char buf[4096];
    for (size_t n; (n = std::fread(buf, 1, sizeof buf, file_)) > 0;) text_.append(buf, n);
    std::fclose(file_);
    file_ = nullptr;
  }

  std::FILE* file_ = nullptr;
  int saved_ = -1;
  std::string text_;
};

}  // namespace thornvale::test

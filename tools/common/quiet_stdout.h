// QuietStdout: while it lives, what C++ code writes to std::cout goes nowhere
// (the model reader's "Deseralization version" line, for front ends that keep
// standard output for their own results). It swaps std::cout's buffer, which
// is process-wide: hold one only where no other thread writes to std::cout.
#pragma once

#include <iostream>
#include <sstream>

namespace reliqa::tool {

class QuietStdout {
 public:
  QuietStdout() : saved_(std::cout.rdbuf(sink_.rdbuf())) {}
  ~QuietStdout() { std::cout.rdbuf(saved_); }
  QuietStdout(const QuietStdout&) = delete;
  QuietStdout& operator=(const QuietStdout&) = delete;

 private:
  std::ostringstream sink_;
  std::streambuf* saved_;
};

}  // namespace reliqa::tool

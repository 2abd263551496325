// Errors of the command-line tool.
//
// Every failure that the user can fix is a ToolError: a message that names
// the file (and, where known, the line) it concerns. main() prints it as
// "reliqa: FILE:LINE: what is wrong" (or "reliqa: FILE: ..." without a line)
// and exits with status 2. UsageError is a ToolError about the command line
// itself; its text points to --help.
#pragma once

#include <stdexcept>
#include <string>

namespace reliqa::tool {

class ToolError : public std::runtime_error {
 public:
  // `line` is 1-based; 0 means the message concerns the whole file.
  ToolError(std::string file, int64_t line, const std::string& what)
      : std::runtime_error(what), file_(std::move(file)), line_(line) {}

  const std::string& file() const { return file_; }
  int64_t line() const { return line_; }

  // "FILE:LINE: what", "FILE: what", or just "what" when there is no file.
  std::string describe() const {
    std::string out;
    if (!file_.empty()) {
      out = file_;
      if (line_ > 0) out += ":" + std::to_string(line_);
      out += ": ";
    }
    return out + what();
  }

 private:
  std::string file_;
  int64_t line_;
};

class UsageError : public ToolError {
 public:
  explicit UsageError(const std::string& what) : ToolError("", 0, what) {}
};

// The name used in messages for standard input.
inline const char* const kStdinName = "<stdin>";

}  // namespace reliqa::tool

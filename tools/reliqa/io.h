// Input and output plumbing of the tool.
//
// readFile reads a whole file ("-" is standard input) with a size limit.
// LineReader streams lines from a file descriptor in constant memory (one line
// at a time, each at most a limit long) and, before it blocks waiting for more
// input, flushes the given output, so a pipe sees each answer as soon as its
// line has been read. ResultWriter writes results to the descriptor that was
// standard output when the tool started; the tool points the process's own
// standard output at standard error, so that whatever the libraries print
// there can never mix with results.
// Errors are ToolErrors naming the file.
#pragma once

#include <cstdint>
#include <cstdio>
#include <string>
#include <string_view>

namespace reliqa::tool {

constexpr size_t kMaxFileBytes = size_t{1} << 30;  // 1 GiB
constexpr size_t kMaxLineBytes = size_t{256} << 20;  // 256 MiB

std::string readFile(const std::string& path, size_t limit = kMaxFileBytes);

// The name of `path` in messages ("<stdin>" for "-").
std::string displayName(const std::string& path);

class ResultWriter {
 public:
  // Takes over the current standard output: results go to a duplicate of it,
  // and descriptor 1 becomes a duplicate of standard error.
  ResultWriter();
  ~ResultWriter();
  ResultWriter(const ResultWriter&) = delete;
  ResultWriter& operator=(const ResultWriter&) = delete;

  void line(std::string_view text);  // text and a line feed
  void write(std::string_view text);
  void flush();  // throws ToolError when the output cannot be written

 private:
  FILE* out_;
};

class LineReader {
 public:
  // `path` "-" reads standard input. Throws ToolError if it cannot be opened.
  LineReader(const std::string& path, ResultWriter* flushBeforeBlocking);
  ~LineReader();
  LineReader(const LineReader&) = delete;
  LineReader& operator=(const LineReader&) = delete;

  // Next line without its line feed (and without a trailing carriage return);
  // false at the end of the input. Throws ToolError for a line longer than
  // kMaxLineBytes or a read error.
  bool next(std::string& line);
  int64_t lineNumber() const { return lineNumber_; }
  const std::string& name() const { return name_; }

 private:
  bool fill();

  int fd_;
  bool ownsFd_;
  std::string name_;
  ResultWriter* flush_;
  std::string buffer_;
  size_t pos_ = 0;
  size_t end_ = 0;
  bool eof_ = false;
  int64_t lineNumber_ = 0;
};

// JSON string literal of `s` (quotes included): '"' and '\' escaped, \b \f \n
// \r \t for those bytes, \u00XX for other bytes below 0x20; every other byte is
// copied as it is.
std::string jsonString(std::string_view s);
// The same literal, appended to `out`.
void appendJsonString(std::string& out, std::string_view s);

}  // namespace reliqa::tool

#include "tools/reliqa/io.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "tools/common/errors.h"

namespace reliqa::tool {

std::string displayName(const std::string& path) { return path == "-" ? kStdinName : path; }

std::string readFile(const std::string& path, size_t limit) {
  int fd = path == "-" ? STDIN_FILENO : ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) throw ToolError(path, 0, std::string("cannot open: ") + std::strerror(errno));
  std::string out;
  char chunk[1 << 16];
  while (true) {
    ssize_t n = ::read(fd, chunk, sizeof chunk);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) {
      int e = errno;
      if (fd != STDIN_FILENO) ::close(fd);
      throw ToolError(displayName(path), 0, std::string("cannot read: ") + std::strerror(e));
    }
    if (n == 0) break;
    if (out.size() + static_cast<size_t>(n) > limit) {
      if (fd != STDIN_FILENO) ::close(fd);
      throw ToolError(displayName(path), 0, "larger than " + std::to_string(limit >> 20) + " MiB; refused");
    }
    out.append(chunk, static_cast<size_t>(n));
  }
  if (fd != STDIN_FILENO) ::close(fd);
  return out;
}

ResultWriter::ResultWriter() {
  std::fflush(stdout);
  int fd = ::dup(STDOUT_FILENO);
  out_ = fd >= 0 ? ::fdopen(fd, "w") : nullptr;
  if (out_ == nullptr) {
    out_ = stdout;  // cannot separate; results still go to standard output
    return;
  }
  ::dup2(STDERR_FILENO, STDOUT_FILENO);
}

ResultWriter::~ResultWriter() {
  if (out_ != stdout) std::fclose(out_);
}

void ResultWriter::write(std::string_view text) { std::fwrite(text.data(), 1, text.size(), out_); }

void ResultWriter::line(std::string_view text) {
  write(text);
  std::fputc('\n', out_);
}

void ResultWriter::flush() {
  if (std::fflush(out_) != 0 || std::ferror(out_)) {
    throw ToolError("<stdout>", 0, std::string("cannot write results: ") + std::strerror(errno));
  }
}

LineReader::LineReader(const std::string& path, ResultWriter* flushBeforeBlocking)
    : name_(displayName(path)), flush_(flushBeforeBlocking) {
  if (path == "-") {
    fd_ = STDIN_FILENO;
    ownsFd_ = false;
  } else {
    fd_ = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    ownsFd_ = true;
    if (fd_ < 0) throw ToolError(path, 0, std::string("cannot open: ") + std::strerror(errno));
  }
  buffer_.resize(1 << 16);
}

LineReader::~LineReader() {
  if (ownsFd_) ::close(fd_);
}

bool LineReader::fill() {
  if (eof_) return false;
  if (flush_ != nullptr) flush_->flush();
  if (pos_ > 0) {  // keep the unread tail at the front
    std::memmove(&buffer_[0], &buffer_[pos_], end_ - pos_);
    end_ -= pos_;
    pos_ = 0;
  }
  if (end_ == buffer_.size()) {
    if (buffer_.size() >= kMaxLineBytes) {
      throw ToolError(name_, lineNumber_ + 1,
                      "line longer than " + std::to_string(kMaxLineBytes >> 20) + " MiB; refused");
    }
    buffer_.resize(std::min(buffer_.size() * 2, kMaxLineBytes));
  }
  while (true) {
    ssize_t n = ::read(fd_, &buffer_[end_], buffer_.size() - end_);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) throw ToolError(name_, lineNumber_ + 1, std::string("cannot read: ") + std::strerror(errno));
    if (n == 0) eof_ = true;
    end_ += static_cast<size_t>(n);
    return n > 0;
  }
}

bool LineReader::next(std::string& line) {
  size_t scanFrom = pos_;
  while (true) {
    const char* begin = buffer_.data() + pos_;
    const void* nl = std::memchr(buffer_.data() + scanFrom, '\n', end_ - scanFrom);
    if (nl != nullptr) {
      const char* stop = static_cast<const char*>(nl);
      line.assign(begin, stop);
      pos_ = static_cast<size_t>(stop - buffer_.data()) + 1;
      break;
    }
    size_t scanned = end_ - pos_;
    if (!fill()) {
      if (end_ == pos_) return false;
      line.assign(buffer_.data() + pos_, end_ - pos_);  // last line without a line feed
      pos_ = end_;
      break;
    }
    scanFrom = pos_ + scanned;
  }
  if (!line.empty() && line.back() == '\r') line.pop_back();
  ++lineNumber_;
  return true;
}

std::string jsonString(std::string_view s) {
  std::string out;
  appendJsonString(out, s);
  return out;
}

void appendJsonString(std::string& out, std::string_view s) {
  static const char* hex = "0123456789abcdef";
  out += '"';
  size_t plain = 0;  // start of the run of bytes copied as they are
  for (size_t i = 0; i < s.size(); ++i) {
    unsigned char c = static_cast<unsigned char>(s[i]);
    if (c >= 0x20 && c != '"' && c != '\\') continue;
    out.append(s.data() + plain, i - plain);
    plain = i + 1;
    switch (c) {
      case '"': out += "\\\""; break;
      case '\\': out += "\\\\"; break;
      case '\b': out += "\\b"; break;
      case '\f': out += "\\f"; break;
      case '\n': out += "\\n"; break;
      case '\r': out += "\\r"; break;
      case '\t': out += "\\t"; break;
      default:
        out += "\\u00";
        out += hex[c >> 4];
        out += hex[c & 15];
    }
  }
  out.append(s.data() + plain, s.size() - plain);
  out += '"';
}

}  // namespace reliqa::tool

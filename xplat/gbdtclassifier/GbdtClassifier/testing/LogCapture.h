// For tests: records every glog message while alive, of every severity and
// thread, with INFO logging switched on (the previous level comes back at the
// end). One per test; do not nest them.
#pragma once

#include <glog/logging.h>

#include <mutex>
#include <string>
#include <vector>

namespace thornvale::test {

class LogCapture : public google::LogSink {
 public:
  struct Entry {
    google::LogSeverity severity;
    std::string file;  // base name
    int line;
    std::string text;
  };

  LogCapture() : savedMinLevel_(FLAGS_minloglevel) {
    FLAGS_minloglevel = google::GLOG_INFO;
    google::AddLogSink(this);
  }
  ~LogCapture() override {
    google::RemoveLogSink(this);
    FLAGS_minloglevel = savedMinLevel_;
  }
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;

  void send(google::LogSeverity severity, const char* /*fullFilename*/, const char* baseFilename, int line,
            const google::LogMessageTime& /*time*/, const char* message, size_t length) override {
    std::lock_guard<std::mutex> lock(mutex_);
    entries_.push_back({severity, baseFilename, line, std::string(message, length)});
  }

  std::vector<Entry> entries() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return entries_;
  }
  // The texts alone, in order.
  std::vector<std::string> messages() const {
    std::vector<std::string> out;
    for (const Entry& e : entries()) out.push_back(e.text);
    return out;
  }
  // The texts of one severity, in order.
  std::vector<std::string> at(google::LogSeverity severity) const {
    std::vector<std::string> out;
    for (const Entry& e : entries()) {
      if (e.severity == severity) out.push_back(e.text);
    }
    return out;
  }
  void clear() {
    std::lock_guard<std::mutex> lock(mutex_);
    entries_.clear();
  }

 private:
  int savedMinLevel_;
  mutable std::mutex mutex_;
  std::vector<Entry> entries_;
};

}  // namespace thornvale::test

// TestLogSink: collects glog messages while it exists, for tests that check
// what was logged. Messages of every severity and thread are collected.
#pragma once

#include <glog/logging.h>

#include <mutex>
#include <string>
#include <vector>

namespace thornvale {

class TestLogSink : public google::LogSink {
 public:
  struct Line {
    google::LogSeverity severity;
    std::string file;  // base name
    int line;
    std::string message;
  };

  TestLogSink() { google::AddLogSink(this); }
  ~TestLogSink() override { google::RemoveLogSink(this); }

  void send(google::LogSeverity severity, const char* /*fullFilename*/, const char* baseFilename, int line,
            const google::LogMessageTime& /*time*/, const char* message, size_t length) override {
    std::lock_guard<std::mutex> lock(mutex_);
    lines_.push_back({severity, baseFilename, line, std::string(message, length)});
  }

  std::vector<Line> lines() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return lines_;
  }

  // The messages alone, in order.
  std::vector<std::string> messages() const {
    std::vector<std::string> result;
    for (const Line& line : lines()) result.push_back(line.message);
    return result;
  }

 private:
  mutable std::mutex mutex_;
  std::vector<Line> lines_;
};

}  // namespace thornvale

#pragma once

#include <mutex>
#include <string>
#include <vector>

#include "platform/log.h"
#include "tests/fakes/call_trace.h"

namespace appsync::fakes {

/// Keeps log lines, and writes them into the trace.
class FakeLog : public Log {
 public:
  struct Line {
    LogChannel channel;
    LogLevel level;
    std::string text;  ///< without the plug-in's prefix
    bool operator==(const Line&) const = default;
  };

  explicit FakeLog(CallTrace& trace) : trace_(trace) {}

  void write(LogChannel channel, LogLevel level, std::string_view text) noexcept override {
    trace_.add(TraceLog, "log " + std::string(name(level)) + " " + std::string(shortName(channel)) +
                             "|" + std::string(text));
    const std::scoped_lock lock(mutex_);
    lines_.push_back({channel, level, withoutPluginPrefix(std::string(text))});
  }

  std::vector<Line> lines() const {
    const std::scoped_lock lock(mutex_);
    return lines_;
  }
  /// The texts without the plug-in's prefix.
  std::vector<std::string> texts() const {
    const std::scoped_lock lock(mutex_);
    std::vector<std::string> texts;
    for (const Line& line : lines_) texts.push_back(line.text);
    return texts;
  }
  std::vector<std::string> texts(LogLevel level) const {
    const std::scoped_lock lock(mutex_);
    std::vector<std::string> texts;
    for (const Line& line : lines_) {
      if (line.level == level) texts.push_back(line.text);
    }
    return texts;
  }
  void clear() {
    const std::scoped_lock lock(mutex_);
    lines_.clear();
  }

 private:
  static std::string_view shortName(LogChannel channel) {
    switch (channel) {
      case LogChannel::TWLogCategorySyncBundle:
        return "SyncBundle";
      case LogChannel::TWLogCategorySyncBundle_Oversize:
        return "Oversize";
      case LogChannel::TWLogCategoryFramework:
        return "Framework";
    }
    return "unknown";
  }

  CallTrace& trace_;
  mutable std::mutex mutex_;
  std::vector<Line> lines_;
};

}  // namespace appsync::fakes

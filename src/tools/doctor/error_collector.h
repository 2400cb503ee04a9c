// Keeps the errors that a check provokes, so that they appear among its findings.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "platform/system_log.h"

namespace tally::tools {

class ErrorCollector final : public SystemLog {
 public:
  ErrorCollector() : SystemLog(Repeats::All) {}
  std::vector<std::string> errors;
  bool enabled(LogLevel level) const override { return level == LogLevel::Error; }
  void write(LogLevel level, std::string_view message) override {
    if (enabled(level)) errors.emplace_back(message);
  }
};

}  // namespace tally::tools

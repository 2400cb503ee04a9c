#include "tools/frame/tool_log.h"

#include <set>
#include <string>

#include "base/printable.h"
#include "tools/frame/tool.h"

namespace tally::tools {
namespace {

class ToolLog final : public SystemLog {
 public:
  explicit ToolLog(std::FILE* file) : file_(file) {}
  bool enabled(LogLevel level) const override { return level == LogLevel::Error; }
  void write(LogLevel level, std::string_view message) override {
    if (!enabled(level) || !written_.emplace(message).second) return;
    print(file_, "tallyctl: " + printable(message) + "\n");
  }

 private:
  std::FILE* file_;
  std::set<std::string, std::less<>> written_;
};

}  // namespace

std::shared_ptr<SystemLog> makeToolLog(std::FILE* file) { return std::make_shared<ToolLog>(file); }

}  // namespace tally::tools

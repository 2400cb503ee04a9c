// The driver's statistics for the length of a block.
#pragma once

#include "storage/exporter.h"

namespace tally {

class LoadedStatistics {
 public:
  LoadedStatistics() : loaded_(loadNandStatistics(&exporter_, &context_)->value()) {}
  ~LoadedStatistics() {
    if (loaded_ && exporter_->releaseContext != nullptr) exporter_->releaseContext(&context_);
  }
  LoadedStatistics(const LoadedStatistics&) = delete;
  LoadedStatistics& operator=(const LoadedStatistics&) = delete;
  explicit operator bool() const { return loaded_; }
  const SPXParseContext& context() const { return context_; }

 private:
  const NandExporter* exporter_ = nullptr;
  SPXParseContext context_;
  bool loaded_;
};

}  // namespace tally

// Error-correction events of memory controllers.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "host/tree/system_tree.h"
#include "platform/kernel_values.h"
#include "platform/metrics_store.h"

namespace tally {

// The kernel values of a device, and for "kern.next_ecc_event" what its memory controllers counted
// since the last sweep where nothing else answers: an event for each controller, whose id is its
// number and whose two registers are the errors that were corrected and those that were not.
class EccEvents final : public KernelValues {
 public:
  EccEvents(std::shared_ptr<KernelValues> values, std::shared_ptr<const SystemTree> tree,
            std::shared_ptr<MetricsStore> store)
      : values_(std::move(values)), tree_(std::move(tree)), store_(std::move(store)) {}

  int readKernelValue(std::string_view name, std::span<std::byte> buffer,
                      std::size_t* length) override;
  bool hasKernelValue(std::string_view name) override { return values_->hasKernelValue(name); }
  std::uint64_t MonotonicTicks() override { return values_->MonotonicTicks(); }
  std::optional<Timebase> TimebaseInfo() override { return values_->TimebaseInfo(); }

 private:
  struct Event {
    std::uint8_t controller;
    std::int64_t corrected, uncorrected;
  };
  void findEvents();

  std::shared_ptr<KernelValues> values_;
  std::shared_ptr<const SystemTree> tree_;
  std::shared_ptr<MetricsStore> store_;
  bool looked_ = false;
  std::vector<Event> events_;  // those that were not read yet, last first
};

}  // namespace tally

// This process and the machine's clocks, whatever device root the program works on.
#pragma once

#include "platform/self.h"

namespace tally {

class LinuxSelf final : public Self {
 public:
  std::optional<ClockReading> clocks() override;
  RunCost cost() override;
};

}  // namespace tally

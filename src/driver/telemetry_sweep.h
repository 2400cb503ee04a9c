// The daily sweep: health values of the device that nobody else records.
#pragma once

#include <functional>

namespace tally {

// Capabilities that join the sweep from outside. One that is empty is passed over.
struct SweepCapabilities {
  // Writes the storage structured log; the argument asks for it out of turn.
  std::function<void(bool)> dumpStorageStructuredLog;
};

// What the program joins to its sweep.
SweepCapabilities programSweepCapabilities();

// Reads them and sets each as a scalar of the day in progress, all in one transaction; forwards the
// kernel's error-correction events to the structured log. No failure stops what follows it.
void runTelemetrySweep(const SweepCapabilities& capabilities = {});

}  // namespace tally

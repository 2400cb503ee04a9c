// The daily sweep: health values of the device that no other program records.
#pragma once

#include "platform/platform.h"

namespace tally {

// Reads them and sets each as a scalar of the day in progress, all in one transaction; writes the
// storage structured log if it is due; forwards the kernel's error-correction events to the
// structured log. A failure does not stop the steps that follow. The libraries that it calls use
// the installed platform, which must be the given one.
void runTelemetrySweep(Platform& platform);

}  // namespace tally

// Asks NVMe controllers for their SMART / health page. That takes a right that the daily job must
// not have, so a program of its own does it: this one command, and nothing else.
#pragma once

#include "base/result.h"

namespace tally {

// Leaves a file for each controller that answers, and removes those of controllers that are gone.
// The first failure; the other controllers are asked all the same.
Status leaveHealthPages();

}  // namespace tally

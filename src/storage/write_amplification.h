// How much the flash storage writes for what the host wrote, and what follows from it.
#pragma once

#include "storage/statistics.h"

namespace tally {

// Bytes written to the flash for each byte of the host, to single precision; 0 while the host has
// written nothing.
struct WriteAmplification {
  double user = 0;
  double intermediate = 0;  // of the intermediate band
};
WriteAmplification writeAmplificationOf(const SPXParseContext& context);

// Whether so high a user write amplification asks for the validity list. The threshold is a
// preference.
bool isHighWriteAmplification(double user);

}  // namespace tally

// How much the flash storage writes for each byte of the host, and what follows from it.
#pragma once

#include "storage/statistics.h"

namespace tally {

// Bytes written to the flash for each byte of the host; 0 while the host has written nothing. Kept
// as single precision: g++ 12 vectorises two figures that only pass through it without rounding.
struct WriteAmplification {
  float user = 0;
  float intermediate = 0;  // of the intermediate band
};
WriteAmplification writeAmplificationOf(const SPXParseContext& context);
// Of a fresh fetch; 0 when it fails.
WriteAmplification measureWriteAmplification();

// The user write amplification above which the validity list is collected: a preference, or 2.
double writeAmplificationThreshold();

}  // namespace tally

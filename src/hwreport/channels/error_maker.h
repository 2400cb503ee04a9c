// Makes and prints the library's error objects.
#pragma once

#include "hwreport/error.h"

namespace tally {

// Null when the message is not ASCII. A null message is replaced.
KvRef<HwReportError> makeError(HwResult code, const char* message);

// Stores a new error object in *out, unless out is null; returns the code.
HwResult reportError(KvRef<HwReportError>* out, HwResult code, const char* message = nullptr);

// Prints "LABEL: REASON" to standard error when the options ask for it (bit 31). A null label or
// error is printed as unknown.
void printError(std::int32_t options, const KvString* label, const HwReportError* error);

}  // namespace tally

// Making and printing the library's error objects.
#pragma once

#include "hwreport/error.h"

namespace tally {

// Null when the message is not ASCII. A null message is replaced by one that says so.
KvRef<HwReportError> createKvErr(HwResult code, const char* message);

// Stores a new error object where there is room for one; returns the code.
HwResult reportError(KvRef<HwReportError>* out, HwResult code, const char* message = nullptr);

// Prints "LABEL: REASON" to standard error when the options ask for it (bit 31). A null label or
// error is printed as unknown.
void printKvErr(std::int32_t options, const KvString* label, const HwReportError* error);

}  // namespace tally

// JSON on one line, written straight into a string.
#pragma once

#include <string>

#include "kv/value.h"

namespace tally {

// Dates are timestamps, data is base64, and a real that JSON cannot carry is the string "inf",
// "-inf" or "nan". What is nested deeper than 512 levels is null.
void appendJson(std::string& out, const KvObject& value);

}  // namespace tally

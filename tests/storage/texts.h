// What the tests of this folder compare: values and diagnostics as text.
#pragma once

#include <gtest/gtest.h>

#include <string>

#include "kv/value.h"

namespace tally::tests {

// What a run writes to standard error; a run that returns false adds "false".
template <class Run>
std::string errorsOf(const Run& run) {
  testing::internal::CaptureStderr();
  const bool result = run();
  return testing::internal::GetCapturedStderr() + (result ? "" : "false");
}

// A value's text without line breaks and indents.
inline std::string oneLine(const KvObject* value) {
  std::string text;
  bool indent = false;
  for (const char letter : kvText(value)) {
    indent = letter == '\n' || (indent && letter == ' ');
    if (!indent) text += letter;
  }
  return text;
}

}  // namespace tally::tests

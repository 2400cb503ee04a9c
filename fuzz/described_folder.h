// The folder of a described device, in memory where there is such a file system (TMPDIR).
#pragma once

#include "fakes/temporary_folder.h"
#include "fuzz_values.h"
#include "platform/system_log.h"

namespace tally::fuzz {

// A log that is enabled at every level and drops everything.
struct UnreadLog final : SystemLog {
  bool enabled(LogLevel) const override { return true; }
  void write(LogLevel, std::string_view) override {}
};

class DescribedFolder : public TemporaryFolder {
 public:
  DescribedFolder() { put("File", "bytes of a file that a description names"); }
  // The input as a file: a property list as it is, otherwise the value that it encodes, written.
  void putInput(std::string_view name, Input& input) const {
    if (isDocument(input.rest())) return put(name, input.rest());
    const auto written = encodeXmlPlist(*valueOf(input));
    put(name, written ? *written : "");
  }
};

}  // namespace tally::fuzz

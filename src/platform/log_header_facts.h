// What the header of a text log says of the device and of the process that wrote it.
#pragma once

#include <cstdint>
#include <string>

namespace tally {

class LogHeaderFacts {
 public:
  virtual ~LogHeaderFacts() = default;
  // Each is one line of text, never empty.
  virtual std::string SysIdDescription() = 0;     // the system that runs
  virtual std::string HardwareModelString() = 0;  // the machine it runs on
  virtual std::string SystemVersionString() = 0;
  virtual std::string NewIncidentID() = 0;  // another one at each call
  virtual std::string processName() = 0;
  virtual std::int32_t processIdentifier() = 0;
};

}  // namespace tally

#include "recorder/process_figures.h"

#include <time.h>
#include <unistd.h>

#include <fstream>
#include <sstream>
#include <string>

namespace tally::bench {

CpuTimes operator-(const CpuTimes& a, const CpuTimes& b) {
  return {a.user - b.user, a.system - b.system};
}

// The kernel counts the sum in nanoseconds, and shows how it divides in ticks of 10 ms.
CpuTimes cpuTimesOf(pid_t process) {
  std::ifstream file("/proc/" + std::to_string(process) + "/stat");
  std::string text;
  std::getline(file, text);
  std::istringstream fields(text.substr(text.rfind(')') + 1));
  std::string skipped;
  constexpr int kFieldsBeforeTimes = 11;
  for (int i = 0; i < kFieldsBeforeTimes; ++i) fields >> skipped;
  double user = 0, system = 0;
  fields >> user >> system;
  clockid_t clock = 0;
  timespec total{};
  if (user + system == 0 || ::clock_getcpuclockid(process, &clock) != 0 ||
      ::clock_gettime(clock, &total) != 0) {
    return {};
  }
  const double seconds =
      static_cast<double>(total.tv_sec) + static_cast<double>(total.tv_nsec) * 1e-9;
  return {seconds * user / (user + system), seconds * system / (user + system)};
}

PrivateMemory privateMemoryOf(pid_t process) {
  std::ifstream file("/proc/" + std::to_string(process) + "/smaps_rollup");
  PrivateMemory memory;
  for (std::string line; std::getline(file, line);) {
    std::istringstream words(line);
    std::string label;
    long kibibytes = 0;
    words >> label >> kibibytes;
    if (label == "Private_Clean:") memory.clean = kibibytes;
    if (label == "Private_Dirty:") memory.dirty = kibibytes;
  }
  return memory;
}

}  // namespace tally::bench

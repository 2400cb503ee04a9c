// The daily log of an ordinary day, beside an empty program. A program of its own, which holds next
// to nothing: the kernel counts to a child's peak of memory what its parent held when it began.
#include <stdlib.h>

#include <cstdio>
#include <filesystem>
#include <string>

#include "figures.h"
#include "process_cost.h"

namespace {

using namespace tally::bench;

constexpr int kRounds = 30;

// Of all runs the least of each, which others on the machine have disturbed least.
void keepLeast(ProcessCost& least, const ProcessCost& cost) {
  if (cost.exitStatus != 0) std::exit(1);
  const bool isFirst = least.exitStatus != 0;
  if (isFirst || cost.cpuSeconds < least.cpuSeconds) least.cpuSeconds = cost.cpuSeconds;
  if (isFirst || cost.peakKibibytes < least.peakKibibytes) least.peakKibibytes = cost.peakKibibytes;
  least.exitStatus = 0;
}

void print(const char* name, const ProcessCost& cost) {
  std::printf("%-32s %8.2f ms CPU %8.1f MiB peak\n", name, cost.cpuSeconds * 1e3,
              static_cast<double>(cost.peakKibibytes) / 1024);
}

}  // namespace

int main(int, char** arguments) {
  const auto programs = std::filesystem::canonical(arguments[0]).parent_path();
  char folder[] = "/tmp/tally-ordinary-day-XXXXXX";
  if (::mkdtemp(folder) == nullptr) return 1;
  const std::string root = folder, logs = root + "/var/mobile/Library/Logs/Submission";
  ProcessCost day, nothing;
  keepLeast(day, runProcess({programs / "bench_daily_log", "make-ordinary", root}));
  day = {};
  for (int round = 0; round < kRounds; ++round) {
    keepLeast(day, runProcess({programs / "tallyrun", "-f"},
                              {"TALLYRUN_ROOT=" + root, "TALLYRUN_LOG=stderr"}));
    keepLeast(nothing, runProcess({programs / "bench_empty"}));
  }
  const bool wasLogged = std::filesystem::exists(logs) && !std::filesystem::is_empty(logs);
  std::filesystem::remove_all(root);
  if (!wasLogged) return 1;
  print("tallyrun -f", day);
  print("an empty C++ program", nothing);
  const auto milliseconds = day.cpuSeconds * 1e3;
  const auto mebibytes = static_cast<double>(day.peakKibibytes) / 1024;
  addFigure("an ordinary day", milliseconds, "ms CPU", atMost(10));
  addFigure("an ordinary day, beside nothing", milliseconds, "ms CPU", "an empty C++ program",
            nothing.cpuSeconds * 1e3, noTarget());
  addFigure("an ordinary day, peak", mebibytes, "MiB", atMost(8));
  addFigure("an ordinary day, peak beside nothing", mebibytes, "MiB", "an empty C++ program",
            static_cast<double>(nothing.peakKibibytes) / 1024, noTarget());
  return 0;
}

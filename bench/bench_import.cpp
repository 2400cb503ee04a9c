// `tallyctl store import` of ten million samples, beside a script that reads the same file into a
// table with a row for each.
#include <stdlib.h>

#include <cstdio>
#include <filesystem>

#include "data/sample_device.h"
#include "figures.h"
#include "host/store/store_schema.h"
#include "process_cost.h"

int main(int, char** arguments) {
  using namespace tally::bench;
  const auto programs = std::filesystem::canonical(arguments[0]).parent_path();
  char folder[] = "/tmp/tally-import-XXXXXX";
  if (::mkdtemp(folder) == nullptr) return 1;
  const std::string base = folder, csv = base + "/day.csv";
  const SampleDay day{yesterday()};
  if (!makeCsv(csv, day)) return 1;
  const double lines = static_cast<double>(day.scalars + day.distributions * day.samplesEach);
  const ProcessCost import =
      runProcess({programs / "tallyctl", "--root", base + "/root", "store", "import", csv});
  const ProcessCost yardstick =
      runProcess({"python3", YARDSTICK_FOLDER "/import_rows.py", csv, base + "/rows.sqlite"});
  std::filesystem::remove_all(base);
  const auto line = [&](const char* name, const ProcessCost& cost) {
    std::printf("%-42s %8.2f million lines/s %8.1f MiB peak\n", name,
                lines / cost.wallSeconds / 1e6, static_cast<double>(cost.peakKibibytes) / 1024);
  };
  line("tallyctl store import", import);
  line("yardstick: Python's csv and sqlite3", yardstick);
  std::printf("ratio %.1f\n", yardstick.wallSeconds / import.wallSeconds);
  const double speed = lines / import.wallSeconds / 1e6;
  addFigure("importing a day", speed, "million lines/s", atLeast(1));
  addFigure("importing a day, beside a script", speed, "million lines/s",
            "Python's csv and sqlite3", lines / yardstick.wallSeconds / 1e6, noTarget());
  addFigure("importing a day, peak", static_cast<double>(import.peakKibibytes) / 1024, "MiB",
            atMost(64));
  return import.exitStatus != 0 || yardstick.exitStatus != 0 ? 1 : 0;
}

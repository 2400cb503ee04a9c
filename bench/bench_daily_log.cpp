// The daily log of a large day: `tallyrun -f` as a whole, beside a query and a script that work on
// a table with a row for each sample; and the pass over the samples alone, beside reading stores
// with the same samples, raw and packed, with nothing computed. Each measurement is a process of
// its own. "bench_daily_log growth" measures the whole run and the query for days of different
// sizes.
#include <stdlib.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <limits>
#include <string_view>

#include "data/sample_device.h"
#include "figures.h"
#include "host/linux_platform.h"
#include "host/store/store_history.h"
#include "host/store/store_schema.h"
#include "host/store/store_writer.h"
#include "process_cost.h"
#include "report/distribution_pass.h"

namespace {

using namespace tally;
using namespace tally::bench;

constexpr int kRounds = 3;
volatile double keep;  // what is computed must not be optimised away

// Reads every column of the rows that a query gives.
int readRows(const char* path, std::initializer_list<const char*> queries) {
  auto database = Database::openAtPath(path, Database::Access::ReadOnly);
  if (!database) return 1;
  std::size_t bytes = 0;
  for (const char* query : queries) {
    auto rows = database->prepare(query);
    if (!rows) return 1;
    Step step = Step::Done;
    while ((step = rows->step()) == Step::Row) bytes += rows->blob(0).size();
    if (step == Step::Failed) return 1;
  }
  keep = static_cast<double>(bytes);
  return bytes > 0 ? 0 : 1;
}

// What the report does with the day's samples, without the whitelist and the log.
int passOverSamples(const char* root) {
  const PlatformScope scope(makeLinuxPlatform(std::string(root)));
  const KvRef<KvDictionary> options[] = {SampleDay::distributionOptions(0),
                                         SampleDay::distributionOptions(1)};
  const auto history = openSqliteHistory(metricsStoreFile(std::string(root)),
                                         [](const std::string&) { std::exit(1); });
  std::size_t number = 0;
  DistributionPass pass(*platform().log, [](std::string_view, const DistributionResult& result) {
    keep = result.summary.mean;
  });
  history->enumerateDistributions(
      "", std::numeric_limits<std::int32_t>::min(), std::numeric_limits<std::int32_t>::max(),
      [&](std::string_view key, std::int32_t, DistributionValues& values, bool&) {
        pass.add(values, key, *options[number++ % 2]);
      });
  pass.finish();
  return number > 0 ? 0 : 1;
}

int convert(const char* root) {
  auto store = StoreWriter::open(metricsStoreFile(std::string(root)), IfMissing::Leave);
  return store && *store && (*store)->convertToPackedSchema([](const std::string&) {}) ? 0 : 1;
}

// Keeps the run with the least CPU time, which others on the machine have disturbed least.
void least(ProcessCost& best, const std::vector<std::string>& command,
           const std::vector<std::string>& environment = {}) {
  const ProcessCost cost = runProcess(command, environment);
  if (best.exitStatus != 0 || cost.exitStatus != 0 || cost.cpuSeconds < best.cpuSeconds) {
    best = cost;
  }
}

double mebibytes(const ProcessCost& cost) { return static_cast<double>(cost.peakKibibytes) / 1024; }

void line(const char* name, const ProcessCost& cost) {
  std::printf("%-46s %8.3f s CPU %8.1f MiB peak\n", name, cost.cpuSeconds, mebibytes(cost));
  if (cost.exitStatus != 0) {
    std::printf("failed\n");
    std::exit(1);
  }
}

std::string newestLog(const std::string& root) {
  std::string newest;
  for (const auto& entry :
       std::filesystem::directory_iterator(root + "/var/mobile/Library/Logs/Submission")) {
    if (entry.path().extension() == ".log") newest = std::max(newest, entry.path().string());
  }
  return newest;
}

int make(const std::string& base, std::size_t samplesEach) {
  SampleDay day{yesterday()};
  day.samplesEach = samplesEach;
  SampleDay fewer = day;
  fewer.samplesEach /= 100;
  return makeDevice(base + "/full", day) && makeDevice(base + "/few", fewer) &&
                 makeRawDevice(base + "/raw", day) && makeRowDatabase(base + "/rows.sqlite", day)
             ? 0
             : 1;
}

// In a process of its own: a child's peak of memory starts at what its parent holds.
bool makeApart(const std::string& self, const std::string& base, std::size_t samplesEach) {
  return runProcess({self, "make", base, std::to_string(samplesEach)}).exitStatus == 0;
}

std::vector<std::string> onDevice(const std::string& root) {
  return {"TALLYRUN_ROOT=" + root, "TALLYRUN_LOG=stderr", "TALLYRUN_LOG_LEVEL=error"};
}

int growth(const std::string& self) {
  const std::string job = std::filesystem::path(self).parent_path() / "tallyrun";
  std::printf("%12s %16s %16s %12s\n", "samples", "tallyrun, s CPU", "query, s CPU", "peak, MiB");
  ProcessCost fewest, most;
  for (const std::size_t samplesEach : {100u, 300u, 1000u, 3000u, 10000u}) {
    char folder[] = "/tmp/tally-daily-log-XXXXXX";
    if (::mkdtemp(folder) == nullptr) return 1;
    const std::string base = folder;
    ProcessCost whole, query;
    const bool made = makeApart(self, base, samplesEach);
    for (int round = 0; made && round < kRounds; ++round) {
      least(whole, {job, "-f"}, onDevice(base + "/full"));
      least(query, {self, "query", base + "/rows.sqlite"});
    }
    std::filesystem::remove_all(base);
    if (whole.exitStatus != 0 || query.exitStatus != 0) return 1;
    std::printf("%12zu %16.3f %16.3f %12.1f\n", samplesEach * SampleDay{}.distributions,
                whole.cpuSeconds, query.cpuSeconds, mebibytes(whole));
    if (fewest.exitStatus != 0) fewest = whole;
    most = whole;
  }
  addFigure("a large day, 100 times the samples", most.cpuSeconds, "s CPU", "few samples",
            fewest.cpuSeconds, noTarget());
  return 0;
}

int measure(const std::string& self, const std::string& yardsticks) {
  const auto programs = std::filesystem::path(self).parent_path();
  char folder[] = "/tmp/tally-daily-log-XXXXXX";
  if (::mkdtemp(folder) == nullptr) return 1;
  const std::string base = folder, full = base + "/full", few = base + "/few";
  const std::string rows = base + "/rows.sqlite", expected = base + "/expected.plist";
  const SampleDay day{yesterday()};
  if (!makeApart(self, base, day.samplesEach)) return 1;
  std::printf("%zu scalars, %zu distributions of %zu samples\n\n", day.scalars, day.distributions,
              day.samplesEach);

  const auto onFull = onDevice(full), onFew = onDevice(few);
  const std::string store = metricsStoreFile(full).text(), job = programs / "tallyrun";
  const std::string raw = base + "/raw", rawStore = metricsStoreFile(raw).text();
  ProcessCost whole, small, pass, rawPass, floor, packed, query, script;
  // In turns, so that a machine whose speed drifts slows all alike.
  for (int round = 0; round < kRounds; ++round) {
    least(query, {self, "query", rows});
    least(whole, {job, "-f"}, onFull);
    least(small, {job, "-f"}, onFew);
    for (int again = 0; again < kRounds; ++again) {
      least(whole, {job, "-f"}, onFull);
      least(pass, {self, "pass", full});
      least(rawPass, {self, "pass", raw});
      least(floor, {self, "read-raw", rawStore});
      least(packed, {self, "read-store", store});
    }
    least(script, {"python3", yardsticks + "/daily_log.py", rows, whitelistPath(full),
                   std::to_string(day.day), expected});
  }
  line("tallyrun -f, whole", whole);
  line("tallyrun -f, a hundredth of the samples", small);
  line("yardstick: one SQL query, a row per sample", query);
  line("yardstick: Python script, a row per sample", script);
  line("the samples' pass alone", pass);
  line("the same of a raw store, schema version 1", rawPass);
  line("yardstick: the whole raw store read", floor);
  line("yardstick: the whole store read, not unpacked", packed);
  line("a raw store converted", runProcess({self, "convert", raw}));
  const ProcessCost compared =
      runProcess({"python3", yardsticks + "/compare_logs.py", newestLog(full), expected});
  std::filesystem::remove_all(base);

  std::printf("\nthe program's log and the script's          %s\n",
              compared.exitStatus == 0 ? "equal" : "DIFFERENT");
  std::printf("query / tallyrun                     %6.1f\n", query.cpuSeconds / whole.cpuSeconds);
  std::printf("script / tallyrun                    %6.1f\n", script.cpuSeconds / whole.cpuSeconds);
  std::printf("pass / whole raw store read          %6.2f\n", pass.cpuSeconds / floor.cpuSeconds);
  std::printf("pass / pass of a raw store           %6.2f\n", pass.cpuSeconds / rawPass.cpuSeconds);
  std::printf("pass / whole packed store read       %6.2f\n", pass.cpuSeconds / packed.cpuSeconds);
  std::printf("peak, 100 times the samples          %+6.1f %%\n",
              100.0 * (mebibytes(whole) / mebibytes(small) - 1));
  addFigure("a large day", whole.cpuSeconds, "s CPU", "a Python script", script.cpuSeconds,
            timesLess(60));
  addFigure("a large day, beside SQL", whole.cpuSeconds, "s CPU", "one SQL query", query.cpuSeconds,
            timesLess(30));
  addFigure("a large day, the pass over the samples", pass.cpuSeconds, "s CPU",
            "reading a raw store", floor.cpuSeconds, atMost(1.5));
  addFigure("a large day, the pass over packed samples", pass.cpuSeconds, "s CPU", "over raw ones",
            rawPass.cpuSeconds, atMost(1));
  addFigure("a large day, the pass beside reading alone", pass.cpuSeconds, "s CPU",
            "reading the packed store", packed.cpuSeconds, noTarget());
  addFigure("a large day, peak", mebibytes(whole), "MiB", atMost(28));
  addFigure("a large day, growth of the peak", mebibytes(whole), "MiB",
            "a hundredth of the samples", mebibytes(small), atMost(1.05));
  return compared.exitStatus;
}

}  // namespace

int main(int count, char** arguments) {
  const std::string_view mode = count > 1 ? arguments[1] : "";
  const std::string self = std::filesystem::canonical("/proc/self/exe");
  if (mode == "make" && count == 4) return make(arguments[2], std::stoul(arguments[3]));
  if (mode == "make-ordinary" && count == 3) {  // for bench_ordinary_day
    return makeDevice(arguments[2], {yesterday(), 200, 32, 840}) ? 0 : 1;
  }
  if (mode == "growth") return growth(self);
  if (mode == "read-store" && count == 3) {
    return readRows(arguments[2],
                    {"SELECT key, day, value FROM scalars",
                     "SELECT sample_values, sample_weights, sample_offsets FROM series"});
  }
  if (mode == "read-raw" && count == 3) {
    return readRows(arguments[2], {"SELECT key, day, value FROM scalars",
                                   "SELECT sample_values, sample_offsets FROM chunks"});
  }
  if (mode == "query" && count == 3) {
    return readRows(arguments[2], {"SELECT key, count(*), min(value), max(value), avg(value) "
                                   "FROM samples GROUP BY key"});
  }
  if (mode == "convert" && count == 3) return convert(arguments[2]);
  if (mode == "pass" && count == 3) return passOverSamples(arguments[2]);
  return measure(self, YARDSTICK_FOLDER);
}

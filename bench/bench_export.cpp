// `tallyctl report export` of a spool of 1,000 logs, beside a script that makes the same rows. Also
// its memory for 10 logs and for 1,000.
#include <fmt/core.h>
#include <stdlib.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>

#include "figures.h"
#include "kv/plist_codec.h"
#include "process_cost.h"

namespace {

using namespace tally;
using namespace tally::bench;

constexpr int kScalars = 1600, kDistributions = 400, kBuckets = 10;
constexpr int kLogs = 1000, kFewLogs = 10;
constexpr double kFirstDay = 20400 * 86400.0;

KvRef<KvDictionary> makeLog(int number) {
  auto scalars = KvDictionary::create(), distributions = KvDictionary::create(),
       histograms = KvDictionary::create();
  for (int i = 0; i < kScalars; ++i) {
    scalars->set(fmt::format("com.example.subsystem.counter.{}", i),
                 KvNumber::int64(std::int64_t{i} * i * 12345 + number));
  }
  for (int i = 0; i < kDistributions; ++i) {
    const std::string key = fmt::format("com.example.subsystem.latency.{}", i);
    const double least = i / 8.0, most = least + 1000, mean = least + number / 3.0;
    distributions->set(key, KvArray::create({KvNumber::float64(least), KvNumber::float64(most),
                                             KvNumber::float64(mean), KvNumber::float64(mean * 1e4),
                                             KvNumber::int32(550 + i)}));
    if (i % 2 != 0) continue;
    auto histogram = KvDictionary::create();
    for (int bucket = 0; bucket < kBuckets; ++bucket) {
      const auto label = bucket == 0 ? std::string("(-inf, 12.5]")
                                     : fmt::format("({}, {}]", 12.5 * bucket, 12.5 * (bucket + 1));
      histogram->set(label, KvNumber::uint32(static_cast<std::uint32_t>(10 * bucket + 1)));
    }
    histograms->set(key, histogram);
  }
  return KvDictionary::create(
      {{"TBCrashLogVersion", KvNumber::int32(1)},
       {"TBStartDate", KvDate::create(kFirstDay + number * 86400.0)},
       {"TBScalars", scalars},
       {"TBDistributions", distributions},
       {"TBDistributionsHistogram", histograms},
       {"TBWhitelistDigest", KvString::create("0123456789abcdef0123456789abcdef")}});
}

bool write(const std::string& path, const KvDictionary& content) {
  const auto encoded = encodeXmlPlist(content);
  std::ofstream file(path, std::ios::binary);
  return encoded && file << *encoded;
}

std::string spoolOf(const std::string& root) {
  return root + "/var/mobile/Library/Logs/Submission";
}

bool makeSpool(const std::string& root, int logs) {
  std::filesystem::create_directories(spoolOf(root));
  bool written = true;
  for (int i = 1; i <= logs; ++i) {
    const std::string stem = fmt::format("{}/{:010}-log-tallyd", spoolOf(root), i);
    const auto information = KvDictionary::create(
        {{"TypeCode", KvString::create("193")},
         {"Name", KvString::create("log-tallyd")},
         {"DevicePseudonym", KvString::create("00112233445566778899aabbccddeeff")},
         {"SequenceNumber", KvNumber::int32(i)},
         {"SystemVersion", KvString::create("12.5")},
         {"Options", KvDictionary::create({{"ConfigNumber", KvString::create("C-7")}})}});
    written =
        written && write(stem + ".info.plist", *information) && write(stem + ".log", *makeLog(i));
  }
  return written;
}

}  // namespace

int main(int, char** arguments) {
  const auto programs = std::filesystem::canonical(arguments[0]).parent_path();
  char folder[] = "/tmp/tally-export-XXXXXX";
  if (::mkdtemp(folder) == nullptr) return 1;
  const std::string many = std::string(folder) + "/many", few = std::string(folder) + "/few";
  if (!makeSpool(many, kLogs) || !makeSpool(few, kFewLogs)) return 1;
  bool failed = false;
  const auto line = [&](const char* name, const ProcessCost& cost, int logs) {
    std::printf("%-44s %8.3f s CPU %9.1f logs/s %7.1f MiB peak\n", name, cost.cpuSeconds,
                logs / cost.wallSeconds, static_cast<double>(cost.peakKibibytes) / 1024);
    failed = failed || cost.exitStatus != 0;
  };
  const auto exported = [&](const std::string& root, const char* format) {
    return medianRun(
        3, {programs / "tallyctl", "--root", root, "report", "export", "--format", format});
  };
  std::printf("%d logs of %d scalars and %d distributions, half of them with %d buckets\n\n", kLogs,
              kScalars, kDistributions, kBuckets);
  const ProcessCost rows = exported(many, "ndjson");
  line("tallyctl report export", rows, kLogs);
  const ProcessCost script =
      runProcess({"python3", YARDSTICK_FOLDER "/export_rows.py", spoolOf(many)});
  line("yardstick: Python's plistlib and json", script, kLogs);
  line("tallyctl report export --format csv", exported(many, "csv"), kLogs);
  const ProcessCost fewRows = exported(few, "ndjson");
  line("tallyctl report export, of 10 logs", fewRows, kFewLogs);
  const int compared = std::system(
      fmt::format("{0} --root {1} report export > {1}/ours && python3 {2}/export_rows.py {3} > "
                  "{1}/theirs && python3 {2}/compare_rows.py {1}/ours {1}/theirs",
                  (programs / "tallyctl").string(), few, YARDSTICK_FOLDER, spoolOf(few))
          .c_str());
  std::filesystem::remove_all(folder);
  std::printf("\nthe program's rows and the script's         %s\n",
              compared == 0 ? "equal" : "DIFFERENT");
  std::printf("script / tallyctl %26.1f\n", script.cpuSeconds / rows.cpuSeconds);
  std::printf("peak, 100 times the logs %19.1f MiB more\n",
              static_cast<double>(rows.peakKibibytes - fewRows.peakKibibytes) / 1024);
  addFigure("exporting 1,000 logs", rows.cpuSeconds, "s CPU", "Python's plistlib and json",
            script.cpuSeconds, timesLess(20));
  addFigure("exporting 1,000 logs, peak", static_cast<double>(rows.peakKibibytes) / 1024, "MiB",
            "10 logs", static_cast<double>(fewRows.peakKibibytes) / 1024, atMost(1.1));
  return failed || compared != 0 ? 1 : 0;
}

// A device in a folder, and days on it, each in a process of its own.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "faults/fault.h"
#include "kv/value.h"

namespace tally::faults {

// A day on which the storage's figures are recorded; on the next one they are sent as events.
constexpr std::int32_t kDay = FAULT_DAY;
// The day that was processed last, long enough ago that the storage log is due again.
constexpr std::int32_t kFormerRun = kDay - 9;
constexpr std::string_view kProgramDomain = "vellum.tallyd.tallyrun";
// The type of structured data of which a day has several records.
constexpr std::uint32_t kStorageRecordType = 176;

// What the services reported as done.
struct Acknowledged {
  int logs = 0, records = 0, events = 0;
  bool swept = false, tasked = false;
};

// How a run ended, and its errors.
struct Ending {
  bool met = false;     // the fault
  bool killed = false;  // by it
  bool sound = false;   // neither crashed nor ended by itself with an error
  std::vector<std::string> errors;
  Acknowledged acknowledged;
};

class SampleDevice {
 public:
  // Makes the device as it is before the day, once; restore() brings it back.
  SampleDevice();
  ~SampleDevice();
  SampleDevice(const SampleDevice&) = delete;
  SampleDevice& operator=(const SampleDevice&) = delete;

  void restore(bool withStore) const;
  Ending run(std::int32_t day) const { return run(day, nullptr, 0, ""); }
  // With the n-th call below the folder of the device meeting the fault.
  Ending run(std::int32_t day, const Fault* fault, long n, const std::string& folder) const;

  void schedule(const std::string& tasking) const;

  std::string at(std::string_view path) const;
  // The regular files below a folder, as paths; none when it is not there.
  std::vector<std::string> files(std::string_view folder) const;
  // A copy of the store, since opening a store after a killed run repairs it; empty when there is
  // none.
  std::string copyOfStore() const;

 private:
  // A scalar and samples in the store.
  void record(const std::vector<std::int32_t>& days) const;

  std::filesystem::path folder_;
};

// Null unless the file is a property list with a dictionary.
KvRef<KvDictionary> dictionaryIn(const std::string& path);

constexpr std::int64_t kSamples = 20;
std::int64_t countOf(std::int32_t day);

}  // namespace tally::faults

// What tells the submitted logs of a fleet apart: the device's pseudonym, and a number of each log.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "base/files/temporary_file.h"
#include "platform/system_log.h"

namespace tally {

constexpr std::string_view kIdentityFolder = "/var/mobile/Library/Tallybook";
constexpr std::string_view kIdentityFile = "SubmissionIdentity.plist";

struct SubmissionIdentity {
  // 32 lower-case hexadecimal digits from the kernel's random numbers. Nothing of the device is in
  // it, so a new one cannot be linked with the former.
  std::string device;
  // The last number that was given, by the name of the logs. The first is 1.
  std::map<std::string, std::uint64_t, std::less<>> last;

  std::uint64_t next(std::string_view name) const;
};

// 32 hexadecimal digits of the kernel's random numbers.
Result<std::string> randomHex();
// Whether a text has the form of a pseudonym.
// Whether a file may be sound although it cannot be read now.
bool mayBeSound(const Error& error);
bool isDevicePseudonym(std::string_view text);

// The file that keeps it. All calls but read() and hasLeftOvers() REQUIRE the lock of the spool.
//
// A log's number gets its name here after the log has its own. If a run dies between the two, the
// number is found beside the log: load() looks there, and must be called before a log is removed.
class IdentityFile {
 public:
  explicit IdentityFile(const DeviceRoot& root) : folder_(root, std::string(kIdentityFolder)) {}

  // As it was written last. ENOENT: the device has none yet.
  Result<SubmissionIdentity> read() const;
  // The same, after the logs of the spool have been counted. A missing or damaged one is replaced;
  // one that was damaged with one error line. An error if it cannot be read or written now.
  Result<SubmissionIdentity> load(const Directory& spool, SystemLog& log) const;
  Status write(const SubmissionIdentity& identity) const;
  // The same, not committed yet.
  Result<TemporaryFile> prepare(const SubmissionIdentity& identity) const;
  // A new pseudonym. Logs that wait keep the former one.
  Result<SubmissionIdentity> reset() const;
  // The next log begins with a new one.
  Status erase() const;
  // What killed or failing runs left beside it.
  bool hasLeftOvers() const { return !leftOvers().empty(); }
  void sweep() const;

 private:
  std::vector<std::string> leftOvers() const;
  DeviceDirectory folder_;
};

}  // namespace tally

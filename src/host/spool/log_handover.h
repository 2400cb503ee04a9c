// Moves submitted logs out of the spool into a directory from which they are uploaded.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/spool/log_spool.h"

namespace tally {

// What a call has moved, and why some logs stayed.
struct TakenLogs {
  std::vector<std::string> names;  // of the bodies, as they are called in the directory
  std::uint64_t bytes = 0;
  std::vector<std::string> faults;
};

// A log is copied under temporary names, noted in a journal of the spool, renamed, and then removed
// from the spool. Whenever a call dies, the next one finds by the journal and the temporary names
// whether the log had been renamed, and completes its removal or takes the copies back; so each log
// is handed over once, on any file systems. docs/handing-over.md has the steps.
class LogHandover {
 public:
  // consent is asked before each log; what it forbids stays.
  LogHandover(DeviceRoot root, SystemLog& log, FolderBounds bounds, std::function<bool()> consent)
      : root_(std::move(root)), log_(log), bounds_(bounds), consent_(std::move(consent)) {}

  // To a directory of this machine, whatever the device root, by its absolute path; it is made if
  // the one above it exists. A log gets the next number of the directory, so
  // it never replaces another, and its information comes before it. With a type code, others stay.
  // An error: nothing more can be moved now.
  Result<TakenLogs> take(const std::string& to, const std::optional<std::string>& typeCode);

 private:
  struct Journal;
  struct Target;
  struct Copy;
  Status recover(const Directory& spool) const;
  Status settle(const Directory& spool, const Directory& to, const Journal& journal) const;
  Status moveAll(const Directory& spool, const std::vector<SpooledLog>& logs, Target& target,
                 Journal& journal, TakenLogs& taken) const;
  Status moveOne(const Directory& spool, const SpooledLog& log, const Copy& copy, Target& target,
                 Journal& journal) const;
  Result<Target> open(const Directory* spool, const std::string& to) const;

  DeviceRoot root_;
  SystemLog& log_;
  FolderBounds bounds_;
  std::function<bool()> consent_;
};

}  // namespace tally

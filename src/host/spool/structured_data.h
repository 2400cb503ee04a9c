// Structured-data logs: records gathered per type until they are written out.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <string_view>

#include "base/result.h"
#include "host/spool/sequence_folder.h"
#include "kv/value.h"
#include "platform/clock.h"

namespace tally {

// A folder of structured-data logs. NUMBER-TYPE.pending gathers the records of a type; finish()
// turns it into NUMBER-TYPE.plist, a dictionary of "RecordType", "CreationTime" and "Records". A
// run may be killed between any two steps: a record that was half appended is dropped, whole ones
// are kept, and none is written out twice.
class StructuredDataFolder {
 public:
  StructuredDataFolder(DeviceDirectory folder, const Clock& clock, SystemLog& log)
      : folder_(std::move(folder)), clock_(clock), log_(log) {}
  Status append(std::uint32_t recordType, const KvDictionary& record, const FolderBounds& bounds);
  // Writes out every pending log; report is told of each that cannot be.
  void finishAll(const FolderBounds& bounds, const std::function<void(const Error&)>& report);

 private:
  Status finish(const Directory& folder, const std::string& pendingName,
                const FolderBounds& bounds);
  struct Pending {
    std::string name;
    std::size_t end = 0;  // of its whole records
  };
  static bool takesMore(const Directory& folder, const Pending& pending, std::size_t bytes);
  Result<Pending> pendingFor(const Directory& folder, std::uint32_t recordType, std::size_t bytes,
                             const FolderBounds& bounds);

  DeviceDirectory folder_;
  const Clock& clock_;
  SystemLog& log_;
  std::map<std::uint32_t, Pending> appended_;  // as this process left them, by type
};

// The length of the whole records that pending bytes begin with.
std::size_t wholeRecords(std::string_view bytes);

// Renames LOG to LOG.1 for every log (*.log) of the folder that is not empty, its former
// generations one further; the seventh is the last.
Status rollLogs(const DeviceDirectory& folder);

}  // namespace tally

// A bounded folder of finished logs, whose names begin with a rising number.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "platform/system_log.h"
#include "platform/tables/known_preferences.h"

namespace tally {

// The bounds of a folder; by default those that apply without preferences.
inline constexpr const KnownPreference& kMaximumLogs = knownPreference("SpoolMaximumLogs");
inline constexpr const KnownPreference& kMaximumBytes = knownPreference("SpoolMaximumBytes");
struct FolderBounds {
  std::uint64_t maximumLogs = static_cast<std::uint64_t>(kMaximumLogs.bound.fallback);
  std::uint64_t maximumBytes = static_cast<std::uint64_t>(kMaximumBytes.bound.fallback);
};

// Space that logs leave free on their volume.
constexpr std::uint64_t kReservedBytes = 16u << 20;

// Numbers have ten digits.
constexpr std::uint64_t kLastSequence = 9'999'999'999;

// The files of one log; their names begin with its number.
struct SequencedLog {
  std::uint64_t sequence = 0;
  std::uint64_t bytes = 0;         // of all its files
  std::vector<std::string> names;  // sorted
};

// The number that a file's name begins with; empty when the name is not such a name.
std::optional<std::uint64_t> sequenceOf(std::string_view name);
// "0000000042-", the beginning of a log's names.
std::string sequencePrefix(std::uint64_t sequence);

// The logs of a folder, oldest first. The number gives the age, which therefore does not depend on
// the clock.
Result<std::vector<SequencedLog>> listSequenced(const Directory& folder);
// The same for a writer that holds the folder's lock: logs whose numbers no run can have reached
// are renamed to "set-aside-NAME" with one error line, so that a stray file with a huge number does
// not use up the numbers of later logs.
Result<std::vector<SequencedLog>> listForWriting(const Directory& folder, SystemLog& log);
// The number for the next log.
Result<std::uint64_t> nextSequence(const std::vector<SequencedLog>& logs);

// Removes the oldest logs until the folder is within its bounds, but neither the log `kept` nor a
// newer one. A log's files go last name first. One that cannot be removed is skipped, and the
// result is an error.
Status evictOldest(const Directory& folder, const FolderBounds& bounds, std::uint64_t kept);

// An error if writing this many more bytes would use the volume's reserved space.
Status checkReserve(const Directory& folder, std::uint64_t bytes);

// Appends the bytes durably after the file's whole records, and cuts off what a killed run left
// half written there.
Status appendAt(const Directory& folder, std::string_view name, std::size_t end,
                std::string_view bytes);

// The directory, made readable by its owner alone when it is missing.
Result<Directory> makePrivateFolder(const DeviceDirectory& folder);

}  // namespace tally

// Why a key that the store knows is not in a day's log.
#pragma once

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <optional>
#include <string>
#include <string_view>

namespace tally::tools {

enum class Absence : std::uint8_t {
  NotListed,
  GroupOff,
  OtherSection,
  NoValueThatDay,
  RefusedByRecorder,
  Unreadable,
  DayNotProcessed,
  SubmissionForbidden,
};

// One row each, in the order of the enumerators. The name is for programs.
struct AbsenceRow {
  std::string_view name, meaning;
};
inline constexpr AbsenceRow kAbsences[] = {
    {"not_listed", "the whitelist does not list it"},
    {"group_off", "the whitelist lists it in a group that is not in force"},
    {"other_section", "the whitelist lists it as the other kind only"},
    {"no_value_that_day", "it has no value on that day"},
    {"refused_by_recorder", "the recorder refused it, and it has no value on that day"},
    {"unreadable", "its value, its group's switch or the whitelist cannot be read"},
    {"day_not_processed", "the day is not known to have been processed"},
    {"submission_forbidden", "submission is not allowed on this device"},
};
static_assert(std::size(kAbsences) == std::size_t(Absence::SubmissionForbidden) + 1);

constexpr const AbsenceRow& rowOf(Absence absence) {
  return kAbsences[static_cast<std::size_t>(absence)];
}

// A reason, and what there is to say about this key beside the row's meaning.
struct AbsenceReason {
  Absence absence;
  std::string detail;  // a clause: "the store has no such row on that day"

  friend bool operator==(const AbsenceReason&, const AbsenceReason&) = default;
};

// What is known of the value of a key, as one kind, on a day.
struct ValueState {
  bool stored = false;       // in a row that can be read
  bool damaged = false;      // in a row that cannot
  bool storeFails = false;   // the store cannot be read to its end
  bool elsewhen = false;     // stored on other days
  std::string_view refusal;  // why the recorder refused it on that day; empty: it did not
  // Of a key that the report measures itself.
  bool measured = false;
  bool logMade = true;     // without any whitelisted row no log is made
  bool measurable = true;  // the log has it, or would
};

// Why there is no value that could be reported; empty if there is one, whatever the whitelist says.
std::optional<AbsenceReason> whyNoValue(const ValueState& value);
// Why a value that a log would get does not reach it, of those that come after the whitelist.
std::optional<AbsenceReason> whyNotMeasured(const ValueState& value);

}  // namespace tally::tools

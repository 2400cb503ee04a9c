// Why a key that the store knows is not in a day's log.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
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
    {"other_section", "the whitelist lists it, but as the other kind"},
    {"no_value_that_day", "it has no value on that day"},
    {"refused_by_recorder", "the recorder refused it"},
    {"unreadable", "the whitelist or the value cannot be read"},
    {"day_not_processed", "the day has not been processed"},
    {"submission_forbidden", "submission is not allowed on this device"},
};
static_assert(std::size(kAbsences) == std::size_t(Absence::SubmissionForbidden) + 1);

constexpr const AbsenceRow& rowOf(Absence absence) {
  return kAbsences[static_cast<std::size_t>(absence)];
}

}  // namespace tally::tools

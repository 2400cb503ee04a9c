#include "tools/whitelist/absence.h"

namespace tally::tools {

std::optional<AbsenceReason> whyNoValue(const ValueState& value) {
  if (value.stored || value.measured) return std::nullopt;
  if (value.damaged) {
    return AbsenceReason{Absence::Unreadable, "its row in the store is damaged and is left out"};
  }
  if (value.storeFails) {
    return AbsenceReason{Absence::Unreadable, "the store cannot be read to its end"};
  }
  if (!value.refusal.empty()) {
    return AbsenceReason{Absence::RefusedByRecorder,
                         "the recorder refused it: " + std::string(value.refusal)};
  }
  return AbsenceReason{Absence::NoValueThatDay,
                       value.elsewhen ? "the store has no such row on that day, but on others"
                                      : "the store has no such row on that day"};
}

std::optional<AbsenceReason> whyNotMeasured(const ValueState& value) {
  if (value.stored || !value.measured) return std::nullopt;
  if (!value.logMade) {
    return AbsenceReason{Absence::NoValueThatDay,
                         "the day has no whitelisted value in the store, so no log is made and "
                         "nothing is measured"};
  }
  if (!value.measurable) {
    return AbsenceReason{Absence::Unreadable,
                         "it cannot be measured: a count that it needs cannot be read, or is 0"};
  }
  return std::nullopt;
}

}  // namespace tally::tools

// Every preference that the program reads or keeps, one row each: its place, its type and bound,
// and what applies without it. This is the only such list.
#pragma once

#include <algorithm>
#include <limits>
#include <string_view>

namespace tally {

// The domain of the program's own preferences.
inline constexpr std::string_view kProgramDomain = "vellum.tallyd.tallyrun";
// The domain of the metrics store's owner.
inline constexpr std::string_view kStoreDomain = "vellum.tallyd";
// In this domain, a boolean of a whitelist group's name switches the group on or off.
inline constexpr std::string_view kGroupSwitchDomain = "vellum.da";
// The domain of the system's preferences in which a tasking is scheduled.
inline constexpr std::string_view kScheduleDomain = "vellum.Ferryman";

enum class PreferenceType { Boolean, Integer, Real, String, Date, Array, Dictionary, Any };

// The open interval in which a number is accepted, and what applies instead of any other value.
struct NumberBound {
  double fallback = 0;
  double above = -std::numeric_limits<double>::infinity();
  double below = std::numeric_limits<double>::infinity();
};

struct KnownPreference {
  std::string_view domain;
  std::string_view key;  // empty: any name of a whitelist group
  PreferenceType type;
  std::string_view meaning;             // as the documents say it
  std::string_view without = "absent";  // what applies without a value, unless it is a number
  NumberBound bound = {};
  bool isHistory = false;  // records what the device did, so "tallyctl forget" removes it
};

inline constexpr KnownPreference kKnownPreferences[] = {
    {kProgramDomain, "LastCrashLogSerializationDateInDaysSince1970", PreferenceType::Integer,
     "the last day that a day check processed; not recorded while no whitelist file exists", "",
     NumberBound{}, /*isHistory=*/true},
    {kProgramDomain, "SpoolMaximumLogs", PreferenceType::Integer,
     "largest number of submitted logs (two files each), of structured-data logs and of files of "
     "analytics events",
     "", NumberBound{.fallback = 500, .above = 0}},
    {kProgramDomain, "SpoolMaximumBytes", PreferenceType::Integer,
     "largest number of bytes of each of the three", "",
     NumberBound{.fallback = 50 << 20, .above = 0}},
    {kProgramDomain, "WithdrawnLogs", PreferenceType::String,
     "what happens to waiting logs, structured data and events when the user forbids submission: "
     "`hold` renames them to `NAME.held` until it is allowed again; any other value deletes them",
     "delete"},
    {kProgramDomain, "StoreConversion", PreferenceType::String,
     "when a checkpoint converts a metrics store of the former format, which older versions of the "
     "program can read: `at once`, `never`, or after 30 days on which the daily run worked",
     "after 30 days"},
    {kProgramDomain,
     "StoreConversionDays",
     PreferenceType::Dictionary,
     "kept by the program until then: the number of those `days`, and the `last` of them",
     "absent",
     {},
     true},
    {kProgramDomain,
     "LastOSVersion",
     PreferenceType::String,
     "kept by the program: the system version of the latest log",
     "absent",
     {},
     true},
    {kProgramDomain,
     "LastOSUpdate",
     PreferenceType::Dictionary,
     "kept by the program: the running build (`version`) and the `day` when it was first seen",
     "absent",
     {},
     true},
    {kProgramDomain,
     "SSLastLoggedAt",
     PreferenceType::Date,
     "kept by the program: when the latest storage log was written",
     "absent",
     {},
     true},
    // Not history: without this record, the preferences of a tasking could never be rolled back.
    {kProgramDomain, "TaskingID", PreferenceType::String,
     "kept by the program: the tasking in force"},
    {kProgramDomain, "TaskingOS", PreferenceType::String,
     "kept by the program: the build under which it was applied"},
    {kProgramDomain, "TaskingDigest", PreferenceType::Any, "kept by the program: its digest"},
    {kProgramDomain, "TaskingPayload", PreferenceType::Array, "kept by the program: its entries"},
    {kProgramDomain, "TaskingUnfinished", PreferenceType::Dictionary,
     "kept by the program: what remains of a change that is in progress or was interrupted"},
    {kStoreDomain, "DiagnosticSubmissionEnabled", PreferenceType::Boolean,
     "whether the user allows logs to be submitted", "true"},
    {kStoreDomain, "DatabaseCorruptionCount", PreferenceType::Integer,
     "corruptions of the metrics store that were detected; reset by each log whose whitelist "
     "admits them",
     ""},
    {"vellum.NANDInfo", "userWAmp", PreferenceType::Real,
     "the user write amplification above which a storage log is written", "",
     NumberBound{.fallback = 2, .above = 0, .below = 10}},
    {"vellum.demo-settings", "StoreDemoMode", PreferenceType::Boolean,
     "whether the device is in demonstration mode, which the storage figures report", "false"},
    {kGroupSwitchDomain, "", PreferenceType::Boolean, "switches the group on or off"},
    {kScheduleDomain, "ScheduledTasking", PreferenceType::Dictionary,
     "of the system's preferences: the tasking that the system schedules (below)"},
};

// The program's own domain is written to remove the history.
static_assert(std::ranges::all_of(kKnownPreferences, [](const KnownPreference& known) {
  return !known.isHistory || known.domain == kProgramDomain;
}));

// The row of a key. Does not compile if there is none.
consteval const KnownPreference& knownPreference(std::string_view key) {
  constexpr std::size_t kCount = std::size(kKnownPreferences);
  std::size_t found = kCount;
  for (std::size_t row = 0; row < kCount; ++row) {
    if (kKnownPreferences[row].key != key) continue;
    if (found != kCount) throw "two preferences have this key";
    found = row;
  }
  if (found == kCount) throw "kKnownPreferences has no row of this key";
  return kKnownPreferences[found];
}

// The last day that a day check processed.
inline constexpr const KnownPreference& kLastProcessedDay =
    knownPreference("LastCrashLogSerializationDateInDaysSince1970");

}  // namespace tally

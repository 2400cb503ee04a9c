// The entries of the device description: the one table that its readers, doctor and the table of
// docs/device-root.md agree on.
#pragma once

#include <algorithm>
#include <cstddef>
#include <span>
#include <string_view>

#include "kv/value.h"

namespace tally {

enum class Described : std::size_t {
  DeviceAnswers,
  HasInternalDiagnostics,
  OSVersion,
  SystemID,
  HardwareModel,
  SystemVersion,
  Applications,
  PreferredLanguages,
  SystemLanguages,
  RegionCode,
  DiagnosticSubmissionEnabled,
  CrashSupport,
  Stackshot,
  PurgeableSpace,
  AnalyticsEvents,
  KernelValues,
  MonotonicTicks,
  Timebase,
};

// A member that a dictionary of the description may have.
struct DescribedMember {
  std::string_view name;
  KvType type;
};
struct DescribedEntry {
  Described entry;
  std::string_view name;
  KvType type;
  std::string_view answers;                    // what
  std::span<const DescribedMember> members{};  // those that are known; none: any name is
};

constexpr DescribedMember kSystemVersionMembers[] = {{"ProductName", KvType::String},
                                                     {"ProductVersion", KvType::String},
                                                     {"ProductBuildVersion", KvType::String}};
constexpr DescribedMember kCrashSupportMembers[] = {{"Absent", KvType::Boolean},
                                                    {"MissingSymbols", KvType::Array}};
constexpr DescribedMember kStackshotMembers[] = {
    {"File", KvType::String}, {"FlagsStatus", KvType::Number}, {"CaptureStatus", KvType::Number}};
constexpr DescribedMember kAnalyticsEventsMembers[] = {{"Absent", KvType::Boolean},
                                                       {"Wanted", KvType::Array}};
constexpr DescribedMember kTimebaseMembers[] = {{"Numerator", KvType::Number},
                                                {"Denominator", KvType::Number}};

constexpr DescribedEntry kDescribedEntries[] = {
    {Described::DeviceAnswers, "DeviceAnswers", KvType::Dictionary, "device queries"},
    {Described::HasInternalDiagnostics, "HasInternalDiagnostics", KvType::Boolean,
     "whether this is an internal-diagnostics build, for every subsystem"},
    {Described::OSVersion, "OSVersion", KvType::String,
     "the running system's version as logs carry it"},
    {Described::SystemID, "SystemID", KvType::String, "what the storage log calls the system"},
    {Described::HardwareModel, "HardwareModel", KvType::String,
     "what the storage log calls the machine"},
    {Described::SystemVersion, "SystemVersion", KvType::Dictionary,
     "the system version, as a whole: what it leaves out is not known", kSystemVersionMembers},
    {Described::Applications, "Applications", KvType::Array, "installed applications"},
    {Described::PreferredLanguages, "PreferredLanguages", KvType::Array,
     "the user's languages, most wanted first"},
    {Described::SystemLanguages, "SystemLanguages", KvType::Array,
     "the languages that the system can show"},
    {Described::RegionCode, "RegionCode", KvType::String, "the region of the user's locale"},
    {Described::DiagnosticSubmissionEnabled, "DiagnosticSubmissionEnabled", KvType::Boolean,
     "whether logs may be submitted"},
    {Described::CrashSupport, "CrashSupport", KvType::Dictionary,
     "whether the crash-reporting support library is there, and which entry points it lacks",
     kCrashSupportMembers},
    {Described::Stackshot, "Stackshot", KvType::Dictionary, "snapshots of all threads",
     kStackshotMembers},
    {Described::PurgeableSpace, "PurgeableSpace", KvType::Dictionary, "purgeable space"},
    {Described::AnalyticsEvents, "AnalyticsEvents", KvType::Dictionary,
     "whether there is an analytics-event service, and which events it takes; a `Wanted` of "
     "another "
     "type wants nothing",
     kAnalyticsEventsMembers},
    {Described::KernelValues, "KernelValues", KvType::Dictionary, "kernel values"},
    {Described::MonotonicTicks, "MonotonicTicks", KvType::Number, "ticks since boot"},
    {Described::Timebase, "Timebase", KvType::Dictionary,
     "nanoseconds in a tick; a dictionary without both is a reading that fails", kTimebaseMembers},
};

constexpr const DescribedEntry& describedEntry(Described entry) {
  return kDescribedEntries[static_cast<std::size_t>(entry)];
}
static_assert(std::ranges::all_of(kDescribedEntries, [](const DescribedEntry& row) {
  return &describedEntry(row.entry) == &row;
}));

// An entry that is known, when it is compiled, to be read as what the table says.
template <class T>
struct DescribedAs {
  consteval DescribedAs(Described described) : entry(described) {
    if (describedEntry(described).type != T::kType) throw "the table has another type";
  }
  Described entry;
};

}  // namespace tally

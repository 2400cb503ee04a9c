// What a tasking update is to do, planned before anything is written.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <tuple>
#include <vector>

#include "kv/value.h"

namespace tally {

constexpr std::string_view kTaskingNotification = "vellum.da.tasking_changed";

// What an update starts from. Null means absent.
struct TaskingInputs {
  std::int32_t today = 0;
  KvRef<KvObject> build;       // of the running system
  KvRef<KvObject> lastUpdate;  // "LastOSUpdate"
  KvRef<KvObject> schedule;    // what the system schedules
  KvRef<KvObject> recordedID;  // "TaskingID", and so on: the tasking in force
  KvRef<KvObject> recordedOS;
  KvRef<KvObject> recordedPayload;
  KvRef<KvObject> unfinished;  // "TaskingUnfinished": what earlier runs could not finish
};

// Names one preference of one user.
using PreferenceName = std::tuple<std::string, std::string, std::string>;  // user, domain, key

struct PreferenceWrite {
  enum class Owner { Program, System, User };
  Owner owner;
  std::string user;  // whose preferences, as a payload names it
  std::string domain, key;
  KvRef<KvObject> value;  // null removes
  std::size_t entry = 0;  // of the payload that is applied

  PreferenceName name() const { return {user, domain, key}; }
};

struct TaskingMessage {
  bool isFault;
  std::string text;
};

// What remains to be done until a tasking, or none, is in force.
struct TaskingChange {
  KvRef<KvObject> id, system, digest;             // what is recorded in the end
  KvRef<KvArray> payload;                         // null: no tasking will be in force
  std::vector<PreferenceWrite> removals, writes;  // in this order
};

struct TaskingPlan {
  std::vector<TaskingMessage> messages;
  KvRef<KvObject> lastUpdate;           // the new "LastOSUpdate"; null: unchanged
  std::optional<TaskingChange> change;  // of preferences and of the record
  bool endsRecorded = false;            // the change begins with the end of the tasking in force
  bool isDue = false;                   // false: what is scheduled is in force already
};

// Notes a change of the system's build. If the scheduled tasking is not in force under this build,
// rolls back the one that is and applies the scheduled one. Entries of a payload that can never be
// written (a field is missing, a name cannot be that of a file, a property list cannot represent
// the value) are skipped, each with a fault. Of several entries for one preference the last
// applies.
//
// A change that an earlier run has begun is resumed, even if the schedule has been withdrawn since.
// If something else is scheduled, or the system has changed, everything that it may have written is
// removed.
TaskingPlan planTasking(const TaskingInputs& inputs);

// The change as it is recorded ("TaskingUnfinished") while something of it remains to be done.
KvRef<KvDictionary> unfinishedRecord(const TaskingChange& change);

}  // namespace tally

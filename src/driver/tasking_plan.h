// What a tasking update would do, worked out before anything is done.
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

// What an update starts from. Null is absent.
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

// What is still to be done until a tasking is in force, or none is.
struct TaskingChange {
  KvRef<KvObject> id, system, digest;             // what is recorded in the end
  KvRef<KvArray> payload;                         // null: no tasking will be in force
  std::vector<PreferenceWrite> removals, writes;  // in this order
};

struct TaskingPlan {
  std::vector<TaskingMessage> messages;
  KvRef<KvObject> lastUpdate;           // "LastOSUpdate" becomes this; null: it stays
  std::optional<TaskingChange> change;  // of preferences and of the record
  bool endsRecorded = false;            // the change begins with the end of the tasking in force
  bool isDue = false;                   // false: what is scheduled is in force already
};

// Notes a change of the system's build; if the schedule is not the tasking in force under this
// build, rolls that one back and applies the schedule's. Entries of a payload that can never be
// written (a field is missing, a name could not be a file's, a property list cannot hold them as
// they are) are left out, each with a fault. Of several entries for one preference the last counts.
//
// A change that an earlier run has begun is resumed where it stands, also when the schedule has
// been withdrawn meanwhile. If something else is scheduled, or the system has changed, all that it
// may have written is removed.
TaskingPlan planTasking(const TaskingInputs& inputs);

// The change as it is recorded ("TaskingUnfinished") while something of it remains to be done.
KvRef<KvDictionary> unfinishedRecord(const TaskingChange& change);

}  // namespace tally

// What a tasking update would do, worked out before anything is done.
#pragma once

#include <cstdint>
#include <string>
#include <variant>
#include <vector>

#include "kv/value.h"

namespace tally {

constexpr std::string_view kScheduleDomain = "vellum.Ferryman";
constexpr std::string_view kScheduleKey = "ScheduledTasking";
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
  KvRef<KvObject> unfinishedPayload;  // "TaskingUnfinished"
};

struct PreferenceWrite {
  enum class Owner { Program, System, User };
  Owner owner;
  std::string user;  // whose preferences, as a payload names it
  std::string domain, key;
  KvRef<KvObject> value;  // null removes
};
// Makes a domain of the program's own preferences durable.
struct DomainFlush {
  std::string domain;
};
struct TaskingMessage {
  bool isFault;
  std::string text;
};
using TaskingStep = std::variant<PreferenceWrite, DomainFlush, TaskingMessage>;

struct TaskingPlan {
  std::vector<TaskingStep> steps;  // in the order in which they are carried out
  bool postsNotification = false;  // when all of them are done
};

// Notes a change of the system's build; if the schedule is not the tasking in force under this
// build, rolls that one back and applies the schedule's. Entries of a payload that lack a field or
// name something that could not be a file are left out, each with a fault.
//
// A run may die between any two steps. So the payload that is about to be written is noted first
// ("TaskingUnfinished", beside what earlier runs left there) and the record of the tasking in force
// is flushed last, in one file with the removal of that note: a later run that finds the note
// undoes all of it and starts over, whatever the schedule says by then.
TaskingPlan planTasking(const TaskingInputs& inputs);

}  // namespace tally

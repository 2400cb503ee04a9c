#include "driver/tasking_plan.h"

#include <fmt/core.h>

#include <map>
#include <set>
#include <utility>

#include "base/files/directory.h"
#include "base/files/file.h"
#include "base/files/temporary_file.h"
#include "base/result.h"
#include "base/utf8.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

using Owner = PreferenceWrite::Owner;

constexpr std::string_view kProgramUserName = "mobile";
constexpr std::string_view kSystemUserName = "__sysmetra__";

// Keys of the record of a change, in addition to those of a tasking in force.
constexpr std::string_view kUnremoved = "Unremoved";  // entries without value
constexpr std::string_view kUnwritten = "Unwritten";  // indexes of the payload
// Nesting depth of an entry in that record: domain, record, payload.
constexpr int kEntryLevel = 3;

// The preference that an entry names. Setting and removing use the same checks, so that what was
// never written is not removed.
Result<PreferenceWrite> preferenceIn(const KvObject* entry) {
  const auto* const fields = kvCast<KvDictionary>(entry);
  if (fields == nullptr) return Error{"not a dictionary"};
  for (const char* name : {"Domain", "User", "Key"}) {
    const auto text = fields->getString(name);
    if (!text) return Error{fmt::format("no text \"{}\"", name)};
    if (replaceNonXmlCharacters(*text) != *text) {
      return Error{
          fmt::format("its \"{}\" has characters that a property list cannot represent", name)};
    }
  }
  const std::string_view domain = *fields->getString("Domain");
  const std::string_view user = *fields->getString("User");
  // Both become file names; a key is text inside a file.
  for (const auto& [name, text] : {std::pair("Domain", domain), std::pair("User", user)}) {
    if (!isSafeFileName(text) || isTemporaryName(text)) {
      return Error{fmt::format("its \"{}\" cannot be a file's name: {}", name, text)};
    }
  }
  const Owner owner = user == kProgramUserName  ? Owner::Program
                      : user == kSystemUserName ? Owner::System
                                                : Owner::User;
  return PreferenceWrite{owner, std::string(user), std::string(domain),
                         std::string(*fields->getString("Key")), nullptr};
}

bool isStorable(const KvRef<KvObject>& entry) {
  return kvIdentical(entry.get(), storedForm(entry, kEntryLevel).get());
}

// Whether a recorded value is this one. Writing it to a file may have replaced characters.
bool isRecordOf(const KvObject* recorded, const KvRef<KvObject>& value) {
  if (!value || recorded == nullptr) return !value && recorded == nullptr;
  return kvIdentical(recorded, value.get()) || kvIdentical(recorded, storedForm(value).get());
}

class Planner {
 public:
  explicit Planner(const TaskingInputs& inputs) : inputs_(inputs) {}

  TaskingPlan plan() {
    noteSystemUpdate();
    updateTasking();
    return std::move(plan_);
  }

 private:
  void noteSystemUpdate() {
    const auto* const last = kvCast<KvDictionary>(inputs_.lastUpdate.get());
    const KvObject* const version = last != nullptr ? last->get("version") : nullptr;
    if (!inputs_.build || isRecordOf(version, inputs_.build)) return;
    say(fmt::format("OS change since last run ({} -> {})", kvText(version),
                    kvText(inputs_.build.get())));
    plan_.lastUpdate =
        KvDictionary::create({{"version", inputs_.build}, {"day", KvNumber::int32(inputs_.today)}});
  }

  void updateTasking() {
    const auto* const schedule = scheduled();
    if (schedule == nullptr) {
      // A change that was begun is finished, as a tasking in force outlives its schedule.
      if (isResumable()) resume();
      return;
    }
    const auto newID = KvRef<KvObject>::share(schedule->get("TaskingID"));
    if (inputs_.recordedID) {
      if (isRecordOf(inputs_.recordedID.get(), newID) &&
          isRecordOf(inputs_.recordedOS.get(), inputs_.build) && !inputs_.unfinished) {
        return;
      }
      say(fmt::format("Tasking update ({} -> {}, {} -> {})", kvText(inputs_.recordedID.get()),
                      kvText(newID.get()), kvText(inputs_.recordedOS.get()),
                      kvText(inputs_.build.get())));
    }
    KvArray* const payload = payloadOf(schedule->get("TaskingPayload"), "the schedule's");
    if (isResumable() && leadsTo(newID, payload)) return resume();
    startOver(*schedule, newID, payload);
  }

  // Null if nothing is scheduled that can be applied.
  const KvDictionary* scheduled() {
    const auto* const schedule = kvCast<KvDictionary>(inputs_.schedule.get());
    if (inputs_.schedule && schedule == nullptr) fault("the schedule is not a dictionary");
    if (schedule == nullptr || !schedule->contains("TaskingID")) return nullptr;
    if (schedule->getAs<KvString>("TaskingID") != nullptr) return schedule;
    fault("the schedule's \"TaskingID\" is not a text");
    return nullptr;
  }

  const KvDictionary* unfinished() const { return kvCast<KvDictionary>(inputs_.unfinished.get()); }
  bool isResumable() const { return unfinished() != nullptr && !inputs_.recordedID; }
  bool leadsTo(const KvRef<KvObject>& newID, const KvArray* payload) const {
    return isRecordOf(unfinished()->get("TaskingID"), newID) &&
           isRecordOf(unfinished()->get("TaskingOS"), inputs_.build) &&
           (payload == nullptr || unfinished()->getAs<KvArray>("TaskingPayload") != nullptr);
  }

  void resume() {
    TaskingChange change = unfinishedChange();
    say(fmt::format("an unfinished tasking update is resumed: {} to remove, {} to set",
                    change.removals.size(), change.writes.size()));
    plan_.change = std::move(change);
    plan_.isDue = true;
  }

  // If the list of unwritten entries cannot be read, all are written: repeating a write is
  // harmless.
  TaskingChange unfinishedChange() {
    const KvDictionary& record = *unfinished();
    TaskingChange change;
    for (auto [field, key] :
         {std::pair(&change.id, "TaskingID"), std::pair(&change.system, "TaskingOS"),
          std::pair(&change.digest, "TaskingDigest")}) {
      *field = KvRef<KvObject>::share(record.get(key));
    }
    change.payload = KvRef<KvArray>::share(record.getAs<KvArray>("TaskingPayload"));
    change.removals = removalsOf({record.getAs<KvArray>(kUnremoved)});
    if (!change.payload) return change;
    change.writes = writesOf(*change.payload);
    if (const auto* const unwritten = record.getAs<KvArray>(kUnwritten)) {
      std::set<std::int64_t> indexes;
      for (const auto& index : *unwritten) {
        if (const auto* number = kvCast<KvNumber>(index.get())) indexes.insert(number->asInt64());
      }
      std::erase_if(change.writes, [&](const PreferenceWrite& write) {
        return !indexes.contains(static_cast<std::int64_t>(write.entry));
      });
    }
    return change;
  }

  void startOver(const KvDictionary& schedule, KvRef<KvObject> newID, const KvArray* newPayload) {
    plan_.isDue = true;
    const KvArray* const oldPayload =
        inputs_.recordedID ? payloadOf(inputs_.recordedPayload.get(), "the recorded") : nullptr;
    if (newPayload == nullptr && oldPayload == nullptr && !inputs_.unfinished) return;
    plan_.endsRecorded = inputs_.recordedID && (oldPayload != nullptr || newPayload != nullptr);
    if (inputs_.unfinished) say("what an unfinished tasking update has written is removed");
    TaskingChange change{std::move(newID), inputs_.build, nullptr, nullptr, {}, {}};
    // Earlier versions noted only the payload that they were about to write.
    const auto* const former = unfinished();
    change.removals =
        removalsOf({oldPayload, kvCast<KvArray>(inputs_.unfinished.get()),
                    former != nullptr ? former->getAs<KvArray>("TaskingPayload") : nullptr,
                    former != nullptr ? former->getAs<KvArray>(kUnremoved) : nullptr});
    if (newPayload != nullptr) {
      change.digest = KvRef<KvObject>::share(schedule.get("TaskingDigest"));
      if (change.digest && !storedForm(change.digest, kEntryLevel)) {
        fault("the digest is left out, since it cannot be recorded");
        change.digest = nullptr;
      }
      change.payload = recordable(*newPayload);
      change.writes = writesOf(*change.payload);
    }
    plan_.change = std::move(change);
  }

  KvArray* payloadOf(KvObject* value, std::string_view whose) {
    auto* const payload = kvCast<KvArray>(value);
    if (value != nullptr && payload == nullptr) {
      fault(fmt::format("{} payload is not an array", whose));
    }
    return payload;
  }

  // The payload without the entries that are never written. They must not be recorded: an entry
  // that a file cannot represent may name another preference when it is read back.
  KvRef<KvArray> recordable(const KvArray& payload) {
    auto kept = KvArray::create();
    for (std::size_t i = 0; i < payload.size(); ++i) {
      auto entry = KvRef<KvObject>::share(payload.get(i));
      const auto preference = preferenceIn(entry.get());
      if (preference && isStorable(entry)) {
        kept->append(std::move(entry));
        continue;
      }
      fault(fmt::format("entry {} of the scheduled payload is skipped: {}", i,
                        preference ? "a property list cannot represent its \"Value\""
                                   : preference.error().message));
    }
    return kept;
  }

  static std::vector<PreferenceWrite> writesOf(const KvArray& payload) {
    std::vector<PreferenceWrite> writes;
    std::map<PreferenceName, std::size_t> last;
    for (std::size_t i = 0; i < payload.size(); ++i) {
      auto write = preferenceIn(payload.get(i));
      if (!write) continue;
      // An entry without a value removes the preference.
      write->value = KvRef<KvObject>::share(kvCast<KvDictionary>(payload.get(i))->get("Value"));
      write->entry = i;
      last[write->name()] = i;
      writes.push_back(*std::move(write));
    }
    std::erase_if(writes,
                  [&](const PreferenceWrite& write) { return last[write.name()] != write.entry; });
    return writes;
  }

  static std::vector<PreferenceWrite> removalsOf(std::initializer_list<const KvArray*> payloads) {
    std::vector<PreferenceWrite> removals;
    std::set<PreferenceName> known;
    for (const KvArray* payload : payloads) {
      for (std::size_t i = 0; payload != nullptr && i < payload->size(); ++i) {
        auto removal = preferenceIn(payload->get(i));
        if (removal && known.insert(removal->name()).second) {
          removals.push_back(*std::move(removal));
        }
      }
    }
    return removals;
  }

  void say(std::string text) { plan_.messages.push_back({false, std::move(text)}); }
  void fault(const std::string& text) { plan_.messages.push_back({true, "tasking: " + text}); }

  const TaskingInputs& inputs_;
  TaskingPlan plan_;
};

}  // namespace

TaskingPlan planTasking(const TaskingInputs& inputs) { return Planner(inputs).plan(); }

KvRef<KvDictionary> unfinishedRecord(const TaskingChange& change) {
  auto unremoved = KvArray::create(change.removals.size());
  for (const PreferenceWrite& removal : change.removals) {
    unremoved->append(KvDictionary::create({{"User", KvString::create(removal.user)},
                                            {"Domain", KvString::create(removal.domain)},
                                            {"Key", KvString::create(removal.key)}}));
  }
  auto unwritten = KvArray::create(change.writes.size());
  for (const PreferenceWrite& write : change.writes) {
    unwritten->append(KvNumber::int64(static_cast<std::int64_t>(write.entry)));
  }
  auto record = KvDictionary::create();
  record->set("TaskingID", change.id);
  record->set("TaskingOS", change.system);
  record->set("TaskingDigest", change.digest);
  record->set("TaskingPayload", change.payload);
  record->set(kUnremoved, std::move(unremoved));
  record->set(kUnwritten, std::move(unwritten));
  return record;
}

}  // namespace tally

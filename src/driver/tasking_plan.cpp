#include "driver/tasking_plan.h"

#include <fmt/format.h>

#include <array>
#include <set>
#include <utility>

#include "base/directory.h"
#include "base/file.h"
#include "base/result.h"
#include "report/report.h"

namespace tally {
namespace {

using Owner = PreferenceWrite::Owner;

constexpr std::string_view kProgramUserName = "mobile";
constexpr std::string_view kSystemUserName = "__sysmetra__";

enum class Direction { Apply, RollBack };

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
    if (!inputs_.build || (version != nullptr && kvEqual(version, inputs_.build.get()))) return;
    say(fmt::format("OS change since last run ({} -> {})", kvText(version),
                    kvText(inputs_.build.get())));
    record("LastOSUpdate", KvDictionary::create({{"version", inputs_.build},
                                                 {"day", KvNumber::int32(inputs_.today)}}));
  }

  void updateTasking() {
    const auto* const schedule = kvCast<KvDictionary>(inputs_.schedule.get());
    if (inputs_.schedule && schedule == nullptr) fault("the schedule is not a dictionary");
    if (schedule == nullptr || !schedule->contains("TaskingID")) return;
    KvString* const newID = schedule->getAs<KvString>("TaskingID");
    if (newID == nullptr) {
      fault("the schedule's \"TaskingID\" is not a text");
      return;
    }
    const bool unfinished = static_cast<bool>(inputs_.unfinishedPayload);
    if (inputs_.recordedID) {
      const bool sameSystem = inputs_.build ? kvEqual(inputs_.recordedOS.get(), inputs_.build.get())
                                            : !inputs_.recordedOS;
      if (kvEqual(inputs_.recordedID.get(), newID) && sameSystem && !unfinished) return;
      say(fmt::format("Tasking update ({} -> {}, {} -> {})", kvText(inputs_.recordedID.get()),
                      kvText(newID), kvText(inputs_.recordedOS.get()),
                      kvText(inputs_.build.get())));
    }
    KvArray* const newPayload = payloadOf(schedule->get("TaskingPayload"), "the schedule's");
    KvArray* const oldPayload =
        inputs_.recordedID ? payloadOf(inputs_.recordedPayload.get(), "the recorded") : nullptr;
    if (newPayload != nullptr || oldPayload != nullptr || unfinished) {
      beginChange(newPayload);
      rollBack(oldPayload);
      if (newPayload != nullptr) apply(*schedule, newPayload);
      endChange();
    }
    plan_.postsNotification = true;
  }

  KvArray* payloadOf(KvObject* value, std::string_view whose) {
    auto* const payload = kvCast<KvArray>(value);
    if (value != nullptr && payload == nullptr) {
      fault(fmt::format("{} payload is not an array", whose));
    }
    return payload;
  }

  // What an earlier run left behind stays noted until all is done: this run may die as well, on its
  // way to another payload.
  void beginChange(const KvArray* newPayload) {
    auto note = KvArray::create();
    std::set<std::array<std::string, 3>> noted;
    const KvArray* const payloads[] = {kvCast<KvArray>(inputs_.unfinishedPayload.get()),
                                       newPayload};
    for (const KvArray* payload : payloads) {
      if (payload == nullptr) continue;
      for (const auto& entry : *payload) {
        const auto write = makeWrite(entry.get());
        if (write && noted.insert({write->user, write->domain, write->key}).second) {
          note->append(entry);
        }
      }
    }
    record("TaskingUnfinished", std::move(note));
    plan_.steps.push_back(DomainFlush{std::string(kProgramDomain)});
  }

  void rollBack(KvArray* oldPayload) {
    if (const auto* unfinished = kvCast<KvArray>(inputs_.unfinishedPayload.get())) {
      say("a tasking update was interrupted; what it wrote is removed");
      writeAll(*unfinished, Direction::RollBack);
    }
    if (oldPayload == nullptr) return;
    writeAll(*oldPayload, Direction::RollBack);
    for (const char* key : {"TaskingID", "TaskingDigest", "TaskingPayload"}) record(key, nullptr);
  }

  void apply(const KvDictionary& schedule, KvArray* newPayload) {
    writeAll(*newPayload, Direction::Apply);
    record("TaskingID", KvRef<KvObject>::share(schedule.get("TaskingID")));
    record("TaskingOS", inputs_.build);
    record("TaskingDigest", KvRef<KvObject>::share(schedule.get("TaskingDigest")));
    record("TaskingPayload", KvRef<KvArray>::share(newPayload));
  }

  void endChange() {
    record("TaskingUnfinished", nullptr);
    domains_.erase(std::string(kProgramDomain));
    for (const std::string& domain : domains_) plan_.steps.push_back(DomainFlush{domain});
    plan_.steps.push_back(DomainFlush{std::string(kProgramDomain)});
  }

  void writeAll(const KvArray& payload, Direction direction) {
    for (std::size_t i = 0; i < payload.size(); ++i) {
      auto write = makeWrite(payload.get(i));
      if (!write) {
        fault(fmt::format("entry {} of the {} payload is skipped: {}", i,
                          direction == Direction::Apply ? "scheduled" : "former",
                          write.error().message));
        continue;
      }
      if (direction == Direction::RollBack) write->value = nullptr;
      if (write->owner == Owner::Program) domains_.insert(write->domain);
      plan_.steps.push_back(*std::move(write));
    }
  }

  // The same checks in both directions, so that what was not written is not removed either.
  static Result<PreferenceWrite> makeWrite(const KvObject* entry) {
    const auto* const fields = kvCast<KvDictionary>(entry);
    if (fields == nullptr) return Error{"not a dictionary"};
    for (const char* name : {"Domain", "User", "Key"}) {
      const auto text = fields->getString(name);
      if (!text) return Error{fmt::format("no text \"{}\"", name)};
      if (!isSafeFileName(*text)) {
        return Error{fmt::format("its \"{}\" would leave its folder: {}", name, *text)};
      }
    }
    const std::string_view domain = *fields->getString("Domain");
    if (isTemporaryName(domain)) return Error{fmt::format("not a domain: {}", domain)};
    if (!fields->contains("Value")) return Error{"no \"Value\""};
    const std::string_view user = *fields->getString("User");
    const Owner owner = user == kProgramUserName  ? Owner::Program
                        : user == kSystemUserName ? Owner::System
                                                  : Owner::User;
    return PreferenceWrite{owner, std::string(user), std::string(domain),
                           std::string(*fields->getString("Key")),
                           KvRef<KvObject>::share(fields->get("Value"))};
  }

  void record(std::string_view key, KvRef<KvObject> value) {
    plan_.steps.push_back(PreferenceWrite{Owner::Program, std::string(kProgramUserName),
                                          std::string(kProgramDomain), std::string(key),
                                          std::move(value)});
  }
  void say(std::string text) { plan_.steps.push_back(TaskingMessage{false, std::move(text)}); }
  void fault(const std::string& text) {
    plan_.steps.push_back(TaskingMessage{true, "tasking: " + text});
  }

  const TaskingInputs& inputs_;
  TaskingPlan plan_;
  std::set<std::string> domains_;  // of the program's own user, to be flushed
};

}  // namespace

TaskingPlan planTasking(const TaskingInputs& inputs) { return Planner(inputs).plan(); }

}  // namespace tally

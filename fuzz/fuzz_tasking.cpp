// Taskings: schedules and records of any shape, as a run finds them, and what it plans to write.
#include <set>

#include "base/files/file.h"
#include "driver/tasking_plan.h"
#include "fuzz_values.h"
#include "kv/plist_codec.h"

using namespace tally;
using fuzz::require;

FUZZ_TARGET(tasking)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  TaskingInputs inputs;
  if (fuzz::isDocument(input.rest())) {
    inputs.schedule = fuzz::valueOf(input);
  } else {
    const auto given = input.take<std::uint8_t>();
    fuzz::ValueReader values(input);
    KvRef<KvObject>* const all[] = {&inputs.schedule,   &inputs.unfinished, &inputs.recordedPayload,
                                    &inputs.recordedID, &inputs.recordedOS, &inputs.build,
                                    &inputs.lastUpdate};
    for (std::size_t i = 0; i < std::size(all); ++i) {
      if ((given >> i & 1) != 0) *all[i] = values.take();
    }
    inputs.build = KvRef<KvString>::share(kvCast<KvString>(inputs.build.get()));
  }

  const TaskingPlan plan = planTasking(inputs);
  if (!plan.change) return 0;
  const TaskingChange& change = *plan.change;
  std::set<PreferenceName> removed, written;
  for (const PreferenceWrite& removal : change.removals) {
    require(removed.insert(removal.name()).second, "a preference is removed once");
  }
  for (const PreferenceWrite& write : change.writes) {
    require(isSafeFileName(write.user) && isSafeFileName(write.domain),
            "a write stays in the folder of its user");
    require(written.insert(write.name()).second, "a preference is written once");
    require(change.payload && write.entry < change.payload->size(), "a write is an entry's");
  }

  // A run that dies now is resumed by the next one, with the same work to do.
  TaskingInputs next = inputs;
  next.recordedID = nullptr;
  next.unfinished = storedForm(unfinishedRecord(change));
  require(static_cast<bool>(next.unfinished), "the change can be noted");
  const TaskingPlan again = planTasking(next);
  require(again.change && again.change->writes.size() == change.writes.size() &&
              again.change->removals.size() == change.removals.size(),
          "an interrupted change is resumed");
  return 0;
}

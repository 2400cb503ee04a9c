// Taskings: schedules and records of any shape, as a run finds them, and what it plans to write.
#include "base/file.h"
#include "driver/tasking_plan.h"
#include "fuzz_values.h"

using namespace tally;
using fuzz::require;

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  TaskingInputs inputs;
  if (fuzz::isDocument(input.rest())) {
    inputs.schedule = fuzz::valueOf(input);
  } else {
    const auto given = input.take<std::uint8_t>();
    fuzz::ValueReader values(input);
    KvRef<KvObject>* const all[] = {&inputs.schedule,        &inputs.unfinishedPayload,
                                    &inputs.recordedPayload, &inputs.recordedID,
                                    &inputs.recordedOS,      &inputs.build,
                                    &inputs.lastUpdate};
    for (std::size_t i = 0; i < std::size(all); ++i) {
      if ((given >> i & 1) != 0) *all[i] = values.take();
    }
  }

  const TaskingPlan plan = planTasking(inputs);
  bool isNoted = false;
  for (const TaskingStep& step : plan.steps) {
    const auto* const write = std::get_if<PreferenceWrite>(&step);
    if (write == nullptr) continue;
    require(isSafeFileName(write->user) && isSafeFileName(write->domain),
            "a write stays in the folder of its user");
    const bool isOwn = write->owner == PreferenceWrite::Owner::Program &&
                       write->domain == "vellum.tallyd.tallyrun";
    require(isNoted || isOwn, "what is about to be written is noted first");
    isNoted = isNoted || write->key == "TaskingUnfinished";
  }
  require(!isNoted || std::holds_alternative<DomainFlush>(plan.steps.back()),
          "a change ends with its record made durable");
  return 0;
}

// Lines of any kind, from several users, through the recorder's memory to what is committed.
#include <cmath>
#include <string>
#include <vector>

#include "fakes/fake_platform.h"
#include "fuzz.h"
#include "recorder/metric_intake.h"

using namespace tally;
using fuzz::require;

namespace {

// The settings that a first byte chooses.
RecorderSettings settingsOf(std::uint8_t choice) {
  RecorderSettings settings;
  settings.numbers[std::size_t(RecorderNumber::KeysOfUser)] = 5;
  settings.numbers[std::size_t(RecorderNumber::MemoryLimit)] = 8 << 20;
  if (choice & 1) settings.prefix = "p.";
  if (choice & 2) settings.tags = {"a", "b"};
  if (choice & 4) settings.rename["a"] = "b";
  if (choice & 8) settings.durable = {"a"};
  if (choice & 16) settings.allow["b"].numbers = {1};
  return settings;
}

void check(const CommitBatch& batch) {
  for (const CommitBatch::Change& change : batch.changes) {
    require(isRecordableName(change.key), "a key can be stored");
    require((change.kind == RecordedChange::Kind::Samples) == (change.samples != nullptr),
            "samples come with samples");
    if (!change.samples) continue;
    std::uint64_t count = 0;
    StreamSamples samples;
    for (SampleStream::Reader reader(*change.samples); reader.next(samples, 3);) {
      count += samples.values.size();
      for (const double value : samples.values) require(std::isfinite(value), "a sample is finite");
      for (const std::uint32_t weight : samples.weights) require(weight > 0, "a sample counts");
    }
    require(count == change.samples->count(), "every sample is read");
  }
}

}  // namespace

FUZZ_TARGET(metric_lines)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  static fakes::FakeSystemLog log(fakes::FakeSystemLog::Repeats::Bounded);
  const std::string text(input.rest());
  if (text.empty()) return 0;
  MetricIntake intake(settingsOf(static_cast<std::uint8_t>(text.front())), log);
  RecordingMoment now{.day = 20000, .bootNanoseconds = 1};
  intake.beginDay(now, {});
  // Each zero byte ends a datagram; the byte after it says whose the next one is and what happens
  // before.
  std::vector<CommitBatch> batches;
  for (std::size_t at = 1; at < text.size();) {
    const auto choice = static_cast<std::uint8_t>(text[at++]);
    if (choice & 4) {
      now.day = choice & 8 ? std::nullopt : std::optional(20000 + (choice >> 4));
      intake.beginDay(now, {});
    }
    if (choice & 16) {
      for (CommitBatch& batch :
           intake.take(choice & 32 ? MetricIntake::Take::Durable : MetricIntake::Take::All)) {
        batches.push_back(std::move(batch));
      }
    }
    if (choice & 64) intake.putBack(std::exchange(batches, {}));
    if (choice & 128) intake.thin();
    const std::size_t end = std::min(text.find('\0', at), text.size());
    intake.recordLines({choice & 3}, std::string_view(text).substr(at, end - at));
    at = end + 1;
  }
  for (CommitBatch& batch : intake.take(MetricIntake::Take::AllAtEnd)) {
    batches.push_back(std::move(batch));
  }
  for (const CommitBatch& batch : batches) {
    check(batch);
    intake.forget(batch);
  }
  require(intake.samples() == 0 && intake.sampleBytes() == 0, "everything is given back");
  return 0;
}

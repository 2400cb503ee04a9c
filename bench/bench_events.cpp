// The 35 event payloads from one dictionary of a device's figures, beside (a) a copy of that
// dictionary, and (b) the same payloads found by linear search. Then the reference text, which is
// read once a call.
#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <string_view>
#include <vector>

#include "figures.h"
#include "storage/analytics_events.h"
#include "storage/events/event_payload.h"
#include "storage/nand_info.h"
#include "storage/statistics.h"

namespace {

using namespace tally;

constexpr int kRounds = 401;

double medianMicroseconds(const std::function<void()>& work) {
  std::vector<double> times;
  for (int round = 0; round < kRounds; ++round) {
    const auto start = std::chrono::steady_clock::now();
    work();
    times.push_back(
        std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - start)
            .count());
  }
  std::nth_element(times.begin(), times.begin() + kRounds / 2, times.end());
  return times[kRounds / 2];
}

// Every key that a driver can export.
EventFigures makeFigures() {
  EventFigures figures;
  figures.info = KvDictionary::create();
  std::int64_t value = 1000;
  for (const SPXKeyMapRow& row : keyMap) {
    figures.info->set(row.key, KvNumber::int64(value += 37));
  }
  for (const std::string_view key :
       {kNANDInfoNumLogicalReadsKey, kNANDInfoNumLogicalWritesKey, kNANDInfoNumPhysicalReadsKey,
        kNANDInfoNumPhysicalWritesKey, kNANDInfoExportVersionKey, kNANDInfoBytesPerPageKey}) {
    figures.info->set(key, KvNumber::int64(value += 37));
  }
  return figures;
}

std::size_t buildAll(const EventReference& reference, const EventFigures& figures) {
  std::size_t fields = 0;
  for (const std::string_view event : kEventPulseEvents) {
    fields += buildEventPayload(event, reference.find(event)->second, figures)->size();
  }
  return fields;
}

std::size_t searchAll(const EventReference& reference, const EventFigures& figures) {
  std::size_t fields = 0;
  for (const std::string_view event : kEventPulseEvents) {
    auto payload = KvDictionary::create();
    for (const EventField& field : reference.find(event)->second) {
      const auto found =
          std::find_if(figures.info->begin(), figures.info->end(),
                       [&](const auto& entry) { return entry.key->view() == field.key->view(); });
      payload->set(field.name->view(), found == figures.info->end()
                                           ? KvRef<KvObject>(KvNumber::int32(0))
                                           : found->value);
    }
    fields += payload->size();
  }
  return fields;
}

}  // namespace

int main() {
  const EventFigures figures = makeFigures();
  const auto reference = parseEventReference(kEventPulseRefJson);
  if (!reference) return 1;
  std::size_t fields = 0, copied = 0, searched = 0;
  const double payloads = medianMicroseconds([&] { fields = buildAll(*reference, figures); });
  const double copy = medianMicroseconds([&] { copied = figures.info->copy()->size(); });
  const double linear = medianMicroseconds([&] { searched = searchAll(*reference, figures); });
  const double parsed = medianMicroseconds([&] {
    if (!parseEventReference(kEventPulseRefJson)) std::abort();
  });
  std::printf("35 payloads, %zu fields of %zu entries  %8.1f us\n", fields, copied, payloads);
  std::printf("a copy of the dictionary              %8.1f us  payloads take %.1f times that\n",
              copy, payloads / copy);
  std::printf("the same by linear search             %8.1f us  %.1f times slower\n", linear,
              linear / payloads);
  std::printf("reading the reference text            %8.1f us\n", parsed);
  bench::addFigure("35 event payloads", payloads, "us", "a copy of their dictionary", copy,
                   bench::noTarget());
  bench::addFigure("35 event payloads, beside a search for each field", payloads, "us",
                   "the same by linear search", linear, bench::noTarget());
  return fields == searched ? 0 : 1;
}

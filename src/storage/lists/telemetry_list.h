// The telemetry list: a raw counter block and a summary for each flash bus.
#pragma once

#include <cstddef>
#include <cstdio>
#include <functional>
#include <span>

#include "kv/value.h"

namespace tally {

// Hands the record of each bus to the sink, bus after bus. False, with a line on standard error
// and no record at all, when the characteristics or the list's length do not allow it. Invalid
// digits are reported in `notices`.
using RecordSink = std::function<void(const KvDictionary&)>;
bool readTelemetryList(std::span<const std::byte> list, const KvObject* characteristics,
                       std::FILE* notices, const RecordSink& sink);

// The sink of the daily job: a structured-data record.
void logStorageRecord(const KvDictionary& record);

}  // namespace tally

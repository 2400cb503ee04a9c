// From the NAND info dictionary to the payloads of the analytics events.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "kv/value.h"

namespace tally {

// A field of a payload, and the NAND info key whose value it carries.
struct EventField {
  KvRef<KvString> name;
  KvRef<KvString> key;
};
using EventMapping = std::vector<EventField>;  // in the order of the reference text
using EventReference = std::map<std::string, EventMapping, std::less<>>;  // by event

// Empty unless the text is a JSON object of objects of strings.
std::optional<EventReference> parseEventReference(std::string_view json);

// The figures of all payloads of one call. One that could not be measured keeps the value that it
// has here.
struct EventFigures {
  KvRef<KvDictionary> info;
  std::int64_t capacityMiB = -1;
  std::int64_t availableMiB = -1;
  std::uint64_t freezerWrites = ~std::uint64_t{0};  // bytes
};

KvRef<KvDictionary> buildEventPayload(std::string_view event, const EventMapping& mapping,
                                      const EventFigures& figures);

}  // namespace tally

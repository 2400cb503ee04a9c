// The read-algorithm counters that the controller keeps for each flash bus, in the layout of its
// generation.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

#include "kv/value.h"

namespace tally {

// The counters of a bus in one order, whatever the controller; what a layout lacks is 0.
using NandAlgoCounters = std::array<std::uint32_t, 177>;

// A layout parser copies counters of a bus's raw block (little-endian 32-bit words) into a record
// and leaves the others alone. A word beyond the end of the block is left alone as well.
using BusBlock = std::span<const std::byte>;
TALLY_API void parseCounters1y(BusBlock busBlock, NandAlgoCounters& record);
TALLY_API void parseCounters1xSandisk(BusBlock busBlock, NandAlgoCounters& record);
TALLY_API void parseCounters1xHynix(BusBlock busBlock, NandAlgoCounters& record);
TALLY_API void parseCountersAlgoGeneric(BusBlock busBlock, NandAlgoCounters& record);
TALLY_API void parseCountersAlgoGenericQ9(BusBlock busBlock, NandAlgoCounters& record);
// What the two functions above call; they return the last word that was copied.
TALLY_API std::uint32_t parseOnlyAlgoGenericCounters(BusBlock busBlock, NandAlgoCounters& record);
TALLY_API std::uint32_t parseOnlyAlgoGenericCountersQ9(BusBlock busBlock, NandAlgoCounters& record);

// Logs the counters of every bus in a telemetry list as a structured-data record each. The
// characteristics, a dictionary, tell the generation ("chip-id"), the makers' codes
// ("manufacturer-id") and the number of buses ("num-bus"). False, with a line on standard error and
// nothing logged, when they do not, or when the list is shorter than that many buses.
TALLY_API KvRef<KvBoolean> parseTelemetryList(const void* buffer, std::size_t length,
                                              const KvObject* characteristics);

// The first two, and the first eight, hexadecimal digits of a text as a number; each pair is a
// byte, an odd last digit one of its own. Another character counts as 0, and standard output names
// it.
TALLY_API std::uint8_t hexStringToByte(std::string_view text, std::size_t length);
TALLY_API std::uint32_t hexStringToInt32(std::string_view text, std::size_t length);

}  // namespace tally

// D-Bus messages as property values, and property values as D-Bus messages.
#pragma once

#include <cstddef>

#include "base/result.h"
#include "kv/value.h"

struct sd_bus_message;

namespace tally {

// Limits on a message. They bound memory, whatever a peer claims.
struct BusMessageLimits {
  std::size_t elements = 20'000;  // of all its arrays together
  std::size_t values = 640'000;   // of any kind, keys too: 32 for each element
  std::size_t bytes = 16u << 20;  // of its content
  std::size_t nesting = 16;       // of arrays and dictionaries in each other
};

// Reads the dictionary (signature a{sv}) at the message's position. D-Bus integers keep their width
// (those of 8 and 16 bits become 32-bit ones), an array of bytes is data, object paths and
// signatures are strings, an array of string-keyed entries is a dictionary, any other an array. If
// a key occurs twice, the later value applies. A field whose value has no counterpart here
// (structures, file descriptors, dictionaries by number) is left out; such an element of an array
// becomes empty data, so that the others keep their places. Fails if the message is malformed or
// exceeds the limits.
Result<KvRef<KvDictionary>> readBusDictionary(sd_bus_message* message,
                                              const BusMessageLimits& limits = {});

// Appends a dictionary as a{sv}: arrays of dictionaries as aa{sv}, other arrays as av. Fails if a
// message cannot carry a value: a date, or a text with a zero byte.
Status appendBusDictionary(sd_bus_message* message, const KvDictionary& dictionary);

}  // namespace tally

// Writes kcdata for tests, item by item.
#pragma once

#include <algorithm>
#include <string>

#include "fakes/statistics_buffer.h"

namespace tally::fakes {

constexpr std::uint32_t kBegin = 0x13, kEnd = 0x14, kName = 0x909, kIo = 0x901,
                        kBufferEnd = 0xF19158ED;

class Kcdata {
 public:
  Kcdata& item(std::uint32_t type, std::uint64_t flags, const Bytes& payload) {
    appendValue(bytes, type);
    appendValue(bytes, static_cast<std::uint32_t>(payload.size()));
    appendValue(bytes, flags);
    bytes.insert(bytes.end(), payload.begin(), payload.end());
    return *this;
  }
  Kcdata& begin(std::uint64_t id, std::size_t payload = 4) {
    return item(kBegin, id, Bytes(payload));
  }
  Kcdata& end(std::uint64_t id) { return item(kEnd, id, {}); }
  Kcdata& name(const std::string& text) {
    Bytes payload(text.size());
    std::transform(text.begin(), text.end(), payload.begin(),
                   [](char letter) { return static_cast<std::byte>(letter); });
    return item(kName, 0, payload);
  }
  Kcdata& io(std::uint64_t writesSize) {
    Bytes payload(24);
    appendValue(payload, writesSize);
    return item(kIo, 0, payload);
  }
  Kcdata& thread(std::uint64_t id, const std::string& text, std::uint64_t writesSize) {
    return begin(id).name(text).io(writesSize).end(id);
  }
  Kcdata& stop() { return item(kBufferEnd, 0, {}); }
  Bytes bytes;
};

}  // namespace tally::fakes

// Writes statistics buffers for tests.
#pragma once

#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <string_view>
#include <vector>

namespace tally::fakes {

using Bytes = std::vector<std::byte>;

template <class T>
void appendValue(Bytes& bytes, T value) {
  const auto* from = reinterpret_cast<const std::byte*>(&value);
  bytes.insert(bytes.end(), from, from + sizeof value);
}

struct Record {
  std::uint32_t key;
  std::vector<std::uint64_t> values;
  std::uint32_t count = static_cast<std::uint32_t>(values.size());  // as the header announces it
};

inline Bytes statisticsBuffer(const std::vector<Record>& records) {
  Bytes bytes;
  for (const Record& record : records) {
    appendValue(bytes, record.key);
    appendValue(bytes, record.count);
    for (const std::uint64_t value : record.values) appendValue(bytes, value);
  }
  return bytes;
}

}  // namespace tally::fakes

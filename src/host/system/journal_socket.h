// The journal's socket, in the journal's native protocol: one datagram is one entry.
#pragma once

#include <atomic>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "base/files/file.h"

namespace tally {

// The name consists of capital letters, digits and underscores; the value is any bytes.
struct JournalField {
  std::string_view name, value;
};

// The entry's bytes. A value with a newline is preceded by its length, so that no value can look
// like a further field.
std::string journalEntry(std::span<const JournalField> fields);

// Never connected: the journal is looked up for each entry, so it may be restarted. Any thread may
// call.
class JournalSocket {
 public:
  explicit JournalSocket(std::string path);

  // False when the journal has not taken the entry: it is absent, or its queue stays full for a
  // second. Of a minute, no more than a second is waited in all: a slow journal must not hold up a
  // run.
  bool send(std::string_view entry);

 private:
  std::string path_;
  Descriptor socket_;
  // In nanoseconds: when the present minute began, and how long was waited in it.
  std::atomic<std::int64_t> minute_ = 0, waited_ = 0;
};

}  // namespace tally

// A named IPC endpoint.
#pragma once

#include <functional>
#include <string_view>

#include "kv/value.h"

namespace tally {

// Delivers the messages that peers send to a name: dictionaries of typed fields, in which a signed
// 64-bit integer is a KvNumber of the kind Int64, text a KvString, a UUID a KvData of 16 bytes, and
// a list of dictionaries a KvArray of KvDictionary.
class IpcEndpoint {
 public:
  // Gets one message. Its form and bounds have been checked, but not its meaning.
  using MessageHandler = std::function<void(const KvDictionary& message)>;

  virtual ~IpcEndpoint() = default;
  // Takes the name and delivers its messages from the main event loop, one at a time, in the order
  // in which they arrived. False when that cannot be done; the reason is logged. A peer never gets
  // an answer to what its message says.
  virtual bool listen(std::string_view name, MessageHandler handler) = 0;
  // Releases the name, so that later messages start a new process, and delivers those that had
  // arrived by then. True when there was one: the endpoint then has its name again, so that what is
  // sent in answer to that message reaches this process too. Without a listener it does nothing.
  virtual bool stopListening() = 0;
};

}  // namespace tally

// The analytics-event service, which a product may ship without.
#pragma once

#include <functional>
#include <string_view>

#include "kv/value.h"

namespace tally {

class AnalyticsEvents {
 public:
  // Makes the payload of an event.
  using PayloadBuilder = std::function<KvRef<KvDictionary>()>;
  virtual ~AnalyticsEvents() = default;
  // False when the product has no such service; nothing is sent then.
  virtual bool isAvailable() = 0;
  // Whether the service would ask for the payload of an event of this name.
  virtual bool isEventWanted(std::string_view eventName) = 0;
  // Calls the builder, within the call and at most once, when the event is wanted, and sends what
  // it returns. True when the event was sent.
  virtual bool PulseSendEventLazy(std::string_view eventName, const PayloadBuilder& builder) = 0;
};

}  // namespace tally

// The analytics-event service on Linux: a spool of sent events, from which an uploader takes them.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "base/result.h"
#include "host/described/device_description.h"
#include "host/spool/sequence_folder.h"
#include "host/spool/submission_consent.h"
#include "platform/analytics_events.h"
#include "platform/clock.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace tally {

// NUMBER-events.jsonl holds one JSON object a line, each a whole event; the next file is begun when
// one is full, and the oldest files go when the folder's bounds are reached. Writers of several
// processes are serialised. A line that a killed run left half written is cut off before the next.
class EventSpool {
 public:
  EventSpool(DeviceDirectory folder, const Clock& clock, SystemLog& log)
      : folder_(std::move(folder)), clock_(clock), log_(log) {}
  Status append(std::string_view event, const KvDictionary& payload, const FolderBounds& bounds);

 private:
  DeviceDirectory folder_;
  const Clock& clock_;
  SystemLog& log_;
};

// {"event": NAME, "time": "2026-03-01T12:30:00Z", "payload": {...}} and a newline.
std::string eventLine(std::string_view event, double secondsSince1970, const KvDictionary& payload);

// A device without a description has no such service. The description's entry "AnalyticsEvents"
// says whether it has one, and which events it wants.
class LinuxAnalyticsEvents final : public AnalyticsEvents {
 public:
  LinuxAnalyticsEvents(DeviceDirectory folder, std::shared_ptr<SystemLog> log,
                       std::shared_ptr<Clock> clock, std::shared_ptr<Preferences> preferences,
                       std::shared_ptr<DeviceDescription> description,
                       std::shared_ptr<SubmissionConsent> consent);
  bool isAvailable() override;
  bool isEventWanted(std::string_view eventName) override;
  bool PulseSendEventLazy(std::string_view eventName, const PayloadBuilder& builder) override;

 private:
  std::shared_ptr<SystemLog> log_;
  std::shared_ptr<Clock> clock_;
  std::shared_ptr<Preferences> preferences_;
  std::shared_ptr<DeviceDescription> description_;
  std::shared_ptr<SubmissionConsent> consent_;
  EventSpool spool_;
};

// Where the events lie on a device.
DeviceDirectory analyticsEventsFolder(const DeviceRoot& root);

}  // namespace tally

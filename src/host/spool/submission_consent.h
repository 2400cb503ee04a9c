// Whether the user allows logs to leave the device, and what happens to them if not.
#pragma once

#include <memory>
#include <mutex>
#include <set>
#include <string>

#include "base/files/device_root.h"
#include "host/described/device_description.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace tally {

// Every service that puts files where they wait to be taken away asks here first. Any thread may.
class SubmissionConsent {
 public:
  SubmissionConsent(DeviceRoot root, std::shared_ptr<SystemLog> log,
                    std::shared_ptr<Preferences> preferences,
                    std::shared_ptr<DeviceDescription> description)
      : root_(std::move(root)),
        log_(std::move(log)),
        preferences_(std::move(preferences)),
        description_(std::move(description)) {}

  // The description's entry, else the user's preference; true if neither exists. A preference that
  // cannot be read, or is neither a boolean nor a number, may be a refusal.
  bool given() const { return wish() == Wish::Allowed; }
  // The same, with one info line for each kind of thing that is therefore not recorded.
  bool permits(std::string_view what);
  // If the user no longer allows submission, deletes the waiting files, or holds them if the
  // program's preference "WithdrawnLogs" is "hold"; once the user allows it again, releases the
  // held files. One line gives the number of files. While the user's choice is unknown, nothing
  // changes.
  void enforce();

 private:
  enum class Wish { Allowed, Forbidden, Unknown };
  Wish wish() const;
  DeviceRoot root_;
  std::shared_ptr<SystemLog> log_;
  std::shared_ptr<Preferences> preferences_;
  std::shared_ptr<DeviceDescription> description_;
  std::mutex mutex_;
  std::set<std::string, std::less<>> refused_;
};

}  // namespace tally

// From the name on a line to the key in the store, and who may record it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "recorder/recorder_settings.h"
#include "recorder/refusal.h"

namespace tally {

// A name is 1 to 512 bytes of UTF-8 without control characters; so is a key.
bool isRecordableName(std::string_view name);

class KeyRules {
 public:
  explicit KeyRules(RecorderSettings settings) : settings_(std::move(settings)) {}
  const RecorderSettings& settings() const { return settings_; }

  // What identifies the metric among those that clients send: its name with the tags that become
  // part of the key. Borrows from the name or the buffer.
  std::string_view identityOf(std::string_view name, std::string_view tags,
                              std::string& buffer) const;
  // REQUIRES: an identity and the name from which it was made.
  std::string keyOf(std::string_view name, std::string_view identity) const;
  bool mayRecord(std::int64_t user, std::string_view key) const;
  bool isDurable(std::string_view key) const;

 private:
  RecorderSettings settings_;
};

// What a name counts in which clients report their own losses; empty for others.
std::optional<RecorderCount> clientLossOf(std::string_view name);

}  // namespace tally

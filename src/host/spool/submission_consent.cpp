#include "host/spool/submission_consent.h"

#include <fmt/core.h>

#include "host/spool/waiting_logs.h"
#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

constexpr const KnownPreference& kSwitch = knownPreference("DiagnosticSubmissionEnabled");

bool holds(Preferences& preferences) {
  const auto value = preferences.get(knownPreference("WithdrawnLogs"));
  const auto* const text = kvCast<KvString>(value.get());
  return text != nullptr && text->view() == "hold";
}

}  // namespace

SubmissionConsent::Wish SubmissionConsent::wish() const {
  if (const auto* described =
          description_->getAs<KvBoolean>(Described::DiagnosticSubmissionEnabled)) {
    return described->value() ? Wish::Allowed : Wish::Forbidden;
  }
  bool isSwitch = false;
  const bool enabled =
      preferences_->SMAPreferencesGetBoolValue(kSwitch.key, kSwitch.domain, &isSwitch);
  if (isSwitch) return enabled ? Wish::Allowed : Wish::Forbidden;
  const bool isAbsent = !preferences_->get(kSwitch) && preferences_->isReadable(kSwitch.domain);
  return isAbsent ? Wish::Allowed : Wish::Unknown;
}

bool SubmissionConsent::permits(std::string_view what) {
  const Wish wish = this->wish();
  if (wish == Wish::Allowed) return true;
  const std::lock_guard lock(mutex_);
  if (refused_.emplace(what).second) {
    log_->write(LogLevel::Info,
                fmt::format("{}: not kept, {}", what,
                            wish == Wish::Forbidden
                                ? "the user does not allow submission"
                                : "it is not known whether the user allows submission"));
  }
  return false;
}

void SubmissionConsent::enforce() {
  const Wish wish = this->wish();
  if (wish == Wish::Unknown) return;
  const bool allowed = wish == Wish::Allowed;
  const WaitingAction action = allowed                ? WaitingAction::Release
                               : holds(*preferences_) ? WaitingAction::Hold
                                                      : WaitingAction::Erase;
  const auto handled = handleWaiting(root_, action);
  if (!handled) {
    log_->write(LogLevel::Error, fmt::format("waiting logs: {}", handled.error().message));
  } else if (*handled > 0) {
    log_->write(LogLevel::Default, fmt::format("submission is {}: {} waiting files {}",
                                               allowed ? "allowed again" : "not allowed", *handled,
                                               allowed                         ? "are released"
                                               : action == WaitingAction::Hold ? "are held back"
                                                                               : "are deleted"));
  }
}

}  // namespace tally

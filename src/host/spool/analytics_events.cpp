#include "host/spool/analytics_events.h"

#include <algorithm>

#include "base/files/file_lock.h"
#include "base/time_text.h"
#include "host/spool/log_spool.h"
#include "host/spool/waiting_logs.h"
#include "kv/json_writer.h"

namespace tally {
namespace {

constexpr std::string_view kName = "events.jsonl";
constexpr std::size_t kLargestFile = 1u << 20;

// The length of the whole lines that the bytes begin with. No line has a zero byte; zeros are what
// a power cut leaves where bytes did not arrive.
std::size_t wholeLines(std::string_view bytes) {
  bytes = bytes.substr(0, bytes.find('\0'));
  const std::size_t last = bytes.rfind('\n');
  return last == std::string_view::npos ? 0 : last + 1;
}

void report(SystemLog& log, std::string_view event, const Error& error) {
  log.fault(faultKind("analytics events", error), "analytics event {}: {}", event, error.message);
}

}  // namespace

std::string eventLine(std::string_view event, double secondsSince1970,
                      const KvDictionary& payload) {
  std::string line = "{\"event\":";
  appendJson(line, *KvString::create(event));
  line += ",\"time\":\"";
  appendTimestamp(line, secondsSince1970);
  line += "\",\"payload\":";
  appendJson(line, payload);
  line += "}\n";
  return line;
}

Status EventSpool::append(std::string_view event, const KvDictionary& payload,
                          const FolderBounds& bounds) {
  const std::string line = eventLine(event, clock_.secondsSince1970(), payload);
  // The newest file is never evicted, so it must stay small enough for the bound to hold.
  const std::uint64_t largest =
      std::min<std::uint64_t>(kLargestFile, std::max<std::uint64_t>(bounds.maximumBytes / 4, 1));
  if (line.size() > bounds.maximumBytes) return Error{"larger than the whole spool may be"};
  const auto folder = makePrivateFolder(folder_);
  if (!folder) return folder.error();
  const auto lock = FileLock::acquire(*folder, kAnalyticsEventLogs.lock);
  if (!lock) return lock.error();
  if (auto reserve = checkReserve(*folder, line.size()); !reserve) return reserve;
  const auto files = listForWriting(*folder, log_);
  if (!files) return files.error();

  const auto fileName = [](std::uint64_t sequence) {
    return sequencePrefix(sequence) + std::string(kName);
  };
  std::uint64_t sequence = files->empty() ? 0 : files->back().sequence;
  std::size_t end = 0;
  bool takesMore = !files->empty() && files->back().bytes + line.size() <= largest &&
                   files->back().names == std::vector{fileName(sequence)};
  if (takesMore) {
    const auto present = folder->readFile(fileName(sequence), kLargestFile);
    takesMore = static_cast<bool>(present);
    if (present) {
      end = wholeLines(*present);
    } else {
      report(log_, event, present.error());  // the event goes to a file after it
    }
  }
  if (!takesMore) {
    const auto next = nextSequence(*files);
    if (!next) return next.error();
    sequence = *next;
  }
  if (auto appended = appendAt(*folder, fileName(sequence), end, line); !appended) return appended;
  return evictOldest(*folder, bounds, sequence);
}

LinuxAnalyticsEvents::LinuxAnalyticsEvents(DeviceDirectory folder, std::shared_ptr<SystemLog> log,
                                           std::shared_ptr<Clock> clock,
                                           std::shared_ptr<Preferences> preferences,
                                           std::shared_ptr<DeviceDescription> description,
                                           std::shared_ptr<SubmissionConsent> consent)
    : log_(std::move(log)),
      clock_(std::move(clock)),
      preferences_(std::move(preferences)),
      description_(std::move(description)),
      consent_(std::move(consent)),
      spool_(std::move(folder), *clock_, *log_) {}

bool LinuxAnalyticsEvents::isAvailable() {
  const auto* described = description_->getAs<KvDictionary>(Described::AnalyticsEvents);
  if (described == nullptr) return description_->exists();
  return !described->getBool("Absent").value_or(false);
}

bool LinuxAnalyticsEvents::isEventWanted(std::string_view eventName) {
  const auto* described = description_->getAs<KvDictionary>(Described::AnalyticsEvents);
  const KvObject* wanted = described != nullptr ? described->get("Wanted") : nullptr;
  if (wanted == nullptr) return true;
  const auto* names = kvCast<KvArray>(wanted);
  if (names == nullptr) {
    // An unreadable list wants nothing: unwanted events must not be stored.
    description_->reportEntry("AnalyticsEvents.Wanted", "is not an array; no event is sent");
    return false;
  }
  return std::any_of(names->begin(), names->end(), [&](const auto& item) {
    const auto* name = kvCast<KvString>(item.get());
    if (name == nullptr) return false;
    const std::string_view text = name->view();
    return text.ends_with('*') ? eventName.starts_with(text.substr(0, text.size() - 1))
                               : eventName == text;
  });
}

bool LinuxAnalyticsEvents::PulseSendEventLazy(std::string_view eventName,
                                              const PayloadBuilder& builder) {
  if (!isAvailable() || !isEventWanted(eventName) || !consent_->permits("analytics events")) {
    return false;
  }
  const auto payload = builder();
  if (!payload) return false;
  const auto appended = spool_.append(eventName, *payload, folderBounds(*preferences_));
  if (!appended) report(*log_, eventName, appended.error());
  return static_cast<bool>(appended);
}

DeviceDirectory analyticsEventsFolder(const DeviceRoot& root) {
  return kAnalyticsEventLogs.on(root);
}

}  // namespace tally

#include "host/spool/log_spool.h"

#include <fmt/core.h>

#include <algorithm>
#include <cerrno>
#include <span>

#include "base/files/file.h"
#include "base/files/file_lock.h"
#include "base/files/temporary_file.h"
#include "host/spool/waiting_logs.h"
#include "kv/plist_codec.h"
#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

// Keys of the information that tell a fleet's logs apart.
constexpr std::string_view kDevicePseudonym = "DevicePseudonym";
constexpr std::string_view kSequenceNumber = "SequenceNumber";
constexpr std::string_view kSystemVersion = "SystemVersion";
// Space for the number, the longer suffix and a temporary file's mark in a file's name.
constexpr std::size_t kLongestLogName = 180;

// Counts what the writer writes against the bounds, before it reaches the disk.
class SpoolFile final : public LogFile {
 public:
  SpoolFile(TemporaryFile& file, const Directory& folder, std::uint64_t maximumBytes)
      : file_(file), folder_(folder), left_(maximumBytes) {}

  bool write(std::string_view bytes) override {
    if (!status_) return false;
    if (bytes.size() > left_) {
      status_ = Error{"the log is larger than the whole spool may be"};
    } else if (status_ = checkReserve(folder_, bytes.size()); status_) {
      status_ = file_.write(bytes);
      left_ -= bytes.size();
    }
    return static_cast<bool>(status_);
  }
  void abandon(const Error& reason) override {
    if (status_) status_ = reason;
  }
  const Status& status() const { return status_; }

 private:
  TemporaryFile& file_;
  const Directory& folder_;
  std::uint64_t left_;
  Status status_ = Done{};
};

KvRef<KvDictionary> makeInformation(std::string_view typeCode, std::string_view name,
                                    const KvDictionary* options, double now,
                                    std::string systemVersion) {
  auto information = KvDictionary::create({{"TypeCode", KvString::create(typeCode)},
                                           {"Name", KvString::create(name)},
                                           {"CreationTime", KvDate::create(now)},
                                           {kSystemVersion, KvString::create(systemVersion)}});
  if (options != nullptr) information->set("Options", options->copy());
  return information;
}

// Removes what runs that were killed have left: temporary files, and information whose body never
// got its name or has been removed.
void sweepLeftOvers(const Directory& folder) {
  const auto names = folder.list();
  if (!names) return;
  for (const std::string& name : *names) {
    bool stale = isTemporaryName(name);
    if (sequenceOf(name) && name.ends_with(kInformationSuffix)) {
      const auto body =
          name.substr(0, name.size() - kInformationSuffix.size()) + std::string(kBodySuffix);
      stale = stale || !std::binary_search(names->begin(), names->end(), body);
    }
    if (stale) (void)folder.remove(name);
  }
}

}  // namespace

FolderBounds folderBounds(Preferences& preferences) {
  return {static_cast<std::uint64_t>(preferences.getInteger(kMaximumLogs)),
          static_cast<std::uint64_t>(preferences.getInteger(kMaximumBytes))};
}

bool SpoolSubmission::SMAWriteLogForSubmission(std::string_view typeCode, std::string_view name,
                                               const KvDictionary* options,
                                               const KvObject* reserved, const Writer& writer) {
  Status submitted = Done{};
  if (!consent_->permits("submitted logs")) return false;
  if (reserved != nullptr) {
    submitted = Error{"the reserved argument is in use"};
  } else if (!isSafeFileName(name) || isTemporaryName(name) || name.size() > kLongestLogName) {
    submitted = Error{"not a name that a log can have"};
  } else if (submitting_) {
    submitted = Error{"submitted while another log is being written"};
  } else {
    submitting_ = true;
    submitted = submit(typeCode, name, options, writer);
    submitting_ = false;
  }
  if (!submitted) {
    log_->fault(faultKind("log submission", submitted.error()), "log submission of {}: {}", name,
                submitted.error().message);
  } else {
    notifications_->offerSystemNotification(kSubmittedNotification);
  }
  return static_cast<bool>(submitted);
}

Status SpoolSubmission::submit(std::string_view typeCode, std::string_view name,
                               const KvDictionary* options, const Writer& writer) {
  const auto folder = makePrivateFolder(folder_);
  if (!folder) return folder.error();
  const auto lock = FileLock::acquire(*folder, kSubmittedLogs.lock);
  if (!lock) return lock.error();
  sweepLeftOvers(*folder);
  const auto logs = listForWriting(*folder, *log_);
  if (!logs) return logs.error();
  const auto sequence = nextSequence(*logs);
  if (!sequence) return sequence.error();
  const auto information = makeInformation(typeCode, name, options, clock_->secondsSince1970(),
                                           information_->SMAOSVersion());
  // A log is worth more than its number.
  auto identity = identityFile_.load(*folder, *log_);
  if (identity) {
    information->set(kDevicePseudonym, KvString::create(identity->device));
    information->set(kSequenceNumber,
                     KvNumber::int64(static_cast<std::int64_t>(identity->next(name))));
  } else {
    log_->fault("log number", "log submission of {}: no device pseudonym: {}", name,
                identity.error().message);
  }

  const FolderBounds bounds = folderBounds(*preferences_);
  const std::string stem = fmt::format("{}{}", sequencePrefix(*sequence), name);
  if (identity) identity->last.insert_or_assign(std::string(name), identity->next(name));
  auto number =
      identity ? identityFile_.prepare(*identity) : Result<TemporaryFile>(Error{identity.error()});
  Status numbered = identity && !number ? Status(number.error()) : Done{};
  auto written = commit(*folder, *information, stem, writer, bounds.maximumBytes,
                        number ? &*number : nullptr, numbered);
  if (!written) return written;
  // The log is safe. Should its number not be noted now, it is found beside the log the next time.
  if (!numbered) log_->fault("log number", "log submission: {}", numbered.error().message);
  if (const auto evicted = evictOldest(*folder, bounds, *sequence); !evicted) {
    log_->fault("log submission: older logs stay", "log submission: {}", evicted.error().message);
  }
  return Done{};
}

Status SpoolSubmission::commit(const Directory& folder, const KvDictionary& information,
                               const std::string& stem, const Writer& writer,
                               std::uint64_t maximumBytes, TemporaryFile* number,
                               Status& numbered) {
  const auto text = encodeXmlPlist(information);
  if (!text) return text.error();
  auto written = writeFiles(folder, stem, *text, writer, maximumBytes, number, numbered);
  if (!written) {
    (void)folder.remove(stem + std::string(kBodySuffix));
    (void)folder.remove(stem + std::string(kInformationSuffix));
  }
  return written;
}

// The information gets its name before the body does, so that no body is ever without, and the
// number after it, so that none is left out.
Status SpoolSubmission::writeFiles(const Directory& folder, const std::string& stem,
                                   const std::string& info, const Writer& writer,
                                   std::uint64_t maximumBytes, TemporaryFile* number,
                                   Status& numbered) {
  auto body = TemporaryFile::create(folder, stem + std::string(kBodySuffix));
  if (!body) return body.error();
  SpoolFile file(*body, folder, maximumBytes - std::min<std::uint64_t>(maximumBytes, info.size()));
  writer(file);
  if (!file.status()) return file.status();
  if (auto reserve = checkReserve(folder, info.size()); !reserve) return reserve;
  auto informed = TemporaryFile::create(folder, stem + std::string(kInformationSuffix));
  if (!informed) return informed.error();
  if (auto written = informed->write(info); !written) return written;
  TemporaryFile* const files[] = {&*informed, &*body, number};
  const std::span<TemporaryFile* const> all(files, number != nullptr ? 3 : 2);
  if (auto synced = TemporaryFile::syncAll(all); !synced) return synced;
  for (TemporaryFile* each : {&*informed, &*body}) {
    if (auto renamed = each->rename(); !renamed) return renamed;
  }
  if (number != nullptr) numbered = number->rename();
  if (auto synced = folder.sync(); !synced) return synced;
  if (number != nullptr && numbered) numbered = number->syncDirectory();
  return Done{};
}

void readLogInformation(std::string_view bytes, SpooledLog& log) {
  const auto root = decodePlist(bytes);
  const auto* const info = root ? kvCast<KvDictionary>(root->get()) : nullptr;
  if (info == nullptr) return;
  log.typeCode = info->getString("TypeCode").value_or("");
  log.name = info->getString("Name").value_or("");
  log.options = KvRef<KvDictionary>::share(info->getAs<KvDictionary>("Options"));
  if (const auto* date = info->getAs<KvDate>("CreationTime")) {
    log.creationTime = date->secondsSince1970();
  }
  log.device = info->getString(kDevicePseudonym).value_or("");
  log.systemVersion = info->getString(kSystemVersion).value_or("");
  const auto* const number = info->getAs<KvNumber>(kSequenceNumber);
  if (number != nullptr && number->asInt64() > 0) {
    log.deviceSequence = static_cast<std::uint64_t>(number->asInt64());
  }
}

Result<std::vector<SpooledLog>> listSpooled(const Directory& folder, ListedLogs which) {
  const auto logs = listSequenced(folder);
  if (!logs) return logs.error();
  std::vector<SpooledLog> spooled;
  for (const SequencedLog& log : *logs) {
    std::string_view held;
    const auto isBody = [&](const std::string& name) {
      return name.ends_with(std::string(kBodySuffix).append(held));
    };
    auto body = std::ranges::find_if(log.names, isBody);
    if (body == log.names.end() && which == ListedLogs::HeldToo) {
      held = kHeldSuffix;
      body = std::ranges::find_if(log.names, isBody);
    }
    if (body == log.names.end()) continue;
    SpooledLog& entry = spooled.emplace_back();
    entry.sequence = log.sequence;
    entry.fileName = *body;
    const auto identity = folder.identity(*body);
    entry.bytes = identity ? identity->size : 0;
    const auto stem = body->substr(0, body->size() - kBodySuffix.size() - held.size());
    const auto information =
        folder.readFile(stem + std::string(kInformationSuffix).append(held), kLargestInformation);
    if (information) {
      readLogInformation(*information, entry);
    } else {
      entry.fault = information.error();
    }
  }
  return spooled;
}

Result<std::vector<SpooledLog>> SpoolReader::list() const {
  const auto folder = folder_.open();
  if (!folder && folder.error().systemError == ENOENT) return std::vector<SpooledLog>();
  if (!folder) return folder.error();
  return listSpooled(*folder);
}

Result<std::string> SpoolReader::readBody(const SpooledLog& log, std::size_t limit) const {
  if (!isSafeFileName(log.fileName)) return Error{"not a name that a log can have"};
  const auto folder = folder_.open();
  if (!folder) return folder.error();
  return folder->readFile(log.fileName, limit);
}

DeviceDirectory spoolFolder(const DeviceRoot& root) { return kSubmittedLogs.on(root); }

}  // namespace tally

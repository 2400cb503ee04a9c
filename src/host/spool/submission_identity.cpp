#include "host/spool/submission_identity.h"

#include <sys/random.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <optional>

#include "base/files/temporary_file.h"
#include "base/hex.h"
#include "host/spool/log_spool.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

constexpr std::size_t kPseudonymBytes = 16;
constexpr std::size_t kLargestIdentity = 1u << 20;
constexpr std::string_view kPseudonym = "DevicePseudonym";
constexpr std::string_view kLastNumbers = "LastSequenceNumbers";
// What every reader of an export can hold.
constexpr std::uint64_t kLargestNumber = (std::uint64_t{1} << 53) - 1;

std::optional<SubmissionIdentity> parseIdentity(std::string_view bytes) {
  const auto root = decodePlist(bytes);
  const auto* const fields = root ? kvCast<KvDictionary>(root->get()) : nullptr;
  const auto* const numbers =
      fields != nullptr ? fields->getAs<KvDictionary>(kLastNumbers) : nullptr;
  if (numbers == nullptr) return std::nullopt;
  SubmissionIdentity identity{std::string(fields->getString(kPseudonym).value_or("")), {}};
  if (!isDevicePseudonym(identity.device)) return std::nullopt;
  for (const auto& [name, value] : *numbers) {
    const auto* const number = kvCast<KvNumber>(value.get());
    if (number == nullptr || number->asInt64() < 1) return std::nullopt;
    const auto last = static_cast<std::uint64_t>(number->asInt64());
    if (last >= kLargestNumber) return std::nullopt;  // no device gets there
    identity.last[std::string(name->view())] = last;
  }
  return identity;
}

// True if one of the spool's logs has a later number.
Result<bool> countSpooled(const Directory& spool, SubmissionIdentity& identity) {
  bool isNews = false;
  const auto logs = listSpooled(spool, ListedLogs::HeldToo);
  if (!logs) return logs.error();
  for (const SpooledLog& log : *logs) {
    if (log.fault && mayBeSound(*log.fault)) return *log.fault;
    if (log.device != identity.device || !log.deviceSequence) continue;
    if (*log.deviceSequence >= kLargestNumber) continue;
    std::uint64_t& last = identity.last[log.name];
    isNews = isNews || *log.deviceSequence > last;
    last = std::max(last, *log.deviceSequence);
  }
  return isNews;
}

}  // namespace

bool mayBeSound(const Error& error) {
  const int codes[] = {EIO, EACCES, ENOMEM, EMFILE, ENFILE, ENOTDIR, ESTALE};
  return std::ranges::find(codes, error.systemError) != std::end(codes);
}

Result<std::string> randomHex() {
  unsigned char bytes[kPseudonymBytes];
  const auto count = retried([&] { return ::getrandom(bytes, sizeof bytes, 0); });
  if (count != sizeof bytes) {
    return Error{std::string("no random bytes: ") + std::strerror(errno), errno};
  }
  std::string digits;
  for (const unsigned char byte : bytes) appendHex(digits, byte, 2);
  return digits;
}

bool isDevicePseudonym(std::string_view text) {
  return text.size() == 2 * kPseudonymBytes &&
         text.find_first_not_of(kLowerHexDigits) == std::string_view::npos;
}

std::uint64_t SubmissionIdentity::next(std::string_view name) const {
  const auto found = last.find(name);
  return found == last.end() ? 1 : found->second + 1;
}

Result<SubmissionIdentity> IdentityFile::read() const {
  const auto bytes = folder_.readFile(kIdentityFile, kLargestIdentity);
  if (!bytes) return bytes.error();
  auto identity = parseIdentity(*bytes);
  if (!identity) return Error{folder_.text() + "/" + std::string(kIdentityFile) + " is damaged"};
  return *std::move(identity);
}

Result<SubmissionIdentity> IdentityFile::load(const Directory& spool, SystemLog& log) const {
  sweep();
  auto identity = read();
  if (!identity) {
    const Error fault = identity.error();
    if (mayBeSound(fault)) return fault;
    identity = reset();
    if (identity && fault.systemError != ENOENT) {
      log.fault("device pseudonym", "{}: the device has a new pseudonym, and its logs count from 1",
                fault.message);
    }
    return identity;
  }
  const auto isNews = countSpooled(spool, *identity);
  if (!isNews) return isNews.error();
  if (*isNews) {
    if (auto written = write(*identity); !written) return written.error();
  }
  return identity;
}

Status IdentityFile::write(const SubmissionIdentity& identity) const {
  auto file = prepare(identity);
  return file ? file->commit() : Status(file.error());
}

Result<TemporaryFile> IdentityFile::prepare(const SubmissionIdentity& identity) const {
  const auto numbers = KvDictionary::create();
  for (const auto& [name, number] : identity.last) {
    numbers->set(name, KvNumber::int64(static_cast<std::int64_t>(number)));
  }
  const auto bytes = encodeXmlPlist(*KvDictionary::create(
      {{kPseudonym, KvString::create(identity.device)}, {kLastNumbers, numbers}}));
  if (!bytes) return bytes.error();
  const auto folder = folder_.make();
  if (!folder) return folder.error();
  auto file = TemporaryFile::create(*folder, kIdentityFile);
  if (!file) return file;
  if (auto written = file->write(*bytes); !written) return written.error();
  return file;
}

Result<SubmissionIdentity> IdentityFile::reset() const {
  auto pseudonym = randomHex();
  if (!pseudonym) return pseudonym.error();
  SubmissionIdentity identity{*std::move(pseudonym), {}};
  if (auto written = write(identity); !written) return written.error();
  return identity;
}

Status IdentityFile::erase() const {
  const auto folder = folder_.open();
  if (!folder && folder.error().systemError == ENOENT) return Done{};
  if (!folder) return folder.error();
  if (!folder->identity(kIdentityFile)) return Done{};
  if (auto removed = folder->remove(kIdentityFile); !removed) return removed;
  return folder->sync();
}

std::vector<std::string> IdentityFile::leftOvers() const {
  auto names = folder_.list();
  if (!names) return {};
  std::erase_if(*names, [](const std::string& name) {
    return !isTemporaryName(name) || !name.starts_with(kIdentityFile);
  });
  return *std::move(names);
}

void IdentityFile::sweep() const {
  const auto folder = folder_.open();
  if (!folder) return;
  for (const std::string& name : leftOvers()) (void)folder->remove(name);
}

}  // namespace tally

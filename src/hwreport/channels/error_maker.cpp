// The error object, its maker and its printer.
#include "hwreport/error.h"

#include <algorithm>
#include <cstdio>

#include <fmt/core.h>

#include "hwreport/channels/error_maker.h"
#include "platform/registry_results.h"

namespace tally {

// A registry's codes are passed on as errors of this library.
static_assert(HwErrNoMemory == kRegistryNoMemory && HwErrBadArgument == kRegistryBadArgument &&
              HwErrNotFound == kRegistryNotFound);

void HwReportError::release() const noexcept {
  if (references_.fetch_sub(1, std::memory_order_acq_rel) == 1) delete this;
}

std::string_view HwReportError::failureReason() const noexcept {
  return userInfo_->getString(kHwReportFailureReasonKey).value_or(std::string_view());
}

std::string HwReportError::description() const {
  return fmt::format("{} {:#x}: {}", domain(), code_, failureReason());
}

KvRef<HwReportError> makeError(HwResult code, const char* message) {
  const std::string_view text =
      message != nullptr ? message : "createKvErr() passed a NULL string!";
  const auto isAscii = [](char c) { return static_cast<unsigned char>(c) < 0x80; };
  if (!std::all_of(text.begin(), text.end(), isAscii)) return nullptr;
  return KvRef<HwReportError>::adopt(new HwReportError(
      code, KvDictionary::create({{kHwReportFailureReasonKey, KvString::create(text)}})));
}

HwResult reportError(KvRef<HwReportError>* out, HwResult code, const char* message) {
  if (out != nullptr) *out = makeError(code, message);
  return code;
}

void printError(std::int32_t options, const KvString* label, const HwReportError* error) {
  if (options >= 0) return;
  std::string line(label != nullptr ? label->view() : "<unknown> function");
  line += ": ";
  if (error == nullptr) {
    line += "<unknown> error";
  } else {
    line += error->failureReason().empty() ? error->description() : error->failureReason();
  }
  line += '\n';
  std::fwrite(line.data(), 1, line.size(), stderr);
}

}  // namespace tally

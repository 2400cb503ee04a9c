// Result codes, and the error object that says why an operation failed.
#pragma once

#include <atomic>
#include <cstdint>
#include <string>
#include <string_view>

#include "kv/value.h"

namespace tally {

// 0 is success; a failing platform operation's own code is passed on.
using HwResult = std::uint32_t;
constexpr HwResult HwErrGeneral = 0xE00002BC;
constexpr HwResult HwErrNoMemory = 0xE00002BD;
constexpr HwResult HwErrBadArgument = 0xE00002C2;
constexpr HwResult HwErrUnsupported = 0xE00002C9;        // a legend that is not one
constexpr HwResult HwErrIO = 0xE00002CA;                 // a write failed
constexpr HwResult HwErrUnsupportedFormat = 0xE00002E6;  // an element format that is not known
constexpr HwResult HwErrShortWrite = 0xE00002E7;         // fewer bytes written than asked
constexpr HwResult HwErrRegistryChanged = 0xE00002EB;    // while its drivers were being walked
constexpr HwResult HwErrNotFound = 0xE00002F0;           // no legend, service or channel

// The domain of every error of this library, and the one key of its user information.
constexpr std::string_view kHwReportErrorDomain = "HwKernelReturnErrorDomain";
constexpr std::string_view kHwReportFailureReasonKey = "LocalizedFailureReason";

// Why an operation failed. Immutable; functions that take an error out-parameter store a new one
// there when they fail and leave it alone when they succeed. The parameter may be null.
class TALLY_API HwReportError final {
 public:
  HwReportError(const HwReportError&) = delete;
  HwReportError& operator=(const HwReportError&) = delete;
  void retain() const noexcept { references_.fetch_add(1, std::memory_order_relaxed); }
  void release() const noexcept;

  std::string_view domain() const noexcept { return kHwReportErrorDomain; }
  HwResult code() const noexcept { return code_; }
  // Borrowed: one entry, the failure reason.
  const KvDictionary* userInfo() const noexcept { return userInfo_.get(); }
  std::string_view failureReason() const noexcept;
  // Domain, code and reason in one line.
  std::string description() const;

 private:
  friend KvRef<HwReportError> makeError(HwResult code, const char* message);
  HwReportError(HwResult code, KvRef<KvDictionary> userInfo) noexcept
      : code_(code), userInfo_(std::move(userInfo)) {}
  ~HwReportError() = default;
  mutable std::atomic<std::uint32_t> references_{1};
  const HwResult code_;
  const KvRef<KvDictionary> userInfo_;
};

}  // namespace tally

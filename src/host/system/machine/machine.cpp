#include "host/system/machine/machine.h"

#include <pwd.h>
#include <sys/timex.h>

#include "base/files/device_root.h"

namespace tally {
namespace {

constexpr std::size_t kLongestId = 64;

}  // namespace

std::string bootId() {
  auto text = DeviceRoot("").readFile("/proc/sys/kernel/random/boot_id", kLongestId);
  if (!text) return "";
  text->resize(text->find_last_not_of('\n') + 1);
  return *text;
}

std::optional<bool> kernelSynchronisation() {
  timex state{};
  const int status = ::adjtimex(&state);
  if (status < 0) return std::nullopt;
  return status != TIME_ERROR && (state.status & STA_UNSYNC) == 0;
}

std::optional<std::int64_t> userNumber(std::string_view name) {
  const passwd* const user = ::getpwnam(std::string(name).c_str());
  if (user == nullptr) return std::nullopt;
  return static_cast<std::int64_t>(user->pw_uid);
}

std::string userName(std::int64_t user) {
  const passwd* const entry = user >= 0 ? ::getpwuid(static_cast<uid_t>(user)) : nullptr;
  return entry != nullptr ? entry->pw_name : std::to_string(user);
}

}  // namespace tally

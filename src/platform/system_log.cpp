#include "platform/system_log.h"

#include <cstring>

namespace tally {

bool SystemLog::admit(LogLevel level, std::uint64_t most, std::string_view kind) {
  if (repeats_ == Repeats::All) return true;
  const std::lock_guard lock(counting_);
  auto known = kinds_.find(kind);
  if (known == kinds_.end()) known = kinds_.emplace(kind, Kind{level}).first;
  const bool admitted = known->second.written < most;
  ++(admitted ? known->second.written : known->second.omitted);
  return admitted;
}

void SystemLog::writeOmitted() {
  const std::lock_guard lock(counting_);
  for (auto& [name, kind] : kinds_) {
    if (const auto omitted = std::exchange(kind.omitted, 0); omitted > 0) {
      write(kind.level, fmt::format("{}: {} more", name, omitted));
    }
  }
}

std::string faultKind(std::string_view service, const Error& error) {
  if (error.systemError == 0) return std::string(service);
  return fmt::format("{}: {}", service, std::strerror(error.systemError));
}

}  // namespace tally

// System calls that a signal may interrupt.
#pragma once

#include <cerrno>

namespace tally {

// Makes the call until it is not interrupted; what it answered, -1 with errno for a failure.
template <class Call>
auto retried(Call call) {
  auto result = call();
  while (result == -1 && errno == EINTR) result = call();
  return result;
}

}  // namespace tally

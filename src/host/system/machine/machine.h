// Questions to this machine, whatever device root the program works on.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tally {

// Different after each boot; empty if the kernel does not say.
std::string bootId();
// Whether the kernel knows that its clock follows a reference; empty if it does not answer.
std::optional<bool> kernelSynchronisation();
// The same, where no answer counts as no.
inline bool clockIsSynchronised() { return kernelSynchronisation().value_or(false); }
// The number of a user; empty when there is none of that name.
std::optional<std::int64_t> userNumber(std::string_view name);
// The name of a user; its number as text when it has none.
std::string userName(std::int64_t user);

}  // namespace tally

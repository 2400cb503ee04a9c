// Names that anyone's machine may have, in files where they may also be what a person chose.
#pragma once

#include <string>
#include <string_view>

namespace tally {

// The release of a kernel up to the first part that is neither a number nor a usual word:
// "6.1.0-18-amd64" as it is, "6.1.0" of "6.1.0-alice-custom". The end of the line stays.
std::string plainRelease(std::string_view text);

// Of a power supply: "BAT0", "axp20x-battery".
bool isSupplyName(std::string_view name);

// Of a sensor: what a driver is called, or a power supply.
bool isDriverName(std::string_view name);

// The lines of os-release that say what the system is and in which version.
std::string nameAndVersion(std::string_view text);

}  // namespace tally

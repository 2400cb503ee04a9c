// The crash-reporting support library.
#pragma once

#include <string_view>

namespace tally {

constexpr std::string_view kCrashSupportPath =
    "/System/Library/PrivateFrameworks/FaultDeskSupport.framework/FaultDeskSupport";
// The entry points that the program uses of it.
constexpr std::string_view kCrashSupportSymbols[] = {"SMAPreferencesGetIntegerValue",
                                                     "SMAPreferencesSetValue"};

// The crash-reporting support library, which a product may ship without. Its entry points give
// access to the preferences.
class CrashSupportLibrary {
 public:
  virtual ~CrashSupportLibrary() = default;
  // Loads the library; false when the device has none at that path. May be called again.
  virtual bool open(std::string_view path) = 0;
  // True when the loaded library has the entry point of this name.
  virtual bool hasSymbol(std::string_view name) = 0;

  // The entry points found so far, kept for the rest of the process.
  struct Accessors {
    bool getIntegerValue = false;
    bool setValue = false;
  };
  Accessors accessors;
};

}  // namespace tally

// Installed applications.
#pragma once

#include <functional>
#include <string_view>

namespace tally {

constexpr int kBundleKindApplication = 1;
// Types of an application bundle.
constexpr std::string_view UserAppType = "User";
constexpr std::string_view SystemAppType = "System";

class AppRegistry {
 public:
  virtual ~AppRegistry() = default;
  // Calls the handler with the type of every bundle of a kind.
  virtual void enumerateBundles(
      int kind, const std::function<void(std::string_view bundleType)>& handler) = 0;
};

}  // namespace tally

// A source for what a device root does not describe.
#pragma once

#include <algorithm>
#include <memory>

#include "host/registry/registry_source.h"

namespace tally {

// Has the entries of another source while none of the described ones takes their place.
class UndescribedSource final : public RegistrySource {
 public:
  using Replaces = bool (*)(const RegistryEntry& described);
  // described outlives this source.
  UndescribedSource(std::unique_ptr<RegistrySource> source, RegistrySource& described,
                    Replaces replaces)
      : source_(std::move(source)), described_(described), replaces_(replaces) {}

  std::shared_ptr<const Entries> entries() override {
    const auto described = described_.entries();
    const bool replaced =
        std::ranges::any_of(*described, [&](const auto& entry) { return replaces_(*entry); });
    return replaced ? none_ : source_->entries();
  }
  std::unique_ptr<UserClient> open(const RegistryEntry& entry, std::uint32_t type,
                                   RegistryResult* result) override {
    return source_->open(entry, type, result);
  }

 private:
  std::unique_ptr<RegistrySource> source_;
  RegistrySource& described_;
  Replaces replaces_;
  std::shared_ptr<const Entries> none_ = std::make_shared<const Entries>();
};

}  // namespace tally

#include "host/described/described_driver.h"

#include <algorithm>
#include <cstring>
#include <limits>

#include "host/registry/injected_result.h"
#include "platform/protocol/fetch_request.h"

namespace tally {
namespace {

// What a call asks for. Without a fetch request it has no selector.
struct Request {
  std::uint32_t method = 0;
  std::optional<std::uint32_t> selector;
  std::uint32_t flags = 0;  // without the size-query flag
  bool isSizeQuery = false;
};

bool isWanted(const KvDictionary& answer, std::string_view key,
              std::optional<std::uint32_t> value) {
  const auto* number = answer.getAs<KvNumber>(key);
  return number == nullptr || (value && number->asInt64() == std::int64_t{*value});
}

class DescribedDriver final : public UserClient {
 public:
  DescribedDriver(KvRef<KvDictionary> description, std::shared_ptr<DescribedFiles> files)
      : description_(std::move(description)), files_(std::move(files)) {}

  RegistryResult call(std::uint32_t method, MethodCall& call) override {
    Request request{method, std::nullopt, 0, false};
    if (!call.structInput.empty()) {
      const auto fetch = decodeFetchRequest(call.structInput);
      if (!fetch) return kRegistryBadArgument;
      request.selector = fetch->selector;
      request.flags = fetch->flags & ~FetchRequest::kSizeQueryFlag;
      request.isSizeQuery = (fetch->flags & FetchRequest::kSizeQueryFlag) != 0;
    }
    const KvDictionary* answer = findAnswer(request);
    if (answer == nullptr) return kRegistryUnsupported;
    return request.isSizeQuery ? announce(*answer, call) : deliver(*answer, call);
  }

  RegistryResult close() override { return injectedResult(description_.get(), "CloseStatus"); }

 private:
  // The first answer whose method, selector and flags, as far as it names them, are the request's.
  const KvDictionary* findAnswer(const Request& request) const {
    const auto* methods = description_->getAs<KvArray>("Methods");
    if (methods == nullptr) return nullptr;
    for (const auto& item : *methods) {
      const auto* answer = kvCast<KvDictionary>(item.get());
      if (answer == nullptr || answer->getInt64("Method") != std::int64_t{request.method}) continue;
      if (isWanted(*answer, "Selector", request.selector) &&
          isWanted(*answer, "Flags", request.flags)) {
        return answer;
      }
    }
    return nullptr;
  }

  RegistryResult announce(const KvDictionary& answer, MethodCall& call) {
    if (const auto status = injectedResult(&answer, "SizeStatus")) return status;
    std::uint32_t size = 0;
    if (const auto announced = answer.getInt64("AnnouncedSize")) {
      size = static_cast<std::uint32_t>(*announced);
    } else if (const auto bytes = bytesOf(answer)) {
      size = static_cast<std::uint32_t>(bytes->size());
    }
    return copyOut({reinterpret_cast<const std::byte*>(&size), sizeof size}, call);
  }

  RegistryResult deliver(const KvDictionary& answer, MethodCall& call) {
    if (const auto status = injectedResult(&answer, "DataStatus")) return status;
    const auto bytes = bytesOf(answer);
    return bytes ? copyOut(*bytes, call) : kRegistryNotFound;
  }

  std::optional<std::vector<std::byte>> bytesOf(const KvDictionary& answer) {
    const KvObject* const described = answer.get("Data");
    if (described == nullptr) return std::vector<std::byte>();
    return files_->bytes(*described);
  }

  static RegistryResult copyOut(std::span<const std::byte> bytes, MethodCall& call) {
    call.structOutputSize = std::min(bytes.size(), call.structOutput.size());
    if (call.structOutputSize > 0) {
      std::memcpy(call.structOutput.data(), bytes.data(), call.structOutputSize);
    }
    return kRegistrySuccess;
  }

  KvRef<KvDictionary> description_;
  std::shared_ptr<DescribedFiles> files_;
};

}  // namespace

std::unique_ptr<UserClient> openDescribedDriver(KvRef<KvDictionary> description,
                                                std::shared_ptr<DescribedFiles> files,
                                                RegistryResult* result) {
  *result = injectedResult(description.get(), "OpenStatus");
  if (*result != kRegistrySuccess) return nullptr;
  return std::make_unique<DescribedDriver>(std::move(description), std::move(files));
}

}  // namespace tally

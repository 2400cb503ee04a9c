#include "hwreport/sampling/subscription.h"

#include "hwreport/channels/channel_walk.h"
#include "hwreport/channels/error_maker.h"
#include "hwreport/sampling/interest_list.h"
#include "platform/platform.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {
namespace {

constexpr std::uint32_t kHubConnectionType = 0;

}  // namespace

void HwReportSubscription::finalize() const noexcept {
  delete static_cast<const Subscription*>(this);  // there is no other kind
}

Subscription::~Subscription() {
  if (address_ != nullptr) registry_->ConnectionUnmapMemory(connection_, memoryType(), address_);
  if (connection_ != 0) registry_->ServiceCloseConnection(connection_);
}

HwResult Subscription::connect(std::span<const std::byte> interests, KvRef<HwReportError>* error) {
  if (const HwResult failure = openHub(error)) return failure;
  if (const HwResult failure = configure(interests, error)) return failure;
  return mapRegion(error);
}

HwResult Subscription::openHub(KvRef<HwReportError>* error) {
  const RegistryHandle hub =
      registry_->RegistryFindService(ServiceMatchingByClass(kStatisticsHubClass));
  if (hub == 0) return reportError(error, HwErrNotFound);
  ConnectionHandle connection = 0;
  const RegistryResult opened =
      registry_->ServiceOpenConnection(hub, kHubConnectionType, &connection);
  registry_->HandleRelease(hub);
  if (opened != 0) return reportError(error, opened, "Could not open HwReportHub");
  connection_ = connection;
  MethodCall call;
  const RegistryResult started = registry_->ConnectionCallMethod(connection_, kHubOpen, call);
  return started != 0 ? reportError(error, started, "kHwReportUserClientOpen failed") : 0;
}

HwResult Subscription::configure(std::span<const std::byte> interests,
                                 KvRef<HwReportError>* error) {
  MethodCall call;
  call.structInput = interests;
  call.scalarOutput = {&token_, 1};
  RegistryResult result =
      registry_->ConnectionCallMethod(connection_, kHubConfigureInterests, call);
  if (result == 0 && call.scalarOutputCount != 1) result = HwErrGeneral;  // a token is missing
  return result != 0 ? reportError(error, result, "kHwReportUserClientConfigureInterests failed")
                     : 0;
}

HwResult Subscription::mapRegion(KvRef<HwReportError>* error) {
  const std::byte* address = nullptr;
  std::size_t length = 0;
  RegistryResult result =
      registry_->ConnectionMapMemory(connection_, memoryType(), kMapAnywhere, &address, &length);
  if (result == 0 && address == nullptr) result = HwErrGeneral;
  if (result != 0) return reportError(error, result, "HwConnectMapMemory() failed");
  address_ = address;
  length_ = length;
  return 0;
}

HwResult Subscription::update() {
  MethodCall call;
  call.scalarInput = {&token_, 1};
  return registry_->ConnectionCallMethod(connection_, kHubUpdate, call);
}

KvRef<HwReportSubscription> HwReportCreateSubscription(const void*, KvDictionary* desired,
                                                       KvRef<KvDictionary>* subscribed,
                                                       std::uint32_t, KvRef<HwReportError>* error) {
  if (desired == nullptr || subscribed == nullptr) {
    reportError(error, HwErrBadArgument, "bad arguments");
    return nullptr;
  }
  InterestList interests;
  KvRef<KvDictionary> copy;
  const int copied = transformLevels(
      desired, nullptr, false,
      [&](const LevelChannels& channels, const LevelChannels*, KvRef<ChannelFrame>* output) {
        *output = channels.copy();
        interests.add(**output);
        return channels.isWhole(**output) ? HwIterContinue : HwIterFailed;
      },
      &copy);
  if (walkFailed(copied) || interests.count() == 0) {
    const char* const reason = walkFailed(copied) ? "iteration error" : "no channels";
    reportError(error, HwErrBadArgument, reason);
    return nullptr;
  }
  if (!interests.complete()) {
    reportError(error, HwErrNoMemory, "createInterestList() failed");
    return nullptr;
  }
  const auto subscription = KvRef<Subscription>::adopt(new Subscription(platform().deviceRegistry));
  if (subscription->connect(interests.bytes(), error) != 0) return nullptr;
  *subscribed = std::move(copy);
  return subscription;
}

}  // namespace tally

#include "hwreport/sampling/subscription.h"

#include "hwreport/channels/channel_walk.h"
#include "hwreport/channels/error_maker.h"
#include "hwreport/channels/interest_list.h"
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
  const std::int32_t count = interests.fill(desired);
  if (count <= 0) {
    reportError(error, HwErrBadArgument, count < 0 ? "iteration error" : "no channels");
    return nullptr;
  }
  if (!interests.complete()) {
    reportError(error, HwErrNoMemory, "createInterestList() failed");
    return nullptr;
  }
  const auto subscription = KvRef<Subscription>::adopt(new Subscription(platform().deviceRegistry));
  if (subscription->connect(interests.bytes(), error) != 0) return nullptr;
  KvRef<KvDictionary> copy;
  KvArena arena;
  const auto keep = [](KvDictionary*, KvDictionary*) { return HwIterContinue; };
  if (walkFailed(transformChannels(desired, arena, keep, &copy))) {
    reportError(error, HwErrGeneral);
    return nullptr;
  }
  *subscribed = std::move(copy);
  return subscription;
}

}  // namespace tally

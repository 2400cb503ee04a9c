#include "hwreport/channels/drivers.h"

#include <utility>

#include "hwreport/channels/error_maker.h"
#include "hwreport/channels/keys.h"
#include "hwreport/channels/type_word.h"
#include "platform/platform.h"

namespace tally {
namespace {

// An entry or iterator that the registry handed out.
class Handle {
 public:
  explicit Handle(RegistryHandle handle) : handle_(handle) {}
  Handle(const Handle&) = delete;
  Handle& operator=(const Handle&) = delete;
  ~Handle() {
    if (handle_ != 0) platform().deviceRegistry->HandleRelease(handle_);
  }
  RegistryHandle get() const { return handle_; }

 private:
  const RegistryHandle handle_;
};

// The legend array of a channel: the array itself, unless a sample will write the type into it,
// which other readers of the registry's legend must not see.
KvRef<KvArray> shareableLegend(KvArray& legendChannel) {
  const TypeWord type{bitsOf(legendChannel.get(kLegendTypeWord))};
  return type.format() != kHwReportFormatUnknown ? KvRef<KvArray>::share(&legendChannel)
                                                 : legendChannel.copy();
}

// Adds the channels of one legend group. False: a channel could not be made.
bool readGroup(const KvArray& channels, const ChannelGroup& group, HwRegistryEntry driver,
               std::int32_t options, ChannelOwner& owner, KvDictionary& collection) {
  for (const auto& item : channels) {
    auto* const legendChannel = kvCast<KvArray>(item.get());
    if (legendChannel == nullptr) return true;
    if (!isLegendChannel(*legendChannel)) return false;
    if (!owner.driverID && readOwner(driver, &owner, nullptr) != 0) return false;
    const auto channel = makeChannel(owner, group, shareableLegend(*legendChannel), nullptr);
    if (!channel || addChannel(&collection, channel.get(), options, nullptr) != 0) return false;
  }
  return true;
}

bool readLegend(const KvArray& legend, HwRegistryEntry driver, std::int32_t options,
                KvDictionary& collection) {
  ChannelOwner owner;  // read with the first channel
  for (const auto& item : legend) {
    const auto* const entry = kvCast<KvDictionary>(item.get());
    if (entry == nullptr) return true;
    const ChannelGroup group = {
        KvRef<KvString>::share(entry->getAs<KvString>(*keys().group)),
        KvRef<KvString>::share(entry->getAs<KvString>(*keys().subGroup)),
        KvRef<KvDictionary>::share(entry->getAs<KvDictionary>(*keys().channelInfo))};
    const auto* const channels = entry->getAs<KvArray>(*keys().channels);
    if ((group.subGroup && !group.group) || channels == nullptr) return true;
    if (!readGroup(*channels, group, driver, options, owner, collection)) return false;
  }
  return true;
}

}  // namespace

HwResult walkDrivers(KvDictionary& matching,
                     const std::function<HwResult(HwRegistryEntry driver)>& step) {
  DeviceRegistry& registry = *platform().deviceRegistry;
  RegistryHandle found = 0;
  // The call takes over a reference.
  const RegistryResult failure =
      registry.RegistryCopyMatchingServices(KvRef<KvDictionary>::share(&matching), &found);
  const Handle iterator(found);
  if (failure != 0) return failure;
  for (;;) {
    const Handle driver(registry.RegistryIteratorNext(iterator.get()));
    if (driver.get() == 0) break;
    if (const HwResult result = step(driver.get()); result != 0) return result;
  }
  return registry.RegistryIteratorIsValid(iterator.get()) ? 0 : HwErrRegistryChanged;
}

HwResult readOwner(HwRegistryEntry driver, ChannelOwner* owner, KvRef<HwReportError>* error) {
  constexpr const char* kMessage = "error extracting driver info";
  std::uint64_t id = 0;
  if (const auto failure = platform().deviceRegistry->RegistryGetEntryID(driver, &id)) {
    return reportError(error, failure, kMessage);
  }
  auto name = HwReportCopyDriverName(driver);
  if (!name) return reportError(error, HwErrGeneral, kMessage);
  *owner = {KvNumber::uint64(id), std::move(name)};
  return 0;
}

KvRef<KvDictionary> HwReportCopyChannelsForDriver(HwRegistryEntry driver, std::int32_t options,
                                                  KvRef<HwReportError>* error) {
  DeviceRegistry& registry = *platform().deviceRegistry;
  if (driver == 0 || registry.RegistryHandleIsValid(driver) == 0) {
    reportError(error, HwErrBadArgument, "invalid driver");
    return nullptr;
  }
  auto collection = HwReportCreateAggregate(options);
  if (!registry.RegistryCopyProperty(driver, kLegendPublicProperty)) return collection;
  const auto property = registry.RegistryCopyProperty(driver, kLegendProperty);
  if (!property) {
    reportError(error, HwErrNotFound, "no legend");
    return nullptr;
  }
  const auto* const legend = kvCast<KvArray>(property.get());
  if (legend == nullptr) {
    reportError(error, HwErrUnsupported, "bad legend");
    return nullptr;
  }
  if (!readLegend(*legend, driver, options, *collection)) {
    reportError(error, HwErrGeneral);
    return nullptr;
  }
  return collection;
}

}  // namespace tally

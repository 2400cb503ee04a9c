// Sets of channels, subscriptions and samples for C.
#include "hwreport/hwreport_c.h"

#include <fmt/core.h>

#include "base/utf8.h"
#include "hwreport/c_api/fields.h"
#include "hwreport/c_api/handles.h"
#include "hwreport/channel.h"
#include "hwreport/channels/channel_walk.h"

namespace tally {
namespace {

static_assert(HWREPORT_BAD_ARGUMENT == kCBadArgument && HWREPORT_NO_MEMORY == kCNoMemory &&
              HWREPORT_NOT_FOUND == kCNotFound && HWREPORT_NO_VALUE == kCNoValue &&
              HWREPORT_FAILED == kCFailed);

constexpr std::string_view kNotASet = "not a set of channels";
constexpr std::string_view kMalformed = "a malformed set of channels";

int codeOfResult(HwResult result) {
  switch (result) {
    case HwErrBadArgument:
      return HWREPORT_BAD_ARGUMENT;
    case HwErrNoMemory:
      return HWREPORT_NO_MEMORY;
    case HwErrNotFound:
      return HWREPORT_NOT_FOUND;
    case HwErrRegistryChanged:
      return HWREPORT_CHANGED;
    default:
      return HWREPORT_FAILED;
  }
}

int reportFailed(std::string_view what, const KvRef<HwReportError>& error) {
  if (!error) return cFailure(HWREPORT_FAILED, what);
  return cFailure(codeOfResult(error->code()),
                  fmt::format("{}: {:#x} {}", what, error->code(), error->failureReason()));
}

// Numbers the channels afresh. False for a malformed collection.
bool numberChannels(hwreport_channels& channels) {
  channels.list.clear();
  return !walkFailed(iterateChannels(channels.collection.get(), [&](KvDictionary* channel) {
    channels.list.push_back(channel);
    return HwIterContinue;
  }));
}

int storeSet(KvRef<KvDictionary> collection, hwreport_channels** channels) {
  auto made = std::make_unique<hwreport_channels>();
  made->collection = std::move(collection);
  if (!numberChannels(*made)) return cFailure(HWREPORT_FAILED, kMalformed);
  *channels = made.release();
  return HWREPORT_OK;
}

// Removes the channels for which keep is false.
template <class Keep>
int keepWhere(hwreport_channels* channels, Keep keep) {
  if (cHandle(channels) == nullptr) return cBadArgument(kNotASet);
  channels->list.clear();  // if this fails, no index leads to a channel that is gone
  const int result = pruneChannels(channels->collection.get(), [&](KvDictionary* channel) {
    return keep(channel) ? HwIterContinue : HwIterDrop;
  });
  const bool numbered = numberChannels(*channels);
  return walkFailed(result) || !numbered ? cFailure(HWREPORT_FAILED, kMalformed) : kCOk;
}

// Null texts are not looked at.
bool hasText(const KvString* text, const char* wanted) {
  return wanted == nullptr || (text != nullptr && text->view() == wanted);
}
bool isNullOrUtf8(const char* text) { return text == nullptr || isValidUtf8(text); }

}  // namespace
}  // namespace tally

using namespace tally;

const char* hwreport_error_text(void) { return cErrorText.data(); }

void hwreport_close(hwreport_device* device) { cRelease(device); }
void hwreport_free(hwreport_channels* channels) { cRelease(channels); }
void hwreport_unsubscribe(hwreport_subscription* subscription) {
  if (cHandle(subscription) == nullptr) return;
  const auto services = subscription->services;
  const ThreadPlatformScope scope(*services);
  delete subscription;
}

int hwreport_list(hwreport_device* device, hwreport_channels** channels) {
  return cCall([&] {
    if (!cClear(channels)) return cBadArgument("the set's output is NULL");
    if (cHandle(device) == nullptr) return cBadArgument("not a device");
    const ThreadPlatformScope scope(*device->services);
    KvRef<HwReportError> error;
    auto all = HwReportCopyAllChannels(0, &error);
    return all ? storeSet(std::move(all), channels)
               : reportFailed("the channels cannot be listed", error);
  });
}

size_t hwreport_count(const hwreport_channels* channels) {
  return cHandle(channels) != nullptr ? channels->list.size() : 0;
}

int hwreport_keep_group(hwreport_channels* channels, const char* group, const char* subgroup) {
  return cCall([&] {
    if (group == nullptr && subgroup == nullptr) return cBadArgument("no group or subgroup");
    if (!isNullOrUtf8(group) || !isNullOrUtf8(subgroup)) return cBadArgument("not UTF-8");
    return keepWhere(channels, [&](KvDictionary* channel) {
      return hasText(HwReportChannelGetGroup(channel), group) &&
             hasText(HwReportChannelGetSubGroup(channel), subgroup);
    });
  });
}

int hwreport_keep_name(hwreport_channels* channels, const char* name) {
  return cCall([&] {
    if (name == nullptr) return cBadArgument("the name is NULL");
    if (!isValidUtf8(name)) return cBadArgument("the name is not UTF-8");
    return keepWhere(channels, [&](KvDictionary* channel) {
      return hasText(HwReportChannelGetChannelName(channel), name);
    });
  });
}

int hwreport_keep_categories(hwreport_channels* channels, uint16_t categories) {
  return cCall([&] {
    return keepWhere(channels, [&](KvDictionary* channel) {
      return (HwReportChannelGetCategories(channel) & categories) != 0;
    });
  });
}

int hwreport_keep_number(hwreport_channels* channels, int field, uint64_t number) {
  return cCall([&] {
    const CNumberReader read = numberReaderOf(field);
    if (read == nullptr) return cBadArgument("no such number field");
    return keepWhere(channels, [&](KvDictionary* channel) { return read(channel) == number; });
  });
}

int hwreport_add(hwreport_channels* channels, hwreport_channels* more) {
  return cCall([&] {
    if (cHandle(channels) == nullptr || cHandle(more) == nullptr) return cBadArgument(kNotASet);
    if (channels == more) return cBadArgument("a set cannot be added to itself");
    KvRef<HwReportError> error;
    const int merged =
        HwReportMergeChannels(channels->collection.get(), more->collection.get(), &error);
    const bool numbered = numberChannels(*channels);
    if (walkFailed(merged)) return reportFailed("the channels cannot be added", error);
    return numbered ? kCOk : cFailure(HWREPORT_FAILED, kMalformed);
  });
}

int hwreport_subscribe(hwreport_device* device, hwreport_channels* channels,
                       hwreport_subscription** subscription) {
  return cCall([&] {
    if (!cClear(subscription)) return cBadArgument("the subscription's output is NULL");
    if (cHandle(device) == nullptr) return cBadArgument("not a device");
    if (cHandle(channels) == nullptr) return cBadArgument(kNotASet);
    const ThreadPlatformScope scope(*device->services);
    auto made = std::make_unique<hwreport_subscription>();
    made->services = device->services;
    KvRef<HwReportError> error;
    made->connection = HwReportCreateSubscription(nullptr, channels->collection.get(),
                                                  &made->subscribed, 0, &error);
    if (!made->connection) return reportFailed("the channels cannot be subscribed", error);
    *subscription = made.release();
    return kCOk;
  });
}

int hwreport_sample(hwreport_subscription* subscription, hwreport_channels** sample) {
  return cCall([&] {
    if (!cClear(sample)) return cBadArgument("the sample's output is NULL");
    if (cHandle(subscription) == nullptr) return cBadArgument("not a subscription");
    const ThreadPlatformScope scope(*subscription->services);
    KvRef<HwReportError> error;
    auto made = HwReportCreateSamples(subscription->connection.get(),
                                      subscription->subscribed.get(), &error);
    return made ? storeSet(std::move(made), sample) : reportFailed("no sample can be taken", error);
  });
}

int hwreport_delta(hwreport_channels* earlier, hwreport_channels* later,
                   hwreport_channels** delta) {
  return cCall([&] {
    if (!cClear(delta)) return cBadArgument("the delta's output is NULL");
    if (cHandle(earlier) == nullptr || cHandle(later) == nullptr) return cBadArgument(kNotASet);
    KvRef<HwReportError> error;
    auto made =
        HwReportCreateSamplesDelta(earlier->collection.get(), later->collection.get(), &error);
    return made ? storeSet(std::move(made), delta)
                : reportFailed("the samples cannot be subtracted", error);
  });
}

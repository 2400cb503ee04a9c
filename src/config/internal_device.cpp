#include "config/internal_device.h"

namespace tally {

bool isInternalDevice(Platform& platform) {
  OnceBoolean& once = *platform.internalDevice;
  std::call_once(once.asked, [&] {
    const auto answer = platform.deviceInformation->DeviceQuery("InternalBuild");
    if (const auto* boolean = kvCast<KvBoolean>(answer.get())) {
      once.answer = boolean->value();
    } else if (const auto* number = kvCast<KvNumber>(answer.get())) {
      once.answer = number->asInt64() != 0;
    }
  });
  return once.answer;
}

}  // namespace tally

#include "kv/plist_receiver.h"

namespace tally {

void replayPlist(const KvRef<KvObject>& value, PlistReceiver& receiver) {
  const auto* const dictionary = kvCast<KvDictionary>(value.get());
  const auto* const array = kvCast<KvArray>(value.get());
  if ((dictionary == nullptr && array == nullptr) || receiver.wantsObject()) {
    receiver.value(value);
    return;
  }
  receiver.beginContainer(value->type());
  if (dictionary != nullptr) {
    for (const auto& entry : *dictionary) {
      receiver.key(entry.key->view());
      replayPlist(entry.value, receiver);
    }
  } else {
    for (const auto& item : *array) replayPlist(item, receiver);
  }
  receiver.endContainer();
}

}  // namespace tally

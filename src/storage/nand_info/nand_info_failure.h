// Failures as entries of a dictionary.
#pragma once

#include <string_view>

#include "kv/value.h"
#include "storage/nand_info.h"

namespace tally {

inline void setFailure(KvDictionary& dictionary, std::string_view errorKey,
                       std::string_view messageKey, std::string_view message) {
  dictionary.set(errorKey, KvString::create("1"));
  dictionary.set(messageKey, KvString::create(message));
}

inline KvRef<KvDictionary> nandInfoFailure(std::string_view message) {
  auto dictionary = KvDictionary::create();
  setFailure(*dictionary, kNANDInfoErrorKey, kNANDInfoErrorMessageKey, message);
  return dictionary;
}

}  // namespace tally

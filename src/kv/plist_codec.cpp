// Chooses the reader by the first bytes.
#include "kv/plist_codec.h"

#include "kv/plist_binary_reader.h"
#include "kv/plist_xml_reader.h"
#include "kv/plist_xml_writer.h"

namespace tally {
Result<KvRef<KvObject>> decodePlist(std::string_view document, std::size_t maximumBytes) {
  if (document.size() > maximumBytes) return plistTooLarge(maximumBytes);
  if (document.empty()) return Error{"the property list is empty"};
  if (isBinaryPlist(document)) {
    auto value = readBinaryPlist(document);
    if (!value) return Error{"damaged binary property list: " + value.error().message};
    return value;
  }
  if (isUtf16Plist(document)) return readXmlPlist(document, maximumBytes);
  const std::size_t first = document.find_first_not_of(" \t\r\n\xEF\xBB\xBF");
  if (first == std::string_view::npos || document[first] != '<') {
    return Error{"neither an XML nor a binary property list"};
  }
  return readXmlPlist(document, maximumBytes);
}

Result<std::string> encodeXmlPlist(const KvObject& root, std::size_t maximumBytes) {
  return writeXmlPlist(root, maximumBytes);
}

KvRef<KvObject> storedForm(KvRef<KvObject> value, int levels) {
  for (int i = 0; i < levels; ++i) value = KvArray::create({std::move(value)});
  const auto document = encodeXmlPlist(*value);
  if (!document) return nullptr;
  auto read = decodePlist(*document);
  if (!read) return nullptr;
  KvRef<KvObject> part = *std::move(read);
  for (int i = 0; i < levels && part; ++i) {
    const auto* const array = kvCast<KvArray>(part.get());
    part = KvRef<KvObject>::share(array != nullptr ? array->get(0) : nullptr);
  }
  return part;
}

}  // namespace tally

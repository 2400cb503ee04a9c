// Chooses the reader by the first bytes.
#include "kv/plist_codec.h"

#include "kv/plist_binary_reader.h"
#include "kv/plist_xml_reader.h"
#include "kv/plist_xml_writer.h"

namespace tally {
namespace {

class RootReceiver final : public PlistReceiver {
 public:
  bool wantsObject() override { return true; }
  void beginContainer(KvType) override {}
  void endContainer() override {}
  void key(std::string_view) override {}
  void value(KvRef<KvObject> value) override { root = std::move(value); }
  KvRef<KvObject> root;
};

Status readBinary(std::string_view document, PlistReceiver& receiver) {
  const auto value = readBinaryPlist(document);
  if (!value) return Error{"damaged binary property list: " + value.error().message};
  replayPlist(*value, receiver);
  return Done{};
}

}  // namespace

Status readPlist(DocumentWindow& window, PlistReceiver& receiver, std::size_t maximumBytes) {
  constexpr std::size_t kLongestMark = 16;
  const auto first = [&] { return window.text().find_first_not_of(" \t\r\n\xEF\xBB\xBF"); };
  while (!window.endsDocument() &&
         (window.text().size() < kLongestMark || first() == std::string_view::npos)) {
    window.more(0);
  }
  const bool isUtf16 = isUtf16Plist(window.text());
  if (isBinaryPlist(window.text()) || isUtf16) {
    while (!window.endsDocument()) window.more(0);
  }
  const std::string_view text = window.text();
  if (text.size() > maximumBytes) return plistTooLarge(maximumBytes);
  if (text.empty()) return Error{"the property list is empty"};
  if (isBinaryPlist(text)) return readBinary(text, receiver);
  if (isUtf16) return readUtf16Plist(text, maximumBytes, receiver);
  if (first() == std::string_view::npos || text[first()] != '<') {
    return Error{"neither an XML nor a binary property list"};
  }
  return readXmlPlist(window, receiver);
}

Result<KvRef<KvObject>> decodePlist(std::string_view document, std::size_t maximumBytes) {
  DocumentWindow window(document);
  RootReceiver receiver;
  const Status isRead = readPlist(window, receiver, maximumBytes);
  if (!isRead) return isRead.error();
  return std::move(receiver.root);
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

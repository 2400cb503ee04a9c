// Chooses the reader by the first bytes, and turns the library's tree of a binary list into values.
#include "kv/plist_codec.h"

#include <plist/plist.h>

#include <cstdlib>
#include <limits>
#include <memory>

#include "kv/plist_binary_guard.h"
#include "kv/plist_xml_leaf.h"
#include "kv/plist_xml_reader.h"
#include "kv/plist_xml_writer.h"

namespace tally {
namespace {

constexpr double kSecondsFrom1970To2001 = 978307200;

struct FreeMemory {
  void operator()(void* memory) const { std::free(memory); }
};
struct FreeNode {
  void operator()(void* node) const { plist_free(node); }
};
template <class T>
using Allocated = std::unique_ptr<T, FreeMemory>;
using Node = std::unique_ptr<void, FreeNode>;

// The text that the library writes for a scalar: it tells what the getters blur.
std::string xmlText(plist_t node) {
  char* written = nullptr;
  std::uint32_t length = 0;
  plist_to_xml(node, &written, &length);
  const Allocated<char> owner(written);
  const std::string_view document(written != nullptr ? written : "", length);
  const std::size_t end = document.rfind("</", document.rfind("</plist>") - 1);
  const std::size_t start = document.rfind('>', end);
  if (end == std::string_view::npos || start == std::string_view::npos) return {};
  return std::string(document.substr(start + 1, end - start - 1));
}

KvRef<KvObject> integerOf(plist_t node) {
  std::uint64_t bits = 0;
  plist_get_uint_val(node, &bits);
  if (bits <= static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
    return KvNumber::int64(static_cast<std::int64_t>(bits));
  }
  return integerFromText(xmlText(node));  // negative, or unsigned and that large
}

KvRef<KvObject> dateOf(plist_t node) {
  std::int32_t seconds = 0, microseconds = 0;
  plist_get_date_val(node, &seconds, &microseconds);
  constexpr auto limit = std::numeric_limits<std::int32_t>::max();
  if (seconds > -limit && seconds < limit) {
    return KvDate::create(kSecondsFrom1970To2001 + seconds);
  }
  std::string text = xmlText(node);  // the getter has no room for it
  const std::size_t yearLength = text.find('-');
  if (yearLength < 4) text.insert(0, 4 - yearLength, '0');
  return dateFromText(text);
}

KvRef<KvObject> valueOf(plist_t node);

// Frees each item as soon as its value is made, so that tree and values never stand side by side.
KvRef<KvObject> arrayOf(plist_t node) {
  auto array = KvArray::create(plist_array_get_size(node));
  plist_array_iter iterator = nullptr;
  plist_array_new_iter(node, &iterator);
  const Allocated<void> owner(iterator);
  for (;;) {
    plist_t item = nullptr;
    plist_array_next_item(node, iterator, &item);
    const Node itemOwner(item);
    if (item == nullptr) return array;
    auto value = valueOf(item);
    if (!value) return nullptr;
    array->append(std::move(value));
  }
}

KvRef<KvObject> dictionaryOf(plist_t node) {
  auto dictionary = KvDictionary::create(plist_dict_get_size(node));
  plist_dict_iter iterator = nullptr;
  plist_dict_new_iter(node, &iterator);
  const Allocated<void> owner(iterator);
  for (;;) {
    char* key = nullptr;
    plist_t item = nullptr;
    plist_dict_next_item(node, iterator, &key, &item);
    const Allocated<char> keyOwner(key);
    if (item == nullptr) return dictionary;
    const Node keyNode(plist_dict_item_get_key(item));
    const Node itemOwner(item);
    auto value = valueOf(item);
    if (!value || key == nullptr) return nullptr;
    dictionary->set(key, std::move(value));
  }
}

// Null for a node without a value. At most kMaximumDepth calls deep, since it was checked.
KvRef<KvObject> valueOf(plist_t node) {
  std::uint64_t length = 0;
  const auto size = [&length] { return static_cast<std::size_t>(length); };
  switch (plist_get_node_type(node)) {
    case PLIST_BOOLEAN: {
      std::uint8_t value = 0;
      plist_get_bool_val(node, &value);
      return KvBoolean::of(value != 0);
    }
    case PLIST_UINT:
      return integerOf(node);
    case PLIST_REAL: {
      double value = 0;
      plist_get_real_val(node, &value);
      return KvNumber::float64(value);
    }
    case PLIST_STRING: {
      const char* text = plist_get_string_ptr(node, &length);
      const std::string_view content(text != nullptr ? text : "", text != nullptr ? size() : 0);
      return KvString::create(content);
    }
    case PLIST_DATE:
      return dateOf(node);
    case PLIST_DATA: {
      const char* bytes = plist_get_data_ptr(node, &length);
      return KvData::create(std::as_bytes(std::span(bytes, bytes != nullptr ? size() : 0)));
    }
    case PLIST_ARRAY:
      return arrayOf(node);
    case PLIST_DICT:
      return dictionaryOf(node);
    default:
      return nullptr;
  }
}

Result<KvRef<KvObject>> readBinary(std::string_view document) {
  if (Status status = checkBinaryPlist(std::as_bytes(std::span(document))); !status) {
    return Error{"damaged binary property list: " + status.error().message};
  }
  plist_t root = nullptr;
  plist_from_bin(document.data(), static_cast<std::uint32_t>(document.size()), &root);
  const Node owner(root);
  auto value = root != nullptr ? valueOf(root) : nullptr;
  if (!value) return Error{"damaged binary property list: it cannot be read"};
  return value;
}

}  // namespace

Result<KvRef<KvObject>> decodePlist(std::string_view document, std::size_t maximumBytes) {
  if (document.size() > maximumBytes) return plistTooLarge(maximumBytes);
  if (document.empty()) return Error{"the property list is empty"};
  if (isBinaryPlist(std::as_bytes(std::span(document)))) return readBinary(document);
  const std::size_t first = document.find_first_not_of(" \t\r\n\xEF\xBB\xBF");
  if (first == std::string_view::npos || document[first] != '<') {
    return Error{"neither an XML nor a binary property list"};
  }
  return readXmlPlist(document);
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

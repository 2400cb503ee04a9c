#include "tools/endpoint/application_list.h"

#include <fmt/core.h>

#include <nlohmann/json.hpp>
#include <optional>
#include <vector>

#include "base/files/file.h"
#include "base/hex.h"
#include "driver/app_info_listener.h"
#include "kv/plist_codec.h"
#include "tools/frame/standard_input.h"

namespace tally::tools {
namespace {

// More than any message can carry.
constexpr std::size_t kLargestFile = 64u << 20;

// Null if the text is not a UUID of 8-4-4-4-12 digits.
KvRef<KvObject> uuidOf(std::string_view text) {
  constexpr std::string_view kForm = "xxxxxxxx-xxxx-xxxx-xxxx-xxxxxxxxxxxx";
  if (text.size() != kForm.size()) return nullptr;
  std::vector<std::byte> bytes;
  std::optional<unsigned> high;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (kForm[i] == '-') {
      if (text[i] != '-') return nullptr;
      continue;
    }
    const auto digit = hexDigitValue(text[i]);
    if (!digit) return nullptr;
    if (high) bytes.push_back(static_cast<std::byte>(*high << 4 | *digit));
    high = high ? std::nullopt : digit;
  }
  return KvData::create(bytes);
}

KvRef<KvObject> valueOf(const nlohmann::json& json) {
  if (json.is_string()) return KvString::create(json.get_ref<const std::string&>());
  if (json.is_number_unsigned()) return KvNumber::uint64(json.get<std::uint64_t>());
  if (json.is_number_integer()) return KvNumber::int64(json.get<std::int64_t>());
  return nullptr;
}

// Null if the document is not an array of objects.
KvRef<KvArray> arrayOfJson(std::string_view document) {
  const auto root = nlohmann::json::parse(document, nullptr, /*allow_exceptions=*/false);
  if (!root.is_array()) return nullptr;
  auto list = KvArray::create(root.size());
  for (const auto& element : root) {
    if (!element.is_object()) return nullptr;
    auto fields = KvDictionary::create();
    for (const auto& [key, value] : element.items()) fields->set(key, valueOf(value));
    list->append(std::move(fields));
  }
  return list;
}

// The value of a field as a message carries it.
Result<KvRef<KvObject>> fieldOf(const KvDictionary& fields, std::string_view key,
                                ApplicationFieldKind kind) {
  switch (kind) {
    case ApplicationFieldKind::Text:
      if (auto* const text = fields.getAs<KvString>(key)) return KvRef<KvObject>::share(text);
      return Error{fmt::format("no text \"{}\"", key)};
    case ApplicationFieldKind::Number: {
      const auto* const number = fields.getAs<KvNumber>(key);
      if (number == nullptr || number->isReal()) {
        return Error{fmt::format("no integer \"{}\"", key)};
      }
      if (number->isUnsigned() && number->asInt64() < 0) {
        return Error{fmt::format("\"{}\" does not fit in a signed 64-bit integer", key)};
      }
      return KvRef<KvObject>(KvNumber::int64(number->asInt64()));
    }
    case ApplicationFieldKind::Uuid:
      break;
  }
  const auto text = fields.getString(key);
  auto uuid = text ? uuidOf(*text) : KvRef<KvObject>::share(fields.getAs<KvData>(key));
  const auto* const bytes = kvCast<KvData>(uuid.get());
  if (bytes == nullptr || bytes->bytes().size() != kUuidBytes) {
    return Error{fmt::format("no \"{}\" of {} bytes", key, kUuidBytes)};
  }
  return uuid;
}

Result<KvRef<KvDictionary>> makeElement(const KvObject* value) {
  const auto* const fields = kvCast<KvDictionary>(value);
  if (fields == nullptr) return Error{"not an object"};
  auto element = KvDictionary::create();
  for (const auto& [key, logged, kind] : kApplicationFields) {
    auto field = fieldOf(*fields, key, kind);
    if (!field) return field.error();
    element->set(key, *std::move(field));
  }
  return element;
}

}  // namespace

Result<KvRef<KvArray>> readApplicationList(const std::string& path) {
  const auto document =
      path == "-" ? readStandardInput(kLargestFile) : readFile(path, kLargestFile);
  if (!document) return document.error();
  const auto first = document->find_first_not_of(" \t\r\n");
  KvRef<KvArray> list;
  if (first != document->npos && (*document)[first] == '[') {
    list = arrayOfJson(*document);
  } else if (const auto root = decodePlist(*document)) {
    list = KvRef<KvArray>::share(kvCast<KvArray>(root->get()));
  }
  if (!list) return Error{path + ": neither JSON nor a property list with an array of objects"};
  auto elements = KvArray::create(list->size());
  for (std::size_t i = 0; i < list->size(); ++i) {
    auto element = makeElement(list->get(i));
    if (!element) {
      return Error{fmt::format("{}: element {}: {}", path, i, element.error().message)};
    }
    elements->append(*std::move(element));
  }
  return elements;
}

}  // namespace tally::tools

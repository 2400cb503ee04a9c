#include "host/bus/bus_message.h"

#include <fmt/core.h>
#include <systemd/sd-bus.h>

#include <cstring>
#include <string>
#include <string_view>

namespace tally {
namespace {

Error systemFailure(std::string_view what, int result) {
  return {fmt::format("{}: {}", what, std::strerror(-result)), -result};
}

// One value, or null for one that has no counterpart.
using ReadValue = Result<KvRef<KvObject>>;

class DictionaryReader {
 public:
  DictionaryReader(sd_bus_message* message, const BusMessageLimits& limits)
      : message_(message), left_(limits) {}

  // The position is before an array of entries; so it is for all of these.
  Result<KvRef<KvDictionary>> readDictionary(const char* entry) {
    int result = ::sd_bus_message_enter_container(message_, SD_BUS_TYPE_ARRAY, entry);
    if (result < 0) return systemFailure("malformed", result);
    auto dictionary = KvDictionary::create();
    const std::string_view types(entry);
    const std::string inner(types.substr(1, types.size() - 2));  // without the braces
    while ((result = ::sd_bus_message_enter_container(message_, SD_BUS_TYPE_DICT_ENTRY,
                                                      inner.c_str())) > 0) {
      const char* key = nullptr;
      result = ::sd_bus_message_read_basic(message_, SD_BUS_TYPE_STRING, &key);
      if (result < 0) return systemFailure("malformed", result);
      const std::string_view keyText(key);
      if (Status counted = count(keyText.size()); !counted) return counted.error();
      const auto keyObject = KvString::create(keyText);
      auto value = readNext();
      if (!value) return value.error();
      if (*value) dictionary->set(keyObject, *std::move(value));
      result = ::sd_bus_message_exit_container(message_);
      if (result < 0) return systemFailure("malformed", result);
    }
    if (result >= 0) result = ::sd_bus_message_exit_container(message_);
    if (result < 0) return systemFailure("malformed", result);
    return dictionary;
  }

 private:
  ReadValue readNext() {
    char type = 0;
    const char* contents = nullptr;
    const int result = ::sd_bus_message_peek_type(message_, &type, &contents);
    if (result < 0) return systemFailure("malformed", result);
    if (result == 0) return Error{"malformed: a value is missing"};
    if (Status counted = count(0); !counted) return counted.error();
    switch (type) {
      case SD_BUS_TYPE_VARIANT:
      case SD_BUS_TYPE_ARRAY:
        return readContainer(type, contents);
      case SD_BUS_TYPE_STRING:
      case SD_BUS_TYPE_OBJECT_PATH:
      case SD_BUS_TYPE_SIGNATURE:
        return readString(type);
      case SD_BUS_TYPE_BOOLEAN:
        return readAs<int>(type, [](int value) { return KvBoolean::of(value != 0); });
      case SD_BUS_TYPE_BYTE:
        return readAs<std::uint8_t>(type, KvNumber::uint32);
      case SD_BUS_TYPE_INT16:
        return readAs<std::int16_t>(type, KvNumber::int32);
      case SD_BUS_TYPE_UINT16:
        return readAs<std::uint16_t>(type, KvNumber::uint32);
      case SD_BUS_TYPE_INT32:
        return readAs<std::int32_t>(type, KvNumber::int32);
      case SD_BUS_TYPE_UINT32:
        return readAs<std::uint32_t>(type, KvNumber::uint32);
      case SD_BUS_TYPE_INT64:
        return readAs<std::int64_t>(type, KvNumber::int64);
      case SD_BUS_TYPE_UINT64:
        return readAs<std::uint64_t>(type, KvNumber::uint64);
      case SD_BUS_TYPE_DOUBLE:
        return readAs<double>(type, KvNumber::float64);
      default:
        return skip();
    }
  }

  // Variants count as a level too: they are what makes nesting free for a sender.
  ReadValue readContainer(char type, const char* contents) {
    if (left_.nesting == 0) return Error{"nested too deeply"};
    --left_.nesting;
    ReadValue value = type == SD_BUS_TYPE_VARIANT ? readVariant(contents) : readArray(contents);
    ++left_.nesting;
    return value;
  }

  ReadValue readVariant(const char* contents) {
    int result = ::sd_bus_message_enter_container(message_, SD_BUS_TYPE_VARIANT, contents);
    if (result < 0) return systemFailure("malformed", result);
    ReadValue value = readNext();
    if (!value) return value;
    result = ::sd_bus_message_exit_container(message_);
    if (result < 0) return systemFailure("malformed", result);
    return value;
  }

  ReadValue readArray(const char* contents) {
    const std::string_view element(contents);
    if (element == "y") return readBytes();
    if (element.starts_with("{s")) {
      auto dictionary = readDictionary(std::string(element).c_str());
      if (!dictionary) return dictionary.error();
      return KvRef<KvObject>(*std::move(dictionary));
    }
    if (element.starts_with('{')) return skip();
    const std::string type(element);
    int result = ::sd_bus_message_enter_container(message_, SD_BUS_TYPE_ARRAY, type.c_str());
    if (result < 0) return systemFailure("malformed", result);
    auto array = KvArray::create();
    while ((result = ::sd_bus_message_at_end(message_, 0)) == 0) {
      if (left_.elements == 0) return Error{"more elements than a message may have"};
      --left_.elements;
      auto value = readNext();
      if (!value) return value;
      array->append(*value ? *std::move(value) : KvRef<KvObject>(KvData::create({})));
    }
    if (result >= 0) result = ::sd_bus_message_exit_container(message_);
    if (result < 0) return systemFailure("malformed", result);
    return KvRef<KvObject>(std::move(array));
  }

  ReadValue readBytes() {
    const void* bytes = nullptr;
    std::size_t size = 0;
    const int result = ::sd_bus_message_read_array(message_, SD_BUS_TYPE_BYTE, &bytes, &size);
    if (result < 0) return systemFailure("malformed", result);
    if (Status counted = count(size); !counted) return counted.error();
    return KvRef<KvObject>(KvData::create({static_cast<const std::byte*>(bytes), size}));
  }

  ReadValue readString(char type) {
    const char* text = nullptr;
    const int result = ::sd_bus_message_read_basic(message_, type, &text);
    if (result < 0) return systemFailure("malformed", result);
    const std::string_view view(text);
    if (Status counted = count(view.size()); !counted) return counted.error();
    return KvRef<KvObject>(KvString::create(view));
  }

  template <class T, class Create>
  ReadValue readAs(char type, Create create) {
    T value{};
    const int result = ::sd_bus_message_read_basic(message_, type, &value);
    if (result < 0) return systemFailure("malformed", result);
    return KvRef<KvObject>(create(value));
  }

  ReadValue skip() {
    const int result = ::sd_bus_message_skip(message_, nullptr);
    if (result < 0) return systemFailure("malformed", result);
    return KvRef<KvObject>();
  }

  // One more value or key, of so many bytes besides what every one takes.
  Status count(std::size_t size) {
    constexpr std::size_t kLeastBytes = 8;
    if (left_.values == 0) return Error{"more values than a message may have"};
    if (left_.bytes < size + kLeastBytes) return Error{"larger than a message may be"};
    --left_.values;
    left_.bytes -= size + kLeastBytes;
    return Done{};
  }

  sd_bus_message* message_;
  BusMessageLimits left_;
};

class DictionaryWriter {
 public:
  explicit DictionaryWriter(sd_bus_message* message) : message_(message) {}

  Status append(const KvDictionary& dictionary) {
    if (Status opened = open(SD_BUS_TYPE_ARRAY, "{sv}"); !opened) return opened;
    for (const auto& entry : dictionary) {
      if (Status opened = open(SD_BUS_TYPE_DICT_ENTRY, "sv"); !opened) return opened;
      if (Status key = appendText(entry.key->view()); !key) return key;
      if (Status value = appendVariant(*entry.value); !value) return value;
      if (Status closed = close(); !closed) return closed;
    }
    return close();
  }

 private:
  Status appendVariant(const KvObject& value) {
    const char* type = variantType(value);
    if (type == nullptr) return Error{"a message cannot carry a date"};
    if (Status opened = open(SD_BUS_TYPE_VARIANT, type); !opened) return opened;
    if (Status content = appendContent(value, type); !content) return content;
    return close();
  }

  static const char* variantType(const KvObject& value) {
    switch (value.type()) {
      case KvType::String:
        return "s";
      case KvType::Boolean:
        return "b";
      case KvType::Data:
        return "ay";
      case KvType::Dictionary:
        return "a{sv}";
      case KvType::Number:
        return numberType(static_cast<const KvNumber&>(value));
      case KvType::Array:
        return isListOfDictionaries(static_cast<const KvArray&>(value)) ? "aa{sv}" : "av";
      default:
        return nullptr;
    }
  }

  static const char* numberType(const KvNumber& number) {
    if (number.isReal()) return "d";
    return number.kind() == KvNumberKind::UInt64 ? "t" : "x";
  }

  // An empty list counts: it is what a list of nothing looks like.
  static bool isListOfDictionaries(const KvArray& array) {
    for (const auto& item : array) {
      if (item->type() != KvType::Dictionary) return false;
    }
    return true;
  }

  Status appendContent(const KvObject& value, std::string_view type) {
    switch (value.type()) {
      case KvType::String:
        return appendText(static_cast<const KvString&>(value).view());
      case KvType::Boolean: {
        const int flag = static_cast<const KvBoolean&>(value).value() ? 1 : 0;
        return done(::sd_bus_message_append_basic(message_, SD_BUS_TYPE_BOOLEAN, &flag));
      }
      case KvType::Data: {
        const auto bytes = static_cast<const KvData&>(value).bytes();
        return done(
            ::sd_bus_message_append_array(message_, SD_BUS_TYPE_BYTE, bytes.data(), bytes.size()));
      }
      case KvType::Dictionary:
        return append(static_cast<const KvDictionary&>(value));
      case KvType::Number:
        return appendNumber(static_cast<const KvNumber&>(value));
      default:
        return appendArray(static_cast<const KvArray&>(value), type == "av" ? "v" : "a{sv}");
    }
  }

  Status appendNumber(const KvNumber& number) {
    if (number.isReal()) {
      const double value = number.asDouble();
      return done(::sd_bus_message_append_basic(message_, SD_BUS_TYPE_DOUBLE, &value));
    }
    const std::int64_t value = number.asInt64();  // of the same bits when it is unsigned
    return done(::sd_bus_message_append_basic(message_, numberType(number)[0], &value));
  }

  Status appendArray(const KvArray& array, const std::string& element) {
    if (Status opened = open(SD_BUS_TYPE_ARRAY, element.c_str()); !opened) return opened;
    for (const auto& item : array) {
      const Status added =
          element == "v" ? appendVariant(*item) : append(static_cast<const KvDictionary&>(*item));
      if (!added) return added;
    }
    return close();
  }

  Status appendText(std::string_view text) {
    if (text.find('\0') != text.npos) return Error{"a message cannot carry a zero byte in a text"};
    const std::string terminated(text);
    return done(::sd_bus_message_append_basic(message_, SD_BUS_TYPE_STRING, terminated.c_str()));
  }

  Status open(char type, const char* contents) {
    return done(::sd_bus_message_open_container(message_, type, contents));
  }
  Status close() { return done(::sd_bus_message_close_container(message_)); }
  static Status done(int result) {
    if (result < 0) return systemFailure("a message cannot be created", result);
    return Done{};
  }

  sd_bus_message* message_;
};

}  // namespace

Result<KvRef<KvDictionary>> readBusDictionary(sd_bus_message* message,
                                              const BusMessageLimits& limits) {
  return DictionaryReader(message, limits).readDictionary("{sv}");
}

Status appendBusDictionary(sd_bus_message* message, const KvDictionary& dictionary) {
  return DictionaryWriter(message).append(dictionary);
}

}  // namespace tally

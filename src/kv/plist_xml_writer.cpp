// A writer of our own: building the library's tree first costs several times the time and the
// memory of the document, and it loses unsigned integers, dates far from today and control
// characters. Where the library's output is correct, this writer's is the same byte for byte.
#include "kv/plist_xml_writer.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>

#include "base/number_text.h"
#include "base/time_text.h"
#include "base/utf8.h"
#include "kv/base64.h"
#include "kv/nesting.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

constexpr std::string_view kHeader =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
    "<!DOCTYPE plist PUBLIC \"-//Apple//DTD PLIST 1.0//EN\" "
    "\"http://www.apple.com/DTDs/PropertyList-1.0.dtd\">\n"
    "<plist version=\"1.0\">\n";
constexpr std::string_view kFooter = "</plist>\n";

// Lines of data end at this column, a tab counting 8; deeper than 8 tabs they stay where they are.
constexpr int kDataColumns = 76;
constexpr int kTabColumns = 8;
constexpr int kDataMaximumTabs = 8;

enum : std::uint8_t { kPlain, kEscaped, kSuspect };

// Suspect bytes may belong to a character that XML cannot carry: controls, U+FFFE and U+FFFF.
constexpr std::array<std::uint8_t, 256> kByteClass = [] {
  std::array<std::uint8_t, 256> classes{};
  for (unsigned byte = 0; byte < 0x20; ++byte) classes[byte] = kSuspect;
  classes['\t'] = classes['\n'] = kPlain;
  for (const char byte : {'&', '<', '>', '\r'}) {
    classes[static_cast<unsigned char>(byte)] = kEscaped;
  }
  classes[0xEF] = kSuspect;
  return classes;
}();

std::uint8_t classOf(char character) { return kByteClass[static_cast<std::uint8_t>(character)]; }

void appendEscaped(std::string& out, std::string_view text) {
  std::size_t start = 0;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (classOf(text[i]) != kEscaped) continue;
    out.append(text, start, i - start);
    start = i + 1;
    switch (text[i]) {
      case '&':
        out += "&amp;";
        break;
      case '<':
        out += "&lt;";
        break;
      case '>':
        out += "&gt;";
        break;
      default:
        out += "&#13;";  // a reader turns a plain carriage return into a newline
    }
  }
  out.append(text, start);
}

void appendText(std::string& out, std::string_view text) {
  std::uint8_t found = kPlain;
  for (const char character : text) found = std::max(found, classOf(character));
  if (found == kPlain) {
    out += text;
  } else if (found == kEscaped) {
    appendEscaped(out, text);
  } else {
    appendEscaped(out, replaceNonXmlCharacters(text));
  }
}

void appendReal(std::string& out, double value) {
  if (!std::isfinite(value)) {
    appendDouble(out, value);
  } else if (value == 0) {
    out += std::signbit(value) ? "-0.0" : "0.0";
  } else {
    char text[40];
    const auto [end, error] =
        std::to_chars(text, text + sizeof text, value, std::chars_format::general, 17);
    out.append(text, end);
  }
}

class Writer {
 public:
  explicit Writer(std::size_t maximumBytes) : maximumBytes_(maximumBytes) {}

  Status value(const KvObject& object, int depth) {
    if (out_.size() > maximumBytes_) return plistTooLarge(maximumBytes_);
    indent(depth);
    switch (object.type()) {
      case KvType::String:
        text("string", static_cast<const KvString&>(object).view());
        break;
      case KvType::Number:
        number(static_cast<const KvNumber&>(object));
        break;
      case KvType::Boolean:
        out_ += static_cast<const KvBoolean&>(object).value() ? "<true/>\n" : "<false/>\n";
        break;
      case KvType::Date:
        out_ += "<date>";
        appendTimestamp(out_, static_cast<const KvDate&>(object).secondsSince1970());
        out_ += "</date>\n";
        break;
      case KvType::Data:
        data(static_cast<const KvData&>(object).bytes(), depth);
        break;
      case KvType::Array:
        return array(static_cast<const KvArray&>(object), depth);
      case KvType::Dictionary:
        return dictionary(static_cast<const KvDictionary&>(object), depth);
    }
    return Done{};
  }

  std::string out_{kHeader};

 private:
  void indent(int depth) { out_.append(static_cast<std::size_t>(depth), '\t'); }

  void text(std::string_view tag, std::string_view content) {
    ((out_ += '<') += tag) += '>';
    appendText(out_, content);
    ((out_ += "</") += tag) += ">\n";
  }

  void number(const KvNumber& number) {
    if (number.isReal()) {
      out_ += "<real>";
      appendReal(out_, number.asDouble());
      out_ += "</real>\n";
      return;
    }
    out_ += "<integer>";
    if (number.isUnsigned()) {
      appendUInt64(out_, number.asUInt64());
    } else {
      appendInt64(out_, number.asInt64());
    }
    out_ += "</integer>\n";
  }

  void data(std::span<const std::byte> bytes, int depth) {
    const int tabs = std::min(depth, kDataMaximumTabs);
    const auto bytesPerLine = static_cast<std::size_t>(kDataColumns - kTabColumns * tabs) / 4 * 3;
    out_ += "<data>\n";
    for (; !bytes.empty(); bytes = bytes.subspan(std::min(bytes.size(), bytesPerLine))) {
      indent(tabs);
      appendBase64(out_, bytes.first(std::min(bytes.size(), bytesPerLine)));
      out_ += '\n';
    }
    indent(depth);
    out_ += "</data>\n";
  }

  Status array(const KvArray& array, int depth) {
    if (depth == kMaximumDepth) return tooDeep();
    if (array.empty()) return out_ += "<array/>\n", Done{};
    out_ += "<array>\n";
    for (const auto& item : array) {
      if (Status status = value(*item, depth + 1); !status) return status;
    }
    indent(depth);
    out_ += "</array>\n";
    return Done{};
  }

  Status dictionary(const KvDictionary& dictionary, int depth) {
    if (depth == kMaximumDepth) return tooDeep();
    if (dictionary.empty()) return out_ += "<dict/>\n", Done{};
    out_ += "<dict>\n";
    for (const auto& [key, item] : dictionary) {
      indent(depth + 1);
      text("key", key->view());
      if (Status status = value(*item, depth + 1); !status) return status;
    }
    indent(depth);
    out_ += "</dict>\n";
    return Done{};
  }

  static Error tooDeep() {
    return Error{"the value is " + std::string(kTooDeep) + " or contains itself"};
  }

  std::size_t maximumBytes_;
};

}  // namespace

Error plistTooLarge(std::size_t maximumBytes) {
  return Error{"the property list is larger than " + std::to_string(maximumBytes >> 20) + " MiB"};
}

Result<std::string> writeXmlPlist(const KvObject& root, std::size_t maximumBytes) {
  Writer writer(maximumBytes);
  if (Status status = writer.value(root, 0); !status) return status.error();
  writer.out_ += kFooter;
  if (writer.out_.size() > maximumBytes) return plistTooLarge(maximumBytes);
  return std::move(writer.out_);
}

}  // namespace tally

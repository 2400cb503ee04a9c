// A writer of our own: building the library's tree first costs several times the time and the
// memory of the document, and it loses unsigned integers, dates far from today and control
// characters. Where the library's output is correct, this writer's is the same byte for byte.
#include "kv/plist_xml_writer.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <limits>
#include <utility>

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

constexpr std::size_t kPiece = 64u << 10;

// Lines of data end at this column, a tab counting 8; deeper than 8 tabs they stay where they are.
constexpr std::size_t kDataColumns = 76;
constexpr std::size_t kTabColumns = 8;
constexpr std::size_t kDataMaximumTabs = 8;

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

Error tooDeep() { return Error{"the value is " + std::string(kTooDeep) + " or contains itself"}; }

}  // namespace

XmlPlistWriter::XmlPlistWriter(std::size_t maximumBytes, Sink sink)
    : maximumBytes_(maximumBytes),
      sink_(std::move(sink)),
      piece_(sink_ ? kPiece : std::numeric_limits<std::size_t>::max()),
      out_(kHeader) {}

void XmlPlistWriter::beginDictionary() {
  indent(depth_++);
  out_ += "<dict>\n";
}

void XmlPlistWriter::endDictionary() {
  indent(--depth_);
  out_ += "</dict>\n";
}

void XmlPlistWriter::emptyDictionary() {
  indent(depth_);
  out_ += "<dict/>\n";
}

void XmlPlistWriter::key(std::string_view key) {
  indent(depth_);
  text("key", key);
}

void XmlPlistWriter::integer(std::int64_t value) {
  indent(depth_);
  out_ += "<integer>";
  appendInt64(out_, value);
  out_ += "</integer>\n";
}

Status XmlPlistWriter::value(const KvObject& object) {
  if (size() > maximumBytes_) return plistTooLarge(maximumBytes_);
  if (isLarge()) {
    if (Status passed = passOn(); !passed) return passed;
  }
  indent(depth_);
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
      data(static_cast<const KvData&>(object).bytes());
      break;
    case KvType::Array:
      return array(static_cast<const KvArray&>(object));
    case KvType::Dictionary:
      return dictionary(static_cast<const KvDictionary&>(object));
  }
  return Done{};
}

Status XmlPlistWriter::passOn() {
  if (!sink_) return Done{};
  passedOn_ += out_.size();
  const bool taken = sink_(out_);
  out_.clear();
  return taken ? Status(Done{}) : Error{"the document was not taken whole"};
}

Result<std::string> XmlPlistWriter::finish() {
  out_ += kFooter;
  if (size() > maximumBytes_) return plistTooLarge(maximumBytes_);
  if (Status passed = passOn(); !passed) return passed.error();
  return std::move(out_);
}

void XmlPlistWriter::text(std::string_view tag, std::string_view content) {
  ((out_ += '<') += tag) += '>';
  appendText(out_, content);
  ((out_ += "</") += tag) += ">\n";
}

void XmlPlistWriter::number(const KvNumber& number) {
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

void XmlPlistWriter::data(std::span<const std::byte> bytes) {
  const std::size_t tabs = std::min(depth_, kDataMaximumTabs);
  const std::size_t bytesPerLine = (kDataColumns - kTabColumns * tabs) / 4 * 3;
  out_ += "<data>\n";
  for (; !bytes.empty(); bytes = bytes.subspan(std::min(bytes.size(), bytesPerLine))) {
    indent(tabs);
    appendBase64(out_, bytes.first(std::min(bytes.size(), bytesPerLine)));
    out_ += '\n';
  }
  indent(depth_);
  out_ += "</data>\n";
}

Status XmlPlistWriter::array(const KvArray& array) {
  if (depth_ == std::size_t{kMaximumDepth}) return tooDeep();
  if (array.empty()) return out_ += "<array/>\n", Done{};
  out_ += "<array>\n";
  ++depth_;
  for (const auto& item : array) {
    if (Status status = value(*item); !status) return status;
  }
  indent(--depth_);
  out_ += "</array>\n";
  return Done{};
}

Status XmlPlistWriter::dictionary(const KvDictionary& dictionary) {
  if (depth_ == std::size_t{kMaximumDepth}) return tooDeep();
  if (dictionary.empty()) return out_ += "<dict/>\n", Done{};
  out_ += "<dict>\n";
  ++depth_;
  for (const auto& [name, item] : dictionary) {
    key(name->view());
    if (Status status = value(*item); !status) return status;
  }
  endDictionary();
  return Done{};
}

Error plistTooLarge(std::size_t maximumBytes) {
  return Error{"the property list is larger than " + std::to_string(maximumBytes >> 20) + " MiB"};
}

Result<std::string> writeXmlPlist(const KvObject& root, std::size_t maximumBytes) {
  XmlPlistWriter writer(maximumBytes);
  if (Status status = writer.value(root); !status) return status.error();
  return writer.finish();
}

}  // namespace tally

#include "kv/json_writer.h"

#include <cmath>
#include <utility>

#include "base/hex.h"
#include "base/number_text.h"
#include "base/time_text.h"
#include "kv/base64.h"
#include "kv/nesting.h"

namespace tally {
namespace {

void appendString(std::string& out, std::string_view text) {
  out += '"';
  for (const char c : text) {
    const auto code = static_cast<unsigned char>(c);
    if (c == '"' || c == '\\') {
      out += '\\';
      out += c;
    } else if (code < 0x20 || code == 0x7F) {
      out += "\\u00";
      appendHex(out, code, 2);
    } else {
      out += c;
    }
  }
  out += '"';
}

void appendJsonNumber(std::string& out, const KvNumber& number) {
  if (number.isReal() && !std::isfinite(number.asDouble())) {
    out += '"';
    appendDouble(out, number.asDouble());
    out += '"';
  } else if (number.kind() == KvNumberKind::Float) {
    appendFloat(out, static_cast<float>(number.asDouble()));
  } else if (number.isReal()) {
    appendDouble(out, number.asDouble());
  } else if (number.isUnsigned()) {
    appendUInt64(out, number.asUInt64());
  } else {
    appendInt64(out, number.asInt64());
  }
}

void appendValue(std::string& out, const KvObject& value, int depth);

void appendArray(std::string& out, const KvArray& array, int depth) {
  out += '[';
  bool first = true;
  for (const auto& item : array) {
    if (!std::exchange(first, false)) out += ',';
    appendValue(out, *item, depth);
  }
  out += ']';
}

void appendDictionary(std::string& out, const KvDictionary& dictionary, int depth) {
  out += '{';
  bool first = true;
  for (const auto& [key, value] : dictionary) {
    if (!std::exchange(first, false)) out += ',';
    appendString(out, key->view());
    out += ':';
    appendValue(out, *value, depth);
  }
  out += '}';
}

void appendValue(std::string& out, const KvObject& value, int depth) {
  if (depth == kMaximumDepth) {
    out += "null";
    return;
  }
  switch (value.type()) {
    case KvType::String:
      return appendString(out, kvCast<KvString>(&value)->view());
    case KvType::Number:
      return appendJsonNumber(out, *kvCast<KvNumber>(&value));
    case KvType::Boolean:
      out += kvCast<KvBoolean>(&value)->value() ? "true" : "false";
      return;
    case KvType::Date:
      out += '"';
      appendTimestamp(out, kvCast<KvDate>(&value)->secondsSince1970());
      out += '"';
      return;
    case KvType::Data:
      out += '"';
      appendBase64(out, kvCast<KvData>(&value)->bytes());
      out += '"';
      return;
    case KvType::Array:
      return appendArray(out, *kvCast<KvArray>(&value), depth + 1);
    case KvType::Dictionary:
      return appendDictionary(out, *kvCast<KvDictionary>(&value), depth + 1);
  }
}

}  // namespace

void appendJson(std::string& out, const KvObject& value) { appendValue(out, value, 0); }

}  // namespace tally

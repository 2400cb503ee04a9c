// Text form and equality of values.
#include "kv/value.h"

#include <algorithm>
#include <cmath>

#include "base/hex.h"
#include "base/number_text.h"
#include "base/time_text.h"
#include "kv/nesting.h"

namespace tally {
namespace {

// A cycle that branches would otherwise be written out for ever.
constexpr std::size_t kMaximumText = 16u << 20;

void appendNumber(std::string& out, const KvNumber& number) {
  if (number.kind() == KvNumberKind::Float) {
    appendFloat(out, static_cast<float>(number.asDouble()));
  } else if (number.isReal()) {
    appendDouble(out, number.asDouble());
  } else if (number.isUnsigned()) {
    appendUInt64(out, number.asUInt64());
  } else {
    appendInt64(out, number.asInt64());
  }
}

void appendData(std::string& out, const KvData& data) {
  out += '<';
  for (const std::byte byte : data.bytes()) appendHex(out, std::to_integer<unsigned>(byte), 2);
  out += '>';
}

void appendText(std::string& out, const KvObject* value, int depth) {
  if (value == nullptr) {
    out += "(null)";
    return;
  }
  if (out.size() > kMaximumText) return;
  if (depth > kMaximumDepth) {
    out += "...";
    return;
  }
  const auto indent = [&](int levels) { out.append(static_cast<std::size_t>(levels) * 4, ' '); };
  switch (value->type()) {
    case KvType::String:
      out += static_cast<const KvString*>(value)->view();
      return;
    case KvType::Number:
      appendNumber(out, *static_cast<const KvNumber*>(value));
      return;
    case KvType::Boolean:
      out += static_cast<const KvBoolean*>(value)->value() ? '1' : '0';
      return;
    case KvType::Date:
      appendTimestamp(out, static_cast<const KvDate*>(value)->secondsSince1970());
      return;
    case KvType::Data:
      appendData(out, *static_cast<const KvData*>(value));
      return;
    case KvType::Array: {
      const auto& array = *static_cast<const KvArray*>(value);
      out += "(\n";
      for (std::size_t i = 0; i < array.size(); ++i) {
        indent(depth + 1);
        appendText(out, array.get(i), depth + 1);
        out += i + 1 < array.size() ? ",\n" : "\n";
      }
      indent(depth);
      out += ')';
      return;
    }
    case KvType::Dictionary:
      out += "{\n";
      for (const auto& entry : *static_cast<const KvDictionary*>(value)) {
        indent(depth + 1);
        out += entry.key->view();
        out += " = ";
        appendText(out, entry.value.get(), depth + 1);
        out += ";\n";
      }
      indent(depth);
      out += '}';
      return;
  }
}

enum class Numbers { ByValue, Identical };

// Not as doubles, which would round the integer.
bool equalIntegerAndReal(const KvNumber& integer, double real) {
  constexpr double kTwoTo63 = 9223372036854775808.0;
  if (std::trunc(real) != real) return false;
  if (integer.kind() == KvNumberKind::UInt64) {
    return real >= 0 && real < 2 * kTwoTo63 &&
           static_cast<std::uint64_t>(real) == integer.asUInt64();
  }
  return real >= -kTwoTo63 && real < kTwoTo63 &&
         static_cast<std::int64_t>(real) == integer.asInt64();
}

bool equalNumbers(const KvNumber& a, const KvNumber& b, Numbers numbers) {
  if (a.isReal() && b.isReal()) {
    const double x = a.asDouble(), y = b.asDouble();
    if (numbers == Numbers::ByValue) return x == y;
    return std::isnan(x) ? std::isnan(y) : x == y && std::signbit(x) == std::signbit(y);
  }
  if (a.isReal() || b.isReal()) {
    if (numbers == Numbers::Identical) return false;
    return a.isReal() ? equalIntegerAndReal(b, a.asDouble()) : equalIntegerAndReal(a, b.asDouble());
  }
  const bool aHuge = a.kind() == KvNumberKind::UInt64 && a.asInt64() < 0;
  const bool bHuge = b.kind() == KvNumberKind::UInt64 && b.asInt64() < 0;
  return aHuge == bHuge && a.asInt64() == b.asInt64();
}

bool equal(const KvObject* a, const KvObject* b, Numbers numbers, int depth) {
  if (a == b) return true;
  if (a == nullptr || b == nullptr || a->type() != b->type() || depth > kMaximumDepth) return false;
  switch (a->type()) {
    case KvType::String:
      return static_cast<const KvString*>(a)->view() == static_cast<const KvString*>(b)->view();
    case KvType::Number:
      return equalNumbers(*static_cast<const KvNumber*>(a), *static_cast<const KvNumber*>(b),
                          numbers);
    case KvType::Boolean:
      return false;  // each value exists once
    case KvType::Date:
      return static_cast<const KvDate*>(a)->secondsSince1970() ==
             static_cast<const KvDate*>(b)->secondsSince1970();
    case KvType::Data: {
      const auto x = static_cast<const KvData*>(a)->bytes();
      const auto y = static_cast<const KvData*>(b)->bytes();
      return std::equal(x.begin(), x.end(), y.begin(), y.end());
    }
    case KvType::Array: {
      const auto& x = *static_cast<const KvArray*>(a);
      const auto& y = *static_cast<const KvArray*>(b);
      if (x.size() != y.size()) return false;
      for (std::size_t i = 0; i < x.size(); ++i) {
        if (!equal(x.get(i), y.get(i), numbers, depth + 1)) return false;
      }
      return true;
    }
    case KvType::Dictionary: {
      const auto& x = *static_cast<const KvDictionary*>(a);
      const auto& y = *static_cast<const KvDictionary*>(b);
      if (x.size() != y.size()) return false;
      for (const auto& entry : x) {
        if (!equal(entry.value.get(), y.get(entry.key->view()), numbers, depth + 1)) return false;
      }
      return true;
    }
  }
  return false;
}

}  // namespace

bool kvEqual(const KvObject* a, const KvObject* b) { return equal(a, b, Numbers::ByValue, 0); }
bool kvIdentical(const KvObject* a, const KvObject* b) {
  return equal(a, b, Numbers::Identical, 0);
}

std::string kvText(const KvObject* value) {
  std::string out;
  appendText(out, value, 0);
  return out;
}

}  // namespace tally

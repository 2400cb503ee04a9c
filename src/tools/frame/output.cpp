#include "tools/frame/output.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <nlohmann/json.hpp>

#include "base/natural_order.h"
#include "base/number_text.h"
#include "base/printable.h"
#include "base/time_text.h"
#include "base/utf8.h"
#include "kv/base64.h"

namespace tally::tools {
namespace {

std::string_view sequenceOf(Ink ink) {
  switch (ink) {
    case Ink::Strong:
      return "\x1b[1m";
    case Ink::Faint:
      return "\x1b[2m";
    case Ink::Good:
      return "\x1b[32m";
    case Ink::Doubtful:
      return "\x1b[33m";
    case Ink::Bad:
      return "\x1b[1;31m";
    default:
      return "";
  }
}

// Digits in groups of three.
std::string grouped(std::string digits) {
  const std::size_t first = digits.find_first_of("0123456789");
  for (std::size_t i = digits.size(); i > first + 3;) digits.insert(i -= 3, 1, ',');
  return digits;
}

}  // namespace

std::string inked(const Terminal& terminal, Ink ink, std::string_view text) {
  const std::string_view begin = sequenceOf(ink);
  if (!terminal.escapes || begin.empty() || text.empty()) return std::string(text);
  return fmt::format("{}{}\x1b[0m", begin, text);
}

void printHeading(const ToolContext& context, std::string_view title) {
  print(context.out, "\n");
  printLine(context, title, Ink::Strong);
}

void printLine(const ToolContext& context, std::string_view text, Ink ink) {
  const std::string shown = printable(text);
  if (!context.output.interactive || displayWidth(shown) <= context.output.columns) {
    return print(context.out, inked(context.output, ink, shown) + "\n");
  }
  // Continuation lines are indented further.
  constexpr std::size_t kContinued = 2;
  const std::size_t first = std::min(shown.find_first_not_of(' '), context.output.columns / 2);
  const std::size_t hang = first + kContinued;
  std::size_t indent = first;
  for (const std::string& line :
       wrapped(std::string_view(shown).substr(first), context.output.columns - hang)) {
    print(context.out, std::string(indent, ' ') + inked(context.output, ink, line) + "\n");
    indent = hang;
  }
}

std::string bar(const Terminal& terminal, double share, std::size_t width) {
  constexpr std::size_t kSteps = 8;  // of a column
  static constexpr std::string_view kPart[kSteps] = {"", "▏", "▎", "▍", "▌", "▋", "▊", "▉"};
  if (!(share > 0)) return "";
  const double columns = std::min(share, 1.0) * static_cast<double>(width);
  if (!terminal.unicode) {
    return std::string(static_cast<std::size_t>(std::max(1.0, std::round(columns))), '#');
  }
  const auto steps = static_cast<std::size_t>(std::max(1.0, std::round(columns * kSteps)));
  std::string text;
  for (std::size_t i = 0; i < steps / kSteps; ++i) text += "█";
  return text.append(kPart[steps % kSteps]);
}

std::string integerText(std::int64_t value) { return grouped(std::to_string(value)); }

std::string realText(double value) {
  constexpr double kWhole = 999.95, kLargest = 1e16;  // from here four digits leave no fraction
  if (!std::isfinite(value) || std::fabs(value) >= kLargest) {
    std::string text;
    appendDouble(text, value);
    return text;
  }
  if (std::trunc(value) == value || std::fabs(value) >= kWhole) {
    return grouped(fmt::format("{:.0f}", value + 0.0));
  }
  return fmt::format("{:.4g}", value);
}

std::string byteText(std::uint64_t bytes) {
  constexpr double kStep = 1024;
  if (bytes < 1024) return counted(bytes, "byte");
  auto value = static_cast<double>(bytes);
  std::string_view unit;
  for (const std::string_view next : {"KiB", "MiB", "GiB", "TiB"}) {
    if (value < kStep) break;
    value /= kStep;
    unit = next;
  }
  return fmt::format("{:.1f} {}", value, unit);
}

std::string counted(std::uint64_t count, std::string_view noun) {
  const bool endsInY = noun.ends_with("ry");  // entry, registry; not day, key
  const std::string_view stem = endsInY ? noun.substr(0, noun.size() - 1) : noun;
  const std::string_view ending = endsInY ? "ies" : "s";
  return fmt::format("{} {}{}", grouped(std::to_string(count)), count == 1 ? noun : stem,
                     count == 1 ? "" : ending);
}

std::vector<const KvDictionary::Entry*> entriesByName(const KvDictionary& dictionary) {
  std::vector<const KvDictionary::Entry*> entries;
  for (const auto& entry : dictionary) entries.push_back(&entry);
  std::ranges::sort(entries, naturalLess, [](const auto* entry) { return entry->key->view(); });
  return entries;
}

std::string_view typeName(KvType type) {
  switch (type) {
    case KvType::String:
      return "string";
    case KvType::Number:
      return "number";
    case KvType::Boolean:
      return "boolean";
    case KvType::Date:
      return "date";
    case KvType::Data:
      return "data";
    case KvType::Array:
      return "array";
    default:
      return "dictionary";
  }
}

std::string dayName(std::int32_t day) { return fmt::format("day {} ({})", day, dayText(day)); }

Json jsonOfReal(double value) {
  if (std::isfinite(value)) return value;
  std::string text;
  appendDouble(text, value);
  return text;
}

Json jsonOf(const KvObject* value) {
  if (value == nullptr) return nullptr;
  if (const auto* text = kvCast<KvString>(value)) return std::string(text->view());
  if (const auto* boolean = kvCast<KvBoolean>(value)) return boolean->value();
  if (const auto* number = kvCast<KvNumber>(value)) {
    if (number->isReal()) return jsonOfReal(number->asDouble());
    return number->isUnsigned() ? Json(number->asUInt64()) : Json(number->asInt64());
  }
  if (const auto* date = kvCast<KvDate>(value)) {
    std::string text;
    appendTimestamp(text, date->secondsSince1970());
    return text;
  }
  if (const auto* data = kvCast<KvData>(value)) {
    std::string text;
    appendBase64(text, data->bytes());
    return text;
  }
  if (const auto* array = kvCast<KvArray>(value)) {
    Json items = Json::array();
    for (const auto& item : *array) items.push_back(jsonOf(item.get()));
    return items;
  }
  Json object = Json::object();
  for (const auto& entry : static_cast<const KvDictionary&>(*value)) {
    addMember(object, std::string(entry.key->view()), jsonOf(entry.value.get()));
  }
  return object;
}

void addMember(Json& object, std::string name, Json value) {
  object.get_ref<Json::object_t&>().Container::emplace_back(std::move(name), std::move(value));
}

void printJson(const ToolContext& context, const Json& document) {
  print(context.out,
        printableJson(document.dump(2, ' ', false, Json::error_handler_t::replace)) + "\n");
}

std::string printableJson(std::string text) {
  std::string out;
  std::size_t copied = 0;
  for (std::size_t i = 0; i < text.size();) {
    const std::size_t begin = i;
    const std::uint32_t character = takeCharacter(text, i);
    // Characters outside ASCII occur only inside strings, where an escape is valid.
    if (character != 0x7F && (character < 0x80 || !isControl(character))) continue;
    out.append(text, copied, begin - copied).append(fmt::format("\\u{:04x}", character));
    copied = i;
  }
  if (copied == 0) return text;
  return out.append(text, copied);
}

std::string jsonText(std::string_view text) {
  return printableJson(Json(text).dump(-1, ' ', false, Json::error_handler_t::replace));
}

int complain(const ToolContext& context, std::string_view message, ExitStatus status) {
  if (context.json && context.complaints != nullptr) {
    context.complaints->emplace_back(message);
  } else {
    print(context.err, fmt::format("tallyctl: {}\n", printable(message)));
  }
  return status;
}

}  // namespace tally::tools

#include "storage/lists/telemetry_list.h"

#include <algorithm>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "base/byte_reader.h"
#include "base/hex.h"
#include "base/number_text.h"
#include "platform/platform.h"
#include "storage/vendor_counters.h"

namespace tally {
namespace {

constexpr std::size_t kBlockBytes = 4096;    // of a bus, all blocks first
constexpr std::size_t kSummaryBytes = 32;    // of a bus, after the blocks
constexpr std::size_t kChipIdCapacity = 64;  // with its terminator
constexpr std::size_t kVendorDigits = 4;     // what follows them is the part code
constexpr std::size_t kMostHexDigits = 8;

// The structured-data record type of storage lists.
constexpr std::uint32_t kStorageRecordType = 176;

enum Generation : std::uint8_t { kGeneration0, kGeneration1, kGeneration2, kGenerations };

// The first signed words of a bus's summary, by name.
constexpr std::string_view kSummaryNames[] = {"RD",  "PE",         "Max_PE_rate", "t0",
                                              "Ret", "block_type", "num_pages"};

// An array of the record: its first word, and how many elements each generation reports.
struct TelemetryField {
  std::string_view name;
  std::size_t firstWord;
  std::array<std::size_t, kGenerations> elements;
};
constexpr TelemetryField kTelemetryFields[] = {
    {"readStage", 0, {23, 23, 33}},
    {"initialReadStage", 33, {23, 23, 23}},
    {"nandStageOfLife", 56, {8, 8, 8}},
    {"dspExceptionParameter", 65, {12, 12, 38}},
    {"readStage18NumOfErrorsBin", 103, {12, 12, 12}},
    {"readStage9NumOfErrorsBin", 115, {10, 10, 10}},
    {"readStage10NumOfErrorsBin", 125, {10, 10, 10}},
    {"readStage17NumOfErrorsBin", 135, {10, 10, 10}},
    {"readStage19NumOfErrorsBin", 145, {12, 12, 12}},
    {"retentionIndication", 165, {0, 0, 12}},
    {"algoNANDAccessesBin", 157, {8, 0, 8}},
};

using LayoutParser = void (*)(BusBlock, NandAlgoCounters&);

// The oldest generation lays its counters out by the flash parts it is built with. An element that
// is named here is matched on the vendor's code and on the part's upper 24 bits.
struct PartLayout {
  std::uint32_t vendor, part;
  LayoutParser parser;
};
constexpr PartLayout kPartLayouts[] = {
    {0xAD82, 0x522321, parseCounters1xHynix},
    {0x4582, 0x60DE57, parseCounters1xSandisk},
    {0x4582, 0x603A57, parseCounters1xSandisk},
};

struct Characteristics {
  Generation generation = kGeneration0;
  LayoutParser parser = nullptr;
  std::size_t buses = 0;
};

unsigned digitValue(char digit, std::FILE* notices) {
  if (const auto value = hexDigitValue(digit)) return *value;
  std::fprintf(notices, "unrecognized hex character: %c", digit);
  return 0;
}

unsigned hexByte(std::string_view digits, std::FILE* notices) {
  unsigned value = 0;
  for (const char digit : digits.substr(0, 2)) value = value << 4 | digitValue(digit, notices);
  return value;
}

std::uint32_t hexNumber(std::string_view text, std::FILE* notices) {
  const std::string_view digits = text.substr(0, kMostHexDigits);
  std::uint32_t value = 0;
  for (std::size_t i = 0; i < digits.size(); i += 2) {
    value = value << 8 | hexByte(digits.substr(i, 2), notices);
  }
  return value;
}

// The string; empty after a line that says what is wrong with it.
std::optional<std::string_view> stringOf(const KvDictionary& dictionary, const char* key) {
  const KvObject* const value = dictionary.get(key);
  const auto* const text = kvCast<KvString>(value);
  if (value == nullptr) {
    std::fprintf(stderr, "ERROR: Could not determine the %s\n", key);
  } else if (text == nullptr) {
    std::fprintf(stderr, "ERROR: %s is not stored as a KvStringTypeID\n", key);
  } else {
    return text->view();
  }
  return std::nullopt;
}

std::optional<Generation> generationOf(const KvDictionary& dictionary) {
  const auto chip = stringOf(dictionary, "chip-id");
  if (!chip) return std::nullopt;
  if (chip->size() >= kChipIdCapacity) {
    std::fprintf(stderr,
                 "ERROR: Unable to obtain %s as conversion from the UniChar contents of KvString "
                 "failed, or the buffer of %d bytes is too small\n",
                 "chip-id", static_cast<int>(kChipIdCapacity));
    return std::nullopt;
  }
  const std::string_view name = chip->substr(0, chip->find('\0'));
  return name == "Q7M" ? kGeneration1 : name == "Q9M" ? kGeneration2 : kGeneration0;
}

LayoutParser parserOf(Generation generation, std::string_view manufacturer, std::FILE* notices) {
  const std::string_view partText =
      manufacturer.substr(std::min(kVendorDigits, manufacturer.size()));
  const std::uint32_t vendor = hexNumber(manufacturer.substr(0, kVendorDigits), notices);
  const std::uint32_t part = hexNumber(partText, notices) >> 8;
  if (generation == kGeneration1) return parseCountersAlgoGeneric;
  if (generation == kGeneration2) return parseCountersAlgoGenericQ9;
  for (const PartLayout& layout : kPartLayouts) {
    if (layout.vendor == vendor && layout.part == part) return layout.parser;
  }
  return parseCounters1y;
}

std::optional<Characteristics> characteristicsOf(const KvObject* object, std::size_t listBytes,
                                                 std::FILE* notices) {
  const auto* const dictionary = kvCast<KvDictionary>(object);
  if (dictionary == nullptr) {
    std::fputs("ERROR: Could not parse the Device Characteristics dictionary\n", stderr);
    return std::nullopt;
  }
  const auto generation = generationOf(*dictionary);
  if (!generation) return std::nullopt;
  const auto manufacturer = stringOf(*dictionary, "manufacturer-id");
  if (!manufacturer) return std::nullopt;
  const LayoutParser parser = parserOf(*generation, *manufacturer, notices);
  const auto* const buses = dictionary->getAs<KvNumber>("num-bus");
  if (buses == nullptr) {
    std::fputs("ERROR: could not determine the number of channels\n", stderr);
    return std::nullopt;
  }
  const std::int64_t count = buses->asInt32();
  if (count < 0 || static_cast<std::size_t>(count) > listBytes / (kBlockBytes + kSummaryBytes)) {
    std::fputs("ERROR: Attempting to parse beyond the bounds of the buffer\n", stderr);
    return std::nullopt;
  }
  return Characteristics{*generation, parser, static_cast<std::size_t>(count)};
}

// The source of a reported element; the names are made once for all buses.
struct Element {
  KvRef<KvString> name;
  std::size_t word;
};
std::vector<Element> elementsOf(Generation generation) {
  std::vector<Element> elements;
  for (const TelemetryField& field : kTelemetryFields) {
    for (std::size_t i = 0; i < field.elements[generation]; ++i) {
      std::string name(field.name);
      name += '[';
      appendUInt64(name, i);
      name += ']';
      elements.push_back({KvString::create(name), field.firstWord + i});
    }
  }
  return elements;
}

}  // namespace

bool readTelemetryList(std::span<const std::byte> list, const KvObject* characteristics,
                       std::FILE* notices, const RecordSink& sink) {
  const auto known = characteristicsOf(characteristics, list.size(), notices);
  if (!known) return false;
  const std::vector<Element> elements = elementsOf(known->generation);
  const auto summaries = list.subspan(known->buses * kBlockBytes);
  for (std::size_t bus = 0; bus < known->buses; ++bus) {
    NandAlgoCounters counters{};
    known->parser(list.subspan(bus * kBlockBytes, kBlockBytes), counters);
    const auto record = KvDictionary::create(std::size(kSummaryNames) + elements.size());
    const ByteReader summary(summaries.subspan(bus * kSummaryBytes, kSummaryBytes));
    for (std::size_t i = 0; i < std::size(kSummaryNames); ++i) {
      record->set(
          kSummaryNames[i],
          KvNumber::int32(summary.read<std::int32_t>(i * sizeof(std::int32_t)).value_or(0)));
    }
    for (const Element& element : elements) {
      record->set(element.name, KvNumber::int32(static_cast<std::int32_t>(counters[element.word])));
    }
    sink(*record);
  }
  return true;
}

void logStorageRecord(const KvDictionary& record) {
  platform().crashReporting->FDLogStructuredData(kStorageRecordType, record);
}

KvRef<KvBoolean> parseTelemetryList(const void* buffer, std::size_t length,
                                    const KvObject* characteristics) {
  const std::span list(static_cast<const std::byte*>(buffer), length);
  return KvBoolean::of(readTelemetryList(list, characteristics, stdout, logStorageRecord));
}

std::uint8_t hexStringToByte(std::string_view text, std::size_t length) {
  return static_cast<std::uint8_t>(hexByte(text.substr(0, length), stdout));
}

std::uint32_t hexStringToInt32(std::string_view text, std::size_t length) {
  return hexNumber(text.substr(0, length), stdout);
}

}  // namespace tally

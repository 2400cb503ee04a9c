// Property values out of a fuzz input: from a property list when the input is one, else from a
// short form in which nearly every byte string is a value, so that mutations get past
// the codec. fuzz/make-corpus writes the same form.
#pragma once

#include <string>
#include <string_view>

#include "fuzz.h"
#include "host/described/described_entries.h"
#include "kv/plist_codec.h"
#include "kv/value.h"

namespace tally::fuzz {

// The keys and texts that mean something somewhere, with bars between them; the entries of the
// device description come after them. Only append: seeds name them by their place.
constexpr std::string_view kKnownTexts =
    "Entries|Class|Name|ID|Parents|Properties|Hub|UserClient|Methods|Method|Selector|Flags|Data|"
    "SizeStatus|DataStatus|AnnouncedSize|OpenStatus|CloseStatus|StartStatus|ConfigureStatus|"
    "MapStatus|UpdateStatus|RawFrames|HwReportHub|HwReportLegendPublic|HwReportLegend|"
    "HwReportChannels|HwReportGroupName|HwReportSubGroupName|HwReportChannelInfo|"
    "HwReportChannelUnit|HwReportChannelConfig|HwReportValues|Channel|Type|Value|Frames|Time|"
    "InTransitions|Residency|Hits|Minimum|Maximum|Sum|SPXStorage|HwReportDrivers|"
    "HwReportChannelGroups|QueryOpts|DriverID|DriverName|LegendChannel|RawElements|ChannelName|"
    "UnitLabel|StateNames|ProcessedChannelConfig|ScalarKeys|DistributionKeys|ScalarKeyPrefixes|"
    "DistributionKeyPrefixes|sig_fig|bucket_interval|intervals|InternalTesting|DeviceAnswers|"
    "KernelValues|PurgeableSpace|DiskUsage|Applications|CaptureStatus|FlagsStatus|File|Error|"
    "Timebase|Numerator|Denominator|MonotonicTicks|HardwareModel|SystemID|InternalBuild|"
    "InverseDeviceID|AnalyticsEvents|Wanted|Stackshot|PreferredLanguages|SystemLanguages|"
    "RegionCode|OSVersion|SystemVersion|HasInternalDiagnostics|chip-id|manufacturer-id|num-bus|"
    "nand-device-desc|HwProviderClass|HwNameMatch|HwEntryIDMatch|HwPropertyMatch|Driver|vellum.|"
    "operation|app_data|bundle_id|version|adam_id|arch|uuid|TaskingID|TaskingDigest|"
    "TaskingPayload|User|Domain|Key|mobile|__sysmetra__|TBCrashLogVersion|TBStartDate|"
    "TBLogCreationDate|TBMetadata|TBScalars|TBDistributions|TBDistributionsHistogram|"
    "TBActivatedAppInfo|(-inf, 10]|(10, 20]|(20, inf)|bundle|adamID|inf|-inf|nan";

// The known text of that number, of any number.
inline std::string_view knownText(std::size_t number) {
  static const auto* const texts = [] {
    auto* const made = new std::vector<std::string_view>();
    for (std::size_t begin = 0; begin <= kKnownTexts.size();) {
      const std::size_t end = std::min(kKnownTexts.find('|', begin), kKnownTexts.size());
      made->push_back(kKnownTexts.substr(begin, end - begin));
      begin = end + 1;
    }
    for (const DescribedEntry& entry : kDescribedEntries) {
      made->push_back(entry.name);
      for (const DescribedMember& member : entry.members) made->push_back(member.name);
    }
    return made;
  }();
  return (*texts)[number % texts->size()];
}

class ValueReader {
 public:
  explicit ValueReader(Input& input) : input_(input) {}

  // Never null.
  KvRef<KvObject> take(int depth = 0) {
    // Deeper than the bound of every reader but the codec.
    constexpr int kDeepest = 48;
    switch (const auto kind = input_.take<std::uint8_t>() % 16; kind) {
      case 0:
        return KvString::create(knownText(input_.take<std::uint8_t>()));
      case 1:
        return KvString::create(input_.takeText(input_.take<std::uint8_t>()));
      case 2:
        return KvNumber::int64(input_.take<std::int8_t>());
      case 3:
        return KvNumber::int64(input_.take<std::int64_t>());
      case 4:
        return KvNumber::uint64(input_.take<std::uint64_t>());
      case 5:
        return KvNumber::float64(input_.take<double>());
      case 6:
      case 7:
        return KvBoolean::of(kind == 7);
      case 8:
        return KvData::create(input_.takeCopy(input_.take<std::uint16_t>()));
      case 9:
        return depth < kDeepest ? takeArray(depth) : KvArray::create();
      case 10:
        return depth < kDeepest ? takeDictionary(depth) : KvDictionary::create();
      case 11:
        return KvDate::create(input_.take<double>());
      case 12:
        return KvNumber::int32(input_.take<std::int32_t>());
      case 13:
        return KvNumber::uint32(input_.take<std::uint32_t>());
      case 14:
        return KvNumber::float32(input_.take<float>());
      default:
        return takeLongText();
    }
  }

  KvRef<KvDictionary> takeDictionary(int depth = 0) {
    auto dictionary = KvDictionary::create();
    for (int left = input_.take<std::uint8_t>(); left > 0 && !input_.empty(); --left) {
      const auto key = takeKey();
      dictionary->set(key, take(depth + 1));
    }
    return dictionary;
  }

 private:
  std::string takeKey() {
    constexpr std::uint8_t kFirstLength = 0xC0;
    const auto first = input_.take<std::uint8_t>();
    if (first < kFirstLength) return std::string(knownText(first));
    return std::string(input_.takeText(first - kFirstLength));
  }
  KvRef<KvObject> takeArray(int depth) {
    auto array = KvArray::create();
    for (int left = input_.take<std::uint8_t>(); left > 0 && !input_.empty(); --left) {
      array->append(take(depth + 1));
    }
    return array;
  }
  KvRef<KvObject> takeLongText() {
    const auto letter = input_.take<char>();
    const std::size_t length =
        std::min(input_.take<std::uint8_t>() * std::size_t{8}, longLettersLeft_);
    longLettersLeft_ -= length;
    return KvString::create(std::string(length, letter));
  }

  Input& input_;
  std::size_t longLettersLeft_ = 4096;  // otherwise every three bytes could ask for long texts
};

inline bool isDocument(std::string_view bytes) {
  return bytes.starts_with('<') || bytes.starts_with("bplist");
}

// A whole input as a value; null for a property list that cannot be read.
inline KvRef<KvObject> valueOf(Input& input) {
  if (!isDocument(input.rest())) return ValueReader(input).takeDictionary();
  auto decoded = decodePlist(input.takeText(input.rest().size()));
  return decoded ? *std::move(decoded) : nullptr;
}

}  // namespace tally::fuzz

// Small worlds of drivers, channels and raw elements for the tests of this folder.
#pragma once

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "fakes/fake_registry.h"
#include "hwreport/hwreport.h"
#include "platform/platform.h"

namespace tally::tests {

constexpr std::uint64_t kInvalid = kHwReportInvalidValue;

inline std::uint64_t typeWord(std::uint64_t format, std::uint64_t elements,
                              std::uint64_t categories = 0) {
  return format | categories << 16 | elements << 32;
}

inline KvRef<KvNumber> number(std::uint64_t value) { return KvNumber::uint64(value); }
inline KvRef<KvString> text(std::string_view value) { return KvString::create(value); }
using Fields = std::initializer_list<std::pair<std::string_view, KvRef<KvObject>>>;

// A channel dictionary with a group and subgroup where they are given.
inline KvRef<KvDictionary> channel(std::uint64_t id, std::uint64_t type, const char* name = nullptr,
                                   const char* group = nullptr, const char* subgroup = nullptr,
                                   std::uint64_t driver = 0x10) {
  auto legend = KvArray::create({number(id), number(type)});
  if (name != nullptr) legend->append(text(name));
  auto made = KvDictionary::create({{"DriverID", number(driver)},
                                    {"DriverName", text("D <id 0x10>")},
                                    {"LegendChannel", legend}});
  if (group != nullptr) made->set("HwReportGroupName", text(group));
  if (subgroup != nullptr) made->set("HwReportSubGroupName", text(subgroup));
  return made;
}

inline KvRef<KvDictionary> flat(std::initializer_list<KvRef<KvObject>> channels) {
  return KvDictionary::create({{"HwReportChannels", KvArray::create(channels)}});
}

inline KvDictionary* channelAt(const KvRef<KvDictionary>& flatCollection, std::size_t index) {
  return flatCollection->getAs<KvArray>("HwReportChannels")->getAs<KvDictionary>(index);
}

struct Element {
  std::vector<std::uint64_t> slots;
  std::uint64_t time = 0;
};

// The bytes of a run; the count in its type word may lie.
inline std::vector<std::byte> run(std::uint64_t channelID, std::uint64_t type,
                                  const std::vector<Element>& elements,
                                  std::uint64_t driver = 0x10) {
  std::vector<std::byte> bytes;
  for (const Element& element : elements) {
    std::vector<std::uint64_t> words = {driver, channelID, type, element.time};
    words.insert(words.end(), element.slots.begin(), element.slots.end());
    words.resize(8);
    const auto raw = std::as_bytes(std::span(words));
    bytes.insert(bytes.end(), raw.begin(), raw.end());
  }
  return bytes;
}

inline std::vector<std::byte> operator+(std::vector<std::byte> a, const std::vector<std::byte>& b) {
  a.insert(a.end(), b.begin(), b.end());
  return a;
}

// A channel that was sampled; its legend says as many elements as there are, unless told otherwise.
inline KvRef<KvDictionary> sampled(std::uint64_t format, const std::vector<Element>& elements,
                                   int legendCount = -1, std::uint64_t id = 0x41) {
  const auto count = legendCount < 0 ? elements.size() : static_cast<std::size_t>(legendCount);
  auto made = channel(id, typeWord(format, count));
  made->set("RawElements", KvData::create(run(id, typeWord(format, elements.size()), elements)));
  return made;
}

inline std::uint64_t slotOf(const KvDictionary& channel, std::size_t element, std::size_t slot) {
  const auto* data = channel.getAs<KvData>("RawElements");
  const std::size_t offset = element * 64 + 32 + slot * 8;
  std::uint64_t value = 0;
  if (data == nullptr || data->bytes().size() < offset + 8) return 0xDEAD;
  std::memcpy(&value, data->bytes().data() + offset, 8);
  return value;
}

// The names of a collection's channels in walk order, "-" for none.
inline std::string namesOf(KvDictionary* collection) {
  std::string names;
  HwReportIterate(collection, [&](KvDictionary* one) {
    const KvString* const name = HwReportChannelGetChannelName(one);
    names += (names.empty() ? "" : " ") + std::string(name != nullptr ? name->view() : "-");
    return HwIterContinue;
  });
  return names;
}

// "CODE REASON", or nothing.
inline std::string errorText(const KvRef<HwReportError>& error) {
  if (!error) return "";
  char code[16];
  std::snprintf(code, sizeof(code), "%08X ", error->code());
  return code + std::string(error->failureReason());
}
constexpr const char* kNotAdded = "E00002BC _addChannel() failed";
constexpr const char* kNoReason = "createKvErr() passed a NULL string!";

// A platform with a registry and nothing else.
class RegistryTest : public testing::Test {
 protected:
  ~RegistryTest() override { EXPECT_EQ(registry_->openHandles(), 0); }
  fakes::FakeRegistry& registry() { return *registry_; }
  // A driver that publishes a legend of these groups.
  void addDriver(const char* name, std::uint64_t id, KvRef<KvObject> legend) {
    registry_->entries.push_back(
        {"Driver", name, id,
         KvDictionary::create(
             {{"HwReportLegendPublic", KvBoolean::of(true)}, {"HwReportLegend", legend}})});
  }

 private:
  static Platform platformOf(std::shared_ptr<fakes::FakeRegistry> registry) {
    Platform services;
    services.deviceRegistry = std::move(registry);
    return services;
  }
  std::shared_ptr<fakes::FakeRegistry> registry_ = std::make_shared<fakes::FakeRegistry>();
  PlatformScope scope_{platformOf(registry_)};
};

}  // namespace tally::tests

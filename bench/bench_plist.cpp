// The property-list codec beside the library on the same documents. Each measurement is a process
// of its own ("bench_plist NAME"), so that its peak of memory is its own.
#include <plist/plist.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <string_view>
#include <tuple>

#include "figures.h"
#include "kv/plist_codec.h"
#include "process_cost.h"

namespace {

using namespace tally;

constexpr int kEntries = 100'000;

KvRef<KvDictionary> dailyScalars() {
  auto scalars = KvDictionary::create(kEntries);
  for (int i = 0; i < kEntries; ++i) {
    scalars->set("com.example.subsystem.counter." + std::to_string(i),
                 KvNumber::int64(std::int64_t{i} * 12345));
  }
  return scalars;
}

KvRef<KvDictionary> whitelist() {
  auto keys = KvDictionary::create(kEntries);
  for (int i = 0; i < kEntries; ++i) {
    keys->set("com.example.subsystem.counter." + std::to_string(i),
              KvDictionary::create(
                  {{"sig_fig", KvNumber::int64(2)}, {"type", KvString::create("scalar")}}));
  }
  return keys;
}

void encode() {
  if (!encodeXmlPlist(*dailyScalars())) std::abort();
}

void encodeWithLibrary() {
  const auto scalars = dailyScalars();
  plist_t root = plist_new_dict();
  for (const auto& [key, value] : *scalars) {
    const std::string name(key->view());
    const auto number = static_cast<const KvNumber*>(value.get())->asUInt64();
    plist_dict_set_item(root, name.c_str(), plist_new_uint(number));
  }
  char* text = nullptr;
  std::uint32_t length = 0;
  plist_to_xml(root, &text, &length);
  plist_free(root);
  std::free(text);
}

void decode() {
  if (!decodePlist(*encodeXmlPlist(*whitelist()))) std::abort();
}

void decodeWithLibrary() {
  const std::string document = *encodeXmlPlist(*whitelist());
  plist_t root = nullptr;
  plist_from_xml(document.data(), static_cast<std::uint32_t>(document.size()), &root);
  plist_free(root);
}

struct Measurement {
  const char* name;
  const char* label;
  const char* without;  // the measurement that prepares the same and does not do it
  void (*run)();
};

const Measurement kMeasurements[] = {
    {"scalars", "", nullptr, [] { dailyScalars(); }},
    {"encode", "encode 100,000 integers", "scalars", encode},
    {"encode-library", "the same, library", "scalars", encodeWithLibrary},
    {"document", "", nullptr, [] { std::ignore = encodeXmlPlist(*whitelist()); }},
    {"decode", "decode a whitelist of 100,000", "document", decode},
    {"decode-library", "the same, library (no values)", "document", decodeWithLibrary},
};

}  // namespace

int main(int count, char** arguments) {
  if (count == 2) {
    for (const Measurement& m : kMeasurements) {
      if (m.name == std::string_view(arguments[1])) return m.run(), 0;
    }
    return 2;
  }
  const std::string self = std::filesystem::canonical(arguments[0]);
  struct {
    const char* label;
    double milliseconds;
  } ours{};
  for (const Measurement& m : kMeasurements) {
    if (m.without == nullptr) continue;
    const auto cost = bench::medianRun(9, {self, m.name});
    const auto base = bench::medianRun(9, {self, m.without});
    if (cost.exitStatus != 0 || base.exitStatus != 0) return 1;
    const double milliseconds = (cost.cpuSeconds - base.cpuSeconds) * 1e3;
    std::printf("%-32s %7.1f ms CPU  peak %6.1f MiB\n", m.label, milliseconds,
                static_cast<double>(cost.peakKibibytes) / 1024);
    if (std::string_view(m.name).ends_with("-library")) {  // of what the row before measured
      bench::addFigure(ours.label, ours.milliseconds, "ms CPU", "the property-list library",
                       milliseconds, bench::noTarget());
    }
    ours = {m.label, milliseconds};
  }
  return 0;
}

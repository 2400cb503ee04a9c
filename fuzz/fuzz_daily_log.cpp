// A day of any samples through a whitelist of any options: the daily log that is submitted.
#include <string>

#include "config/whitelist_file.h"
#include "fakes/fake_platform.h"
#include "fuzz_values.h"
#include "report/daily_report.h"

using namespace tally;
using fuzz::require;

namespace {

constexpr std::int32_t kDay = 19999;

// Rows whose keys are those that the whitelist may name: the known texts.
void takeRows(fuzz::Input& input, fakes::FakeMetricsStore& store) {
  for (int left = input.take<std::uint8_t>() % 32; left > 0 && !input.empty(); --left) {
    const auto place = input.take<std::uint8_t>();
    const std::string_view key = fuzz::knownText(place);
    if (input.takeFlag()) {
      store.putScalar(kDay, key, input.take<std::int64_t>());
      continue;
    }
    std::vector<double> samples;
    for (int count = input.take<std::uint8_t>() % 16; count > 0; --count) {
      samples.push_back(input.take<double>());
    }
    store.putDistribution(kDay, key, samples);
  }
}

// Options of keys, as one group of a whitelist.
KvRef<KvDictionary> takeWhitelist(fuzz::Input& input) {
  auto group = KvDictionary::create();
  for (const std::string_view section : sectionNames()) {
    group->set(section, fuzz::ValueReader(input).takeDictionary());
  }
  return KvDictionary::create({{"Group", std::move(group)}});
}

void checkLog(std::string_view body, const KvDictionary& whitelist) {
  const auto decoded = decodePlist(body);
  const auto* const log = decoded ? kvCast<KvDictionary>(decoded->get()) : nullptr;
  require(log != nullptr, "a log is a property list");
  const auto* const group = whitelist.getAs<KvDictionary>("Group");
  const auto* const keys = group->getAs<KvDictionary>("ScalarKeys");
  const auto* const prefixes = group->getAs<KvDictionary>("ScalarKeyPrefixes");
  const auto* const scalars = log->getAs<KvDictionary>("TBScalars");
  require(scalars != nullptr, "a log has scalars");
  for (const auto& scalar : *scalars) {
    const std::string_view key = scalar.key->view();
    const bool isNamed = keys->contains(key) ||
                         std::any_of(prefixes->begin(), prefixes->end(), [&](const auto& prefix) {
                           return key.starts_with(prefix.key->view());
                         });
    require(isNamed, "nothing is in a log that the whitelist does not name");
  }
}

}  // namespace

FUZZ_TARGET(daily_log)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const fakes::FakePlatform fake = fakes::makeFakePlatform();
  const auto scope = fake.install();
  takeRows(input, *fake.metricsStore);
  const auto whitelist = takeWhitelist(input);
  const auto written = encodeXmlPlist(*whitelist);
  if (!written) return 0;
  // Keys as a reader of the file sees them.
  const auto read = decodePlist(*written);
  fake.files->contents[std::string(kWhitelistPath)] = *written;
  writeDailyLog(platform(), kDay, nullptr);
  for (const auto& log : fake.logSubmission->logs) {
    checkLog(log.body, *kvCast<KvDictionary>(read->get()));
  }
  return 0;
}

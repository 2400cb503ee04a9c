#include "data/sample_device.h"

#include <sqlite3.h>

#include <chrono>
#include <cmath>
#include <cstdio>
#include <vector>

#include "base/files/device_root.h"
#include "base/files/temporary_file.h"
#include "data/raw_store.h"
#include "host/store/store_importer.h"
#include "kv/plist_codec.h"
#include "tools/store/store_csv.h"

namespace tally::bench {
namespace {

constexpr std::string_view kWhitelistFolder = "/Library/Application Support/Tallybook";
constexpr std::string_view kWhitelistName = "Whitelist_Nimbus.plist";

std::uint64_t scrambled(std::uint64_t value) {
  value = (value ^ (value >> 31)) * 0x9E3779B97F4A7C15;
  value = (value ^ (value >> 29)) * 0xBF58476D1CE4E5B9;
  return value ^ (value >> 32);
}

KvRef<KvDictionary> scalarOptions(std::size_t index) {
  switch (index % 4) {
    case 0:
      return KvDictionary::create({{"sig_fig", KvNumber::int64(2)}});
    case 1:
      return KvDictionary::create({{"bucket_interval", KvNumber::int64(10)}});
    case 2:
      return KvDictionary::create(
          {{"bucket_interval", KvNumber::int64(5)}, {"sig_fig", KvNumber::int64(3)}});
    default:
      return KvDictionary::create();
  }
}

bool writeWhitelist(const std::string& device, const SampleDay& day) {
  auto scalars = KvDictionary::create(day.scalars);
  for (std::size_t i = 0; i < day.scalars; ++i) {
    scalars->set(SampleDay::scalarKey(i), scalarOptions(i));
  }
  auto distributions = KvDictionary::create(day.distributions);
  for (std::size_t i = 0; i < day.distributions; ++i) {
    distributions->set(SampleDay::distributionKey(i), SampleDay::distributionOptions(i));
  }
  const auto root = KvDictionary::create(
      {{"Bench",
        KvDictionary::create({{"ScalarKeys", scalars}, {"DistributionKeys", distributions}})}});
  const auto document = encodeXmlPlist(*root);
  const auto folder = DeviceRoot(device).make(kWhitelistFolder);
  return document && folder && writeFileAtomically(*folder, kWhitelistName, *document);
}

bool importDay(const StoreFile& path, const SampleDay& day) {
  StoreImporter importer(path);
  for (std::size_t i = 0; i < day.scalars; ++i) {
    if (!importer.addScalar(day.day, SampleDay::scalarKey(i), SampleDay::scalar(i))) return false;
  }
  for (std::size_t i = 0; i < day.distributions; ++i) {
    const std::string key = SampleDay::distributionKey(i);
    for (std::size_t j = 0; j < day.samplesEach; ++j) {
      if (!importer.addSample(day.day, key, day.offset(j), SampleDay::sample(i, j))) return false;
    }
  }
  return static_cast<bool>(importer.finish());
}

}  // namespace

std::string SampleDay::scalarKey(std::size_t index) {
  return "vellum.bench.component" + std::to_string(index % 97) + ".counter" + std::to_string(index);
}

std::string SampleDay::distributionKey(std::size_t index) {
  return "vellum.bench.latency." + std::to_string(index);
}

std::int64_t SampleDay::scalar(std::size_t index) {
  const std::uint64_t bits = scrambled(index);
  return static_cast<std::int64_t>(bits >> (30 + bits % 30));
}

double SampleDay::sample(std::size_t distribution, std::size_t index) {
  const double uniform = static_cast<double>(scrambled(distribution << 32 | index) >> 11) * 0x1p-53;
  // Many small values and a long tail, as latencies have.
  return std::round(1000 / (uniform + 0.01)) / 1000;
}

std::uint32_t SampleDay::offset(std::size_t index) const {
  return static_cast<std::uint32_t>(index * 86400 / samplesEach);
}

KvRef<KvDictionary> SampleDay::distributionOptions(std::size_t index) {
  auto options = KvDictionary::create();
  if (index % 2 == 0) return options;
  auto boundaries = KvArray::create(20);
  for (int i = 1; i <= 20; ++i) boundaries->append(KvNumber::float64(0.5 * i * i));
  options->set("intervals", boundaries);
  return options;
}

std::int32_t yesterday() {
  using std::chrono::days;
  const auto now = std::chrono::system_clock::now().time_since_epoch();
  return static_cast<std::int32_t>(std::chrono::floor<days>(now).count() - 1);
}

std::string whitelistPath(const std::string& root) {
  return root + std::string(kWhitelistFolder) + "/" + std::string(kWhitelistName);
}

bool makeDevice(const std::string& root, const SampleDay& day) {
  return writeWhitelist(root, day) && importDay(metricsStoreFile(root), day);
}

bool makeRawDevice(const std::string& root, const SampleDay& day) {
  auto store = RawStore::make(metricsStoreFile(root));
  bool done = store.has_value();
  for (std::size_t i = 0; done && i < day.scalars; ++i) {
    done = store->addScalar(day.day, SampleDay::scalarKey(i), SampleDay::scalar(i));
  }
  std::vector<double> values(day.samplesEach);
  std::vector<std::uint32_t> offsets(day.samplesEach);
  for (std::size_t i = 0; done && i < day.distributions; ++i) {
    for (std::size_t j = 0; j < day.samplesEach; ++j) {
      values[j] = SampleDay::sample(i, j);
      offsets[j] = day.offset(j);
    }
    done = store->addSamples(day.day, SampleDay::distributionKey(i), {values, offsets, {}});
  }
  return done && store->finish();
}

bool makeRowDatabase(const std::string& path, const SampleDay& day) {
  auto opened = Database::openAtPath(path, Database::Access::Create);
  if (!opened) return false;
  Database& database = *opened;
  if (!database.execute("CREATE TABLE scalars(day INTEGER, key TEXT, value INTEGER);"
                        "CREATE TABLE samples(day INTEGER, key TEXT, offset INTEGER, value REAL);"
                        "BEGIN")) {
    return false;
  }
  auto scalar = database.prepare("INSERT INTO scalars VALUES (?1, ?2, ?3)");
  // A quotient of whole numbers is the same double that the store was given.
  auto sample = database.prepare("INSERT INTO samples VALUES (?1, ?2, ?3, ?4 / 1000.0)");
  if (!scalar || !sample) return false;
  for (std::size_t i = 0; i < day.scalars; ++i) {
    const std::string key = SampleDay::scalarKey(i);
    scalar->bind(1, std::int64_t{day.day}).bind(2, key).bind(3, SampleDay::scalar(i));
    if (!scalar->run()) return false;
  }
  std::vector<std::string> keys;
  for (std::size_t i = 0; i < day.distributions; ++i) keys.push_back(SampleDay::distributionKey(i));
  for (std::size_t j = 0; j < day.samplesEach; ++j) {
    for (std::size_t i = 0; i < day.distributions; ++i) {
      const auto thousandths = std::llround(SampleDay::sample(i, j) * 1000);
      sample->bind(1, std::int64_t{day.day})
          .bind(2, keys[i])
          .bind(3, std::int64_t{day.offset(j)})
          .bind(4, std::int64_t{thousandths});
      if (!sample->run()) return false;
    }
  }
  return static_cast<bool>(database.execute("COMMIT"));
}

bool makeCsv(const std::string& path, const SampleDay& day) {
  std::FILE* const file = std::fopen(path.c_str(), "wbe");
  if (file == nullptr) return false;
  std::string text(tools::kStoreCsvHeader);
  text += '\n';
  const auto flush = [&](std::size_t least) {
    if (text.size() < least) return;
    std::fwrite(text.data(), 1, text.size(), file);
    text.clear();
  };
  constexpr std::size_t kPiece = 1u << 20;
  for (std::size_t i = 0; i < day.scalars; ++i) {
    tools::appendScalarRow(text, SampleDay::scalarKey(i), day.day, SampleDay::scalar(i));
    flush(kPiece);
  }
  for (std::size_t i = 0; i < day.distributions; ++i) {
    const std::string key = SampleDay::distributionKey(i);
    for (std::size_t j = 0; j < day.samplesEach; ++j) {
      tools::appendSampleRow(text, key, day.day, day.offset(j), SampleDay::sample(i, j));
      flush(kPiece);
    }
  }
  flush(1);
  const bool written = std::ferror(file) == 0;
  return std::fclose(file) == 0 && written;
}

}  // namespace tally::bench

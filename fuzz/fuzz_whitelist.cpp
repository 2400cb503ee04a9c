// The whitelist: as a file of any bytes, or as a property list of any shape; then keys looked up.
#include <string>

#include "config/metric_table.h"
#include "config/whitelist.h"
#include "fakes/fake_platform.h"
#include "fuzz_values.h"

using namespace tally;
using fuzz::require;

namespace {

// The longest entry that the key begins with, found by looking at each.
const KvString* longestPrefix(const KvDictionary& root, std::string_view sectionTitle,
                              std::string_view key) {
  const KvString* longest = nullptr;
  for (const auto& group : root) {
    const auto* const sections = kvCast<KvDictionary>(group.value.get());
    if (sections == nullptr || groupState(platform(), group.key->view()) != GroupState::InForce)
      continue;
    const auto* const entries = sections->getAs<KvDictionary>(sectionTitle);
    if (entries == nullptr) continue;
    for (const auto& entry : *entries) {
      const std::string_view prefix = entry.key->view();
      if (kvCast<KvDictionary>(entry.value.get()) == nullptr || !key.starts_with(prefix)) continue;
      if (longest == nullptr || prefix.size() > longest->view().size()) longest = entry.key.get();
    }
  }
  return longest;
}

void lookUp(const Whitelist& config, const KvDictionary& root, std::string_view key) {
  const auto match = config.matchScalarKey(key);
  require(config.scalarOptions(key) == match.options, "both answers are the same");
  require((match.kind == WhitelistMatchKind::None) == (match.options == nullptr),
          "a key that is admitted has options");
  config.distributionOptions(key);
  if (match.kind == WhitelistMatchKind::Exact) {
    require(match.entry->key() == key, "an exact match is the key");
    return;
  }
  const KvString* const expected = longestPrefix(root, "ScalarKeyPrefixes", key);
  require((match.kind == WhitelistMatchKind::Prefix) == (expected != nullptr) &&
              (expected == nullptr || match.entry->key() == expected->view()),
          "the longest prefix matches");
}

// The same bytes as a table of metrics.
void readMetrics(std::string_view bytes) {
  MetricTable table;
  table.parse(bytes, "Metrics", [](const std::string&) {});
  table.finish();
  require(table.below("").metrics == table.keyCount() + table.prefixCount(), "all begin with \"\"");
  const Metric* const metric = table.find("vellum.a");
  require(metric == nullptr || std::string_view("vellum.a").starts_with(metric->key->view()),
          "what is found is the key or a prefix");
}

}  // namespace

FUZZ_TARGET(whitelist)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  fakes::FakePlatform fake = fakes::makeFakePlatform();
  const auto scope = fake.install();
  WhitelistFile file;
  KvRef<KvDictionary> root;
  if (fuzz::isDocument(input.rest())) {
    readMetrics(input.rest());
    // Piece by piece, so that each part of a document is cut somewhere; beside all at once.
    fake.files->contents[std::string(kWhitelistPath)] = input.rest();
    fake.files->pieceSize = 1 + size % 61;
    file = loadWhitelistFile(platform());
    const WhitelistFile whole = parseWhitelistFile(input.rest());
    require(file.fault == whole.fault && file.digest == whole.digest, "pieces are the whole");
    const auto parsed = decodePlist(input.rest());
    if (parsed) root = KvRef<KvDictionary>::share(kvCast<KvDictionary>(parsed->get()));
    require((file.content != nullptr) == static_cast<bool>(root), "both ways read the same");
  } else {
    file.read = true;
    root = fuzz::ValueReader(input).takeDictionary();
    file.content = WhitelistContent::of(root);
  }
  const auto config = Whitelist::fromFile(platform(), file);
  require((config != nullptr) == static_cast<bool>(root), "a file that is read is in force");
  if (config == nullptr) return 0;
  for (const auto& group : *root) {
    const auto* const sections = kvCast<KvDictionary>(group.value.get());
    if (sections == nullptr) continue;
    for (const auto& section : *sections) {
      const auto* const entries = kvCast<KvDictionary>(section.value.get());
      if (entries == nullptr) continue;
      std::size_t looked = 0;
      for (const auto& entry : *entries) {
        const std::string key(entry.key->view());
        lookUp(*config, *root, key);
        lookUp(*config, *root, key + "x");
        lookUp(*config, *root, std::string_view(key).substr(0, key.size() / 2));
        if (++looked == 8) break;
      }
    }
  }
  return 0;
}

// Random whitelists, damaged ones among them: what the content says, however the file is read,
// is what a tree of the same document says.
#include "config/whitelist_content.h"

#include <gtest/gtest.h>

#include <bit>
#include <random>

#include "base/utf8.h"
#include "config/whitelist_file.h"
#include "fakes/fake_platform.h"

namespace tally {
namespace {

class Recorder final : public WhitelistVisitor {
 public:
  bool beginGroup(std::string_view name) override {
    add("group", {name});
    return name != "off";
  }
  void beginSection(WhitelistSection section, std::size_t entries) override {
    add("section", {sectionName(section), std::to_string(entries)});
  }
  void entry(WhitelistSection, const WhitelistEntry& entry) override {
    add("entry", {entry.group, entry.key, kvText(entry.options.get())});
  }
  void malformed(const WhitelistPlace& place) override {
    add("malformed", {place.group, place.section.value_or("-"), place.key.value_or("-"),
                      place.option.value_or("-")});
  }
  void unknownSection(std::string_view group, std::string_view section) override {
    add("unknown", {group, section});
  }
  std::string trace;

 private:
  void add(std::string_view what, std::initializer_list<std::string_view> details) {
    trace += what;
    for (const std::string_view detail : details) (trace += '|') += detail;
    trace += '\n';
  }
};

void visitEntries(std::string_view group, const KvDictionary& entries, WhitelistSection section,
                  Recorder& recorder) {
  recorder.beginSection(section, entries.size());
  for (const auto& [key, value] : entries) {
    WhitelistPlace place{group, sectionName(section), key->view(), {}};
    const auto* const options = kvCast<KvDictionary>(value.get());
    if (options == nullptr) {
      recorder.malformed(place);
      continue;
    }
    auto kept = KvDictionary::create();
    for (const auto& option : *options) {
      place.option = option.key->view();
      if (isWellFormedOption(*place.option, *option.value)) {
        kept->set(option.key, option.value);
      } else {
        recorder.malformed(place);
      }
    }
    recorder.entry(section, {key->view(), kept, group});
  }
}

// By the tree alone.
std::string expectedTrace(std::string_view document) {
  const auto root = decodePlist(document);
  if (!root) return root.error().message;
  const auto* const groups = kvCast<KvDictionary>(root->get());
  if (groups == nullptr) return "the root is not a dictionary";
  Recorder recorder;
  for (const auto& [group, value] : *groups) {
    if (!recorder.beginGroup(group->view())) continue;
    const auto* const sections = kvCast<KvDictionary>(value.get());
    if (sections == nullptr) recorder.malformed({group->view(), {}, {}, {}});
    for (std::size_t i = 0; sections != nullptr && i < sections->size(); ++i) {
      const auto& [name, content] = sections->begin()[i];
      const auto section = sectionOfName(name->view());
      const auto* const entries = kvCast<KvDictionary>(content.get());
      if (!section) {
        recorder.unknownSection(group->view(), name->view());
      } else if (entries == nullptr) {
        recorder.malformed({group->view(), name->view(), {}, {}});
      } else {
        visitEntries(group->view(), *entries, *section, recorder);
      }
    }
  }
  return recorder.trace;
}

std::string traceOf(const WhitelistFile& file) {
  if (!file.content) return file.fault;
  Recorder recorder;
  visitWhitelist(*file.content, recorder);
  return recorder.trace;
}

// Few names, so that many are repeated.
class Documents {
 public:
  explicit Documents(unsigned seed) : random_(seed) {}
  std::size_t below(std::size_t count) { return random_() % count; }

  std::string next() {
    std::string text = "<?xml version=\"1.0\"?>\n<!-- \xC3\xA9 > --><plist version=\"1.0\">\n" +
                       (below(20) == 0 ? value(0) : dictionary(0)) + "</plist>\n";
    switch (below(6)) {
      case 0:
        text.resize(below(text.size()));
        break;
      case 1:
        text[below(text.size())] = "\0<>/&k\xFF"[below(7)];
        break;
    }
    return text;
  }

 private:
  std::string dictionary(int level) {
    static constexpr const char* kNames[4][5] = {
        {"A", "off", "B&amp;", "A", "C"},
        {"ScalarKeys", "DistributionKeys", "ScalarKeyPrefixes", "DistributionKeyPrefixes", "Notes"},
        {"k.1", "k.<!-- -->2", "\xC3\xA9<![CDATA[<]]>", "bad\xFF", ""},
        {"sig_fig", "bucket_interval", "intervals", "type", "sig_fig"}};
    if (below(8) == 0) return "<dict/>";
    std::string text = "<dict>\n";
    for (std::size_t left = below(level == 2 ? 40 : 5); left > 0; --left) {
      text += std::string("<key>") + kNames[level][below(5)] +
              (level == 2 ? std::to_string(below(20)) : "") + "</key>\n";
      text += level == 3 || below(8) == 0 ? value(level) : dictionary(level + 1);
    }
    return text + "</dict>\n";
  }
  std::string value(int level) {
    static constexpr const char* kValues[] = {
        "<integer>2</integer>\n",
        "<integer>-2</integer>",
        "<real>3.0</real>",
        "<string>2</string>",
        "<array><integer>1</integer><real>2.5</real></array>\n",
        "<array><string/></array>",
        "<true/>",
        "<date>2026-01-01T00:00:00Z</date>",
        "<data>AAAA</data>",
        "<integer>3</integer>"};
    if (below(12) == 0) return "<array>" + dictionary(level) + dictionary(3) + "</array>";
    return kValues[below(std::size(kValues))];
  }
  std::mt19937 random_;
};

std::string inUtf16(std::string_view text) {
  std::string out = "\xFF\xFE";
  for (std::size_t i = 0; i < text.size();) {
    const std::uint32_t character = takeCharacter(text, i);
    out += static_cast<char>(character & 0xFF);
    out += static_cast<char>(character >> 8);
  }
  return out;
}

TEST(WhitelistContent, SaysWhatATreeOfTheDocumentSays) {
  const fakes::FakePlatform fake = fakes::makeFakePlatform();
  Platform platform = fake.services();
  std::size_t sound = 0;
  for (unsigned seed = 0; seed < 400; ++seed) {
    SCOPED_TRACE(seed);
    Documents documents(seed);
    std::string text = documents.next();
    if (seed % 5 == 0) text = inUtf16(text);
    const std::string expected = expectedTrace(text);
    sound += expected.starts_with("group");
    const WhitelistFile whole = parseWhitelistFile(text);
    ASSERT_EQ(traceOf(whole), expected) << text;
    // Every place is cut by some piece.
    fake.files->contents[std::string(kWhitelistPath)] = text;
    fake.files->pieceSize = 1 + documents.below(seed % 2 == 0 ? 4 : 100);
    const WhitelistFile pieces = loadWhitelistFile(platform);
    ASSERT_EQ(traceOf(pieces), expected) << text;
    ASSERT_EQ(pieces.digest, whole.digest);
    // As a binary document is read.
    const auto root = decodePlist(text);
    auto* const groups = root ? kvCast<KvDictionary>(root->get()) : nullptr;
    if (groups == nullptr) continue;
    const auto content = WhitelistContent::of(KvRef<KvDictionary>::share(groups));
    ASSERT_EQ(traceOf({.read = true, .digest = {}, .content = content, .fault = {}}), expected);
  }
  EXPECT_GT(sound, 150u);
}

}  // namespace
}  // namespace tally

// tallyctl report export: where a stream is cut, and what a sort that leaves memory gives back.
#include <map>
#include <memory>

#include "tools/export/bucket_label.h"
#include "tools/export/log_stream.h"
#include "tools/export/sorted_lines.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

std::vector<std::string> documentsOf(std::string text, std::size_t mostBytes) {
  const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(
      ::fmemopen(text.data(), text.size(), "r"), std::fclose);
  LogStream stream(file.get(), mostBytes);
  std::vector<std::string> documents;
  while (const auto document = stream.next()) {
    documents.push_back(*document ? std::string(**document)
                                  : "(" + document->error().message + ")");
  }
  return documents;
}

TEST(Export, AStreamIsCutWhereItsDocumentsEnd) {
  constexpr std::size_t kMost = 200'000;
  const std::string one = "<?xml version='1.0'?><plist><key a='>'/>&lt;/plist></plist>";
  const std::string hidden = "<plist><!-- </plist><?xml --><s><![CDATA[</s></plist>]]></s></plist>";
  const struct {
    std::string stream;
    std::vector<std::string> documents;
  } cases[] = {
      {one + "\n\n " + one + hidden + "\n", {one, one, hidden}},
      {"<dict/><array><a/></array>", {"<dict/>", "<array><a/></array>"}},
      {"<plist><a>" + one, {"<plist><a>", one}},
      {"<plist><a b='" + one, {"<plist><a b='", one}},
      {"<plist><a></" + one, {"<plist><a></", one}},
      {"</a>noise" + one + "noise", {"</a>", "noise", one, "noise"}},
      {one + "bplist00" + one, {one, "bplist00" + one}},
      {"<plist><!-- " + one, {"<plist><!-- " + one}},
      {"<a>" + std::string(kMost, 'x') + "</a>" + one, {"(too large)", one}},
      {"<a>" + std::string(3 * kMost, '<') + "</a>" + one, {"(too large)", one}},
      {" \n\n ", {}},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(documentsOf(c.stream, kMost), c.documents) << c.stream.substr(0, 60);
  }
  // Wherever the pieces that are read end, the documents are the same.
  for (std::size_t blanks = 65'536 - 80; blanks < 65'536; ++blanks) {
    const std::string first = "<a>" + std::string(blanks, ' ') + "</a>";
    EXPECT_EQ(documentsOf(first + one + hidden, kMost),
              (std::vector<std::string>{first, one, hidden}))
        << blanks;
  }
}

TEST(Export, LinesAreSortedAlsoBeyondMemory) {
  for (const std::size_t memory : {std::size_t{300}, std::size_t{1} << 20}) {
    SortedLines lines(memory);
    lines.add("forgotten", "line");
    lines.clear();
    std::multimap<std::string, std::string> wanted;
    for (int i = 0; i < 3000; ++i) {
      const std::string key = std::to_string(i * 7919 % 500), line = std::to_string(i);
      lines.add(key, line);
      wanted.emplace(key, line);
    }
    std::vector<std::pair<const std::string, std::string>> sorted;
    EXPECT_TRUE(lines.each(
        [&](std::string_view key, std::string_view line) { sorted.emplace_back(key, line); }));
    EXPECT_TRUE(std::ranges::equal(sorted, wanted)) << memory;
  }
}

TEST(Export, LabelsAreReadAsTheyWereWritten) {
  for (const char* label :
       {"", "(", "(1, ]", "(1, 2", "(1,2]", "1, 2]", "(1, 2, 3]", "(x, 2]", "(1, "}) {
    EXPECT_FALSE(parseBucketLabel(label)) << label;
  }
  const auto bounds = parseBucketLabel("(-9007199254740993, 1e+22]");
  ASSERT_TRUE(bounds);
  EXPECT_EQ(bounds->lower, -9007199254740992.0);
  EXPECT_EQ(bounds->upper, 1e22);
}

}  // namespace
}  // namespace tally::tools

// tallyctl report page without a browser: the words, and the data that the page's script reads.
#include <gtest/gtest.h>

#include "tools/page/page_words.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

TEST(PageWords, AnyTextIsOneWordOfAShell) {
  const std::pair<const char*, const char*> cases[] = {
      {"Kitchen-2.a", "Kitchen-2.a"}, {"", "''"},   {"a b", "'a b'"},
      {"$(id)", "'$(id)'"},           {"~", "'~'"}, {"it's", "'it'\\''s'"},
  };
  for (const auto& [text, word] : cases) EXPECT_EQ(shellWord(text), word);
}

TEST(PageWords, RoundingIsSaidInTheOrderInWhichItHappens) {
  const struct {
    std::optional<int> interval, figures;
    const char* words;
  } cases[] = {
      {{}, {}, ""},
      {1, 19, ""},
      {1000, {}, "rounded to the nearest multiple of 1,000"},
      {10, 2, "rounded to the nearest multiple of 10, then to 2 significant figures"},
      {{}, 0, "rounded to 0, 1 or a power of ten"},
  };
  for (const auto& c : cases) {
    auto options = ScalarOptions::create();
    if (c.interval) options->set("bucket_interval", KvNumber::int64(*c.interval));
    if (c.figures) options->set("sig_fig", KvNumber::int64(*c.figures));
    EXPECT_EQ(roundingWords(*options), c.words);
  }
}

class PageTest : public ToolTest {
 protected:
  nlohmann::json block(const std::string& page, const std::string& id) {
    const std::string begin = "<script type=\"application/json\" id=\"" + id + "\">";
    const auto from = page.find(begin) + begin.size();
    return nlohmann::json::parse(page.substr(from, page.find("</script>", from) - from));
  }
};

TEST_F(PageTest, NumbersAreExactAndNothingEndsTheData) {
  putWhitelist(R"({"G": {"ScalarKeys": {"least": {}, "&lt;/script&gt;": {"sig_fig": 1}}}})");
  putRows(
      "kind,key,day,offset,value\nscalar,least,20513,,-9223372036854775808\n"
      "scalar,</script>,20513,,-1234\nscalar,other,20513,,1\n");
  submit(20513);
  const std::string page = run({"report", "page", "-o", "-"}).out;
  const auto data = block(page, "log-1");
  const auto& scalars = data["scalars"];
  EXPECT_EQ(scalars["key"], (nlohmann::json{"</script>", "least"}));
  EXPECT_EQ(scalars["value"], (nlohmann::json{-1000, "-9223372036854775808"}));
  // -1,499 to -950: the digits change between.
  EXPECT_EQ(data["ranges"][scalars["range"][0].get<int>()], (nlohmann::json{"499", "50", false}));
  EXPECT_EQ(data["absent"]["key"], (nlohmann::json{"other"}));
  EXPECT_EQ(data["reasons"], nlohmann::json::parse(R"([["not_listed", ""]])"));
  EXPECT_EQ(block(page, "index")["logs"].size(), 2u);
}

}  // namespace
}  // namespace tally::tools

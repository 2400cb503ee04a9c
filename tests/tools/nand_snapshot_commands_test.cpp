// tallyctl nand snapshot: buffers of both layouts, and descriptions that are not to be trusted.
#include <algorithm>

#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

class SnapshotCommand : public ToolTest {
 protected:
  std::string file(const char* name, const std::string& bytes) const {
    put(name, bytes);
    return at(name);
  }
  Outcome show(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), {"nand", "snapshot"});
    return run(arguments);
  }
};

TEST_F(SnapshotCommand, ShowsRecordsOfBothLayouts) {
  const std::string record = "\x07" + std::string(251, '\0');
  std::string many;  // more text than the first try has room for
  for (int i = 0; i < 9000; ++i) many += record;
  const Outcome fixed = show({file("fixed", many)});
  EXPECT_EQ(fixed.status, kSuccess);
  EXPECT_TRUE(fixed.out.starts_with("Key: \nT   - Timestamp\n"));
  EXPECT_EQ(std::count(fixed.out.begin(), fixed.out.end(), '\n'), 27 + 9000 + 1);
  const Outcome cut = show({file("cut", record + "x")});
  EXPECT_EQ(cut.status, kSuccess);
  EXPECT_THAT(cut.err, testing::HasSubstr("does not end with a whole record"));

  const auto word = [](std::uint32_t value) {
    return std::string(reinterpret_cast<const char*>(&value), sizeof value);
  };
  const auto block = [&](const std::string& label) {
    std::string bytes = word(0) + word(6) + word(4) + word(3) + word(0) + word(0) + word(36) +
                        word(0) + std::string("\x1b]\0\0", 4) + word(1) + word(0) + word(0) +
                        word(0) + word(4) + label;
    bytes.resize(36 + 8 + 28);
    return bytes;
  };
  const std::string records = file("records", word(5) + word(77));
  const std::string good = file("good", block("T=%04u")), bad = file("bad", block("T=%n"));
  const Outcome described = show({records, "--header", good});
  EXPECT_EQ(described.status, kSuccess);
  EXPECT_EQ(described.out, "- SPX Snapshot - \n\\x1b]\nT=0005\nT=0077\n");
  const Outcome json = show({records, "--header", good, "--json"});
  EXPECT_EQ(json.json()["lines"][3], "T=0077");
  const Outcome refused = show({records, "--header", bad});
  EXPECT_EQ(refused.status, kWrong);
  EXPECT_THAT(refused.err, testing::HasSubstr("a label format holds anything but one integer"));
  EXPECT_EQ(show({"/nowhere"}).status, kWrong);
}

}  // namespace
}  // namespace tally::tools

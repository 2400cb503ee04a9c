// Runs tallyctl nand on a storage driver in memory.
#pragma once

#include "fakes/fake_storage.h"
#include "tools/tool_fixture.h"

namespace tally::tools {

class NandToolTest : public ToolTest {
 protected:
  Platform makePlatform(const std::string&, std::FILE*) override { return storage.services(); }
  Outcome nand(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), "nand");
    testing::internal::CaptureStderr();
    testing::internal::CaptureStdout();
    const Outcome outcome = run(arguments);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "") << "the library's notices spoil JSON";
    testing::internal::GetCapturedStderr();
    return outcome;
  }
  fakes::FakeStorage storage;
};

}  // namespace tally::tools

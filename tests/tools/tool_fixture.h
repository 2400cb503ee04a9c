// Runs tallyctl's commands on a device root of the test's own.
#pragma once

#include <gmock/gmock.h>

#include <cstdio>
#include <map>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "host/host_platform.h"
#include "host/temporary_root.h"
#include "tools/frame/tool.h"
#include "tools/frame/tool_log.h"

namespace tally::tools {

class ToolTest : public TemporaryRoot {
 protected:
  struct Outcome {
    int status = -1;
    std::string out, err;
    nlohmann::json json() const { return nlohmann::json::parse(out); }
  };
  // The device is a folder below the root of the test.
  Outcome run(std::vector<std::string> arguments, const std::string& device = "device") {
    arguments.insert(arguments.begin(), {"tallyctl", "--root", at(device)});
    std::vector<const char*> pointers;
    for (const std::string& argument : arguments) pointers.push_back(argument.c_str());
    ToolContext context;
    context.output = terminal;
    context.errors = errorTerminal;
    const auto open = [&](const char* name) { return std::fopen(at(name).c_str(), "w"); };
    std::FILE* const out = context.out = open("out");
    std::FILE* const err = context.err = open("err");
    Outcome outcome;
    outcome.status = runTool(context, pointers, [this, err](const std::string& folder) {
      return makePlatform(folder, err);
    });
    std::fclose(out);
    std::fclose(err);
    outcome.out = get("out");
    outcome.err = get("err");
    return outcome;
  }
  // The same with words before the arguments.
  Outcome runUnder(std::vector<std::string> words, const std::vector<std::string>& arguments) {
    words.insert(words.end(), arguments.begin(), arguments.end());
    return run(std::move(words));
  }
  virtual Platform makePlatform(const std::string& folder, std::FILE* err) {
    return makeHostPlatform(folder, {makeToolLog(err), /*readOnlyPreferences=*/true});
  }

  void putWhitelist(const std::string& groups) {
    putPlist("device/Library/Application Support/Tallybook/Whitelist_Nimbus.plist",
             "<dict>" + groups + "</dict>");
  }
  void putRows(const std::string& rows) {
    put("rows.csv", rows);
    ASSERT_EQ(run({"store", "import", at("rows.csv")}).status, kSuccess);
  }
  // Every file of the device with its content.
  std::map<std::string, std::string> tree() const {
    std::map<std::string, std::string> files;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(at("device"))) {
      const std::string path = entry.path().string().substr(root.size() + 1);
      files[path] = entry.is_regular_file() ? get(path) : "";
    }
    return files;
  }

  Terminal terminal{80, false, false, true}, errorTerminal;
};

// A part of a whitelist: a dictionary under a key.
inline std::string dict(const std::string& key, const std::string& content) {
  return "<key>" + key + "</key><dict>" + content + "</dict>";
}
inline std::string integer(const std::string& key, const std::string& value) {
  return "<key>" + key + "</key><integer>" + value + "</integer>";
}
inline std::string intervals(const std::vector<std::string>& boundaries) {
  std::string text = "<key>intervals</key><array>";
  for (const std::string& boundary : boundaries) text += "<real>" + boundary + "</real>";
  return text + "</array>";
}

}  // namespace tally::tools

// Runs tallyctl's commands on a device root of the test's own.
#pragma once

#include <gmock/gmock.h>

#include <cstdio>
#include <map>
#include <nlohmann/json.hpp>
#include <sstream>
#include <string>
#include <vector>

#include "host/host_platform.h"
#include "host/temporary_root.h"
#include "report/daily_report.h"
#include "tools/frame/output.h"
#include "tools/frame/tool.h"
#include "tools/frame/tool_log.h"

namespace tally::tools {

inline const std::string kPreferences = "device/var/mobile/Library/Preferences/",
                         kDescription = "device/device/device.plist",
                         kRegistry = "device/device/registry.plist",
                         kWhitelist =
                             "device/Library/Application Support/Tallybook/Whitelist_Nimbus.plist",
                         kStore = "device/var/mobile/Library/Tallybook/TBDataStore.sqlitedb",
                         kSpool = "device/var/mobile/Library/Logs/Submission/";

// The element of a property list; a text that begins with "<" is an element as it is.
inline std::string element(const Json& value) {
  std::string text;
  if (value.is_object()) {
    for (const auto& [key, part] : value.items()) text += "<key>" + key + "</key>" + element(part);
    return "<dict>" + text + "</dict>";
  }
  if (value.is_array()) {
    for (const auto& part : value) text += element(part);
    return "<array>" + text + "</array>";
  }
  if (value.is_boolean()) return value.get<bool>() ? "<true/>" : "<false/>";
  if (value.is_number_integer()) return "<integer>" + value.dump() + "</integer>";
  if (value.is_number()) return "<real>" + value.dump() + "</real>";
  text = value.get<std::string>();
  return text.starts_with('<') ? text : "<string>" + text + "</string>";
}

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
    outcome.status = runTool(context, pointers, [this, err](const ToolContext& tool) {
      return makePlatform(tool.root, err);
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

  // The content is JSON, from which the property list is made.
  void putList(const std::string& path, std::string_view json) const {
    putPlist(path, element(Json::parse(json)));
  }
  void putWhitelist(std::string_view json) const { putList(kWhitelist, json); }
  void putRows(const std::string& rows) {
    put("rows.csv", rows);
    ASSERT_EQ(run({"store", "import", at("rows.csv")}).status, kSuccess);
  }
  // What the daily job does for the day.
  void submit(std::int32_t day) const {
    const PlatformScope scope(makeLinuxPlatform(at("device"), {log, false}));
    writeDailyLog(platform(), day, nullptr);
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

inline std::vector<std::string> split(const std::string& text, char separator) {
  std::vector<std::string> parts;
  std::istringstream stream(text);
  for (std::string part; std::getline(stream, part, separator);) parts.push_back(part);
  return parts;
}
// For Pointwise: each text begins with the one that is wanted.
MATCHER(Begins, "") { return std::get<0>(arg).starts_with(std::get<1>(arg)); }
inline void expectParts(const std::string& text, const std::vector<std::string>& parts) {
  for (const std::string& part : parts) EXPECT_THAT(text, testing::HasSubstr(part));
}
// The values, in JSON, are found by JSON pointers.
inline void expectValues(const nlohmann::json& document, std::string_view values) {
  const auto wanted = nlohmann::json::parse(values);
  for (const auto& [pointer, value] : wanted.items()) {
    const nlohmann::json::json_pointer place(pointer);
    EXPECT_EQ(document.contains(place) ? document.at(place) : "absent", value) << pointer;
  }
}

}  // namespace tally::tools

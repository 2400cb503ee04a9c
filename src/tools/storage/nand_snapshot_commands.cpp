#include "tools/storage/nand_snapshot_commands.h"

#include <algorithm>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <vector>

#include "base/files/file.h"
#include "base/text_lines.h"
#include "base/utf8.h"
#include "storage/snapshot.h"
#include "storage/snapshot/snapshot_description.h"
#include "tools/frame/command.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

constexpr std::size_t kLargestRecords = 64u << 20;
constexpr std::size_t kLargestDescription = 1u << 20;
constexpr std::uint32_t kFirstCapacity = 2u << 20;
constexpr std::uint32_t kLargestCapacity = 1u << 30;

// Renders with growing capacity, always from the first record, so that no record is lost to a text
// that was too small. Empty if no capacity suffices.
template <class Render>
std::optional<std::string> renderWhole(const Render& render) {
  for (std::uint32_t capacity = kFirstCapacity; capacity <= kLargestCapacity; capacity *= 2) {
    std::string text(capacity, '\0');
    std::uint32_t size = capacity;
    if (render(text.data(), size)) {
      text.resize(size);
      return text;
    }
  }
  return std::nullopt;
}

std::optional<std::string> renderFixed(const std::string& records) {
  return renderWhole([&](char* text, std::uint32_t& size) {
    return SPXParseSnapshotBuffer(records.data(), static_cast<std::uint32_t>(records.size()), text,
                                  &size) == 1;
  });
}

std::optional<std::string> renderDescribed(const std::string& records,
                                           const std::string& description) {
  return renderWhole([&](char* text, std::uint32_t& size) {
    std::uint32_t cursor = 0;
    const bool whole = SPXParseSnapshotBufferWithInplaceParser(
                           records.data(), static_cast<std::uint32_t>(records.size()), text, &size,
                           std::as_bytes(std::span(description)), &cursor) == 1;
    if (whole) --size;  // the zero byte
    return whole;
  });
}

struct SnapshotArguments {
  std::string records, description;  // files
};

int runSnapshot(const ToolContext& context, const SnapshotArguments& arguments) {
  const auto records = readFile(arguments.records, kLargestRecords);
  if (!records) return complain(context, records.error().message, kWrong);
  std::optional<std::string> text;
  if (arguments.description.empty()) {
    text = renderFixed(*records);
  } else {
    const auto description = readFile(arguments.description, kLargestDescription);
    if (!description) return complain(context, description.error().message, kWrong);
    const std::string_view fault =
        SnapshotDescription().parse(std::as_bytes(std::span(*description)));
    if (!fault.empty()) {
      return complain(context, fmt::format("the description is refused: {}", fault), kWrong);
    }
    text = renderDescribed(*records, *description);
  }
  if (!text) return complain(context, "the snapshot cannot be shown", kWrong);
  if (context.json) {
    Json shown = Json::array();
    eachLine(*text, [&](std::string_view line) { shown.push_back(repairUtf8(line)); });
    printJson(context, {{"lines", std::move(shown)}});
  } else {
    eachLine(*text, [&](std::string_view line) { printLine(context, line); });
  }
  if (arguments.description.empty() && records->size() % kSPXSnapshotRecordBytes != 0) {
    complain(context, "the file does not end with a whole record", kSuccess);
  }
  return kSuccess;
}

}  // namespace

void addNandSnapshotCommands(CLI::App& nand, ToolContext& context) {
  CommandGroup<SnapshotArguments> group(nand, context);
  SnapshotArguments& arguments = group.arguments();
  Command command = group.add(
      "snapshot", "Print a snapshot buffer of the storage processor as text", runSnapshot);
  command.argument(kFileValue, &arguments.records, "The records");
  command.option("--header", kFileValue, &arguments.description,
                 "The description block of the records; without it they have the fixed layout");
}

}  // namespace tally::tools

#include "tools/storage/nand_snapshot_commands.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <vector>

#include "base/file.h"
#include "base/utf8.h"
#include "storage/snapshot.h"
#include "storage/snapshot/snapshot_description.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

constexpr std::size_t kLargestRecords = 64u << 20;
constexpr std::size_t kLargestDescription = 1u << 20;
constexpr std::uint32_t kFirstCapacity = 2u << 20;
constexpr std::uint32_t kLargestCapacity = 1u << 30;

// Renders with more and more room, always from the first record, so that no record is lost to a
// text that was too small. Empty when there is no room that suffices.
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

std::vector<std::string> linesOf(const std::string& text) {
  std::vector<std::string> lines;
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t end = std::min(text.find('\n', at), text.size());
    lines.push_back(text.substr(at, end - at));
    at = end + 1;
  }
  return lines;
}

int runSnapshot(const ToolContext& context, const std::string& path,
                const std::string& descriptionPath) {
  const auto records = readFile(path, kLargestRecords);
  if (!records) return complain(context, records.error().message, kWrong);
  std::optional<std::string> text;
  if (descriptionPath.empty()) {
    text = renderFixed(*records);
  } else {
    const auto description = readFile(descriptionPath, kLargestDescription);
    if (!description) return complain(context, description.error().message, kWrong);
    const std::string_view fault =
        SnapshotDescription().parse(std::as_bytes(std::span(*description)));
    if (!fault.empty()) {
      return complain(context, fmt::format("the description is refused: {}", fault), kWrong);
    }
    text = renderDescribed(*records, *description);
  }
  if (!text) return complain(context, "the snapshot cannot be shown", kWrong);
  const auto lines = linesOf(*text);
  if (context.json) {
    Json shown = Json::array();
    for (const std::string& line : lines) shown.push_back(repairUtf8(line));
    printJson(context, {{"lines", std::move(shown)}});
  } else {
    for (const std::string& line : lines) printLine(context, line);
  }
  if (descriptionPath.empty() && records->size() % kSPXSnapshotRecordBytes != 0) {
    complain(context, "the file does not end with a whole record", kSuccess);
  }
  return kSuccess;
}

}  // namespace

void addNandSnapshotCommands(CLI::App& nand, ToolContext& context) {
  CLI::App* snapshot =
      nand.add_subcommand("snapshot", "A snapshot buffer of the storage processor as text");
  struct Paths {
    std::string records, description;
  };
  const auto paths = std::make_shared<Paths>();
  snapshot->add_option("FILE", paths->records, "The records")->required();
  snapshot
      ->add_option("--header", paths->description,
                   "The description block of the records; without it they have the fixed layout")
      ->type_name("FILE");
  snapshot->callback([&context, paths] {
    context.command = [&context, paths] {
      return runSnapshot(context, paths->records, paths->description);
    };
  });
}

}  // namespace tally::tools

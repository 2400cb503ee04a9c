#include "tools/page/page_command.h"

#include <nlohmann/json.hpp>

#include "base/files/directory.h"
#include "base/files/temporary_file.h"
#include "tools/frame/command.h"
#include "tools/page/page_document.h"
#include "tools/page/page_logs.h"

namespace tally::tools {
namespace {

constexpr std::uint32_t kDefaultDays = 7;
constexpr int kMostDays = 366;
// The page is its owner's alone.
constexpr unsigned kPageMode = 0600;

struct PageArguments {
  std::optional<std::uint32_t> days;
  std::string file;
};

// Replaces the file as a whole; neither a link nor anything else that is not a file is followed.
Status writePage(const std::string& path, std::string_view page) {
  const auto slash = path.rfind('/');
  const std::string folder = slash == std::string::npos ? "." : path.substr(0, slash + 1);
  const std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
  if (!isSafeFileName(name)) return Error{path + ": not the name of a file"};
  const auto directory = Directory::open(folder);
  if (!directory) return directory.error();
  const auto present = directory->identity(name);
  if (present && !present->regular) {
    return Error{path + ": not replaced, because it is not an ordinary file"};
  }
  return writeFileAtomically(*directory, name, page, kPageMode);
}

int makePage(const ToolContext& context, const PageArguments& arguments) {
  const PageSources sources(context);
  const auto logs = pageLogs(sources, arguments.days.value_or(kDefaultDays));
  if (!logs) return complain(context, logs.error().message, kWrong);
  const std::string page = pageDocument(sources, *logs);
  if (arguments.file == "-") {
    print(context.out, page);
    return kSuccess;
  }
  const Status written = writePage(arguments.file, page);
  if (!written) return complain(context, written.error().message, kWrong);
  if (context.json) {
    printJson(context, {{"file", arguments.file}, {"bytes", page.size()}, {"logs", logs->size()}});
  } else {
    printLine(context, fmt::format("{}: {}, {}", arguments.file, counted(logs->size(), "log"),
                                   byteText(page.size())));
  }
  return kSuccess;
}

}  // namespace

void addPageCommand(CLI::App& report, ToolContext& context) {
  CommandGroup<PageArguments> group(report, context);
  PageArguments& arguments = group.arguments();
  Command command =
      group.add("page", "Write a page that shows the owner of the device what leaves it", makePage);
  command
      .option("--days", {"N", ValueKind::Number}, &arguments.days,
              "How many of the newest submitted days to show, beside the next log; 7 by default")
      .within(0, kMostDays);
  command
      .option("-o,--output", kFileValue, &arguments.file,
              "The HTML file, which only its owner can read; - for standard output")
      .required();
}

}  // namespace tally::tools

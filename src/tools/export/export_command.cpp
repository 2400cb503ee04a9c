#include "tools/export/export_command.h"

#include <memory>

#include "base/utf8.h"
#include "tools/export/csv_rows.h"
#include "tools/export/json_rows.h"
#include "tools/export/log_sources.h"
#include "tools/export/metric_rows.h"
#include "tools/frame/buffered_output.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

struct ExportArguments {
  std::string format = "ndjson";
  std::string device, systemVersion, configuration;
  std::optional<std::uint64_t> sequence;
  std::vector<std::string> files;
  bool timestamps = false;
};

std::unique_ptr<RowFormat> makeFormat(const ToolContext& context, const ExportArguments& arguments,
                                      BufferedOutput& output) {
  if (arguments.format == "csv") {
    return std::make_unique<CsvRows>(output, context.output.interactive);
  }
  if (arguments.format == "openmetrics") {
    return std::make_unique<MetricRows>(output, knownMetrics(context), arguments.timestamps,
                                        context.output.interactive);
  }
  return std::make_unique<JsonRows>(output);
}

int exportLogs(const ToolContext& context, const ExportArguments& arguments) {
  if (arguments.timestamps && arguments.format != "openmetrics") {
    return complain(context, "--timestamps is of --format openmetrics", kBadUsage);
  }
  BufferedOutput output(context.out);
  const auto format = makeFormat(context, arguments, output);
  LogSources sources(context,
                     {repairUtf8(arguments.device), arguments.sequence,
                      repairUtf8(arguments.systemVersion), repairUtf8(arguments.configuration)},
                     *format);
  if (arguments.files.empty()) sources.addSpool();
  for (const std::string& file : arguments.files) sources.addFile(file);
  const auto finished = format->finish();
  if (!finished) return complain(context, finished.error().message, kWrong);
  return sources.failed() ? kWrong : kSuccess;
}

}  // namespace

void addExportCommand(CLI::App& report, ToolContext& context) {
  CommandGroup<ExportArguments> group(report, context);
  ExportArguments& arguments = group.arguments();
  Command command = group.add(
      "export", "Turn submitted logs into rows for databases and other programs", exportLogs);
  command.option("--format", {"FORMAT", ValueKind::Text}, &arguments.format, "Form of the rows")
      .oneOf({"ndjson", "csv", "openmetrics"})
      .showsDefault();
  command.flag("--timestamps", &arguments.timestamps,
               "OpenMetrics of all logs with the times of their days, not of the last log without");
  command.option("--device", kTextValue, &arguments.device,
                 "Pseudonym of the device, of logs that do not say it");
  command
      .option("--sequence", {"NUMBER", ValueKind::Number}, &arguments.sequence,
              "Sequence number, of the first log that does not say it")
      .within(std::uint64_t{1}, kLargestExact);
  command.option("--system-version", kTextValue, &arguments.systemVersion,
                 "Version of the system, of logs that do not say it");
  command.option("--configuration", kTextValue, &arguments.configuration,
                 "Configuration of the device, of logs that do not say it");
  command.optionalArgument(
      kFileValue, &arguments.files,
      "Logs, each with the information in the file beside it; - for logs on standard input; by "
      "default the submitted ones");
}

}  // namespace tally::tools

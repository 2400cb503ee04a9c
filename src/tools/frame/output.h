// Output of tallyctl: colours, bars, numbers for people, JSON for programs.
#pragma once

#include <cstdint>
#include <nlohmann/json_fwd.hpp>
#include <string>
#include <string_view>
#include <vector>

#include "kv/value.h"
#include "tools/frame/tool.h"

namespace tally::tools {

using Json = nlohmann::ordered_json;

enum class Ink { Plain, Strong, Faint, Good, Doubtful, Bad };
// The text in an ink if the terminal has colour, else the plain text.
std::string inked(const Terminal& terminal, Ink ink, std::string_view text);
// A title line, with an empty line above it.
void printHeading(const ToolContext& context, std::string_view title);
// A line of text that may be untrusted. On a terminal it is wrapped, and continuation lines are
// indented further.
void printLine(const ToolContext& context, std::string_view text, Ink ink = Ink::Plain);

// A bar of share (0 to 1) times width columns; a share above 0 is never invisible.
std::string bar(const Terminal& terminal, double share, std::size_t width);

// "1,234,567".
std::string integerText(std::int64_t value);
// Four significant digits, grouped, without trailing zeros: "0.0123", "29.02",
// "48,731,904"; "inf", "-inf", "nan".
std::string realText(double value);
// "512 bytes", "1.4 MiB".
std::string byteText(std::uint64_t bytes);
// "1 key", "2 keys", "2 entries".
std::string counted(std::uint64_t count, std::string_view noun);
// The entries by name, so that related ones are adjacent. They are valid as long as the dictionary.
std::vector<const KvDictionary::Entry*> entriesByName(const KvDictionary& dictionary);
// "string", "number", "dictionary".
std::string_view typeName(KvType type);
// "day 20513 (2026-03-01)".
std::string dayName(std::int32_t day);

// Any property value: dates as "2026-03-01T12:30:00Z", data in base64, reals that JSON cannot carry
// as the strings "inf", "-inf" and "nan". Null gives null.
Json jsonOf(const KvObject* value);
Json jsonOfReal(double value);
// Adds a member that the object does not have yet, without looking for it: an ordered object would
// compare the name with every other.
void addMember(Json& object, std::string name, Json value);
void printJson(const ToolContext& context, const Json& document);

// JSON that is safe to show on a terminal: control characters beyond those that JSON escapes
// anyway, and characters that reorder a line, are escaped.
std::string printableJson(std::string text);
// A text as a JSON string, in quotes, likewise safe to show.
std::string jsonText(std::string_view text);

// Reports why the command fails, as a line on standard error or with --json as a part of the error
// object that runTool() prints. Returns the status.
int complain(const ToolContext& context, std::string_view message, ExitStatus status);

}  // namespace tally::tools

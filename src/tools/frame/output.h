// How tallyctl says things: ink, bars, numbers for people, JSON for programs.
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
// The text in an ink, where the terminal has colour; the text alone elsewhere.
std::string inked(const Terminal& terminal, Ink ink, std::string_view text);
// A title line, with an empty line above it.
void printHeading(const ToolContext& context, std::string_view title);
// A line of text that may come from outside. A terminal gets it wrapped, with what continues it
// indented further.
void printLine(const ToolContext& context, std::string_view text, Ink ink = Ink::Plain);

// A bar of share (0 to 1) times width columns; a share above 0 is never invisible.
std::string bar(const Terminal& terminal, double share, std::size_t width);

// "1,234,567".
std::string integerText(std::int64_t value);
// Four significant digits, grouped, without a fraction that says nothing: "0.0123", "29.02",
// "48,731,904"; "inf", "-inf", "nan".
std::string realText(double value);
// "512 bytes", "1.4 MiB".
std::string byteText(std::uint64_t bytes);
// "1 key", "2 keys", "2 entries".
std::string counted(std::uint64_t count, std::string_view noun);
// The entries by name, so that what belongs together stands together; as long as the dictionary.
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

// JSON whose texts hold no character that a terminal would obey: control characters beyond those
// that JSON escapes anyway, and those that reorder a line, are written as escapes.
std::string printableJson(std::string text);

// Says why the command ends, and passes the status on: a line on standard error, or with --json a
// part of the error object that runTool() prints.
int complain(const ToolContext& context, std::string_view message, ExitStatus status);

}  // namespace tally::tools

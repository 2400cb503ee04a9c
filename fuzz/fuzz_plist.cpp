// Property lists as the codec reads them, and values that no property list delivered as it writes
// them.
#include <string>

#include "fuzz_values.h"
#include "kv/json_writer.h"

using namespace tally;
using fuzz::require;

namespace {

// Writes the value in each form. The XML reads back as itself, except that keys which XML cannot
// carry may have become one.
void checkRoundTrip(const KvObject& value) {
  std::string json;
  appendJson(json, value);
  require(!json.empty() && json.find('\n') == json.npos, "JSON is one line");
  require(kvEqual(&value, &value) || !kvText(&value).empty(), "a value has a text");

  const auto written = encodeXmlPlist(value);
  if (!written) return;  // too deep
  const auto read = decodePlist(*written);
  require(static_cast<bool>(read), "what is written can be read");
  const auto second = encodeXmlPlist(**read);
  constexpr std::string_view kReplacement = "\xEF\xBF\xBD";
  require(second && (*second == *written || written->find(kReplacement) != written->npos),
          "reading and writing changes nothing");
  const auto readAgain = decodePlist(*second);
  const auto third = readAgain ? encodeXmlPlist(**readAgain) : Error{};
  require(third && *third == *second, "what was read once stays as it is");
}

}  // namespace

FUZZ_TARGET(plist)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  if (const auto value = fuzz::valueOf(input)) checkRoundTrip(*value);
  return 0;
}

// The texts that a Linux system describes itself with, and numbers and text as people write them.
#include <cmath>
#include <string>

#include "base/number_text.h"
#include "base/printable.h"
#include "base/time_text.h"
#include "base/utf8.h"
#include "fuzz.h"
#include "host/system/applications.h"
#include "host/system/device_information.h"
#include "host/system/kernel_values.h"
#include "host/system/locale.h"
#include "host/system/os_release.h"

using namespace tally;
using fuzz::require;

namespace {

void checkNumbers(std::string_view text) {
  if (const auto whole = parseInt64(text)) {
    std::string written;
    appendInt64(written, *whole);
    require(parseInt64(written) == whole, "a whole number reads back");
  }
  if (const auto real = parseDouble(text)) {
    std::string written;
    appendDouble(written, *real);
    const auto again = parseDouble(written);
    require(again && (*again == *real || std::isnan(*real)), "a real number reads back");
    std::string time;
    appendTimestamp(time, *real);
    require(time.size() == std::string_view("2026-03-01T12:30:00Z").size(), "a time has its form");
    dayText(dayOfSeconds(*real));
  }
}

void checkText(std::string_view text) {
  const std::string shown = printable(text);
  require(isValidUtf8(shown), "what is shown is UTF-8");
  require(std::all_of(shown.begin(), shown.end(),
                      [](char c) { return static_cast<unsigned char>(c) >= ' ' && c != '\x7f'; }),
          "what is shown holds no control characters");
  require(printable(shown) == shown || text.find('\\') != text.npos, "it shows as itself again");
  constexpr std::size_t kColumns = 10;
  require(displayWidth(fitted(shown, kColumns, "..")) <= kColumns, "a fitted text fits");
  const std::string repaired = repairUtf8(text);
  require(isValidUtf8(repaired) && isValidUtf8(replaceNonXmlCharacters(repaired)) &&
              (!isValidUtf8(text) || repaired == text),
          "repair gives UTF-8 and leaves it alone");
}

}  // namespace

FUZZ_TARGET(host_texts)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const std::string text(input.rest());
  checkText(text);
  checkNumbers(text);
  osVersionText(*systemVersionFromOsRelease(text));
  isVisibleApplication(text);
  const std::string tag = languageTag(text);
  require(tag.find_first_of("_.@") == tag.npos, "a language's tag has nothing of a locale's name");
  const LocaleEnvironment environment{text, text, "", text};
  require(preferredLanguages(environment).size() <= text.size() + 1, "languages are named");
  regionCode(environment);
  if (const auto usage = parseSwapUsage(text, 4096)) {
    require(usage->usedBytes + usage->availableBytes == usage->totalBytes, "swap space adds up");
  }
  parseBootSession(text);
  const std::string id = inverseDeviceID(text);
  require(id.empty() || id.size() == 32, "an identifier has 32 digits");
  return 0;
}

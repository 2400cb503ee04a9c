#include "tools/page/page_document.h"

#include <algorithm>
#include <nlohmann/json.hpp>

#include "base/hex.h"
#include "base/time_text.h"
#include "base/version.h"
#include "kv/base64.h"
#include "platform/platform.h"
#include "tools/page/page_assets.h"
#include "tools/page/page_words.h"
#include "tools/whitelist/absence.h"

namespace tally::tools {
namespace {

// As a content security policy names a script or a style that it allows.
std::string policyDigest(std::string_view digits) {
  std::vector<std::byte> bytes;
  for (std::size_t i = 0; i + 1 < digits.size(); i += 2) {
    bytes.push_back(static_cast<std::byte>(hexDigitValue(digits[i]).value_or(0) << 4 |
                                           hexDigitValue(digits[i + 1]).value_or(0)));
  }
  std::string text = "'sha256-";
  appendBase64(text, bytes);
  return text + "'";
}

// The JSON as the content of a script element, which only "<" could end. The two separators are
// line ends to JavaScript, so they are escaped for whoever copies the data into a script.
void appendData(std::string& out, std::string_view id, const Json& json) {
  const std::string text = json.dump(-1, ' ', false, Json::error_handler_t::replace);
  out.append("<script type=\"application/json\" id=\"").append(id).append("\">");
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '<') {
      out += "\\u003c";
    } else if (text.compare(i, 2, "\xE2\x80") == 0 && i + 2 < text.size() &&
               (text[i + 2] == '\xA8' || text[i + 2] == '\xA9')) {
      out += text[i + 2] == '\xA8' ? "\\u2028" : "\\u2029";
      i += 2;
    } else {
      out += text[i];
    }
  }
  out += "</script>\n";
}

Json indexEntry(const PageLog& log) {
  std::string created;
  if (log.spooled && log.spooled->creationTime) {
    appendTimestamp(created, *log.spooled->creationTime);
  }
  return {{"next", !log.spooled},
          {"date", log.day ? Json(dayText(*log.day)) : Json(nullptr)},
          {"readable", log.content.has_value()},
          {"created", created},
          {"file", log.spooled ? Json(log.spooled->fileName) : Json(nullptr)},
          {"keys", log.content ? log.content->keyCount() : 0}};
}

Json pageIndex(const PageSources& sources, const std::vector<PageLog>& logs) {
  Platform& platform = *sources.context.platform;
  std::string made;
  appendTimestamp(made, platform.clock->secondsSince1970());
  const OffSwitch off = submissionSwitch(platform);
  Json entries = Json::array();
  for (const PageLog& log : logs) entries.push_back(indexEntry(log));
  Json absences = Json::array();
  for (const AbsenceRow& row : kAbsences) {
    absences.push_back({{"name", row.name}, {"meaning", row.meaning}});
  }
  return {{"made", made},
          {"absences", std::move(absences)},
          {"version", kProgramVersion},
          {"submissionAllowed", sources.submissionAllowed},
          {"submissionSwitch", {off.command, off.note}},
          {"logs", std::move(entries)}};
}

// For readers whose browser runs no script: figures and dates alone, nothing that others chose.
std::string withoutScript(const std::vector<PageLog>& logs) {
  std::string rows;
  for (const PageLog& log : logs) {
    rows += fmt::format(
        "<tr><th scope=\"row\">{}</th><td>{}</td><td>{}</td><td><code>tallyctl report {}</code>"
        "</td></tr>\n",
        log.day ? dayText(*log.day) : "unknown", log.spooled ? "submitted" : "would go next",
        log.content ? integerText(static_cast<std::int64_t>(log.content->keyCount())) : "none",
        log.spooled ? fmt::format("show {}", log.spooled->sequence)
                    : fmt::format("preview --day {}", log.day.value_or(0)));
  }
  return rows;
}

void fill(std::string& html, std::string_view place, std::string_view content) {
  const auto at = html.find(place);
  if (at != std::string::npos) html.replace(at, place.size(), content);
}

}  // namespace

std::string pageDocument(const PageSources& sources, const std::vector<PageLog>& logs) {
  std::string html(kPageAssets.html);
  fill(html, "{{policy}}",
       fmt::format("default-src 'none'; script-src {}; style-src {}; base-uri 'none'; form-action "
                   "'none'",
                   policyDigest(kPageAssets.scriptDigest), policyDigest(kPageAssets.styleDigest)));
  fill(html, "{{without-script}}", withoutScript(logs));
  fill(html, "{{style}}", kPageAssets.style);
  fill(html, "{{script}}", kPageAssets.script);
  // The data are never searched for places, since they may be large and hold any text. The script
  // comes before all logs but the first, so that it need not wait for them.
  constexpr std::string_view kFirst = "{{first-data}}", kRest = "{{other-data}}";
  const auto first = html.find(kFirst);
  const auto rest = html.find(kRest);
  std::string document = html.substr(0, first);
  appendData(document, "index", pageIndex(sources, logs));
  for (std::size_t i = 0; i < logs.size(); ++i) {
    appendData(document, fmt::format("log-{}", i), pageBlock(sources, logs[i]));
    if (i == 0) document.append(html, first + kFirst.size(), rest - first - kFirst.size());
  }
  return document.append(html, rest + kRest.size());
}

}  // namespace tally::tools

#include "host/system/os_release.h"

#include <algorithm>
#include <cctype>

#include "base/text_lines.h"

namespace tally {
namespace {

bool isName(std::string_view name) {
  return !name.empty() && std::all_of(name.begin(), name.end(), [](char c) {
    return c == '_' || std::isalnum(static_cast<unsigned char>(c)) != 0;
  });
}

// A value as a shell would read it: single quotes keep everything, double quotes and bare text let
// a backslash escape the character after it.
std::string unquoted(std::string_view text) {
  constexpr std::string_view kEscapedInDoubleQuotes = "\"\\$`";
  std::string value;
  char quote = '\0';
  for (std::size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (quote == '\0' && (c == '"' || c == '\'')) {
      quote = c;
    } else if (c == quote) {
      quote = '\0';
    } else if (c == '\\' && quote != '\'' && i + 1 < text.size() &&
               (quote == '\0' ||
                kEscapedInDoubleQuotes.find(text[i + 1]) != std::string_view::npos)) {
      value += text[++i];
    } else {
      value += c;
    }
  }
  return value;
}

}  // namespace

std::map<std::string, std::string, std::less<>> parseOsRelease(std::string_view text) {
  std::map<std::string, std::string, std::less<>> assignments;
  eachLine(text, [&assignments](std::string_view whole) {
    const std::string_view line = trimmed(whole);
    const std::size_t equals = line.find('=');
    if (equals == std::string_view::npos || !isName(line.substr(0, equals))) return;
    assignments[std::string(line.substr(0, equals))] = unquoted(line.substr(equals + 1));
  });
  return assignments;
}

KvRef<KvDictionary> systemVersionFromOsRelease(std::string_view text) {
  const auto assignments = parseOsRelease(text);
  const auto version = KvDictionary::create();
  const auto setFirst = [&](std::string_view key, std::initializer_list<std::string_view> names) {
    for (const std::string_view name : names) {
      const auto found = assignments.find(name);
      if (found == assignments.end() || found->second.empty()) continue;
      version->set(key, KvString::create(found->second));
      return;
    }
  };
  setFirst("ProductName", {"NAME"});
  setFirst("ProductVersion", {"VERSION_ID"});
  setFirst("ProductBuildVersion", {"BUILD_ID", "VERSION", "VERSION_ID"});
  return version;
}

std::string osVersionText(const KvDictionary& systemVersion) {
  std::string text;
  const auto add = [&text](std::string_view word) {
    if (!text.empty() && !word.empty()) text += ' ';
    text += word;
  };
  const auto version = systemVersion.getString("ProductVersion").value_or("");
  const auto build = systemVersion.getString("ProductBuildVersion").value_or("");
  add(systemVersion.getString("ProductName").value_or(""));
  if (build.starts_with(version)) {  // "12" and "12 (bookworm)"
    add(build);
  } else {
    add(version);
    if (!build.empty()) add("(" + std::string(build) + ")");
  }
  return text.empty() ? "unknown" : text;
}

}  // namespace tally

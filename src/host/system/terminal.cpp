#include "host/system/terminal.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>

#include "base/number_text.h"
#include "host/system/environment.h"

namespace tally {
namespace {

// "de_CH.UTF-8", "C.utf8@x".
bool namesUtf8(std::string locale) {
  for (char& c : locale) c = c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
  const std::string_view codeset =
      std::string_view(locale).substr(std::min(locale.find('.'), locale.size()));
  return codeset.starts_with(".utf-8") || codeset.starts_with(".utf8");
}

}  // namespace

Terminal makeTerminal(bool interactive, std::size_t columns,
                      const TerminalEnvironment& environment) {
  constexpr std::int64_t kNarrowest = 40, kWidest = 200, kUsual = 80;
  Terminal terminal;
  auto width = static_cast<std::int64_t>(columns);
  if (width == 0) width = parseInt64(environment.columns).value_or(kUsual);
  if (width <= 0) width = kUsual;
  terminal.columns = static_cast<std::size_t>(std::clamp(width, kNarrowest, kWidest));
  terminal.interactive = interactive;
  terminal.escapes = interactive && environment.noColor.empty() && environment.term != "dumb";
  const std::string& locale = !environment.all.empty()     ? environment.all
                              : !environment.ctype.empty() ? environment.ctype
                                                           : environment.lang;
  terminal.unicode = namesUtf8(locale);
  return terminal;
}

Terminal terminalOf(int descriptor) {
  const bool interactive = ::isatty(descriptor) == 1;
  winsize size{};
  const bool sized = interactive && ::ioctl(descriptor, TIOCGWINSZ, &size) == 0;
  return makeTerminal(interactive, sized ? size.ws_col : 0,
                      {environmentVariable("COLUMNS"), environmentVariable("NO_COLOR"),
                       environmentVariable("TERM"), environmentVariable("LC_ALL"),
                       environmentVariable("LC_CTYPE"), environmentVariable("LANG")});
}

}  // namespace tally

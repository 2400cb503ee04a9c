#include "tools/frame/standard_input.h"

#include <cstdio>

namespace tally::tools {

Result<std::string> readStandardInput(std::size_t mostBytes) {
  std::string text;
  char buffer[1 << 16];
  while (const std::size_t count = std::fread(buffer, 1, sizeof buffer, stdin)) {
    text.append(buffer, count);
    if (text.size() > mostBytes) return Error{"standard input: too large"};
  }
  if (std::ferror(stdin) != 0) return Error{"standard input cannot be read"};
  return text;
}

}  // namespace tally::tools

// The page's fixed parts, from the files in assets/, which the build compiles in.
#pragma once

#include <string_view>

namespace tally::tools {

// What the browser lets run and apply: the digests are SHA-256, in hexadecimal digits.
struct PageAssets {
  std::string_view html;  // with places for the parts, "{{style}}" and the like
  std::string_view style, styleDigest;
  std::string_view script, scriptDigest;
};
extern const PageAssets kPageAssets;

}  // namespace tally::tools

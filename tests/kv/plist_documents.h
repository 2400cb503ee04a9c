// Documents for the property-list tests, among them binary ones that are wrong on purpose.
#pragma once

#include <bit>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "kv/plist_codec.h"

namespace tally {

inline std::string repeated(std::string_view text, std::size_t count) {
  std::string out;
  for (std::size_t i = 0; i < count; ++i) out += text;
  return out;
}

inline std::string plistOf(std::string_view body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
         "<!DOCTYPE plist PUBLIC \"-//Apple//DTD PLIST 1.0//EN\" "
         "\"http://www.apple.com/DTDs/PropertyList-1.0.dtd\">\n"
         "<plist version=\"1.0\">\n" +
         std::string(body) + "\n</plist>\n";
}

// What the document holds, as it would be written; or "error: ..." when it is refused.
inline std::string canonical(std::string_view document) {
  const auto value = decodePlist(document);
  if (!value) return "error: " + value.error().message;
  const auto written = encodeXmlPlist(**value);
  return written ? *written : "error: " + written.error().message;
}

inline std::string bigEndian(std::uint64_t value, std::size_t width) {
  std::string out;
  for (std::size_t i = width; i-- > 0;) {
    out += i < 8 ? static_cast<char>(value >> (8 * i) & 0xFF) : '\0';
  }
  return out;
}

// The ASCII text in UTF-16, without a byte order mark.
inline std::string utf16(std::string_view text, std::endian order) {
  std::string out;
  for (const char c : text)
    (out += order == std::endian::big ? '\0' : c) += order == std::endian::big ? c : '\0';
  return out;
}

inline std::string bits(double value) { return bigEndian(std::bit_cast<std::uint64_t>(value), 8); }

// An array or dictionary (keys first) with references of four bytes.
inline std::string container(char marker, const std::vector<std::uint64_t>& references) {
  const std::size_t count = marker == '\xD0' ? references.size() / 2 : references.size();
  std::string out;
  if (count < 15) {
    out += static_cast<char>(marker | static_cast<char>(count));
  } else {
    (out += static_cast<char>(marker | '\x0F')) += '\x12' + bigEndian(count, 4);
  }
  for (const std::uint64_t reference : references) out += bigEndian(reference, 4);
  return out;
}
inline std::string arrayOf(const std::vector<std::uint64_t>& items) {
  return container('\xA0', items);
}
inline std::string dictOf(const std::vector<std::uint64_t>& parts) {
  return container('\xD0', parts);
}

// A binary property list of these objects; what a case wants damaged is damaged by its fields.
struct Binary {
  std::vector<std::string> objects;
  std::uint64_t root = 0;
  std::size_t offsetWidth = 4, referenceWidth = 4;
  std::uint64_t extraObjects = 0, tableShift = 0;
  std::vector<std::uint64_t> offsets = {};  // instead of the right ones

  std::string build() const {
    std::string out = "bplist00";
    std::vector<std::uint64_t> starts;
    for (const std::string& object : objects) {
      starts.push_back(out.size());
      out += object;
    }
    const std::uint64_t table = out.size();
    for (const std::uint64_t start : offsets.empty() ? starts : offsets) {
      out += bigEndian(start, offsetWidth);
    }
    out +=
        std::string(6, '\0') + static_cast<char>(offsetWidth) + static_cast<char>(referenceWidth);
    return out + bigEndian(starts.size() + extraObjects, 8) + bigEndian(root, 8) +
           bigEndian(table + tableShift, 8);
  }
};

inline std::string zeros(std::size_t count) { return std::string(count, '\0'); }

// depth containers around a boolean, each one the only item of the one before.
inline Binary nestedBinary(std::size_t depth) {
  Binary list;
  for (std::size_t i = 0; i < depth; ++i) list.objects.push_back(arrayOf({i + 1}));
  list.objects.push_back("\x09");
  return list;
}

}  // namespace tally

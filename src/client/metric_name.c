#include "client/metric_name.h"

#include <stdbool.h>
#include <string.h>

static bool is_plain(unsigned char byte) {
  /* Of these, the protocol separates a line's parts with four. */
  return byte >= 0x20 && byte < 0x7f && byte != ':' && byte != '|' && byte != '#' && byte != '@';
}

static bool continues(unsigned char byte) { return (byte & 0xc0) == 0x80; }

/* The length of the well-formed UTF-8 sequence of several bytes that starts there, or 0. */
static size_t sequence_length(const unsigned char* text) {
  const unsigned char first = text[0], second = text[1]; /* a zero byte ends every text */
  if (first < 0xc2 || first > 0xf4 || !continues(second)) return 0;
  if (first < 0xe0) return 2;
  const bool is_overlong = (first == 0xe0 && second < 0xa0) || (first == 0xf0 && second < 0x90);
  const bool is_surrogate = first == 0xed && second >= 0xa0;
  const bool is_too_large = first == 0xf4 && second >= 0x90;
  if (is_overlong || is_surrogate || is_too_large || !continues(text[2])) return 0;
  if (first < 0xf0) return 3;
  return continues(text[3]) ? 4 : 0;
}

size_t client_name_length(const char* name) {
  const unsigned char* const text = (const unsigned char*)name;
  size_t length = 0;
  while (text[length] != 0) {
    const size_t step = is_plain(text[length]) ? 1 : sequence_length(text + length);
    length += step;
    if (step == 0 || length > CLIENT_LONGEST_NAME) return 0;
  }
  /* A line that begins so is an event. */
  return strncmp(name, "_e{", 3) == 0 ? 0 : length;
}

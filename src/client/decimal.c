#include "client/decimal.h"

#include <stdio.h>
#include <string.h>

/* Up to here every whole number is a double of its own. */
static const double kExactIntegers = 9007199254740992.0; /* 2^53 */

char* client_write_unsigned(char* out, uint64_t value) {
  char digits[20];
  char* begin = digits + sizeof digits;
  do {
    *--begin = (char)('0' + value % 10);
    value /= 10;
  } while (value != 0);
  const size_t count = (size_t)(digits + sizeof digits - begin);
  memcpy(out, begin, count);
  return out + count;
}

char* client_write_integer(char* out, int64_t value) {
  if (value >= 0) return client_write_unsigned(out, (uint64_t)value);
  *out++ = '-';
  return client_write_unsigned(out, 0 - (uint64_t)value);
}

/* scaled / 10^decimals. */
static char* write_fixed(char* out, uint64_t scaled, size_t decimals) {
  char digits[20];
  const size_t count = (size_t)(client_write_unsigned(digits, scaled) - digits);
  const size_t whole = count > decimals ? count - decimals : 0;
  if (whole == 0) *out++ = '0';
  memcpy(out, digits, whole);
  out += whole;
  *out++ = '.';
  if (count < decimals) {
    memset(out, '0', decimals - count);
    out += decimals - count;
  }
  memcpy(out, digits + whole, count - whole);
  return out + (count - whole);
}

/* 17 digits, which are enough for any double. */
static char* write_scientific(char* out, double value) {
  char text[64];
  const int length = snprintf(text, sizeof text, "%.16e", value);
  /* The C library writes the decimal point of the locale, which may be several bytes. */
  const char* from = text;
  if (*from == '-') *out++ = *from++;
  *out++ = *from++;
  *out++ = '.';
  while (*from < '0' || *from > '9') ++from;
  const size_t rest = (size_t)(text + length - from);
  memcpy(out, from, rest);
  return out + rest;
}

char* client_write_real(char* out, double value) {
  static const double kPowers[] = {1e1, 1e2,  1e3,  1e4,  1e5,  1e6,  1e7, 1e8,
                                   1e9, 1e10, 1e11, 1e12, 1e13, 1e14, 1e15};
  const double magnitude = value < 0 ? -value : value;
  if (magnitude <= kExactIntegers && (double)(int64_t)value == value) {
    return client_write_integer(out, (int64_t)value);
  }
  for (size_t i = 0; i < sizeof kPowers / sizeof *kPowers; ++i) {
    const double scaled = magnitude * kPowers[i];
    if (scaled >= kExactIntegers) break;
    /* Both are exact, and so a division rounds as a reader of the decimal digits does. */
    const uint64_t digits = (uint64_t)(scaled + 0.5);
    if ((double)digits / kPowers[i] == magnitude) {
      if (value < 0) *out++ = '-';
      return write_fixed(out, digits, i + 1);
    }
  }
  return write_scientific(out, value);
}

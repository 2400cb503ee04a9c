/* Numbers as decimal text, the same in every locale. */
#ifndef CLIENT_DECIMAL_H
#define CLIENT_DECIMAL_H

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

enum { CLIENT_LONGEST_NUMBER = 32 };

/* Write at most CLIENT_LONGEST_NUMBER bytes, without a zero byte, and return their end. */
char* client_write_unsigned(char* out, uint64_t value);
char* client_write_integer(char* out, int64_t value);
/* Digits that read back as the same value; the fewest, if these are at most 15.
   REQUIRES: the value is finite. */
char* client_write_real(char* out, double value);

#ifdef __cplusplus
}
#endif

#endif

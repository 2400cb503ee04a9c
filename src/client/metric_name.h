/* What a metric may be called. */
#ifndef CLIENT_METRIC_NAME_H
#define CLIENT_METRIC_NAME_H

#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

enum { CLIENT_LONGEST_NAME = 512 };

/* The length of a name, or 0 if it would not arrive as it is. */
size_t client_name_length(const char* name);

#ifdef __cplusplus
}
#endif

#endif

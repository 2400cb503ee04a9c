/* Records metrics of a program in the device's daily log.

   Values go to the metrics daemon over a local datagram socket: gauges and counters become scalars
   of the day, samples become distributions. No call blocks, and none allocates memory after
   tallyclient_open(). Lines are packed into datagrams of up to 8,192 bytes; one is sent when it is
   full, and by the first call a second or more after its oldest value. A program that records
   rarely, or is about to sleep, calls tallyclient_flush().

   What the daemon does not take at once stays in the buffer. When the buffer is full, further
   values are dropped and counted, and the next datagram that gets through reports the number
   (`tallyclient.dropped`). While the daemon is missing, a connection is tried once a second.

   All functions may be called from any thread, and none from a signal handler. After fork() the
   child uses its copies of the handles, which start empty: what the parent had buffered is sent by
   the parent alone. (Children that are made by a raw clone system call must not use them.)

   Functions return 0, or an error number of <errno.h>; errno itself stays as it is. */
#ifndef TALLYCLIENT_TALLYCLIENT_H
#define TALLYCLIENT_TALLYCLIENT_H

#include <stddef.h>
#include <stdint.h>

#define TALLYCLIENT_API __attribute__((visibility("default")))

#ifdef __cplusplus
extern "C" {
#endif

typedef struct tallyclient tallyclient;

/* A handle for the socket at a path, which is copied. NULL means the variable TALLYCLIENT_SOCKET of
   the environment (ignored in a program that runs with more rights than its caller), or without it
   /run/tallyd/statsd.sock. The daemon need not be there yet. The caller closes the handle.
   NULL on failure, with errno: ENAMETOOLONG (107 bytes at most), EINVAL (empty) or ENOMEM. */
TALLYCLIENT_API tallyclient* tallyclient_open(const char* path);

/* A name is valid UTF-8 of 1 to 512 bytes without control characters and without : | # @; it does
   not begin with "_e{". Each of the three functions returns
     0        recorded
     EINVAL   the handle is NULL, or the name or a value is not accepted; nothing is recorded
     ENOBUFS  dropped and counted, since the buffer is full and the daemon does not take it */

/* Sets a gauge: the day's scalar becomes the value. */
TALLYCLIENT_API int tallyclient_set(tallyclient* client, const char* name, int64_t value);

/* Adds to a counter: the day's scalar grows by the amount, which may be negative. */
TALLYCLIENT_API int tallyclient_add(tallyclient* client, const char* name, int64_t amount);

/* Adds a sample to a distribution. NaN and infinities are not accepted. */
TALLYCLIENT_API int tallyclient_push(tallyclient* client, const char* name, double value);

/* Adds samples, with one check of the name and as few bytes as possible. When one of the values is
   not accepted, none is recorded; ENOBUFS means that those from some value on were dropped. A count
   of 0 only checks the name. */
TALLYCLIENT_API int tallyclient_push_many(tallyclient* client, const char* name,
                                          const double* values, size_t count);

/* Sends what is in the buffer. 0: nothing is left. Otherwise it stays there, and the next calls try
   again: EAGAIN, the daemon's queue is full; ENOENT or ECONNREFUSED, it is missing; EACCES, not
   permitted, and what else connect() and send() return. EINVAL: the handle is NULL. */
TALLYCLIENT_API int tallyclient_flush(tallyclient* client);

/* How many values were dropped since the handle was opened, or since the fork in a child. 0 for
   NULL. */
TALLYCLIENT_API uint64_t tallyclient_dropped(tallyclient* client);

/* Tries to send what is in the buffer, as tallyclient_flush(), whose result it returns, and frees
   the handle in any case. No other thread may be using it. */
TALLYCLIENT_API int tallyclient_close(tallyclient* client);

#ifdef __cplusplus
}
#endif

#endif

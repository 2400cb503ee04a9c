#include "tallyclient/tallyclient.h"

#include <errno.h>
#include <math.h>
#include <pthread.h>
#include <stdatomic.h>
#include <stdbool.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include "client/decimal.h"
#include "client/link.h"
#include "client/metric_name.h"

static const char kDefaultSocket[] = "/run/tallyd/statsd.sock";
static const char kDroppedName[] = "tallyclient.dropped";

enum {
  kDatagramBytes = 8192,
  kTypeBytes = 3, /* "|g\n" */
  /* What a datagram never lacks: space to report losses. */
  kReportBytes = sizeof kDroppedName + CLIENT_LONGEST_NUMBER + kTypeBytes,
  kLineBytes = kDatagramBytes - kReportBytes,
};
static const int64_t kMillisecond = 1000000, kSecond = 1000000000; /* in nanoseconds */

struct tallyclient {
  pthread_mutex_t lock;
  atomic_uint generation; /* of the process that the handle was last used in */
  struct client_link link;
  int fault;            /* why the last datagram was not sent; 0 after one that was */
  int64_t next_attempt; /* after a fault, on the monotonic clock */
  int64_t oldest;       /* when the first line was written, on the coarse monotonic clock */
  uint64_t dropped, unreported;
  size_t used;         /* bytes of whole lines */
  size_t samples_at;   /* where the last line begins, if it carries samples; else kNoSamples */
  size_t samples_name; /* the length of its name */
  char datagram[kDatagramBytes];
};
static const size_t kNoSamples = SIZE_MAX;

/* Forks since the library was loaded. A handle of an older generation is the parent's: another
   thread may have held its lock or written to it at that moment, so all of it but the connection is
   made anew. */
static atomic_uint current_generation;
static pthread_mutex_t renewal = PTHREAD_MUTEX_INITIALIZER;
static pthread_once_t fork_handler = PTHREAD_ONCE_INIT;
static int fork_handler_fault;

static void after_fork(void) {
  pthread_mutex_init(&renewal, NULL);
  atomic_fetch_add(&current_generation, 1);
}
static void install_fork_handler(void) {
  fork_handler_fault = pthread_atfork(NULL, NULL, after_fork);
}

static void start_empty(tallyclient* client) {
  pthread_mutex_init(&client->lock, NULL);
  client->fault = 0;
  client->dropped = client->unreported = 0;
  client->used = 0;
  client->samples_at = kNoSamples;
}

static void lock(tallyclient* client) {
  const unsigned generation = atomic_load(&current_generation);
  if (atomic_load(&client->generation) != generation) {
    pthread_mutex_lock(&renewal);
    if (atomic_load(&client->generation) != generation) {
      start_empty(client);
      atomic_store(&client->generation, generation);
    }
    pthread_mutex_unlock(&renewal);
  }
  pthread_mutex_lock(&client->lock);
}

static int64_t nanoseconds(clockid_t clock) {
  struct timespec now;
  clock_gettime(clock, &now);
  return now.tv_sec * kSecond + now.tv_nsec;
}

/* With the losses so far, which count as reported once the datagram is sent. */
static int send_datagram(tallyclient* client) {
  char* end = client->datagram + client->used;
  if (client->unreported > 0) {
    end = (char*)mempcpy(end, kDroppedName, sizeof kDroppedName - 1);
    *end++ = ':';
    end = client_write_unsigned(end, client->unreported);
    end = (char*)mempcpy(end, "|c\n", kTypeBytes);
  }
  /* A thread that is cancelled in a system call would keep the lock. */
  int cancel_state;
  pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &cancel_state);
  const int kept_errno = errno;
  const int fault =
      client_link_send(&client->link, client->datagram, (size_t)(end - client->datagram));
  errno = kept_errno;
  pthread_setcancelstate(cancel_state, NULL);
  return fault;
}

/* Sends what there is, unless it failed a moment ago. REQUIRES: the lock is held. */
static int send_buffer(tallyclient* client, bool on_request) {
  if (client->used == 0 && client->unreported == 0) return 0;
  if (client->fault != 0) {
    const bool may_try = on_request && client->fault == EAGAIN;
    if (!may_try && nanoseconds(CLOCK_MONOTONIC) < client->next_attempt) return client->fault;
  }
  client->fault = send_datagram(client);
  if (client->fault != 0) {
    /* A full queue is soon emptied; a missing daemon is started by someone. */
    client->next_attempt =
        nanoseconds(CLOCK_MONOTONIC) + (client->fault == EAGAIN ? kMillisecond / 10 : kSecond);
    return client->fault;
  }
  client->used = 0;
  client->unreported = 0;
  client->samples_at = kNoSamples;
  return 0;
}

static bool has_space(tallyclient* client, size_t bytes) {
  if (client->used + bytes <= kLineBytes) return true;
  return send_buffer(client, false) == 0;
}

static int drop(tallyclient* client, size_t values) {
  client->dropped += values;
  client->unreported += values;
  return ENOBUFS;
}

/* Takes what was written up to there into the datagram, and sends it if it has waited for long. */
static void accept_up_to(tallyclient* client, const char* end) {
  const int64_t now = nanoseconds(CLOCK_MONOTONIC_COARSE);
  if (client->used == 0) client->oldest = now;
  client->used = (size_t)(end - client->datagram);
  if (now - client->oldest >= kSecond) send_buffer(client, false);
}

static char* write_line(char* out, const char* name, size_t length, int64_t value, char type) {
  out = (char*)mempcpy(out, name, length);
  *out++ = ':';
  out = client_write_integer(out, value);
  *out++ = '|';
  *out++ = type;
  *out++ = '\n';
  return out;
}

static int record_integer(tallyclient* client, const char* name, int64_t value, char type) {
  const size_t length = client != NULL && name != NULL ? client_name_length(name) : 0;
  if (length == 0) return EINVAL;
  /* A gauge with a sign is a change of it, so that it is set to 0 first, in the same datagram. */
  const bool from_zero = type == 'g' && value < 0;
  const size_t bytes = (length + 1 + CLIENT_LONGEST_NUMBER + kTypeBytes) * (from_zero ? 2 : 1);
  int result = 0;
  lock(client);
  if (has_space(client, bytes)) {
    char* end = client->datagram + client->used;
    if (from_zero) end = write_line(end, name, length, 0, type);
    end = write_line(end, name, length, value, type);
    client->samples_at = kNoSamples;
    accept_up_to(client, end);
  } else {
    result = drop(client, 1);
  }
  pthread_mutex_unlock(&client->lock);
  return result;
}

int tallyclient_set(tallyclient* client, const char* name, int64_t value) {
  return record_integer(client, name, value, 'g');
}

int tallyclient_add(tallyclient* client, const char* name, int64_t amount) {
  return record_integer(client, name, amount, 'c');
}

/* Writes as many values as fit, onto the last line if it has the name; returns how many. */
static size_t append_samples(tallyclient* client, const char* name, size_t length,
                             const double* values, size_t count) {
  char* end = client->datagram + client->used;
  const char* const limit = client->datagram + kLineBytes;
  if (client->samples_at != kNoSamples && client->samples_name == length &&
      memcmp(client->datagram + client->samples_at, name, length) == 0) {
    end -= kTypeBytes;
  } else {
    client->samples_at = client->used;
    client->samples_name = length;
    end = (char*)mempcpy(end, name, length);
  }
  size_t written = 0;
  while (written < count && limit - end >= 1 + CLIENT_LONGEST_NUMBER + kTypeBytes) {
    *end++ = ':';
    end = client_write_real(end, values[written++]);
  }
  accept_up_to(client, (char*)mempcpy(end, "|h\n", kTypeBytes));
  return written;
}

int tallyclient_push_many(tallyclient* client, const char* name, const double* values,
                          size_t count) {
  const size_t length = client != NULL && name != NULL ? client_name_length(name) : 0;
  if (length == 0 || (values == NULL && count > 0)) return EINVAL;
  for (size_t i = 0; i < count; ++i) {
    if (!isfinite(values[i])) return EINVAL;
  }
  int result = 0;
  lock(client);
  for (size_t done = 0; done < count && result == 0;) {
    if (has_space(client, length + 1 + CLIENT_LONGEST_NUMBER + kTypeBytes)) {
      done += append_samples(client, name, length, values + done, count - done);
    } else {
      result = drop(client, count - done);
    }
  }
  pthread_mutex_unlock(&client->lock);
  return result;
}

int tallyclient_push(tallyclient* client, const char* name, double value) {
  return tallyclient_push_many(client, name, &value, 1);
}

int tallyclient_flush(tallyclient* client) {
  if (client == NULL) return EINVAL;
  lock(client);
  const int fault = send_buffer(client, true);
  pthread_mutex_unlock(&client->lock);
  return fault;
}

uint64_t tallyclient_dropped(tallyclient* client) {
  if (client == NULL) return 0;
  lock(client);
  const uint64_t dropped = client->dropped;
  pthread_mutex_unlock(&client->lock);
  return dropped;
}

tallyclient* tallyclient_open(const char* path) {
  if (path == NULL) {
    path = secure_getenv("TALLYCLIENT_SOCKET");
    if (path == NULL || *path == 0) path = kDefaultSocket;
  }
  pthread_once(&fork_handler, install_fork_handler);
  tallyclient* const client = fork_handler_fault == 0 ? malloc(sizeof *client) : NULL;
  if (client == NULL) {
    errno = ENOMEM;
    return NULL;
  }
  const int kept_errno = errno;
  const int fault = client_link_open(&client->link, path);
  if (fault != 0) {
    free(client);
    errno = fault;
    return NULL;
  }
  errno = kept_errno;
  start_empty(client);
  atomic_init(&client->generation, atomic_load(&current_generation));
  return client;
}

int tallyclient_close(tallyclient* client) {
  if (client == NULL) return EINVAL;
  const int fault = tallyclient_flush(client);
  const int kept_errno = errno;
  client_link_close(&client->link);
  errno = kept_errno;
  pthread_mutex_destroy(&client->lock);
  free(client);
  return fault;
}

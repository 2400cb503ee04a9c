/* record-day DAY MINUTES: in the emulated machine, sends tallyd what a device records on that day
   since 1970, in steps of the clock, which it sets, and has it commit at every interval of so many
   minutes. */
#include <errno.h>
#include <linux/sockios.h>
#include <math.h>
#include <sched.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

enum {
  DAY = 86400,
  COUNTERS = 500,
  COUNTS = 100,
  DISTRIBUTIONS = 50,
  SAMPLES = 10,
  PER_DATAGRAM = 20
};
enum { STEP = 2 }; /* seconds; those of a step share their time of arrival */

static void give_up(const char* what) {
  perror(what);
  exit(1);
}

static int connected(int type, const char* path) {
  struct sockaddr_un address = {.sun_family = AF_UNIX};
  strcpy(address.sun_path, path);
  const int made = socket(AF_UNIX, type, 0);
  if (made < 0 || connect(made, (struct sockaddr*)&address, sizeof address) != 0) give_up(path);
  return made;
}

/* The answer must begin so. Returns the number after a text in it. */
static long long ask(const char* request, const char* begin, const char* before) {
  static char answer[1 << 16];
  const int control = connected(SOCK_STREAM, "/run/tallyd/control.sock");
  size_t size = 0;
  if (write(control, request, strlen(request)) < 0) give_up(request);
  for (ssize_t got; (got = read(control, answer + size, sizeof answer - 1 - size)) > 0;)
    size += (size_t)got;
  close(control);
  answer[size] = '\0';
  if (strncmp(answer, begin, strlen(begin)) != 0) give_up(answer);
  const char* const found = before != NULL ? strstr(answer, before) : NULL;
  return found != NULL ? atoll(found + strlen(before)) : 0;
}

/* Latencies: a lognormal distribution with a median of 50 ms. */
static int milliseconds(void) {
  static int values[4096];
  enum { VALUES = sizeof values / sizeof *values };
  for (int i = 0; values[VALUES - 1] == 0 && i < VALUES; ++i) {
    const double u = drand48(), v = drand48();
    values[i] = 1 + (int)(50 * exp(sqrt(-2 * log(1 - u)) * cos(2 * 3.14159265358979 * v)));
  }
  return values[lrand48() % VALUES];
}

struct Datagram {
  char text[PER_DATAGRAM * 48];
  size_t used;
};

static void add_line(struct Datagram* datagram, const char* format, int key, int value) {
  datagram->used += (size_t)snprintf(datagram->text + datagram->used,
                                     sizeof datagram->text - datagram->used, format, key, value);
}

static int receiver;

static void send_datagram(const struct Datagram* datagram) {
  if (send(receiver, datagram->text, datagram->used, 0) < 0) give_up("send");
}

/* The counters' datagrams are the same in each round of all keys. */
static void count(int datagrams) {
  enum { ROUND = COUNTERS / PER_DATAGRAM };
  static struct Datagram made[ROUND];
  static int next;
  for (int i = made[0].used == 0 ? 0 : COUNTERS; i < COUNTERS; ++i)
    add_line(&made[i / PER_DATAGRAM], "com.example.service.requests.%03d:%d|c\n", i, 1);
  for (; datagrams > 0; --datagrams, next = (next + 1) % ROUND) send_datagram(&made[next]);
}

static void sample(int datagrams) {
  for (; datagrams > 0; --datagrams) {
    struct Datagram made = {.used = 0};
    for (int i = 0; i < PER_DATAGRAM; ++i)
      add_line(&made, "com.example.service.latency.%02d:%d|ms\n", (int)(lrand48() % DISTRIBUTIONS),
               milliseconds());
    send_datagram(&made);
  }
}

/* What is sent is taken before the clock moves on. */
static void record_step(void) {
  count(STEP * COUNTS / PER_DATAGRAM);
  sample(STEP * SAMPLES / PER_DATAGRAM);
  for (int waiting = 1; waiting > 0; sched_yield())
    if (ioctl(receiver, SIOCOUTQ, &waiting) != 0) give_up("SIOCOUTQ");
}

int main(int words, char** arguments) {
  if (words != 3) return 2;
  const long day = atol(arguments[1]), interval = atol(arguments[2]) * 60;
  receiver = connected(SOCK_DGRAM, "/run/tallyd/statsd.sock");
  for (long second = 0; second < DAY; second += STEP) {
    const struct timespec now = {.tv_sec = day * DAY + second};
    if (clock_settime(CLOCK_REALTIME, &now) != 0) give_up("clock_settime");
    record_step();
    if ((second + STEP) % interval != 0) continue;
    ask("commit\n", "done", NULL);
    sync(); /* as the kernel does by itself within 30 s */
  }
  printf("recorded %lld of %lld\n", ask("status\n", "<?xml", "<key>metrics</key>\n\t<integer>"),
         (long long)DAY * (COUNTS + SAMPLES));
  return 0;
}

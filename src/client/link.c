#include "client/link.h"

#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

/* Above the standard streams, one of which may be closed: what is written to it must not come here.
 */
static int open_socket(void) {
  const int made = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (made < 0 || made > STDERR_FILENO) return made;
  const int moved = fcntl(made, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
  const int fault = errno;
  close(made);
  errno = fault;
  return moved;
}

/* A program that closes all its descriptors closes ours too, and may get the number for another. */
static bool is_ours(const struct client_link* link) {
  struct stat status;
  return link->descriptor >= 0 && fstat(link->descriptor, &status) == 0 &&
         status.st_dev == link->device && status.st_ino == link->inode;
}

static int reconnect(struct client_link* link) {
  client_link_close(link);
  const int made = open_socket();
  if (made < 0) return errno;
  struct stat status;
  if (fstat(made, &status) != 0 ||
      connect(made, (const struct sockaddr*)&link->address, sizeof link->address) != 0) {
    const int fault = errno;
    close(made);
    return fault;
  }
  link->descriptor = made;
  link->device = status.st_dev;
  link->inode = status.st_ino;
  return 0;
}

int client_link_open(struct client_link* link, const char* path) {
  const size_t length = strlen(path);
  memset(link, 0, sizeof *link);
  link->descriptor = -1;
  if (length == 0) return EINVAL;
  if (length >= sizeof link->address.sun_path) return ENAMETOOLONG;
  link->address.sun_family = AF_UNIX;
  memcpy(link->address.sun_path, path, length);
  (void)reconnect(link);
  return 0;
}

static int send_once(const struct client_link* link, const void* datagram, size_t size) {
  if (!is_ours(link)) return ENOTCONN;
  if (send(link->descriptor, datagram, size, MSG_DONTWAIT | MSG_NOSIGNAL) >= 0) return 0;
  switch (errno) {
    case EWOULDBLOCK:
    case EINTR:
    case ENOBUFS:
    case ENOMEM:
      return EAGAIN;
    default:
      return errno;
  }
}

int client_link_send(struct client_link* link, const void* datagram, size_t size) {
  int fault = send_once(link, datagram, size);
  if (fault == 0 || fault == EAGAIN) return fault;
  /* A daemon that was started again listens at the same path. */
  fault = reconnect(link);
  return fault != 0 ? fault : send_once(link, datagram, size);
}

void client_link_close(struct client_link* link) {
  const int descriptor = is_ours(link) ? link->descriptor : -1;
  link->descriptor = -1; /* first: a child of a fork in between must not close what is another's */
  if (descriptor >= 0) close(descriptor);
}

/* The socket to the daemon: connected when needed, and never waited for. */
#ifndef CLIENT_LINK_H
#define CLIENT_LINK_H

#include <stdbool.h>
#include <stddef.h>
#include <sys/socket.h>
#include <sys/types.h>
#include <sys/un.h>

#ifdef __cplusplus
extern "C" {
#endif

struct client_link {
  struct sockaddr_un address;
  int descriptor; /* -1 while not connected */
  dev_t device;   /* with the inode: which socket the descriptor was made for */
  ino_t inode;
};

/* 0, EINVAL or ENAMETOOLONG. Connects if it can, for programs that lock themselves in afterwards.
 */
int client_link_open(struct client_link* link, const char* path);
/* Sends one datagram or nothing. Returns 0 or an error number; EAGAIN when the daemon's queue is
   full. */
int client_link_send(struct client_link* link, const void* datagram, size_t size);
void client_link_close(struct client_link* link);

#ifdef __cplusplus
}
#endif

#endif

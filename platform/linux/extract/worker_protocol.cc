#include "platform/linux/extract/worker_protocol.h"

#include <sys/socket.h>

#include <cerrno>
#include <cstring>

namespace corvlumex {
namespace platform {
namespace extract {

bool SendDescriptor(int socket, int fd) {
  char byte = 'F';
  struct iovec iov = {&byte, 1};
  alignas(struct cmsghdr) char control[CMSG_SPACE(sizeof(int))];
  memset(control, 0, sizeof(control));
  struct msghdr message;
  memset(&message, 0, sizeof(message));
  message.msg_iov = &iov;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof(control);
  struct cmsghdr* header = CMSG_FIRSTHDR(&message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(sizeof(int));
  memcpy(CMSG_DATA(header), &fd, sizeof(int));
  ssize_t sent;
  do {
    sent = sendmsg(socket, &message, MSG_NOSIGNAL);
  } while (sent < 0 && errno == EINTR);
  return sent == 1;
}

int ReceiveDescriptor(int socket) {
  char byte = 0;
  struct iovec iov = {&byte, 1};
  alignas(struct cmsghdr) char control[CMSG_SPACE(sizeof(int))];
  struct msghdr message;
  memset(&message, 0, sizeof(message));
  message.msg_iov = &iov;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof(control);
  ssize_t received;
  do {
    received = recvmsg(socket, &message, MSG_CMSG_CLOEXEC);
  } while (received < 0 && errno == EINTR);
  if (received <= 0) {
    if (received == 0) errno = 0;
    return -1;
  }
  for (struct cmsghdr* header = CMSG_FIRSTHDR(&message); header != nullptr;
       header = CMSG_NXTHDR(&message, header)) {
    if (header->cmsg_level == SOL_SOCKET && header->cmsg_type == SCM_RIGHTS &&
        header->cmsg_len == CMSG_LEN(sizeof(int))) {
      int fd;
      memcpy(&fd, CMSG_DATA(header), sizeof(int));
      return fd;
    }
  }
  errno = EPROTO;
  return -1;
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex

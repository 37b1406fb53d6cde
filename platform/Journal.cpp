#include "platform/Journal.h"

#include <sys/socket.h>
#include <sys/uio.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <vector>

namespace kolvrand::platform {

namespace {

// One socket for the process, opened at the first entry; datagrams sent from
// several threads at once do not mix.
int journalFd() {
  static const int fd = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  return fd;
}

}  // namespace

int journalSend(std::span<const std::string_view> fields, const char* socketPath) {
  const int fd = journalFd();
  if (fd < 0) return -errno;
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (std::strlen(socketPath) >= sizeof address.sun_path) return -ENAMETOOLONG;
  std::strcpy(address.sun_path, socketPath);

  static char newline = '\n';
  // Room for the binary form of every field: key, line feed, length, value,
  // line feed.
  std::vector<iovec> iov;
  iov.reserve(fields.size() * 5);
  std::vector<uint8_t> lengths(fields.size() * 8);
  for (size_t i = 0; i < fields.size(); ++i) {
    const std::string_view field = fields[i];
    auto piece = [&](const void* p, size_t n) { iov.push_back({const_cast<void*>(p), n}); };
    const size_t equals = field.find('=');
    if (equals == std::string_view::npos) return -EINVAL;
    const std::string_view value = field.substr(equals + 1);
    if (value.find('\n') == std::string_view::npos) {
      piece(field.data(), field.size());
      piece(&newline, 1);
      continue;
    }
    uint8_t* length = lengths.data() + 8 * i;
    for (int b = 0; b < 8; ++b) length[b] = static_cast<uint8_t>(uint64_t{value.size()} >> (8 * b));
    piece(field.data(), equals);
    piece(&newline, 1);
    piece(length, 8);
    piece(value.data(), value.size());
    piece(&newline, 1);
  }
  msghdr message{};
  message.msg_name = &address;
  message.msg_namelen = sizeof address;
  message.msg_iov = iov.data();
  message.msg_iovlen = iov.size();
  for (;;) {
    if (::sendmsg(fd, &message, MSG_NOSIGNAL) >= 0) return 0;
    if (errno != EINTR) return -errno;
  }
}

}  // namespace kolvrand::platform

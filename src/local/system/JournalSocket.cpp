#include "local/system/JournalSocket.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>

namespace kvr {
namespace {

constexpr std::string_view kPath = "/run/systemd/journal/socket";

/// Waits until the peer's queue has room; false if it has none until the deadline.
bool waitForRoom(int socket, std::chrono::steady_clock::time_point deadline) {
  using std::chrono::milliseconds;
  const auto left = std::chrono::ceil<milliseconds>(deadline - std::chrono::steady_clock::now()).count();
  pollfd state{socket, POLLOUT, 0};
  return ::poll(&state, 1, static_cast<int>(std::max<milliseconds::rep>(left, 0))) != 0;
}

/// What is too large for a message is sent as a sealed file in memory.
int sendAsFile(int socket, const std::string& entry) {
  const Descriptor file(::memfd_create("journal-entry", MFD_ALLOW_SEALING | MFD_CLOEXEC));
  if (!file || !writeAll(file.get(), entry)) return errno;
  if (::fcntl(file.get(), F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_WRITE | F_SEAL_SEAL) < 0)
    return errno;
  const int descriptor = file.get();
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof descriptor)] = {};
  msghdr message{};
  message.msg_control = control;
  message.msg_controllen = sizeof control;
  cmsghdr* const header = CMSG_FIRSTHDR(&message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(sizeof descriptor);
  std::memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
  return ::sendmsg(socket, &message, MSG_DONTWAIT | MSG_NOSIGNAL) < 0 ? errno : 0;
}

}  // namespace

void JournalSocket::appendField(std::string& entry, std::string_view name, std::string_view value) {
  entry += name;
  if (value.find('\n') == std::string_view::npos) {
    entry += '=';
  } else {
    entry += '\n';
    for (std::uint64_t size = value.size(), byte = 0; byte < sizeof size; ++byte, size >>= 8U) {
      entry += static_cast<char>(size & 0xFFU);
    }
  }
  entry += value;
  entry += '\n';
}

JournalSocket::Outcome JournalSocket::send(const std::string& entry,
                                           std::chrono::steady_clock::time_point deadline) {
  bool isNew = !socket_;
  if (isNew && !connect()) return Outcome::Failed;
  for (;;) {
    const int error = trySending(entry);
    if (error == 0) return Outcome::Sent;
    if (error == EINTR) continue;
    if (error == EAGAIN) {
      if (!waitForRoom(socket_.get(), deadline)) return Outcome::Full;
      continue;
    }
    // The journal may have been started anew.
    if (isNew || !connect()) return Outcome::Failed;
    isNew = true;
  }
}

bool JournalSocket::connect() {
  sockaddr_un name{};
  name.sun_family = AF_UNIX;
  std::ranges::copy(kPath, name.sun_path);
  socket_ = Descriptor(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  if (socket_ && ::connect(socket_.get(), reinterpret_cast<const sockaddr*>(&name), sizeof name) == 0)
    return true;
  socket_ = Descriptor();
  return false;
}

int JournalSocket::trySending(const std::string& entry) const {
  if (::send(socket_.get(), entry.data(), entry.size(), MSG_DONTWAIT | MSG_NOSIGNAL) >= 0) return 0;
  return errno == EMSGSIZE || errno == ENOBUFS ? sendAsFile(socket_.get(), entry) : errno;
}

}  // namespace kvr

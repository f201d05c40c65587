#pragma once

#include "local/system/Descriptor.h"

#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>

#include <cstring>
#include <filesystem>
#include <stdexcept>
#include <string>

namespace kvr::testing {

/// A socket in the file system that a service of the host would have, such as the journal's.
class DatagramSocket {
 public:
  explicit DatagramSocket(const std::filesystem::path& path) {
    sockaddr_un name{};
    name.sun_family = AF_UNIX;
    path.string().copy(name.sun_path, sizeof name.sun_path - 1);
    // Only a failing test waits this long.
    const timeval limit{60, 0};
    ::setsockopt(socket_.get(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
    if (::bind(socket_.get(), reinterpret_cast<const sockaddr*>(&name), sizeof name) < 0) {
      throw std::runtime_error("no socket at " + path.string());
    }
  }
  bool hasMessage() const { return ::recv(socket_.get(), nullptr, 0, MSG_PEEK | MSG_DONTWAIT) >= 0; }
  /// Waits for the next message; of one that is a file, for its content.
  std::string receive() const {
    std::string message(std::size_t{1} << 20U, '\0');
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))];
    iovec part{message.data(), message.size()};
    msghdr header{};
    header.msg_iov = &part;
    header.msg_iovlen = 1;
    header.msg_control = control;
    header.msg_controllen = sizeof control;
    auto size = ::recvmsg(socket_.get(), &header, MSG_CMSG_CLOEXEC);
    if (const auto* const sent = CMSG_FIRSTHDR(&header); size == 0 && sent != nullptr) {
      int file = -1;
      std::memcpy(&file, CMSG_DATA(sent), sizeof file);
      size = ::pread(Descriptor(file).get(), message.data(), message.size(), 0);
    }
    if (size < 0) throw std::runtime_error("no message came");
    message.resize(static_cast<std::size_t>(size));
    return message;
  }

 private:
  const Descriptor socket_{::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)};
};

}  // namespace kvr::testing

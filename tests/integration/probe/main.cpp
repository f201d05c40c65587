// A client for the tests of peer identity: calls methods of the agent and prints each answer as "MEMBER
// ERROR: TEXT". It takes its options from the environment, so that it can be run under any name:
//
//   KVR_PROBE_MEMBERS  the methods with their signatures: "DefaultDevice: ScheduleOutreachAfter:d"
//   KVR_PROBE_WAITS    print "ready" and wait for SIGUSR1 first
//   KVR_PROBE_LEAVES   let a child make the calls after the process that connected has ended

#include "local/buscodec/BusHandles.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <sstream>

namespace {

/// A socket connected by this process, so that the bus reports this process as the client.
int connectedSocket() {
  const std::string address = std::getenv("DBUS_SESSION_BUS_ADDRESS");
  const auto from = address.find("path=") + 5;
  sockaddr_un name{};
  name.sun_family = AF_UNIX;
  address.substr(from, address.find(',') - from).copy(name.sun_path, sizeof name.sun_path - 1);
  const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (::connect(socket, reinterpret_cast<const sockaddr*>(&name), sizeof name) == 0) return socket;
  std::perror("connect");
  std::exit(EXIT_FAILURE);
}

void waitForSignal() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGUSR1);
  sigprocmask(SIG_BLOCK, &signals, nullptr);
  std::puts("ready");
  std::fflush(stdout);
  int signal = 0;
  sigwait(&signals, &signal);
}

/// Continues in a child process once the parent has ended.
void leave() {
  const auto parent = static_cast<int>(::syscall(SYS_pidfd_open, ::getpid(), 0));
  if (::fork() != 0) ::_exit(EXIT_SUCCESS);
  pollfd ended{parent, POLLIN, 0};
  ::poll(&ended, 1, -1);
}

int append(sd_bus_message* call, char type) {
  if (type == 's') return sd_bus_message_append(call, "s", "SNPHONE00001");
  if (type == 't') return sd_bus_message_append(call, "t", std::uint64_t{1});
  if (type == 'b') return sd_bus_message_append(call, "b", 0);
  return sd_bus_message_append(call, "d", 0.0);
}

}  // namespace

int main() {
  const int socket = connectedSocket();
  if (std::getenv("KVR_PROBE_WAITS") != nullptr) waitForSignal();
  if (std::getenv("KVR_PROBE_LEAVES") != nullptr) leave();
  sd_bus* made = nullptr;
  if (sd_bus_new(&made) < 0) return EXIT_FAILURE;
  const kvr::BusRef bus(made);
  if (sd_bus_set_fd(made, socket, socket) < 0 || sd_bus_set_bus_client(made, 1) < 0 ||
      sd_bus_start(made) < 0) {
    return EXIT_FAILURE;
  }
  std::istringstream members(std::getenv("KVR_PROBE_MEMBERS"));
  for (std::string member; members >> member;) {
    const auto colon = member.find(':');
    const std::string name = member.substr(0, colon);
    sd_bus_message* call = nullptr;
    sd_bus_message_new_method_call(made, &call, "com.tarsil.kvragent", "/com/tarsil/kvragent",
                                   "com.tarsil.kvragent.KVRAgentProtocol", name.c_str());
    const kvr::BusMessageRef held(call);
    for (const char type : member.substr(colon + 1)) append(call, type);
    kvr::BusError error;
    sd_bus_message* reply = nullptr;
    sd_bus_call(made, call, 0, error.get(), &reply);
    const kvr::BusMessageRef answered(reply);
    std::printf("%s %s: %s\n", name.c_str(), reply ? "answered" : error.name(), error.message());
  }
  std::fflush(stdout);
  return EXIT_SUCCESS;
}

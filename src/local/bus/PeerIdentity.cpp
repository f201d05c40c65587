#include "local/bus/PeerIdentity.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <system_error>

namespace kvr {
namespace {

Error processError(int code, const std::string& what) {
  return {"process", code, what + ": " + std::generic_category().message(code)};
}

}  // namespace

Result<PeerIdentity> PeerIdentity::of(std::int32_t process) {
  Descriptor held(static_cast<int>(::syscall(SYS_pidfd_open, process, 0)));
  if (!held) return processError(errno, "process " + std::to_string(process) + " cannot be held");
  const std::string link = "/proc/" + std::to_string(process) + "/exe";
  const Descriptor executable(::open(link.c_str(), O_PATH | O_CLOEXEC));
  struct stat status {};
  if (!executable || ::fstat(executable.get(), &status) < 0) {
    return processError(errno, "the program of process " + std::to_string(process) + " cannot be told");
  }
  return PeerIdentity(std::move(held), FileIdentity{status.st_dev, status.st_ino});
}

bool PeerIdentity::isAlive() const {
  pollfd state{process_.get(), POLLIN, 0};
  return ::poll(&state, 1, 0) == 0;
}

}  // namespace kvr

#include "client/kvrctl/Output.h"

#include "client/AgentClient.h"
#include "client/kvrctl/Terminal.h"
#include "local/device/DeviceRoot.h"

#include <cstdio>
#include <filesystem>

namespace kvr::client {
namespace {

std::string ownPath() {
  std::error_code unknown;
  return std::filesystem::read_symlink("/proc/self/exe", unknown).string();
}

Status statusOf(const Error& error) {
  if (error.domain != kErrorDomain) return kFailed;
  switch (error.code) {
    case NoBus:
    case AgentUnreachable:
      return kUnreachable;
    case Refused:
      return kRefused;
    default:
      return kFailed;
  }
}

}  // namespace

void say(const std::string& message) { std::fprintf(stderr, "kvrctl: %s\n", printable(message).c_str()); }

std::string cureFor(const Error& error) {
  if (error.domain != kErrorDomain) return {};
  switch (error.code) {
    case NoBus:
      return "log in to a session, or set DBUS_SESSION_BUS_ADDRESS";
    case AgentUnreachable:
      return "start it with systemctl --user start kvragent, or see what kvrctl doctor finds";
    case Refused:
      return "grant it to " + ownPath() + " in " + DeviceRoot::directoryFromEnvironment() +
             "/Entitlements.plist, or in the device root that the agent was started with";
    default:
      return {};
  }
}

Status fail(const Error& error) {
  const Status status = statusOf(error);
  std::string line = error.message;
  if (status == kRefused) line = "the agent refuses this program: " + line;
  if (error.domain == kErrorDomain && error.code == AgentUnreachable) {
    line = "the agent cannot be reached: " + line;
  }
  const std::string cure = cureFor(error);
  say(cure.empty() ? line : line + "; " + cure);
  return status;
}

Status print(const std::string& text, Status status) {
  if (std::fwrite(text.data(), 1, text.size(), stdout) == text.size() && std::fflush(stdout) == 0) {
    return status;
  }
  say("the output cannot be written");
  return kFailed;
}

Status print(const Result<std::string>& text, Status status) {
  return text ? print(*text, status) : fail(text.error());
}

}  // namespace kvr::client

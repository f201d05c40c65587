#include "core/agent/ServiceDelegate.h"

#include "core/agent/KVRAgent.h"
#include "platform/names/Names.h"
#include "platform/text/UTF8.h"

#include <array>

namespace kvr {
namespace {

constexpr std::size_t kLongestExecutablePath = 4096;

bool isTrueNumber(const Value& value) { return (value.isBool() || value.isNumber()) && value.asBool(); }

}  // namespace

bool ServiceDelegate::shouldAcceptNewConnection(ServiceConnection& connection) {
  if (!isTrueNumber(connection.valueForEntitlement(names::kEntitlement))) {
    platform_.log.error("Rejecting connection to kvragent: missing entitlement '%@'", names::kEntitlement);
    return false;
  }
  const auto process = connection.processIdentifier();
  const auto bundle = _bundleForPID(process);
  const auto identifier = bundle ? bundle->identifier : std::nullopt;
  platform_.log.standard("connection added from %d with calling process: %@", process, identifier);
  connection.setExportedInterface(agentServiceInterface());
  connection.setExportedObject(
      newAgentServiceObject(platform_.log, KVRAgent::initWithCallingProcessBundleID(platform_, identifier)));
  connection.resume();
  return true;
}

std::optional<Bundle> ServiceDelegate::_bundleForPID(std::int32_t process) const {
  std::array<char, kLongestExecutablePath> buffer{};
  const auto length = platform_.processes.executablePath(process, buffer);
  if (length <= 0 || static_cast<std::size_t>(length) > buffer.size()) return std::nullopt;
  const std::string path(buffer.data(), static_cast<std::size_t>(length));
  if (!isUTF8(path)) return std::nullopt;
  const auto location = platform_.processes.bundleLocationForExecutable(path);
  return location ? platform_.processes.bundleAt(*location) : std::nullopt;
}

}  // namespace kvr

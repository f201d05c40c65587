#include "local/device/LocalNetwork.h"

#include <algorithm>
#include <array>
#include <fstream>
#include <string_view>
#include <utility>

namespace kvr {
namespace {

constexpr const char* kFile = "Network.plist";

constexpr std::string_view kOperationalState = "OPER_STATE=";
/// The operational states in which no link has an address.
constexpr std::array<std::string_view, 6> kUnreachable{"missing", "off",     "no-carrier",
                                                       "dormant", "carrier", "degraded-carrier"};

bool isHostReachable(const std::string& path) {
  std::ifstream state(path);
  for (std::string line; std::getline(state, line);) {
    if (!line.starts_with(kOperationalState)) continue;
    return std::ranges::find(kUnreachable, line.substr(kOperationalState.size())) == kUnreachable.end();
  }
  return true;
}

}  // namespace

LocalNetwork::LocalNetwork(EventLoop& loop, Log& log, const DeviceRoot& root,
                           const std::function<void(bool)>& changed, std::string hostState)
    : root_(root),
      hostState_(std::move(hostState)),
      ownWatch_(loop, log, root.pathOf(kFile), [this, changed](std::size_t) { changed(isReachable()); }),
      hostWatch_(loop, log, hostState_, [this, changed](std::size_t) { changed(isReachable()); }) {}

bool LocalNetwork::isReachable() const { return isReachable(root_.dictionary(kFile), hostState_); }

bool LocalNetwork::isReachable(const Value& described, const std::string& hostState) {
  const Value& reachable = described["reachable"];
  return reachable.isBool() ? reachable.boolean() : isHostReachable(hostState);
}

}  // namespace kvr

#include "kvr-simulate/Clients.h"

#include "core/agent/AgentKeys.h"
#include "core/warranty/LookupPolicy.h"
#include "platform/names/Names.h"

#include <algorithm>
#include <limits>

namespace kvr::simulate {
namespace {

constexpr const char* kDismiss = "DismissFollowUpForSerialNumber";
constexpr double kLimit = 3 * 3600;  ///< seconds until an answer must have come, the longest delay included

const std::vector<std::string> kMembers{"ScheduleOutreach",
                                        "ScheduleOutreachAfter",
                                        "TarsilAccountAdded",
                                        "CheckIsAvailableInStore",
                                        "AppSupportAvailability",
                                        "ReadWebURLOverride",
                                        "DefaultDevice",
                                        "PairedDevices",
                                        "GetDefaultDeviceInfoUsingPolicy",
                                        "GetDeviceInfoForSerialNumber",
                                        "GetDeviceInfoForSerialNumber",
                                        "GetAllDeviceInfosUsingPolicy",
                                        "GetAllDeviceInfosUsingPolicy",
                                        kDismiss};

std::uint64_t policyIn(const Value& value) { return static_cast<std::uint64_t>(value.asInteger()); }

}  // namespace

Value::Array Clients::argumentsFor(const std::string& member, Dice& dice, std::string serialNumber) {
  if (dice.happens(0.1)) {
    serialNumber = dice.oneOf<std::string>(
        {"", "SNSTRANGER", "a/b", std::string("SN\0X", 4), std::string(200, 'x'), "\xC3\xA9"});
  }
  const auto policy = dice.oneOf<std::int64_t>({0, 0, 1, 1, 2, 2, 7});
  if (member == "ScheduleOutreachAfter") {
    return {dice.oneOf({0.0, 60.0, 86400.0, 1e9, -5.0, 1e300, std::numeric_limits<double>::quiet_NaN()})};
  }
  if (member == "CheckIsAvailableInStore" || member == "AppSupportAvailability") {
    return {"com.tarsil.supportapp"};
  }
  if (member == "GetDefaultDeviceInfoUsingPolicy") return {policy};
  if (member == "GetDeviceInfoForSerialNumber") return {serialNumber, policy};
  if (member == "GetAllDeviceInfosUsingPolicy") return {policy, dice.happens(0.5)};
  if (member == kDismiss) return {serialNumber};
  return {};
}

std::shared_ptr<SimulatedServiceConnection> Clients::connection(Dice& dice, SimulatedPlatform& platform) {
  if (!connections_.empty() && dice.happens(0.5)) return dice.oneOf(connections_);
  SimulatedPeer peer;
  if (!dice.happens(0.05)) peer.entitlements = {{names::kEntitlement, true}};
  connections_.push_back(platform.services.connect(names::kAgent, peer));
  return connections_.back();
}

std::string Clients::ask(Dice& dice, SimulatedPlatform& platform, const std::string& serialNumber) {
  const auto member = dice.oneOf(kMembers);
  auto arguments = argumentsFor(member, dice, serialNumber);
  std::string text = member + " " + describe(Value(arguments));
  const auto asked = connection(dice, platform);
  open_.push_back({member, arguments, asked->invoke(member, arguments), world_.now, kLimit});
  if (member == kDismiss) invariants_.dismissalAsked(arguments[0].string());
  ++invariants_.figures.calls;
  invariants_.excuseRuns();
  if (dice.happens(0.1)) {
    asked->disconnect();
    std::erase(connections_, asked);
    text += ", and is gone";
  }
  return text;
}

std::shared_ptr<const SimulatedServiceConnection::Call> Clients::invoke(SimulatedPlatform& platform,
                                                                        const std::string& member,
                                                                        Value::Array arguments) {
  const auto asked = platform.services.connect(names::kAgent, {{{names::kEntitlement, true}}});
  auto call = asked->invoke(member, arguments);
  // In the middle of the agent's work, others may have run since, and the process may have ended.
  if (!invariants_.isWatching()) return call;
  connections_.push_back(asked);
  open_.push_back({member, std::move(arguments), call, world_.now, kLimit});
  return call;
}

void Clients::lieInWait(Dice& dice) {
  if (dice.happens(0.2)) {
    dismissesSeen_ = dice.number();
  } else {
    schedulesAfter_ = dice.oneOf({60.0, 60.0, 86400.0});
  }
}

void Clients::lieInWaitNoLonger() {
  dismissesSeen_.reset();
  schedulesAfter_.reset();
}

void Clients::followUpsSeen(SimulatedPlatform& platform, const std::vector<FollowUpItem>& pending) {
  if (!dismissesSeen_ || pending.empty() || !invariants_.isWatching()) return;
  const auto& item = pending[*std::exchange(dismissesSeen_, std::nullopt) % pending.size()];
  const auto serialNumber = item.userInfo.find(names::kFollowUpSerialNumber);
  if (serialNumber == item.userInfo.end()) return;
  invariants_.dismissalAsked(serialNumber->second.string());
  invoke(platform, kDismiss, {serialNumber->second});
}

void Clients::registering(SimulatedPlatform& platform, const std::string& activity) {
  if (!schedulesAfter_ || activity != names::kOutreach || !invariants_.isWatching()) return;
  invariants_.excuseRuns();
  invoke(platform, "ScheduleOutreachAfter", {*std::exchange(schedulesAfter_, std::nullopt)});
}

void Clients::checkAnswers() {
  std::erase_if(open_, [this](const OpenCall& call) {
    const bool isAnswered = call.call->reply.has_value();
    if (isAnswered) checkAnswer(call);
    if (!isAnswered && !call.call->isRefused && world_.now > call.made + call.limit) {
      invariants_.report("every call is answered", call.member + " " + describe(Value(call.arguments)));
    }
    return isAnswered || call.call->isRefused;
  });
}

void Clients::checkAnswer(const OpenCall& call) {
  const auto& reply = *call.call->reply;
  if (call.member == kDismiss) invariants_.dismissalAnswered(call.arguments[0].string());
  if (call.member == "GetDefaultDeviceInfoUsingPolicy") {
    checkInfo(call, reply, world_.phone, policyIn(call.arguments[0]));
  } else if (call.member == "GetDeviceInfoForSerialNumber") {
    checkInfo(call, reply, call.arguments[0].string(), policyIn(call.arguments[1]));
  } else if (call.member == "GetAllDeviceInfosUsingPolicy") {
    if (!reply.isArray()) return invariants_.report("answers are right", "no list of devices");
    std::vector<std::string> seen;
    for (const auto& info : reply.array()) {
      const auto serialNumber = info["device"]["serialNumber"].stringIfAny().value_or("");
      if (std::ranges::find(seen, serialNumber) != seen.end()) {
        invariants_.report("answers are right", "a device comes twice");
      }
      seen.push_back(serialNumber);
      checkInfo(call, info, serialNumber, policyIn(call.arguments[0]));
    }
    if (std::ranges::find(seen, world_.phone) == seen.end()) {
      invariants_.report("answers are right", "the phone is missing");
    }
  }
}

void Clients::checkInfo(const OpenCall& call, const Value& info, const std::string& serialNumber,
                        std::uint64_t policy) {
  if (!info.isDictionary()) return invariants_.report("answers are right", call.member + ": no record");
  const auto& tree = info["warranty"]["DictionaryRepresentation"];
  if (tree.isNull()) return;
  const auto* const offer = world_.service.find(tree["zubLocalizedOfferLabel"]);
  const bool isCacheOnly = policy != LookupPolicy::kDefault && policy != LookupPolicy::kRefresh;
  if (isCacheOnly && !world_.hasAccount && world_.accountChanged < call.made) {
    invariants_.report("answers are right", "a signed-out owner's warranty is shown");
  }
  if (offer == nullptr) return;
  if (offer->serialNumber != serialNumber) {
    invariants_.report("answers are right", "another device's warranty");
  }
  if (policy == LookupPolicy::kRefresh && offer->lastServed < call.made) {
    invariants_.report("answers are right", "a refresh answered what was known before");
  }
}

std::set<std::string> Clients::serialNumbersToDismiss() const {
  std::set<std::string> serialNumbers;
  for (const auto& call : open_) {
    if (call.member == kDismiss) serialNumbers.insert(call.arguments[0].string());
  }
  return serialNumbers;
}

void Clients::excuse(double seconds) {
  for (auto& call : open_) call.limit += seconds;
}

void Clients::processEnded() {
  open_.clear();
  connections_.clear();
}

}  // namespace kvr::simulate

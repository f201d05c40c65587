#include "client/ConnectionState.h"

#include "client/AgentFailures.h"
#include "platform/names/Names.h"

#include <algorithm>
#include <cstdint>
#include <utility>

namespace kvr::client {

using namespace bus;  // NOLINT(google-build-using-namespace)

namespace {

/// How many messages one `dispatch` takes, so that a flood leaves the program's loop some time.
constexpr int kMostMessages = 256;

std::vector<std::string> textsIn(sd_bus_message* message) {
  std::vector<std::string> texts;
  const char* text = nullptr;
  sd_bus_message_enter_container(message, 'a', "s");
  while (sd_bus_message_read_basic(message, 's', &text) > 0) texts.emplace_back(text);
  sd_bus_message_exit_container(message);
  return texts;
}

}  // namespace

AgentConnection::State::State(sd_bus* bus) : bus_(bus) {
  sd_bus_slot* slot = nullptr;
  sd_bus_add_filter(bus, &slot, handleAny, this);
  filter_.reset(slot);
}

std::optional<std::chrono::microseconds> AgentConnection::State::timeout() const {
  using std::chrono::microseconds;
  if (!ready_.empty()) return microseconds(0);
  std::optional<microseconds> least;
  const auto now = Clock::now();
  const auto consider = [&](microseconds wait) {
    wait = std::max(wait, microseconds(0));
    least = least ? std::min(*least, wait) : wait;
  };
  for (const auto& [number, open] : open_) {
    if (open.end) consider(std::chrono::ceil<microseconds>(*open.end - now));
  }
  std::uint64_t until = UINT64_MAX;  // on the monotonic clock, as `Clock`
  if (!isLost_ && sd_bus_get_timeout(bus(), &until) >= 0 && until != UINT64_MAX) {
    const auto at = std::chrono::duration_cast<microseconds>(now.time_since_epoch());
    consider(microseconds(static_cast<std::int64_t>(until)) - at);
  }
  return least;
}

bool AgentConnection::State::dispatch() {
  receive();
  expire();
  // Completions that are added meanwhile wait for the next time.
  for (std::size_t left = ready_.size(); left > 0 && !isClosed_; --left) {
    const auto next = std::move(ready_.front());
    ready_.pop_front();
    next();
  }
  return !isClosed_ && (!isLost_ || !ready_.empty());
}

void AgentConnection::State::receive() {
  for (int left = kMostMessages; left > 0 && !isLost_; --left) {
    const int r = sd_bus_process(bus(), nullptr);
    if (r < 0) lose();
    if (r <= 0) return;
  }
}

void AgentConnection::State::expire() {
  const auto now = Clock::now();
  std::vector<Call> late;
  for (const auto& [number, open] : open_) {
    if (open.end && *open.end <= now) late.push_back(number);
  }
  for (const Call number : late) settle(number, failure(NoAnswer, "the agent did not answer in time"));
}

void AgentConnection::State::lose() {
  isLost_ = true;
  const Error lost = failure(NoBus, "the session bus has gone");
  while (!open_.empty()) settle(open_.begin()->first, lost);
  owner_.clear();
  tell(lost);
}

void AgentConnection::State::settle(Call number, Result<Value> answer) {
  auto found = open_.extract(number);
  if (found.empty()) return;
  ready_.emplace_back([completion = std::move(found.mapped().completion), answer = std::move(answer)] {
    if (completion) completion(answer);
  });
}

AgentConnection::Call AgentConnection::State::call(const char* member,
                                                   const std::vector<AgentClient::Argument>& arguments,
                                                   const char* replyType, Completion<Value> completion,
                                                   Limit limit) {
  const Call number = ++lastCall_;
  Open& open = open_[number];
  open.owner = this;
  open.number = number;
  open.replyType = replyType;
  open.completion = std::move(completion);
  // A limit beyond a year is none; added to the present, the greatest would overflow.
  if (limit < std::chrono::hours(24 * 365)) open.end = Clock::now() + limit;
  if (isLost_) {
    settle(number, failure(NoBus, "the session bus has gone"));
    return number;
  }
  const Result<BusMessageRef> message = newCall(bus(), member, arguments);
  if (!message) {
    settle(number, message.error());
    return number;
  }
  sd_bus_slot* slot = nullptr;
  const int r = sd_bus_call_async(bus(), &slot, message->get(), handleAnswer, &open, UINT64_MAX);
  open.slot.reset(slot);
  if (r < 0) settle(number, failureOf(r, BusError()));
  return number;
}

int AgentConnection::State::handleAnswer(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    const Open& open = *static_cast<Open*>(userdata);
    open.owner->settle(open.number, valueIn(message, open.replyType));
    return 0;
  });
}

bool AgentConnection::State::cancel(Call call) {
  if (!open_.contains(call)) return false;
  settle(call, failure(Cancelled, "the call was cancelled"));
  return true;
}

void AgentConnection::State::close() {
  isClosed_ = true;
  while (!open_.empty()) settle(open_.begin()->first, failure(Cancelled, "the connection was destroyed"));
  unwatch();
  for (const auto& each : std::exchange(ready_, {})) each();
}

void AgentConnection::State::watch(Completion<Change> handler) {
  unwatch();
  handler_ = std::move(handler);
  if (isLost_) return tell(failure(NoBus, "the session bus has gone"));
  // First this, then the question, so that no change of the owner is missed in between.
  const std::string rule =
      "type='signal',sender='org.freedesktop.DBus',interface='org.freedesktop.DBus',member='NameOwnerChanged'"
      ",arg0='" +
      std::string(names::kAgent) + "'";
  sd_bus_slot* slot = nullptr;
  sd_bus_add_match_async(bus(), &slot, rule.c_str(), handleOwnerChanged, nullptr, this);
  ownerWatch_.reset(slot);
  askOwner();
}

void AgentConnection::State::unwatch() {
  ++watch_;
  handler_ = nullptr;
  ownerWatch_.reset();
  question_.reset();
  const std::string owner = std::exchange(owner_, "");
  if (owner.empty() || isLost_) return;
  sd_bus_message* made = nullptr;
  const int r = sd_bus_message_new_method_call(bus(), &made, owner.c_str(), names::kObjectPath,
                                               names::kChangesInterface, "Unsubscribe");
  const BusMessageRef message(made);
  if (r >= 0) sd_bus_send(bus(), made, nullptr);
}

void AgentConnection::State::askOwner() {
  sd_bus_message* made = nullptr;
  const int r = sd_bus_message_new_method_call(bus(), &made, kBusName, kBusPath, kBusName, "GetNameOwner");
  const BusMessageRef question(made);
  if (r >= 0 && sd_bus_message_append(made, "s", names::kAgent) >= 0) ask(made, handleOwner);
}

/// Asks without a time limit; the answer may take as long as the agent, or the program's loop, does.
void AgentConnection::State::ask(sd_bus_message* question, sd_bus_message_handler_t handler) {
  sd_bus_slot* slot = nullptr;
  sd_bus_call_async(bus(), &slot, question, handler, this, UINT64_MAX);
  question_.reset(slot);
}

int AgentConnection::State::handleOwner(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    State& self = *static_cast<State*>(userdata);
    const char* owner = nullptr;
    if (!isFromBus(message)) {
      self.askOwner();
    } else if (sd_bus_message_read(message, "s", &owner) >= 0) {
      self.setOwner(owner);
    }
    return 0;
  });
}

int AgentConnection::State::handleOwnerChanged(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    const char* name = nullptr;
    const char* before = nullptr;
    const char* now = nullptr;
    const bool isTrue = isFromBus(message) && sd_bus_message_read(message, "sss", &name, &before, &now) >= 0;
    if (isTrue) static_cast<State*>(userdata)->setOwner(now);
    return 0;
  });
}

void AgentConnection::State::setOwner(const std::string& owner) {
  if (owner == owner_) return;
  owner_ = owner;
  question_.reset();
  if (!owner_.empty()) subscribe();
}

/// Asks the agent that is running, by its unique name: that starts none.
void AgentConnection::State::subscribe() {
  sd_bus_message* made = nullptr;
  const int r = sd_bus_message_new_method_call(bus(), &made, owner_.c_str(), names::kObjectPath,
                                               names::kChangesInterface, "Subscribe");
  const BusMessageRef question(made);
  if (r >= 0) ask(made, handleSubscribed);
}

int AgentConnection::State::handleSubscribed(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    State& self = *static_cast<State*>(userdata);
    const char* const sender = sd_bus_message_get_sender(message);
    const bool isFromAgent = sender && sender == self.owner_;
    if (!isFromAgent && !isFromBus(message)) {
      self.subscribe();  // somebody else's answer counts for nothing
    } else if (const auto answer = valueIn(message, "b"); answer) {
      self.tell(Change{.isBeginning = true, .records = {}, .followUps = {}, .devices = true});
    } else if (isFromAgent) {
      self.tell(answer.error());
    }
    return 0;
  });
}

int AgentConnection::State::handleAny(sd_bus_message* message, void* userdata, sd_bus_error*) {
  if (!sd_bus_message_is_signal(message, names::kChangesInterface, names::kChangedMember)) return 0;
  return guardedBusCallback([&] {
    State& self = *static_cast<State*>(userdata);
    const char* const sender = sd_bus_message_get_sender(message);
    if (self.handler_ && sender && sender == self.owner_) self.take(message);
    return 1;
  });
}

void AgentConnection::State::take(sd_bus_message* signal) {
  if (!sd_bus_message_has_signature(signal, "asasb")) return;
  Change change;
  change.records = textsIn(signal);
  change.followUps = textsIn(signal);
  int devices = 0;
  sd_bus_message_read_basic(signal, 'b', &devices);
  change.devices = devices != 0;
  tell(std::move(change));
}

void AgentConnection::State::tell(Result<Change> change) {
  if (!handler_) return;
  ready_.emplace_back([this, watch = watch_, change = std::move(change)] {
    if (watch != watch_) return;
    const auto handler = handler_;  // it may replace itself
    handler(change);
  });
}

}  // namespace kvr::client

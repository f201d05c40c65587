#include "simulated/SimulatedServiceListeners.h"

#include <algorithm>
#include <stdexcept>

namespace kvr {

class SimulatedServiceListeners::Listener : public ServiceListener {
 public:
  Listener(SimulatedServiceListeners& listeners, std::string name)
      : listeners_(listeners), name_(std::move(name)), queue_(listeners.queues_.newSerialQueue(name_)) {}
  ~Listener() override {
    if (listeners_.isListening(name_) && listeners_.listeners_[name_] == this)
      listeners_.listeners_.erase(name_);
    *alive_ = false;
  }
  Listener(const Listener&) = delete;
  Listener& operator=(const Listener&) = delete;

  void setDelegate(ServiceListenerDelegate& delegate) override { delegate_ = &delegate; }
  void resume(const ServiceInterface& /*interface*/) override {
    if (delegate_ == nullptr) throw std::logic_error("a listener without a delegate was resumed");
    listeners_.listeners_[name_] = this;
  }

  void offer(const std::shared_ptr<SimulatedServiceConnection>& connection,
             std::function<void(bool accepted)> decided) {
    queue_->async([this, alive = alive_, connection, decided = std::move(decided)] {
      if (*alive) decided(delegate_->shouldAcceptNewConnection(*connection));
    });
  }

 private:
  SimulatedServiceListeners& listeners_;
  const std::string name_;
  const WorkQueueRef queue_;
  const std::shared_ptr<bool> alive_ = std::make_shared<bool>(true);
  ServiceListenerDelegate* delegate_ = nullptr;
};

SimulatedServiceConnection::SimulatedServiceConnection(WorkQueues& queues, Log& log, SimulatedPeer peer)
    : log_(log), queue_(queues.newSerialQueue("connection")), peer_(std::move(peer)) {}

Value SimulatedServiceConnection::valueForEntitlement(std::string_view entitlement) const {
  const auto found = peer_.entitlements.find(entitlement);
  return found == peer_.entitlements.end() ? Value() : found->second;
}

std::shared_ptr<const SimulatedServiceConnection::Call> SimulatedServiceConnection::invoke(
    std::string member, Value::Array arguments) {
  auto call = std::make_shared<Call>();
  Pending pending{std::move(member), std::move(arguments), call};
  if (!accepted_) {
    pending_.push_back(std::move(pending));
  } else {
    queue_->async([self = shared_from_this(), pending = std::move(pending)] { self->serve(pending); });
  }
  return call;
}

void SimulatedServiceConnection::disconnect() {
  queue_->async([self = shared_from_this()] {
    self->isGone_ = true;
    self->object_ = nullptr;
  });
}

void SimulatedServiceConnection::decide(bool accepted) {
  accepted_ = accepted;
  for (auto& pending : std::exchange(pending_, {})) {
    queue_->async([self = shared_from_this(), pending = std::move(pending)] { self->serve(pending); });
  }
}

void SimulatedServiceConnection::serve(const Pending& pending) {
  if (!*accepted_ || isGone_) {
    pending.call->isRefused = true;
    return;
  }
  if (!isResumed_ || !interface_ || !object_)
    throw std::logic_error("a connection was accepted but not set up");
  const auto& methods = interface_->methods;
  const auto found = std::find_if(methods.begin(), methods.end(), [&](const ServiceMethod& method) {
    return method.member == pending.member;
  });
  if (found == methods.end()) throw std::logic_error("no such member: " + pending.member);
  if (found->in.size() != pending.arguments.size())
    throw std::logic_error("wrong arguments: " + pending.member);
  const auto object = object_;
  object->invoke(
      static_cast<std::size_t>(found - methods.begin()), pending.arguments,
      ServiceReply(log_, found->member, [call = pending.call](const Value& reply) { call->reply = reply; }));
}

std::unique_ptr<ServiceListener> SimulatedServiceListeners::newListener(std::string name) {
  return std::make_unique<Listener>(*this, std::move(name));
}

std::shared_ptr<SimulatedServiceConnection> SimulatedServiceListeners::connect(const std::string& name,
                                                                               SimulatedPeer peer) {
  const auto found = listeners_.find(name);
  if (found == listeners_.end()) throw std::logic_error("nobody listens as " + name);
  auto connection = std::make_shared<SimulatedServiceConnection>(queues_, log_, std::move(peer));
  found->second->offer(connection, [connection](bool accepted) { connection->decide(accepted); });
  return connection;
}

bool SimulatedServiceListeners::isListening(const std::string& name) const {
  return listeners_.contains(name);
}

}  // namespace kvr

#include "local/bus/BusClient.h"

#include "local/bus/PeerIdentity.h"
#include "local/buscodec/BusCodec.h"
#include "platform/names/Names.h"

#include <unistd.h>

#include <utility>

namespace kvr {
namespace {

/// The open calls of one client (waiting or being served), and the bytes of their arguments; beyond that,
/// calls get an error.
constexpr FairLimit kCalls{1024, 8192, 16};
constexpr FairLimit kBytes{std::size_t{4} << 20, std::size_t{32} << 20, std::size_t{16} << 10};

/// Delivers the answer of one call, from any thread. If destroyed without an answer, the caller gets an
/// error.
class CallReply {
 public:
  CallReply(std::shared_ptr<BusThread> thread, std::weak_ptr<BusClient> client, std::uint64_t call)
      : thread_(std::move(thread)), client_(std::move(client)), call_(call) {}
  CallReply(const CallReply&) = delete;
  CallReply& operator=(const CallReply&) = delete;
  ~CallReply() {
    try {
      if (!given_) give(std::nullopt);
    } catch (...) {  // NOLINT(bugprone-empty-catch): out of memory, so the caller gets no answer
    }
  }

  void give(std::optional<Value> value) {
    given_ = true;
    thread_->post([client = client_, call = call_, value = std::move(value)] {
      if (const auto held = client.lock()) held->answer(call, value);
    });
  }

 private:
  const std::shared_ptr<BusThread> thread_;
  const std::weak_ptr<BusClient> client_;
  const std::uint64_t call_;
  bool given_ = false;
};

/// Runs `work` on the client that a callback belongs to and keeps the client alive meanwhile.
template <class Do>
int onClient(void* userdata, const Do& work) {
  return guardedBusCallback([&] {
    work(*static_cast<BusClient*>(userdata)->shared_from_this());
    return 0;
  });
}

}  // namespace

BusClient::BusClient(std::shared_ptr<const Context> context, std::string uniqueName)
    : context_(std::move(context)), name_(std::move(uniqueName)) {}

std::optional<Error> BusClient::begin(sd_bus* bus) {
  // Watch first, so that a client that leaves after the bus has answered about it is noticed.
  const std::string rule =
      "type='signal',sender='org.freedesktop.DBus',interface='org.freedesktop.DBus',member='NameOwnerChanged'"
      ",arg0='" +
      name_ + "'";
  sd_bus_slot* slot = nullptr;
  int r = sd_bus_add_match_async(bus, &slot, rule.c_str(), handleOwnerChanged, handleWatched, this);
  watch_.reset(slot);
  if (r >= 0) r = ask(bus, "GetConnectionCredentials", handleCredentials);
  if (r < 0) return busError(r, "the bus cannot be asked about " + name_);
  return std::nullopt;
}

int BusClient::ask(sd_bus* bus, const char* member, sd_bus_message_handler_t handler) {
  sd_bus_slot* slot = nullptr;
  const int r = sd_bus_call_method_async(bus, &slot, kBusName, kBusPath, kBusName, member, handler, this, "s",
                                         name_.c_str());
  question_.reset(slot);
  return r;
}

int BusClient::handleWatched(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return onClient(userdata, [message](BusClient& self) {
    if (!isFromBus(message) || !sd_bus_message_is_method_error(message, nullptr)) return;
    if (self.state_ == State::Gone) return;
    // Without the watch, the client could never be dropped.
    self.refuse("it cannot be watched");
    self.context_->forget(self.name_);
  });
}

int BusClient::handleOwnerChanged(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return onClient(userdata, [message](BusClient& self) {
    const char* name = nullptr;
    const char* oldOwner = nullptr;
    const char* newOwner = nullptr;
    if (sd_bus_message_read(message, "sss", &name, &oldOwner, &newOwner) < 0 || name != self.name_) return;
    if (*newOwner == '\0' && self.state_ != State::Gone) self.context_->forget(self.name_);
  });
}

int BusClient::handleCredentials(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return onClient(userdata, [message](BusClient& self) {
    if (self.isBusAnswer(message, "GetConnectionCredentials", handleCredentials)) self.identified(message);
  });
}

int BusClient::handleStillThere(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return onClient(userdata, [message](BusClient& self) {
    if (self.isBusAnswer(message, "GetNameOwner", handleStillThere)) self.confirmed(message);
  });
}

/// Whether the answer comes from the bus. If not, asks the bus again.
bool BusClient::isBusAnswer(sd_bus_message* reply, const char* member, sd_bus_message_handler_t handler) {
  if (isFromBus(reply)) return true;
  if (state_ == State::Identifying && ask(sd_bus_message_get_bus(reply), member, handler) < 0) {
    refuse("the bus cannot be asked about it");
  }
  return false;
}

void BusClient::identified(sd_bus_message* reply) {
  if (state_ != State::Identifying) return;
  if (sd_bus_message_is_method_error(reply, SD_BUS_ERROR_NAME_HAS_NO_OWNER)) return context_->forget(name_);
  const Result<Value> credentials = readBusValue(reply, "a{sv}");
  const Value user = credentials ? (*credentials)["UnixUserID"] : Value();
  const Value process = credentials ? (*credentials)["ProcessID"] : Value();
  if (user.kind() != Value::Kind::Int || process.kind() != Value::Kind::Int) {
    distrust_ = "the bus does not tell its user and process";
  } else if (user.integer() != static_cast<std::int64_t>(::geteuid())) {
    distrust_ = "it belongs to another user";
  } else {
    process_ = static_cast<std::int32_t>(process.integer());
  }
  isDeciding_ = true;
  context_->listenerQueue->async([self = shared_from_this()] { self->decide(); });
}

void BusClient::decide() {
  const Result<PeerIdentity> peer =
      distrust_.empty() ? PeerIdentity::of(process_) : Result<PeerIdentity>(Error{"process", 0, distrust_});
  if (peer) {
    executable_ = peer->executable();
  } else if (distrust_.empty()) {
    distrust_ = describe(peer.error());
  }
  // A peer whose identity is in doubt has no entitlements. The delegate is asked all the same, because it
  // logs the missing one.
  bool accepted = context_->delegate->accepts(*this);
  if (accepted && distrust_.empty() && !peer->isAlive()) distrust_ = "its process has ended";
  accepted = accepted && distrust_.empty();
  if (accepted) {
    queue_ = context_->queues.newSerialQueue(std::string(names::kAgent) + ".connection" + name_);
  } else {
    object_.reset();
  }
  context_->thread->post([self = shared_from_this(), accepted] { self->decided(accepted); });
}

void BusClient::decided(bool accepted) {
  isDeciding_ = false;
  if (state_ == State::Gone) return release();
  if (!accepted) return refuse(distrust_);
  if (!isExported_ || !object_) return refuse("nothing is exported to it");
  const int r = ask(sd_bus_slot_get_bus(watch_.get()), "GetNameOwner", handleStillThere);
  if (r < 0) refuse(describe(busError(r, "the bus cannot be asked whether it is still there")));
}

void BusClient::confirmed(sd_bus_message* reply) {
  if (state_ != State::Identifying) return;
  if (sd_bus_message_is_method_error(reply, nullptr)) return refuse("it has left the bus");
  state_ = State::Admitted;
  serveWaiting();
}

/// `why` is logged; empty if the delegate has already logged the reason. The peer is told which entitlement
/// it lacks.
void BusClient::refuse(const std::string& why) {
  if (!why.empty()) context_->log.error("Refusing connection %@: %@", name_, why);
  state_ = State::Refused;
  refusal_ = missingEntitlement_.empty() ? "the connection is refused"
                                         : "missing entitlement '" + missingEntitlement_ + "'";
  serveWaiting();
  release();
}

void BusClient::receive(sd_bus_message* message) {
  if (state_ == State::Refused) return failBusCall(message, kBusErrorRefused, refusal_);
  if (waiting_.size() + open_.size() >= kCalls.when(*context_->openCalls)) {
    return failBusCall(message, kBusErrorTooMany, "too many calls of this connection are unanswered");
  }
  const char* const interface = sd_bus_message_get_interface(message);
  const bool isAboutChanges = interface && std::string_view(interface) == changesInterface().name;
  Result<BusCall> call = readBusCall(message, isAboutChanges ? changesInterface() : context_->interface);
  if (!call) return failBusCall(message, call.error().domain.c_str(), call.error().message);
  if (call->bytes > 0 && bytes_ + call->bytes > kBytes.when(*context_->openBytes)) {
    return failBusCall(message, kBusErrorTooMany, "the unanswered calls of this connection are too large");
  }
  ++*context_->openCalls;
  bytes_ += call->bytes;
  *context_->openBytes += call->bytes;
  waiting_.push_back(*std::move(call));
  serveWaiting();
}

void BusClient::serveWaiting() {
  if (state_ == State::Identifying || (state_ == State::Admitted && !isResumed_)) return;
  while (!waiting_.empty()) {
    BusCall call = std::move(waiting_.front());
    waiting_.pop_front();
    if (state_ == State::Admitted) {
      serve(std::move(call));
    } else {
      settle(call);
      failBusCall(call.message.get(), kBusErrorRefused, refusal_);
    }
  }
}

/// Removes the call from the counts of open calls.
void BusClient::settle(const BusCall& call) {
  --*context_->openCalls;
  bytes_ -= call.bytes;
  *context_->openBytes -= call.bytes;
}

void BusClient::serve(BusCall call) {
  const std::uint64_t number = ++lastCall_;
  const std::size_t index = call.index;
  if (call.interface == &changesInterface()) {
    const bool isNews = observe(call);
    open_.emplace(number, std::move(call));
    return answer(number, isNews);
  }
  const auto reply = std::make_shared<CallReply>(context_->thread, weak_from_this(), number);
  const ServiceReply completion(context_->log, context_->interface.methods[index].member,
                                [reply](Value value) { reply->give(std::move(value)); });
  // A call that is still queued when the client leaves is not carried out.
  queue_->async([object = object_, index, arguments = std::weak_ptr(call.arguments), completion] {
    const auto held = arguments.lock();
    if (!held) return completion({});
    object->invoke(index, *held, completion);
  });
  open_.emplace(number, std::move(call));
}

/// Carries out a call of `changesInterface`.
bool BusClient::observe(const BusCall& call) {
  const bool isSubscription = std::string_view(call.interface->methods[call.index].member) == "Subscribe";
  return isSubscription ? context_->observers->add(sd_bus_message_get_bus(call.message.get()), name_)
                        : context_->observers->remove(name_);
}

void BusClient::answer(std::uint64_t number, const std::optional<Value>& value) {
  const auto found = open_.find(number);
  if (found == open_.end()) return;
  const BusCall call = std::move(found->second);
  open_.erase(found);
  settle(call);
  const ServiceMethod& method = call.interface->methods[call.index];
  if (!value) return failBusCall(call.message.get(), kBusErrorFailed, "the call went without an answer");
  if (sd_bus_message_get_expect_reply(call.message.get()) > 0 &&
      !context_->unread->maySend(sd_bus_message_get_bus(call.message.get()), name_, *value)) {
    return failBusCall(call.message.get(), kBusErrorTooMany,
                       "too many replies to this connection are unread");
  }
  if (const auto error = replyToBusCall(call.message.get(), method.out.type, *value)) {
    context_->log.error("%s: %@ cannot be answered: %@", method.member, name_, *error);
  }
}

void BusClient::close() {
  if (state_ == State::Gone) return;
  state_ = State::Gone;
  *context_->openCalls -= waiting_.size() + open_.size();
  *context_->openBytes -= std::exchange(bytes_, 0);
  context_->unread->forget(name_);
  context_->observers->remove(name_);
  waiting_.clear();
  open_.clear();
  watch_.reset();
  question_.reset();
  if (!isDeciding_) release();
}

void BusClient::release() {
  // Destroying the exported object may take a while, so it happens off the bus thread.
  if (queue_ && object_) queue_->async([object = std::exchange(object_, nullptr)] {});
  queue_.reset();
}

Value BusClient::valueForEntitlement(std::string_view entitlement) const {
  missingEntitlement_ = entitlement;
  return executable_ ? context_->entitlements.valueFor(*executable_, entitlement) : Value();
}

void BusClient::setExportedInterface(const ServiceInterface& interface) {
  isExported_ = std::string_view(interface.name) == context_->interface.name;
}

void BusClient::setExportedObject(std::shared_ptr<ServiceObject> object) { object_ = std::move(object); }

void BusClient::resume() {
  context_->thread->post([self = shared_from_this()] {
    self->isResumed_ = true;
    self->serveWaiting();
  });
}

}  // namespace kvr

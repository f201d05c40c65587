#include "local/bus/BusConnection.h"

#include "local/loop/EventLoop.h"

#include <pthread.h>

#include <cctype>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <future>
#include <utility>

namespace kvr {
namespace {

/// How long an ending process waits for a bus that accepts nothing.
constexpr std::chrono::seconds kSendLimit{2};

/// The session's stated bus address, or else the default one.
std::string sessionBusAddress() {
  if (const char* const stated = ::secure_getenv("DBUS_SESSION_BUS_ADDRESS")) return stated;
  const char* const directory = ::secure_getenv("XDG_RUNTIME_DIR");
  if (directory == nullptr) return {};
  std::string address = "unix:path=";
  for (const char* at = directory; *at != '\0'; ++at) {
    const bool isPlain =
        std::isalnum(static_cast<unsigned char>(*at)) != 0 || std::strchr("-_/.\\", *at) != nullptr;
    if (isPlain) {
      address += *at;
    } else {
      constexpr const char* kDigits = "0123456789abcdef";
      const auto byte = static_cast<unsigned char>(*at);
      address.append({'%', kDigits[byte >> 4U], kDigits[byte & 15U]});
    }
  }
  return address += "/bus";
}

}  // namespace

void BusThread::post(Work work) {
  // The loop may not accept `work`. It must then be destroyed after the lock is released, because its
  // destruction may post as well.
  const auto held = std::make_shared<Work>(std::move(work));
  const std::lock_guard lock(mutex_);
  if (loop_) loop_->post([held] { (*held)(); });
}

void BusThread::setLoop(EventLoop* loop) {
  const std::lock_guard lock(mutex_);
  loop_ = loop;
}

BusConnection::BusConnection(Log& log, std::function<void(const Error&)> lost)
    : log_(log), lost_(std::move(lost)) {
  std::promise<void> started;
  runner_ = std::thread([this, &started] { run([&started] { started.set_value(); }); });
  started.get_future().wait();
}

BusConnection::~BusConnection() {
  thread_->post([this] { loop_->exit(0); });
  runner_.join();
}

void BusConnection::run(const std::function<void()>& started) {
  ::pthread_setname_np(::pthread_self(), "bus");
  EventLoop loop;
  loop.setFailureHandler([this](const std::string& what) { log_.error("Work on the bus failed: %@", what); });
  loop_ = &loop;
  thread_->setLoop(&loop);
  started();
  loop.run();
  thread_->setLoop(nullptr);
  if (bus_ && !isLost_) sendWhatWaits();
  disconnected_.reset();
  if (bus_) sd_bus_detach_event(bus_.get());
  bus_.reset();
}

sd_bus* BusConnection::bus() {
  if (!bus_ && !isLost_) {
    if (const int r = connect(); r < 0) lose(busError(r, "the session bus cannot be reached"));
  }
  return isLost_ ? nullptr : bus_.get();
}

int BusConnection::connect() {
  sd_bus* opened = nullptr;
  int r = sd_bus_new(&opened);
  if (r < 0) return r;
  bus_.reset(opened);
  r = sd_bus_set_description(opened, "kvragent");
  if (r >= 0) r = sd_bus_set_address(opened, sessionBusAddress().c_str());
  if (r >= 0) r = sd_bus_set_bus_client(opened, 1);
  // No call needs a descriptor; without this, peers could use up this process's descriptors.
  if (r >= 0) r = sd_bus_negotiate_fds(opened, 0);
  if (r >= 0) r = sd_bus_set_exit_on_disconnect(opened, 0);
  if (r >= 0) r = sd_bus_start(opened);
  if (r < 0) return r;
  sd_bus_slot* slot = nullptr;
  r = sd_bus_match_signal(opened, &slot, "org.freedesktop.DBus.Local", nullptr, "org.freedesktop.DBus.Local",
                          "Disconnected", handleDisconnected, this);
  if (r < 0) return r;
  disconnected_.reset(slot);
  return sd_bus_attach_event(opened, loop_->event(), 0);
}

int BusConnection::handleDisconnected(sd_bus_message*, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    // Not while the bus is processing messages.
    auto* const self = static_cast<BusConnection*>(userdata);
    self->loop_->post([self] { self->lose({"bus", 0, "the session bus closed the connection"}); });
    return 0;
  });
}

void BusConnection::lose(const Error& error) {
  if (isLost_) return;
  isLost_ = true;
  lost_(error);
}

void BusConnection::sendWhatWaits() {
  const auto end = std::chrono::steady_clock::now() + kSendLimit;
  std::uint64_t waiting = 0;
  while (sd_bus_get_n_queued_write(bus_.get(), &waiting) >= 0 && waiting > 0) {
    const auto left =
        std::chrono::duration_cast<std::chrono::microseconds>(end - std::chrono::steady_clock::now());
    if (left.count() <= 0) return;
    const int r = sd_bus_process(bus_.get(), nullptr);
    if (r < 0 || (r == 0 && sd_bus_wait(bus_.get(), static_cast<std::uint64_t>(left.count())) < 0)) return;
  }
}

}  // namespace kvr

// Tells what the coverage agent knows of this device, and again whenever it changes: in an sd-event loop.
//
//   g++ -std=c++20 sd-event.cpp -o sd-event $(pkg-config --cflags --libs kvragent-client libsystemd)
#include <client/AgentConnection.h>
#include <systemd/sd-event.h>

#include <cstdint>
#include <cstdio>

using namespace kvr::client;

namespace {

/// The connection in the loop: before each wait, the loop asks it what to wait for.
struct Attached {
  AgentConnection connection;
  sd_event_source* descriptor = nullptr;
  sd_event_source* timer = nullptr;

  void attach(sd_event* loop) {
    const auto ready = [](sd_event_source* source, int, std::uint32_t, void* self) {
      return static_cast<Attached*>(self)->dispatch(source);
    };
    const auto due = [](sd_event_source* source, std::uint64_t, void* self) {
      return static_cast<Attached*>(self)->dispatch(source);
    };
    const auto prepare = [](sd_event_source*, void* self) { return static_cast<Attached*>(self)->prepare(); };
    sd_event_add_io(loop, &descriptor, connection.descriptor(), 0, ready, this);
    sd_event_add_time_relative(loop, &timer, CLOCK_MONOTONIC, 0, 1, due, this);
    sd_event_source_set_prepare(descriptor, prepare);
  }
  int prepare() const {
    sd_event_source_set_io_events(descriptor, static_cast<std::uint32_t>(connection.events()));
    const auto wait = connection.timeout();
    if (wait) sd_event_source_set_time_relative(timer, static_cast<std::uint64_t>(wait->count()));
    return sd_event_source_set_enabled(timer, wait ? SD_EVENT_ONESHOT : SD_EVENT_OFF);
  }
  int dispatch(sd_event_source* source) {
    return connection.dispatch() ? 0 : sd_event_exit(sd_event_source_get_event(source), 3);
  }
};

void show(const kvr::Result<DeviceInfo>& info) {
  const auto coverage = info ? Coverage::from(info->warranty) : Coverage();
  std::printf("%s\n", coverage.isCovered ? coverage.label.value_or("covered").c_str() : "not covered");
  std::fflush(stdout);
}

}  // namespace

int main() {
  auto agent = AgentConnection::connect();
  sd_event* loop = nullptr;
  if (!agent || sd_event_default(&loop) < 0) return 3;
  Attached attached{*std::move(agent)};
  attached.attach(loop);
  attached.connection.watch([&attached](const kvr::Result<Change>& change) {
    if (change) attached.connection.defaultDeviceInfo(Policy::CacheOnly, show, std::chrono::seconds(10));
  });
  const int status = sd_event_loop(loop);
  sd_event_source_disable_unref(attached.timer);
  sd_event_source_disable_unref(attached.descriptor);
  sd_event_unref(loop);
  return status;
}

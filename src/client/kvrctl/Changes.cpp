#include "client/kvrctl/Changes.h"

#include "client/AgentClient.h"

#include <systemd/sd-event.h>
#include <unistd.h>

#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <utility>

namespace kvr::client {

ChangesInLoop::ChangesInLoop(EventLoop& loop, AgentConnection connection,
                             std::function<void(const Change&)> changed)
    : connection_(std::move(connection)) {
  const auto ready = [](sd_event_source*, int, std::uint32_t, void* self) {
    return static_cast<ChangesInLoop*>(self)->dispatch();
  };
  const auto due = [](sd_event_source*, std::uint64_t, void* self) {
    return static_cast<ChangesInLoop*>(self)->dispatch();
  };
  sd_event_add_io(loop.event(), &descriptor_, connection_.descriptor(), 0, ready, this);
  sd_event_add_time_relative(loop.event(), &timer_, CLOCK_MONOTONIC, 0, 1, due, this);
  sd_event_source_set_prepare(
      descriptor_, [](sd_event_source*, void* self) { return static_cast<ChangesInLoop*>(self)->prepare(); });
  connection_.watch([changed = std::move(changed)](const Result<Change>& change) {
    if (change) changed(*change);
  });
}

ChangesInLoop::~ChangesInLoop() {
  sd_event_source_disable_unref(timer_);
  sd_event_source_disable_unref(descriptor_);
}

int ChangesInLoop::prepare() {
  sd_event_source_set_io_events(descriptor_, static_cast<std::uint32_t>(connection_.events()));
  const auto wait = connection_.timeout();
  if (wait) sd_event_source_set_time_relative(timer_, static_cast<std::uint64_t>(wait->count()));
  return sd_event_source_set_enabled(timer_, wait ? SD_EVENT_ONESHOT : SD_EVENT_OFF);
}

int ChangesInLoop::dispatch() {
  if (connection_.dispatch()) return 0;
  sd_event_source_set_enabled(timer_, SD_EVENT_OFF);
  return sd_event_source_set_enabled(descriptor_, SD_EVENT_OFF);
}

void endWithOutput(EventLoop& loop) {
  // An error of the output is reported without being asked for. A file has none, and is not watched.
  sd_event_add_io(
      loop.event(), nullptr, STDOUT_FILENO, 0,
      [](sd_event_source* source, int, std::uint32_t, void*) {
        return sd_event_exit(sd_event_source_get_event(source), kOutputGone);
      },
      nullptr);
  sd_event_add_post(
      loop.event(), nullptr,
      [](sd_event_source* source, void*) {
        if (std::ferror(stdout) == 0) return 0;
        return sd_event_exit(sd_event_source_get_event(source), kOutputGone);
      },
      nullptr);
}

Status watchStatus(const Options& options) {
  const Result<AgentClient> agent = AgentClient::connect();
  if (!agent) return fail(agent.error());
  // Starts the agent, and finds out whether it serves this program.
  if (const auto device = agent->defaultDevice(); !device) return fail(device.error());
  Result<AgentConnection> connection = AgentConnection::connect();
  if (!connection) return fail(connection.error());
  std::signal(SIGPIPE, SIG_IGN);
  EventLoop loop;
  endWithOutput(loop);
  bool isFirst = true;
  const ChangesInLoop changes(loop, *std::move(connection), [&](const Change&) {
    if (!std::exchange(isFirst, false) && !options.json) print("\n", kFine);
    const Status shown = showStatus(*agent, options);
    if (shown == kUnreachable || shown == kRefused) loop.exit(shown);
  });
  const int status = loop.run();
  return status == kOutputGone ? kFailed : static_cast<Status>(status);
}

}  // namespace kvr::client

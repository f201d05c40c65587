// Tells what the coverage agent knows of this device, and again whenever it changes: in a GLib main loop.
//
//   g++ -std=c++20 glib.cpp -o glib $(pkg-config --cflags --libs kvragent-client glib-2.0)
#include <client/AgentConnection.h>
#include <glib.h>

#include <cstdio>

using namespace kvr::client;

namespace {

/// A source of the main loop. GLib allocates it, so the rest is reached through a pointer.
struct AgentSource {
  GSource base;
  AgentConnection* connection;
  GMainLoop* loop;
  gpointer descriptor;
};

gboolean prepare(GSource* base, gint* timeout) {
  auto* const source = reinterpret_cast<AgentSource*>(base);
  const auto events = static_cast<GIOCondition>(source->connection->events());
  g_source_modify_unix_fd(base, source->descriptor, events);
  *timeout = source->connection->milliseconds();
  return *timeout == 0;
}

gboolean check(GSource* base) {
  auto* const source = reinterpret_cast<AgentSource*>(base);
  return g_source_query_unix_fd(base, source->descriptor) != 0 || source->connection->milliseconds() == 0;
}

gboolean dispatch(GSource* base, GSourceFunc, gpointer) {
  auto* const source = reinterpret_cast<AgentSource*>(base);
  if (source->connection->dispatch()) return G_SOURCE_CONTINUE;
  g_main_loop_quit(source->loop);
  return G_SOURCE_REMOVE;
}

void show(const kvr::Result<DeviceInfo>& info) {
  const auto coverage = info ? Coverage::from(info->warranty) : Coverage();
  std::printf("%s\n", coverage.isCovered ? coverage.label.value_or("covered").c_str() : "not covered");
  std::fflush(stdout);
}

}  // namespace

int main() {
  auto agent = AgentConnection::connect();
  if (!agent) return 3;
  AgentConnection connection = *std::move(agent);
  connection.watch([&connection](const kvr::Result<Change>& change) {
    if (change) connection.defaultDeviceInfo(Policy::CacheOnly, show, std::chrono::seconds(10));
  });
  GMainLoop* const loop = g_main_loop_new(nullptr, FALSE);
  GSourceFuncs functions{prepare, check, dispatch, nullptr, nullptr, nullptr};
  GSource* const base = g_source_new(&functions, sizeof(AgentSource));
  auto* const source = reinterpret_cast<AgentSource*>(base);
  source->connection = &connection;
  source->loop = loop;
  source->descriptor = g_source_add_unix_fd(base, connection.descriptor(), G_IO_IN);
  g_source_attach(base, nullptr);
  g_main_loop_run(loop);
  g_source_destroy(base);
  g_source_unref(base);
  g_main_loop_unref(loop);
  return 3;
}

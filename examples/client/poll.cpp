// Tells what the coverage agent knows of this device, and again whenever it changes: with a loop of its own.
//
//   g++ -std=c++20 poll.cpp -o poll $(pkg-config --cflags --libs kvragent-client)
// The program is granted com.tarsil.private.kvragent in Entitlements.plist of the device root.
#include <client/AgentConnection.h>
#include <poll.h>

#include <cstdio>

using namespace kvr::client;

namespace {

void show(const kvr::Result<DeviceInfo>& info) {
  if (!info) {
    std::printf("unknown: %s\n", info.error().message.c_str());
  } else {
    const auto coverage = Coverage::from(info->warranty);
    std::printf("%s\n", coverage.isCovered ? coverage.label.value_or("covered").c_str() : "not covered");
  }
  std::fflush(stdout);
}

}  // namespace

int main() {
  auto agent = AgentConnection::connect();
  if (!agent) {
    std::fprintf(stderr, "%s\n", agent.error().message.c_str());
    return 3;
  }
  AgentConnection connection = *std::move(agent);
  // The answer comes while this loop goes on; after ten seconds, an error comes in its place.
  const auto ask = [&connection] {
    connection.defaultDeviceInfo(Policy::CacheOnly, show, std::chrono::seconds(10));
  };
  connection.watch([&ask](const kvr::Result<Change>& change) {
    if (change) return ask();
    std::fprintf(stderr, "%s\n", change.error().message.c_str());
  });
  ask();
  do {
    pollfd one{connection.descriptor(), connection.events(), 0};
    poll(&one, 1, connection.milliseconds());
  } while (connection.dispatch());
  return 3;
}

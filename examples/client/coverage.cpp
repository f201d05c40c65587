// Prints what the coverage agent knows of every device, without any download.
//
// Built with CMake by what stands beside it, or at once:
//   g++ -std=c++20 coverage.cpp -o coverage $(pkg-config --cflags --libs kvragent-client)
// The program is granted com.tarsil.private.kvragent in Entitlements.plist of the device root.
#include <client/AgentClient.h>

#include <cstdio>

using namespace kvr::client;

int main() {
  const auto agent = AgentClient::connect();
  if (!agent) {
    std::fprintf(stderr, "%s\n", agent.error().message.c_str());
    return 3;
  }
  const auto infos = agent->allDeviceInfos(Policy::CacheOnly, false);
  if (!infos) {
    std::fprintf(stderr, "%s\n", infos.error().message.c_str());
    return infos.error().code == Refused ? 4 : 3;
  }
  for (const auto& info : *infos) {
    const auto coverage = Coverage::from(info.warranty);
    std::printf(
        "%s: %s\n", info.device.name.value_or("unnamed").c_str(),
        coverage.isCovered ? coverage.label.value_or("covered").c_str() : "not covered, as far as is known");
  }
}

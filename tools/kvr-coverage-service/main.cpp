#include "AgentPreferences.h"
#include "Behaviours.h"
#include "Service.h"
#include "WireServer.h"

#include <CLI/CLI.hpp>
#include <pthread.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <future>
#include <string>

namespace {

using namespace kvr::coverage_service;

/// Serves until a termination signal arrives; false when serving ended without one.
bool serve(WireServer& server, const std::string& url, const sigset_t& signals) {
  auto served = std::async(std::launch::async, [&server] {
    const bool wasStopped = server.listen_after_bind();
    if (!wasStopped) ::kill(::getpid(), SIGTERM);
    return wasStopped;
  });
  // Stopping the server before it runs would have no effect.
  using namespace std::chrono_literals;
  while (!server.is_running() && served.wait_for(1ms) == std::future_status::timeout) {
  }
  std::printf("listening on %s\n", url.c_str());
  std::fflush(stdout);
  int signal = 0;
  sigwait(&signals, &signal);
  server.stopServing();
  return served.get();
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{"A stand-in for the coverage service and the host of the version asset."};
  app.footer(Behaviours::kHelp);
  Service::Options options;
  int port = 0;
  bool directsAgent = false;
  app.add_option(
         "--root", options.root,
         "Directory of the answers (kvrV2.plist, coverage/SERIAL[.LOCALE].json, coverage/default.json); "
         "what was received is recorded below requests/")
      ->required();
  app.add_option("--port", port, "Port on 127.0.0.1; 0 chooses one")->check(CLI::Range(0, 65535));
  app.add_option(
      "--tls", options.tls,
      "Serve https too, on the same port; the certificate of the authority to trust for it is written to "
      "this file");
  app.add_option("--authority", options.authority,
                 "Certificate file (PEM or DER): requests about the local device must be attested by it");
  app.add_option("--accounts", options.accounts, "The agent's Accounts.plist, to check headers by value");
  app.add_option("--storefront", options.storefront, "The storefront expected in place of the account's own");
  app.add_flag("--direct-agent", directsAgent,
               "Make this user's agent ask this service, by setting the URLs in its preferences");
  CLI11_PARSE(app, argc, argv);

  // Before any thread starts, so that only this thread receives the signals.
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  try {
    WireServer server;
    const Service service(server, options);
    if (port == 0) {
      port = server.bind_to_any_port("127.0.0.1");
    } else if (!server.bind_to_port("127.0.0.1", port)) {
      port = -1;
    }
    if (port < 0) {
      std::fputs("kvr-coverage-service: the port cannot be had\n", stderr);
      return EXIT_FAILURE;
    }
    const std::string url = "http://127.0.0.1:" + std::to_string(port);
    if (directsAgent && !directAgentTo(url)) {
      std::fputs("kvr-coverage-service: the agent's preferences cannot be written\n", stderr);
      return EXIT_FAILURE;
    }
    return serve(server, url, signals) ? EXIT_SUCCESS : EXIT_FAILURE;
  } catch (const std::exception& error) {
    std::fprintf(stderr, "kvr-coverage-service: %s\n", error.what());
    return EXIT_FAILURE;
  }
}

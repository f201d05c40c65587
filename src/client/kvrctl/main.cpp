// kvrctl: asks the agent about this device, its paired devices and their warranties.

#include "client/kvrctl/Changes.h"
#include "client/kvrctl/Commands.h"
#include "client/kvrctl/Monitor.h"
#include "client/kvrctl/Terminal.h"

#include <CLI/CLI.hpp>
#include <unistd.h>

#include <clocale>
#include <cstdio>
#include <exception>
#include <functional>
#include <map>
#include <string>

namespace {

using namespace kvr;          // NOLINT(google-build-using-namespace)
using namespace kvr::client;  // NOLINT(google-build-using-namespace)

Status withAgent(AgentCommand command, const Options& options) {
  Result<AgentClient> connected = AgentClient::connect();
  if (!connected) return fail(connected.error());
  AgentClient agent = *std::move(connected);
  const bool isWatched = isCapableTerminal(STDERR_FILENO);
  if (isWatched) {
    agent.setWaiting([](int seconds) { std::fprintf(stderr, "\rwaiting for the agent, %d s ", seconds); });
  }
  const Status status = command(agent, options);
  if (isWatched) std::fprintf(stderr, "\r\033[K");
  return status;
}

/// Parses the command line: defines the commands and their arguments.
class CommandLine {
 public:
  CommandLine() : app_("Asks the agent about devices and their warranties.", "kvrctl") {
    app_.require_subcommand(0, 1);
    app_.footer(
        "Exit status: 0 fine, 2 nothing known, 3 the agent cannot be reached, 4 it refuses this program, "
        "1 anything else.");
    addOptions(app_);
    addQuestions();
    addOrders();
    addViews();
  }

  Status run(int argumentCount, char** arguments) {
    try {
      app_.parse(argumentCount, arguments);
    } catch (const CLI::ParseError& error) {
      return app_.exit(error) == 0 ? kFine : kFailed;
    }
    for (const auto& [command, operation] : commands_) {
      if (command->parsed()) return operation();
    }
    return withAgent(showStatus, options_);
  }

 private:
  void addOptions(CLI::App& command) {
    command.add_flag("--json", options_.json, "One JSON document instead of text");
    command.add_flag("--show-serial", options_.showSerial, "Whole serial numbers instead of their ends");
  }
  CLI::App* add(const char* name, const char* description, std::function<Status()> operation) {
    CLI::App* const added = app_.add_subcommand(name, description);
    addOptions(*added);
    commands_.emplace(added, std::move(operation));
    return added;
  }
  /// Adds a command that calls the agent.
  CLI::App* add(const char* name, const char* description, AgentCommand operation) {
    return add(name, description, [this, operation] { return withAgent(operation, options_); });
  }
  CLI::Option* addText(CLI::App* command, const char* name, const char* description) {
    return command->add_option(name, options_.text, description)->check([](const std::string& text) {
      return text.empty() ? std::string("it is empty") : std::string();
    });
  }
  /// Any text is a serial number, an empty one too.
  CLI::Option* addSerial(CLI::App* command, const char* description) {
    return command->add_option_function<std::string>(
        "SERIAL", [this](const std::string& text) { options_.serialNumber = text; }, description);
  }

  void addQuestions() {
    add("status", "Every device at a glance, from what is known already (the default)", [this] {
      return options_.isWatched ? watchStatus(options_) : withAgent(showStatus, options_);
    })->add_flag("--watch", options_.isWatched, "Again whenever it changes");
    add("device", "This device", showDevice);
    add("paired", "The paired devices", showPaired);
    CLI::App* const info = add("info", "A device and its warranty", showInfo);
    CLI::Option* const serial = addSerial(info, "Another device's serial number");
    info->add_option("--policy", options_.policy, "Where the warranty comes from: default, cache or refresh")
        ->transform(CLI::CheckedTransformer(std::map<std::string, Policy>{
            {"default", Policy::Default}, {"cache", Policy::CacheOnly}, {"refresh", Policy::Refresh}}))
        ->option_text("POLICY");
    info->add_flag("--all", options_.all, "This device and every paired one")->excludes(serial);
    add("refresh", "Downloads every device's warranty anew", refresh);
    CLI::App* const support =
        add("support-app", "How an application stands on this device", showSupportApplication);
    addText(support, "BUNDLE", "Its bundle identifier")->required();
    add("web-url", "The override of the web flow's address", showWebURL);
  }

  void addOrders() {
    addSerial(add("dismiss", "Takes a device's offer away", dismiss), "The device's serial number")
        ->required();
    add("schedule-outreach", "Has the agent ask about every device by itself", scheduleOutreach)
        ->add_option("--after", options_.seconds, "So many seconds from now");
    add("account-added", "Tells the agent that a cloud account was added", reportAccountAdded)
        ->add_flag("--no-wait", options_.noWait, "Does not wait for the answer, which may take an hour");
    addText(add("notify", "Posts a notification to everyone on the bus", postNotification), "NAME",
            "Its name")
        ->required();
  }

  void addViews() {
    CLI::App* const timeline =
        add("timeline", "Coverage, offers and activities on one axis of dates", showTimeline);
    addSerial(timeline, "Only this device, by its serial number");
    timeline->add_option("--svg", options_.file,
                         "Draws a picture into this file instead, - for standard output");
    add("follow-ups", "The offers that are shown", [this] { return showFollowUps(options_); });
    add("activities", "The background activities: to come, and how each ended last",
        [this] { return showActivities(options_); });
    add("monitor", "What changes, as it happens",
        [this] { return monitor(options_.report(), options_.json); });
    add("doctor", "What is wrong, and what helps", [this] { return showVerdicts(options_); });
  }

  Options options_;
  CLI::App app_;
  std::map<const CLI::App*, std::function<Status()>> commands_;
};

}  // namespace

int main(int argumentCount, char** arguments) {
  std::setlocale(LC_TIME, "");
  try {
    return CommandLine().run(argumentCount, arguments);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "kvrctl: %s\n", error.what());
    return kFailed;
  }
}

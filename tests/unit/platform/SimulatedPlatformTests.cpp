#include "unit/SimulatedTest.h"

#include <stdexcept>

namespace kvr {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Optional;

class ASimulatedPlatform : public SimulatedTest {
 protected:
  /// Sends a request and records in `answers` how and when it was answered.
  void send(const std::string& url, double timeout = 60) {
    HTTPRequest request;
    request.url = url;
    request.timeout = timeout;
    simulated.http.newUncachedSession()->send(std::move(request), [this, url](const HTTPResponse& response) {
      answers.push_back(
          format("%@ %d %@ after %.0f s", url, response.status, response.body, simulated.clock.elapsed()));
    });
  }

  std::vector<std::string> answers;
};

TEST_F(ASimulatedPlatform, AnswersRequestsAsScriptedAndWithinTheirTimeouts) {
  simulated.http.respond(200, "body", 5);
  simulated.http.ignore();
  simulated.http.respond(204, "", 100);
  std::vector<SimulatedHTTP::Answer> held;
  simulated.http.handler = [&](const HTTPRequest& request, bool uncached, SimulatedHTTP::Answer answer) {
    EXPECT_TRUE(uncached);
    if (request.url == "answered") answer({201, "handled", std::nullopt});
    held.push_back(std::move(answer));
  };
  for (const auto* const url : {"scripted", "ignored", "late", "answered"}) send(url);
  send("held", 1e6);
  EXPECT_THAT(answers, IsEmpty()) << "answered inside send";
  simulated.queues.advance(200);
  for (const auto& answer : held) answer({202, "held", std::nullopt});
  simulated.queues.run();
  std::sort(answers.begin(), answers.end());
  EXPECT_THAT(answers, ElementsAre("answered 201 handled after 0 s", "held 202 held after 200 s",
                                   "ignored 0 (null) after 60 s", "late 0 (null) after 60 s",
                                   "scripted 200 body after 5 s"));
  EXPECT_EQ(simulated.http.requests().size(), 5U);
  EXPECT_FALSE(simulated.queues.runUntil([] { return false; }));
}

TEST_F(ASimulatedPlatform, RenewsCredentialsAsScripted) {
  struct Case {
    SimulatedAccountStore::Renewal renewal;
    std::optional<std::int64_t> code;
    std::string token;
  };
  const Case cases[] = {
      {{0, {{"service", "new"}}, 5, std::nullopt, false}, 0, "new"},
      {{7, {{"service", "new"}}, 5, Error{"accounts", 7, "declined"}, false}, 7, "old"},
      {{0, {{"service", "new"}}, 5, std::nullopt, true}, std::nullopt, "old"},
  };
  for (const auto& example : cases) {
    simulated.accounts.tokens = {{"service", "old"}};
    simulated.accounts.renewal = example.renewal;
    std::optional<std::int64_t> code;
    std::optional<Error> error;
    simulated.accounts.renewCredentialsFor({}, {true, {"service"}},
                                           [&](std::int64_t result, std::optional<Error> why) {
                                             code = result;
                                             error = std::move(why);
                                           });
    simulated.queues.advance(4);
    EXPECT_EQ(code, std::nullopt);
    simulated.queues.advance(1);
    EXPECT_EQ(code, example.code);
    EXPECT_EQ(error, example.renewal.error);
    EXPECT_THAT(simulated.accounts.tokenFor({}, "service"), Optional(example.token));
  }
  EXPECT_EQ(simulated.accounts.renewals.size(), 3U);
}

/// Replies its argument, and counts itself.
class EchoObject : public ServiceObject {
 public:
  explicit EchoObject(int& alive) : alive_(alive) { ++alive_; }
  ~EchoObject() override { --alive_; }
  EchoObject(const EchoObject&) = delete;
  EchoObject& operator=(const EchoObject&) = delete;
  void invoke(std::size_t method, const Value::Array& arguments, ServiceReply reply) override {
    reply(method == 1 ? arguments.at(0) : Value("other"));
  }

 private:
  int& alive_;
};

class EchoDelegate : public ServiceListenerDelegate {
 public:
  bool shouldAcceptNewConnection(ServiceConnection& connection) override {
    if (!connection.valueForEntitlement("echo").asBool()) return false;
    connection.setExportedInterface(interface);
    connection.setExportedObject(std::make_shared<EchoObject>(alive));
    connection.resume();
    return true;
  }

  const ServiceInterface interface {
    "Echo", {
      {"Other", {}, {"reply", "s"}}, {
        "Echo", {{"text", "s"}}, { "reply", "s" }
      }
    }
  };
  int alive = 0;
};

TEST_F(ASimulatedPlatform, ConnectsClientsToAService) {
  EchoDelegate delegate;
  auto listener = simulated.services.newListener("echo");
  listener->setDelegate(delegate);
  EXPECT_THROW(simulated.services.connect("echo", {}), std::logic_error);
  listener->resume(delegate.interface);

  const auto client = simulated.services.connect("echo", {{{"echo", true}}, 17});
  const auto stranger = simulated.services.connect("echo", {});
  const auto served = client->invoke("Echo", {"hello"});
  const auto refused = stranger->invoke("Echo", {"hello"});
  EXPECT_EQ(served->reply, std::nullopt);
  simulated.queues.run();
  EXPECT_TRUE(client->isAccepted());
  EXPECT_TRUE(stranger->isRefused());
  EXPECT_THAT(served->reply, Optional(Value("hello")));
  EXPECT_TRUE(refused->isRefused);
  EXPECT_EQ(delegate.alive, 1);

  client->disconnect();
  const auto late = client->invoke("Other");
  simulated.queues.run();
  EXPECT_TRUE(late->isRefused);
  EXPECT_EQ(delegate.alive, 0);
  listener.reset();
  EXPECT_FALSE(simulated.services.isListening("echo"));
}

TEST_F(ASimulatedPlatform, CollectsTheFaultsOfTheProgram) {
  {
    const Completion<int> dropped(simulated.log, "dropped", [](int) {});
    const Completion<int> twice(simulated.log, "twice", [](int) {});
    twice(1);
    twice(2);
  }
  simulated.queues.mainQueue()->async([] { throw std::runtime_error("boom"); });
  simulated.queues.run();
  EXPECT_THAT(simulated.faults(),
              ElementsAre("work item failed: boom", "twice: answered a second time, refused",
                          "dropped: went without an answer"));
  EXPECT_EQ(simulated.log.texts(LogLevel::Error).size(), 2U);
  simulated.queues.takeFaults();
  simulated.log.takeFaults();
}

TEST_F(ASimulatedPlatform, LetsWaitingWorkFinishBeforeItGoes) {
  std::vector<std::string> seen;
  {
    SimulatedPlatform other;
    const auto signal = other.queues.newSignal();
    other.queues.concurrentQueue(Priority::Default)->async([&] {
      seen.emplace_back(signal->wait(std::nullopt) ? "signalled" : "over");
      seen.push_back(other.locale.decimalString(1234567));
      other.queues.mainQueue()->async([&] { seen.emplace_back("too late"); });
    });
    other.queues.run();
  }
  EXPECT_THAT(seen, ElementsAre("over", "1,234,567"));
}

}  // namespace
}  // namespace kvr

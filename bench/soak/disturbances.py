"""What happens to the agent: edited files, a service that fails, a clock that is set, kills."""
import random
import signal
import threading

from world import DEVICES, WATCHES

OK = "HTTP/1.1 200 OK\r\n"
DAY = 86400
FAILURES = [
    {"status": 500}, {"status": 503}, {"status": 401}, {"status": 404}, {"body": "garbage"}, {"body": "truncated"},
    {"body": "oversize"}, {"late": 0.3}, {"late": 3}, {"redirect": "http://127.0.0.1:1/"},
    {"raw": "", "end": "close"}, {"raw": "", "end": "reset"},
    {"raw": OK + "Content-Length: 4\r\n\r\nnull"}, {"raw": OK + "Content-Length: 9\r\n\r\n{", "end": "reset"},
    {"raw": OK + "Content-Length: 4000\r\n\r\n" + "[" * 4000}, {"raw": OK + "X-More: ", "repeat": "x" * 4096},
]
# These take the agent half a minute each.
LONG_FAILURES = [{"never": True}, {"late": 29}, {"raw": OK + "Content-Length: 9\r\n\r\n{", "end": "hold"},
                 {"raw": OK + "X-More: ", "repeat": "x", "pace": 1}]


class Disturber:
    """Does something to a world every few seconds."""

    def __init__(self, world, gate, pause, isLong, seed):
        self.world, self.gate, self.pause, self.report = world, gate, pause, world.report
        self.failures = FAILURES + LONG_FAILURES if isLong else FAILURES
        self.random = random.Random(seed)
        self.kinds = [("pairings edited", self.pair, 3), ("languages edited", self.change_language, 1.5),
                      ("accounts edited", self.change_account, 1.5), ("network files edited", self.change_network, 0.7),
                      ("answers of the service changed", self.change_coverage, 3),
                      ("failures of the service", self.fail_service, 4)]
        if world.kind != "lasting":
            self.kinds += [("kills with SIGKILL", lambda: bool(world.kill_agent(signal.SIGKILL)), 1.5),
                           ("ends with SIGTERM", lambda: bool(world.kill_agent(signal.SIGTERM)), 1.5)]
        self.thread = threading.Thread(target=self.run)
        self.thread.start()

    def run(self):
        while self.gate.enter():
            try:
                name, do, _ = self.random.choices(self.kinds, [weight for *_, weight in self.kinds])[0]
                if do() is not False:  # there was no agent to kill
                    self.report.count(name)
            except OSError as error:
                self.report.fail(f"{self.world.kind}: {error!r}")
            finally:
                self.gate.leave()
            self.gate.rest(self.random.expovariate(1 / self.pause))

    def pair(self):
        self.world.pair(self.random.sample(WATCHES, self.random.randint(0, len(WATCHES))))

    def change_language(self):
        self.world.set_language(self.random.choice(["en_US", "fr_FR"]))

    def change_account(self):
        self.world.set_account(self.random.random() < 0.7, self.random.choice([0, 0, 1, 2]))

    def change_network(self):
        self.world.set_network(self.random.random() < 0.7)

    def change_coverage(self):
        self.world.set_coverage(self.random.choice(DEVICES), self.random.choice(["Plan", "Better plan"]),
                                self.random.uniform(-5, 5), self.random.choice([-1, 0.01, 1, 3, 30]))

    def fail_service(self):
        def rules():
            return [{**self.random.choice(self.failures), "times": self.random.randint(1, 5)}
                    for _ in range(self.random.randint(0, 3))]

        self.world.misbehave({"coverage": rules(), **({"asset": rules()} if self.random.random() < 0.3 else {})})


class ClockSetter:
    """Sets the wall clock of everybody."""

    def __init__(self, clock, gate, pause, report, seed):
        self.clock, self.gate, self.pause, self.report = clock, gate, pause, report
        self.random = random.Random(seed)
        self.thread = threading.Thread(target=self.run)
        self.thread.start()

    def run(self):
        while self.gate.enter():
            shift = self.clock.shift + self.random.choice([-1, 1]) * self.random.choice([60, 3600, DAY, 10 * DAY])
            self.clock.set(shift if abs(shift) < 60 * DAY else 0)
            self.report.count("settings of the clock")
            self.gate.leave()
            self.gate.rest(self.random.expovariate(1 / self.pause))

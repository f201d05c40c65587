"""Clients of the agent, which come and go; most of them check what they are answered."""
import json
import random
import signal
import struct
import subprocess
import threading
import time

from peer import ERROR, INTERFACE, NAME, PATH, RETURN, SIGNAL, Peer, padded, text
from world import DEVICES, LIMIT, OTHERS, PHONE, WATCHES

CACHE, DEFAULT, REFRESH = 1, 0, 2
# What a call may be answered with while the agent ends or there is none.
GONE = {f"org.freedesktop.DBus.Error.{name}" for name in (
    "NoReply", "ServiceUnknown", "NameHasNoOwner", "Spawn.ChildExited", "Spawn.ChildSignaled", "Spawn.Failed", "TimedOut",
    "Disconnected")} | {"org.freedesktop.DBus.Error.Failed"}
# Not an answer but a wrong call: what the agent says to them.
WRONG_CALLS = [("Nothing", "", b"", {"UnknownMethod"}), ("DefaultDevice", "s", text("x" * 5000), {"InvalidArgs"}),
               ("GetDeviceInfoForSerialNumber", "s", text(PHONE), {"InvalidArgs"})]


class Wrong(Exception):
    """An answer is not what it should be."""


def require(condition, what):
    if not condition:
        raise Wrong(what)


def check_info(info, serial):
    """A device info is about this device, and so is its warranty."""
    require(info["device"]["serialNumber"] == serial, f"asked for {serial}, answered {info}")
    warranty = info.get("warranty")
    if warranty is not None:
        label = warranty["DictionaryRepresentation"]["coverageLocalizedLabel"]
        require(label.split()[-1] == serial, f"asked for {serial}, answered the warranty {label}")


def check_infos(infos, possible):
    serials = [info["device"]["serialNumber"] for info in infos]
    require(len(serials) == len(set(serials)), f"a device twice: {serials}")
    require(any({*serials} == {PHONE, *watches} for watches in possible), f"other devices than the paired ones: {serials}")
    for info, serial in zip(infos, serials):
        check_info(info, serial)


class Clients:
    """One slot: a client at a time, each of which does one thing and leaves."""

    def __init__(self, world, gate, think, seed):
        self.world, self.gate, self.think, self.report = world, gate, think, world.report
        self.random = random.Random(seed)
        self.kinds = [(self.visit, 10), (self.stay, 1), (self.burst, 2), (self.leave, 3), (self.write_wrong_calls, 1),
                      (self.use_kvrctl, 3), (self.interrupt_kvrctl, 1), (self.come_as_a_stranger, 1),
                      (self.post_notifications, 1)]
        self.thread = threading.Thread(target=self.run)
        self.thread.start()

    def run(self):
        doings, weights = zip(*self.kinds)
        while self.gate.enter():
            try:
                self.random.choices(doings, weights)[0]()
            except Wrong as wrong:
                self.report.fail(f"{self.world.kind}: {wrong}")
            except (OSError, KeyError, ValueError, SystemExit) as error:
                self.report.fail(f"{self.world.kind}: {error!r}")
            finally:
                self.gate.leave()
            self.gate.rest(self.random.expovariate(1 / self.think))

    # --- calls ---

    def random_call(self):
        """A call (member, signature, arguments) and the check of its answer."""
        serial = self.random.choice(DEVICES)
        policy = struct.pack("<Q", self.random.choices([CACHE, DEFAULT, REFRESH], [6, 3, 2])[0])
        application = text("com.example.app")

        def check_phone(device, _):
            require(device["serialNumber"] == PHONE, f"the phone is {device}")

        def check_watches(devices, possible):
            require({device["serialNumber"] for device in devices} in possible, f"other watches than the paired ones: {devices}")

        def check_yes(answer, _):
            require(answer == 1, f"answered {answer}")

        def check_application(found, _):
            require(found["AppAvailabilityType"] == 0, f"an unknown application is {found}")

        return self.random.choices([
            ("DefaultDevice", "", b"", check_phone),
            ("PairedDevices", "", b"", check_watches),
            ("GetDefaultDeviceInfoUsingPolicy", "t", policy, lambda info, _: check_info(info, PHONE)),
            ("GetDeviceInfoForSerialNumber", "st", padded(text(serial), 8) + policy, lambda info, _: check_info(info, serial)),
            ("GetAllDeviceInfosUsingPolicy", "tb", policy + struct.pack("<I", self.random.randrange(2)), check_infos),
            ("DismissFollowUpForSerialNumber", "s", text(self.random.choice(WATCHES + OTHERS)), check_yes),
            ("ScheduleOutreach", "", b"", check_yes),
            ("ScheduleOutreachAfter", "d", struct.pack("<d", self.random.uniform(0, 20)), check_yes),
            ("TarsilAccountAdded", "", b"", check_yes),
            ("CheckIsAvailableInStore", "s", application, check_application),
            ("AppSupportAvailability", "s", application, check_application),
            ("ReadWebURLOverride", "", b"", lambda url, _: require(url == "", f"the address is {url}")),
        ], [3, 3, 5, 8, 4, .2, .3, .3, .3, 1, 1, 1])[0]

    def finish(self, peer, open_calls):
        """Reads until every call is answered, each once."""
        answered = set()
        while open_calls:
            message = peer.receive(LIMIT)
            require(message is not None, f"{len(open_calls)} calls without an answer, or the bus has closed the connection")
            if message.kind == SIGNAL:
                continue
            serial = message.reply_serial
            require(serial not in answered, "a call was answered twice")
            if serial not in open_calls:
                continue  # the bus's own
            answered.add(serial)
            member, check, sent = open_calls.pop(serial)
            self.take(member, message, check, sent)

    def take(self, member, message, check, sent):
        if message.kind == ERROR:
            require(self.world.kind != "lasting" and message.error in GONE, f"{member}: {message.error} {message.values()}")
            return self.report.count("calls while the agent was away")
        possible = self.world.paired_between(sent, time.monotonic())
        try:
            check(message.values()[0], possible)
        except Wrong as wrong:
            raise Wrong(f"{member}: {wrong}") from None
        self.report.count("calls answered")

    def send(self, peer, open_calls):
        member, signature, body, check = self.random_call()
        sent = time.monotonic()
        open_calls[peer.send(NAME, PATH, INTERFACE, member, signature, body)] = (member, check, sent)

    # --- what a client does ---

    def visit(self):
        """One call after another."""
        with Peer(self.world.address) as peer:
            for _ in range(self.random.randint(1, 6)):
                open_calls = {}
                self.send(peer, open_calls)
                self.finish(peer, open_calls)

    def stay(self):
        """A client that keeps its connection, whatever becomes of the agent."""
        with Peer(self.world.address) as peer:
            for _ in range(20):
                open_calls = {}
                self.send(peer, open_calls)
                self.finish(peer, open_calls)
                self.gate.rest(1)

    def burst(self):
        """Many calls at once, and only then the answers."""
        with Peer(self.world.address) as peer:
            open_calls = {}
            for _ in range(self.random.randint(5, 30)):
                self.send(peer, open_calls)
            self.finish(peer, open_calls)

    def leave(self):
        """Leaves without its answers, sometimes in the middle of a message."""
        with Peer(self.world.address) as peer:
            for _ in range(self.random.randint(1, 4)):
                self.send(peer, {})
            if self.random.random() < 0.5:
                peer.socket.sendall(peer.call_message(NAME, PATH, INTERFACE, "DefaultDevice")[:self.random.randint(1, 100)])
            self.gate.rest(self.random.choice([0, 0, 0.01, 0.5]))
        self.report.count("clients that left without their answers")

    def write_wrong_calls(self):
        with Peer(self.world.address) as peer:
            for member, signature, body, errors in WRONG_CALLS:
                answer = peer.call(NAME, PATH, INTERFACE, member, signature, body, limit=LIMIT)
                isGone = self.world.kind != "lasting" and answer.error in GONE
                require(isGone or (answer.error or "").split(".")[-1] in errors, f"{member}: answered {answer.error}")
            peer.call(NAME, PATH, "org.freedesktop.DBus.Introspectable", "Introspect", limit=LIMIT)
        self.report.count("wrong calls", len(WRONG_CALLS))

    def post_notifications(self):
        with Peer(self.world.address) as peer:
            for _ in range(self.random.choice([1, 1, 3])):
                peer.socket.sendall(peer.signal(self.random.choice([
                    "com.tarsil.pairedregistry.device-did-pair", "com.tarsil.pairedregistry.device-did-unpair"])))
                self.report.count("notifications")

    def start_program(self, *command):
        return subprocess.Popen(command, stdout=subprocess.PIPE, stderr=subprocess.PIPE, env=self.world.environment())

    def kvrctl(self, *arguments):
        return self.start_program(f"{self.world.programs}/kvrctl", *arguments)

    def use_kvrctl(self):
        serial = self.random.choice(DEVICES)
        policy = self.random.choice(["cache", "default", "refresh"])
        arguments = self.random.choice([
            ["info", serial, "--policy", policy], ["info", "--all", "--policy", policy], ["status"], ["device"], ["paired"],
            ["refresh"], ["follow-ups"], ["activities"], ["timeline"], ["doctor"]])
        start = time.monotonic()
        program = self.kvrctl(*arguments, "--json", "--show-serial")
        output, errors = program.communicate(timeout=LIMIT)
        status = program.returncode
        self.report.count("runs of kvrctl")
        # Away or nothing known; what the doctor finds wrong changes with the disturbances.
        isFine = status in (0, 2) or arguments == ["doctor"] or (status in (1, 3) and self.world.kind != "lasting")
        require(isFine, f"kvrctl {arguments}: status {status}, {errors.decode()}")
        if status != 0:
            return
        infos = [{"device": info["device"], "warranty": info["warranty"] and {"DictionaryRepresentation": info["warranty"]}}
                 for info in json.loads(output).get("deviceInfos", [])]
        if arguments[0] != "info":
            return
        if arguments[1] == serial:
            require(len(infos) == 1, f"asked for {serial}, answered {infos}")
            check_info(infos[0], serial)
        else:
            check_infos(infos, self.world.paired_between(start, time.monotonic()))

    def interrupt_kvrctl(self):
        program = self.kvrctl(*self.random.choice([["monitor", "--json"], ["info", "--all", "--policy", "refresh"]]))
        self.gate.rest(self.random.uniform(0, 2))
        program.send_signal(self.random.choice([signal.SIGTERM, signal.SIGKILL, signal.SIGINT]))
        program.communicate()
        self.report.count("runs of kvrctl cut short")

    def come_as_a_stranger(self):
        """A program without the entitlement."""
        program = self.start_program("dbus-send", f"--bus={self.world.address}", "--print-reply", f"--dest={NAME}", PATH,
                                     f"{INTERFACE}.DefaultDevice")
        output, errors = program.communicate(timeout=LIMIT)
        isGone = self.world.kind != "lasting" and any(name.encode() in errors for name in GONE)
        require(b"AccessDenied" in errors or isGone, f"a stranger was answered {output} {errors}")
        self.report.count("strangers turned away")

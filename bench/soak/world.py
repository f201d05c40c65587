"""A phone with its watches, their coverage service, and an agent on a bus of its own."""
import contextlib
import json
import os
import plistlib
import signal
import struct
import subprocess
import sys
import threading
import time
import urllib.request

from peer import BUS, NAME, RETURN, Peer, text

PHONE = "SNPHONE00001"
WATCHES = [f"SNWATCH{number:05}" for number in range(1, 7)]
OTHERS = [f"SNOTHER{number:05}" for number in range(1, 4)]
DEVICES = [PHONE, *WATCHES, *OTHERS]
TOKENS = "com.tarsil.vornic.supportapp.auth"
DAY = 86400
LIMIT = 180  # seconds: longer than whatever the agent may take

# Lines of the log at error level that what is done here leads to.
EXPECTED = [
    "Failed to fetch plist data", "Error serializing plist file", "No server version dictionary", "Incorrect format",
    "contains no plist data", "Server version dictionary missing", "kvragent failed to load warranty", "is no JSON",
    "Warranty failed to download", "Primary Nimbra Account is nil", "renewal of Vornic credential failed",
    "Rejecting connection", "its process has ended", "it has left the bus", "no altDSID",
]


class Clock:
    """The wall clock of all programs of the soak."""

    def __init__(self, path):
        self.path, self.shift, self.lastSet = path, 0, 0
        with open(path, "wb") as file:
            file.write(struct.pack("<q", 0))

    def now(self):
        return time.time() + self.shift

    def set(self, shift):
        self.shift, self.lastSet = shift, time.monotonic()
        with open(self.path, "r+b") as file:
            file.write(struct.pack("<q", shift))


class World:
    """`kind` says who starts the agent again when it has ended:

    "lasting"    nobody, for nobody ends it; it must not end by itself either
    "managed"    this object, as a service manager does
    "activated"  the bus, at the next call, or kvragent-wake
    """

    KINDS = ("lasting", "managed", "activated")

    def __init__(self, kind, directory, programs, clock, report):
        self.kind, self.directory, self.programs, self.clock, self.report = kind, directory, programs, clock, report
        self.home, self.device = f"{directory}/home", f"{directory}/device"
        self.isEnding = False
        self.children, self.keeper, self.agent = [], None, None
        self.log, self.logEnd = os.pipe()
        threading.Thread(target=self.read_log, daemon=True).start()
        self.lines, self.heldBack = [], None
        self.pairings = []  # (before it was written, after, serial numbers)
        self.signedIn = True
        self.prepare()
        self.start_bus()
        self.start_service()
        self.write_preferences()
        self.start_agent()

    # --- the files ---

    def write(self, name, content):
        """Replaces a file as an editor does, so that nobody reads half of it."""
        path = f"{self.directory}/{name}"
        os.makedirs(os.path.dirname(path), exist_ok=True)
        with open(f"{self.directory}/new", "wb") as file:
            file.write(content if isinstance(content, bytes) else plistlib.dumps(content))
        os.rename(f"{self.directory}/new", path)

    def prepare(self):
        self.write("service/kvrV2.plist", {"LowServerVersion": 2, "HighServerVersion": 3})
        self.write("device/DeviceProperties.plist",
                   {"SerialNumber": PHONE, "UserAssignedDeviceName": "Phone", "ProductVersion": "17.9"})
        self.write("device/FeatureFlags.plist", {"Kavrel": {"Bravik_3_0": True}})
        self.write("device/Entitlements.plist", {
            program: {"com.tarsil.private.kvragent": True}
            for program in (os.path.realpath(sys.executable), os.path.realpath(f"{self.programs}/kvrctl"))})
        self.write("home/Library/Activities/com.tarsil.kvragent.plist", {"OSVersion": "17.9", "activities": {}})
        for folder in ("Library", "Library/Preferences", "Library/Activities"):
            os.makedirs(f"{self.home}/{folder}", exist_ok=True)
            os.chmod(f"{self.home}/{folder}", 0o700)
        self.restore("before the start")

    def restore(self, offer):
        """The device as it is at every calm: all watches paired, an offer for each, signed in, in English."""
        self.pair(WATCHES)
        self.set_account(True)
        self.set_language("en_US")
        self.set_network(True)
        for serial in DEVICES:
            self.set_coverage(serial, offer, shownFrom=-10, eligible=20)

    def pair(self, serials):
        self.pairings.append((time.monotonic(), float("inf"), {*serials}))
        self.write("device/PairedDevices.plist", [
            {"name": f"Watch {serial}", "serialNumber": serial, "isPaired": True} for serial in serials])
        self.pairings[-1] = (self.pairings[-1][0], time.monotonic(), {*serials})

    def paired_between(self, start, end):
        """The sets of watches that may have been read in this time."""
        found = []
        for number, (before, _, serials) in enumerate(self.pairings):
            isLast = number == len(self.pairings) - 1
            if before <= end and (isLast or self.pairings[number + 1][1] >= start):
                found.append(serials)
        return found

    def set_account(self, signedIn, renewal=0):
        account = {"altDSID": "a", "storefront": "143441-1,29", "authenticationAccount": {
            "alternateDSID": "b", "tokens": {TOKENS: "token"},
            "renewal": {"resultCode": renewal, "tokens": {TOKENS: "renewed"}}}}
        self.write("device/Accounts.plist", {"primaryAccount": account} if signedIn else {})

    def set_language(self, language):
        self.write("device/Locale.plist", {"identifier": language})

    def set_network(self, reachable):
        self.write("device/Network.plist", {"reachable": reachable})

    def set_coverage(self, serial, offer, shownFrom, eligible):
        """Dates in days from now."""
        now = int(self.clock.now())
        for language in ("en_US", "fr_FR"):
            self.write(f"service/coverage/{serial}.{language}.json", json.dumps({
                "covered": True, "coverageEndDate": now + 300 * DAY, "coverageLocalizedLabel": f"{language} of {serial}",
                "zubOfferEligible": eligible > 0, "zubOfferEligibleUntil": now + int(eligible * DAY),
                "zubLocalizedOfferLabel": f"{offer} for {serial}", "zubLocalizedOfferDesc": "Repairs and more.",
                "zubLocalizedOfferSingularDesc": "One day left", "zubLocalizedOfferPluralDescFormat": "%@ days left",
                "zubLocalizedOfferCTA": "Add", "zubOfferFollowupDisplayDate": now + int(shownFrom * DAY),
                "zubOfferBadgeBeforeEndDate": 20,
                "featureToggleParameters": {"zubOfferDisplay": eligible > 0, "zubOfferSettingsRowBadge": True}}).encode())

    # --- the processes ---

    def environment(self):
        return {**os.environ, "HOME": self.home, "KVR_DEVICE_ROOT": self.device, "DBUS_SESSION_BUS_ADDRESS": self.address,
                "LC_ALL": "C", "TZ": "UTC", "JOURNAL_STREAM": "", "KVR_LOG_PRIVATE": "1", "KVR_CLOCK": self.clock.path,
                "LD_PRELOAD": f"{self.programs}/libkvr-soak-clock.so"}

    def start(self, *command, environment=None):
        child = subprocess.Popen(command, stdout=subprocess.PIPE, stderr=self.logEnd, text=True, env=environment)
        self.children.append(child)
        return child

    def start_bus(self):
        self.write("bus.conf", f"""<busconfig><type>session</type><listen>unix:dir={self.directory}</listen>
<servicedir>{self.directory}/services</servicedir><policy context="default"><allow send_destination="*"/>
<allow receive_sender="*"/><allow own="*"/></policy>
<limit name="max_connections_per_user">1000</limit></busconfig>""".encode())
        bus = self.start("dbus-daemon", f"--config-file={self.directory}/bus.conf", "--nofork", "--print-address=1")
        self.address = bus.stdout.readline().strip()

    def start_service(self):
        authority = f"{self.home}/Library/Keys/com.tarsil.kvragent.kestCertificates/authority.pem"
        service = self.start(f"{self.programs}/kvr-coverage-service", "--root", f"{self.directory}/service", "--authority",
                             authority, environment=self.environment())
        self.url = service.stdout.readline().split()[-1]

    def write_preferences(self):
        self.write("home/Library/Preferences/com.tarsil.kvragent.plist", {
            "PostUpgradeActivityCompleted": True, "PostUpgradeOutreachDelay": 1,
            "ServerVersionURL": f"{self.url}/library/TARSIL/asset/kvrV2.plist",
            "WarrantyURL": f"{self.url}/api/v3/coverage/summary",
            "WearablesWarrantyURL": f"{self.url}/api/v2/coverage/summary"})

    def misbehave(self, rules):
        headers = {"Content-Type": "application/json"}
        urllib.request.urlopen(urllib.request.Request(f"{self.url}/control", json.dumps(rules).encode(), headers)).read()

    def check_requests(self):
        """The service has checked what it was sent; a request without fault has no reason."""
        for name in os.listdir(f"{self.directory}/service/requests"):
            path = f"{self.directory}/service/requests/{name}"
            if not name.endswith(".json") or name.startswith("."):
                continue
            with open(path) as file:
                request = json.load(file)
            os.unlink(path)
            self.report.count("requests to the service")
            reason = request.get("reason")
            # A request that was under way when the clock was set has the former time.
            isOfFormerTime = "requestTimestamp" in (reason or "") and time.monotonic() - self.clock.lastSet < LIMIT
            if reason and not isOfFormerTime:
                self.report.fail(f"{self.kind}: a wrong request, {reason}")

    def start_agent(self):
        agent = f"{self.programs}/kvragent"
        if self.kind == "activated":
            script = "".join(f"export {name}='{value}'\n" for name, value in self.environment().items() if "KVR" in name
                             or name in ("HOME", "LC_ALL", "TZ", "JOURNAL_STREAM", "LD_PRELOAD", "DBUS_SESSION_BUS_ADDRESS"))
            self.write("start-agent", f"{script}{agent}\necho \"agent: status $?\" >&2\n".encode())
            self.write("services/agent.service", f"[D-BUS Service]\nName={NAME}\n"
                       f"Exec=/bin/sh {self.directory}/start-agent\n".encode())
            with Peer(self.address) as peer:
                peer.call(*BUS, "ReloadConfig")
        else:
            self.keeper = threading.Thread(target=self.run_agent, args=(agent,))
            self.keeper.start()
        self.wait_for_agent()

    def run_agent(self, program):
        """Starts the agent, and again whenever it ends, as a service manager does."""
        while not self.isEnding:
            # The variable by which a service manager tells a program that it was started by one.
            mark = "export SYSTEMD_EXEC_PID=$$; " if self.kind == "managed" else ""
            self.agent = subprocess.Popen(["/bin/sh", "-c", f"{mark}exec {program}"], stderr=self.logEnd,
                                          env=self.environment())
            self.note_end(self.agent.wait())

    def note_end(self, status):
        """An agent ends with status 0, or because it was killed."""
        isEarly = self.isEnding and status == -signal.SIGTERM  # it had not begun yet
        if status not in (0, -signal.SIGKILL) and not isEarly:
            self.report.fail(f"{self.kind}: it ended with status {status}")
        if self.kind == "lasting" and not self.isEnding:
            self.report.fail(f"{self.kind}: it ended, though nobody had asked it to")
        self.report.count("starts of the agent")

    def ask_bus(self, member, signature="", body=b""):
        with Peer(self.address) as peer:
            answer = peer.call(*BUS, member, signature, body)
            return answer.values()[0] if answer.kind == RETURN else None

    def agent_process(self):
        return self.ask_bus("GetConnectionUnixProcessID", "s", text(NAME))

    def wait_for_agent(self, but=None):
        """The process of the agent, once there is one (another one than `but`)."""
        end = time.monotonic() + LIMIT
        while time.monotonic() < end:
            if self.kind == "activated":
                self.ask_bus("StartServiceByName", "su", text(NAME) + b"\0" * (-len(text(NAME)) % 4 + 4))
            process = self.agent_process()
            if process and process != but:
                return process
            time.sleep(0.05)
        raise SystemExit(f"{self.kind}: there is no agent\n" + "".join(self.lines[-50:]))

    def kill_agent(self, by):
        """The process that was sent the signal, if there was one."""
        process = self.agent_process()
        with contextlib.suppress(ProcessLookupError):
            if process:
                os.kill(process, by)
        return process

    def connections(self):
        """How many programs are on the bus, besides the one that asks."""
        with Peer(self.address) as peer:
            return sum(name.startswith(":") for name in peer.call(*BUS, "ListNames").values()[0]) - 1

    def close(self):
        self.isEnding = True
        process = self.kill_agent(signal.SIGTERM)
        end = time.monotonic() + 20
        if self.keeper:
            self.keeper.join(20)
            while self.keeper.is_alive():  # it was just starting another one
                self.agent.terminate()
                self.keeper.join(1)
        while self.kind == "activated" and process and os.path.exists(f"/proc/{process}") and time.monotonic() < end:
            time.sleep(0.05)
        for child in reversed(self.children):
            child.send_signal(signal.SIGTERM)
            child.wait()

    def read_log(self):
        with open(self.log, errors="replace") as lines:
            for line in lines:
                self.lines.append(line)
                if "is held back until" in line:
                    self.heldBack = time.monotonic()
                del self.lines[:-2000]
                if line.startswith("agent: status "):
                    status = int(line.split()[-1])
                    self.note_end(-(status - 128) if status > 128 else status)
                elif " error " in line[:60] and not any(expected in line for expected in EXPECTED):
                    self.report.fail(f"{self.kind}: an unexpected line of the log: {line.strip()}")

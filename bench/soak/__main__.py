#!/usr/bin/env python3
"""The real agent on private buses, with the real coverage service, for a long time. See scripts/soak.

Three agents run side by side, each on a bus of its own. Clients come and go, files are edited, the service fails, the
clock is set. Nobody ends the first agent. The others are killed and ended, and started again as a service manager does
it, or by the bus. Every five minutes everything becomes calm, and the figures of each agent are taken: at the end, it
must be what it was after the first calm.
"""
import argparse
import concurrent.futures
import contextlib
import os
import signal
import struct
import sys
import tempfile
import threading
import time

ROOT = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
sys.dont_write_bytecode = True
sys.path.insert(0, os.path.join(ROOT, "bench"))

from clients import REFRESH, Clients  # noqa: E402
from disturbances import ClockSetter, Disturber  # noqa: E402
from peer import INTERFACE, NAME, PATH, RETURN, Peer, padded, text  # noqa: E402
from report import Report, figures, wakes  # noqa: E402
from world import DEVICES, LIMIT, PHONE, Clock, World  # noqa: E402


class Gate:
    """Lets everybody work until it is closed, and then waits until they have finished."""

    def __init__(self):
        self.changed, self.inside, self.isOpen, self.isOver = threading.Condition(), 0, False, False

    def enter(self):
        """Waits while the gate is closed; false at the end."""
        with self.changed:
            self.changed.wait_for(lambda: self.isOpen or self.isOver)
            self.inside += not self.isOver
            return not self.isOver

    def leave(self):
        with self.changed:
            self.inside -= 1
            self.changed.notify_all()

    def rest(self, seconds):
        with self.changed:
            self.changed.wait_for(lambda: not self.isOpen, seconds)

    def set(self, isOpen, isOver=False):
        with self.changed:
            self.isOpen, self.isOver = isOpen, isOver
            self.changed.notify_all()
            self.changed.wait_for(lambda: isOpen or self.inside == 0)


def files_of(world):
    """The files below the home directory, with their sizes."""
    return {os.path.relpath(f"{folder}/{name}", world.home): os.path.getsize(f"{folder}/{name}")
            for folder, _, names in os.walk(world.home) for name in names}


def check_files(world, files):
    """No temporary file of a killed agent stays once something was written beside it; nothing was damaged."""
    for name in files:
        if ".damaged-" in name:
            world.report.fail(f"{world.kind}: {name}")
        if ".kvr-" in name:
            folder = os.path.dirname(f"{world.home}/{name}")
            times = {path: os.stat(f"{folder}/{path}").st_mtime for path in os.listdir(folder)}
            if times.pop(os.path.basename(name)) < max(times.values(), default=0):
                world.report.fail(f"{world.kind}: the temporary file {name} stays")


def wait_for_offer(world, offer):
    """The phone's offer, which nobody dismisses, is shown as the service says it now. An activity that has been started
    often may be held back for ten minutes; then nobody waits for it here."""
    end = time.monotonic() + LIMIT
    while time.monotonic() < end:
        with contextlib.suppress(FileNotFoundError), \
                open(f"{world.home}/Library/FollowUps/com.tarsil.Kavrel.plist", "rb") as file:
            if f"{offer} for {PHONE}".encode() in file.read():
                return
        if world.heldBack and time.monotonic() - world.heldBack < 600:
            return world.report.count("offers held back in a calm")
        time.sleep(0.1)
    world.report.fail(f"{world.kind}: {offer} is not shown")


def rest(world, process):
    """Waits until no thread of the agent runs any more."""
    end = time.monotonic() + LIMIT
    before = None
    while before != (before := wakes(process)):
        if time.monotonic() > end:
            return world.report.fail(f"{world.kind}: it does not come to rest")
        time.sleep(7)  # longer than it keeps connections to the service open


def calm(world, number):
    """Makes everything as it was, has the agent do everything once, and takes the figures when it rests."""
    offer = f"Offer {number}"
    world.restore(offer)
    process = world.agent_process()
    if world.kind != "lasting":
        world.kill_agent(signal.SIGTERM)
        process = world.wait_for_agent(but=process)

    def call(member, signature="", body=b""):
        answer = peer.call(NAME, PATH, INTERFACE, member, signature, body, limit=LIMIT)
        if answer.kind != RETURN:
            raise SystemExit(f"{world.kind}: in a calm, {member} is answered {answer.error}")
        return answer.values()[0]

    with Peer(world.address) as peer:
        # A refused token is renewed.
        world.misbehave({"coverage": [{"status": 401, "times": 1}], "asset": []})
        for serial in DEVICES:
            info = call("GetDeviceInfoForSerialNumber", "st", padded(text(serial), 8) + struct.pack("<Q", REFRESH))
            warranty = info.get("warranty", {}).get("DictionaryRepresentation", {})
            if warranty.get("zubLocalizedOfferLabel") != f"{offer} for {serial}":
                world.report.fail(f"{world.kind}: in a calm the service says {offer}, the answer is {warranty}")
        call("AppSupportAvailability", "s", text("com.example.app"))
        call("GetAllDeviceInfosUsingPolicy", "tb", struct.pack("<QI", REFRESH, True))
        call("ScheduleOutreach")
        wait_for_offer(world, offer)
    rest(world, process)
    if world.agent_process() != process:
        world.report.fail(f"{world.kind}: another agent after the calm")
    files = files_of(world)
    check_files(world, files)
    found = {**figures(process), "on the bus": world.connections(), "files": len(files), "bytes": sum(files.values())}
    world.report.say(f"{world.kind}: " + ", ".join(f"{name} {value}" for name, value in found.items()))
    return found, {*files}


def compare(world, calms, growth):
    """The last calm against the first one, the end of the warm-up."""
    (first, firstFiles), (last, lastFiles) = calms[0], calms[-1]
    for name in ("descriptors", "threads", "on the bus"):
        if first[name] != last[name]:
            world.report.fail(f"{world.kind}: {last[name]} instead of {first[name]} {name}")
    if last["written"] > first["written"] + growth:
        world.report.fail(f"{world.kind}: {last['written']} KiB of memory written to, instead of {first['written']}")
    if firstFiles != lastFiles:
        world.report.fail(f"{world.kind}: other files than before: {firstFiles ^ lastFiles}")
    if last["bytes"] > 2 * first["bytes"]:  # how many offers are shown and were dismissed differs
        world.report.fail(f"{world.kind}: {last['bytes']} bytes in files, instead of {first['bytes']}")


def print_table(report, history):
    names = ("written", "private", "PSS", "descriptors", "threads", "on the bus", "files", "bytes")
    print("\n| Agent, KiB: | " + " | ".join(names) + " |\n" + "|---" * (len(names) + 1) + "|")
    for kind, calms in history.items():
        for when, (found, _) in (("after the warm-up", calms[0]), ("at the end", calms[-1])):
            print(f"| {kind}, {when} | " + " | ".join(str(found[name]) for name in names) + " |")
    print("\n| What | How often |\n|---|---|")
    for what, times in sorted(report.counts.items()):
        print(f"| {what} | {times} |")
    print(f"\n{len(report.failures)} failures")
    for failure in report.failures[:100]:
        print(f"  {failure}")


def soak(options, directory, report):
    clock, gate = Clock(f"{directory}/clock"), Gate()
    worlds = []
    for kind in options.only or World.KINDS:
        os.mkdir(f"{directory}/{kind}")
        worlds.append(World(kind, f"{directory}/{kind}", os.path.abspath(options.programs), clock, report))
    everybody = [ClockSetter(clock, gate, 15, report, options.seed)]
    for world in worlds:
        everybody += [Clients(world, gate, options.think, f"{options.seed}/{world.kind}/{slot}") for slot in range(4)]
        isLong = options.minutes > 5 and options.think > 0.1
        everybody.append(Disturber(world, gate, 2, isLong, f"{options.seed}/{world.kind}"))
    calms = max(2, round(options.minutes / 5))
    history = {world.kind: [] for world in worlds}
    try:
        for number in range(1, calms + 1):
            gate.set(True)
            end = time.monotonic() + options.minutes * 60 / calms
            while time.monotonic() < end:
                time.sleep(1)
                for world in worlds:
                    world.check_requests()
            gate.set(False)
            report.say(", ".join(f"{times} {what}" for what, times in sorted(report.counts.items())))
            with concurrent.futures.ThreadPoolExecutor() as pool:
                for world, figuresOfCalm in zip(worlds, pool.map(calm, worlds, [number] * len(worlds))):
                    history[world.kind].append(figuresOfCalm)
    finally:
        gate.set(False, True)
        for one in everybody:
            one.thread.join()
        for world in worlds:
            world.close()
    for world in worlds:
        compare(world, history[world.kind], options.growth)
    print_table(report, history)


def main():
    options = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    options.add_argument("--minutes", type=float, default=60, help="without the calms")
    options.add_argument("--seed", type=int, default=1, help="what each client does, but not when")
    options.add_argument("--think", type=float, default=0.5,
                         help="seconds between two clients of one of the four slots; with little, the service's failures "
                         "that take half a minute are left out")
    options.add_argument("--growth", type=int, default=512, help="KiB by which the written memory may grow")
    options.add_argument("--only", choices=World.KINDS, action="append", help="only this agent")
    options.add_argument("--programs", default=os.path.join(ROOT, "build/release/bin"))
    options = options.parse_args()
    report = Report()
    signal.signal(signal.SIGTERM, lambda *_: sys.exit("told to end"))
    with tempfile.TemporaryDirectory() as directory:
        soak(options, directory, report)
    return 1 if report.failures else 0


sys.exit(main())

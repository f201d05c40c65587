"""Faults that scripts/planted-faults plants: their patches, the copies of the tree they are planted in, and the programs
that must find them."""
import dataclasses
import hashlib
import json
import os
import pathlib
import re
import shutil
import signal
import subprocess
import time

from rooms import ROOT, git_files

FAULTS = ROOT / "faults"
OUTSIDE = ("tests/", "faults/", "docs/")  # what a fault may not change
UNUSED = ("faults/", "docs/", "scripts/")  # what the copies do without
LEAST_LIMIT = 60  # seconds for a stage
LIMIT_FACTOR = 10  # ... or so many times what it takes on the tree without a fault


class Stale(Exception):
    """The patch does not fit the tree."""


class Broken(Exception):
    """Nothing can be said about the fault: the copy does not build, or a program does not start."""


@dataclasses.dataclass
class Fault:
    room: str
    name: str
    harm: str
    is_for_compiler: bool  # the patch says that the compiler is to find it
    hunks: list  # (file, line, old lines, new lines)
    digest: str

    @property
    def id(self):
        return f"{self.room}/{self.name}"

    @property
    def files(self):
        return list(dict.fromkeys(hunk[0] for hunk in self.hunks))

    def planted(self, tree):
        """The texts of the files that the fault changes, with the fault. Raises Stale."""
        texts = {}
        for file, line, old, new in self.hunks:
            if file not in texts:
                if not (tree / file).is_file():
                    raise Stale(f"{file} does not exist")
                texts[file] = ((tree / file).read_text().split("\n"), 0)
            lines, shift = texts[file]
            places = [at for at in range(len(lines) - len(old) + 1) if lines[at:at + len(old)] == old]
            if not places:
                raise Stale(f"{file} has changed near line {line}")
            place = line - 1 + shift if line - 1 + shift in places else places[0]
            if len(places) > 1 and place != line - 1 + shift:
                raise Stale(f"{file} has several places like line {line}")
            lines[place:place + len(old)] = new
            texts[file] = (lines, shift + len(new) - len(old))
        return {file: "\n".join(lines) for file, (lines, _) in texts.items()}


def read_fault(path):
    text = path.read_text()
    head = re.split(r"^--- ", text, maxsplit=1, flags=re.MULTILINE)[0]
    harm = re.search(r"^Harm: (.+?)(?:\n\n|\n*\Z|\n(?=\w+:|diff --git))", head, re.MULTILINE | re.DOTALL)
    if not harm:
        raise Broken(f"{path.relative_to(ROOT)}: does not say the harm")
    hunks, file = [], None
    lines = iter(text[len(head):].split("\n"))
    for line in lines:
        if line.startswith("+++ b/"):
            file = line[len("+++ b/"):].split("\t")[0]
            if file.startswith(OUTSIDE):
                raise Broken(f"{path.relative_to(ROOT)}: changes {file}")
        elif found := re.match(r"@@ -(\d+)(?:,(\d+))? \+\d+(?:,(\d+))? @@", line):
            removed, added = (int(found[group] or 1) for group in (2, 3))
            old, new = [], []
            while len(old) < removed or len(new) < added:
                line = next(lines, None)
                if line is None:
                    raise Broken(f"{path.relative_to(ROOT)}: ends in the middle of a hunk")
                if line[:1] in ("-", " ", ""):
                    old.append(line[1:])
                if line[:1] in ("+", " ", ""):
                    new.append(line[1:])
            hunks.append((file, int(found[1]), old, new))
    if not hunks:
        raise Broken(f"{path.relative_to(ROOT)}: changes nothing")
    return Fault(path.parent.name, path.stem, " ".join(harm[1].split()), "\nExpect: compiler" in head, hunks,
                 hashlib.sha256(text.encode()).hexdigest())


def read_faults():
    return [read_fault(path) for path in sorted(FAULTS.glob("*/*.patch"))]


@dataclasses.dataclass
class Ending:
    status: int  # below zero: the signal
    output: str
    hangs: bool
    seconds: float


class Copy:
    """A copy of the tree with its own build, without optimisation. It stays, so that building is incremental."""

    def __init__(self, folder, jobs):
        self.folder, self.tree, self.build = folder, folder / "tree", folder / "build"
        self.jobs = jobs
        self.running = None  # the process group of the command that runs
        self.environment = dict(os.environ, CCACHE_BASEDIR=str(folder), CCACHE_NOHASHDIR="1",
                                CCACHE_SLOPPINESS="pch_defines,time_macros,include_file_mtime,include_file_ctime")

    def sync(self):
        """Makes the copy equal to the tree; returns a digest of it. Files that are equal keep their time."""
        digest = hashlib.sha256()
        wanted = {name for name in git_files() if not name.startswith(UNUSED)}
        for name in sorted(wanted):
            content = (ROOT / name).read_bytes()
            digest.update(f"{name}\0{len(content)}\0".encode() + content)
            copy = self.tree / name
            if not copy.is_file() or copy.read_bytes() != content:
                copy.parent.mkdir(parents=True, exist_ok=True)
                copy.write_bytes(content)
        for path in list(self.tree.rglob("*")):
            if path.is_file() and str(path.relative_to(self.tree)) not in wanted:
                path.unlink()
        return digest.hexdigest()

    def configure(self):
        options = {
            "CMAKE_BUILD_TYPE": "None", "CMAKE_CXX_COMPILER": "g++", "CMAKE_CXX_FLAGS": "-O0 -g0 -DNDEBUG",
            "KVR_TESTS": "ON", "KVR_BENCH": "OFF", "CMAKE_GTEST_DISCOVER_TESTS_DISCOVERY_MODE": "PRE_TEST"}
        if shutil.which("ld.lld"):
            options |= {f"CMAKE_{kind}_LINKER_FLAGS": "-fuse-ld=lld" for kind in ("EXE", "SHARED", "MODULE")}
        if shutil.which("ccache"):
            options["CMAKE_CXX_COMPILER_LAUNCHER"] = "ccache"
        ending = self.run(["cmake", "-S", str(self.tree), "-B", str(self.build), "-G", "Ninja",
                           *(f"-D{key}={value}" for key, value in options.items())], 600)
        if ending.status:
            raise Broken("the tree cannot be configured:\n" + ending.output[-3000:])

    def digest(self, stage):
        """What the stage runs. If it is the same as without a fault, the stage can find nothing."""
        digest = hashlib.sha256()
        for path in sorted((self.build / "bin").iterdir()):
            if stage.programs is None or path.name in stage.programs:
                digest.update(path.read_bytes())
        return digest.hexdigest()

    def make(self, target):
        """Builds a target; returns the compiler's output if it fails."""
        ending = self.run(["cmake", "--build", str(self.build), "--target", target, "-j", str(self.jobs)], 3600)
        return ending.output if ending.status else None

    def run(self, command, limit):
        """Runs a command to its end, or ends it and all that it started after `limit` seconds."""
        began = time.monotonic()
        output = self.folder / "output.txt"
        with open(output, "wb") as file:
            process = subprocess.Popen(command, stdout=file, stderr=subprocess.STDOUT, stdin=subprocess.DEVNULL,
                                       cwd=self.folder, env=self.environment, start_new_session=True)
            self.running = process.pid
            hangs = False
            try:
                process.wait(limit)
            except subprocess.TimeoutExpired:
                hangs = True
            self.kill()
            process.wait()
        return Ending(process.returncode, output.read_text(errors="replace"), hangs, time.monotonic() - began)

    def kill(self):
        """Ends the command that runs, with what it has started."""
        group, self.running = self.running, None
        try:
            if group:
                os.killpg(group, signal.SIGKILL)
        except ProcessLookupError:
            pass

    def plant(self, fault):
        texts = fault.planted(self.tree)
        originals = {file: (self.tree / file).read_text() for file in texts}
        for file, text in texts.items():
            (self.tree / file).write_text(text)
        return originals

    def take_out(self, originals):
        for file, text in originals.items():
            (self.tree / file).write_text(text)


class TestStage:
    """A program of test cases. What it finds counts if the test case fails again on its own."""

    MOST_UNSTEADY = 3

    def __init__(self, name, target, programs):
        """`programs`: what it runs and loads; None if that is everything."""
        self.name, self.target, self.programs = name, target, programs

    def find(self, copy, limit, hint=None):
        """The name of a test that fails and how; None if none does. Raises Broken if that cannot be said."""
        excluded = []
        while True:
            pattern = hint or ("*-" + ":".join(excluded) if excluded else "*")
            test, how = self._first_failure(copy, limit, pattern)
            if not test:
                return None
            again, how_again = self._first_failure(copy, limit, test)
            if again:
                return f"{test}{how_again}"
            excluded.append(test)
            if hint:
                return None
            if len(excluded) > self.MOST_UNSTEADY:
                raise Broken(f"{', '.join(excluded)} failed only once")

    def _first_failure(self, copy, limit, pattern):
        ending = copy.run([str(copy.build / "bin" / self.target), "--gtest_fail_fast", "--gtest_color=no",
                           f"--gtest_filter={pattern}"], limit)
        begun = re.findall(r"^\[ RUN      \] (\S+)", ending.output, re.MULTILINE)
        failed = re.search(r"^\[  FAILED  \] ([\w/.]+)", ending.output, re.MULTILINE)
        if ending.status == 0 and not ending.hangs:
            if not re.search(r"^\[  PASSED  \]", ending.output, re.MULTILINE):
                raise Broken(f"{self.target} did nothing")
            return None, ""
        if failed:
            return failed[1], ""
        if not begun:
            raise Broken(f"{self.target} does not start: {ending.output[-500:]}")
        return begun[-1], " (hangs)" if ending.hangs else f" (ends with {ending.status})"


class SimulationStage:
    """Whole lives in virtual time. The same seed is the same life, so nothing needs to be repeated."""

    name, target, programs = "simulation", "kvr-simulate", ("kvr-simulate",)

    def __init__(self, lives):
        self.lives = lives

    def find(self, copy, limit, hint=None):
        first, count = (hint.split()[1], "1") if hint and re.match(r"seed \d+ ", hint) else ("1", str(self.lives))
        ending = copy.run([str(copy.build / "bin" / self.target), "--first", first, "--seeds", count, "--years", "1",
                           "--brief", "--jobs", str(copy.jobs)], limit)
        if ending.hangs:
            return "hangs"
        if ending.status == 0:
            return None
        if found := re.search(r'^seed (\d+): "([^"]+)"', ending.output, re.MULTILINE):
            return f"seed {found[1]} {found[2]}"
        if ending.status < 0 and -ending.status != signal.SIGKILL:
            return f"ends with {ending.status}"
        raise Broken(f"kvr-simulate does not start: {ending.output[-500:]}")


def stages(lives):
    return [TestStage("unit", "unit_tests", ("unit_tests",)),
            TestStage("conformance", "conformance_tests", ("conformance_tests", "libkvragent-locale.so")),
            SimulationStage(lives), TestStage("integration", "integration_tests", None)]


def limit_of(seconds):
    return max(LEAST_LIMIT, LIMIT_FACTOR * seconds)


class Memory:
    """What is remembered from one run to the next, beside the copies."""

    def __init__(self, path):
        self.path = path
        self.content = json.loads(path.read_text()) if path.exists() else {}

    def __getitem__(self, key):
        return self.content.get(key)

    def __setitem__(self, key, value):
        self.content[key] = value
        self.path.parent.mkdir(parents=True, exist_ok=True)
        temporary = self.path.with_suffix(".new")
        temporary.write_text(json.dumps(self.content, indent=1, sort_keys=True))
        temporary.replace(self.path)

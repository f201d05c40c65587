"""Reads the rooms of the tree from the CMakeLists.txt files, and the includes of its files."""
import pathlib
import re
import subprocess

ROOT = pathlib.Path(__file__).resolve().parent.parent
TREES = ("src", "tools", "tests", "bench", "fuzz")
# Where to look for includes in quotes, after the file's own folder.
INCLUDE_ROOTS = ("src", "tests", "tools")
OPEN_TO_ALL = set(
    """algorithm array atomic bit cctype cerrno charconv climits cmath compare concepts cstddef cstdint 
    cstring deque exception functional initializer_list istream iterator limits list map memory mutex new numeric
    optional ostream queue random ratio set span sstream stdexcept string string_view system_error tuple type_traits
    typeindex typeinfo unordered_map unordered_set utility variant vector""".split())

CALL = re.compile(r"^kvr_(room|program|module|tests)\(([^()]*)\)", re.MULTILINE)
INCLUDE = re.compile(r'^[ \t]*#[ \t]*include[ \t]+(["<])([^">]+)[">]', re.MULTILINE)
KEYWORDS = ("USES", "SYSTEM", "LINKS", "WITHOUT")


def git_files(*patterns):
    listed = subprocess.check_output(
        ["git", "ls-files", "--cached", "--others", "--exclude-standard", "--", *patterns], cwd=ROOT, text=True)
    return [name for name in listed.splitlines() if (ROOT / name).exists()]


class Room:
    def __init__(self):
        self.uses, self.system = set(), set()
        self.needed = set()


def folder_of(room, folders):
    """The folder of a room from the root of the tree: core/warranty is below src, tests/unit is not."""
    return f"src/{room}".rstrip("/.") if room == "." or f"src/{room}" in folders else room


def read_rooms(texts, folders):
    rooms = {}
    for text in texts:
        for kind, body in CALL.findall(re.sub(r"#.*", "", text)):
            words = body.split()
            name = words[1] if kind in ("program", "module") else words[0]
            if name.startswith("$"):
                continue
            room = rooms.setdefault(folder_of(name, folders), Room())
            keyword = None
            for word in words[1:]:
                if word in KEYWORDS:
                    keyword = word
                elif keyword == "USES":
                    room.uses.add(folder_of(word, folders))
                elif keyword == "SYSTEM":
                    room.system.add(word.strip("<>"))
    return rooms


def read_tree():
    """The text of every source file by its name, and a function that reads the rooms again."""
    sources = {name: (ROOT / name).read_text(errors="replace")
               for name in git_files(*TREES) if name.endswith((".h", ".cpp"))}
    folders = {name.rsplit("/", 1)[0] for name in sources}
    texts = [(ROOT / name).read_text() for name in git_files("*CMakeLists.txt")]
    return sources, lambda: read_rooms(texts, folders)


def target_of(header, folder, sources):
    """The file that an include in quotes names when a file in `folder` has it; None if there is none."""
    candidates = [f"{folder}/{header}"] + [f"{root}/{header}" for root in INCLUDE_ROOTS]
    return next((file for file in candidates if file in sources), None)

"""Who may include whom, and what the core must not reach for.

The table of the architecture, folder by folder: which folders of the project a file may include
from, and whether it may include headers of the operating system or of libraries. The core reaches
the machine through QVPlatform alone, so that all of it can be tested; here is what it would get
around that with.
"""

import re

from project import INCLUDE, open_project, without_comments, without_comments_and_strings

STANDARD_HEADERS = set("""
    algorithm any array atomic barrier bit bitset cassert cctype cerrno cfenv cfloat charconv
    chrono cinttypes climits clocale cmath codecvt compare complex concepts condition_variable
    coroutine csetjmp csignal cstdarg cstddef cstdint cstdio cstdlib cstring ctime cuchar cwchar
    cwctype deque exception execution filesystem forward_list fstream functional future
    initializer_list iomanip ios iosfwd iostream istream iterator latch limits list locale map
    memory memory_resource mutex new numbers numeric optional ostream queue random ranges ratio
    regex scoped_allocator semaphore set shared_mutex source_location span sstream stack stdexcept
    stop_token streambuf string string_view syncstream system_error thread tuple type_traits
    typeindex typeinfo unordered_map unordered_set utility valarray variant vector version
    """.split())

# Headers of the standard that are a way past the platform's interfaces.
MACHINE_HEADERS = {
    "condition_variable": "QVConditions", "filesystem": "QVPlatform", "fstream": "QVPlatform",
    "future": "QVWorkQueues", "iostream": "QVLog", "latch": "QVConditions",
    "barrier": "QVConditions", "semaphore": "QVConditions", "stop_token": "QVWorkQueues",
    "thread": "QVWorkQueues", "csignal": "QVProcess",
}

# Calls and names that are a way past them.
MACHINE_NAMES = [
    (re.compile(r"\b(?:secure_)?getenv\b"), "the environment is the adapters' business"),
    (re.compile(r"\bargv\b"), "the command line is the composition root's business"),
    (re.compile(r"\w::now\s*\("), "ask QVClock"),
    (re.compile(r"\b(?:random_device|std::rand|srand)\b"), "ask QVRandom"),
    (re.compile(r"(?<![\w.>:])(?:std::|::)?(?:_?exit|quick_exit|_Exit|abort|system|popen)\s*\("),
     "ask QVProcess"),
    (re.compile(r"\b(?:fopen|freopen|tmpfile|FILE)\b"), "ask the file system of QVPlatform"),
    (re.compile(r"\bstd::(?:time|clock|localtime|gmtime|timespec_get)\s*\("), "ask QVClock"),
    (re.compile(r"\b(?:stderr|stdout|printf)\b"), "write to QVLog"),
    (re.compile(r"\bextern\b|\bsyscall\s*\("), "the operating system is the adapters' business"),
]

# Libraries that stay behind the adapters.
LIBRARIES = {
    "Asio": re.compile(r"asio(\.hpp$|/)"),
    "libsystemd": re.compile(r"systemd/"),
    "RapidJSON": re.compile(r"rapidjson/"),
    "SQLite": re.compile(r"sqlite3"),
}


class Layer:
    """What the files of a folder may include.

    `project` are patterns of the project's files, `system` says whether headers beyond the standard
    are allowed, `libraries` which of LIBRARIES, `machine` whether the machine may be reached for.
    """

    def __init__(self, folder, project, system=False, libraries=(), machine=True):
        self.folder = folder
        self.project = [re.compile(pattern + r"\Z") for pattern in project]
        self.system = system
        self.libraries = set(libraries)
        self.machine = machine


_PLATFORM = r"platform/\w+\.h"
_ANY = r".*"
# What is shared by adapters lies in their folder itself; the wire code, and with it the client, uses
# those headers of it that need no source: it is linked without the rest.
_SHARED = r"platform/linux/\w+\.h"
_SHARED_WITHOUT_SOURCE = r"platform/linux/(QVDescriptor|QVThreadAnnotations|QVWakeUpBatch)\.h"

_SHARED_WITH_TOOLS = (r"platform/linux/(QVDescriptor|output/QVPosixAtomicFile|settings/QVServiceDirectories|"
                      r"store/(QVEventStoreSchema|QVJSONText)|files/\w+|tally/\w+)\.h")


def adapter(name, others=(), libraries=(), shared=_SHARED):
    """The layer of an adapter's folder, which may include from those `others`."""
    folders = [rf"platform/linux/{folder}/\w+\.h" for folder in (name, *others)]
    return Layer(f"platform/linux/{name}", [_PLATFORM, shared, *folders], system=True, libraries=libraries)


# The first folder that a file lies in, or the file itself, decides.
LAYERS = [
    Layer("platform/fake", [_PLATFORM, r"platform/fake/\w+\.h"]),
    # Their code goes into the client without the rest of the adapters, but for the sockets.
    adapter("bus", libraries=["Asio", "libsystemd"],
            shared=r"platform/linux/(QVDescriptor|QVLogException|QVThreadAnnotations|QVWakeUpBatch)\.h"),
    adapter("files", libraries=["RapidJSON"], shared=_SHARED_WITHOUT_SOURCE),
    adapter("log", ["bus"], libraries=["libsystemd"]),
    adapter("orientation", ["files", "watch"], libraries=["libsystemd"]),
    adapter("output", libraries=["RapidJSON"]),
    adapter("queues", libraries=["Asio"]),
    adapter("settings", ["files"]),
    adapter("store", ["output"], libraries=["RapidJSON", "SQLite"]),
    adapter("system", ["bus"]),
    adapter("tally", ["files"]),
    adapter("watch"),
    Layer("platform/linux", [_PLATFORM, _SHARED], system=True),
    Layer("platform", [_PLATFORM], machine=False),
    Layer("QVServices/Statistics/Service", [_PLATFORM, r"QVServices/Statistics/(Service/)?\w+\.h"],
          machine=False),
    Layer("QVServices", [_PLATFORM, r"QVServices/Statistics/\w+\.h"], machine=False),
    Layer("client",
          [_PLATFORM, r"client/.*\.h", r"platform/linux/(bus|files)/\w+\.h", _SHARED_WITHOUT_SOURCE],
          system=True),
    Layer("daemon", [_PLATFORM, r"platform/linux/(\w+/)*\w+\.h", r"QVServices/.*\.h", r"daemon/.*\.h"],
          system=True),
    # Of the core, the tools know the vocabulary alone; of the adapters those that read and write
    # files, so that they are read in one way only.
    Layer("tools",
          [_PLATFORM, r"tools/.*\.h", r"client/.*\.h",
           r"QVServices/Statistics/QVReportingVocabulary\.h", _SHARED_WITH_TOOLS],
          system=True, libraries=["SQLite"]),
    Layer("tests", [_ANY], system=True, libraries=LIBRARIES),
    Layer("bench", [_ANY], system=True, libraries=LIBRARIES),
    Layer("fuzz", [_ANY], system=True, libraries=LIBRARIES),
]

def layer_of(name):
    return next((layer for layer in LAYERS
                 if name == layer.folder or name.startswith(layer.folder + "/")), None)


def check_include(project, layer, name, line, match):
    if match["other"] is not None:
        project.report(name, line, "layering", "an include whose file is not written out")
        return
    if match["quoted"] is not None:
        target = project.resolve(name, match["quoted"])
        if target is None:
            project.report(name, line, "layering",
                           f'"{match["quoted"]}" is no file of the project; others go in <>')
        elif not any(pattern.match(target) for pattern in layer.project):
            project.report(name, line, "layering", f"{layer.folder}/ may not include {target}")
        return
    header = match["angled"]
    if project.has(header):
        project.report(name, line, "layering", f'a file of the project is included as "{header}"')
        return
    for library, pattern in LIBRARIES.items():
        if pattern.match(header) and library not in layer.libraries:
            project.report(name, line, "layering", f"{layer.folder}/ may not include {library} ({header})")
            return
    if header not in STANDARD_HEADERS and not layer.system:
        project.report(name, line, "layering",
                       f"{layer.folder}/ may include standard headers only, not <{header}>")
    elif header in MACHINE_HEADERS and not layer.machine:
        project.report(name, line, "machine",
                       f"{layer.folder}/ may not include <{header}>: use {MACHINE_HEADERS[header]}")


def main():
    project, _ = open_project(__doc__)
    for name in project.sources():
        layer = layer_of(name)
        if layer is None:
            project.report(name, 1, "layering", "lies in no folder of the architecture")
            continue
        text = project.read(name)
        for match in INCLUDE.finditer(without_comments(text)):
            line = text.count("\n", 0, match.start()) + 1
            check_include(project, layer, name, line, match)
        if layer.machine:
            continue
        for line, code in enumerate(without_comments_and_strings(text).split("\n"), 1):
            for pattern, advice in MACHINE_NAMES:
                found = pattern.search(code)
                if found:
                    project.report(name, line, "machine", f"{found[0].strip()}: {advice}")
    project.finish()


if __name__ == "__main__":
    main()

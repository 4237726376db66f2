"""Runs clang-tidy on every C++ source, several at a time, skipping what it found clean before.

What a run's outcome depends on (the source, the project's headers it includes, the configuration,
the compiler's arguments, the versions of clang-tidy and of the installed libraries) is hashed; a
clean run leaves a file of that name in the cache.
"""

import concurrent.futures
import hashlib
import json
import os
import re
import shlex
import subprocess
import sys
import time

from project import INCLUDE, open_project

TIDY = "clang-tidy-19"
# A clean file that no run has asked for in this time has been changed or is gone.
CACHE_SECONDS = 30 * 24 * 3600
FINDING = re.compile(r"^(?P<path>[^:\n]+):(?P<line>\d+):\d+: (?:error|warning): (?P<text>.*)", re.MULTILINE)


def version_of(*command):
    return subprocess.run(command, capture_output=True, text=True, check=True).stdout


class Tidy:
    def __init__(self, project, build, cache):
        self.project = project
        self.build = os.path.join(project.root, build)
        self.cache = os.path.join(project.root, cache)
        os.makedirs(self.cache, exist_ok=True)
        with open(os.path.join(self.build, "compile_commands.json"), encoding="utf-8") as file:
            self.commands = {os.path.relpath(entry["file"], project.root): entry
                             for entry in json.load(file)}
        self.digests = {}
        self.closures = {}
        self.common = version_of(TIDY, "--version")
        self.common += version_of("dpkg-query", "--show", "*-dev") if os.path.exists("/var/lib/dpkg") else ""

    def digest(self, name):
        if name not in self.digests:
            self.digests[name] = hashlib.sha256(self.project.read(name).encode()).hexdigest()
        return self.digests[name]

    def includes(self, name):
        """The project's headers that `name` includes itself."""
        if name not in self.closures:
            quoted = (match["quoted"] for match in INCLUDE.finditer(self.project.read(name)))
            resolved = (self.project.resolve(name, path) for path in quoted if path)
            self.closures[name] = {path for path in resolved if path}
        return self.closures[name]

    def key(self, name):
        files, waiting = set(), [name]
        while waiting:
            path = waiting.pop()
            if path not in files:
                files.add(path)
                waiting += self.includes(path)
        folder = os.path.dirname(name)
        while True:
            configuration = os.path.join(folder, ".clang-tidy")
            if self.project.has(configuration):
                files.add(configuration)
            if not folder:
                break
            folder = os.path.dirname(folder)
        entry = self.commands[name]
        arguments = entry.get("arguments") or shlex.split(entry["command"])
        text = "\n".join([self.common, *arguments, *(f"{path} {self.digest(path)}" for path in sorted(files))])
        return os.path.join(self.cache, hashlib.sha256(text.encode()).hexdigest())

    def run(self, name):
        """The findings in one source; what clang-tidy says where it fails otherwise."""
        answer = subprocess.run([TIDY, "-p", self.build, "--quiet", os.path.join(self.project.root, name)],
                                cwd=self.project.root, capture_output=True, text=True)
        findings = []
        for match in FINDING.finditer(answer.stdout):
            path = os.path.relpath(os.path.join(self.project.root, match["path"]), self.project.root)
            text = match["text"].replace(",-warnings-as-errors", "")
            findings.append((path, int(match["line"]), "tidy", text))
        if answer.returncode != 0 and not findings:
            last = (answer.stdout + answer.stderr).strip().split("\n")[-12:]
            findings.append((name, 1, "tidy", f"{TIDY} failed ({answer.returncode}): " + "\n  ".join(last)))
        return findings

    def prune(self):
        oldest = time.time() - CACHE_SECONDS
        for entry in os.scandir(self.cache):
            if entry.stat().st_mtime < oldest:
                os.unlink(entry.path)


def main():
    def add_arguments(parser):
        parser.add_argument("--build", default="build/check", help="where compile_commands.json lies")
        parser.add_argument("--cache", default="build/.tidy-cache")
        parser.add_argument("--jobs", type=int, default=os.cpu_count())
    project, arguments = open_project(__doc__, add_arguments)
    tidy = Tidy(project, arguments.build, arguments.cache)
    sources = project.sources(".cpp")
    for name in sources:
        if name not in tidy.commands:
            project.report(name, 1, "tidy", "no target of the build compiles it")
    keys = {name: tidy.key(name) for name in sources if name in tidy.commands}
    changed = [name for name, key in keys.items() if not os.path.exists(key)]
    # Long ones first, so that no processor ends up waiting for the last.
    changed.sort(key=lambda name: (not name.startswith("tests/"), -len(project.read(name))))
    with concurrent.futures.ThreadPoolExecutor(arguments.jobs) as pool:
        for name, findings in zip(changed, pool.map(tidy.run, changed)):
            project.findings += findings
            if not findings:
                open(keys[name], "w").close()
    for name in keys.keys() - set(changed):
        os.utime(keys[name])
    tidy.prune()
    print(f"{TIDY}: {len(changed)} of {len(keys)} sources, the others unchanged", file=sys.stderr)
    project.finish()


if __name__ == "__main__":
    main()

"""What the checks share: the list of the project's files, source text without comments, findings."""

import argparse
import os
import re
import subprocess
import sys

ROOT = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
# Folders of the project that hold C++.
SOURCE_FOLDERS = ("platform", "QVServices", "daemon", "client", "tools", "tests", "bench", "fuzz")

INCLUDE = re.compile(
    r'^[ \t]*#[ \t]*include[ \t]*(?:"(?P<quoted>[^"\n]*)"|<(?P<angled>[^>\n]*)>|(?P<other>.*))',
    re.MULTILINE)


class Project:
    """The files below `root` that belong to the project, and the findings about them."""

    def __init__(self, root):
        self.root = os.path.abspath(root)
        self.files = sorted(self._list())
        self._known = set(self.files)
        self.findings = []

    def _list(self):
        """New files count before they are added; what git ignores never does."""
        git = ["git", "-C", self.root]
        top = subprocess.run([*git, "rev-parse", "--show-toplevel"], capture_output=True, text=True)
        if top.returncode == 0 and os.path.realpath(top.stdout.strip()) == os.path.realpath(self.root):
            listed = subprocess.run(
                [*git, "ls-files", "-z", "--cached", "--others", "--exclude-standard"],
                capture_output=True, text=True, check=True)
            names = {name for name in listed.stdout.split("\0") if name}
            return [name for name in names if os.path.isfile(os.path.join(self.root, name))]
        found = []
        for folder, folders, names in os.walk(self.root):
            folders[:] = [name for name in folders if name not in ("build", ".git", "__pycache__")]
            found += [os.path.relpath(os.path.join(folder, name), self.root) for name in names]
        return found

    def has(self, path):
        return path in self._known

    def sources(self, *suffixes):
        """C++ files of the project, by suffix."""
        suffixes = suffixes or (".cpp", ".h")
        return [name for name in self.files
                if name.split("/")[0] in SOURCE_FOLDERS and name.endswith(suffixes)]

    def read(self, name):
        with open(os.path.join(self.root, name), encoding="utf-8", errors="replace") as file:
            return file.read()

    def resolve(self, name, quoted):
        """The project's file that an #include "..." in file `name` means, or None."""
        beside = os.path.normpath(os.path.join(os.path.dirname(name), quoted))
        return next((path for path in (os.path.normpath(quoted), beside) if self.has(path)), None)

    def report(self, name, line, rule, text):
        self.findings.append((name, line, rule, text))

    def finish(self):
        """Prints the findings and ends the program with 1 where there are any."""
        for name, line, rule, text in sorted(set(self.findings)):
            print(f"{name}:{line}: {rule}: {text}")
        sys.exit(1 if self.findings else 0)


def open_project(description, add_arguments=None):
    """The project that the command line names (by default the one these checks belong to)."""
    parser = argparse.ArgumentParser(description=description)
    parser.add_argument("--root", default=ROOT, help="the project to check")
    if add_arguments:
        add_arguments(parser)
    arguments = parser.parse_args()
    return Project(arguments.root), arguments


_TOKEN = re.compile(
    r'(?P<comment>//[^\n]*|/\*.*?\*/)'
    r'|R"(?P<delimiter>[^()\\\s]{0,16})\(.*?\)(?P=delimiter)"'
    r'|(?P<string>"(?:\\.|[^"\\\n])*")'
    r"|(?<![0-9A-Za-z_])(?P<character>'(?:\\.|[^'\\\n])*')",
    re.DOTALL)


def _blank(text):
    return re.sub(r"[^\n]", " ", text)


def without_comments(text):
    """C++ with its comments blanked; lines stay where they are."""
    return _TOKEN.sub(lambda m: _blank(m[0]) if m["comment"] else m[0], text)


def literals(text):
    """The texts of C++'s string literals, as they are written."""
    for match in _TOKEN.finditer(text):
        if match["string"]:
            yield match["string"][1:-1]
        elif match[0].startswith("R"):
            yield match[0].split("(", 1)[1].rsplit(")", 1)[0]


def without_comments_and_strings(text):
    """C++ with comments and the contents of literals blanked, but for include lines."""
    lines = without_comments(text)
    bare = _TOKEN.sub(lambda m: _blank(m[0]), text)
    return "\n".join(kept if INCLUDE.match(kept) else blanked
                     for kept, blanked in zip(lines.split("\n"), bare.split("\n")))

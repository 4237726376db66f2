"""The project's scripts: they say what they are, fail at the first error, and explain themselves."""

import os
import re
import shutil
import subprocess

from project import open_project

# How a script begins; Debian's Python packages need Debian's Python.
INTERPRETERS = {
    "#!/usr/bin/env bash": "bash",
    "#!/usr/bin/env python3": "python",
    "#!/usr/bin/python3": "python",
    # What Debian's tools run: the package's rules, and its maintainer scripts.
    "#!/usr/bin/make -f": "make",
    "#!/bin/sh": "sh",
}
# Scripts whose --help is tried.
ANSWERS_HELP = re.compile(r"scripts/[\w-]+|\.ci/run")


def is_script(project, name):
    path = os.path.join(project.root, name)
    if name.endswith((".cpp", ".h", ".md", ".txt", ".json", ".cmake")):
        return False
    with open(path, "rb") as file:
        return file.read(2) == b"#!"


def check_script(project, name):
    path = os.path.join(project.root, name)
    lines = project.read(name).split("\n")
    kind = INTERPRETERS.get(lines[0])
    if kind is None:
        project.report(name, 1, "script", f"begins with none of: {', '.join(INTERPRETERS)}")
        return
    described = lines[1].startswith(("# ", '"""') if kind == "python" else "# ") and len(lines[1]) > 20
    if not described:
        project.report(name, 2, "script", "no line that says what it does")
    sourced = name.startswith("scripts/lib/")
    if os.access(path, os.X_OK) == sourced:
        project.report(name, 1, "script", "is sourced, not run" if sourced else "cannot be executed")
    if kind != "bash":
        return
    if not sourced and "set -euo pipefail" not in lines:
        project.report(name, 1, "script", "goes on after a failure: no 'set -euo pipefail'")
    parsed = subprocess.run(["bash", "-n", path], capture_output=True, text=True)
    if parsed.returncode != 0:
        project.report(name, 1, "script", parsed.stderr.strip())
    if ANSWERS_HELP.fullmatch(name) and os.access(path, os.X_OK):
        check_help(project, name, path)


def check_help(project, name, path):
    # A script that does not know --help must not get far: it runs in an empty environment, and
    # not for long.
    try:
        answer = subprocess.run([path, "--help"], capture_output=True, text=True, timeout=10,
                                stdin=subprocess.DEVNULL, cwd="/",
                                env={"PATH": os.environ.get("PATH", "")})
    except subprocess.TimeoutExpired:
        project.report(name, 1, "script", "--help does not end")
        return
    if answer.returncode != 0 or not answer.stdout.startswith("usage:"):
        project.report(name, 1, "script", "--help does not print a text that begins with 'usage:'")


def check_shell(project, names):
    """Has shellcheck read the shell scripts, where it is installed."""
    if not names or shutil.which("shellcheck") is None:
        return
    answer = subprocess.run(["shellcheck", "--format=gcc", "--external-sources", *names],
                            cwd=project.root, capture_output=True, text=True)
    for line in answer.stdout.splitlines():
        place = re.match(r"(?P<name>[^:]+):(?P<line>\d+):\d+: (?P<text>.*)", line)
        if place:
            project.report(place["name"], int(place["line"]), "shellcheck", place["text"])


def main():
    project, _ = open_project(__doc__)
    scripts = [name for name in project.files if is_script(project, name)]
    for name in scripts:
        check_script(project, name)
    for name in project.files:
        if re.fullmatch(r"scripts/[\w-]+", name) and name not in scripts:
            project.report(name, 1, "script", "no '#!' line")
    check_shell(project, [name for name in scripts
                          if project.read(name).startswith("#!/usr/bin/env bash")])
    project.finish()


if __name__ == "__main__":
    main()

"""Has clang-format compare every C++ file with the project's format; --fix rewrites them."""

import os
import re
import subprocess
import sys

from project import open_project

FORMATTER = "clang-format"
FINDING = re.compile(r"(?P<name>.+?):(?P<line>\d+):\d+: error: ")


def main():
    project, arguments = open_project(
        __doc__, lambda parser: parser.add_argument("--fix", action="store_true"))
    names = project.sources()
    if not names:
        sys.exit(0)
    style = os.path.join(project.root, ".clang-format")
    command = [FORMATTER, f"--style=file:{style}"]
    if arguments.fix:
        sys.exit(subprocess.run([*command, "-i", *names], cwd=project.root).returncode)
    answer = subprocess.run([*command, "--dry-run", "-Werror", *names], cwd=project.root,
                            capture_output=True, text=True)
    found = {(match["name"], int(match["line"])) for match in map(FINDING.match, answer.stderr.splitlines())
             if match}
    for name, line in found:
        project.report(name, line, "format", "not as clang-format lays it out (scripts/check --fix)")
    if answer.returncode != 0 and not found:
        sys.exit(answer.stderr)
    project.finish()


if __name__ == "__main__":
    main()

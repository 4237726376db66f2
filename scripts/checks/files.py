"""The shape of files: length, header comments, and what an editor leaves behind.

A source beyond 500 lines, a test beyond 800 or a header beyond 100 lines of code does more than one
thing. There are no exceptions.
"""

import re

from project import open_project, without_comments

SOURCE_LINES = 500
TEST_LINES = 800
HEADER_CODE_LINES = 100
# A folder with more C++ files than this says in a README what belongs there. For the folders of
# tests and measurements one README above them is enough.
FILES_WITHOUT_README = 6
SHARED_README = ("tests", "bench", "fuzz")

TEXT_SUFFIXES = (".cpp", ".h", ".py", ".md", ".txt", ".cmake", ".json", ".yml", ".sh", ".service",
                 ".socket", ".c")
CLASS = re.compile(r"^class\s+(?:QV_\w+(?:\([^)]*\))?\s+)?(?P<name>\w+)(?:\s+final)?\s*(?::(?!:)[^;{]*)?\{",
                   re.MULTILINE)


def check_length(project, name, text):
    lines = text.count("\n")
    if name.endswith(".h"):
        code = sum(1 for line in without_comments(text).split("\n") if line.strip())
        if code >= HEADER_CODE_LINES:
            project.report(name, 1, "length",
                           f"{code} lines of code; a header has fewer than {HEADER_CODE_LINES}")
        return
    limit, kind = (TEST_LINES, "test") if name.startswith("tests/") else (SOURCE_LINES, "source")
    if lines >= limit:
        project.report(name, 1, "length", f"{lines} lines; a {kind} has fewer than {limit}")


def check_header(project, name, text):
    if "#pragma once" not in text:
        project.report(name, 1, "header", "no #pragma once")
    lines = text.split("\n")
    for match in CLASS.finditer(text):
        above = text.count("\n", 0, match.start()) - 1
        while above >= 0 and lines[above].startswith(("template", "requires", "    requires")):
            above -= 1
        if not lines[above].startswith("//"):
            project.report(name, above + 2, "header",
                           f"class {match['name']} has no comment: purpose, threads, ownership")


def check_whitespace(project, name, text):
    if not text:
        return
    if not text.endswith("\n") or text.endswith("\n\n"):
        project.report(name, text.count("\n") + 1, "whitespace", "ends with exactly one line end")
    for line, content in enumerate(text.split("\n"), 1):
        if content != content.rstrip():
            project.report(name, line, "whitespace", "blanks at the end of the line")
        if "\t" in content:
            project.report(name, line, "whitespace", "a tab")


def main():
    project, _ = open_project(__doc__)
    folders = {}
    for name in project.sources():
        text = project.read(name)
        check_length(project, name, text)
        if name.endswith(".h"):
            check_header(project, name, text)
        folders.setdefault(name.rsplit("/", 1)[0], []).append(name)
    for folder, names in folders.items():
        top = folder.split("/")[0]
        readmes = [f"{folder}/README.md", *([f"{top}/README.md"] if top in SHARED_README else [])]
        if len(names) > FILES_WITHOUT_README and not any(map(project.has, readmes)):
            project.report(folder, 1, "readme",
                           f"{len(names)} files and no README.md: what belongs here, what it may include")
    for name in project.files:
        if name.endswith(TEXT_SUFFIXES) or name.startswith("scripts/") or name == ".ci/run":
            check_whitespace(project, name, project.read(name))
    project.finish()


if __name__ == "__main__":
    main()

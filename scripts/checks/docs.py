"""What the documents name exists: files, links, scripts and their options, presets, programs, classes.

Looks at code spans and code blocks of every Markdown file, and at links. The change log may name
what is gone.
"""

import fnmatch
import itertools
import json
import os
import re

from project import open_project

SKIPPED = ("CHANGELOG.md",)

LINK = re.compile(r"\]\((?P<target>[^)\s]+)\)")
SPAN = re.compile(r"(?P<ticks>`+)(?P<code>.+?)(?P=ticks)")
FENCE = re.compile(r"^\s*(```|~~~)")
CLASS = re.compile(r"\bQV[A-Z]\w*[a-z]\w*")
PRESET = re.compile(r"--preset[ =](?P<name>[\w-]+)")
PROGRAM = re.compile(r"\bbuild/(?P<preset>[\w<>*-]+)/bin/(?P<name>[\w-]+)")
OPTION = re.compile(r"(?<!\S)(?P<option>--[a-z][\w-]*)")


def code_of(text):
    """(line, code) of each code span and each line of a code block."""
    fenced = False
    for line, content in enumerate(text.split("\n"), 1):
        if FENCE.match(content):
            fenced = not fenced
        elif fenced:
            yield line, content
        else:
            for span in SPAN.finditer(content):
                yield line, span["code"]


def expand(path):
    """The patterns that a path with <places> and {alternatives} stands for."""
    path = re.sub(r"<[^<>]*>", "*", path)
    parts = [part.split(",") for part in re.split(r"\{([^{}]*)\}", path)]
    return ["".join(choice) for choice in itertools.product(*parts)]


class Documents:
    def __init__(self, project):
        self.project = project
        tops = sorted({name.split("/")[0] for name in project.files if "/" in name})
        self.path = re.compile(r"(?<![\w/$}.~-])(?:\./)?(?P<path>(?:%s)/[\w./*<>{},-]*[\w*>}/])"
                               % "|".join(map(re.escape, tops)))
        self.folders = {os.path.dirname(name) for name in project.files}
        self.folders |= {parent for folder in self.folders
                         for parent in itertools.accumulate(folder.split("/"), "{}/{}".format)}
        self.presets = set()
        if project.has("CMakePresets.json"):
            presets = json.loads(project.read("CMakePresets.json"))
            self.presets = {preset["name"] for preset in presets["configurePresets"]}
        cmake = "\n".join(project.read(name) for name in project.files
                          if name.endswith(("CMakeLists.txt", ".cmake")))
        self.programs = set(re.findall(r"(?:add_executable|qv_\w+)\(\s*([\w-]+)", cmake))
        self.code = "\n".join(project.read(name) for name in project.sources())
        self.words = set(re.findall(r"\w+", self.code))

    def exists(self, pattern):
        pattern = pattern.rstrip("/")
        return (pattern in self.folders or self.project.has(pattern) or
                any(fnmatch.fnmatchcase(name, pattern)
                    for name in itertools.chain(self.project.files, self.folders)))

    def check_code(self, name, line, code):
        report = self.project.report
        for match in PROGRAM.finditer(code):
            if match["name"] not in self.programs:
                report(name, line, "docs", f"{match[0]}: no target of the build is called so")
            if re.fullmatch(r"[\w-]+", match["preset"]) and match["preset"] not in self.presets:
                report(name, line, "docs", f"{match[0]}: no preset is called so")
            for option in OPTION.finditer(code, match.end()):
                if f'"{option["option"]}' not in self.code:
                    report(name, line, "docs", f"{match['name']} knows no {option['option']}")
        for match in PRESET.finditer(code):
            if match["name"] not in self.presets:
                report(name, line, "docs", f"{match['name']}: no preset is called so")
        for match in CLASS.finditer(code):
            if match[0] not in self.words:
                report(name, line, "docs", f"{match[0]}: the sources know no such name")
        for match in self.path.finditer(code):
            for pattern in expand(match["path"]):
                if not self.exists(pattern):
                    report(name, line, "docs", f"{match['path']}: no such file")
            self.check_options(name, line, code, match)

    def check_options(self, name, line, code, match):
        """Options that follow a script's name, up to the next command."""
        script = match["path"]
        if not script.startswith("scripts/") or not self.project.has(script):
            return
        arguments = re.split(r"[;|&]| -- ", code[match.end():])[0]
        text = self.project.read(script)
        for option in OPTION.finditer(arguments):
            if option["option"] not in text:
                self.project.report(name, line, "docs", f"{script} knows no {option['option']}")

    def check_links(self, name, line, content):
        for match in LINK.finditer(content):
            target = match["target"].split("#")[0]
            if not target or "://" in target or target.startswith("mailto:"):
                continue
            path = os.path.normpath(os.path.join(os.path.dirname(name), target))
            if not self.exists(path):
                self.project.report(name, line, "docs", f"link to {target}: no such file")


def main():
    project, _ = open_project(__doc__)
    documents = Documents(project)
    for name in project.files:
        if not name.endswith(".md") or os.path.basename(name) in SKIPPED:
            continue
        text = project.read(name)
        for line, code in code_of(text):
            documents.check_code(name, line, code)
        for line, content in enumerate(text.split("\n"), 1):
            documents.check_links(name, line, content)
    project.finish()


if __name__ == "__main__":
    main()

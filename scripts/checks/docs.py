"""What the documents name exists: files, links, commands and their options, presets, programs, classes, tests.

Looks at code spans, code blocks and links of every Markdown file, and at the manual pages. A block
marked `sh` holds shell: each command in it is one of the project's or one that is named below. A
block behind a line `<!-- FILE -->` shows that file: nothing more, nothing less. The change log may
name what is gone.

With --programs DIR, the programs that are built there are asked what they take; without it, their
sources are looked at. Whether a manual page is complete, tool.py tells.
"""

import fnmatch
import itertools
import json
import os
import re
import shlex
import sys

from project import open_project
from usage import Usages, commands_in, faults

SKIPPED = ("CHANGELOG.md",)

# Commands of others that documents use.
OTHERS = set("""
    aplay apt-get bpftrace busctl c++ cat cc cd cmake ctest dbus-send echo export gdb gdbus git grep
    journalctl lintian mkdir mmvdump perf pidof pkg-config printf readelf rm sqlite3 systemctl
    systemd-analyze systemd-socket-activate tail touch usermod dpkg-buildpackage
""".split())

LINK = re.compile(r"\]\((?P<target>[^)\s]+)\)")
SPAN = re.compile(r"(?P<ticks>`+)(?P<code>.+?)(?P=ticks)")
FENCE = re.compile(r"^\s*(```|~~~)(?P<language>\w*)")
SHOWN = re.compile(r"<!-- (?P<path>\S+) -->")
CLASS = re.compile(r"\bQV[A-Z]\w*[a-z]\w*")
TEST = re.compile(r"\b(?P<name>QV\w+\.[A-Z]\w*)")
TEST_MADE = re.compile(r"^(?:TYPED_)?TEST(?:_F|_P)?\(\s*(?P<suite>\w+),\s*(?P<name>\w+)\)", re.MULTILINE)
PRESET = re.compile(r"--preset[ =](?P<name>[\w-]+)")
PROGRAM = re.compile(r"\bbuild/(?P<preset>[\w<>*-]+)/bin/(?P<name>[\w-]+)")

MANUAL = re.compile(r"(?:.*/)?[\w-]+\.[1-8]")
MACRO = re.compile(r"\.(?P<name>[A-Z]{1,2})(?: +(?P<arguments>.*))?$")
# Text that alternates between two fonts has no blanks between.
ALTERNATING = {"BI", "BR", "IB", "IR", "RB", "RI"}
ESCAPES = {r"\-": "-", r"\(aq": "'", r"\(dq": '"', r"\e": "\\", r"\&": "", r"\ ": " "}
ESCAPE = re.compile(r"\\(?:f\[?[A-Z]{1,2}\]|f[BIRP]|\(\w\w|.)")


def expand(path):
    """The patterns that a path with <places> and {alternatives} stands for."""
    path = re.sub(r"<[^<>]*>", "*", path)
    parts = [part.split(",") for part in re.split(r"\{([^{}]*)\}", path)]
    return ["".join(choice) for choice in itertools.product(*parts)]


class Block:
    """A code block: the line it begins with, its language, the file that it shows, its lines."""

    def __init__(self, line, language, shown):
        self.line = line
        self.language = language
        self.shown = shown
        self.lines = []

    def numbered(self):
        return enumerate(self.lines, self.line + 1)


def read_markdown(text):
    """The blocks of a Markdown file, and (line, code) of each of its code spans."""
    blocks, spans = [], []
    block = shown = None
    for line, content in enumerate(text.split("\n"), 1):
        fence = FENCE.match(content)
        if fence and block is None:
            block = Block(line, fence["language"], shown)
            blocks.append(block)
        elif fence:
            block = None
        elif block is not None:
            block.lines.append(content)
        else:
            spans += [(line, span["code"]) for span in SPAN.finditer(content)]
        mark = SHOWN.fullmatch(content.strip())
        shown = mark["path"] if mark and block is None else None
    return blocks, spans


def plain(text):
    """A text of a manual page without its fonts."""
    return ESCAPE.sub(lambda match: ESCAPES.get(match[0], ""), text)


def read_manual(text):
    """(line, text, is it an example) of each line of a manual page."""
    example = False
    for line, content in enumerate(text.split("\n"), 1):
        macro = MACRO.match(content)
        if content.startswith((".nf", ".EX")):
            example = True
        elif content.startswith((".fi", ".EE")):
            example = False
        elif macro and macro["name"] not in ("TH", "SH", "SS"):
            arguments = macro["arguments"] or ""
            words = [quoted or word for quoted, word in re.findall(r'"([^"]*)"|(\S+)', arguments)]
            between = "" if macro["name"] in ALTERNATING else " "
            yield line, plain(between.join(words)), example
        elif not content.startswith("."):
            yield line, plain(content), example


class Documents:
    def __init__(self, project, programs):
        self.project = project
        self.usages = Usages(project, programs)
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
        sources = project.sources(".cpp", ".h", ".c")
        self.words = {word for name in sources for word in re.findall(r"\w+", project.read(name))}
        self.tests = {f"{test['suite']}.{test['name']}" for name in sources
                      for test in TEST_MADE.finditer(project.read(name))}
        # Names of files count: a class may have several sources.
        self.words |= {os.path.splitext(os.path.basename(name))[0] for name in project.files}

    def report(self, name, line, text):
        self.project.report(name, line, "docs", text)

    def exists(self, pattern):
        pattern = pattern.rstrip("/")
        return (pattern in self.folders or self.project.has(pattern) or
                any(fnmatch.fnmatchcase(name, pattern)
                    for name in itertools.chain(self.project.files, self.folders)))

    def check_names(self, name, line, code):
        """Presets, programs by their paths, classes, tests and files, wherever in a text they stand."""
        for match in PROGRAM.finditer(code):
            if match["name"] not in self.usages.programs:
                self.report(name, line, f"{match[0]}: no target of the build is called so")
            if re.fullmatch(r"[\w-]+", match["preset"]) and match["preset"] not in self.presets:
                self.report(name, line, f"{match[0]}: no preset is called so")
        for match in PRESET.finditer(code):
            if match["name"] not in self.presets:
                self.report(name, line, f"{match['name']}: no preset is called so")
        for match in CLASS.finditer(code):
            if match[0] not in self.words:
                self.report(name, line, f"{match[0]}: the sources know no such name")
        for match in TEST.finditer(code):
            if match["name"] not in self.tests:
                self.report(name, line, f"{match['name']}: no test is called so")
        for match in self.path.finditer(code):
            for pattern in expand(match["path"]):
                if not self.exists(pattern):
                    self.report(name, line, f"{match['path']}: no such file")

    def usage_of(self, word):
        """The usage of a command of the project; None for others."""
        path = os.path.normpath(word)
        if re.fullmatch(r"scripts/[\w-]+|\.ci/\w+", path):
            return self.usages.script(path) if self.project.has(path) else None
        program = os.path.basename(path)
        return self.usages.program(program) if program in self.usages.programs else None

    def check_line(self, name, line, code, is_shell):
        """The commands of a line. Where it need not be shell, those that begin with one of ours."""
        try:
            commands = list(commands_in(code))
        except ValueError:  # a quotation without an end: no shell
            commands = []
        if not is_shell:
            commands = [words for words in commands[:1] if words and self.usage_of(words[0])]
        for words in commands:
            self.check_command(name, line, words)

    def check_command(self, name, line, words):
        if words and "/" not in words[0] and words[0] not in OTHERS and not self.usage_of(words[0]):
            self.report(name, line, f"{words[0]}: no command is called so")
        # A command may be handed to another one, with its arguments.
        for place, word in enumerate(words):
            usage = self.usage_of(word) if place == 0 or "/" in word else None
            if usage:
                for fault in faults(usage, words[place + 1:]):
                    self.report(name, line, f"{word} knows no {fault}")
                return

    def check_shell(self, name, block):
        """Lines of shell; one that ends in the middle of a command goes on in the next."""
        begun, text = None, ""
        for line, content in block.numbered():
            begun = begun or line
            text += content
            if text.endswith("\\"):
                text = text[:-1]
                continue
            try:
                shlex.split(text, comments=True)
            except ValueError:
                text += "\n"
                continue
            self.check_line(name, begun, text, True)
            begun, text = None, ""
        if begun:
            self.report(name, begun, "a command without an end")

    def check_shown(self, name, block):
        if not self.project.has(block.shown):
            self.report(name, block.line, f"{block.shown}: no such file")
        elif "\n".join(block.lines) + "\n" != self.project.read(block.shown):
            self.report(name, block.line, f"is not what {block.shown} holds")

    def check_markdown(self, name):
        text = self.project.read(name)
        blocks, spans = read_markdown(text)
        for line, code in spans:
            self.check_names(name, line, code)
            self.check_line(name, line, code, False)
        for block in blocks:
            for line, code in block.numbered():
                self.check_names(name, line, code)
                if block.language != "sh":
                    self.check_line(name, line, code, False)
            if block.language == "sh":
                self.check_shell(name, block)
            if block.shown:
                self.check_shown(name, block)
        for line, content in enumerate(text.split("\n"), 1):
            self.check_links(name, line, content)

    def check_manual(self, name):
        for line, text, example in read_manual(self.project.read(name)):
            self.check_names(name, line, text)
            if example:
                self.check_line(name, line, text, False)

    def check_links(self, name, line, content):
        for match in LINK.finditer(content):
            target = match["target"].split("#")[0]
            if not target or "://" in target or target.startswith("mailto:"):
                continue
            path = os.path.normpath(os.path.join(os.path.dirname(name), target))
            if not self.exists(path):
                self.report(name, line, f"link to {target}: no such file")


def add_arguments(parser):
    parser.add_argument("--programs", metavar="DIR", help="ask the programs that are built in DIR")


def main():
    project, arguments = open_project(__doc__, add_arguments)
    documents = Documents(project, arguments.programs)
    for name in project.files:
        if name.endswith(".md") and os.path.basename(name) not in SKIPPED:
            documents.check_markdown(name)
        elif MANUAL.fullmatch(name):
            documents.check_manual(name)
    if arguments.programs and not documents.usages.asked:
        sys.exit(f"{arguments.programs}: none of the programs that documents name is built there")
    project.finish()


if __name__ == "__main__":
    main()

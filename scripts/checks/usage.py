"""What commands take: options and subcommands of the project's scripts and programs.

Scripts are asked (--help). Programs are asked where they are built; else their sources say what
they could know: words and options that stand in texts of their folder.
"""

import os
import re
import shlex
import subprocess

from project import literals

OPTION = re.compile(r"(?<![\w-])(?:--[a-z][\w-]*|-[A-Za-z])(?![\w-])")
WORD = re.compile(r"[a-z][a-z-]*")
TARGET = re.compile(r"(?P<kind>add_executable|qv_\w+)\(\s*(?P<name>[\w-]+)")
# The list of subcommands in a help text, up to the next part.
SUBCOMMANDS = re.compile(r"^(?:sub)?commands:\s*\n(?P<list>(?:[ \t]+.*\n|[ \t]*\n)+)", re.I | re.M)

# Where a command ends and the next one begins, and words that a command may follow.
SEPARATORS = {";", "|", "&", "&&", "||", "(", ")", "|&", ";;"}
PREFIXES = {"sudo", "exec", "time", "then", "do", "else", "if", "while", "until"}
ASSIGNMENT = re.compile(r"\w+=")
PLACEHOLDER = re.compile(r"[A-Z][A-Z_.]*(?:=.*)?|.*[<>\[\]{}*…$].*|.*\.\.\.")


class Usage:
    """Options that may stand at a place of the command line, and the words that may follow there."""

    def __init__(self, options, subcommands=(), follow=None):
        self.options = set(options)
        self.subcommands = set(subcommands)
        self._follow = follow

    def follow(self, word):
        """What may stand behind that subcommand, besides the same options; None where unknown."""
        return self._follow(word) if self._follow else None


def ask(command):
    """The text that a command prints for --help."""
    answer = subprocess.run([*command, "--help"], capture_output=True, text=True, timeout=60,
                            stdin=subprocess.DEVNULL, cwd="/",
                            env={"PATH": os.environ.get("PATH", "")})
    return answer.stdout if answer.returncode == 0 else ""


class Usages:
    """The usage of every command of the project. With a folder of built programs, what these say."""

    def __init__(self, project, folder=None):
        self.project = project
        self.folder = folder and os.path.abspath(folder)
        self.asked = set()
        self._known = {}
        # Program: the folder of its sources.
        self.programs = {}
        for name in project.files:
            if name.endswith(("CMakeLists.txt", ".cmake")):
                for match in TARGET.finditer(project.read(name)):
                    if match["kind"] in ("add_executable", "qv_test_program"):
                        self.programs.setdefault(match["name"], os.path.dirname(name))

    def script(self, path):
        """The usage of a script of the project, by its path."""
        if path not in self._known:
            self._known[path] = Usage(OPTION.findall(ask([os.path.join(self.project.root, path)])))
        return self._known[path]

    def program(self, name):
        if name not in self._known:
            self._known[name] = self._asked(name) or self._read(name)
        return self._known[name]

    def _literals(self, name):
        folder = self.programs[name]
        for source in self.project.sources(".cpp", ".h", ".c"):
            if os.path.dirname(source) == folder:
                yield from literals(self.project.read(source))

    def _read(self, name):
        """What the sources could know. Without --help there among it, a program takes nothing."""
        options, words = set(), set()
        for text in self._literals(name):
            options |= set(OPTION.findall(text))
            if WORD.fullmatch(text):
                words.add(text)
        folder = self.programs[name]
        commands = any("CLI::App" in self.project.read(source)
                       for source in self.project.sources()
                       if os.path.dirname(source) == folder)
        return Usage(options, words if commands else ())

    def _asked(self, name):
        """What a built program says; None where it is not built, or knows no --help: the service
        would begin to serve."""
        path = self.folder and os.path.join(self.folder, name)
        if not path or not os.access(path, os.X_OK):
            return None
        if not any("--help" in OPTION.findall(text) for text in self._literals(name)):
            return None
        self.asked.add(name)
        return self._place([path])

    def _place(self, command):
        text = ask(command)
        listed = SUBCOMMANDS.search(text)
        # Lines of the list are indented alike; what goes on in the next line is so further.
        lines = [line for line in (listed["list"] if listed else "").split("\n") if line.strip()]
        indent = min((len(line) - len(line.lstrip()) for line in lines), default=0)
        words = [line.split()[0].rstrip(",") for line in lines
                 if len(line) - len(line.lstrip()) == indent]
        places = {}

        def follow(word):
            if word not in places:
                places[word] = self._place([*command, word])
            return places[word]

        return Usage(OPTION.findall(text), words, follow)


def commands_in(line):
    """The commands of a line of shell: lists of words, without assignments and redirections."""
    lexer = shlex.shlex(line, posix=True, punctuation_chars="();<>|&")
    lexer.whitespace_split = True
    command, skip, outer = [], False, []
    for token in lexer:
        if set(token) <= set("<>") or token in (">&", "&>"):
            skip = True
            if command and command[-1].isdigit():
                command.pop()  # the descriptor
        elif skip:
            skip = False
        elif token == "(" and command and command[-1].endswith("$"):
            outer.append(command)
            command = []
        elif token == ")" and outer:
            yield command
            command = outer.pop()
        elif token in SEPARATORS:
            yield command
            command = []
        elif command or not (ASSIGNMENT.match(token) or token in PREFIXES):
            command.append(token)
    yield command


def faults(usage, arguments):
    """What is wrong with the words that follow a command."""
    options = set(usage.options)
    placed = previous = None
    for word in arguments:
        option = OPTION.match(word)
        if word == "--":
            return
        if option and word.startswith("-"):
            if option[0] not in options:
                yield option[0]
        elif usage and usage.subcommands and not placed and not PLACEHOLDER.fullmatch(word):
            if word in usage.subcommands:
                usage = usage.follow(word)
                options |= usage.options if usage else set()
            elif previous is None or not previous.startswith("-"):
                yield word
                placed = word
        previous = word

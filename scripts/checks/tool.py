"""What qvctl's --help, its man page and its completions say of its commands and options agrees.

Needs the built program (--program), so that ctest runs it rather than scripts/check. The program is
asked for the help of every command; the man page has a subsection for each, the completions for
bash a table, those for zsh a function. Also has groff read the man page, where it is installed.
"""

import os
import re
import shutil
import subprocess
import sys

from project import open_project

FOLDER = "tools/qvctl"
MAN = f"{FOLDER}/qvctl.1"
BASH = f"{FOLDER}/completions/qvctl.bash"
ZSH = f"{FOLDER}/completions/_qvctl"
# Seconds that a program may take to print its help.
HELP_LIMIT = 60

OPTION_LINE = re.compile(r"^  ((?:-\w,)?--[a-z][\w-]*|-\w)(?:,|\s|$)")
COMMAND_LINE = re.compile(r"^  ([a-z][\w-]*)(?:\s|$)")


class Help:
    """The commands of the program: for each, by its words, its options and the commands below it."""

    def __init__(self, program):
        self.program = program
        self.options = {}
        self.commands = {}
        self._ask(())

    def _ask(self, path):
        answer = subprocess.run([self.program, *path, "--help"], capture_output=True, text=True,
                                timeout=HELP_LIMIT, stdin=subprocess.DEVNULL)
        if answer.returncode != 0 or not answer.stdout:
            sys.exit(f"{self.program} {' '.join(path)} --help ends with {answer.returncode}")
        options, commands, part = set(), [], None
        for line in answer.stdout.splitlines():
            if re.fullmatch(r"[A-Z]\w*:", line):
                part = line[:-1]
            elif not line:
                part = None
            elif part == "Options" and (match := OPTION_LINE.match(line)):
                options.update(match[1].split(","))
            elif part == "Subcommands" and (match := COMMAND_LINE.match(line)):
                commands.append(match[1])
        if not options:
            sys.exit(f"{self.program} {' '.join(path)} --help names no option")
        self.options[path] = options
        self.commands[path] = commands
        for command in commands:
            self._ask((*path, command))

    def leaves(self):
        return [path for path in self.options if path and not self.commands[path]]


def long_options(options):
    return {option for option in options if option.startswith("--")}


class Comparison:
    """Reports what one description lacks or has too much of."""

    def __init__(self, project):
        self.project = project

    def compare(self, name, line, what, described, real):
        for thing in sorted(real - described):
            self.project.report(name, line, "tool", f"{what}: {thing} is missing")
        for thing in sorted(described - real):
            self.project.report(name, line, "tool", f"{what}: there is no {thing}")


def man_sections(text):
    """(title, first line, lines) of each section and subsection."""
    sections = [("", 1, [])]
    for number, line in enumerate(text.split("\n"), 1):
        match = re.match(r"\.(Sh|Ss) (.*)", line)
        if match:
            title = match[2] if match[1] == "Sh" else f"command {match[2]}"
            sections.append((title, number, []))
        sections[-1][2].append(line)
    return sections


def man_options(lines):
    """The options that items of a list are about."""
    found = set()
    for line in lines:
        if line.startswith(".It "):
            found.update("-" + option for option in re.findall(r"\bFl (-?[a-z][\w-]*)", line))
    return found


def check_man(project, program, comparison):
    common, general, commands = set(), 1, {}
    for title, line, lines in man_sections(project.read(MAN)):
        if title == "OPTIONS":
            common, general = man_options(lines), line
        elif title.startswith("command "):
            commands[tuple(title.split()[1:])] = (line, man_options(lines))
    comparison.compare(MAN, general, "OPTIONS", common, program.options[()])
    leaves = program.leaves()
    comparison.compare(MAN, 1, "subsections", {" ".join(path) for path in commands},
                       {" ".join(path) for path in leaves})
    everywhere = set.intersection(*(program.options[path] for path in leaves))
    for path in leaves:
        if path in commands:
            line, options = commands[path]
            comparison.compare(MAN, line, " ".join(path), options | (everywhere & common),
                               program.options[path])


def check_man_renders(project):
    if shutil.which("groff") is None:
        print("groff is not installed: the man page was not rendered", file=sys.stderr)
        return
    answer = subprocess.run(["groff", "-ww", "-mdoc", "-Tutf8", "-z", os.path.join(project.root, MAN)],
                            capture_output=True, text=True)
    for warning in answer.stderr.splitlines():
        line = re.search(r":(\d+): (.*)", warning)
        project.report(MAN, int(line[1]) if line else 1, "tool", line[2] if line else warning)


def bash_table(text, name):
    """{words of a command, without the program: words of its entry}, and the table's line."""
    match = re.search(rf"^declare -gA {name}=\(\n(.*?)^\)", text, re.MULTILINE | re.DOTALL)
    if match is None:
        return None, 1
    entries = re.findall(r"\['([^']*)'\]='([^']*)'", match[1])
    return {tuple(key.split()[1:]): value.split() for key, value in entries}, text.count("\n", 0, match.start()) + 1


def check_bash(project, program, comparison):
    text = project.read(BASH)
    for name, real in (("_qvctl_commands", {path: set(commands) for path, commands
                                            in program.commands.items() if commands}),
                       ("_qvctl_options", program.options)):
        table, line = bash_table(text, name)
        if table is None:
            project.report(BASH, 1, "tool", f"has no table {name}")
            continue
        comparison.compare(BASH, line, name, {" ".join(path) or "qvctl" for path in table},
                           {" ".join(path) or "qvctl" for path in real})
        for path in real.keys() & table.keys():
            comparison.compare(BASH, line, f"{name} of {' '.join(path) or 'qvctl'}", set(table[path]),
                               real[path])


def zsh_body(text, arrays, name):
    """A function's text with the arrays that it uses put in, and its line; None where there is none."""
    match = re.search(rf"^{name}\(\) \{{\n(.*?)^\}}", text, re.MULTILINE | re.DOTALL)
    if match is None:
        return None, 1
    body = re.sub(r"\$(_qvctl_\w+)", lambda use: arrays.get(use[1], use[0]), match[1])
    return body, text.count("\n", 0, match.start()) + 1


def check_zsh(project, program, comparison):
    text = project.read(ZSH)
    arrays = dict(re.findall(r"^(_qvctl_\w+)=\((.*?)\)$", text, re.MULTILINE | re.DOTALL))
    helper = zsh_body(text, arrays, "_qvctl_below")[0] or ""
    for path, options in program.options.items():
        what = " ".join(path) or "qvctl"
        body, line = zsh_body(text, arrays, "_".join(("_qvctl", *path)))
        if body is None:
            project.report(ZSH, 1, "tool", f"has no function for {what}")
            continue
        specs = body + helper if "_qvctl_below" in body else body
        described = set(re.findall(r"(?<=['){,*])--[a-z][\w-]*", specs))
        comparison.compare(ZSH, line, what, described, long_options(options))
        commands = set(re.findall(r"^\s+'([a-z]+):", body, re.MULTILINE))
        comparison.compare(ZSH, line, what, commands, set(program.commands[path]))


def main():
    project, arguments = open_project(
        __doc__, lambda parser: parser.add_argument("--program", required=True, help="qvctl, as built"))
    program = Help(os.path.abspath(arguments.program))
    comparison = Comparison(project)
    for name, check in ((MAN, check_man), (BASH, check_bash), (ZSH, check_zsh)):
        if project.has(name):
            check(project, program, comparison)
        else:
            project.report(name, 1, "tool", "is missing")
    if project.has(MAN):
        check_man_renders(project)
    project.finish()


if __name__ == "__main__":
    main()

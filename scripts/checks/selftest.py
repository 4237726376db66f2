"""Checks the checks: each is shown small projects with one fault each and has to name it.

A check that cannot fail is worth nothing. Every rule has its fault here; a project without faults
must pass all of them.
"""

import json
import os
import shutil
import subprocess
import sys
import tempfile

from project import ROOT

CHECKS = os.path.join(ROOT, "scripts/checks")

HEADER = """#pragma once

// A thing. Any thread.
class QVThing {
 public:
  int size() const { return size_; }

 private:
  int size_ = 0;
};
"""
SCRIPT = """#!/usr/bin/env bash
# Says how it is used, for the checks.
set -euo pipefail
echo "usage: scripts/tool [--loud]"
"""
# A program with subcommands: its sources, what it says when it is built, its manual page.
TOOL_SOURCE = """#include <CLI/CLI.hpp>

const char* const kWords[] = {"--help,-h", "--json", "look", "--all"};
CLI::App app;
"""
TOOL = """#!/bin/sh
case $1 in
  look) printf 'usage: thingctl look\\n\\nOptions:\\n  --all  everything\\n' ;;
  *) printf 'Options:\\n  -h,--help\\n  --json\\n\\nSubcommands:\\n  look   looks at it, and\\n         goes on\\n' ;;
esac
"""
PAGE = """.TH THINGCTL 1
.SH EXAMPLES
.nf
thingctl look \\-\\-all
.fi
"""
PRESETS = '{"configurePresets": [{"name": "dev"}]}\n'

# A project without faults; each fault below is laid over it.
GOOD = {
    "CMakePresets.json": PRESETS,
    "daemon/CMakeLists.txt": "add_executable(thingd main.cpp)\n",
    "platform/QVThing.h": HEADER,
    "platform/linux/bus/QVBusThing.h": '#pragma once\n\n#include "platform/QVThing.h"\n\n#include <sys/un.h>\n',
    "platform/linux/bus/QVBusThing.cpp":
        '#include "platform/linux/bus/QVBusThing.h"\n\n#include <asio/io_context.hpp>\n',
    "QVServices/Statistics/QVCount.cpp":
        '#include "platform/QVThing.h"\n\n#include <string>\n\n'
        'int exitCode(int value) {\n  return value;  // no getenv here, no exit(1)\n}\n',
    "QVServices/Statistics/Service/QVServe.cpp": '#include "platform/QVThing.h"\n\n#include <map>\n',
    "platform/linux/files/QVFileThing.h": HEADER,
    "platform/linux/files/QVFileThing.cpp":
        '#include "platform/linux/files/QVFileThing.h"\n\n#include <rapidjson/reader.h>\n',
    "client/QVClient.cpp":
        '#include "platform/linux/bus/QVBusThing.h"\n#include "platform/linux/files/QVFileThing.h"\n\n'
        '#include <poll.h>\n',
    "daemon/main.cpp":
        '#include "platform/linux/bus/QVBusThing.h"\n\nint main(int argc, char** argv) {\n'
        '  return argc > 1 && argv[1][0] == \'-\' ? 1 : 0;\n}\n',
    "tests/unit/QVThingTest.cpp":
        '#include "platform/QVThing.h"\n\n#include <gtest/gtest.h>\n\nTEST(QVThingTest, HasASize) {}\n',
    "tools/CMakeLists.txt": "add_executable(thingctl main.cpp)\n",
    "tools/main.cpp": TOOL_SOURCE,
    "tools/thingctl.1": PAGE,
    "build/dev/bin/thingctl": TOOL,
    "scripts/tool": SCRIPT,
    "README.md":
        "# Thing\n\nSee [the header](platform/QVThing.h), `platform/*.h`, `QVThing`, `QVThingTest.HasASize` and\n"
        "`platform/linux/bus/QVBusThing.{h,cpp}`. `thingctl COMMAND --json`.\n\n```sh\n"
        "cmake --preset dev\nscripts/tool --loud\nKEY=value build/dev/bin/thingd 2>/dev/null\n"
        "echo 'one\ntwo' | thingctl --json look \\\n  --all -- --gone\n```\n\n<!-- tools/CMakeLists.txt -->\n"
        "```cmake\nadd_executable(thingctl main.cpp)\n```\n",
}


def fault(check, rule, place, name, text, **more):
    """A file that, laid over GOOD, has `check` report `rule` at `place`, "file:line"."""
    return check, rule, place, {name: text, **more}


CORE = "QVServices/Statistics/QVCount.cpp"
SERVE = "QVServices/Statistics/Service/QVServe.cpp"
TEST = "tests/unit/QVThingTest.cpp"
LONG_LINE = "// A comment.\n"

FAULTS = [
    # Format.
    fault("format", "format", "platform/QVThing.cpp:1", "platform/QVThing.cpp", "int   a;\n"),
    # Includes, folder by folder.
    fault("layering", "layering", "platform/QVThing.h:3", "platform/QVThing.h",
          "#pragma once\n\n#include <unistd.h>\n"),
    fault("layering", "layering", "platform/QVThing.h:3", "platform/QVThing.h",
          '#pragma once\n\n#include "platform/linux/bus/QVBusThing.h"\n'),
    fault("layering", "layering", f"{CORE}:1", CORE, '#include "platform/linux/bus/QVBusThing.h"\n'),
    fault("layering", "layering", f"{CORE}:1", CORE, '#include "Service/QVServe.h"\n',
          **{"QVServices/Statistics/Service/QVServe.h": HEADER}),
    fault("layering", "layering", f"{CORE}:2", CORE, "// why\n#  include <sys/types.h>\n"),
    fault("layering", "layering", f"{CORE}:1", CORE, '#include "unistd.h"\n'),
    fault("layering", "layering", f"{CORE}:1", CORE, "#include ANYTHING\n"),
    fault("layering", "layering", f"{SERVE}:1", SERVE, "#include <asio.hpp>\n"),
    fault("layering", "layering", f"{SERVE}:1", SERVE, '#include "platform/fake/QVFake.h"\n',
          **{"platform/fake/QVFake.h": HEADER}),
    fault("layering", "layering", "platform/fake/QVFake.cpp:1", "platform/fake/QVFake.cpp",
          "#include <sys/socket.h>\n"),
    fault("layering", "layering", "platform/linux/QVReal.cpp:1", "platform/linux/QVReal.cpp",
          '#include "QVServices/Statistics/QVCount.h"\n', **{"QVServices/Statistics/QVCount.h": HEADER}),
    fault("layering", "layering", "platform/linux/bus/QVBusThing.cpp:1", "platform/linux/bus/QVBusThing.cpp",
          '#include "platform/linux/QVReal.h"\n', **{"platform/linux/QVReal.h": HEADER}),
    fault("layering", "layering", "platform/linux/files/QVFileThing.cpp:1", "platform/linux/files/QVFileThing.cpp",
          '#include "platform/linux/QVReal.h"\n', **{"platform/linux/QVReal.h": HEADER}),
    fault("layering", "layering", "platform/linux/files/QVFileThing.cpp:1", "platform/linux/files/QVFileThing.cpp",
          "#include <sqlite3.h>\n"),
    fault("layering", "layering", "platform/linux/watch/QVWatch.cpp:1", "platform/linux/watch/QVWatch.cpp",
          "#include <systemd/sd-bus.h>\n"),
    fault("layering", "layering", "platform/linux/watch/QVWatch.cpp:1", "platform/linux/watch/QVWatch.cpp",
          '#include "platform/linux/files/QVFileThing.h"\n'),
    fault("layering", "layering", "platform/linux/QVReal.cpp:1", "platform/linux/QVReal.cpp",
          '#include "platform/linux/files/QVFileThing.h"\n'),
    fault("layering", "layering", "platform/linux/new/QVNew.cpp:1", "platform/linux/new/QVNew.cpp",
          '#include "platform/linux/files/QVFileThing.h"\n'),
    fault("layering", "layering", "client/QVClient.cpp:1", "client/QVClient.cpp",
          '#include "platform/linux/QVReal.h"\n', **{"platform/linux/QVReal.h": HEADER}),
    fault("layering", "layering", "client/QVClient.cpp:1", "client/QVClient.cpp",
          '#include "QVServices/Statistics/Service/QVServe.h"\n',
          **{"QVServices/Statistics/Service/QVServe.h": HEADER}),
    fault("layering", "layering", "client/QVClient.cpp:1", "client/QVClient.cpp",
          "#include <rapidjson/reader.h>\n"),
    fault("layering", "layering", "daemon/main.cpp:1", "daemon/main.cpp",
          '#include "platform/fake/QVFake.h"\n', **{"platform/fake/QVFake.h": HEADER}),
    fault("layering", "layering", "daemon/main.cpp:1", "daemon/main.cpp", "#include <sqlite3.h>\n"),
    fault("layering", "layering", "tools/main.cpp:1", "tools/main.cpp",
          '#include "QVServices/Statistics/Service/QVServe.h"\n',
          **{"QVServices/Statistics/Service/QVServe.h": HEADER}),
    fault("layering", "layering", "tools/main.cpp:1", "tools/main.cpp",
          '#include "platform/linux/QVReal.h"\n', **{"platform/linux/QVReal.h": HEADER}),
    fault("layering", "layering", "tools/main.cpp:1", "tools/main.cpp", "#include <rapidjson/reader.h>\n"),
    fault("layering", "layering", "platform/other/QVOther.cpp:1", "platform/other/QVOther.cpp",
          '#include "platform/linux/bus/QVBusThing.h"\n'),
    # The core and the machine.
    *[fault("layering", "machine", f"{CORE}:3", CORE, f"#include <string>\n\n{code}\n") for code in (
        "#include <thread>", "#include <filesystem>", 'auto home = std::getenv("HOME");',
        "auto now = std::chrono::steady_clock::now();", "std::random_device device;",
        "void f() { std::exit(2); }", "void f() { _exit(2); }", 'extern "C" int close(int);',
        'auto* file = std::fopen("a", "r");', "int f(char** argv);", "void f() { std::abort(); }")],
    # Words.
    *[fault("words", rule, "docs/page.md:2", "docs/page.md", f"# Page\n{text}\n") for rule, text in (
        ("origin", "As the speci" "fication says."), ("origin", "See Part" " 3.2 there."),
        ("origin", "Laid down in the design" " document."), ("origin", "Mends issue" " 7."),
        ("workplace", "As the pro" "mpt asks."), ("workplace", "Done by a sub-age" "nt."),
        ("workplace", "Beyond this ta" "sk."), ("machine-path", "Look into /wo" "rk/main."),
        ("machine-path", "Lies in /t" "mp/socket."), ("registry", "From de" "b.debian.org."),
        ("later", "TO" "DO: more"), ("later", "Enough for" " now."))],
    fault("words", "origin", "docs/my_speci" "fication.md:1", "docs/my_speci" "fication.md", "# Page\n"),
    *[fault("words", rule, f"{TEST}:2", TEST, f"\n{text}\n") for rule, text in (
        ("sleep", "std::this_thread::sleep_for(1s);"), ("sleep", "usleep(10);"), ("sleep", "  sleep(1);"),
        ("disabled-test", "TEST(A, DISABLED_B) {}"), ("disabled-test", "GTEST_SKIP();"))],
    fault("words", "sleep", "tests/e2e/run.sh:3", "tests/e2e/run.sh", f"{SCRIPT.splitlines()[0]}\n\nsleep 1\n"),
    # Files.
    fault("files", "length", "platform/QVLong.cpp:1", "platform/QVLong.cpp", LONG_LINE * 500),
    fault("files", "length", f"{TEST}:1", TEST, LONG_LINE * 800),
    fault("files", "length", "platform/QVLong.h:1", "platform/QVLong.h", "#pragma once\n" + "int a();\n" * 99),
    fault("files", "header", "platform/QVThing.h:1", "platform/QVThing.h", HEADER.replace("#pragma once\n\n", "")),
    fault("files", "header", "platform/QVThing.h:3", "platform/QVThing.h",
          HEADER.replace("// A thing. Any thread.\n", "")),
    fault("files", "readme", "platform/many:1", "platform/many/a.h", HEADER,
          **{f"platform/many/{letter}.h": HEADER for letter in "bcdefg"}),
    fault("files", "whitespace", "README.md:1", "README.md", "# Thing \n"),
    fault("files", "whitespace", "README.md:2", "README.md", "# Thing"  "\n\tmore\n"),
    fault("files", "whitespace", "README.md:1", "README.md", "# Thing"),
    # Scripts.
    fault("programs", "script", "scripts/tool:1", "scripts/tool", SCRIPT.replace("env bash", "env ksh")),
    fault("programs", "script", "scripts/tool:1", "scripts/tool", "echo none\n"),
    fault("programs", "script", "scripts/tool:2", "scripts/tool", SCRIPT.replace("# Says", "echo")),
    fault("programs", "script", "scripts/tool:1", "scripts/tool", SCRIPT.replace("pipefail", "nothing")),
    fault("programs", "script", "scripts/tool:1", "scripts/tool", SCRIPT.replace("usage:", "help:")),
    fault("programs", "script", "scripts/tool:1", "scripts/tool", SCRIPT + "if\n"),
    fault("programs", "shellcheck", "scripts/tool:5", "scripts/tool", SCRIPT + "rm -f $1\n"),
    # Documents.
    *[fault("docs", "docs", "README.md:3", "README.md", f"# Thing\n\n{text}\n") for text in (
        "See `platform/QVGone.h`.", "See `platform/gone/*.h`.", "See [it](platform/QVGone.h).",
        "Made of `QVGone`.", "As in `QVThingTest.IsGone`.", "Run `scripts/tool --quiet`.", "Run `cmake --preset fast`.",
        "Run `build/dev/bin/goned`.", "Run `build/slow/bin/thingd`.", "Run `build/dev/bin/thingd --gone`.",
        "See `platform/linux/bus/QVBusThing.{h,c}`.")],
    fault("docs", "docs", "README.md:2", "README.md", "```\nscripts/gone\n```\n"),
    *[fault("docs", "docs", "README.md:3", "README.md", f"# Thing\n```{text}\n```\n") for text in (
        "sh\ngonectl look", "sh\ntrue; echo | thingctl look", "sh\nthingctl gone",
        "sh\nthingctl look --gone", "sh\nthingctl look -g", "\nthingctl --gone",
        "sh\nsudo A=b thingctl --gone >/dev/null", "sh\necho 'no end", "sh\nscripts/tool \\\n  --quiet",
        "sh\necho $(thingctl gone)",
        "sh\nthingctl $(echo a) --gone")],
    *[fault("docs", "docs", "README.md:3", "README.md", f"# Thing\n<!-- {file} -->\n```\nother\n```\n")
      for file in ("tools/CMakeLists.txt", "tools/gone.cpp")],
    fault("docs", "docs", "tools/thingctl.1:2", "tools/thingctl.1", ".TH THINGCTL 1\nSee platform/gone.h.\n"),
    fault("docs", "docs", "tools/thingctl.1:3", "tools/thingctl.1",
          ".TH THINGCTL 1\n.nf\nthingctl look \\-\\-gone\n.fi\n"),
    # What a built program says is more exact than its sources.
    fault("docs --programs build/dev/bin", "docs", "README.md:1", "README.md", "`thingctl --all look`\n"),
]

# A program with help, and what describes it; faults are laid over it in the same way.
def help_text(options, commands=()):
    lines = ["A tool", "Usage: tool", "", "Options:", *(f"  {option}  Text" for option in options)]
    if commands:
        lines += ["", "Subcommands:", *(f"  {command}  Text" for command in commands)]
    return "\n".join(lines) + "\n"


TOOL_MAN = """.Dd January 1, 2026
.Dt TOOL 1
.Os
.Sh NAME
.Nm tool
.Nd looks at things
.Sh OPTIONS
.Bl -tag -width indent
.It Fl h , Fl -help
Help.
.It Fl -version
Version.
.El
.Sh COMMANDS
.Ss look
.Bl -tag -width indent
.It Fl n , Fl -last Ar n
The last.
.El
.Ss group list
Lists, without
.Fl -last .
"""
TOOL_BASH = """declare -gA _qvctl_commands=(
  ['tool']='look group'
  ['tool group']='list'
)
declare -gA _qvctl_options=(
  ['tool']='-h --help --version'
  ['tool look']='-h --help
    -n --last'
  ['tool group']='-h --help'
  ['tool group list']='-h --help'
)
"""
TOOL_ZSH = """_qvctl_places=('(- *)--help[text]')
_qvctl_look() {
  _arguments $_qvctl_places '(-n --last)'{-n,--last}'[text]:number:'
}
_qvctl_group() {
  _qvctl_below group \\
    'list:text'
}
_qvctl_group_list() {
  _arguments $_qvctl_places
}
_qvctl_below() {
  _arguments '(- *)--help[text]'
}
_qvctl() {
  commands=(
    'look:text'
    'group:text'
  )
  _arguments $_qvctl_places '--version[text]'
}
"""
TOOL_HELP = {
    "": help_text(["-h,--help", "--version"], ["look", "group"]),
    "look ": help_text(["-h,--help", "-n,--last N"]),
    "group ": help_text(["-h,--help"], ["list"]),
    "group list ": help_text(["-h,--help"]),
}


def tool_program(**changes):
    texts = {**TOOL_HELP, **changes}
    cases = "".join(f"'{command}--help') cat <<'END'\n{text}END\n;;\n" for command, text in texts.items())
    return f"#!/usr/bin/env bash\ncase \"$*\" in\n{cases}*) exit 2 ;;\nesac\n"


MAN = "tools/qvctl/qvctl.1"
BASH = "tools/qvctl/completions/qvctl.bash"
ZSH = "tools/qvctl/completions/_qvctl"
TOOL = {"program": tool_program(), MAN: TOOL_MAN, BASH: TOOL_BASH, ZSH: TOOL_ZSH}

MORE_OPTIONS = tool_program(**{"look ": help_text(["-h,--help", "-n,--last N", "--full"])})
MORE_COMMANDS = tool_program(**{"group ": help_text(["-h,--help"], ["list", "show"]),
                                "group show ": help_text(["-h,--help"])})

TOOL_FAULTS = [
    # What the program has and a description lacks.
    *[fault("tool", "tool", place, "program", program) for program in (MORE_OPTIONS, MORE_COMMANDS)
      for place in ((f"{MAN}:15", f"{BASH}:5", f"{ZSH}:2") if program == MORE_OPTIONS else
                    (f"{MAN}:1", f"{BASH}:1", f"{ZSH}:5"))],
    # What a description has and the program lacks.
    fault("tool", "tool", f"{MAN}:15", MAN, TOOL_MAN.replace(".It Fl n ,", ".It Fl -gone\n.It Fl n ,")),
    fault("tool", "tool", f"{MAN}:15", MAN, TOOL_MAN.replace("Fl n , ", "")),
    fault("tool", "tool", f"{MAN}:7", MAN, TOOL_MAN.replace(".It Fl -version\nVersion.\n", "")),
    fault("tool", "tool", f"{MAN}:1", MAN, TOOL_MAN + ".Ss gone\nText.\n"),
    fault("tool", "tool", f"{BASH}:5", BASH, TOOL_BASH.replace("--help --version", "--help --gone --version")),
    fault("tool", "tool", f"{BASH}:1", BASH, TOOL_BASH.replace("'look group'", "'look group gone'")),
    fault("tool", "tool", f"{BASH}:5", BASH, TOOL_BASH.replace("  ['tool group']='-h --help'\n", "")),
    fault("tool", "tool", f"{ZSH}:2", ZSH, TOOL_ZSH.replace("number:'", "number:' '--gone[text]'")),
    fault("tool", "tool", f"{ZSH}:1", ZSH, TOOL_ZSH.replace("_qvctl_look()", "_qvctl_gone()")),
    fault("tool", "tool", f"{ZSH}:5", ZSH, TOOL_ZSH.replace("'list:text'", "'list:text'\n    'gone:text'")),
]
# Only groff can tell.
if shutil.which("groff"):
    TOOL_FAULTS.append(fault("tool", "tool", f"{MAN}:19", MAN, TOOL_MAN.replace(".El\n.Ss group", ".\\\\*[gone]\n.El\n.Ss group")))

TIDY_FAULTS = [
    fault("tidy", "tidy", f"{CORE}:7", CORE,
          "#include <string>\n#include <utility>\n\nstatic void take(std::string&&) {}\n"
          "bool taken(std::string text) {\n  take(std::move(text));\n  return text.empty();\n}\n"),
    fault("tidy", "tidy", f"{CORE}:1", CORE, "struct wrongName {};\n"),
    fault("tidy", "tidy", f"{CORE}:1", CORE, "int broken(\n"),
    fault("tidy", "tidy", "platform/QVThing.h:9", "platform/QVThing.h",
          HEADER.replace("size_", "total"), **{CORE: '#include "platform/QVThing.h"\n'}),
]


class Sandbox:
    """A project in a temporary folder."""

    def __init__(self, files):
        self.root = tempfile.mkdtemp(prefix="selftest.")
        self.write(files)
        for name in (".clang-format", ".clang-tidy"):
            shutil.copy(os.path.join(ROOT, name), self.root)

    def write(self, files):
        for name, text in files.items():
            path = os.path.join(self.root, name)
            os.makedirs(os.path.dirname(path), exist_ok=True)
            with open(path, "w", encoding="utf-8") as file:
                file.write(text)
            if text.startswith("#!"):
                os.chmod(path, 0o755)

    def configure(self, sources):
        """What the build would say of how it compiles `sources`."""
        self.write({"build/check/compile_commands.json": json.dumps([
            {"directory": self.root, "file": os.path.join(self.root, name),
             "command": f"c++ -std=c++20 -I{self.root} -c {name}"} for name in sources])})

    def run(self, check):
        name, *arguments = check.split()
        if name == "tool":
            arguments += ["--program", os.path.join(self.root, "program")]
        answer = subprocess.run(
            [sys.executable, os.path.join(CHECKS, f"{name}.py"), "--root", self.root, *arguments],
            cwd=self.root, capture_output=True, text=True)
        return answer.returncode, answer.stdout, answer.stderr

    def __enter__(self):
        return self

    def __exit__(self, *_):
        shutil.rmtree(self.root)


class SelfTest:
    def __init__(self):
        self.failures = []

    def expect(self, condition, text):
        if not condition:
            self.failures.append(text)

    @staticmethod
    def good(check):
        """The project without faults that the check's faults are laid over."""
        return {"tidy": {}, "tool": TOOL}.get(check, GOOD)

    def finds(self, check, rule, place, files):
        with Sandbox({**self.good(check), **files}) as sandbox:
            sandbox.configure([CORE])
            status, out, error = sandbox.run(check)
        lines = out.splitlines()
        found = any(line.startswith(f"{place}: {rule}: ") for line in lines)
        self.expect(status == 1 and found,
                    f"{check} does not report {rule} at {place} in {next(iter(files.values()))!r}; "
                    f"it ends with {status} and says:\n  " + "\n  ".join(lines + [error]))

    def passes(self, check):
        with Sandbox(self.good(check)) as sandbox:
            status, out, error = sandbox.run(check)
        self.expect(status == 0 and not out, f"{check} finds fault with a good project:\n{out}{error}")

    def keeps_clean_runs(self):
        """A clean source is not looked at again until it or a header of it changes."""
        header = "platform/QVThing.h"
        sources = {CORE: '#include "platform/QVThing.h"\n', header: HEADER}
        with Sandbox(sources) as sandbox:
            sandbox.configure([CORE])
            for expected, change in (("1 of 1", {}), ("0 of 1", {}),
                                     ("1 of 1", {header: HEADER.replace("= 0", "= 1")}),
                                     ("1 of 1", {CORE: sources[CORE] + "\n"})):
                sandbox.write(change)
                status, out, error = sandbox.run("tidy")
                self.expect(status == 0 and f": {expected} sources" in error,
                            f"tidy's cache: expected {expected} looked at: {out}{error}")
        with Sandbox(sources) as sandbox:
            sandbox.configure([])
            status, out, _ = sandbox.run("tidy")
            self.expect(status == 1 and f"{CORE}:1: tidy: " in out, "tidy passes over what nothing compiles")


def main():
    test = SelfTest()
    for check in ("format", "layering", "words", "files", "programs", "docs",
                  "docs --programs build/dev/bin", "tool"):
        test.passes(check)
    faults = FAULTS + TOOL_FAULTS
    if "--fast" not in sys.argv[1:]:
        faults += TIDY_FAULTS
        test.keeps_clean_runs()
    for check, rule, place, files in faults:
        test.finds(check, rule, place, files)
    for failure in test.failures:
        print(f"selftest: {failure}")
    print(f"{len(faults)} faults shown, {len(test.failures)} complaints", file=sys.stderr)
    sys.exit(1 if test.failures else 0)


if __name__ == "__main__":
    main()

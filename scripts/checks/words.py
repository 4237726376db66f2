"""Words that the project's files do without.

Everywhere: mentions of how the project came to be instead of what it is, places of one machine,
promises of later work. In tests: sleeping, and tests that are switched off. The patterns are put
together from pieces so that this file passes its own check.
"""

import re

from project import open_project


def _pattern(*pieces, flags=re.IGNORECASE):
    return re.compile("".join(pieces), flags)


# Files whose words are not ours.
BINARY_SUFFIXES = (".wav", ".flac", ".ogg", ".png", ".gz", ".bin", ".db", ".pdf")

EVERYWHERE = [
    ("origin", _pattern(r"\bspeci", r"fications?\b|\bspe", r"c\b|\bspe", r"c\.md\b"),
     "say what it does and why, not where that was laid down"),
    ("origin", _pattern(r"\bPart", r" \d+\.\d+"), "say what it does and why"),
    ("origin", _pattern(r"\b(?:design|style)(?:\.md| docu", r"ments?| page)\b"),
     "say what it does and why"),
    ("origin", _pattern(r"\bissue", r"s? (?:#\s*)?\d|(?<![\w&])#", r"\d+\b(?=[\s,.;:)]|$)"),
     "say what was wrong, not under which number"),
    ("workplace", _pattern(r"\bpro", r"mpts?\b|\bsub-?age", r"nts?\b|\bhelper (?:age", r"nt|session)s?\b"),
     "write as the system's own developer"),
    ("workplace", _pattern(r"\b(?:this|my|our) (?:ta", r"sk|bri", r"ef)\b"),
     "write as the system's own developer"),
    ("workplace", _pattern(r"\b(?:language mo", r"del|AI-gen", r"erated|LL", r"Ms?)\b"),
     "write as the system's own developer"),
    ("machine-path", _pattern(r"(?<![\w.$}-])/(?:wo", r"rk|fa", r"rm|ho", r"me|ro", r"ot)/", flags=0),
     "a path of one machine"),
    ("machine-path", _pattern(r"(?<![\w.$}-])/t", r"mp/", flags=0),
     "a fixed place for temporary files: use mktemp, TMPDIR or the test's temporary root"),
    ("registry", _pattern(r"\b(?:de", r"b\.debian\.org|pyp", r"i\.org|npm", r"js\.org|crat", r"es\.io",
                          r"|proxy\.gol", r"ang\.org|pythonho", r"sted\.org)"),
     "the machine's own configuration says where packages come from"),
    ("later", _pattern(r"\b(?:TO", r"DO|FIX", r"ME|XX", r"X|HA", r"CK)\b", flags=0),
     "finish it or leave it out"),
    ("later", _pattern(r"\bfor", r" now\b|\bnot (?:yet )?imple", r"mented\b"),
     "finish it or leave it out"),
]

TESTS = [
    ("sleep", _pattern(r"\b(?:u|nano|clock_nano)?sle", r"ep(?:_for|_until)?\s*\(|\bsle", r"ep +[\d$\"]",
                       r"|\btime\.sle", r"ep\b", flags=0),
     "advance the clock, or wait for the event itself"),
    ("disabled-test", _pattern(r"\bDISA", r"BLED_|\bunittest\.sk", r"ip", flags=0),
     "a test runs or is not there"),
    ("disabled-test", _pattern(r"\bGTEST_SK", r"IP\(\)\s*;", flags=0),
     "say which facility of the machine is missing"),
]


def check(project, name, rules):
    for line, text in enumerate(project.read(name).split("\n"), 1):
        for rule, pattern, advice in rules:
            found = pattern.search(text)
            if found:
                project.report(name, line, rule, f'"{found[0].strip()}": {advice}')


def main():
    project, _ = open_project(__doc__)
    for name in project.files:
        for rule, pattern, advice in EVERYWHERE:
            if pattern.search(name.replace("_", " ").replace("-", " ")):
                project.report(name, 1, rule, f"the file's name: {advice}")
        if not name.endswith(BINARY_SUFFIXES):
            check(project, name, EVERYWHERE + (TESTS if name.startswith("tests/") else []))
    project.finish()


if __name__ == "__main__":
    main()

#!/usr/bin/env python3
"""Checks that what the documents point at exists.

Looked at: relative links, with their anchors, and paths in `code` that begin
with one of our folders. A fault is printed as FILE:LINE: text, and the exit
code is 1.

usage: check-docs.py [ROOT]        check ROOT/*.md and ROOT/docs
       check-docs.py --self-test   check the checker
"""

import glob
import os
import re
import sys
import tempfile

FOLDERS = ("src", "docs", "tools", "scripts", "tests", "fuzz", "benchmarks", "packaging", "debian", "cmake", ".ci")

LINK = re.compile(r"\[[^\]]*\]\(([^)\s]+)(?:\s+\"[^\"]*\")?\)")
CODE = re.compile(r"`([^`]+)`")
PATH = re.compile(r"(?:^|(?<=\s))((?:%s)/[\w./*@-]*)" % "|".join(re.escape(f) for f in FOLDERS))
HEADING = re.compile(r"^#{1,6}\s+(.*?)\s*#*$")
FENCE = re.compile(r"^\s*(```|~~~)")


def documents(root):
    yield from sorted(glob.glob(os.path.join(root, "*.md")))
    yield from sorted(glob.glob(os.path.join(root, "docs", "**", "*.md"), recursive=True))


def lines(path):
    """Yields (number, text, is inside a fenced block)."""
    fenced = False
    with open(path, encoding="utf-8") as file:
        for number, line in enumerate(file, 1):
            if FENCE.match(line):
                fenced = not fenced
            else:
                yield number, line.rstrip("\n"), fenced


def anchors(path):
    """The anchors of a document's headings, as code hosts make them."""
    found = set()
    for _, line, fenced in lines(path):
        match = None if fenced else HEADING.match(line)
        if match:
            text = re.sub(r"[^\w\- ]", "", match[1].lower())
            found.add(text.replace(" ", "-"))
    return found


def link_error(root, document, target):
    """What is wrong with a link; None when nothing is."""
    if re.match(r"[a-z]+:", target):
        return None
    path, _, anchor = target.partition("#")
    start = root if path.startswith("/") else os.path.dirname(document)
    file = os.path.normpath(os.path.join(start, path.lstrip("/"))) if path else document
    if not os.path.exists(file):
        return f"link to {path}, which does not exist"
    if anchor and file.endswith(".md") and anchor not in anchors(file):
        return f"link to #{anchor}, which {os.path.relpath(file, root)} does not have"
    return None


def check_document(root, document):
    for number, line, fenced in lines(document):
        if not fenced:
            for match in LINK.finditer(CODE.sub("", line)):
                error = link_error(root, document, match[1])
                if error:
                    yield number, error
        code = [line] if fenced else CODE.findall(line)
        for text in code:
            for match in PATH.finditer(text):
                path = match[1].rstrip(".")
                if not glob.glob(os.path.join(root, path)):
                    yield number, f"names {path}, which does not exist"


def check(root):
    found = []
    for document in documents(root):
        name = os.path.relpath(document, root)
        found += [f"{name}:{line}: {text}" for line, text in check_document(root, document)]
    return found


ALLOWED = """# A title, with `code`

[this](docs/other.md), [there](docs/other.md#the-second-heading), [here](#a-title-with-code),
[web](https://example.org/x), [root](/docs/other.md) `docs/other.md` `src/*.h` `build/x` `not/ours`

```
[not a link](nowhere.md)
cat docs/other.md
```
"""
FORBIDDEN = (
    "[x](docs/gone.md)",
    "[x](docs/other.md#gone)",
    "[x](#gone)",
    "see `docs/gone.md`",
    "run `sh tools/gone.sh`",
    "`src/*.gone`",
    "```\ncat docs/gone.md\n```",
)


def check_text(text):
    with tempfile.TemporaryDirectory() as root:
        for path, content in (("README.md", text), ("docs/other.md", "## The second heading\n"),
                              ("src/a.h", "")):
            os.makedirs(os.path.join(root, os.path.dirname(path)), exist_ok=True)
            with open(os.path.join(root, path), "w", encoding="utf-8") as file:
                file.write(content)
        return check(root)


def self_test():
    errors = [f"should be allowed: {text}" for text in check_text(ALLOWED)]
    return errors + [f"should be one fault: {text}" for text in FORBIDDEN
                     if len(check_text(text)) != 1]


def main(arguments):
    if arguments == ["--self-test"]:
        found = self_test()
    else:
        found = check(arguments[0] if arguments else os.path.join(os.path.dirname(__file__), ".."))
    for line in found:
        print(line)
    return 1 if found else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))

#!/usr/bin/env python3
"""Makes the report's frame: one page of the files beside this one.

    bundle.py OUTPUT D3

D3 is the chart library as its package has it. The page asks for nothing from
outside, and its policy lets no script run but the one that is in it now.
"""

import base64
import hashlib
import sys
from pathlib import Path

HERE = Path(__file__).resolve().parent
# In the order in which they need each other.
SCRIPTS = ["text.js", "dom.js", "answer.js", "evidence.js", "timeline-rows.js", "timeline.js",
           "bars.js", "statistics.js", "trace.js", "sessions.js", "rows.js", "table.js",
           "theme.js", "main.js"]


def read(path):
    return Path(path).read_text(encoding="utf-8")


def script_hash(text):
    digest = hashlib.sha256(text.encode()).digest()
    return f"'sha256-{base64.b64encode(digest).decode()}'"


def bundle(d3_path):
    own = "\n".join(f"// {name}\n{read(HERE / name)}" for name in SCRIPTS)
    script = "\n".join([read(d3_path), '"use strict";', "(() => {", own, "})();"])
    style = read(HERE / "style.css")
    for text, end in ((script, "</script"), (style, "</style")):
        if end in text.lower() or "@DIGEST@" in text:
            raise SystemExit(f"bundle.py: {end} or the digest's mark inside of a script or style")
    policy = (f"default-src 'none'; script-src {script_hash(script)}; "
              f"style-src {script_hash(style)}; base-uri 'none'; form-action 'none'")
    page = read(HERE / "page.html")
    for mark, text in (("@POLICY@", policy), ("@LICENCES@", read(HERE / "licences.txt")),
                       ("@STYLE@", style), ("@SCRIPT@", script)):
        if page.count(mark) != 1:
            raise SystemExit(f"bundle.py: page.html needs {mark} once")
        page = page.replace(mark, text)
    return page


def main():
    if len(sys.argv) != 3:
        sys.exit(__doc__)
    Path(sys.argv[1]).write_text(bundle(sys.argv[2]), encoding="utf-8")


if __name__ == "__main__":
    main()

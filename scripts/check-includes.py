#!/usr/bin/env python3
"""Checks who may include what.

The tables below are the dependency rule; docs and reviewers quote them. A
violation is printed as FILE:LINE: text, and the exit code is 1.

usage: check-includes.py [ROOT]        check all that is compiled in ROOT
       check-includes.py --self-test   check the checker
"""

import os
import re
import sys
import tempfile

# What the sources of a folder may include, by #include "folder/...". A folder
# always sees itself.
BASE = {"common", "protocol", "platform"}
FOLDERS = {
    "common": set(),
    "protocol": {"common"},
    "platform": {"common", "protocol"},
    "sinks": BASE,
    "tracing": BASE,
    "session": BASE | {"sinks", "tracing"},
    "drivers": BASE | {"sinks", "tracing", "session"},
    "service": BASE | {"sinks", "tracing", "session", "drivers"},
    "client": {"common", "protocol"},
    "testing": BASE,
}
# The rooms of linux/ have an order of their own; what stands beside them sees all.
LINUX_ROOMS = {
    "queues": set(),
    "system": {"queues"},
    "net": {"queues", "system"},
    "store": set(),
    "drivers": {"queues", "system"},
    "trace": {"queues", "system"},
    "config": {"system", "net", "store", "drivers"},
}
for room, below in LINUX_ROOMS.items():
    FOLDERS[f"linux/{room}"] = BASE | {f"linux/{name}" for name in below}
FOLDERS["linux"] = BASE | {f"linux/{room}" for room in LINUX_ROOMS}
ROOMY = {folder.split("/")[0] for folder in FOLDERS if "/" in folder}
# Files that see more than their folder does.
EXTRA = {
    "service/main.cpp": {"linux", "linux/system", "client"},
    "linux/queues/Queues_test.cpp": {"linux/system"},  # real conditions
}
# A unit test (X_test.cpp, and what several of them share) also sees the fakes;
# nothing but tests sees what they share.
TEST_FILES = ("_test.cpp", "_test.c", "Fixture.h", "TestSupport.h", "Testing.h", "Testing.cpp")
TEST_EXTRA = {"testing"}
# What is compiled beside src/, the longest path counts. All of it sees libhalyard's
# public headers, and a file the headers of its own program.
PROGRAMS = {
    "tools": set(),  # clients of the daemon like anybody's
    # Reads the store with the room that owns its schema, asks the daemon what libhalyard
    # has no call for, looks where the daemon has its directories, and reads its configuration
    # with the daemon's own reader, so that the two cannot disagree about what is in force.
    "tools/halyardctl": {"common", "protocol", "linux/store", "linux/system", "linux/config"},
    # Sends what the reading part of halyardctl reads, as the device's configuration says.
    "tools/halyard-export": {"common", "platform", "linux/config", "linux/drivers", "linux/store",
                             "linux/system"},
    "tests": set(),  # strangers
    "benchmarks": BASE | {"session", "linux/system", "linux/store", "linux/drivers", "testing"},
    "benchmarks/load": {"common", "protocol", "testing"},  # the whole daemon from outside
    "benchmarks/trace": set(),
    "fuzz": BASE | {"sinks", "tracing", "linux/drivers", "linux/config", "testing"},
}
# The tests of such a program may play the daemon's side.
PROGRAM_TEST_EXTRA = {"common", "protocol", "testing"}
# The client's public headers, included as <halyard/...> or "halyard/...".
PUBLIC = {"halyard": "client"}

# The core: takes time, threads and files from platform/ and asks nothing of the
# system itself. Maps to the libraries that a folder's headers and sources use.
CORE = {
    "common": ("fmt/", "rapidjson/"),
    "protocol": ("fmt/", "msgpack.hpp", "msgpack/"),
    "platform": ("fmt/",),
    "sinks": ("fmt/", "protozero/"),
    "tracing": ("fmt/", "plist/", "rapidjson/"),
    "session": ("fmt/",),
    "drivers": ("fmt/",),
    "service": ("fmt/",),
}
# Standard headers that reach past the platform.
NOT_IN_CORE = {
    "barrier", "condition_variable", "csignal", "filesystem", "fstream", "future", "iostream",
    "latch", "random", "semaphore", "shared_mutex", "stop_token", "thread",
}
# Time that does not come from platform::Clock, also in unit tests of the core.
CALLS_NOT_IN_CORE = re.compile(
    r"\b(now\s*\(\s*\)|(?:sleep|sleep_for|sleep_until|usleep|nanosleep|clock_gettime|gettimeofday)"
    r"\s*\()")

INCLUDE = re.compile(r'^\s*#\s*include\s*(?:"([^"]+)"|<([^>]+)>)')
STANDARD = re.compile(r"[a-z_0-9]+")
COMMENT_OR_TEXT = re.compile(
    r'//[^\n]*|/\*.*?\*/|R"\((?:.*?)\)"|"(?:\\.|[^"\\\n])*"|\'(?:\\.|[^\'\\\n])+\'', re.DOTALL)


def without_comments_and_text(source):
    """The same lines, with comments and literals blanked."""
    return COMMENT_OR_TEXT.sub(lambda match: "\n" * match.group().count("\n"), source)


def folder_of(path):
    """The folder of a path below src/, or its room where a folder has rooms; None for a name
    without a folder."""
    parts = path.split("/")[:-1]
    room = "/".join(parts[:2])
    if room in FOLDERS:
        return room
    return parts[0] if parts else None


class File:
    """One source file and what it may see."""

    def __init__(self, path):
        top, inner = path.split("/", 1)
        self.path = path
        self.is_test = path.endswith(TEST_FILES)
        self.folder = folder_of(inner) if top == "src" else None
        self.is_core = self.folder in CORE and inner not in EXTRA
        if self.folder is None:
            self.place = max((p for p in PROGRAMS if path.startswith(p + "/")), key=len)
            self.sees = PROGRAMS[self.place] | (PROGRAM_TEST_EXTRA if self.is_test else set())
        else:
            self.place = self.folder
            self.sees = FOLDERS[self.folder] | {self.folder} | EXTRA.get(inner, set())
            self.sees |= TEST_EXTRA if self.is_test else set()

    def include_error(self, name, quoted):
        """Why this file may not include `name`; None when it may."""
        first = folder_of(name)
        if first in PUBLIC:
            if self.folder is None:
                return None
            first = PUBLIC[first]
            quoted = True
        if quoted:
            if self.folder is not None and first not in FOLDERS:
                return f'write "{name}" from src/ on'
            if first in FOLDERS and first not in self.sees:
                return f"{self.place} does not see {first}"
            if name.endswith(TEST_FILES) and not self.is_test:
                return f"{name} is for tests"
            return None
        if not self.is_core or self.is_test:
            return None
        if STANDARD.fullmatch(name):
            return f"<{name}> does not belong in the core" if name in NOT_IN_CORE else None
        if name.startswith(CORE[self.folder]):
            return None
        return f"<{name}> is no library of {self.folder}"


def check_file(path, source):
    """Yields (line, text) for each violation in one file."""
    file = File(path)
    for number, line in enumerate(source.splitlines(), 1):
        match = INCLUDE.match(line)
        if match:
            error = file.include_error(match[1] or match[2], match[1] is not None)
            if error:
                yield number, error
    if file.is_core:
        for number, line in enumerate(without_comments_and_text(source).splitlines(), 1):
            match = CALLS_NOT_IN_CORE.search(line)
            if match:
                yield number, f"{match[1].strip()}: the core's time comes from platform::Clock"


def place_error(path):
    """Why no source belongs where `path` is; None when it does."""
    parts = path.split("/")[:-1]
    if parts[0] != "src" or len(parts) == 1:
        return None
    if parts[1] not in FOLDERS:
        return f"src/{parts[1]} is not in the table of folders"
    if parts[1] in ROOMY and len(parts) > 2 and "/".join(parts[1:3]) not in FOLDERS:
        return f"{'/'.join(parts)} is not in the table of folders"
    return None


def circles():
    """The folders of the table that see each other in a circle, as lines of text."""
    found = []
    below = {folder: set(sees) for folder, sees in FOLDERS.items()}
    while below:
        free = {folder for folder, sees in below.items() if not sees & below.keys()}
        if not free:
            found.append(f"see each other in a circle: {', '.join(sorted(below))}")
            break
        below = {folder: sees for folder, sees in below.items() if folder not in free}
    return found


def sources(root):
    for top in sorted({"src"} | {place.split("/")[0] for place in PROGRAMS}):
        for folder, subfolders, names in os.walk(os.path.join(root, top)):
            subfolders.sort()
            for name in sorted(names):
                if name.endswith((".h", ".hpp", ".cpp", ".c")):
                    yield os.path.relpath(os.path.join(folder, name), root)


def check(root):
    """All violations under `root`, as lines of text."""
    found = []
    for path in sources(root):
        error = place_error(path)
        if error:
            found.append(f"{path}:1: {error}")
            continue
        with open(os.path.join(root, path), encoding="utf-8") as file:
            found += [f"{path}:{line}: {text}" for line, text in check_file(path, file.read())]
    return found


ALLOWED = {
    "src/common/A.cpp": '#include "common/A.h"\n#include <vector>\n#include <fmt/core.h>\n',
    "src/session/A.cpp": '#include "sinks/B.h"\n#include "protocol/Wire.h"\n// calls now() never\n',
    "src/session/A_test.cpp": '#include "testing/Fake.h"\n#include <gtest/gtest.h>\n',
    "src/sinks/SinkFixture.h": '#include "testing/Fake.h"\n#include <gtest/gtest.h>\n',
    "src/sinks/A_test.cpp": '#include "sinks/SinkFixture.h"\n',
    "src/service/main.cpp": '#include "linux/Server.h"\n#include "client/Mark.h"\n'
                            "#include <unistd.h>\n",
    "src/linux/A.cpp": '#include "platform/Clock.h"\n#include <asio.hpp>\n#include <thread>\n'
                       "auto t = std::chrono::steady_clock::now();\n",
    "src/linux/queues/A.cpp": '#include "linux/queues/B.h"\n#include "platform/Clock.h"\n',
    "src/linux/B.cpp": '#include "linux/queues/A.h"\n',
    "src/client/A.cpp": '#include <halyard/halyard.h>\n#include "protocol/Wire.h"\n',
    "src/tracing/A.cpp": 'const char* text = "sleep(1)"; /* now() */\nint asleep(int);\n',
    "tools/ctl/A.cpp": '#include "Table.h"\n#include "halyard/halyard.hpp"\n#include <unistd.h>\n',
    "benchmarks/a_benchmark.cpp": '#include "session/A.h"\n#include "testing/Tree.h"\n',
    "benchmarks/load/A.cpp": '#include "load/Daemon.h"\n#include "protocol/Wire.h"\n',
    "fuzz/a_fuzz.cpp": '#include "Require.h"\n#include "linux/config/Settings.h"\n',
    "tests/a/A.cpp": '#include "Sound.h"\n#include <halyard/halyard.h>\n',
    "src/client/a_test.c": "#include <halyard/halyard.h>\n",
    "tools/halyardctl/A.cpp": '#include "linux/store/Schema.h"\n#include "protocol/Wire.h"\n'
                              '#include "linux/config/SettingsFiles.h"\n',
    "tools/ctl/ATesting.cpp": '#include "ATesting.h"\n#include "testing/Tree.h"\n',
    "tools/ctl/A_test.cpp": '#include "protocol/Wire.h"\n#include "testing/FakeDaemon.h"\n',
}
FORBIDDEN = {
    "src/common/A.cpp": '#include "platform/Clock.h"\n',
    "src/common/B.cpp": '#include "B.h"\n',
    "src/protocol/A.h": '#include "platform/Log.h"\n',
    "src/platform/A.h": "#include <sys/socket.h>\n",
    "src/sinks/A.cpp": '#include "session/HYReportingSession.h"\n',
    "src/sinks/B.cpp": '#include "tracing/Trace.h"\n',
    "src/session/A.cpp": '  #  include "testing/Fake.h"\n',
    "src/session/B.cpp": "auto t = Clock::now();\n",
    "src/session/B_test.cpp": "std::this_thread::sleep_for(1s);\n",
    "src/session/C_test.cpp": '#include "linux/Server.h"\n',
    "src/session/D.cpp": '#include "sinks/SinkFixture.h"\n',
    "src/drivers/A.cpp": "#include <thread>\n",
    "src/drivers/B.cpp": "#include <sqlite3.h>\n",
    "src/service/A.cpp": '#include "linux/Server.h"\n',
    "src/service/B.cpp": "#include <halyard/halyard.h>\n",
    "src/linux/A.cpp": '#include "session/HYReportingSession.h"\n',
    "src/linux/queues/A.cpp": '#include "linux/Server.h"\n',
    "src/linux/novel/A.cpp": "\n",
    "src/client/A.cpp": '#include "platform/Clock.h"\n',
    "src/testing/A.h": '#include "session/HYReportingSession.h"\n',
    "src/novel/A.h": "\n",
    "tools/ctl/A.cpp": '#include "service/Registry.h"\n',
    "tools/ctl/B.cpp": '#include "common/Value.h"\n',
    "tools/ctl/C.cpp": '#include "client/Client.h"\n',
    "tools/ctl/D.cpp": '#include "testing/FakeDaemon.h"\n',
    "benchmarks/a_benchmark.cpp": '#include "linux/net/Server.h"\n',
    "benchmarks/load/A.cpp": '#include "service/Registry.h"\n',
    "benchmarks/trace/A.cpp": '#include "common/Json.h"\n',
    "fuzz/a_fuzz.cpp": '#include "service/Registry.h"\n',
    "tests/a/A.cpp": '#include "common/Value.h"\n',
    "tools/halyardctl/A.cpp": '#include "linux/net/Server.h"\n',
    "tools/ctl/F.cpp": '#include "ATesting.h"\n',
    "tools/ctl/E_test.cpp": '#include "service/Registry.h"\n',
}


def check_tree(files):
    with tempfile.TemporaryDirectory() as root:
        for path, text in files.items():
            os.makedirs(os.path.join(root, os.path.dirname(path)), exist_ok=True)
            with open(os.path.join(root, path), "w", encoding="utf-8") as file:
                file.write(text)
        return check(root)


def self_test():
    errors = circles() + [f"should be allowed: {text}" for text in check_tree(ALLOWED)]
    for path, text in FORBIDDEN.items():
        if len(check_tree({path: text})) != 1:
            errors.append(f"should be one violation: {path}: {text.strip()}")
    return errors


def main(arguments):
    if arguments == ["--self-test"]:
        found = self_test()
    else:
        root = arguments[0] if arguments else os.path.join(os.path.dirname(__file__), "..")
        if not any(True for _ in sources(root)):
            found = [f"{root}: no sources here"]
        else:
            found = check(root)
    for line in found:
        print(line)
    return 1 if found else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))

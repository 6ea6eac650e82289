"""Installs components of the build below a temporary root, for tests that look at what is
there and use nothing else.

BUILD is the build folder, PREFIX and LIBDIR what it was configured with.
"""

import os
import shutil
import subprocess
import tempfile

BUILD = os.environ.get("BUILD", "build/test")
PREFIX = os.environ.get("PREFIX", "/usr/local")
LIBDIR = os.environ.get("LIBDIR", "lib")
PATIENCE = 120


class Root:
    """A folder that takes the place of / ."""

    def __init__(self):
        self.path = tempfile.mkdtemp(prefix="halyard-install-")

    def install(self, *components):
        for component in components:
            subprocess.run(["cmake", "--install", BUILD, "--component", component],
                           env=os.environ | {"DESTDIR": self.path}, check=True,
                           stdout=subprocess.DEVNULL, timeout=PATIENCE)
        return self

    def prefixed(self, *names):
        return os.path.join(self.path + PREFIX, *names)

    def lib(self, *names):
        return self.prefixed(LIBDIR, *names)

    def files(self):
        """All that is not a folder, sorted: absolute outside the prefix, else without it, and
        with LIB where libraries go."""
        found = []
        for folder, _, names in os.walk(self.path):
            for name in names:
                path = os.path.join(folder, name)[len(self.path):]
                if path.startswith(PREFIX + "/"):
                    path = path[len(PREFIX) + 1:]
                    if path.startswith(LIBDIR + "/") and not path.startswith(
                            ("lib/systemd/", "lib/sysusers.d/")):
                        path = "LIB" + path[len(LIBDIR):]
                found.append(path)
        return sorted(found)

    def remove(self):
        shutil.rmtree(self.path, ignore_errors=True)

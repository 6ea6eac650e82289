"""halyard-pipewire between a private PipeWire and the real daemon: what glitches
where, and what of it is told when one of the two goes away meanwhile.

HALYARD_PIPEWIRE and GLITCH_PLAYER name the programs.
"""

import json
import os
import shutil
import signal
import subprocess
import tempfile
import time
import unittest

from harness import PATIENCE, DaemonTest

BRIDGE = os.environ.get("HALYARD_PIPEWIRE", "build/release/halyard-pipewire")
PLAYER = os.environ.get("GLITCH_PLAYER", "")

SINK = """
context.objects = [
  { factory = adapter args = { factory.name = support.null-audio-sink
      node.name = "out.speaker" media.class = Audio/Sink object.linger = true
      audio.position = [ FL FR ] priority.session = 1000 } }
]
"""
NO_DBUS = """
alsa_monitor.enabled = false
v4l2_monitor.enabled = false
libcamera_monitor.enabled = false
default_access.enabled = false
"""


def until(condition, what):
    deadline = time.monotonic() + PATIENCE
    while not condition():
        if time.monotonic() > deadline:
            raise AssertionError(f"never came about: {what}")
        time.sleep(0.02)


def write(path, text):
    os.makedirs(os.path.dirname(path), exist_ok=True)
    with open(path, "w", encoding="utf-8") as file:
        file.write(text)


class PipeWire:
    """A PipeWire daemon with a session manager and a null sink of its own."""

    def __init__(self):
        self.folder = tempfile.mkdtemp(prefix="bridge-test-")
        write(f"{self.folder}/config/pipewire/pipewire.conf.d/sink.conf", SINK)
        write(f"{self.folder}/config/wireplumber/main.lua.d/60-nodbus.lua", NO_DBUS)
        write(
            f"{self.folder}/config/wireplumber/bluetooth.lua.d/60-off.lua",
            "bluez_monitor.enabled = false\n",
        )
        self.environment = dict(os.environ, XDG_CONFIG_HOME=f"{self.folder}/config")
        for name in ("XDG_RUNTIME_DIR", "PIPEWIRE_RUNTIME_DIR", "XDG_STATE_HOME"):
            self.environment[name] = self.folder
        for name in ("DBUS_SESSION_BUS_ADDRESS", "DISPLAY", "PIPEWIRE_REMOTE"):
            self.environment.pop(name, None)
        self.processes = []

    def start(self):
        self.daemon = self.run("pipewire")
        until(lambda: os.path.exists(f"{self.folder}/pipewire-0"), "PipeWire's socket")
        self.manager = self.run("wireplumber")
        until(
            lambda: subprocess.run(
                ["wpctl", "inspect", "@DEFAULT_AUDIO_SINK@"],
                env=self.environment,
                stdout=subprocess.DEVNULL,
                stderr=subprocess.DEVNULL,
                check=False,
            ).returncode
            == 0,
            "a default sink",
        )

    def run(self, *command, **options):
        options.setdefault("stdout", subprocess.DEVNULL)
        options.setdefault("stderr", subprocess.DEVNULL)
        process = subprocess.Popen(command, env=self.environment, **options)
        self.processes.append(process)
        return process

    def kill(self):
        """All at once, as when the machine runs out of memory."""
        for process in (self.daemon, self.manager):
            process.kill()
            process.wait()
        os.remove(f"{self.folder}/pipewire-0")

    def remove(self):
        for process in reversed(self.processes):
            if process.poll() is None:
                process.send_signal(signal.SIGCONT)
                process.kill()
            process.wait()
            for pipe in (process.stdin, process.stdout):
                if pipe is not None:
                    pipe.close()
        shutil.rmtree(self.folder, ignore_errors=True)


@unittest.skipUnless(
    all(shutil.which(name) for name in ("pipewire", "wireplumber", "wpctl")),
    "pipewire, wireplumber and wpctl are not installed",
)
class BridgeTest(DaemonTest):
    def setUp(self):
        super().setUp()
        self.pipewire = PipeWire()
        self.addCleanup(self.pipewire.remove)
        self.pipewire.start()

    def bridge(self, *options):
        self.log = f"{self.pipewire.folder}/bridge.log"
        with open(self.log, "wb") as log:
            process = self.pipewire.run(
                BRIDGE, f"--socket={self.daemon.socket_path}", *options, stderr=log
            )
        until(lambda: "connected to PipeWire" in self.said(), "the bridge's connection")
        return process

    def said(self):
        with open(self.log, encoding="utf-8") as log:
            return log.read()

    def play(self, name="player"):
        """A player whose stream the bridge watches, with a known data thread."""
        player = self.pipewire.run(
            PLAYER,
            "--target=out.speaker",
            f"--name={name}",
            stdin=subprocess.PIPE,
            stdout=subprocess.PIPE,
        )
        self.assertGreater(json.loads(player.stdout.readline())["pid"], 0)
        until(lambda: self.messages(1), "the stream's start")
        return player

    def command(self, player, text):
        player.stdin.write(text.encode() + b"\n")
        player.stdin.flush()
        return json.loads(player.stdout.readline())

    def messages(self, kind):
        found = self.daemon.rows(
            "SELECT payload FROM upload_message WHERE category = 4 AND type = ? ORDER BY id", kind
        )
        return [json.loads(payload) for (payload,) in found]

    def glitches(self, count=1):
        until(lambda: len(self.messages(7)) >= count, f"{count} glitches")
        return self.messages(7)

    def test_a_glitch_of_a_player_is_a_row_of_its_session(self):
        self.bridge()
        player = self.play()
        done = self.command(player, "sleep 100")
        (glitch,) = self.glitches()
        self.assertEqual(glitch["rtaid_client"], "player")
        self.assertEqual(glitch["glitch_device"], "out.speaker")
        self.assertAlmostEqual(
            glitch["any_channel_silence_seconds"],
            glitch["glitch_cycles"] * glitch["glitch_quantum_seconds"],
            places=6,
        )
        # Four or five cycles of 21.3 ms fit into 100 ms.
        self.assertIn(glitch["glitch_cycles"], (4, 5), done)

    def test_an_open_glitch_is_told_when_pipewire_dies(self):
        self.bridge()
        player = self.play()
        player.send_signal(signal.SIGSTOP)
        until(lambda: self.cycles_missed() >= 10, "missed cycles")
        self.pipewire.kill()
        (glitch,) = self.glitches()
        self.assertEqual(glitch["issue_type"], "process_stopped")
        self.assertGreaterEqual(glitch["glitch_cycles"], 10)
        until(lambda: self.daemon.rows("SELECT 1 FROM upload_session WHERE closed"), "its end")

    def cycles_missed(self):
        """As the bridge has counted them so far."""
        path = os.path.join(os.path.dirname(self.daemon.socket_path), "cycles")
        path = os.path.join(path, "out-out.speaker.counts")
        try:
            with open(path, encoding="ascii") as file:
                words = file.read().split()
        except FileNotFoundError:
            return 0
        return int(words[words.index("missed") + 1])

    def test_a_glitch_while_the_daemon_is_away_is_told_when_it_is_back(self):
        self.bridge()
        player = self.play()
        self.daemon.kill()
        self.command(player, "sleep 100")
        until(lambda: "waiting for halyardd" in self.said(), "the bridge to notice")
        self.daemon.run()
        (glitch,) = self.glitches()
        self.assertIn(glitch["glitch_cycles"], (4, 5))

    def test_an_open_glitch_is_told_when_the_bridge_is_ended(self):
        bridge = self.bridge()
        player = self.play()
        player.send_signal(signal.SIGSTOP)
        until(lambda: self.cycles_missed() >= 10, "missed cycles")
        bridge.send_signal(signal.SIGTERM)
        self.assertEqual(bridge.wait(PATIENCE), 0)
        self.assertEqual(self.glitches()[0]["issue_type"], "process_stopped")
        until(lambda: self.messages(2), "the stream's stop")

    def test_busy_programs_are_named_for_who_asks_and_for_nobody_else(self):
        for options, named in (((), False), (("--blame",), True)):
            bridge = self.bridge(*options)
            player = self.play("named" if named else "nameless")
            before = len(self.messages(7))
            for _ in range(3):
                self.command(player, "burn 400")
            until(lambda: len(self.messages(7)) > before, "a glitch")
            evidence = [message["glitch_evidence"] for message in self.messages(7)[before:]]
            self.assertEqual(any("busiest" in each for each in evidence), named)
            player.stdin.close()
            player.wait(PATIENCE)
            bridge.send_signal(signal.SIGTERM)
            bridge.wait(PATIENCE)

    def test_what_programs_call_themselves_does_not_reach_a_terminal_raw(self):
        self.bridge("--verbose")
        self.play("red\x1b[31m\nforged line")
        until(lambda: "forged line" in self.said(), "the session's line")
        self.assertNotIn("\x1b", self.said())
        self.assertFalse(any(line.startswith("forged") for line in self.said().splitlines()))


if __name__ == "__main__":
    unittest.main()

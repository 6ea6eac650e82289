"""The PipeWire graph, as its command-line tools tell it, and a headless daemon's
configuration."""

import json
import os
import socket
import subprocess
from pathlib import Path

SINK = """{ factory = adapter args = {
  factory.name = support.null-audio-sink node.name = "%s" media.class = Audio/Sink
  object.linger = true audio.position = [ FL FR ] monitor.channel-volumes = true
  priority.session = %d } }
"""

# The session manager runs without D-Bus and without hardware.
NO_DBUS = """alsa_monitor.enabled = false
v4l2_monitor.enabled = false
libcamera_monitor.enabled = false
default_access.enabled = false
"""


def running_session():
    """The runtime directory of a PipeWire daemon that answers, or None."""
    for name in ("PIPEWIRE_RUNTIME_DIR", "XDG_RUNTIME_DIR"):
        folder = os.environ.get(name)
        if not folder:
            continue
        with socket.socket(socket.AF_UNIX) as probe:
            try:
                probe.connect(str(Path(folder) / "pipewire-0"))
                return Path(folder)
            except OSError:
                continue
    return None


def private_environment(folder):
    """Writes a headless daemon's configuration; its environment."""
    config = folder / "config"
    files = {
        "pipewire/pipewire.conf.d/sinks.conf":
            "context.objects = [\n" + SINK % ("out.speaker", 1000)
            + SINK % ("out.headphones", 900) + "]\n",
        "wireplumber/main.lua.d/60-nodbus.lua": NO_DBUS,
        "wireplumber/bluetooth.lua.d/60-off.lua": "bluez_monitor.enabled = false\n"}
    for name, text in files.items():
        (config / name).parent.mkdir(parents=True)
        (config / name).write_text(text)
    for name in ("run", "state"):
        (folder / name).mkdir(mode=0o700)
    return {"XDG_CONFIG_HOME": str(config), "XDG_STATE_HOME": str(folder / "state"),
            "XDG_RUNTIME_DIR": str(folder / "run"), "PIPEWIRE_RUNTIME_DIR": str(folder / "run")}


def objects():
    """All objects, [] while the daemon is busy starting."""
    result = subprocess.run(["pw-dump"], capture_output=True, text=True, check=False)
    decoder, text, found = json.JSONDecoder(), result.stdout.strip(), []
    # It may print several arrays, later ones with what changed meanwhile.
    while text:
        try:
            array, end = decoder.raw_decode(text)
        except ValueError:
            return []
        found += array
        text = text[end:].strip()
    return found


class Graph:
    def nodes(self, media_class):
        for item in objects():
            info = item.get("info") or {}
            properties = info.get("props") or {}
            if properties.get("media.class") == media_class:
                yield {"id": item["id"], "name": properties.get("node.name", ""),
                       "serial": properties.get("object.serial"), "state": info.get("state"),
                       "priority": properties.get("priority.session", 0)}

    def devices(self):
        """The sinks, the preferred one first."""
        return sorted(self.nodes("Audio/Sink"), key=lambda node: -int(node["priority"]))

    def has_default(self):
        return any(entry.get("key") == "default.audio.sink" for item in objects()
                   for entry in item.get("metadata") or [])

    def running_stream(self, name):
        return next((node for node in self.nodes("Stream/Output/Audio")
                     if node["name"] == name and node["state"] == "running"), None)

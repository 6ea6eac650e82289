"""Neovim, whose MessagePack-RPC client nobody here wrote, uses the daemon."""

import json
import os
import shutil
import subprocess
import unittest

from harness import PATIENCE, DaemonTest

SCRIPT = """
let c = sockconnect('pipe', $HALYARD_SOCKET, {'rpc': v:true})
let out = []
call add(out, rpcrequest(c, 'createReportingSession', 42))
call add(out, rpcrequest(c, 'setServiceType', 8, 42))
call add(out, rpcrequest(c, 'setConfiguration', {'HostApplicationDisplayID': 'nvim'}, 42))
call rpcnotify(c, 'startReportingSessionForID', 42)
call rpcnotify(c, 'sendMessage', {'edits': 3, 'ratio': 0.5, 'names': ['a', 'b']}, 1, 3, [42])
call add(out, rpcrequest(c, 'getServiceNameForReporterID', 42))
call add(out, rpcrequest(c, 'reporterIDValid', 42))
call add(out, rpcrequest(c, 'getAllReporters'))
try
  call rpcrequest(c, 'setServiceType', 70000, 42)
catch
  call add(out, 'refused')
endtry
call add(out, rpcrequest(c, 'stopReportingSessionForID', 42))
call add(out, rpcrequest(c, 'admin.flush'))
call writefile([json_encode(out)], $HALYARD_OUT)
qall!
"""


@unittest.skipUnless(shutil.which("nvim"), "nvim is not installed")
class Neovim(DaemonTest):
    def test_speaks_with_the_daemon(self):
        script = os.path.join(self.daemon.root, "script.vim")
        out = os.path.join(self.daemon.root, "out.json")
        with open(script, "w", encoding="utf-8") as file:
            file.write(SCRIPT)
        environment = dict(os.environ, HALYARD_SOCKET=self.daemon.socket_path, HALYARD_OUT=out,
                           XDG_STATE_HOME=self.daemon.root, XDG_DATA_HOME=self.daemon.root)
        subprocess.run(["nvim", "--headless", "-u", "NONE", "-n", "-i", "NONE", "-S", script],
                       env=environment, timeout=PATIENCE, check=True, stdin=subprocess.DEVNULL)
        with open(out, encoding="utf-8") as file:
            self.assertEqual(json.load(file),
                             [True, True, True, 8, {"reporterID": 42, "serviceType": 8}, [42],
                              "refused", True, True])
        [(payload,)] = self.rows(
            "SELECT payload FROM upload_message WHERE category = 1 AND type = 3")
        self.assertEqual(json.loads(payload), {"edits": 3, "ratio": 0.5, "names": ["a", "b"],
                                               "audiotag": "GenericActivate"})


if __name__ == "__main__":
    unittest.main()

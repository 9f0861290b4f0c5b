#!/usr/bin/env python3
"""End-to-end check of "Try login" against a real vsftpd.

For every scenario of trylogin.toml this script writes the files into /etc,
starts vsftpd on 127.0.0.1 (or leaves it stopped), and runs the dialog
through trylogindriver for each try, the password on its standard input;
every row the scenario expects must be among the rows the dialog shows.

Like verdicts.py it runs only inside scripts/with-private-etc.sh.
"""

import os
import subprocess
import sys
from typing import List

# Run from the source tree: no compiled copy of the harness left beside it.
sys.dont_write_bytecode = True
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
import harness  # noqa: E402
from harness import Scenario, SetupError  # noqa: E402

# The driver's whole trial: PAM and two logins of a few steps each.
DRIVER_TIMEOUT = 90


def rows_of(output: str) -> List[List[str]]:
    """[step, result, reply] of each line "depth<TAB>step<TAB>result<TAB>reply"."""
    return [(line.split("\t") + ["", "", ""])[1:4] for line in output.splitlines() if line]


def matches(row: List[str], expected: str) -> bool:
    step, result, piece = (expected.split("|", 2) + ["", ""])[:3]
    return row[0].startswith(step) and (not result or row[1] == result) and piece in row[2]


def run_one(scenario: Scenario, driver: str, tmp: str) -> bool:
    port = harness.free_port()
    server = harness.Vsftpd(port, os.path.join(tmp, "vsftpd.log"))
    ok = True
    try:
        harness.prepare(scenario, tmp, port)
        if scenario.server:
            server.start()
        for attempt in scenario.tries:
            user = attempt["user"]
            password = attempt.get("password", harness.password_of(user))
            env = dict(os.environ, XDG_CONFIG_HOME=os.path.join(tmp, "xdg"), QT_QPA_PLATFORM="offscreen")
            done = subprocess.run(
                [driver, user], input=password + "\n", capture_output=True, text=True, timeout=DRIVER_TIMEOUT, env=env
            )
            rows = rows_of(done.stdout)
            missing = [e for e in attempt["expect"] if not any(matches(row, e) for row in rows)]
            # The password goes to the server and PAM only: never shown.
            shown = [row for row in rows if password in "\t".join(row)]
            if done.returncode != 0 or missing or shown:
                ok = False
                print(f"{scenario.name}: FAIL {user}: exit {done.returncode}, missing {missing}, shows the password {shown}")
                print(done.stdout + done.stderr)
            else:
                print(f"{scenario.name}: ok {user} ({len(rows)} rows)")
    except (SetupError, OSError, subprocess.TimeoutExpired) as error:
        print(f"{scenario.name}: ERROR {error}")
        ok = False
    finally:
        server.stop()
    return ok


if __name__ == "__main__":
    sys.exit(
        harness.main(
            __file__,
            __doc__,
            "--driver",
            [harness.VSFTPD, harness.CHPASSWD, "openssl"],
            {"server": True, "tries": []},
            lambda table: None,
            run_one,
        )
    )

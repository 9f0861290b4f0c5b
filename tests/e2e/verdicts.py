#!/usr/bin/env python3
"""End-to-end check of the engine's verdicts against a real vsftpd.

For every scenario of verdicts.toml the script writes a vsftpd.conf, a PAM
service file, accounts, lists and virtual users into /etc, starts vsftpd on
127.0.0.1, tries each user's login, stops the server and then asks
ftpconfig-report what the engine thinks of the same files. The two answers
must agree, except where the scenario declares a difference: the engine
follows some rules of its own on purpose (docs/verdicts.md), and a declared
difference must then occur exactly as declared. The forecast of the same
report must say what the server did.

The script writes to /etc, so it only runs inside scripts/with-private-etc.sh,
which bind-mounts a throw-away copy of /etc. Homes, databases and lists live
in one temporary directory that is removed at the end.
"""

import os
import sys

# Run from the source tree: no compiled copy of the harness left beside it.
sys.dont_write_bytecode = True
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
import logins  # noqa: E402  (the shared runner lives next to this file)

if __name__ == "__main__":
    sys.exit(logins.main(__file__, __doc__))

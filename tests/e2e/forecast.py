#!/usr/bin/env python3
"""End-to-end check of the login forecast against a real vsftpd.

The forecast (the "forecast" of every user and the "server" object of
`ftpconfig-report --json`, the SERVER column of its table) claims to say
what vsftpd 3.0.3 will do with a user who types the right password. For
every scenario of forecast.toml this script writes the files into /etc,
starts vsftpd on 127.0.0.1, logs every user in, stops the server and
compares the forecast with what the server did. Unlike the verdict, the
forecast has no rules of its own: every difference is a fault of the
forecast, unless the scenario declares that it cannot judge a user or
names a known fault (printed as FORECAST-BUG; a fault that no longer
happens fails until its mark is removed). Where the program itself ends
before judging anything, only the server's side is checked.

Like verdicts.py it runs only inside scripts/with-private-etc.sh.
"""

import os
import sys

# Run from the source tree: no compiled copy of the harness left beside it.
sys.dont_write_bytecode = True
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
import logins  # noqa: E402  (the shared runner lives next to this file)

if __name__ == "__main__":
    sys.exit(logins.main(__file__, __doc__))

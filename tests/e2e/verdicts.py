#!/usr/bin/env python3
"""End-to-end check of the engine's verdicts against a real vsftpd.

For every scenario of the table below the script writes a vsftpd.conf, a PAM
service file, accounts, lists and virtual users into /etc, starts vsftpd on
127.0.0.1, tries each user's login with the right password, stops the server
and then asks ftpconfig-report what the engine thinks of the same files.  The
two answers must agree, except where the scenario declares a difference:
the engine follows some rules of its own on purpose, and a declared
difference must then occur exactly as declared.

The script writes to /etc, so it only runs inside scripts/with-private-etc.sh,
which bind-mounts a throw-away copy of /etc.  Homes, databases and lists live
in one temporary directory that is removed at the end.
"""

import argparse
import ctypes
import dataclasses
import ftplib
import json
import os
import shutil
import signal
import socket
import subprocess
import sys
import tempfile
import time
from typing import Dict, List, Optional, Tuple

VSFTPD = "/usr/sbin/vsftpd"
DB_LOAD = "db5.3_load"
CHPASSWD = "chpasswd"

ALLOWED = "allowed"
DENIED = "denied"

# The name a client logs in with, and the row the report shows for it.
ANONYMOUS = "anonymous"
ANONYMOUS_ROW = "Anonymous users"

# Seconds: each FTP exchange, the server's start and stop, one report run,
# and the whole run (ctest kills the test at 600).
FTP_TIMEOUT = 5
START_TIMEOUT = 5
STOP_TIMEOUT = 3
REPORT_TIMEOUT = 60
RUN_DEADLINE = 300

FIRST_ID = 42100  # uids and gids of the test accounts start here


def password_of(name: str) -> str:
    return f"{name}-Pw7!"


@dataclasses.dataclass(frozen=True)
class Account:
    """A local account appended to /etc/passwd, /etc/shadow and /etc/group."""

    name: str
    shell: str = "/bin/bash"
    # "hash": the password set by chpasswd; "!" or "*": the whole shadow
    # field; "!hash": the hash with a "!" in front (usermod -L style).
    shadow: str = "hash"
    passwd_field: str = "x"
    expired: bool = False
    # "dir": owned by the account, 0755 (writable by it); "readonly": owned
    # by the account, 0555; "root": owned by root, 0755; "root-group":
    # owned by root and the account's primary group, 0775; "missing".
    home: str = "dir"
    home_path: Optional[str] = None  # default {tmp}/home/NAME
    group: Optional[str] = None  # primary group, default one of its own name
    groups: Tuple[str, ...] = ()  # supplementary groups


@dataclasses.dataclass(frozen=True)
class Expect:
    """What the server and the report must say of one user.

    `engine` is a piece of the report's refusal message (the engine's
    untranslated "***Result: FALSE. Check: ..." texts), so that a verdict
    reached for another reason does not pass; an admitted user must come
    without any message unless `engine` names one. A declared difference has
    a reason id (docs/verdicts.md) and a kind: "deliberate", one of the
    engine's own rules, or "suspected-bug".

    The forecast of the same report has no rules of its own: it must say
    what the server did, unless `forecast_bug` names a known fault of it
    (forecast.py tests it in depth).
    """

    server: str
    report: str
    engine: str = ""
    reason: str = ""
    kind: str = ""
    forecast_bug: str = ""


ALLOW = Expect(ALLOWED, ALLOWED)


def deny(engine: str) -> Expect:
    return Expect(DENIED, DENIED, engine)


def differs(report: str, server: str, reason: str, engine: str = "", kind: str = "deliberate") -> Expect:
    return Expect(server, report, engine, reason, kind)


@dataclasses.dataclass(frozen=True)
class Scenario:
    name: str
    conf: List[str]
    # user -> what both must say. Local users are accounts, virtual ones
    # keys of a database, ANONYMOUS the row "Anonymous users".
    users: Dict[str, Expect]
    accounts: List[Account] = dataclasses.field(default_factory=list)
    pam: Optional[List[str]] = None  # default DEBIAN_PAM
    pam_service: str = "vsftpd"
    # database file (with ".db") -> {virtual user: password}
    dbs: Dict[str, Dict[str, str]] = dataclasses.field(default_factory=dict)
    # further files (lists), path -> lines; paths under /etc or {tmp}
    files: Dict[str, List[str]] = dataclasses.field(default_factory=dict)
    # directories under {tmp}, owned by root, 0755
    dirs: Tuple[str, ...] = ()
    # keys of BASE_CONF this scenario leaves out
    omit: Tuple[str, ...] = ()


# Debian's /etc/pam.d/vsftpd, with the list file made a parameter.
def debian_pam(ftpusers: str = "/etc/ftpusers") -> List[str]:
    return [
        "# Standard behaviour for ftpd(8).",
        f"auth\trequired\tpam_listfile.so item=user sense=deny file={ftpusers} onerr=succeed",
        "",
        "# Standard pam includes",
        "@include common-account",
        "@include common-session",
        "@include common-auth",
        "auth\trequired\tpam_shells.so",
    ]


DEBIAN_PAM = debian_pam()

# Debian 12's common stacks, written into the private /etc so that the
# machine's own (LDAP, a PAM profile, ...) cannot change the server's side.
# Two changes: "nodelay", because pam_unix's two-second pause after every
# refused password would make the run take minutes, and no pam_systemd.
COMMON_PAM = {
    "/etc/pam.d/common-auth": [
        "auth\t[success=1 default=ignore]\tpam_unix.so nullok nodelay",
        "auth\trequisite\t\t\tpam_deny.so",
        "auth\trequired\t\t\tpam_permit.so",
    ],
    "/etc/pam.d/common-account": [
        "account\t[success=1 new_authtok_reqd=done default=ignore]\tpam_unix.so",
        "account\trequisite\t\t\tpam_deny.so",
        "account\trequired\t\t\tpam_permit.so",
    ],
    "/etc/pam.d/common-session": [
        "session\t[default=1]\t\t\tpam_permit.so",
        "session\trequisite\t\t\tpam_deny.so",
        "session\trequired\t\t\tpam_permit.so",
        "session\trequired\tpam_unix.so",
    ],
}

# pam_userdb first, as the engine wants it, then the ordinary stack.
def userdb_pam(auth_db: str, account_db: Optional[str] = None) -> List[str]:
    return [
        f"auth sufficient pam_userdb.so db={auth_db}",
        f"account sufficient pam_userdb.so db={account_db or auth_db}",
        "@include common-account",
        "@include common-session",
        "@include common-auth",
        "auth required pam_shells.so",
    ]


# Every scenario runs with these. vsftpd stays in the foreground on the
# loopback address; seccomp_sandbox=NO is Debian's default anyway and keeps
# the sandbox of 3.0.3 from killing sessions on newer kernels. isolate and
# isolate_network keep their defaults: they work under unshare -m as root.
# A refused login is answered at once instead of after a second.
BASE_CONF = [
    "listen=YES",
    "listen_address=127.0.0.1",
    "listen_port={port}",
    "background=NO",
    "seccomp_sandbox=NO",
    "secure_chroot_dir={tmp}/empty",
    "delay_failed_login=0",
    "ftp_username=e2eanon",
    "anon_root={tmp}/anon",
]

# The account of anonymous sessions; never logs in itself.
ANON_ACCOUNT = Account("e2eanon", shell="/usr/sbin/nologin", shadow="*", home="root", home_path="{tmp}/anon")
# The account virtual users are mapped to.
GUEST_ACCOUNT = Account("e2eguest", shell="/usr/sbin/nologin", shadow="*", home="root", home_path="{tmp}/guest")

VDB = "{tmp}/vusers.db"
VUSERS = {"e2evera": "vera-Pw7!", "e2evlad": "vlad-Pw7!"}

SCENARIOS: List[Scenario] = [
    Scenario(
        "debian-default-pam",
        ["anonymous_enable=YES", "local_enable=YES"],
        accounts=[
            Account("e2ealice"),
            Account("e2enolog", shell="/usr/sbin/nologin"),
            Account("e2eexpir", expired=True),
        ],
        users={
            "e2ealice": ALLOW,
            # Debian's PAM file ends with pam_shells.
            "e2enolog": differs(ALLOWED, DENIED, "pam-shells-not-checked"),
            # pam_unix's account stage refuses an expired account.
            "e2eexpir": differs(ALLOWED, DENIED, "account-expiry-not-checked"),
            ANONYMOUS: ALLOW,
        },
    ),
    Scenario(
        "anonymous-only",
        ["anonymous_enable=YES", "local_enable=NO"],
        accounts=[Account("e2ealice")],
        users={"e2ealice": deny("local_enable != yes"), ANONYMOUS: ALLOW},
    ),
    Scenario(
        "anonymous-disabled",
        ["anonymous_enable=NO", "local_enable=YES"],
        accounts=[Account("e2ealice")],
        users={"e2ealice": ALLOW, ANONYMOUS: deny("anonymous_enable option != yes")},
    ),
    Scenario(
        "local-enable-absent",
        ["anonymous_enable=YES"],
        accounts=[Account("e2ealice")],
        users={"e2ealice": deny("no local_enable defined"), ANONYMOUS: ALLOW},
    ),
    Scenario(
        "anonymous-enable-absent",
        ["local_enable=YES"],
        accounts=[Account("e2ealice")],
        # vsftpd 3.0.3 admits anonymous users without the key, whatever its
        # manual says about the default, and so does the engine.
        users={"e2ealice": ALLOW, ANONYMOUS: ALLOW},
    ),
    Scenario(
        "yes-no-words",
        # vsftpd takes YES, TRUE and 1 (NO, FALSE and 0) in any case.
        [
            "anonymous_enable=TRUE",
            "local_enable=yes",  # lower case: both read it as yes
            "userlist_enable=0",
            "userlist_file={tmp}/user_list",
        ],
        accounts=[Account("e2ealice"), Account("e2ebob")],
        files={"{tmp}/user_list": ["e2ebob"]},
        users={
            "e2ealice": ALLOW,
            "e2ebob": differs(DENIED, ALLOWED, "yes-no-words", "userlist file contains e2ebob"),
            ANONYMOUS: differs(DENIED, ALLOWED, "yes-no-words", "anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "yes-no-words-local",
        ["anonymous_enable=yes", "local_enable=1"],
        accounts=[Account("e2ealice")],
        users={"e2ealice": differs(DENIED, ALLOWED, "yes-no-words", "local_enable != yes"), ANONYMOUS: ALLOW},
    ),
    Scenario(
        "repeated-keys",
        ["local_enable=NO", "anonymous_enable=YES", "local_enable=YES", "anonymous_enable=NO"],
        accounts=[Account("e2ealice")],
        users={
            "e2ealice": differs(DENIED, ALLOWED, "repeated-key-first-wins", "local_enable != yes"),
            ANONYMOUS: differs(ALLOWED, DENIED, "repeated-key-first-wins"),
        },
    ),
    Scenario(
        "locked-passwords",
        ["anonymous_enable=NO", "local_enable=YES"],
        accounts=[
            Account("e2eopen"),
            Account("e2elockx", shadow="!"),
            Account("e2elocks", shadow="*"),
            Account("e2elockp", passwd_field="!"),
            Account("e2elockh", shadow="!hash"),
            Account("e2elockd", shadow="!!"),
        ],
        users={
            "e2eopen": ALLOW,
            "e2elockx": deny("bad passwd in /etc/shadow"),
            "e2elocks": deny("bad passwd in /etc/shadow"),
            "e2elockp": deny("bad passwd in /etc/passwd"),
            # Only a field that is exactly "!" or "*" counts as locked.
            "e2elockh": differs(ALLOWED, DENIED, "lock-only-whole-field"),
            "e2elockd": differs(ALLOWED, DENIED, "lock-only-whole-field"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "userlist-deny",
        [
            "anonymous_enable=YES",
            "local_enable=YES",
            "userlist_enable=YES",
            "userlist_deny=YES",
            "userlist_file={tmp}/user_list",
        ],
        accounts=[Account("e2ealice"), Account("e2ebob")],
        files={"{tmp}/user_list": ["e2ebob", "anonymous"]},
        users={
            "e2ealice": ALLOW,
            "e2ebob": deny("userlist file contains e2ebob"),
            # The server looks up the login name "anonymous"; the verdict
            # looks up the row's label "Anonymous users", the program's rule.
            ANONYMOUS: differs(ALLOWED, DENIED, "anonymous-userlist-by-label"),
        },
    ),
    Scenario(
        "userlist-allow",
        [
            "anonymous_enable=YES",
            "local_enable=YES",
            "userlist_enable=YES",
            "userlist_deny=NO",
            "userlist_file={tmp}/user_list",
        ],
        accounts=[Account("e2ealice"), Account("e2ebob")],
        files={"{tmp}/user_list": ["e2ealice", "anonymous"]},
        users={
            "e2ealice": ALLOW,
            "e2ebob": deny("userlist file doesn't contains e2ebob"),
            ANONYMOUS: differs(
                DENIED,
                ALLOWED,
                "anonymous-userlist-by-label",
                "doesn't contains Anonymous users",
            ),
        },
    ),
    Scenario(
        "userlist-enable-absent",
        ["anonymous_enable=YES", "local_enable=YES", "userlist_file={tmp}/user_list"],
        accounts=[Account("e2ealice"), Account("e2ebob")],
        files={"{tmp}/user_list": ["e2ebob"]},
        users={
            "e2ealice": ALLOW,
            "e2ebob": differs(DENIED, ALLOWED, "userlist-absent-is-enabled", "userlist file contains e2ebob"),
            ANONYMOUS: ALLOW,
        },
    ),
    Scenario(
        "userlist-default-file",
        ["anonymous_enable=YES", "local_enable=YES", "userlist_enable=YES"],
        accounts=[Account("e2ealice"), Account("e2ebob"), Account("e2ecarol")],
        files={
            "/etc/vsftpd.user_list": ["e2ebob"],
            "/etc/vsftpd.d/allowed_user_list.conf": ["e2ecarol"],
        },
        users={
            "e2ealice": ALLOW,
            "e2ebob": differs(ALLOWED, DENIED, "userlist-default-file"),
            "e2ecarol": differs(DENIED, ALLOWED, "userlist-default-file", "userlist file contains e2ecarol"),
            ANONYMOUS: ALLOW,
        },
    ),
    Scenario(
        "pam-listfile-deny",
        ["anonymous_enable=NO", "local_enable=YES"],
        pam=debian_pam("{tmp}/ftpusers"),
        accounts=[Account("e2ealice"), Account("e2ebob")],
        files={"{tmp}/ftpusers": ["# users who may not use FTP", "root", "e2ebob"]},
        users={
            "e2ealice": ALLOW,
            "e2ebob": deny("(item:user|ruser, sense:deny) contains  e2ebob"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "pam-listfile-allow",
        ["anonymous_enable=NO", "local_enable=YES"],
        pam=["auth required pam_listfile.so item=user sense=allow file={tmp}/ftpallow onerr=fail"] + DEBIAN_PAM[3:],
        accounts=[Account("e2ealice"), Account("e2ebob")],
        files={"{tmp}/ftpallow": ["e2ealice"]},
        users={
            "e2ealice": ALLOW,
            "e2ebob": deny("(item:user|ruser, sense:allow) has no e2ebob"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "pam-listfile-missing-file",
        ["anonymous_enable=NO", "local_enable=YES"],
        # onerr=succeed: pam_listfile lets everybody through when the list
        # cannot be read.
        pam=["auth required pam_listfile.so item=user sense=allow file={tmp}/no-such-list onerr=succeed"]
        + DEBIAN_PAM[3:],
        accounts=[Account("e2ealice")],
        users={
            "e2ealice": differs(DENIED, ALLOWED, "listfile-onerr-ignored", "sense:allow) has no e2ealice"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "pam-listfile-group",
        ["anonymous_enable=NO", "local_enable=YES"],
        pam=["auth required pam_listfile.so item=group sense=deny file={tmp}/ftpgroups onerr=succeed"]
        + DEBIAN_PAM[3:],
        accounts=[
            Account("e2ealice"),
            Account("e2ecarol", groups=("e2enoftp",)),  # supplementary member
            Account("e2edave", group="e2enoftp"),  # primary group
        ],
        files={"{tmp}/ftpgroups": ["e2enoftp"]},
        users={
            "e2ealice": ALLOW,
            "e2ecarol": deny("(item:group, sense:deny) contains group"),
            "e2edave": deny("(item:group, sense:deny) contains group"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "chroot-local-user",
        ["anonymous_enable=NO", "local_enable=YES", "chroot_local_user=YES"],
        accounts=[
            Account("e2ealice", home="readonly"),
            Account("e2ebob", home="dir"),
            Account("e2ecarol", home="missing"),
        ],
        users={
            "e2ealice": ALLOW,
            # vsftpd refuses a chroot whose top the user can write to.
            "e2ebob": differs(ALLOWED, DENIED, "writable-chroot-not-checked"),
            "e2ecarol": deny("home/e2ecarol does not exist"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "chroot-list-exceptions",
        # With chroot_local_user the list names the users left unjailed.
        [
            "anonymous_enable=NO",
            "local_enable=YES",
            "chroot_local_user=YES",
            "chroot_list_enable=YES",
            "chroot_list_file={tmp}/chroot_list",
        ],
        accounts=[
            Account("e2ealice", home="readonly"),
            Account("e2ebob", home="missing"),
            Account("e2ecarol", home="missing"),
        ],
        files={"{tmp}/chroot_list": ["e2ebob"]},
        users={
            "e2ealice": ALLOW,
            "e2ebob": differs(ALLOWED, DENIED, "home-checked-only-in-chroot"),
            "e2ecarol": deny("home/e2ecarol does not exist"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "user-config-dir",
        [
            "anonymous_enable=NO",
            "local_enable=YES",
            "chroot_local_user=YES",
            "user_config_dir={tmp}/users.d",
        ],
        accounts=[Account("e2ealice", home="readonly"), Account("e2ebob", home="readonly")],
        files={
            "{tmp}/users.d/e2ealice": ["local_root={tmp}/ftp-alice"],
            "{tmp}/users.d/e2ebob": ["local_root={tmp}/no-such-dir"],
        },
        dirs=("{tmp}/ftp-alice",),
        users={
            "e2ealice": ALLOW,
            "e2ebob": deny("no-such-dir does not exist"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "user-config-dir-absent",
        # No user_config_dir: vsftpd reads no per-user files at all.
        ["anonymous_enable=NO", "local_enable=YES", "chroot_local_user=YES"],
        accounts=[Account("e2ealice", home="readonly"), Account("e2ebob", home="readonly")],
        files={"/etc/vsftpd.d/users.d/e2ebob": ["local_root={tmp}/no-such-dir"]},
        users={
            "e2ealice": ALLOW,
            "e2ebob": differs(DENIED, ALLOWED, "user-config-dir-default", "no-such-dir does not exist"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "no-chroot-missing-home",
        ["anonymous_enable=NO", "local_enable=YES"],
        accounts=[Account("e2ealice"), Account("e2ecarol", home="missing")],
        users={
            "e2ealice": ALLOW,
            "e2ecarol": differs(ALLOWED, DENIED, "home-checked-only-in-chroot"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "virtual-users",
        [
            "anonymous_enable=NO",
            "local_enable=YES",
            "guest_enable=YES",
            "guest_username=e2eguest",
            "pam_service_name=e2e-vsftpd",
        ],
        pam_service="e2e-vsftpd",
        pam=userdb_pam("{tmp}/vusers"),
        accounts=[GUEST_ACCOUNT, Account("e2ealice"), Account("e2ecarol", home="missing")],
        dbs={VDB: VUSERS},
        users={
            "e2evera": ALLOW,
            "e2evlad": ALLOW,
            "e2ealice": ALLOW,
            # With guest_enable every non-anonymous login becomes the guest,
            # local ones too: the server never enters carol's own home.
            "e2ecarol": differs(DENIED, ALLOWED, "guest-maps-only-virtual", "home/e2ecarol does not exist"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "virtual-without-guest",
        ["anonymous_enable=NO", "local_enable=YES"],
        pam=userdb_pam("{tmp}/vusers"),
        accounts=[GUEST_ACCOUNT],
        dbs={VDB: VUSERS},
        users={
            "e2evera": deny("guest users are not enabled"),
            "e2evlad": deny("guest users are not enabled"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "virtual-db-suffix",
        ["anonymous_enable=NO", "local_enable=YES", "guest_enable=YES", "guest_username=e2eguest"],
        # pam_userdb appends ".db" to every db= value.
        pam=userdb_pam("{tmp}/vusers.db"),
        accounts=[GUEST_ACCOUNT],
        dbs={VDB: VUSERS},
        users={
            "e2evera": differs(ALLOWED, DENIED, "userdb-suffix-as-written"),
            "e2evlad": differs(ALLOWED, DENIED, "userdb-suffix-as-written"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "virtual-account-db-missing",
        ["anonymous_enable=NO", "local_enable=YES", "guest_enable=YES", "guest_username=e2eguest"],
        pam=userdb_pam("{tmp}/vusers", "{tmp}/no-such-db"),
        accounts=[GUEST_ACCOUNT],
        dbs={VDB: VUSERS},
        users={
            # The engine names the missing file but still admits.
            "e2evera": differs(ALLOWED, DENIED, "missing-userdb-passes", "invalid path to virtual user db"),
            "e2evlad": differs(ALLOWED, DENIED, "missing-userdb-passes", "invalid path to virtual user db"),
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "virtual-after-listfile",
        ["anonymous_enable=NO", "local_enable=YES", "guest_enable=YES", "guest_username=e2eguest"],
        # Debian's list line stays in front of the pam_userdb lines.
        pam=DEBIAN_PAM[:2] + userdb_pam("{tmp}/vusers"),
        accounts=[GUEST_ACCOUNT, Account("e2ealice")],
        dbs={VDB: VUSERS},
        users={
            "e2evera": differs(DENIED, ALLOWED, "userdb-must-come-first", "PAM configuration problem"),
            "e2evlad": differs(DENIED, ALLOWED, "userdb-must-come-first", "PAM configuration problem"),
            "e2ealice": ALLOW,
            ANONYMOUS: deny("anonymous_enable option != yes"),
        },
    ),
    Scenario(
        "anonymous-root-owned-by-account",
        # Read-only for the anonymous account, but its own.
        ["anonymous_enable=YES", "local_enable=NO"],
        accounts=[dataclasses.replace(ANON_ACCOUNT, home="readonly"), Account("e2ealice")],
        users={
            ANONYMOUS: differs(DENIED, ALLOWED, "anonymous-root-owner", "is owned by anonymous user e2eanon"),
            "e2ealice": deny("local_enable != yes"),
        },
    ),
    Scenario(
        "anonymous-root-group-writable",
        ["anonymous_enable=YES", "local_enable=NO"],
        accounts=[dataclasses.replace(ANON_ACCOUNT, home="root-group"), Account("e2ealice")],
        users={ANONYMOUS: deny("is writable by group e2eanon"), "e2ealice": deny("local_enable != yes")},
    ),
    Scenario(
        "anonymous-home-account",
        # No anon_root: the server takes the home of ftp_username as the
        # anonymous root, the verdict (the program's rule) that of
        # guest_username.
        ["anonymous_enable=YES", "local_enable=YES", "guest_username=e2eguest"],
        omit=("anon_root",),
        accounts=[dataclasses.replace(GUEST_ACCOUNT, home="missing")],
        users={
            ANONYMOUS: differs(
                DENIED,
                ALLOWED,
                "anonymous-root-from-guest-username",
                "guest does not exist",
            )
        },
    ),
]


class SetupError(Exception):
    """The scenario could not be prepared or run; not a verdict."""


# Guards -------------------------------------------------------------------


def etc_is_private() -> Tuple[bool, str]:
    if os.environ.get("FTPCONFIG_PRIVATE_ETC") != "1":
        return False, "FTPCONFIG_PRIVATE_ETC=1 is not set"
    try:
        with open("/proc/self/mountinfo", encoding="utf-8", errors="replace") as mountinfo:
            for line in mountinfo:
                fields = line.split()
                if len(fields) > 4 and fields[4] == "/etc":
                    return True, ""
    except OSError as error:
        return False, f"cannot read /proc/self/mountinfo: {error}"
    return False, "/etc is not a mount point"


# The private /etc -------------------------------------------------------------


class EtcSnapshot:
    """Puts the files a scenario touches back as they were before it."""

    SAVED = [
        "/etc/passwd",
        "/etc/shadow",
        "/etc/group",
        "/etc/gshadow",
        "/etc/vsftpd.conf",
        "/etc/pam.d/vsftpd",
        "/etc/pam.d/common-auth",
        "/etc/pam.d/common-account",
        "/etc/pam.d/common-session",
        "/etc/ftpusers",
        "/etc/vsftpd.user_list",
    ]

    def __init__(self) -> None:
        self.saved: Dict[str, Optional[Tuple[bytes, os.stat_result]]] = {}
        for path in self.SAVED:
            try:
                with open(path, "rb") as source:
                    self.saved[path] = (source.read(), os.stat(path))
            except FileNotFoundError:
                self.saved[path] = None
        self.created: List[str] = []

    def write(self, path: str, text: str, mode: int = 0o644) -> None:
        if not path.startswith("/etc/"):
            raise SetupError(f"{path} is not under /etc")
        directory = os.path.dirname(path)
        missing = []
        while not os.path.exists(directory):
            missing.append(directory)
            directory = os.path.dirname(directory)
        for directory in reversed(missing):
            os.mkdir(directory, 0o755)
            self.created.append(directory)
        if path not in self.saved and not os.path.exists(path):
            self.created.append(path)
        with open(path, "w", encoding="utf-8") as target:
            target.write(text)
        os.chmod(path, mode)

    def restore(self) -> None:
        for path in reversed(self.created):
            if os.path.isdir(path) and not os.path.islink(path):
                shutil.rmtree(path, ignore_errors=True)
            elif os.path.lexists(path):
                os.unlink(path)
        self.created.clear()
        for path, saved in self.saved.items():
            if saved is None:
                if os.path.lexists(path):
                    os.unlink(path)
                continue
            content, info = saved
            with open(path, "wb") as target:
                target.write(content)
            os.chmod(path, info.st_mode & 0o7777)
            os.chown(path, info.st_uid, info.st_gid)


def names_in(path: str) -> set:
    with open(path, encoding="utf-8", errors="replace") as source:
        return {line.split(":", 1)[0] for line in source if ":" in line}


def free_ids(count: int) -> List[int]:
    """Ids unused as uid and gid by the accounts and groups already there."""
    used = set()
    for path in ("/etc/passwd", "/etc/group"):
        with open(path, encoding="utf-8", errors="replace") as source:
            for line in source:
                fields = line.split(":")
                if len(fields) > 2 and fields[2].isdigit():
                    used.add(int(fields[2]))
    ids: List[int] = []
    candidate = FIRST_ID
    while len(ids) < count:
        if candidate not in used:
            ids.append(candidate)
        candidate += 1
    return ids


def run_tool(command: List[str], stdin: str = "", timeout: int = 20) -> None:
    try:
        done = subprocess.run(command, input=stdin, capture_output=True, text=True, timeout=timeout)
    except (OSError, subprocess.TimeoutExpired) as error:
        raise SetupError(f"{command[0]}: {error}") from error
    if done.returncode != 0:
        raise SetupError(f"{' '.join(command)} failed ({done.returncode}): {done.stderr.strip()}")


# Setting a scenario up ---------------------------------------------------------


def fill(text: str, tmp: str, port: int = 0) -> str:
    return text.replace("{tmp}", tmp).replace("{port}", str(port))


def key_of(line: str) -> str:
    return line.split("=", 1)[0]


def conf_text(scenario: Scenario, tmp: str, port: int) -> str:
    base = [line for line in BASE_CONF if key_of(line) not in scenario.omit]
    return "".join(fill(line, tmp, port) + "\n" for line in base + scenario.conf)


# Home forms: mode, owned by the account, group the account's primary group.
HOME_FORMS = {
    "dir": (0o755, True, True),
    "readonly": (0o555, True, True),
    "root": (0o755, False, False),
    "root-group": (0o775, False, True),
}


def add_accounts(scenario: Scenario, tmp: str) -> None:
    """Appends to /etc/passwd, /etc/shadow and /etc/group; EtcSnapshot puts them back."""
    accounts = list(scenario.accounts)
    if all(a.name != ANON_ACCOUNT.name for a in accounts):
        accounts.insert(0, ANON_ACCOUNT)
    group_names: List[str] = []
    for account in accounts:
        for name in (account.group or account.name,) + account.groups:
            if name not in group_names:
                group_names.append(name)
    taken = names_in("/etc/passwd") | names_in("/etc/group")
    clash = taken & ({a.name for a in accounts} | set(group_names))
    if clash:
        raise SetupError(f"accounts or groups already on this machine: {sorted(clash)}")
    ids = free_ids(len(accounts) + len(group_names))
    gid = {name: ids[len(accounts) + i] for i, name in enumerate(group_names)}
    members: Dict[str, List[str]] = {name: [] for name in group_names}
    for account in accounts:
        for name in account.groups:
            members[name].append(account.name)

    passwd_lines, shadow_lines = [], []
    for index, account in enumerate(accounts):
        uid = ids[index]
        home = fill(account.home_path or "{tmp}/home/" + account.name, tmp)
        primary = gid[account.group or account.name]
        # "x" until chpasswd has run: it writes the hash into /etc/passwd
        # instead of /etc/shadow when the field is anything else.
        passwd_lines.append(f"{account.name}:x:{uid}:{primary}::{home}:{account.shell}\n")
        # A recent last change: a 0 there would force a password change.
        expire = "1" if account.expired else ""
        shadow_lines.append(f"{account.name}:!:19000:0:99999:7::{expire}:\n")
        if account.home != "missing":
            os.makedirs(home, exist_ok=True)
            mode, owner, group = HOME_FORMS[account.home]
            os.chmod(home, mode)
            os.chown(home, uid if owner else 0, primary if group else 0)

    group_lines = [f"{name}:x:{gid[name]}:{','.join(members[name])}\n" for name in group_names]
    for path, lines in (("/etc/passwd", passwd_lines), ("/etc/shadow", shadow_lines), ("/etc/group", group_lines)):
        with open(path, "a", encoding="utf-8") as target:
            target.writelines(lines)

    with_hash = [a for a in accounts if a.shadow in ("hash", "!hash")]
    if with_hash:
        run_tool([CHPASSWD], "".join(f"{a.name}:{password_of(a.name)}\n" for a in with_hash))
    # The other forms are written over what chpasswd left.
    by_name = {a.name: a for a in accounts}
    rewrite_field("/etc/shadow", by_name, shadow_field)
    rewrite_field("/etc/passwd", by_name, lambda account, old: account.passwd_field)


def shadow_field(account: Account, hashed: str) -> str:
    if account.shadow == "hash":
        return hashed
    if account.shadow == "!hash":
        return "!" + hashed
    return account.shadow


def rewrite_field(path: str, accounts: Dict[str, Account], value) -> None:
    """Sets the password field of the accounts' lines to value(account, old)."""
    with open(path, encoding="utf-8") as source:
        lines = source.read().splitlines(keepends=True)
    for index, line in enumerate(lines):
        fields = line.split(":")
        account = accounts.get(fields[0])
        if account is not None and len(fields) > 1:
            fields[1] = value(account, fields[1])
            lines[index] = ":".join(fields)
    with open(path, "w", encoding="utf-8") as target:
        target.writelines(lines)


def prepare(scenario: Scenario, tmp: str, port: int, etc: EtcSnapshot) -> None:
    os.makedirs(os.path.join(tmp, "empty"), 0o755, exist_ok=True)
    os.makedirs(os.path.join(tmp, "anon"), 0o755, exist_ok=True)
    add_accounts(scenario, tmp)
    etc.write("/etc/vsftpd.conf", conf_text(scenario, tmp, port))
    for path, lines in COMMON_PAM.items():
        etc.write(path, "".join(line + "\n" for line in lines))
    pam = scenario.pam if scenario.pam is not None else DEBIAN_PAM
    etc.write("/etc/pam.d/" + scenario.pam_service, "".join(fill(line, tmp) + "\n" for line in pam))
    for path, lines in scenario.files.items():
        path = fill(path, tmp)
        text = "".join(fill(line, tmp) + "\n" for line in lines)
        if path.startswith("/etc/"):
            etc.write(path, text)
        elif path.startswith(tmp + "/"):
            os.makedirs(os.path.dirname(path), 0o755, exist_ok=True)
            with open(path, "w", encoding="utf-8") as target:
                target.write(text)
            os.chmod(path, 0o644)
        else:
            raise SetupError(f"{path} is neither under /etc nor under the temporary directory")
    for path in scenario.dirs:
        path = fill(path, tmp)
        if not path.startswith(tmp + "/"):
            raise SetupError(f"{path} is not under the temporary directory")
        os.makedirs(path, 0o755, exist_ok=True)
    for path, users in scenario.dbs.items():
        path = fill(path, tmp)
        if not path.startswith(tmp + "/"):
            raise SetupError(f"{path} is not under the temporary directory")
        run_tool([DB_LOAD, "-T", "-t", "hash", path], "".join(f"{u}\n{p}\n" for u, p in users.items()))


# The server ----------------------------------------------------------------


def free_port() -> int:
    with socket.socket(socket.AF_INET, socket.SOCK_STREAM) as probe:
        probe.bind(("127.0.0.1", 0))
        return probe.getsockname()[1]


class Vsftpd:
    def __init__(self, port: int, log_path: str) -> None:
        self.port = port
        self.log_path = log_path
        self.process: Optional[subprocess.Popen] = None

    def log(self) -> str:
        try:
            with open(self.log_path, encoding="utf-8", errors="replace") as source:
                return source.read().strip()
        except OSError:
            return ""

    def start(self) -> None:
        with open(self.log_path, "wb") as log:
            self.process = subprocess.Popen(
                [VSFTPD, "/etc/vsftpd.conf"],
                stdin=subprocess.DEVNULL,
                stdout=log,
                stderr=subprocess.STDOUT,
                preexec_fn=die_with_parent,
            )
        deadline = time.monotonic() + START_TIMEOUT
        while time.monotonic() < deadline:
            if self.process.poll() is not None:
                raise SetupError(f"vsftpd exited with {self.process.returncode}: {self.log()}")
            try:
                with socket.create_connection(("127.0.0.1", self.port), timeout=1) as probe:
                    probe.settimeout(FTP_TIMEOUT)
                    banner = probe.recv(200).decode("latin-1")
                if banner.startswith("220"):
                    return
                raise SetupError(f"unexpected greeting on port {self.port}: {banner.strip()!r}")
            except OSError:
                time.sleep(0.05)
        raise SetupError(f"vsftpd did not answer on 127.0.0.1:{self.port} within {START_TIMEOUT}s")

    def stop(self) -> None:
        process = self.process
        if process is None:
            return
        self.process = None
        if process.poll() is None:
            process.terminate()
            try:
                process.wait(STOP_TIMEOUT)
            except subprocess.TimeoutExpired:
                process.kill()
                process.wait(STOP_TIMEOUT)
        # The sessions (vsftpd makes each one a process session of its own)
        # end by themselves once their connection is closed. The orphans
        # among them come to us, a subreaper, and are reaped here; nothing
        # else of ours runs at this point. One that does not end is killed.
        deadline = time.monotonic() + STOP_TIMEOUT
        killed = False
        while True:
            reap_children()
            left = children_of(os.getpid())
            if not left:
                return
            if time.monotonic() > deadline:
                if killed:
                    raise SetupError(f"vsftpd sessions {left} did not end")
                for pid in left:
                    try:
                        os.kill(pid, signal.SIGKILL)
                    except ProcessLookupError:
                        pass
                killed = True
                deadline = time.monotonic() + STOP_TIMEOUT
            time.sleep(0.02)


def children_of(parent: int) -> List[int]:
    """Children of the process, zombies included."""
    children = []
    for entry in os.listdir("/proc"):
        if not entry.isdigit():
            continue
        try:
            with open(f"/proc/{entry}/stat", encoding="latin-1") as source:
                stat = source.read()
        except OSError:
            continue
        # After the command name (which may hold blanks): state, ppid.
        fields = stat[stat.rfind(")") + 2 :].split()
        if len(fields) > 1 and fields[1] == str(parent):
            children.append(int(entry))
    return children


def reap_children() -> None:
    while True:
        try:
            pid, _ = os.waitpid(-1, os.WNOHANG)
        except ChildProcessError:
            return
        if pid == 0:
            return


def die_with_parent() -> None:
    """In the child before exec: should this script be killed (a ctest
    timeout), the server gets SIGTERM instead of listening on."""
    libc = ctypes.CDLL(None, use_errno=True)
    pr_set_pdeathsig = 1
    libc.prctl(pr_set_pdeathsig, signal.SIGTERM, 0, 0, 0)


def become_subreaper() -> None:
    """Orphaned descendants (vsftpd sessions) become our children, not init's."""
    libc = ctypes.CDLL(None, use_errno=True)
    pr_set_child_subreaper = 36
    if libc.prctl(pr_set_child_subreaper, 1, 0, 0, 0) != 0:
        raise OSError(ctypes.get_errno(), "prctl(PR_SET_CHILD_SUBREAPER)")


def try_login(port: int, user: str, password: str) -> Tuple[str, str]:
    """ALLOWED when the server says 230 and answers PWD in the session."""
    ftp = ftplib.FTP(timeout=FTP_TIMEOUT)
    try:
        try:
            ftp.connect("127.0.0.1", port, timeout=FTP_TIMEOUT)
        except OSError as error:
            raise SetupError(f"cannot connect to 127.0.0.1:{port}: {error}") from error
        try:
            reply = ftp.login(user, password)
            ftp.pwd()
        except ftplib.error_perm as error:
            return DENIED, str(error)
        except (EOFError, ConnectionError) as error:
            return DENIED, f"connection closed: {error!r}"
        except (socket.timeout, ftplib.error_temp, ftplib.error_proto, ftplib.error_reply) as error:
            raise SetupError(f"login of {user}: {error!r}") from error
        try:
            ftp.quit()
        except (OSError, EOFError, ftplib.Error):
            pass  # the verdict is in; how the session ends does not matter
        return ALLOWED, reply
    finally:
        ftp.close()


# The report ----------------------------------------------------------------


def run_report(report: str, tmp: str) -> Dict[str, dict]:
    env = dict(os.environ)
    # Settings of an operator's own session (a stored "skip_pam_check")
    # must not change the verdicts.
    env["XDG_CONFIG_HOME"] = os.path.join(tmp, "xdg")
    try:
        done = subprocess.run(
            [report, "--root", "/", "--json"], capture_output=True, text=True, timeout=REPORT_TIMEOUT, env=env
        )
    except (OSError, subprocess.TimeoutExpired) as error:
        raise SetupError(f"ftpconfig-report: {error}") from error
    if done.returncode != 0:
        raise SetupError(f"ftpconfig-report exited with {done.returncode}: {done.stderr.strip()}")
    try:
        document = json.loads(done.stdout)
        rows = {row["name"]: row for row in document["users"]}
    except (ValueError, KeyError, TypeError) as error:
        raise SetupError(f"ftpconfig-report printed no usable JSON: {error}") from error
    return rows


# One scenario ----------------------------------------------------------------


def credentials(scenario: Scenario, user: str) -> Tuple[str, str]:
    if user == ANONYMOUS:
        return ANONYMOUS, "e2e@example.org"
    for users in scenario.dbs.values():
        if user in users:
            return user, users[user]
    return user, password_of(user)


def expected_kind(scenario: Scenario, user: str) -> str:
    if user == ANONYMOUS:
        return "anonymous"
    if any(user in users for users in scenario.dbs.values()):
        return "virtual"
    return "local"


def run_scenario(scenario: Scenario, report: str, tmp: str) -> bool:
    etc = EtcSnapshot()
    port = free_port()
    server = Vsftpd(port, os.path.join(tmp, "vsftpd.log"))
    results: Dict[str, Tuple[str, str]] = {}
    problems: List[str] = []
    try:
        prepare(scenario, tmp, port, etc)
        server.start()
        try:
            for user in scenario.users:
                name, password = credentials(scenario, user)
                results[user] = try_login(port, name, password)
                # A server that admits anybody would agree with anything.
                if results[user][0] == ALLOWED and user != ANONYMOUS:
                    wrong, reply = try_login(port, name, password + "x")
                    if wrong != DENIED:
                        problems.append(f"{user}: the server accepted a wrong password ({reply})")
        finally:
            server.stop()
        rows = run_report(report, tmp)
    except (SetupError, OSError) as error:
        print(f"{scenario.name}: ERROR {error}")
        return False
    finally:
        server.stop()
        etc.restore()

    ok = not problems
    for problem in problems:
        print(f"{scenario.name}: FAIL {problem}")
    for user, expect in scenario.users.items():
        server_result, reply = results[user]
        row = rows.get(ANONYMOUS_ROW if user == ANONYMOUS else user)
        report_status = row["status"] if row else "missing"
        message = row["message"] if row else ""
        notes = []
        if row and row.get("kind") != expected_kind(scenario, user):
            notes.append(f"report kind {row.get('kind')}, expected {expected_kind(scenario, user)}")
        if server_result != expect.server:
            notes.append(f"server expected {expect.server} ({reply.strip()})")
        if report_status != expect.report:
            notes.append(f"report expected {expect.report}")
        elif expect.engine and expect.engine not in message:
            notes.append(f"the report's reason lacks {expect.engine!r}")
        elif not expect.engine and message:
            notes.append("the report gives a reason where none was expected")
        forecast = row.get("forecast") if row else None
        forecast_status = forecast.get("status") if isinstance(forecast, dict) else None
        if expect.forecast_bug and forecast_status == server_result:
            notes.append(f"forecast-bug {expect.forecast_bug} no longer happens: remove the mark")
        elif not expect.forecast_bug and forecast_status != server_result:
            notes.append(f"the forecast says {forecast_status}, the server {server_result}")
        if notes:
            ok = False
            outcome = "FAIL: " + "; ".join(notes)
        elif expect.reason:
            outcome = f"ok, declared {expect.kind}: {expect.reason}"
        else:
            outcome = "ok"
        if expect.forecast_bug and not notes:
            outcome += f"; FORECAST-BUG {expect.forecast_bug} (forecast {forecast_status})"
        why = f" [engine: {message}]" if message else ""
        if server_result == DENIED:
            why += f" [server: {reply.strip()}]"
        print(f"{scenario.name:32} {user:10} server={server_result:8} report={report_status:8} {outcome}{why}")
    return ok


def check_table() -> None:
    """Catches slips in the table itself before anything runs."""
    base_keys = {key_of(line) for line in BASE_CONF}
    names = set()
    for scenario in SCENARIOS:
        if scenario.name in names:
            raise SystemExit(f"scenario {scenario.name} appears twice")
        names.add(scenario.name)
        clash = base_keys & {key_of(line) for line in scenario.conf}
        if clash:
            raise SystemExit(f"scenario {scenario.name} sets keys of the base configuration: {sorted(clash)}")
        for user, expect in scenario.users.items():
            where = f"scenario {scenario.name}, user {user}"
            if {expect.server, expect.report} - {ALLOWED, DENIED}:
                raise SystemExit(f"{where}: a verdict is neither {ALLOWED} nor {DENIED}")
            if (expect.server != expect.report) != bool(expect.reason):
                raise SystemExit(f"{where}: a difference needs a reason id, and a reason id a difference")
            if expect.reason and expect.kind not in ("deliberate", "suspected-bug"):
                raise SystemExit(f"{where}: unknown kind of difference {expect.kind!r}")
            if expect.report == DENIED and not expect.engine:
                raise SystemExit(f"{where}: a refusal by the report must name the engine's reason")


def main() -> int:
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--report", required=True, help="the ftpconfig-report program")
    parser.add_argument("--scenario", action="append", help="run only this scenario (repeatable)")
    args = parser.parse_args()

    private, why = etc_is_private()
    if not private:
        print(
            f"verdicts.py: refusing to run: {why}. It writes to /etc; run it through "
            "scripts/with-private-etc.sh, which gives it a private copy of /etc.",
            file=sys.stderr,
        )
        return 2
    if os.geteuid() != 0:
        print("verdicts.py: must run as root (it adds accounts and starts vsftpd)", file=sys.stderr)
        return 2
    for tool in (VSFTPD, DB_LOAD, CHPASSWD):
        if shutil.which(tool) is None:
            print(f"verdicts.py: {tool} is not installed", file=sys.stderr)
            return 2
    if not os.access(args.report, os.X_OK):
        print(f"verdicts.py: {args.report} is not an executable program", file=sys.stderr)
        return 2
    check_table()
    become_subreaper()
    scenarios = [s for s in SCENARIOS if not args.scenario or s.name in args.scenario]
    if not scenarios:
        print("verdicts.py: no scenario selected", file=sys.stderr)
        return 2

    passed = failed = 0
    deadline = time.monotonic() + RUN_DEADLINE
    for scenario in scenarios:
        if time.monotonic() > deadline:
            print(f"{scenario.name}: ERROR not run, the run took longer than {RUN_DEADLINE}s")
            failed += 1
            continue
        tmp = tempfile.mkdtemp(prefix="ftpconfig-e2e-")
        try:
            # Accounts must reach their homes below it.
            os.chmod(tmp, 0o755)
            if run_scenario(scenario, args.report, tmp):
                passed += 1
            else:
                failed += 1
        finally:
            shutil.rmtree(tmp, ignore_errors=True)
    print(f"{passed} passed, {failed} failed")
    return 0 if failed == 0 else 1


if __name__ == "__main__":
    sys.exit(main())

#!/usr/bin/env python3
"""End-to-end check of the login forecast against a real vsftpd.

The forecast (the "forecast" of every user and the "server" object of
`ftpconfig-report --json`) claims to say what vsftpd 3.0.3 will do with a
user who types the right password. For every scenario of the table below
this script writes the files into /etc, starts vsftpd on 127.0.0.1, logs
every user in (right password; an admitted user also with a wrong one, which
must be refused), stops the server and compares the forecast with what the
server did. Unlike the verdict, the forecast has no rules of its own: every
difference is a fault of the forecast. A scenario may only declare that the
forecast cannot judge a user (a PAM module it does not model decides), or
name a known fault of the forecast ("forecast-bug") so that the suite passes
while the fault is open; such a line is printed with FORECAST-BUG, and a
fault that no longer happens fails the scenario until its mark is removed.
Where the program itself ends before judging anything (a missing PAM service
file is one of its own start rules), only the server's side is checked. The
text table must show the same forecast as the JSON.

It shares harness.py with verdicts.py (accounts, the private /etc, the
server's settings, the server, the logins) and, like it, runs only inside
scripts/with-private-etc.sh.
"""

import dataclasses
import json
import os
import sys
from typing import Dict, List, Optional, Tuple

# Run from the source tree: no compiled copy of the harness left beside it.
sys.dont_write_bytecode = True
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
import harness  # noqa: E402  (the shared harness lives next to this file)
from harness import (  # noqa: E402
    ALLOWED,
    ANONYMOUS,
    ANONYMOUS_ROW,
    CONF,
    DEBIAN_PAM,
    DENIED,
    VDB,
    VUSERS,
    Account,
    SetupError,
    debian_pam,
    userdb_pam,
)

UNKNOWN = "unknown"
SEVERITIES = ("error", "warning", "info")
# The column of the text table that shows the forecast.
TABLE_COLUMN = "SERVER"


@dataclasses.dataclass(frozen=True)
class Login:
    """One user of a scenario.

    `server`: what vsftpd does with the right password; `reply`: a piece of
    its answer when it refuses, so that a refusal for another reason does
    not pass. `unknown`: why the forecast cannot judge this login (it may
    then answer "unknown"). `bug`: the id of a known fault of the forecast;
    its answer must then differ from the server's, and the line is printed
    as FORECAST-BUG. `any_password`: an empty password that pam_unix's
    nullok lets through, so a wrong password must pass too.
    """

    server: str
    reply: str = ""
    unknown: str = ""
    bug: str = ""
    any_password: bool = False


OK = Login(ALLOWED)


def refused(reply: str, **extra) -> Login:
    return Login(DENIED, reply, **extra)


# The server's answers to a refused login.
PAM_NO = "530 Login incorrect"
LOCAL_OFF = "anonymous only"
USERLIST_NO = "Permission denied"
NO_DIR = "cannot change directory"
WRITABLE = "writable root inside chroot()"


@dataclasses.dataclass(frozen=True)
class Scenario(harness.Setup):
    # user -> what the server does with the right password
    users: Dict[str, Login]
    # Fields of /etc/shadow set after the accounts are made: user ->
    # {field index: value} (2: last change, 4: maximum age, 7: expiry).
    shadow: Dict[str, Dict[int, str]] = dataclasses.field(default_factory=dict)
    # A server-wide failure: "start", the server exits at once; "connect",
    # it listens but every connection ends in "500 OOPS". The report must
    # then say "fails": true.
    fails: str = ""
    # For a server that refuses to start over one line of /etc/vsftpd.conf:
    # that line, which the server's findings must name by its number.
    blame: str = ""
    # The id of a known fault of the forecast in "server.fails".
    server_bug: str = ""
    # The program itself ends before any forecast (one of its own start
    # rules): a piece of what it says. Only the server's side is checked.
    report_refuses: str = ""


COMMON = ["@include common-account", "@include common-session", "@include common-auth"]
DENY_ALL = ["auth requisite pam_deny.so", "account requisite pam_deny.so"]
ANON = harness.ANON_ACCOUNT
GUEST = harness.GUEST_ACCOUNT
BOTH_ON = ["anonymous_enable=YES", "local_enable=YES"]
LOCAL_ONLY = ["anonymous_enable=NO", "local_enable=YES"]
GUEST_ON = ["local_enable=YES", "guest_enable=YES", "guest_username=e2eguest"]


def users(*names: str) -> List[Account]:
    """Ordinary accounts: a password, bash, a home of their own."""
    return [Account(name) for name in names]


def everybody_refused(reply: str) -> Dict[str, Login]:
    """The users of a scenario where the server fails as a whole."""
    return {"e2ealice": refused(reply), ANONYMOUS: refused(reply)}


SCENARIOS: List[Scenario] = [
    # --- defaults and the words of the configuration file -------------------
    Scenario(
        "defaults",
        # Neither key: vsftpd 3.0.3 admits anonymous users and refuses local
        # ones.
        [],
        accounts=users("e2ealice"),
        users={"e2ealice": refused(LOCAL_OFF), ANONYMOUS: OK},
    ),
    Scenario(
        "yes-no-words",
        # Any case; a trailing blank after a string value is part of it and
        # harmless.
        ["local_enable=True", "anonymous_enable=0", "ftpd_banner=e2e banner "],
        accounts=users("e2ealice"),
        users={"e2ealice": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "yes-no-digits",
        [
            "local_enable=1",
            "anonymous_enable=FaLsE",
            "userlist_enable=yEs",
            "userlist_deny=TRUE",
            "userlist_file={tmp}/user_list",
        ],
        accounts=users("e2ealice", "e2ebob"),
        files={"{tmp}/user_list": ["e2ebob"]},
        users={"e2ealice": OK, "e2ebob": refused(USERLIST_NO), ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "repeated-keys-last-wins",
        ["local_enable=NO", "anonymous_enable=YES", "local_enable=YES", "anonymous_enable=NO"],
        accounts=users("e2ealice"),
        users={"e2ealice": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    # --- lines the server refuses to start with -------------------------------
    Scenario(
        "conf-blank-around-equals",
        ["anonymous_enable=YES", "local_enable = YES"],
        accounts=users("e2ealice"),
        users=everybody_refused("unrecognised variable"),
        fails="start",
        blame="local_enable = YES",
    ),
    Scenario(
        "conf-indented-line",
        # vsftpd skips the blanks in front of a setting.
        ["anonymous_enable=YES", "  local_enable=YES"],
        accounts=users("e2ealice"),
        users={
            "e2ealice": Login(ALLOWED),
            ANONYMOUS: Login(ALLOWED),
        },
    ),
    Scenario(
        "conf-indented-comment",
        ["anonymous_enable=YES", "local_enable=YES", "  # local users may log in"],
        accounts=users("e2ealice"),
        # Past the blanks, a line without "=" is a setting without a value.
        users=everybody_refused("missing value"),
        fails="start",
        blame="  # local users may log in",
    ),
    Scenario(
        "conf-trailing-blank-yes",
        ["anonymous_enable=YES", "local_enable=YES "],
        accounts=users("e2ealice"),
        users=everybody_refused("bad bool value"),
        fails="start",
        blame="local_enable=YES ",
    ),
    Scenario(
        "conf-unknown-key",
        ["anonymous_enable=YES", "local_enable=YES", "e2e_no_such_option=YES"],
        accounts=users("e2ealice"),
        users=everybody_refused("unrecognised variable"),
        fails="start",
        blame="e2e_no_such_option=YES",
    ),
    Scenario(
        "conf-bad-yes-no",
        ["anonymous_enable=maybe", "local_enable=YES"],
        accounts=users("e2ealice"),
        users=everybody_refused("bad bool value"),
        fails="start",
        blame="anonymous_enable=maybe",
    ),
    Scenario(
        "listen-both",
        BOTH_ON + ["listen_ipv6=YES"],
        accounts=users("e2ealice"),
        users=everybody_refused("run two copies"),
        fails="start",
    ),
    Scenario(
        "listen-neither",
        # Without listen and listen_ipv6 vsftpd expects inetd to hand it a
        # connection.
        BOTH_ON,
        omit=("listen",),
        accounts=users("e2ealice"),
        users=everybody_refused("inetd"),
        fails="start",
    ),
    # --- every connection fails ------------------------------------------------
    Scenario(
        "both-disabled",
        ["anonymous_enable=NO", "local_enable=NO"],
        accounts=users("e2ealice"),
        users=everybody_refused("both local and anonymous access disabled"),
        fails="connect",
    ),
    Scenario(
        "secure-chroot-dir-missing",
        BOTH_ON + ["secure_chroot_dir={tmp}/no-such-empty"],
        omit=("secure_chroot_dir",),
        accounts=users("e2ealice"),
        users=everybody_refused("secure_chroot_dir"),
        fails="connect",
    ),
    Scenario(
        "ftp-username-missing",
        BOTH_ON + ["ftp_username=e2enobody"],
        omit=("ftp_username",),
        accounts=users("e2ealice"),
        users=everybody_refused("ftp_username"),
        fails="connect",
    ),
    Scenario(
        "ftp-username-missing-anonymous-off",
        # The anonymous account is only looked up when anonymous logins are on.
        LOCAL_ONLY + ["ftp_username=e2enobody"],
        omit=("ftp_username",),
        accounts=users("e2ealice"),
        users={"e2ealice": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "userlist-file-missing",
        BOTH_ON + ["userlist_enable=YES", "userlist_file={tmp}/no-such-list"],
        accounts=users("e2ealice"),
        users=everybody_refused("cannot read user list file"),
        fails="connect",
    ),
    # --- the userlist ------------------------------------------------------------
    Scenario(
        "userlist-off-by-default",
        BOTH_ON + ["userlist_file={tmp}/user_list"],
        accounts=users("e2ealice", "e2ebob"),
        files={"{tmp}/user_list": ["e2ebob", "anonymous", "ftp"]},
        users={"e2ealice": OK, "e2ebob": OK, ANONYMOUS: OK},
    ),
    Scenario(
        "userlist-default-file-deny",
        # userlist_deny defaults to YES and userlist_file to
        # /etc/vsftpd.user_list; another list of the same machine is not read.
        BOTH_ON + ["userlist_enable=YES"],
        accounts=users("e2ealice", "e2ebob"),
        files={
            "/etc/vsftpd.user_list": ["e2ebob", "anonymous", "ftp"],
            "/etc/vsftpd.d/allowed_user_list.conf": ["e2ealice"],
        },
        users={"e2ealice": OK, "e2ebob": refused(USERLIST_NO), ANONYMOUS: refused(USERLIST_NO)},
    ),
    Scenario(
        "userlist-allow",
        BOTH_ON + ["userlist_enable=YES", "userlist_deny=NO", "userlist_file={tmp}/user_list"],
        accounts=users("e2ealice", "e2ebob"),
        files={"{tmp}/user_list": ["e2ealice", "anonymous", "ftp"]},
        users={"e2ealice": OK, "e2ebob": refused(USERLIST_NO), ANONYMOUS: OK},
    ),
    Scenario(
        "userlist-allow-anonymous-unlisted",
        # A white list applies to anonymous logins too.
        BOTH_ON + ["userlist_enable=YES", "userlist_deny=NO", "userlist_file={tmp}/user_list"],
        accounts=users("e2ealice"),
        files={"{tmp}/user_list": ["e2ealice"]},
        users={"e2ealice": OK, ANONYMOUS: refused(USERLIST_NO)},
    ),
    Scenario(
        "userlist-deny-names-anonymous",
        # The list is looked up with the name typed: "anonymous" is refused
        # (an "ftp" login would not be).
        BOTH_ON + ["userlist_enable=YES", "userlist_file={tmp}/user_list"],
        accounts=users("e2ealice"),
        files={"{tmp}/user_list": ["anonymous"]},
        users={"e2ealice": OK, ANONYMOUS: refused(USERLIST_NO)},
    ),
    Scenario(
        "userlist-allow-names-ftp",
        BOTH_ON + ["userlist_enable=YES", "userlist_deny=NO", "userlist_file={tmp}/user_list"],
        accounts=users("e2ealice"),
        files={"{tmp}/user_list": ["e2ealice", "ftp"]},
        users={"e2ealice": OK, ANONYMOUS: refused(USERLIST_NO)},
    ),
    # --- PAM: which service, and anonymous logins ---------------------------------
    Scenario(
        "pam-service-default",
        # No pam_service_name: the service is "vsftpd", not "ftp" nor another.
        BOTH_ON,
        accounts=users("e2ealice"),
        files={"/etc/pam.d/ftp": DENY_ALL, "/etc/pam.d/e2e-ftp": DENY_ALL},
        users={"e2ealice": OK, ANONYMOUS: OK},
    ),
    Scenario(
        "pam-service-name",
        BOTH_ON + ["pam_service_name=e2e-ftp"],
        pam_service="e2e-ftp",
        pam=debian_pam("{tmp}/ftpusers"),
        accounts=users("e2ealice", "e2ebob"),
        files={"/etc/pam.d/vsftpd": DENY_ALL, "{tmp}/ftpusers": ["e2ebob"]},
        users={"e2ealice": OK, "e2ebob": refused(PAM_NO), ANONYMOUS: OK},
    ),
    Scenario(
        "pam-service-file-missing",
        # Linux-PAM falls back to /etc/pam.d/other for a service without a
        # file of its own.
        BOTH_ON + ["pam_service_name=e2e-no-such-service"],
        accounts=[Account("e2ealice"), Account("e2elock", shadow="!")],
        files={"/etc/pam.d/other": ["@include common-auth", "@include common-account", "@include common-session"]},
        users={"e2ealice": OK, "e2elock": refused(PAM_NO), ANONYMOUS: OK},
        # The program needs the service's own file and ends at start.
        report_refuses="Unable to find /etc/pam.d/e2e-no-such-service",
    ),
    Scenario(
        "anonymous-never-pam",
        BOTH_ON,
        pam=DENY_ALL,
        accounts=users("e2ealice"),
        users={"e2ealice": refused(PAM_NO), ANONYMOUS: OK},
    ),
    # --- pam_unix ------------------------------------------------------------------
    Scenario(
        "pam-unix-passwords",
        LOCAL_ONLY,
        accounts=[
            Account("e2ealice"),
            Account("e2elockx", shadow="!"),
            Account("e2elocks", shadow="*"),
            Account("e2elockh", shadow="!hash"),
            Account("e2eempty", shadow=""),
            Account("e2eexpir", expired=True),
            Account("e2eforce"),
            Account("e2eaged"),
        ],
        # A last change of 0 forces a change; a password older than its
        # maximum age must be changed too.
        shadow={"e2eforce": {2: "0"}, "e2eaged": {2: "19000", 4: "30", 6: ""}},
        users={
            "e2ealice": OK,
            "e2elockx": refused(PAM_NO),
            "e2elocks": refused(PAM_NO),
            "e2elockh": refused(PAM_NO),
            # common-auth has nullok: an empty password field lets any
            # password through.
            "e2eempty": Login(ALLOWED, any_password=True),
            "e2eexpir": refused(PAM_NO),
            "e2eforce": refused(PAM_NO),
            "e2eaged": refused(PAM_NO),
            ANONYMOUS: refused(PAM_NO),
        },
    ),
    Scenario(
        "pam-unix-without-nullok",
        LOCAL_ONLY,
        pam=["auth required pam_unix.so nodelay", "account required pam_unix.so"],
        accounts=[Account("e2ealice"), Account("e2eempty", shadow="")],
        users={"e2ealice": OK, "e2eempty": refused(PAM_NO), ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "pam-shells",
        LOCAL_ONLY,
        accounts=[
            Account("e2ealice"),
            Account("e2ebob", shell="/bin/e2esh"),
            Account("e2ecarol", shell="/usr/sbin/nologin"),
            Account("e2edave", shell="/bin/e2e-unlisted"),
        ],
        # The machine's own list does not name /bin/e2esh: the forecast must
        # read this one.
        files={"/etc/shells": ["# valid login shells", "/bin/sh", "/bin/bash", "/bin/e2esh"]},
        users={
            "e2ealice": OK,
            "e2ebob": OK,
            "e2ecarol": refused(PAM_NO),
            "e2edave": refused(PAM_NO),
            ANONYMOUS: refused(PAM_NO),
        },
    ),
    # --- pam_listfile ----------------------------------------------------------------
    Scenario(
        "pam-listfile-user",
        LOCAL_ONLY,
        pam=[
            "auth required pam_listfile.so item=user sense=deny file={tmp}/ftpusers onerr=succeed",
            "auth required pam_listfile.so item=user sense=allow file={tmp}/ftpallow onerr=fail",
        ]
        + COMMON,
        accounts=users("e2ealice", "e2ebob", "e2ecarol", "e2edave"),
        files={
            "{tmp}/ftpusers": ["# nobody here may use FTP", "root", "e2ebob"],
            "{tmp}/ftpallow": ["e2ealice", "e2ebob", "e2ecarol"],
        },
        users={
            "e2ealice": OK,
            "e2ebob": refused(PAM_NO),
            "e2ecarol": OK,
            "e2edave": refused(PAM_NO),
            ANONYMOUS: refused(PAM_NO),
        },
    ),
    Scenario(
        "pam-listfile-group-shell",
        LOCAL_ONLY,
        pam=[
            "auth required pam_listfile.so item=group sense=deny file={tmp}/ftpgroups onerr=succeed",
            "account required pam_listfile.so item=shell sense=allow file={tmp}/ftpshells onerr=fail",
        ]
        + COMMON,
        accounts=[
            Account("e2ealice"),
            Account("e2ecarol", groups=("e2enoftp",)),
            Account("e2edave", group="e2enoftp"),
            Account("e2eerin", shell="/bin/sh"),
        ],
        files={"{tmp}/ftpgroups": ["e2enoftp"], "{tmp}/ftpshells": ["/bin/bash"]},
        users={
            "e2ealice": OK,
            "e2ecarol": refused(PAM_NO),
            "e2edave": refused(PAM_NO),
            "e2eerin": refused(PAM_NO),
            ANONYMOUS: refused(PAM_NO),
        },
    ),
    Scenario(
        "pam-listfile-missing-succeed",
        LOCAL_ONLY,
        pam=[
            "auth required pam_listfile.so item=user sense=allow file={tmp}/no-such-list onerr=succeed",
            "account required pam_listfile.so item=user sense=deny file={tmp}/no-such-list onerr=succeed",
        ]
        + COMMON,
        accounts=users("e2ealice"),
        users={"e2ealice": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "pam-listfile-missing-fail",
        LOCAL_ONLY,
        pam=["auth required pam_listfile.so item=user sense=deny file={tmp}/no-such-list onerr=fail"] + COMMON,
        accounts=users("e2ealice"),
        users={"e2ealice": refused(PAM_NO), ANONYMOUS: refused(PAM_NO)},
    ),
    # --- controls, @include, pam_nologin, pam_permit -------------------------------
    Scenario(
        "pam-controls",
        LOCAL_ONLY,
        pam=[
            "auth required pam_unix.so nodelay",
            # An optional failure does not matter next to a required success.
            "auth optional pam_deny.so",
            # A sufficient success ends the stack, unless a required line
            # failed before it.
            "auth sufficient pam_listfile.so item=user sense=allow file={tmp}/vip onerr=fail",
            "auth requisite pam_listfile.so item=user sense=deny file={tmp}/banned onerr=fail",
            "auth required pam_listfile.so item=user sense=deny file={tmp}/banned2 onerr=fail",
            "auth required pam_permit.so",
            "account sufficient pam_listfile.so item=user sense=allow file={tmp}/vip onerr=fail",
            "account required pam_unix.so",
        ],
        accounts=[
            Account("e2ealice"),
            Account("e2evip"),
            Account("e2eban"),
            Account("e2eban2"),
            Account("e2evipx", expired=True),
            Account("e2eexpir", expired=True),
        ],
        files={
            "{tmp}/vip": ["e2evip", "e2evipx"],
            "{tmp}/banned": ["e2evip", "e2eban"],
            "{tmp}/banned2": ["e2eban2"],
        },
        users={
            "e2ealice": OK,
            "e2evip": OK,  # the sufficient line comes before the ban
            "e2eban": refused(PAM_NO),
            "e2eban2": refused(PAM_NO),
            "e2evipx": OK,  # expired, but the account stack ends before pam_unix
            "e2eexpir": refused(PAM_NO),
            ANONYMOUS: refused(PAM_NO),
        },
    ),
    Scenario(
        "pam-value-actions",
        LOCAL_ONLY,
        pam=[
            "auth [success=1 default=ignore] pam_listfile.so item=user sense=allow file={tmp}/fast onerr=fail",
            "auth [success=ok default=die] pam_listfile.so item=user sense=allow file={tmp}/slow onerr=fail",
            "auth [success=ok new_authtok_reqd=ok ignore=ignore default=bad] pam_unix.so nodelay",
            "auth [success=done default=ignore] pam_listfile.so item=user sense=allow file={tmp}/express onerr=fail",
            "auth [success=1 default=bad] pam_listfile.so item=user sense=deny file={tmp}/late onerr=fail",
            "auth requisite pam_deny.so",
            "auth required pam_permit.so",
            "@include common-account",
        ],
        accounts=users("e2efast", "e2eslow", "e2enone", "e2eexpr", "e2elate"),
        files={
            "{tmp}/fast": ["e2efast"],
            "{tmp}/slow": ["e2eslow", "e2eexpr", "e2elate"],
            "{tmp}/express": ["e2eexpr"],
            "{tmp}/late": ["e2eexpr", "e2elate"],
        },
        users={
            "e2efast": OK,  # jumps over the "die" line
            "e2eslow": OK,
            "e2enone": refused(PAM_NO),  # dies on the second line
            "e2eexpr": OK,  # "done" before the line that would refuse it
            "e2elate": refused(PAM_NO),
            ANONYMOUS: refused(PAM_NO),
        },
    ),
    Scenario(
        "pam-include",
        LOCAL_ONLY,
        pam=["@include e2e-gate"] + COMMON,
        accounts=users("e2ealice", "e2ebob", "e2ecarol"),
        files={
            "/etc/pam.d/e2e-gate": [
                "auth required pam_listfile.so item=user sense=deny file={tmp}/gate onerr=succeed",
                "@include e2e-gate2",
            ],
            "/etc/pam.d/e2e-gate2": [
                "account required pam_listfile.so item=user sense=deny file={tmp}/gate2 onerr=succeed"
            ],
            "{tmp}/gate": ["e2ebob"],
            "{tmp}/gate2": ["e2ecarol"],
        },
        users={"e2ealice": OK, "e2ebob": refused(PAM_NO), "e2ecarol": refused(PAM_NO), ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "pam-nologin-present",
        BOTH_ON,
        pam=["account required pam_nologin.so"] + DEBIAN_PAM,
        accounts=users("e2ealice"),
        files={"/etc/nologin": ["The system is going down for maintenance."]},
        users={"e2ealice": refused(PAM_NO), ANONYMOUS: OK},
    ),
    Scenario(
        "pam-nologin-absent",
        BOTH_ON,
        pam=["auth requisite pam_nologin.so file={tmp}/no-such-nologin", "account required pam_nologin.so"]
        + DEBIAN_PAM,
        accounts=users("e2ealice"),
        users={"e2ealice": OK, ANONYMOUS: OK},
    ),
    Scenario(
        "pam-nologin-file",
        LOCAL_ONLY,
        pam=["auth requisite pam_nologin.so file={tmp}/ftp-closed"] + DEBIAN_PAM,
        accounts=users("e2ealice"),
        files={"{tmp}/ftp-closed": ["FTP is closed today."]},
        users={"e2ealice": refused(PAM_NO), ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "pam-permit-account",
        LOCAL_ONLY,
        # The account stack does not run pam_unix: expiry does not matter.
        pam=["auth required pam_unix.so nodelay", "auth required pam_permit.so", "account required pam_permit.so"],
        accounts=[Account("e2ealice"), Account("e2eexpir", expired=True), Account("e2elock", shadow="*")],
        users={"e2ealice": OK, "e2eexpir": OK, "e2elock": refused(PAM_NO), ANONYMOUS: refused(PAM_NO)},
    ),
    # --- modules the forecast does not model -----------------------------------
    Scenario(
        "pam-unmodelled-module",
        LOCAL_ONLY,
        pam=[
            "auth requisite pam_listfile.so item=user sense=deny file={tmp}/blocked onerr=succeed",
            "auth [success=1 default=ignore] pam_listfile.so item=user sense=allow file={tmp}/plain onerr=fail",
            "auth required pam_succeed_if.so quiet user ingroup e2eftp",
        ]
        + COMMON,
        accounts=[
            Account("e2eblock", groups=("e2eftp",)),
            Account("e2eplain"),
            Account("e2emember", groups=("e2eftp",)),
            Account("e2eoutside"),
        ],
        files={"{tmp}/blocked": ["e2eblock"], "{tmp}/plain": ["e2eplain"]},
        users={
            "e2eblock": refused(PAM_NO),  # refused before the module runs
            "e2eplain": OK,  # jumps over it
            "e2emember": Login(ALLOWED, unknown="pam_succeed_if decides"),
            "e2eoutside": refused(PAM_NO, unknown="pam_succeed_if decides"),
            ANONYMOUS: refused(PAM_NO),
        },
    ),
    Scenario(
        "pam-unmodelled-after-sufficient",
        LOCAL_ONLY,
        pam=[
            "auth sufficient pam_unix.so nodelay",
            "auth required pam_succeed_if.so quiet user ingroup e2eftp",
            "auth required pam_deny.so",
            "@include common-account",
        ],
        accounts=users("e2ealice"),
        users={"e2ealice": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "pam-unmodelled-after-failure",
        LOCAL_ONLY,
        # A required failure cannot be undone by what follows.
        pam=["auth required pam_deny.so", "auth required pam_succeed_if.so quiet user ingroup e2eftp"] + COMMON,
        accounts=[Account("e2ealice", groups=("e2eftp",))],
        users={"e2ealice": refused(PAM_NO), ANONYMOUS: refused(PAM_NO)},
    ),
    # --- virtual users ----------------------------------------------------------------
    Scenario(
        "virtual-users",
        # Every non-anonymous login becomes the guest, local ones too: carol's
        # missing home is never entered. Anonymous logins skip pam_userdb.
        GUEST_ON + ["anonymous_enable=YES"],
        pam=userdb_pam("{tmp}/vusers"),
        accounts=[GUEST, Account("e2ealice"), Account("e2ecarol", home="missing")],
        dbs={VDB: VUSERS},
        users={"e2evera": OK, "e2evlad": OK, "e2ealice": OK, "e2ecarol": OK, ANONYMOUS: OK},
    ),
    Scenario(
        "virtual-db-suffix",
        # pam_userdb appends ".db": db={tmp}/vusers.db opens vusers.db.db,
        # which holds vera only.
        GUEST_ON + ["anonymous_enable=NO"],
        pam=userdb_pam("{tmp}/vusers.db"),
        accounts=[GUEST, Account("e2ealice")],
        dbs={VDB: VUSERS, "{tmp}/vusers.db.db": {"e2evera": VUSERS["e2evera"]}},
        users={"e2evera": OK, "e2evlad": refused(PAM_NO), "e2ealice": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "virtual-no-account-line",
        # pam_unix's account stage does not know virtual users.
        GUEST_ON + ["anonymous_enable=NO"],
        pam=["auth sufficient pam_userdb.so db={tmp}/vusers"] + COMMON,
        accounts=[GUEST, Account("e2ealice")],
        dbs={VDB: VUSERS},
        users={"e2evera": refused(PAM_NO), "e2evlad": refused(PAM_NO), "e2ealice": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "virtual-local-disabled",
        ["anonymous_enable=YES", "local_enable=NO", "guest_enable=YES", "guest_username=e2eguest"],
        pam=userdb_pam("{tmp}/vusers"),
        accounts=[GUEST],
        dbs={VDB: VUSERS},
        users={"e2evera": refused(LOCAL_OFF), "e2evlad": refused(LOCAL_OFF), ANONYMOUS: OK},
    ),
    Scenario(
        "virtual-without-guest",
        # Without guest_enable a virtual user is a login without an account.
        LOCAL_ONLY,
        pam=userdb_pam("{tmp}/vusers"),
        accounts=[GUEST, Account("e2ealice")],
        dbs={VDB: VUSERS},
        users={"e2evera": refused("500 OOPS"), "e2ealice": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "guest-username-missing",
        ["anonymous_enable=YES", "local_enable=YES", "guest_enable=YES", "guest_username=e2enoguest"],
        pam=userdb_pam("{tmp}/vusers"),
        accounts=[Account("e2ealice")],
        dbs={VDB: VUSERS},
        users={
            "e2evera": refused("guest_username"),
            "e2ealice": refused("guest_username"),
            ANONYMOUS: refused("guest_username"),
        },
        fails="connect",
    ),
    Scenario(
        "virtual-guest-home-writable",
        # Guests are chrooted into the guest's home; a per-user file may
        # allow a writable one.
        GUEST_ON + ["anonymous_enable=NO", "user_config_dir={tmp}/users.d"],
        pam=userdb_pam("{tmp}/vusers"),
        accounts=[dataclasses.replace(GUEST, home="dir")],
        dbs={VDB: VUSERS},
        files={"{tmp}/users.d/e2evera": ["allow_writeable_chroot=YES"]},
        users={"e2evera": OK, "e2evlad": refused(WRITABLE), ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "virtual-local-privs",
        # With virtual_use_local_privs guests are local users: no chroot
        # unless chroot_local_user.
        GUEST_ON + ["anonymous_enable=NO", "virtual_use_local_privs=YES"],
        pam=userdb_pam("{tmp}/vusers"),
        accounts=[dataclasses.replace(GUEST, home="dir")],
        dbs={VDB: VUSERS},
        users={"e2evera": OK, "e2evlad": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "virtual-local-privs-chroot",
        GUEST_ON + ["anonymous_enable=NO", "virtual_use_local_privs=YES", "chroot_local_user=YES"],
        pam=userdb_pam("{tmp}/vusers"),
        accounts=[dataclasses.replace(GUEST, home="dir")],
        dbs={VDB: VUSERS},
        users={"e2evera": refused(WRITABLE), "e2evlad": refused(WRITABLE), ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "virtual-guest-home-missing",
        GUEST_ON + ["anonymous_enable=NO"],
        pam=userdb_pam("{tmp}/vusers"),
        accounts=[dataclasses.replace(GUEST, home="missing"), Account("e2ealice")],
        dbs={VDB: VUSERS},
        users={"e2evera": refused(NO_DIR), "e2ealice": refused(NO_DIR), ANONYMOUS: refused(PAM_NO)},
    ),
    # --- local users' homes, roots and chroot ------------------------------------------
    Scenario(
        "homes-without-chroot",
        LOCAL_ONLY,
        accounts=[
            Account("e2ealice"),
            Account("e2ecarol", home="missing"),
            Account("e2edave", home="closed"),
            Account("e2eerin", home="world"),
        ],
        users={
            "e2ealice": OK,
            "e2ecarol": refused(NO_DIR),
            "e2edave": refused(NO_DIR),
            "e2eerin": OK,  # writable, but no chroot
            ANONYMOUS: refused(PAM_NO),
        },
    ),
    Scenario(
        "chroot-local-user",
        LOCAL_ONLY + ["chroot_local_user=YES"],
        accounts=[
            Account("e2ealice", home="readonly"),
            Account("e2ebob", home="dir"),
            Account("e2ecarol", home="root"),
            Account("e2edave", home="root-group"),
            Account("e2eerin", home="world"),
            Account("e2efrank", home="closed"),
        ],
        users={
            "e2ealice": OK,
            "e2ebob": refused(WRITABLE),
            "e2ecarol": OK,
            "e2edave": refused(WRITABLE),  # group-writable, its own group
            "e2eerin": refused(WRITABLE),
            "e2efrank": refused(NO_DIR),
            ANONYMOUS: refused(PAM_NO),
        },
    ),
    Scenario(
        "chroot-writable-allowed",
        LOCAL_ONLY + ["chroot_local_user=YES", "allow_writeable_chroot=YES"],
        accounts=[Account("e2ebob", home="dir"), Account("e2ecarol", home="missing")],
        users={"e2ebob": OK, "e2ecarol": refused(NO_DIR), ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "chroot-per-user-file",
        LOCAL_ONLY + ["chroot_local_user=YES", "user_config_dir={tmp}/users.d"],
        accounts=[Account("e2ebob", home="dir"), Account("e2ecarol", home="dir")],
        files={"{tmp}/users.d/e2ebob": ["allow_writeable_chroot=YES"]},
        users={"e2ebob": OK, "e2ecarol": refused(WRITABLE), ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "chroot-list",
        # Without chroot_local_user the list names the users to jail.
        LOCAL_ONLY + ["chroot_list_enable=YES", "chroot_list_file={tmp}/chroot_list"],
        accounts=[Account("e2ealice", home="dir"), Account("e2ebob", home="dir"), Account("e2ecarol", home="readonly")],
        files={"{tmp}/chroot_list": ["e2ebob", "e2ecarol"]},
        users={"e2ealice": OK, "e2ebob": refused(WRITABLE), "e2ecarol": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "chroot-list-exceptions",
        # With chroot_local_user the list names the users left unjailed.
        LOCAL_ONLY
        + ["chroot_local_user=YES", "chroot_list_enable=YES", "chroot_list_file={tmp}/chroot_list"],
        accounts=[Account("e2ebob", home="dir"), Account("e2ecarol", home="dir")],
        files={"{tmp}/chroot_list": ["e2ebob"]},
        users={"e2ebob": OK, "e2ecarol": refused(WRITABLE), ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "chroot-list-missing",
        BOTH_ON + ["chroot_list_enable=YES", "chroot_list_file={tmp}/no-such-list"],
        accounts=[Account("e2ealice", home="readonly")],
        users={"e2ealice": refused("chroot() list file"), ANONYMOUS: OK},
    ),
    Scenario(
        "local-root-missing",
        # Without a chroot a missing local_root is passed over: the session
        # starts in the home.
        LOCAL_ONLY + ["local_root={tmp}/no-such-root"],
        accounts=users("e2ealice"),
        users={"e2ealice": OK, ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "local-root-missing-chroot",
        # As the root of a chroot it must exist.
        LOCAL_ONLY + ["local_root={tmp}/no-such-root", "chroot_local_user=YES"],
        accounts=[Account("e2ealice", home="readonly")],
        users={"e2ealice": refused(NO_DIR), ANONYMOUS: refused(PAM_NO)},
    ),
    Scenario(
        "local-root-chroot",
        # The jail is local_root, not the (writable) home; a per-user
        # local_root may point at a writable directory.
        LOCAL_ONLY + ["chroot_local_user=YES", "local_root={tmp}/ftproot", "user_config_dir={tmp}/users.d"],
        accounts=[Account("e2ebob", home="dir"), Account("e2ecarol", home="dir")],
        dirs=("{tmp}/ftproot",),
        files={"{tmp}/users.d/e2ecarol": ["local_root={tmp}/home/e2ecarol"]},
        users={"e2ebob": OK, "e2ecarol": refused(WRITABLE), ANONYMOUS: refused(PAM_NO)},
    ),
    # --- the anonymous root -------------------------------------------------------------
    Scenario(
        "anonymous-root-writable",
        ["anonymous_enable=YES", "local_enable=NO"],
        accounts=[dataclasses.replace(ANON, home="dir")],
        users={ANONYMOUS: refused("writable")},
    ),
    Scenario(
        "anonymous-root-writable-allowed",
        ["anonymous_enable=YES", "local_enable=NO", "allow_writeable_chroot=YES"],
        accounts=[dataclasses.replace(ANON, home="dir")],
        # allow_writeable_chroot does not cover anonymous sessions.
        users={ANONYMOUS: refused(WRITABLE)},
    ),
    Scenario(
        "anonymous-root-closed",
        # Root enters the anonymous root before the session becomes the
        # anonymous account.
        ["anonymous_enable=YES", "local_enable=NO"],
        accounts=[dataclasses.replace(ANON, home="closed")],
        # The login succeeds (230, PWD answers); listing will not.
        users={ANONYMOUS: Login(ALLOWED)},
    ),
    Scenario(
        "anonymous-root-from-ftp-username",
        # No anon_root: the home of ftp_username, not that of guest_username.
        ["anonymous_enable=YES", "local_enable=YES", "guest_username=e2eguest"],
        omit=("anon_root",),
        accounts=[dataclasses.replace(GUEST, home="missing")],
        users={ANONYMOUS: OK},
    ),
    Scenario(
        "anonymous-home-missing",
        ["anonymous_enable=YES", "local_enable=YES"],
        omit=("anon_root",),
        accounts=[dataclasses.replace(ANON, home="missing", home_path="{tmp}/anon-home"), Account("e2ealice")],
        users={ANONYMOUS: refused(NO_DIR), "e2ealice": OK},
    ),
    Scenario(
        "anonymous-root-missing",
        ["anonymous_enable=YES", "local_enable=YES", "anon_root={tmp}/no-such-anon"],
        omit=("anon_root",),
        accounts=[Account("e2ealice")],
        users={ANONYMOUS: refused(NO_DIR), "e2ealice": OK},
    ),
]


# The private /etc: these scenarios also write the list of shells, the
# "other" and "ftp" PAM services and /etc/nologin, which must come back.
class EtcSnapshot(harness.EtcSnapshot):
    SAVED = harness.EtcSnapshot.SAVED + [
        "/etc/shells",
        "/etc/nologin",
        "/etc/pam.d/other",
        "/etc/pam.d/ftp",
    ]


def set_shadow_fields(changes: Dict[str, Dict[int, str]]) -> None:
    if not changes:
        return
    with open("/etc/shadow", encoding="utf-8") as source:
        lines = source.read().splitlines(keepends=True)
    seen = set()
    for index, line in enumerate(lines):
        fields = line.rstrip("\n").split(":")
        if fields[0] in changes:
            for number, value in changes[fields[0]].items():
                fields[number] = value
            lines[index] = ":".join(fields) + "\n"
            seen.add(fields[0])
    if seen != set(changes):
        raise SetupError(f"no /etc/shadow line for {sorted(set(changes) - seen)}")
    with open("/etc/shadow", "w", encoding="utf-8") as target:
        target.writelines(lines)


# The report ---------------------------------------------------------------------


def run_report(report: str, tmp: str, *form: str) -> Tuple[Optional[str], str]:
    """What the program printed, or None and what it said when it failed."""
    done = harness.run_report(report, tmp, *form)
    if done.returncode != 0:
        return None, f"exit status {done.returncode}: {(done.stdout + done.stderr).strip()}"
    return done.stdout, ""


def parse_json(text: str) -> dict:
    try:
        document = json.loads(text)
    except ValueError as error:
        raise SetupError(f"ftpconfig-report printed no JSON: {error}") from error
    if not isinstance(document, dict):
        raise SetupError("ftpconfig-report's JSON is not an object")
    return document


def table_column(text: str, column: str) -> Dict[str, str]:
    """user -> the value of one column of the text table, cut at the
    offsets of the header line (names hold blanks: "Anonymous users").
    The server's findings come in front of the table."""
    lines = text.splitlines()
    heads = [i for i, line in enumerate(lines) if line.startswith("USER ")]
    if not heads:
        return {}
    lines = lines[heads[0] :]
    header = lines[0]
    starts = [i for i, c in enumerate(header) if c != " " and (i == 0 or header[i - 1] == " ")]
    titles = [header[a:b].strip() for a, b in zip(starts, starts[1:] + [len(header)])]
    if column not in titles:
        return {}
    index = titles.index(column)
    end = starts[index + 1] if index + 1 < len(starts) else None
    return {line[: starts[1]].strip(): line[starts[index] : end].strip() for line in lines[1:]}


def finding_problems(findings, where: str) -> List[str]:
    """The shape every finding must have."""
    if not isinstance(findings, list):
        return [f"{where}: findings is not a list"]
    problems = []
    for finding in findings:
        if not isinstance(finding, dict):
            problems.append(f"{where}: a finding is not an object: {finding!r}")
            continue
        if finding.get("severity") not in SEVERITIES:
            problems.append(f"{where}: finding with severity {finding.get('severity')!r}")
        if not isinstance(finding.get("message"), str) or not finding.get("message"):
            problems.append(f"{where}: finding without a message: {finding!r}")
        if not isinstance(finding.get("file"), str) or not isinstance(finding.get("line"), int):
            problems.append(f"{where}: finding without a file and a line number: {finding!r}")
    return problems


def describe(findings) -> str:
    if not isinstance(findings, list):
        return ""
    return "; ".join(
        f"{f.get('severity')} {f.get('file')}:{f.get('line')} {f.get('message')}"
        for f in findings
        if isinstance(f, dict)
    )


def conf_line_number(scenario: Scenario, tmp: str, port: int) -> int:
    text = harness.conf_text(scenario, tmp, port).split("\n")
    wanted = harness.fill(scenario.blame, tmp, port)
    numbers = [index + 1 for index, line in enumerate(text) if line == wanted]
    if len(numbers) != 1:
        raise SetupError(f"the blamed line {scenario.blame!r} is not in the configuration exactly once")
    return numbers[0]


# One scenario ---------------------------------------------------------------------


def log_in_everybody(scenario: Scenario, port: int) -> Tuple[Dict[str, Tuple[str, str]], List[str]]:
    """Each user's login with the right password, and what went wrong with
    the wrong ones."""
    results: Dict[str, Tuple[str, str]] = {}
    problems: List[str] = []
    for user, login in scenario.users.items():
        name, password = harness.credentials(scenario, user)
        results[user] = harness.try_login(port, name, password, greeting_may_refuse=True)
        if results[user][0] != ALLOWED or user == ANONYMOUS:
            continue
        # A server that admits anybody would agree with anything.
        wrong, reply = harness.try_login(port, name, password + "x", greeting_may_refuse=True)
        if login.any_password and wrong != ALLOWED:
            problems.append(f"{user}: the server refused a password that nullok should let through")
        if not login.any_password and wrong != DENIED:
            problems.append(f"{user}: the server accepted a wrong password ({reply.strip()})")
    return results, problems


def check_server_side(scenario: Scenario, started: bool, log: str, results: Dict[str, Tuple[str, str]]) -> List[str]:
    """Is the scenario what it claims to be?"""
    problems = []
    if scenario.fails == "start" and started:
        problems.append("the server started, but the scenario says it does not")
    if scenario.fails != "start" and not started:
        problems.append(f"the server did not start: {log}")
    if scenario.fails == "connect":
        for user, (result, reply) in results.items():
            if result != DENIED or "OOPS" not in reply:
                problems.append(f"{user}: the connection did not fail ({reply.strip()})")
    return problems


def check_server_forecast(scenario: Scenario, document: dict, blamed_line: int) -> Tuple[List[str], list, int]:
    """(problems, the server's findings, known faults seen) of "server"."""
    problems: List[str] = []
    server = document.get("server")
    if not isinstance(server, dict) or not isinstance(server.get("fails"), bool):
        return [f'the report has no "server" object with a boolean "fails": {server!r}'], [], 0
    findings = server.get("findings")
    problems += finding_problems(findings, "server")
    findings = [f for f in findings if isinstance(f, dict)] if isinstance(findings, list) else []
    fails = server["fails"]
    bugs = 0
    outcome = "ok"
    if scenario.server_bug:
        if fails == bool(scenario.fails):
            problems.append(f"forecast-bug {scenario.server_bug} no longer happens: remove the mark")
        else:
            outcome = f"FORECAST-BUG {scenario.server_bug} (expected failure)"
            bugs += 1
    elif fails != bool(scenario.fails):
        problems.append(f"server.fails is {fails}, but the server " + ("fails" if scenario.fails else "works"))
    if scenario.fails and not any(f.get("severity") == "error" for f in findings):
        problems.append("the server fails, but server.findings holds no error")
    if blamed_line and not any(
        f.get("severity") == "error" and f.get("file") == CONF and f.get("line") == blamed_line for f in findings
    ):
        problems.append(f"no error finding names {CONF}:{blamed_line} ({scenario.blame!r})")
    if problems:
        outcome = "FAIL"
    detail = f" [{describe(findings)}]" if findings else ""
    actual = "fails" if scenario.fails else "works"
    print(f"{scenario.name:36} {'(server)':10} actual={actual:8} fails={fails!s:8} {outcome}{detail}")
    return problems, findings, bugs


def check_user(
    scenario: Scenario,
    user: str,
    login: Login,
    row: Optional[dict],
    result: Tuple[str, str],
    server_findings: list,
) -> Tuple[bool, int]:
    """(passed, known faults seen) for one user's forecast."""
    actual, reply = result
    notes: List[str] = []
    status = "missing"
    findings: list = []
    forecast = row.get("forecast") if row else None
    if not isinstance(forecast, dict):
        notes.append("no forecast in the report" if row else "no row in the report")
    else:
        status = forecast.get("status")
        findings = forecast.get("findings", [])
        notes += finding_problems(findings, "findings")
        if status not in (ALLOWED, DENIED, UNKNOWN):
            notes.append(f"forecast status {status!r}")
        if status == DENIED and not findings and not server_findings:
            notes.append("a denied forecast without any finding")
    if actual != login.server:
        notes.append(f"the server was expected to say {login.server}")
    elif actual == DENIED and login.reply not in reply:
        notes.append(f"the server refused for another reason than {login.reply!r}")
    bugs = 0
    outcome = "ok"
    if not notes:
        if login.bug:
            if status == actual:
                notes.append(f"forecast-bug {login.bug} no longer happens: remove the mark")
            else:
                outcome = f"FORECAST-BUG {login.bug} (expected failure)"
                bugs = 1
        elif status == UNKNOWN and login.unknown:
            outcome = f"ok, cannot judge: {login.unknown}"
        elif status != actual:
            notes.append(f"the forecast says {status}, the server {actual}")
    if notes:
        outcome = "FAIL: " + "; ".join(notes)
    detail = f" [server: {reply.strip()}]" if actual == DENIED else ""
    if findings and isinstance(findings, list):
        detail += f" [forecast: {describe(findings)}]"
    print(f"{scenario.name:36} {user:10} server={actual:8} forecast={status!s:8} {outcome}{detail}")
    return not notes, bugs


def check_table_form(scenario: Scenario, rows: Dict[str, dict], table: str) -> List[str]:
    """The text table shows each user's forecast as the JSON does."""
    shown = table_column(table, TABLE_COLUMN)
    if not shown:
        return [f"the text table has no {TABLE_COLUMN} column"]
    problems = []
    for user in scenario.users:
        name = ANONYMOUS_ROW if user == ANONYMOUS else user
        forecast = (rows.get(name) or {}).get("forecast")
        status = forecast.get("status") if isinstance(forecast, dict) else None
        if shown.get(name) != status:
            problems.append(f"{user}: the table shows {shown.get(name)!r}, the JSON forecast {status!r}")
    return problems


def run_scenario(scenario: Scenario, report: str, tmp: str) -> Tuple[bool, int]:
    """(passed, logins with a known forecast fault)."""
    etc = EtcSnapshot()
    port = harness.free_port()
    server = harness.Vsftpd(port, os.path.join(tmp, "vsftpd.log"), may_fail=True)
    problems: List[str] = []
    try:
        harness.prepare(scenario, tmp, port, etc)
        set_shadow_fields(scenario.shadow)
        try:
            started = server.start()
            if started:
                results, problems = log_in_everybody(scenario, port)
            else:
                why = f"vsftpd did not start: {server.log()}"
                results = {user: (DENIED, why) for user in scenario.users}
        finally:
            server.stop()
        log = server.log()
        output, failure = run_report(report, tmp, "--json")
        document = parse_json(output) if output is not None else None
        table = run_report(report, tmp)[0] if output is not None else None
    except (SetupError, OSError) as error:
        print(f"{scenario.name}: ERROR {error}")
        return False, 0
    finally:
        server.stop()
        etc.restore()

    problems += check_server_side(scenario, started, log, results)
    passed = True
    bugs = 0
    if scenario.report_refuses:
        if document is not None or scenario.report_refuses not in failure:
            problems.append(f"the report was expected to end with {scenario.report_refuses!r}: {failure or 'it ran'}")
        for user, login in scenario.users.items():
            actual, reply = results[user]
            fine = actual == login.server and (actual == ALLOWED or login.reply in reply)
            passed = passed and fine
            print(
                f"{scenario.name:36} {user:10} server={actual:8} forecast=none     "
                + ("ok, the program ends first" if fine else f"FAIL: the server was expected to say {login.server}")
                + (f" [server: {reply.strip()}]" if actual == DENIED else "")
            )
    elif document is None:
        problems.append(f"ftpconfig-report failed: {failure}")
    else:
        blamed = conf_line_number(scenario, tmp, port) if scenario.blame else 0
        more, server_findings, bugs = check_server_forecast(scenario, document, blamed)
        problems += more
        rows = {row.get("name"): row for row in document.get("users", []) if isinstance(row, dict)}
        problems += check_table_form(scenario, rows, table or "")
        for user, login in scenario.users.items():
            row = rows.get(ANONYMOUS_ROW if user == ANONYMOUS else user)
            fine, seen = check_user(scenario, user, login, row, results[user], server_findings)
            passed = passed and fine
            bugs += seen
    for problem in problems:
        print(f"{scenario.name}: FAIL {problem}")
    return passed and not problems, bugs


def check_table() -> None:
    harness.check_names_and_keys(SCENARIOS)
    for scenario in SCENARIOS:
        if scenario.fails not in ("", "start", "connect"):
            raise SystemExit(f"scenario {scenario.name}: unknown kind of failure {scenario.fails!r}")
        if scenario.blame and scenario.blame not in scenario.conf:
            raise SystemExit(f"scenario {scenario.name}: the blamed line is not one of its lines")
        for user, login in scenario.users.items():
            where = f"scenario {scenario.name}, user {user}"
            if login.server not in (ALLOWED, DENIED):
                raise SystemExit(f"{where}: the server says {ALLOWED} or {DENIED}")
            if login.server == DENIED and not login.reply:
                raise SystemExit(f"{where}: a refusal must name the server's answer")
            if scenario.fails and login.server != DENIED:
                raise SystemExit(f"{where}: nobody logs in to a failing server")
            if login.unknown and login.bug:
                raise SystemExit(f"{where}: either the forecast cannot judge or it is wrong")
        if scenario.server_bug and scenario.blame:
            raise SystemExit(f"scenario {scenario.name}: a blamed line belongs to a server that fails")


def main() -> int:
    bugs = 0

    def run_one(scenario: Scenario, report: str, tmp: str) -> bool:
        nonlocal bugs
        ok, seen = run_scenario(scenario, report, tmp)
        bugs += seen
        return ok

    return harness.main(
        script="forecast.py",
        doc=__doc__,
        option="--report",
        program_help="the ftpconfig-report program",
        tools=(harness.VSFTPD, harness.DB_LOAD, harness.CHPASSWD),
        table=SCENARIOS,
        check_table=check_table,
        prefix="ftpconfig-e2e-",
        run_one=run_one,
        summary=lambda: f"; {bugs} logins with a known forecast bug (FORECAST-BUG)",
    )


if __name__ == "__main__":
    sys.exit(main())

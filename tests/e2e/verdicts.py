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

import dataclasses
import json
import os
import sys
from typing import Dict, List, Tuple

# Run from the source tree: no compiled copy of the harness left beside it.
sys.dont_write_bytecode = True
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
import harness  # noqa: E402  (the shared harness lives next to this file)
from harness import (  # noqa: E402
    ALLOWED,
    ANON_ACCOUNT,
    ANONYMOUS,
    ANONYMOUS_ROW,
    DEBIAN_PAM,
    DENIED,
    GUEST_ACCOUNT,
    VDB,
    VUSERS,
    Account,
    SetupError,
    debian_pam,
    userdb_pam,
)


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
class Scenario(harness.Setup):
    # user -> what both must say. Local users are accounts, virtual ones
    # keys of a database, ANONYMOUS the row "Anonymous users".
    users: Dict[str, Expect]


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


# The report ----------------------------------------------------------------


def run_report(report: str, tmp: str) -> Dict[str, dict]:
    done = harness.run_report(report, tmp, "--json")
    if done.returncode != 0:
        raise SetupError(f"ftpconfig-report exited with {done.returncode}: {done.stderr.strip()}")
    try:
        document = json.loads(done.stdout)
        rows = {row["name"]: row for row in document["users"]}
    except (ValueError, KeyError, TypeError) as error:
        raise SetupError(f"ftpconfig-report printed no usable JSON: {error}") from error
    return rows


# One scenario ----------------------------------------------------------------


def expected_kind(scenario: Scenario, user: str) -> str:
    if user == ANONYMOUS:
        return "anonymous"
    if any(user in users for users in scenario.dbs.values()):
        return "virtual"
    return "local"


def run_scenario(scenario: Scenario, report: str, tmp: str) -> bool:
    etc = harness.EtcSnapshot()
    port = harness.free_port()
    server = harness.Vsftpd(port, os.path.join(tmp, "vsftpd.log"))
    results: Dict[str, Tuple[str, str]] = {}
    problems: List[str] = []
    try:
        harness.prepare(scenario, tmp, port, etc)
        server.start()
        try:
            for user in scenario.users:
                name, password = harness.credentials(scenario, user)
                results[user] = harness.try_login(port, name, password)
                # A server that admits anybody would agree with anything.
                if results[user][0] == ALLOWED and user != ANONYMOUS:
                    wrong, reply = harness.try_login(port, name, password + "x")
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
    harness.check_names_and_keys(SCENARIOS)
    for scenario in SCENARIOS:
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
    return harness.main(
        script="verdicts.py",
        doc=__doc__,
        option="--report",
        program_help="the ftpconfig-report program",
        tools=(harness.VSFTPD, harness.DB_LOAD, harness.CHPASSWD),
        table=SCENARIOS,
        check_table=check_table,
        prefix="ftpconfig-e2e-",
        run_one=run_scenario,
    )


if __name__ == "__main__":
    sys.exit(main())

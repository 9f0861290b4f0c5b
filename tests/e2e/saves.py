#!/usr/bin/env python3
"""End-to-end check that what the program saves changes what vsftpd does.

Every scenario of saves.toml writes a vsftpd.conf, a PAM file, accounts and
lists, starts vsftpd on 127.0.0.1 and proves the starting point (a user
refused, an upload refused, ...). Then editchild applies ONE edit through the
engine and saves, exactly as the program would: grant a user (every refusal
the engine can cure is cured), deny a user, set a user's rights or root. A
scenario with through = "window" has windowedit (--window) make its edit
instead, through the main window itself: the virtual user dialog behind Add,
Edit and Delete user, the status cell's editor, the options dialog (one
setting or more on each of its pages, by widget name), then the Save action. The
server is started again and must now do what the edit promised: the user
logs in (and a wrong password still fails), the upload lands in the user's
directory, the login fails, the listing shows (or hides) a name, the
greeting says the banner. With `forecast`, ftpconfig-report (--report) is
asked about the saved files too, and its forecast for those users must be
what the server did. Every file and directory under /etc and under the
scenario's own directory is compared before and after the edit: only the
ones the scenario names may change, and each of those must.

Where the engine is known to miss its promise, the scenario names the checks
that fail and why ("known engine fault"): the suite passes while those fail
exactly, and fails once they pass, so that the mark goes with the fault.

It shares harness.py with verdicts.py and forecast.py and, like them, runs
only inside scripts/with-private-etc.sh: it writes to /etc.
"""

import argparse
import ftplib
import io
import json
import os
import pwd
import socket
import stat
import subprocess
import sys
from typing import Dict, List, Optional, Tuple

# Run from the source tree: no compiled copy of the harness left beside it.
sys.dont_write_bytecode = True
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
import harness  # noqa: E402  (the shared harness lives next to this file)
from harness import ALLOWED, DENIED, Scenario, SetupError  # noqa: E402

# Seconds: one edit (the engine opens a Berkeley DB environment).
EDIT_TIMEOUT = 60

# What an upload attempt came to.
STORED = "stored"
REFUSED = "refused"
NO_LOGIN = "no-login"

UPLOAD_NAME = "e2e-upload.txt"
UPLOAD_DATA = b"uploaded through the saved rights\n"

EDITS = ("grant", "deny", "rights", "directory", "vadd", "vchange", "vdelete", "options", "set")
# What windowedit does through the window; who makes a scenario's edit.
WINDOW_EDITS = ("grant", "deny", "vadd", "vchange", "vdelete", "options")
ENGINE_EDITS = ("grant", "deny", "rights", "directory", "vadd", "vchange", "vdelete")
# ftpconfig-ctl (--ctl), with --yes, and the command each edit becomes.
CTL_COMMANDS = {"grant": ["allow"], "deny": ["deny"], "vadd": ["vuser", "add"], "set": ["set"]}
THROUGH = ("engine", "window", "ctl")
BACKUP = ".ftpconfig-bak"
CHANGES = {harness.CONTENT, harness.MODE, harness.CREATED, harness.REMOVED}


def run_edit(program: str, edit: List[str], run_dir: str, refused: str = "") -> Tuple[bool, str]:
    """editchild or windowedit on the system root. The engine opens its
    Berkeley DB environment in /var/lib/ftpconfig (creating it) on every
    load: a mount namespace of the child's own puts an empty directory over
    /var/lib, so that nothing of it reaches the machine. HOME keeps the
    settings it may store in the run's directory."""
    var_lib = os.path.join(run_dir, "var-lib")
    home = os.path.join(run_dir, "edit-home")
    os.makedirs(var_lib, 0o755, exist_ok=True)
    os.makedirs(home, 0o700, exist_ok=True)
    env = dict(os.environ, HOME=home, XDG_CONFIG_HOME=os.path.join(home, ".config"))
    mount = 'mount --bind "$0" /var/lib && exec "$@"'
    # ftpconfig-ctl takes the password of a new virtual user on its
    # standard input only.
    stdin = ""
    if program == CTL:
        stdin = edit[2] + "\n" if edit[0] == "vadd" else ""
        edit = ["--yes", *CTL_COMMANDS[edit[0]], *edit[1 : 2 if edit[0] == "vadd" else None]]
    command = ["unshare", "-m", "--propagation", "private", "sh", "-c", mount, var_lib, program, "--root", "/", *edit]
    try:
        done = subprocess.run(command, input=stdin, capture_output=True, text=True, timeout=EDIT_TIMEOUT, env=env)
    except (OSError, subprocess.TimeoutExpired) as error:
        return False, f"{os.path.basename(program)}: {error}"
    output = (done.stdout.strip() + "\n" + done.stderr.strip()).strip()
    if refused:
        return done.returncode == 1 and refused in done.stderr, f"exit {done.returncode}: {output}"
    if program == CTL:
        return done.returncode == 0, f"exit {done.returncode}: {output}"
    return done.returncode == 0 and done.stdout.strip() == "done saved", f"exit {done.returncode}: {output}"


# Sessions ------------------------------------------------------------------


def in_session(port: int, user: str, work) -> Tuple[Optional[object], str]:
    """work(ftp) in a logged-in session of the user, or None and the
    server's refusal."""
    ftp, reply = harness.log_in(port, user, harness.password_of(user))
    if ftp is None:
        return None, f"login refused: {reply}"
    try:
        return work(ftp), ""
    except ftplib.error_perm as error:
        return error, str(error)
    except (ftplib.Error, EOFError, OSError) as error:
        raise SetupError(f"session of {user}: {error!r}") from error
    finally:
        harness.close(ftp)


def upload(ftp: ftplib.FTP) -> bytes:
    """STOR, then what RETR gives back (nothing, when it is refused)."""
    ftp.storbinary(f"STOR {UPLOAD_NAME}", io.BytesIO(UPLOAD_DATA))
    back = io.BytesIO()
    try:
        ftp.retrbinary(f"RETR {UPLOAD_NAME}", back.write)
    except ftplib.error_perm:
        pass
    return back.getvalue()


def welcome(port: int) -> str:
    """The 220 line a client is greeted with."""
    ftp = ftplib.FTP(timeout=harness.FTP_TIMEOUT)
    try:
        return ftp.connect("127.0.0.1", port, timeout=harness.FTP_TIMEOUT)
    except (OSError, EOFError, ftplib.Error) as error:
        return f"no greeting: {error!r}"
    finally:
        ftp.close()


def greeting(port: int) -> str:
    """The whole of what a server that refuses to serve says to a client
    (the start's probe reads its first packet only)."""
    said = b""
    try:
        with socket.create_connection(("127.0.0.1", port), timeout=1) as probe:
            probe.settimeout(1)
            while len(said) < 1000:
                piece = probe.recv(1000)
                if not piece:
                    break
                said += piece
    except OSError:
        pass
    return said.decode("latin-1").strip()


class Checks:
    """Named checks of one scenario; the names are what a known fault lists."""

    def __init__(self) -> None:
        self.failed: Dict[str, str] = {}
        self.count = 0

    def check(self, name: str, ok: bool, detail: str = "") -> bool:
        self.count += 1
        if not ok:
            self.failed[name] = detail
        return ok


def check_server(phase: str, scenario: Scenario, tmp: str, port: int, checks: Checks) -> Dict[str, str]:
    """Logins, uploads, listings and the greeting of one phase ("before" or
    "after"); what each login came to."""
    logins = {}
    for user, expected in getattr(scenario, phase).items():
        # The table's password: that of a virtual user may be an old one.
        password = harness.credentials(scenario, user)[1] if user == harness.ANONYMOUS else harness.password_of(user)
        got, reply = harness.try_login(port, user, password)
        logins[user] = got
        checks.check(f"{phase}:login:{user}", got == expected, f"expected {expected}, server {got}: {reply.strip()}")
        # Anonymous sessions take any password.
        if got == ALLOWED and user != harness.ANONYMOUS:
            # A server that admits anybody would prove nothing.
            wrong, reply = harness.try_login(port, user, harness.password_of(user) + "x")
            checks.check(f"{phase}:wrong-password:{user}", wrong == DENIED, f"admitted: {reply.strip()}")
    for item in scenario.uploads:
        user, expected = item["user"], item[phase]
        back, reply = in_session(port, user, upload)
        got = NO_LOGIN if back is None else REFUSED if isinstance(back, ftplib.Error) else STORED
        on_disk = os.path.join(harness.fill(item["directory"], tmp), UPLOAD_NAME)
        if not checks.check(f"{phase}:upload:{user}", got == expected, f"expected {expected}, got {got}: {reply}"):
            continue
        if got != STORED:
            checks.check(f"{phase}:no-file:{user}", not os.path.lexists(on_disk), f"{on_disk} exists")
            continue
        checks.check(f"{phase}:download:{user}", back == UPLOAD_DATA, f"RETR gave {back!r} {reply}")
        try:
            with open(on_disk, "rb") as source:
                content, owner = source.read(), os.stat(on_disk).st_uid
        except OSError as error:
            content, owner = str(error).encode(), -1
        uid = pwd.getpwnam(user).pw_uid
        checks.check(
            f"{phase}:on-disk:{user}",
            content == UPLOAD_DATA and owner == uid,
            f"{on_disk}: {content!r}, owner {owner} (expected {uid})",
        )
    for item in scenario.listings:
        if phase not in item:
            continue
        # vsftpd answers an empty directory with 550.
        names, why = in_session(port, item["user"], lambda ftp: ftp.nlst())
        names = [] if isinstance(names, ftplib.Error) else names
        shown = None if names is None else [os.path.basename(n) for n in names]
        # A name, or names; "!name" is one the listing must not show.
        wanted = [item[phase]] if isinstance(item[phase], str) else item[phase]
        checks.check(
            f"{phase}:listing:{item['user']}",
            shown is not None and all((n[1:] not in shown) if n.startswith("!") else (n in shown) for n in wanted),
            f"expected {wanted}, listed {names} {why}",
        )
    if phase in scenario.greeting:
        said = welcome(port)
        checks.check(f"{phase}:greeting", said == scenario.greeting[phase], f"greeted with {said!r}")
    return logins


def check_forecast(scenario: Scenario, report: str, run_dir: str, logins: Dict[str, str], checks: Checks) -> None:
    """ftpconfig-report on the saved files: the server works, and each
    named user's forecast is what the server did."""
    done = harness.run_report(report, run_dir, "--json")
    try:
        document = json.loads(done.stdout) if done.returncode == 0 else {}
    except ValueError:
        document = {}
    document = document if isinstance(document, dict) else {}
    server = document.get("server")
    failure = (done.stderr or done.stdout).strip()[:300]
    checks.check(
        "forecast:server",
        isinstance(server, dict) and server.get("fails") is False,
        f"the report's server: {server!r} {failure}",
    )
    rows = {row.get("name"): row for row in document.get("users", []) if isinstance(row, dict)}
    for user in scenario.forecast:
        row = rows.get(harness.ANONYMOUS_ROW if user == harness.ANONYMOUS else user) or {}
        forecast = row.get("forecast") if isinstance(row.get("forecast"), dict) else {}
        checks.check(
            f"forecast:{user}",
            forecast.get("status") == logins.get(user),
            f"forecast {forecast.get('status')!r} {forecast.get('findings', '')}, server {logins.get(user)}",
        )


def check_saved(scenario: Scenario, tmp: str, port: int, before, after, checks: Checks) -> None:
    declared = {harness.fill(path, tmp): what for path, what in scenario.changes.items()}
    found = harness.differences(before, after)
    # Every save keeps the version of each file it replaces, with its mode
    # and owner (the virtual users database mode 0600), and nothing else.
    for path in [p for p in found if p.endswith(BACKUP)]:
        original, kept = path[: -len(BACKUP)], after.get(path)
        old = before.get(original)
        checks.check(
            f"backup:{original}",
            harness.CONTENT in found.get(original, "")
            and old is not None
            and kept is not None
            and (kept.payload, kept.uid, kept.gid) == (old.payload, old.uid, old.gid)
            and kept.mode == (0o600 if original.endswith(".db") else old.mode),
            f"{path}: {found[path]}, the original {found.get(original) or 'untouched'}",
        )
        del found[path]
    for path in sorted(declared.keys() | found.keys()):
        checks.check(
            f"files:{path}",
            declared.get(path) == found.get(path),
            f"expected {declared.get(path) or 'untouched'}, found {found.get(path) or 'untouched'}",
        )
    for path, lines in scenario.saved_text.items():
        path = harness.fill(path, tmp)
        entry = after.get(path)
        expected = "".join(harness.fill(line, tmp, port) + "\n" for line in lines)
        got = entry.payload.decode("utf-8", "replace") if entry and entry.payload is not None else None
        checks.check(f"text:{path}", got == expected, f"expected {expected!r}, saved {got!r}")


# One scenario ----------------------------------------------------------------


def run_scenario(scenario: Scenario, program: str, base: str) -> bool:
    if scenario.through in ("window", "ctl"):
        given = WINDOW if scenario.through == "window" else CTL
        if not given:
            print(f"{scenario.name:28} ERROR its edit goes through {scenario.through}, and no --{scenario.through} program")
            return False
        program = given
    tmp = os.path.join(base, "root")  # what the scenario sets up: compared
    run_dir = os.path.join(base, "run")  # the harness's own: not compared
    os.makedirs(tmp, 0o755)
    os.makedirs(run_dir, 0o755)
    port = harness.free_port()
    server = harness.Vsftpd(port, os.path.join(run_dir, "vsftpd.log"))
    checks = Checks()
    edit = [harness.fill(part, tmp) for part in scenario.edit]
    edit_output = ""
    try:
        harness.prepare(scenario, tmp, port)
        server.start()
        try:
            check_server("before", scenario, tmp, port, checks)
        finally:
            server.stop()
        if checks.failed:
            raise SetupError("the starting point is not as the scenario says: " + describe(checks.failed, tmp))

        tracked = ["/etc", tmp]
        top_modes = {path: os.lstat(path).st_mode for path in ("/", "/tmp", base)}
        before = harness.capture(tracked)
        done, edit_output = run_edit(program, edit, run_dir, scenario.refused)
        after = harness.capture(tracked)
        for path, mode in top_modes.items():
            if os.lstat(path).st_mode != mode:
                os.chmod(path, stat.S_IMODE(mode))
                raise SetupError(f"the edit changed the mode of {path} (put back)")
        checks.check("edit", done, edit_output)
        check_saved(scenario, tmp, port, before, after, checks)

        try:
            server.start()
        except SetupError as error:
            checks.check("after:start", False, f"{error} {greeting(port)}".strip())
        else:
            try:
                logins = check_server("after", scenario, tmp, port, checks)
            finally:
                server.stop()
            if scenario.forecast:
                check_forecast(scenario, REPORT, run_dir, logins, checks)
    except (SetupError, OSError) as error:
        print(f"{scenario.name:28} ERROR {error}")
        if edit_output:
            print(f"{'':28} {os.path.basename(program)}: {edit_output}")
        return False
    finally:
        server.stop()

    failed = set(checks.failed)
    why = scenario.known_fault
    expected = {harness.fill(name, tmp) for name in scenario.known_fault_checks}
    ok = failed == expected
    if why and ok:
        outcome = f"ok, known engine fault: {why} [{describe(checks.failed, tmp)}]"
    elif why and not failed:
        outcome = f"FAIL: passes now; remove the known fault ({why})"
    elif why:
        outcome = f"FAIL: expected to fail {sorted(expected)}, failed: {describe(checks.failed, tmp)}"
    else:
        outcome = "ok" if ok else "FAIL: " + describe(checks.failed, tmp)
    # The options edit names a widget a setting: too many to show.
    what = f"options ({len(edit) - 1} settings)" if edit[0] == "options" else " ".join(edit).replace(tmp, "{tmp}")
    shown = ("" if scenario.through == "engine" else scenario.through + ": ") + what
    print(f"{scenario.name:28} {shown:40} {checks.count:3} checks  {outcome}")
    if not ok and edit_output:
        print(f"{'':28} {os.path.basename(program)}: {edit_output}")
    return ok


def describe(failed: Dict[str, str], tmp: str) -> str:
    return "; ".join(f"{name}: {detail}" for name, detail in sorted(failed.items())).replace(tmp, "{tmp}")


def check_table(table: List[Scenario]) -> None:
    """Catches slips in the table itself before anything runs."""
    for scenario in table:
        where = f"scenario {scenario.name}"
        conf = {harness.key_of(line): line.split("=", 1)[1] for line in scenario.conf}
        if scenario.edit[0] not in EDITS:
            raise SystemExit(f"{where}: unknown edit {scenario.edit[0]}")
        if scenario.through not in THROUGH:
            raise SystemExit(f"{where}: through is one of {THROUGH}")
        if scenario.through == "window" and scenario.edit[0] not in WINDOW_EDITS:
            raise SystemExit(f"{where}: the window makes only the edits {WINDOW_EDITS}")
        if scenario.through == "engine" and scenario.edit[0] not in ENGINE_EDITS:
            raise SystemExit(f"{where}: editchild makes only the edits {ENGINE_EDITS}")
        if scenario.through == "ctl" and scenario.edit[0] not in CTL_COMMANDS:
            raise SystemExit(f"{where}: ftpconfig-ctl makes only the edits {tuple(CTL_COMMANDS)}")
        if scenario.refused:
            # Refused before anything is written: the server does as before.
            if scenario.changes or scenario.before != scenario.after or scenario.through != "ctl":
                raise SystemExit(f"{where}: a refused edit (through ctl) changes no file and no login")
            continue
        if scenario.forecast and (not REPORT or set(scenario.forecast) - set(scenario.after)):
            raise SystemExit(f"{where}: a forecast needs --report and users the after phase logs in")
        if set(scenario.greeting) - {"before", "after"}:
            raise SystemExit(f"{where}: a greeting is checked before or after the edit")
        # The engine checks the rights against the user's root and offers
        # to add the missing bits; the root of a user who is not chrooted
        # is "/", and the machine's "/" must never be offered.
        if scenario.edit[0] == "rights" and conf.get("chroot_local_user", "").lower() != "yes":
            raise SystemExit(f"{where}: a rights edit needs chroot_local_user=YES")
        if not scenario.changes or any(set(w.split("+")) - CHANGES for w in scenario.changes.values()):
            raise SystemExit(f"{where}: an edit must change files, each in a known way")
        if (set(scenario.before.values()) | set(scenario.after.values())) - {ALLOWED, DENIED}:
            raise SystemExit(f"{where}: a login is neither {ALLOWED} nor {DENIED}")
        if scenario.before == scenario.after and not (scenario.uploads or scenario.listings):
            raise SystemExit(f"{where}: nothing the server does is to change")
        if bool(scenario.known_fault) != bool(scenario.known_fault_checks):
            raise SystemExit(f"{where}: a known fault names the checks it fails")


def take_program_options() -> Tuple[Optional[str], Optional[str], Optional[str]]:
    """--window PROGRAM, --report PROGRAM and --ctl PROGRAM, taken off the
    command line before the harness reads the options every script has."""
    parser = argparse.ArgumentParser(add_help=False)
    parser.add_argument("--window")
    parser.add_argument("--report")
    parser.add_argument("--ctl")
    known, rest = parser.parse_known_args(sys.argv[1:])
    sys.argv[1:] = rest
    for program in (known.window, known.report, known.ctl):
        if program and not os.access(program, os.X_OK):
            raise SystemExit(f"saves.py: {program} is not an executable program")
    return known.window, known.report, known.ctl


WINDOW: Optional[str] = None
REPORT: Optional[str] = None
CTL: Optional[str] = None

if __name__ == "__main__":
    WINDOW, REPORT, CTL = take_program_options()
    tools = (harness.VSFTPD, harness.CHPASSWD, "unshare", "mount")
    defaults = {
        "uploads": [],
        "listings": [],
        "saved_text": {},
        "known_fault": "",
        "known_fault_checks": [],
        "through": "engine",
        "forecast": [],
        "greeting": {},
        "refused": "",
        "changes": {},
    }
    sys.exit(harness.main(__file__, __doc__, "--edit", tools, defaults, check_table, run_scenario))

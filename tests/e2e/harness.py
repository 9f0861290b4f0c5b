"""What the end-to-end scripts share: the private /etc, accounts, PAM stacks,
the server's settings, the vsftpd process, FTP logins, the report program
and the run of a table of scenarios.

verdicts.py, forecast.py and saves.py import it from their own directory;
each sets sys.dont_write_bytecode first, so that no compiled copy of it is
left in the source tree. Everything here writes to /etc, and the scripts
refuse to run outside scripts/with-private-etc.sh (see may_run).
"""

import argparse
import ctypes
import dataclasses
import ftplib
import os
import shutil
import signal
import socket
import subprocess
import sys
import tempfile
import time
from typing import Callable, Dict, List, Optional, Sequence, Tuple

VSFTPD = "/usr/sbin/vsftpd"
DB_LOAD = "db5.3_load"
CHPASSWD = "chpasswd"
CONF = "/etc/vsftpd.conf"

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


class SetupError(Exception):
    """The scenario could not be prepared or run; not a verdict."""


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
    # A form of HOME_FORMS, or "missing".
    home: str = "dir"
    home_path: Optional[str] = None  # default {tmp}/home/NAME
    group: Optional[str] = None  # primary group, default one of its own name
    groups: Tuple[str, ...] = ()  # supplementary groups


# Home forms: mode, owned by the account, group the account's primary group.
HOME_FORMS = {
    "dir": (0o755, True, True),  # the account's own, writable by it
    "readonly": (0o555, True, True),
    "root": (0o755, False, False),
    "root-group": (0o775, False, True),
    "closed": (0o700, False, False),  # the account cannot enter it
    "world": (0o777, False, False),  # writable by every account
}


@dataclasses.dataclass(frozen=True)
class Setup:
    """What prepare() writes for a scenario; each script's Scenario adds
    what it checks. Paths and lines may hold {tmp}, the scenario's own
    temporary directory (and the configuration {port} too)."""

    name: str
    conf: List[str]  # lines after BASE_CONF in /etc/vsftpd.conf
    accounts: List[Account] = dataclasses.field(default_factory=list, kw_only=True)
    pam: Optional[List[str]] = dataclasses.field(default=None, kw_only=True)  # default DEBIAN_PAM
    pam_service: str = dataclasses.field(default="vsftpd", kw_only=True)
    # database file (with ".db") -> {virtual user: password}
    dbs: Dict[str, Dict[str, str]] = dataclasses.field(default_factory=dict, kw_only=True)
    # further files (lists), path -> lines; root-owned 0644, under /etc or {tmp}
    files: Dict[str, List[str]] = dataclasses.field(default_factory=dict, kw_only=True)
    # directories under {tmp}, owned by root, 0755
    dirs: Tuple[str, ...] = dataclasses.field(default=(), kw_only=True)
    # keys of BASE_CONF this scenario leaves out
    omit: Tuple[str, ...] = dataclasses.field(default=(), kw_only=True)


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
        """Root's, as a package would install it."""
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
        os.chown(path, 0, 0)

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


def conf_text(scenario: Setup, tmp: str, port: int) -> str:
    base = [line for line in BASE_CONF if key_of(line) not in scenario.omit]
    return "".join(fill(line, tmp, port) + "\n" for line in base + scenario.conf)


def add_accounts(scenario: Setup, tmp: str) -> None:
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


def under_tmp(path: str, tmp: str) -> str:
    if not path.startswith(tmp + "/"):
        raise SetupError(f"{path} is not under the temporary directory")
    return path


def prepare(scenario: Setup, tmp: str, port: int, etc: EtcSnapshot) -> None:
    """Writes the scenario's accounts, configuration, PAM files, directories,
    lists and databases; what it writes under /etc goes through `etc`."""
    os.makedirs(os.path.join(tmp, "empty"), 0o755, exist_ok=True)
    os.makedirs(os.path.join(tmp, "anon"), 0o755, exist_ok=True)
    add_accounts(scenario, tmp)
    etc.write(CONF, conf_text(scenario, tmp, port))
    for path, lines in COMMON_PAM.items():
        etc.write(path, "".join(line + "\n" for line in lines))
    pam = scenario.pam if scenario.pam is not None else DEBIAN_PAM
    etc.write("/etc/pam.d/" + scenario.pam_service, "".join(fill(line, tmp) + "\n" for line in pam))
    # The directories first: a file may be put into one of them.
    for path in scenario.dirs:
        os.makedirs(under_tmp(fill(path, tmp), tmp), 0o755, exist_ok=True)
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
            os.chown(path, 0, 0)
        else:
            raise SetupError(f"{path} is neither under /etc nor under the temporary directory")
    for path, users in scenario.dbs.items():
        path = under_tmp(fill(path, tmp), tmp)
        run_tool([DB_LOAD, "-T", "-t", "hash", path], "".join(f"{u}\n{p}\n" for u, p in users.items()))


# The server ----------------------------------------------------------------


def free_port() -> int:
    with socket.socket(socket.AF_INET, socket.SOCK_STREAM) as probe:
        probe.bind(("127.0.0.1", 0))
        return probe.getsockname()[1]


class Vsftpd:
    """vsftpd on CONF in the foreground. `may_fail`: the scenario expects
    the server not to start or to fail every connection; otherwise either
    is a SetupError."""

    def __init__(self, port: int, log_path: str, may_fail: bool = False) -> None:
        self.port = port
        self.log_path = log_path
        self.may_fail = may_fail
        self.process: Optional[subprocess.Popen] = None

    def log(self) -> str:
        try:
            with open(self.log_path, encoding="utf-8", errors="replace") as source:
                return source.read().strip()
        except OSError:
            return ""

    def start(self) -> bool:
        """True once it greets on the port; False when it exited instead
        (only a server that may fail)."""
        # vsftpd writes why it stops to descriptor 0, where a connection
        # would be under inetd: give it the log, opened for writing.
        with open(self.log_path, "w+b") as log:
            self.process = subprocess.Popen(
                [VSFTPD, CONF],
                stdin=log,
                stdout=log,
                stderr=subprocess.STDOUT,
                preexec_fn=die_with_parent,
            )
        deadline = time.monotonic() + START_TIMEOUT
        while time.monotonic() < deadline:
            if self.process.poll() is not None:
                if self.may_fail:
                    return False
                raise SetupError(f"vsftpd exited with {self.process.returncode}: {self.log()}")
            try:
                with socket.create_connection(("127.0.0.1", self.port), timeout=1) as probe:
                    probe.settimeout(FTP_TIMEOUT)
                    banner = probe.recv(200).decode("latin-1")
            except OSError:
                time.sleep(0.05)
                continue
            # From a server that may fail any greeting will do: a "500 OOPS"
            # one is a verdict too.
            if self.may_fail or banner.startswith("220"):
                return True
            raise SetupError(f"unexpected greeting on port {self.port}: {banner.strip()!r}")
        if self.may_fail:
            raise SetupError(f"vsftpd neither answered on 127.0.0.1:{self.port} nor exited within {START_TIMEOUT}s")
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


# Logins ----------------------------------------------------------------------

# How a server ends a session it refuses.
CLOSED = (EOFError, ConnectionResetError, BrokenPipeError)


def refusal(error: BaseException) -> str:
    if isinstance(error, ftplib.error_perm):
        return str(error)
    return f"connection closed: {error!r}"


def log_in(
    port: int, user: str, password: str, greeting_may_refuse: bool = False
) -> Tuple[Optional[ftplib.FTP], str]:
    """A session that said 230 and answers PWD, and the server's reply to
    the login; or None and the server's refusal.

    A server that greets with "500 OOPS" or closes the connection at once
    refuses too when `greeting_may_refuse` (one expected to fail);
    otherwise it proved at its start that it greets, and not reaching it
    is a fault of the run."""
    ftp = ftplib.FTP(timeout=FTP_TIMEOUT)
    session = None
    try:
        try:
            ftp.connect("127.0.0.1", port, timeout=FTP_TIMEOUT)
        except (ftplib.error_perm,) + CLOSED as error:
            if not greeting_may_refuse:
                raise SetupError(f"cannot connect to 127.0.0.1:{port}: {error}") from error
            return None, refusal(error)
        except (OSError, ftplib.Error) as error:
            raise SetupError(f"cannot connect to 127.0.0.1:{port}: {error}") from error
        try:
            reply = ftp.login(user, password)
            ftp.pwd()
        except (ftplib.error_perm,) + CLOSED as error:
            return None, refusal(error)
        except (OSError, ftplib.Error) as error:
            raise SetupError(f"login of {user}: {error!r}") from error
        session = ftp  # the caller's to close
        return session, reply
    finally:
        if session is None:
            ftp.close()


def close(ftp: ftplib.FTP) -> None:
    try:
        ftp.quit()
    except (OSError, EOFError, ftplib.Error):
        pass  # the verdict is in; how the session ends does not matter
    ftp.close()


def try_login(port: int, user: str, password: str, greeting_may_refuse: bool = False) -> Tuple[str, str]:
    """(ALLOWED, the server's 230 reply) or (DENIED, its refusal): see log_in."""
    ftp, reply = log_in(port, user, password, greeting_may_refuse)
    if ftp is None:
        return DENIED, reply
    close(ftp)
    return ALLOWED, reply


def credentials(scenario: Setup, user: str) -> Tuple[str, str]:
    """The name and the right password a scenario's user logs in with."""
    if user == ANONYMOUS:
        return ANONYMOUS, "e2e@example.org"
    for users in scenario.dbs.values():
        if user in users:
            return user, users[user]
    return user, password_of(user)


# The report ----------------------------------------------------------------


def run_report(report: str, tmp: str, *form: str) -> subprocess.CompletedProcess:
    """ftpconfig-report on the system root, its output captured."""
    env = dict(os.environ)
    # Settings of an operator's own session (a stored "skip_pam_check")
    # must not change the answers.
    env["XDG_CONFIG_HOME"] = os.path.join(tmp, "xdg")
    try:
        return subprocess.run(
            [report, "--root", "/", *form], capture_output=True, text=True, timeout=REPORT_TIMEOUT, env=env
        )
    except (OSError, subprocess.TimeoutExpired) as error:
        raise SetupError(f"ftpconfig-report: {error}") from error


# The run -------------------------------------------------------------------


def arguments(description: str, option: str, program: str) -> Tuple[str, Optional[List[str]]]:
    """(the program named by `option`, the scenarios asked for or None)."""
    parser = argparse.ArgumentParser(description=description)
    parser.add_argument(option, required=True, help=program)
    parser.add_argument("--scenario", action="append", help="run only this scenario (repeatable)")
    args = parser.parse_args()
    return getattr(args, option.lstrip("-").replace("-", "_")), args.scenario


def check_names_and_keys(table: Sequence[Setup]) -> None:
    """Slips every table can make: a name twice, a key the base
    configuration sets already."""
    base_keys = {key_of(line) for line in BASE_CONF}
    names = set()
    for scenario in table:
        if scenario.name in names:
            raise SystemExit(f"scenario {scenario.name} appears twice")
        names.add(scenario.name)
        clash = base_keys & {key_of(line) for line in scenario.conf} - set(scenario.omit)
        if clash:
            raise SystemExit(f"scenario {scenario.name} sets keys of the base configuration: {sorted(clash)}")


def may_run(script: str, program: str, tools: Sequence[str]) -> bool:
    """Whether the machine lets the script run; it says why not."""
    private, why = etc_is_private()
    if not private:
        print(
            f"{script}: refusing to run: {why}. It writes to /etc; run it through "
            "scripts/with-private-etc.sh, which gives it a private copy of /etc.",
            file=sys.stderr,
        )
        return False
    if os.geteuid() != 0:
        print(f"{script}: must run as root (it adds accounts and starts vsftpd)", file=sys.stderr)
        return False
    for tool in tools:
        if shutil.which(tool) is None:
            print(f"{script}: {tool} is not installed", file=sys.stderr)
            return False
    if not os.access(program, os.X_OK):
        print(f"{script}: {program} is not an executable program", file=sys.stderr)
        return False
    return True


def run_all(
    script: str,
    table: Sequence[Setup],
    selected: Optional[List[str]],
    prefix: str,
    run_one: Callable[[Setup, str], bool],
) -> Optional[Tuple[int, int]]:
    """Runs the selected scenarios (all without a selection), each in a
    temporary directory of its own made with `prefix`, until RUN_DEADLINE:
    (passed, failed), or None when none was selected."""
    become_subreaper()
    scenarios = [s for s in table if not selected or s.name in selected]
    if not scenarios:
        print(f"{script}: no scenario selected", file=sys.stderr)
        return None
    passed = failed = 0
    deadline = time.monotonic() + RUN_DEADLINE
    for scenario in scenarios:
        if time.monotonic() > deadline:
            print(f"{scenario.name}: ERROR not run, the run took longer than {RUN_DEADLINE}s")
            failed += 1
            continue
        tmp = tempfile.mkdtemp(prefix=prefix)
        try:
            # Accounts must reach their homes below it.
            os.chmod(tmp, 0o755)
            if run_one(scenario, tmp):
                passed += 1
            else:
                failed += 1
        finally:
            shutil.rmtree(tmp, ignore_errors=True)
    return passed, failed


def main(
    script: str,
    doc: str,
    option: str,
    program_help: str,
    tools: Sequence[str],
    table: Sequence[Setup],
    check_table: Callable[[], None],
    prefix: str,
    run_one: Callable[[Setup, str, str], bool],
    summary: Callable[[], str] = str,
) -> int:
    """The whole of a script's run: its options (the program it tests, named
    by `option`, and --scenario), the checks of the machine and of the
    table, then run_one(scenario, program, tmp) for each scenario, and the
    line "N passed, M failed" with what summary() adds. The exit status."""
    program, selected = arguments(doc.splitlines()[0], option, program_help)
    if not may_run(script, program, tools):
        return 2
    check_table()
    counts = run_all(script, table, selected, prefix, lambda scenario, tmp: run_one(scenario, program, tmp))
    if counts is None:
        return 2
    passed, failed = counts
    print(f"{passed} passed, {failed} failed{summary()}")
    return 0 if failed == 0 else 1

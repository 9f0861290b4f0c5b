"""What the end-to-end scripts share: the scenario tables (TOML files beside
the scripts), the private /etc, accounts, PAM stacks, the server's settings,
the vsftpd process, FTP logins, the report program and the run of a table.

verdicts.py, forecast.py and saves.py import it from their own directory;
each sets sys.dont_write_bytecode first, so that no compiled copy of it is
left in the source tree. Everything here writes to /etc, and the scripts
refuse to run outside scripts/with-private-etc.sh (see may_run).
"""

import argparse
import copy
import ctypes
import dataclasses
import ftplib
import itertools
import os
import shutil
import signal
import socket
import ssl
import stat
import subprocess
import sys
import tempfile
import time
import tomllib
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
    """A local account appended to /etc/passwd, /etc/shadow and /etc/group.
    A table writes it as "NAME key=value ...", e.g. "e2ebob home=readonly
    groups=e2eftp expired"."""

    name: str
    shell: str = "/bin/bash"
    # "hash": the password set by chpasswd; "!" or "*": the whole shadow
    # field; "!hash": the hash with a "!" in front (usermod -L style).
    shadow: str = "hash"
    passwd: str = "x"
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

# The account of anonymous sessions, which never logs in itself, and the one
# virtual users are mapped to; a table names them to change them.
ANON_ACCOUNT = Account("e2eanon", shell="/usr/sbin/nologin", shadow="*", home="root", home_path="{tmp}/anon")
GUEST_ACCOUNT = Account("e2eguest", shell="/usr/sbin/nologin", shadow="*", home="root", home_path="{tmp}/guest")


def parse_account(text: str) -> Account:
    name, *settings = text.split()
    fields = {}
    for setting in settings:
        key, _, value = setting.partition("=")
        fields[key] = True if key == "expired" else tuple(value.split(",")) if key == "groups" else value
    base = {a.name: a for a in (ANON_ACCOUNT, GUEST_ACCOUNT)}.get(name, Account(name))
    return dataclasses.replace(base, **fields)


# The base configuration, Debian's PAM files: what every scenario starts from.
with open(os.path.join(os.path.dirname(os.path.abspath(__file__)), "machine.toml"), "rb") as machine:
    MACHINE = tomllib.load(machine)
BASE_CONF: List[str] = MACHINE["base_conf"]
DEBIAN_PAM: List[str] = MACHINE["debian_pam"]
COMMON_PAM: Dict[str, List[str]] = MACHINE["common_pam"]


class Scenario:
    """One [[scenario]] of a table: what prepare() writes and what the
    script checks. Paths and lines may hold {tmp}, the scenario's own
    temporary directory (and the configuration {port} too)."""

    DEFAULTS = {
        "conf": [],  # lines after BASE_CONF in /etc/vsftpd.conf
        "omit": [],  # keys of BASE_CONF this scenario leaves out
        "accounts": [],
        "pam": DEBIAN_PAM,
        "pam_service": "vsftpd",
        "dirs": [],  # directories under {tmp}, owned by root, 0755
        "files": {},  # path -> lines; root's, 0644, under /etc or {tmp}
        "dbs": {},  # database file (with ".db") -> {virtual user: password}
        "shadow": {},  # user -> {field number: value}, set after the accounts
        # A certificate and its key made at set-up, {tmp}/cert.pem and
        # {tmp}/key.pem, both in {tmp}/both.pem (never a committed key).
        "certificate": False,
        "users": {},
    }

    def __init__(self, table: dict, defaults: dict) -> None:
        self.__dict__.update(copy.deepcopy({**self.DEFAULTS, **defaults}))
        self.__dict__.update(table)
        self.accounts = [parse_account(text) for text in self.accounts]
        self.name: str = table["name"]


def load_table(script: str, defaults: dict) -> List[Scenario]:
    """The scenarios of the table beside the script (verdicts.py reads
    verdicts.toml), with the script's defaults of the keys it adds."""
    with open(os.path.splitext(script)[0] + ".toml", "rb") as source:
        return [Scenario(table, defaults) for table in tomllib.load(source)["scenario"]]


# Guards -------------------------------------------------------------------


def etc_is_private() -> Tuple[bool, str]:
    if os.environ.get("FTPCONFIG_PRIVATE_ETC") != "1":
        return False, "FTPCONFIG_PRIVATE_ETC=1 is not set"
    try:
        with open("/proc/self/mountinfo", encoding="utf-8", errors="replace") as mountinfo:
            if any(len(line.split()) > 4 and line.split()[4] == "/etc" for line in mountinfo):
                return True, ""
    except OSError as error:
        return False, f"cannot read /proc/self/mountinfo: {error}"
    return False, "/etc is not a mount point"


# Trees ----------------------------------------------------------------------

# What happened to a path between two captures (several joined by "+").
CONTENT = "content"
MODE = "mode"  # permission bits or owner
CREATED = "created"
REMOVED = "removed"


@dataclasses.dataclass(frozen=True)
class Entry:
    kind: str  # "file", "dir", "link", "other"
    mode: int
    uid: int
    gid: int
    payload: Optional[bytes]  # a file's bytes, a link's target


def capture(tops: List[str]) -> Dict[str, Entry]:
    """Everything below the directories (themselves included), by path."""
    entries: Dict[str, Entry] = {}

    def add(path: str) -> None:
        info = os.lstat(path)
        kind, payload = "other", None
        if stat.S_ISREG(info.st_mode):
            kind = "file"
            with open(path, "rb") as source:
                payload = source.read()
        elif stat.S_ISDIR(info.st_mode):
            kind = "dir"
        elif stat.S_ISLNK(info.st_mode):
            kind, payload = "link", os.fsencode(os.readlink(path))
        entries[path] = Entry(kind, stat.S_IMODE(info.st_mode), info.st_uid, info.st_gid, payload)

    for top in tops:
        add(top)
        for directory, subdirectories, files in os.walk(top):
            for name in subdirectories + files:
                add(os.path.join(directory, name))
    return entries


def differences(before: Dict[str, Entry], after: Dict[str, Entry]) -> Dict[str, str]:
    changed: Dict[str, str] = {}
    for path in sorted(before.keys() | after.keys()):
        old, new = before.get(path), after.get(path)
        if old is None or new is None:
            changed[path] = CREATED if old is None else REMOVED
            continue
        what = [CONTENT] if (old.kind, old.payload) != (new.kind, new.payload) else []
        what += [MODE] if (old.mode, old.uid, old.gid) != (new.mode, new.uid, new.gid) else []
        if what:
            changed[path] = "+".join(what)
    return changed


def remove(path: str) -> None:
    if os.path.isdir(path) and not os.path.islink(path):
        shutil.rmtree(path)
    elif os.path.lexists(path):
        os.unlink(path)


class EtcGuard:
    """Puts /etc back exactly as it was when the guard was made, whatever a
    scenario (or the program under test) wrote, made or removed below it."""

    def __init__(self) -> None:
        self.tree = capture(["/etc"])

    @staticmethod
    def write(path: str, text: str, mode: int = 0o644) -> None:
        """Root's, as a package would install it."""
        if not path.startswith("/etc/"):
            raise SetupError(f"{path} is not under /etc")
        os.makedirs(os.path.dirname(path), 0o755, exist_ok=True)
        with open(path, "w", encoding="utf-8") as target:
            target.write(text)
        os.chmod(path, mode)
        os.chown(path, 0, 0)

    def restore(self) -> None:
        now = capture(["/etc"])
        for path in sorted(now.keys() - self.tree.keys(), reverse=True):
            remove(path)
        for path in sorted(self.tree):
            old, new = self.tree[path], now.get(path)
            if old.kind == "other":
                continue
            if new is not None and new.kind != old.kind:
                remove(path)
                new = None
            if old.kind == "dir" and new is None:
                os.mkdir(path)
            elif old.kind == "file" and (new is None or new.payload != old.payload):
                with open(path, "wb") as target:
                    target.write(old.payload or b"")
            elif old.kind == "link" and (new is None or new.payload != old.payload):
                if new is not None:
                    os.unlink(path)
                os.symlink(os.fsdecode(old.payload or b""), path)
            if new is None or (old.mode, old.uid, old.gid) != (new.mode, new.uid, new.gid):
                os.chown(path, old.uid, old.gid, follow_symlinks=False)
                if old.kind != "link":
                    os.chmod(path, old.mode)


# Setting a scenario up ---------------------------------------------------------


def names_in(path: str) -> set:
    with open(path, encoding="utf-8", errors="replace") as source:
        return {line.split(":", 1)[0] for line in source if ":" in line}


def free_ids(count: int) -> List[int]:
    """Ids unused as uid and gid by the accounts and groups already there."""
    used = set()
    for path in ("/etc/passwd", "/etc/group"):
        with open(path, encoding="utf-8", errors="replace") as source:
            used |= {int(f[2]) for f in (line.split(":") for line in source) if len(f) > 2 and f[2].isdigit()}
    return list(itertools.islice((i for i in itertools.count(FIRST_ID) if i not in used), count))


def run_tool(command: List[str], stdin: str = "", timeout: int = 20) -> None:
    try:
        done = subprocess.run(command, input=stdin, capture_output=True, text=True, timeout=timeout)
    except (OSError, subprocess.TimeoutExpired) as error:
        raise SetupError(f"{command[0]}: {error}") from error
    if done.returncode != 0:
        raise SetupError(f"{' '.join(command)} failed ({done.returncode}): {done.stderr.strip()}")


def fill(text: str, tmp: str, port: int = 0) -> str:
    return text.replace("{tmp}", tmp).replace("{port}", str(port))


def key_of(line: str) -> str:
    return line.split("=", 1)[0]


def conf_text(scenario: Scenario, tmp: str, port: int) -> str:
    base = [line for line in BASE_CONF if key_of(line) not in scenario.omit]
    return "".join(fill(line, tmp, port) + "\n" for line in base + scenario.conf)


def add_accounts(scenario: Scenario, tmp: str) -> None:
    """Appends to /etc/passwd, /etc/shadow and /etc/group; EtcGuard puts them back."""
    accounts = list(scenario.accounts)
    if all(a.name != ANON_ACCOUNT.name for a in accounts):
        accounts.insert(0, ANON_ACCOUNT)
    group_names = list(dict.fromkeys(name for a in accounts for name in (a.group or a.name,) + a.groups))
    clash = (names_in("/etc/passwd") | names_in("/etc/group")) & ({a.name for a in accounts} | set(group_names))
    if clash:
        raise SetupError(f"accounts or groups already on this machine: {sorted(clash)}")
    ids = free_ids(len(accounts) + len(group_names))
    gid = {name: ids[len(accounts) + i] for i, name in enumerate(group_names)}
    members: Dict[str, List[str]] = {name: [a.name for a in accounts if name in a.groups] for name in group_names}

    passwd_lines, shadow_lines = [], []
    for index, account in enumerate(accounts):
        uid = ids[index]
        home = fill(account.home_path or "{tmp}/home/" + account.name, tmp)
        primary = gid[account.group or account.name]
        # "x" until chpasswd has run: it writes the hash into /etc/passwd
        # instead of /etc/shadow when the field is anything else.
        passwd_lines.append(f"{account.name}:x:{uid}:{primary}::{home}:{account.shell}\n")
        # A recent last change: a 0 there would force a password change.
        shadow_lines.append(f"{account.name}:!:19000:0:99999:7::{'1' if account.expired else ''}:\n")
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
    hashed = {"hash": lambda old: old, "!hash": lambda old: "!" + old}
    rewrite_fields("/etc/shadow", {a.name: {1: hashed.get(a.shadow, lambda old, a=a: a.shadow)} for a in accounts})
    rewrite_fields("/etc/passwd", {name: {1: lambda old, a=a: a.passwd} for name, a in by_name.items()})
    aging = {user: {int(n): lambda old, v=v: v for n, v in f.items()} for user, f in scenario.shadow.items()}
    rewrite_fields("/etc/shadow", aging)


def rewrite_fields(path: str, changes: Dict[str, Dict[int, Callable[[str], str]]]) -> None:
    """Sets field N of the lines of the named accounts to change(old value)."""
    with open(path, encoding="utf-8") as source:
        lines = source.read().splitlines(keepends=True)
    seen = set()
    for index, line in enumerate(lines):
        fields = line.rstrip("\n").split(":")
        for number, change in changes.get(fields[0], {}).items():
            fields[number] = change(fields[number])
            lines[index] = ":".join(fields) + "\n"
            seen.add(fields[0])
    if seen != {name for name, fields in changes.items() if fields}:
        raise SetupError(f"{path} has no line for {sorted(set(changes) - seen)}")
    with open(path, "w", encoding="utf-8") as target:
        target.writelines(lines)


def under_tmp(path: str, tmp: str) -> str:
    if not path.startswith(tmp + "/"):
        raise SetupError(f"{path} is not under the temporary directory")
    return path


def prepare(scenario: Scenario, tmp: str, port: int) -> None:
    """Writes the scenario's accounts, configuration, PAM files, directories,
    lists and databases."""
    os.makedirs(os.path.join(tmp, "empty"), 0o755, exist_ok=True)
    os.makedirs(os.path.join(tmp, "anon"), 0o755, exist_ok=True)
    if scenario.certificate:
        run_tool(
            ["openssl", "req", "-x509", "-newkey", "rsa:2048", "-nodes", "-days", "2", "-subj", "/CN=127.0.0.1"]
            + ["-keyout", os.path.join(tmp, "key.pem"), "-out", os.path.join(tmp, "cert.pem")]
        )
        with open(os.path.join(tmp, "both.pem"), "w", encoding="ascii") as both:
            for name in ("cert.pem", "key.pem"):
                with open(os.path.join(tmp, name), encoding="ascii") as part:
                    both.write(part.read())
    add_accounts(scenario, tmp)
    EtcGuard.write(CONF, conf_text(scenario, tmp, port))
    for path, lines in COMMON_PAM.items():
        EtcGuard.write(path, "".join(line + "\n" for line in lines))
    EtcGuard.write("/etc/pam.d/" + scenario.pam_service, "".join(fill(line, tmp) + "\n" for line in scenario.pam))
    # The directories first: a file may be put into one of them.
    for path in scenario.dirs:
        os.makedirs(under_tmp(fill(path, tmp), tmp), 0o755, exist_ok=True)
    for path, lines in scenario.files.items():
        path = fill(path, tmp)
        text = "".join(fill(line, tmp) + "\n" for line in lines)
        if path.startswith("/etc/"):
            EtcGuard.write(path, text)
            continue
        os.makedirs(os.path.dirname(under_tmp(path, tmp)), 0o755, exist_ok=True)
        with open(path, "w", encoding="utf-8") as target:
            target.write(text)
        os.chmod(path, 0o644)
        os.chown(path, 0, 0)
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
                [VSFTPD, CONF], stdin=log, stdout=log, stderr=subprocess.STDOUT, preexec_fn=die_with_parent
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
    for entry in filter(str.isdigit, os.listdir("/proc")):
        try:
            with open(f"/proc/{entry}/stat", encoding="latin-1") as source:
                stat_line = source.read()
        except OSError:
            continue
        # After the command name (which may hold blanks): state, ppid.
        fields = stat_line[stat_line.rfind(")") + 2 :].split()
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


def prctl(option: int, value: int) -> int:
    return ctypes.CDLL(None, use_errno=True).prctl(option, value, 0, 0, 0)


def die_with_parent() -> None:
    """In the child before exec: should this script be killed (a ctest
    timeout), the server gets SIGTERM instead of listening on."""
    prctl(1, signal.SIGTERM)  # PR_SET_PDEATHSIG


def become_subreaper() -> None:
    """Orphaned descendants (vsftpd sessions) become our children, not init's."""
    if prctl(36, 1) != 0:  # PR_SET_CHILD_SUBREAPER
        raise OSError(ctypes.get_errno(), "prctl(PR_SET_CHILD_SUBREAPER)")


# Logins ----------------------------------------------------------------------

# How a server ends a session it refuses.
CLOSED = (EOFError, ConnectionResetError, BrokenPipeError)


def refusal(error: BaseException) -> str:
    return str(error) if isinstance(error, ftplib.error_perm) else f"connection closed: {error!r}"


def tls_client() -> ftplib.FTP_TLS:
    """A client that asks for TLS (AUTH TLS) before its login and takes any
    certificate: the one of the test is made up."""
    context = ssl.create_default_context()
    context.check_hostname = False
    context.verify_mode = ssl.CERT_NONE
    return ftplib.FTP_TLS(context=context, timeout=FTP_TIMEOUT)


def log_in(
    port: int, user: str, password: str, greeting_may_refuse: bool = False, tls: bool = False
) -> Tuple[Optional[ftplib.FTP], str]:
    """A session that said 230 and answers PWD, and the server's reply to
    the login; or None and the server's refusal.

    A server that greets with "500 OOPS" or closes the connection at once
    refuses too when `greeting_may_refuse` (one expected to fail);
    otherwise it proved at its start that it greets, and not reaching it
    is a fault of the run."""
    ftp = tls_client() if tls else ftplib.FTP(timeout=FTP_TIMEOUT)
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
            if tls:
                ftp.auth()
            reply = ftp.login(user, password)
            ftp.pwd()
        except (ftplib.error_perm, ssl.SSLError) + CLOSED as error:
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


def try_login(
    port: int, user: str, password: str, greeting_may_refuse: bool = False, tls: bool = False
) -> Tuple[str, str]:
    """(ALLOWED, the server's 230 reply) or (DENIED, its refusal): see log_in."""
    ftp, reply = log_in(port, user, password, greeting_may_refuse, tls)
    if ftp is None:
        return DENIED, reply
    close(ftp)
    return ALLOWED, reply


def credentials(scenario: Scenario, user: str) -> Tuple[str, str]:
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
    # Settings of an operator's own session (a stored "skip_pam_check")
    # must not change the answers.
    env = dict(os.environ, XDG_CONFIG_HOME=os.path.join(tmp, "xdg"))
    try:
        return subprocess.run(
            [report, "--root", "/", *form], capture_output=True, text=True, timeout=REPORT_TIMEOUT, env=env
        )
    except (OSError, subprocess.TimeoutExpired) as error:
        raise SetupError(f"ftpconfig-report: {error}") from error


# The run -------------------------------------------------------------------


def check_names_and_keys(table: Sequence[Scenario]) -> None:
    """Slips every table can make: a name twice, a key the base
    configuration sets already, an account that cannot be read."""
    base_keys = {key_of(line) for line in BASE_CONF}
    names = set()
    for scenario in table:
        if scenario.name in names:
            raise SystemExit(f"scenario {scenario.name} appears twice")
        names.add(scenario.name)
        clash = base_keys & {key_of(line) for line in scenario.conf} - set(scenario.omit)
        if clash:
            raise SystemExit(f"scenario {scenario.name} sets keys of the base configuration: {sorted(clash)}")
        for account in scenario.accounts:
            if account.home not in HOME_FORMS and account.home != "missing":
                raise SystemExit(f"scenario {scenario.name}: unknown home form {account.home!r}")


def may_run(script: str, program: str, tools: Sequence[str]) -> bool:
    """Whether the machine lets the script run; it says why not."""
    private, why = etc_is_private()
    problem = ""
    if not private:
        problem = (
            f"refusing to run: {why}. It writes to /etc; run it through "
            "scripts/with-private-etc.sh, which gives it a private copy of /etc."
        )
    elif os.geteuid() != 0:
        problem = "must run as root (it adds accounts and starts vsftpd)"
    elif any(shutil.which(tool) is None for tool in tools):
        problem = f"{[t for t in tools if shutil.which(t) is None][0]} is not installed"
    elif not os.access(program, os.X_OK):
        problem = f"{program} is not an executable program"
    if problem:
        print(f"{script}: {problem}", file=sys.stderr)
    return not problem


def main(
    script: str,
    doc: str,
    option: str,
    tools: Sequence[str],
    defaults: dict,
    check_table: Callable[[List[Scenario]], None],
    run_one: Callable[[Scenario, str, str], bool],
    summary: Callable[[], str] = str,
) -> int:
    """The whole of a script's run: its options (the program it tests, named
    by `option`, and --scenario), the checks of the machine and of its
    table, then run_one(scenario, program, tmp) for each scenario selected,
    each in a temporary directory of its own and with /etc put back after
    it, until RUN_DEADLINE; and the line "N passed, M failed" with what
    summary() adds. The exit status."""
    parser = argparse.ArgumentParser(description=doc.splitlines()[0])
    parser.add_argument(option, required=True, help="the program under test")
    parser.add_argument("--scenario", action="append", help="run only this scenario (repeatable)")
    args = parser.parse_args()
    program = getattr(args, option.lstrip("-"))
    name = os.path.basename(script)
    if not may_run(name, program, tools):
        return 2
    table = load_table(script, defaults)
    check_names_and_keys(table)
    check_table(table)
    scenarios = [s for s in table if not args.scenario or s.name in args.scenario]
    if not scenarios:
        print(f"{name}: no scenario selected", file=sys.stderr)
        return 2
    become_subreaper()
    guard = EtcGuard()
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
            if run_one(scenario, program, tmp):
                passed += 1
            else:
                failed += 1
        finally:
            guard.restore()
            shutil.rmtree(tmp, ignore_errors=True)
    print(f"{passed} passed, {failed} failed{summary()}")
    return 0 if failed == 0 else 1

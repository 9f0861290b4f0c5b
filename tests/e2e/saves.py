#!/usr/bin/env python3
"""End-to-end check that what the program saves changes what vsftpd does.

Every scenario of the table below writes a vsftpd.conf, a PAM file, accounts
and lists, starts vsftpd on 127.0.0.1 and proves the starting point (a user
refused, an upload refused, ...). Then editchild applies ONE edit through the
engine and saves, exactly as the program would: grant a user (every refusal
the engine can cure is cured), deny a user, set a user's rights or root. The
server is started again and must now do what the edit promised: the user
logs in (and a wrong password still fails), the upload lands in the user's
directory, the login fails. Every file and directory under /etc and under the
scenario's own directory is compared before and after the edit: only the
ones the scenario names may change, and each of those must.

Where the engine is known to miss its promise, the scenario names the checks
that fail and why ("known engine fault"): the suite passes while those fail
exactly, and fails once they pass, so that the mark goes with the fault.

It shares harness.py with verdicts.py and forecast.py (accounts, the
server's settings, the server, the login) and, like them, runs only inside
scripts/with-private-etc.sh: it writes to /etc.
"""

import dataclasses
import ftplib
import io
import os
import pwd
import shutil
import socket
import stat
import subprocess
import sys
from typing import Dict, FrozenSet, List, Optional, Tuple

# Run from the source tree: no compiled copy of the harness left beside it.
sys.dont_write_bytecode = True
sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))
import harness  # noqa: E402  (the shared harness lives next to this file)
from harness import ALLOWED, DENIED, Account, SetupError  # noqa: E402

# Seconds: one edit (the engine opens a Berkeley DB environment).
EDIT_TIMEOUT = 60

# What an upload attempt came to.
STORED = "stored"
REFUSED = "refused"
NO_LOGIN = "no-login"

# What an edit may do to a path (several joined by "+").
CONTENT = "content"
MODE = "mode"  # permission bits or owner
CREATED = "created"
REMOVED = "removed"

UPLOAD_NAME = "e2e-upload.txt"
UPLOAD_DATA = b"uploaded through the saved rights\n"

# Scenarios pin the engine's lists and per-user directory into their own
# directory, so that an edit's changes are the files it is about. Lower-case
# "yes": the program rewrites the key as "yes" on every save, and vsftpd
# reads any case.
OWN_LISTS = [
    "userlist_enable=yes",
    "userlist_deny=yes",
    "userlist_file={tmp}/user_list",
    "chroot_list_file={tmp}/chroot_list",
    "user_config_dir={tmp}/users.d",
]
OWN_LIST_FILES = {"{tmp}/user_list": [], "{tmp}/chroot_list": []}
OWN_LIST_DIRS = ("{tmp}/users.d",)


def own_lists(**changed: str) -> List[str]:
    """OWN_LISTS with some values replaced (userlist_deny="NO")."""
    lines = []
    for line in OWN_LISTS:
        key = harness.key_of(line)
        lines.append(f"{key}={changed[key]}" if key in changed else line)
    return lines


@dataclasses.dataclass(frozen=True)
class Upload:
    """An upload of UPLOAD_NAME into the session's first directory, which is
    `directory` on disk; `before` and `after` are STORED, REFUSED or NO_LOGIN."""

    user: str
    directory: str
    before: str
    after: str


@dataclasses.dataclass(frozen=True)
class Listing:
    """A name the session's first directory must show before and after."""

    user: str
    before: str
    after: str


@dataclasses.dataclass(frozen=True)
class Scenario(harness.Setup):
    # ("grant", USER), ("deny", USER), ("rights", USER, "write, download"),
    # ("directory", USER, PATH); {tmp} is filled in.
    edit: Tuple[str, ...]
    # user -> what the server does with the right password, before and after
    before: Dict[str, str]
    after: Dict[str, str]
    # path -> what the edit does to it (CONTENT, MODE, CREATED, ...); every
    # other path under /etc and {tmp} must stay as it was, byte for byte
    changes: Dict[str, str]
    # path -> the lines the edit must leave in it, each ended by "\n"
    saved_text: Dict[str, List[str]] = dataclasses.field(default_factory=dict)
    uploads: Tuple[Upload, ...] = ()
    listings: Tuple[Listing, ...] = ()
    # (why, the check ids that fail because of it)
    known_fault: Optional[Tuple[str, FrozenSet[str]]] = None


def fault(why: str, *checks: str) -> Tuple[str, FrozenSet[str]]:
    return why, frozenset(checks)


ALICE, BOB, CAROL, DAVE = "e2ealice", "e2ebob", "e2ecarol", "e2edave"
OFF = ["anonymous_enable=NO"]
# With local users off, anonymous ones must be on: vsftpd refuses to serve
# anybody otherwise ("both local and anonymous access disabled!").
ANONYMOUS_ON = ["anonymous_enable=YES"]

SCENARIOS: List[Scenario] = [
    # Grant: one refusal the engine can cure, cured by the file it is in.
    Scenario(
        "grant-userlist-deny",
        OFF + ["local_enable=YES"] + OWN_LISTS,
        edit=("grant", BOB),
        accounts=[Account(ALICE), Account(BOB), Account(CAROL)],
        files={**OWN_LIST_FILES, "{tmp}/user_list": [BOB, CAROL]},
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED, BOB: DENIED, CAROL: DENIED},
        after={ALICE: ALLOWED, BOB: ALLOWED, CAROL: DENIED},
        changes={"{tmp}/user_list": CONTENT},
        saved_text={"{tmp}/user_list": [CAROL]},
    ),
    Scenario(
        "grant-userlist-allow",
        OFF + ["local_enable=YES"] + own_lists(userlist_deny="NO"),
        edit=("grant", BOB),
        accounts=[Account(ALICE), Account(BOB), Account(CAROL)],
        files={**OWN_LIST_FILES, "{tmp}/user_list": [ALICE]},
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED, BOB: DENIED, CAROL: DENIED},
        after={ALICE: ALLOWED, BOB: ALLOWED, CAROL: DENIED},
        changes={"{tmp}/user_list": CONTENT},
        saved_text={"{tmp}/user_list": [ALICE, BOB]},
    ),
    Scenario(
        "grant-ftpusers-deny",
        OFF + ["local_enable=YES"] + OWN_LISTS,
        edit=("grant", BOB),
        pam=harness.debian_pam("{tmp}/ftpusers"),
        accounts=[Account(ALICE), Account(BOB), Account(CAROL)],
        files={**OWN_LIST_FILES, "{tmp}/ftpusers": ["# users who may not use FTP", "root", BOB, CAROL]},
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED, BOB: DENIED, CAROL: DENIED},
        after={ALICE: ALLOWED, BOB: ALLOWED, CAROL: DENIED},
        changes={"{tmp}/ftpusers": CONTENT},
        saved_text={"{tmp}/ftpusers": ["# users who may not use FTP", "root", CAROL]},
    ),
    Scenario(
        "grant-ftpusers-allow",
        OFF + ["local_enable=YES"] + OWN_LISTS,
        edit=("grant", BOB),
        pam=["auth required pam_listfile.so item=user sense=allow file={tmp}/ftpallow onerr=fail"]
        + harness.DEBIAN_PAM[3:],
        accounts=[Account(ALICE), Account(BOB), Account(CAROL)],
        files={**OWN_LIST_FILES, "{tmp}/ftpallow": [ALICE]},
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED, BOB: DENIED, CAROL: DENIED},
        after={ALICE: ALLOWED, BOB: ALLOWED, CAROL: DENIED},
        changes={"{tmp}/ftpallow": CONTENT},
        saved_text={"{tmp}/ftpallow": [ALICE, BOB]},
    ),
    Scenario(
        "grant-ftpusers-group",
        OFF + ["local_enable=YES"] + OWN_LISTS,
        edit=("grant", DAVE),
        pam=["auth required pam_listfile.so item=group sense=deny file={tmp}/ftpgroups onerr=succeed"]
        + harness.DEBIAN_PAM[3:],
        accounts=[
            Account(ALICE),
            Account(CAROL, groups=("e2enoftp",)),  # a supplementary member
            Account(DAVE, group="e2enoftp"),  # the primary group
        ],
        files={**OWN_LIST_FILES, "{tmp}/ftpgroups": ["e2enoftp"]},
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED, CAROL: DENIED, DAVE: DENIED},
        # The group leaves the list, and everybody in it is admitted with dave.
        after={ALICE: ALLOWED, CAROL: ALLOWED, DAVE: ALLOWED},
        changes={"{tmp}/ftpgroups": CONTENT},
        saved_text={"{tmp}/ftpgroups": []},
    ),
    Scenario(
        "grant-local-enable-no",
        ANONYMOUS_ON + ["local_enable=NO"] + OWN_LISTS,
        edit=("grant", ALICE),
        accounts=[Account(ALICE)],
        files=OWN_LIST_FILES,
        dirs=OWN_LIST_DIRS,
        before={ALICE: DENIED},
        after={ALICE: ALLOWED},
        changes={"/etc/vsftpd.conf": CONTENT},
    ),
    Scenario(
        "grant-local-enable-absent",
        ANONYMOUS_ON + OWN_LISTS,
        edit=("grant", ALICE),
        accounts=[Account(ALICE)],
        files=OWN_LIST_FILES,
        dirs=OWN_LIST_DIRS,
        before={ALICE: DENIED},
        after={ALICE: ALLOWED},
        changes={"/etc/vsftpd.conf": CONTENT},
    ),
    Scenario(
        "grant-two-causes",
        # Refused twice over: one grant cures both files.
        ANONYMOUS_ON + ["local_enable=NO"] + OWN_LISTS,
        edit=("grant", BOB),
        pam=harness.debian_pam("{tmp}/ftpusers"),
        accounts=[Account(ALICE), Account(BOB)],
        files={**OWN_LIST_FILES, "{tmp}/ftpusers": ["root", BOB]},
        dirs=OWN_LIST_DIRS,
        before={ALICE: DENIED, BOB: DENIED},
        after={ALICE: ALLOWED, BOB: ALLOWED},
        changes={"/etc/vsftpd.conf": CONTENT, "{tmp}/ftpusers": CONTENT},
        saved_text={"{tmp}/ftpusers": ["root"]},
    ),
    Scenario(
        "grant-missing-chroot-home",
        # The engine offers to create the missing root and does, owned by
        # the user with mode 0775: a root the user can write to, which
        # vsftpd refuses to chroot into.
        OFF + ["local_enable=YES", "chroot_local_user=YES"] + OWN_LISTS,
        edit=("grant", BOB),
        accounts=[Account(ALICE, home="readonly"), Account(BOB, home="missing")],
        files=OWN_LIST_FILES,
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED, BOB: DENIED},
        after={ALICE: ALLOWED, BOB: ALLOWED},
        changes={"{tmp}/home/" + BOB: CREATED},
        known_fault=fault(
            "the root the engine creates is writable by the user (0775, the user's own): "
            "vsftpd refuses to chroot into it",
            "after:login:" + BOB,
        ),
    ),
    Scenario(
        "grant-debian-defaults",
        # Debian's settings: no userlist, no per-user directory. Every save
        # enables the userlist and names the file the program keeps, which
        # it creates; without the name vsftpd would read its own default,
        # /etc/vsftpd.user_list, which Debian does not ship.
        ANONYMOUS_ON + ["local_enable=NO"],
        edit=("grant", ALICE),
        accounts=[Account(ALICE)],
        before={ALICE: DENIED},
        after={ALICE: ALLOWED},
        changes={
            "/etc/vsftpd.conf": CONTENT,
            # The engine's own defaults, made by every load and save.
            "/etc/vsftpd.d": CREATED,
            "/etc/vsftpd.d/users.d": CREATED,
            "/etc/vsftpd.d/allowed_user_list.conf": CREATED,
            "/etc/vsftpd.chroot_list": CREATED,
        },
    ),
    # Rights: "write" through a per-user file, write_enable=NO in the main file.
    Scenario(
        "rights-write",
        OFF + ["local_enable=YES", "write_enable=NO", "chroot_local_user=YES", "allow_writeable_chroot=YES"]
        + OWN_LISTS,
        edit=("rights", ALICE, "write, download"),
        # The homes are the users' own (0755): the engine finds the write
        # bit there already and leaves them alone.
        accounts=[Account(ALICE), Account(BOB)],
        files=OWN_LIST_FILES,
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED, BOB: ALLOWED},
        after={ALICE: ALLOWED, BOB: ALLOWED},
        uploads=(
            Upload(ALICE, "{tmp}/home/" + ALICE, REFUSED, STORED),
            # No per-user file: the main file's write_enable=NO still holds.
            Upload(BOB, "{tmp}/home/" + BOB, REFUSED, REFUSED),
        ),
        changes={"{tmp}/users.d/" + ALICE: CREATED},
        # The program ends the per-user files it writes with an empty line.
        saved_text={
            "{tmp}/users.d/"
            + ALICE: [
                "# File was created by FTP manager",
                "write_enable=yes",
                "download_enable=yes",
                "anon_upload_enable=no",
                "",
            ]
        },
    ),
    Scenario(
        "rights-write-readonly-root",
        # The root is the user's but read-only (0555): asked, the engine
        # adds the owner's write bit at once.
        OFF + ["local_enable=YES", "write_enable=NO", "chroot_local_user=YES", "allow_writeable_chroot=YES"]
        + OWN_LISTS,
        edit=("rights", ALICE, "write, download"),
        accounts=[Account(ALICE, home="readonly")],
        files=OWN_LIST_FILES,
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED},
        after={ALICE: ALLOWED},
        uploads=(Upload(ALICE, "{tmp}/home/" + ALICE, REFUSED, STORED),),
        changes={"{tmp}/users.d/" + ALICE: CREATED, "{tmp}/home/" + ALICE: MODE},
    ),
    Scenario(
        "rights-write-chroot-root",
        # Without allow_writeable_chroot the write bit the engine adds to
        # the chroot root locks the user out.
        OFF + ["local_enable=YES", "write_enable=NO", "chroot_local_user=YES"] + OWN_LISTS,
        edit=("rights", ALICE, "write, download"),
        accounts=[Account(ALICE, home="readonly")],
        files=OWN_LIST_FILES,
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED},
        after={ALICE: ALLOWED},
        uploads=(Upload(ALICE, "{tmp}/home/" + ALICE, REFUSED, STORED),),
        changes={"{tmp}/users.d/" + ALICE: CREATED, "{tmp}/home/" + ALICE: MODE},
        known_fault=fault(
            "the engine makes the chroot root writable by the user (the answer to its own question), "
            "and vsftpd refuses a writable chroot root without allow_writeable_chroot=YES",
            "after:login:" + ALICE,
            "after:upload:" + ALICE,
        ),
    ),
    # Directory: local_root through a per-user file.
    Scenario(
        "directory-local-root",
        OFF + ["local_enable=YES", "chroot_local_user=YES"] + OWN_LISTS,
        edit=("directory", ALICE, "{tmp}/srv/alice"),
        accounts=[Account(ALICE, home="readonly"), Account(BOB, home="readonly")],
        files={
            **OWN_LIST_FILES,
            "{tmp}/home/e2ealice/in-home.txt": ["home"],
            "{tmp}/home/e2ebob/in-home.txt": ["home"],
            "{tmp}/srv/alice/in-srv.txt": ["srv"],
        },
        dirs=OWN_LIST_DIRS + ("{tmp}/srv", "{tmp}/srv/alice"),
        before={ALICE: ALLOWED, BOB: ALLOWED},
        after={ALICE: ALLOWED, BOB: ALLOWED},
        listings=(Listing(ALICE, "in-home.txt", "in-srv.txt"), Listing(BOB, "in-home.txt", "in-home.txt")),
        changes={"{tmp}/users.d/" + ALICE: CREATED},
        saved_text={"{tmp}/users.d/" + ALICE: ["# File was created by FTP manager", "local_root={tmp}/srv/alice", ""]},
    ),
    # Deny: an admitted user blocked through the userlist.
    Scenario(
        "deny-userlist-deny",
        OFF + ["local_enable=YES"] + OWN_LISTS,
        edit=("deny", ALICE),
        accounts=[Account(ALICE), Account(BOB), Account(CAROL)],
        files={**OWN_LIST_FILES, "{tmp}/user_list": [CAROL]},
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED, BOB: ALLOWED, CAROL: DENIED},
        after={ALICE: DENIED, BOB: ALLOWED, CAROL: DENIED},
        changes={"{tmp}/user_list": CONTENT},
        saved_text={"{tmp}/user_list": [CAROL, ALICE]},
    ),
    Scenario(
        "deny-userlist-allow",
        # A white list is turned into a black one holding the blocked user
        # only (its names would otherwise become the blocked ones): carol,
        # not on the white list, is admitted afterwards.
        OFF + ["local_enable=YES"] + own_lists(userlist_deny="NO"),
        edit=("deny", ALICE),
        accounts=[Account(ALICE), Account(BOB), Account(CAROL)],
        files={**OWN_LIST_FILES, "{tmp}/user_list": [ALICE, BOB]},
        dirs=OWN_LIST_DIRS,
        before={ALICE: ALLOWED, BOB: ALLOWED, CAROL: DENIED},
        after={ALICE: DENIED, BOB: ALLOWED, CAROL: ALLOWED},
        changes={"/etc/vsftpd.conf": CONTENT, "{tmp}/user_list": CONTENT},
        saved_text={"{tmp}/user_list": [ALICE]},
    ),
    Scenario(
        "deny-debian-defaults",
        # No userlist keys at all: the engine names its own list and
        # turns it on.
        OFF + ["local_enable=YES"],
        edit=("deny", ALICE),
        accounts=[Account(ALICE), Account(BOB)],
        before={ALICE: ALLOWED, BOB: ALLOWED},
        after={ALICE: DENIED, BOB: ALLOWED},
        changes={
            "/etc/vsftpd.conf": CONTENT,
            "/etc/vsftpd.d": CREATED,
            "/etc/vsftpd.d/users.d": CREATED,
            "/etc/vsftpd.d/allowed_user_list.conf": CREATED,
            "/etc/vsftpd.chroot_list": CREATED,
        },
        saved_text={"/etc/vsftpd.d/allowed_user_list.conf": [ALICE]},
    ),
]


# Trees ----------------------------------------------------------------------


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
        payload = None
        if stat.S_ISREG(info.st_mode):
            kind = "file"
            with open(path, "rb") as source:
                payload = source.read()
        elif stat.S_ISDIR(info.st_mode):
            kind = "dir"
        elif stat.S_ISLNK(info.st_mode):
            kind = "link"
            payload = os.fsencode(os.readlink(path))
        else:
            kind = "other"
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
        if old is None:
            changed[path] = CREATED
        elif new is None:
            changed[path] = REMOVED
        else:
            what = []
            if (old.kind, old.payload) != (new.kind, new.payload):
                what.append(CONTENT)
            if (old.mode, old.uid, old.gid) != (new.mode, new.uid, new.gid):
                what.append(MODE)
            if what:
                changed[path] = "+".join(what)
    return changed


class EtcGuard(harness.EtcSnapshot):
    """Puts /etc back exactly as it was when the guard was made: the files a
    scenario writes (harness.prepare writes them through the guard), and
    whatever the edit made or changed anywhere below /etc."""

    def __init__(self) -> None:
        super().__init__()
        self.tree = capture(["/etc"])

    def restore(self) -> None:
        super().restore()
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


def remove(path: str) -> None:
    if os.path.isdir(path) and not os.path.islink(path):
        shutil.rmtree(path)
    elif os.path.lexists(path):
        os.unlink(path)


# The edit ------------------------------------------------------------------


def run_edit(program: str, edit: Tuple[str, ...], run_dir: str) -> Tuple[bool, str]:
    """editchild on the system root. The engine opens its Berkeley DB
    environment in /var/lib/ftpconfig (creating it) on every load: a mount
    namespace of the child's own puts an empty directory over /var/lib, so
    that nothing of it reaches the machine. HOME keeps the settings it may
    store in the run's directory."""
    var_lib = os.path.join(run_dir, "var-lib")
    home = os.path.join(run_dir, "edit-home")
    os.makedirs(var_lib, 0o755, exist_ok=True)
    os.makedirs(home, 0o700, exist_ok=True)
    env = dict(os.environ, HOME=home, XDG_CONFIG_HOME=os.path.join(home, ".config"))
    command = [
        "unshare",
        "-m",
        "--propagation",
        "private",
        "sh",
        "-c",
        'mount --bind "$0" /var/lib && exec "$@"',
        var_lib,
        program,
        "--root",
        "/",
        *edit,
    ]
    try:
        done = subprocess.run(command, capture_output=True, text=True, timeout=EDIT_TIMEOUT, env=env)
    except (OSError, subprocess.TimeoutExpired) as error:
        return False, f"editchild: {error}"
    output = (done.stdout.strip() + "\n" + done.stderr.strip()).strip()
    return done.returncode == 0 and done.stdout.strip() == "done saved", f"exit {done.returncode}: {output}"


# Sessions ------------------------------------------------------------------


def session(port: int, user: str) -> Tuple[Optional[ftplib.FTP], str]:
    """A logged-in session, or None and the server's refusal."""
    ftp, reply = harness.log_in(port, user, harness.password_of(user))
    return ftp, ("" if ftp is not None else f"login refused: {reply}")


def try_upload(port: int, user: str) -> Tuple[str, str, bytes]:
    """(STORED, "", what RETR gives back) or (REFUSED/NO_LOGIN, reply, b"")."""
    ftp, why = session(port, user)
    if ftp is None:
        return NO_LOGIN, why, b""
    try:
        try:
            ftp.storbinary(f"STOR {UPLOAD_NAME}", io.BytesIO(UPLOAD_DATA))
        except ftplib.error_perm as error:
            return REFUSED, str(error), b""
        back = io.BytesIO()
        try:
            ftp.retrbinary(f"RETR {UPLOAD_NAME}", back.write)
        except ftplib.error_perm as error:
            return STORED, f"download refused: {error}", b""
        return STORED, "", back.getvalue()
    except (ftplib.Error, EOFError, OSError) as error:
        raise SetupError(f"upload of {user}: {error!r}") from error
    finally:
        harness.close(ftp)


def first_listing(port: int, user: str) -> Tuple[Optional[List[str]], str]:
    ftp, why = session(port, user)
    if ftp is None:
        return None, why
    try:
        return ftp.nlst(), ""
    except ftplib.error_perm as error:
        return [], str(error)  # vsftpd answers an empty directory with 550
    except (ftplib.Error, EOFError, OSError) as error:
        raise SetupError(f"listing of {user}: {error!r}") from error
    finally:
        harness.close(ftp)


def greeting(port: int) -> str:
    """The whole of what a server that refuses to serve says to a client
    (the start's probe reads its first packet only)."""
    try:
        with socket.create_connection(("127.0.0.1", port), timeout=1) as probe:
            probe.settimeout(1)
            said = b""
            while len(said) < 1000:
                piece = probe.recv(1000)
                if not piece:
                    break
                said += piece
    except OSError:
        pass
    else:
        return said.decode("latin-1").strip()
    return ""


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


def check_server(phase: str, scenario: Scenario, tmp: str, port: int, checks: Checks) -> None:
    """Logins, uploads and listings of one phase ("before" or "after")."""
    logins = scenario.before if phase == "before" else scenario.after
    for user, expected in logins.items():
        got, reply = harness.try_login(port, user, harness.password_of(user))
        checks.check(f"{phase}:login:{user}", got == expected, f"expected {expected}, server {got}: {reply.strip()}")
        if got == ALLOWED:
            # A server that admits anybody would prove nothing.
            wrong, reply = harness.try_login(port, user, harness.password_of(user) + "x")
            checks.check(f"{phase}:wrong-password:{user}", wrong == DENIED, f"admitted: {reply.strip()}")
    for upload in scenario.uploads:
        expected = upload.before if phase == "before" else upload.after
        got, reply, back = try_upload(port, upload.user)
        on_disk = os.path.join(harness.fill(upload.directory, tmp), UPLOAD_NAME)
        name = f"{phase}:upload:{upload.user}"
        if not checks.check(name, got == expected, f"expected {expected}, got {got}: {reply}"):
            continue
        if got != STORED:
            checks.check(f"{phase}:no-file:{upload.user}", not os.path.lexists(on_disk), f"{on_disk} exists")
            continue
        checks.check(f"{phase}:download:{upload.user}", back == UPLOAD_DATA, f"RETR gave {back!r} {reply}")
        try:
            with open(on_disk, "rb") as source:
                content = source.read()
            owner = os.stat(on_disk).st_uid
        except OSError as error:
            checks.check(f"{phase}:on-disk:{upload.user}", False, str(error))
            continue
        uid = pwd.getpwnam(upload.user).pw_uid
        checks.check(
            f"{phase}:on-disk:{upload.user}",
            content == UPLOAD_DATA and owner == uid,
            f"{on_disk}: {content!r}, owner {owner} (expected {uid})",
        )
    for listing in scenario.listings:
        expected = listing.before if phase == "before" else listing.after
        names, why = first_listing(port, listing.user)
        checks.check(
            f"{phase}:listing:{listing.user}",
            names is not None and expected in [os.path.basename(n) for n in names],
            f"{expected} not in {names} {why}",
        )


def check_saved(scenario: Scenario, tmp: str, before: Dict[str, Entry], after: Dict[str, Entry], checks: Checks):
    declared = {harness.fill(path, tmp): what for path, what in scenario.changes.items()}
    found = differences(before, after)
    for path in sorted(declared.keys() | found.keys()):
        checks.check(
            f"files:{path}",
            declared.get(path) == found.get(path),
            f"expected {declared.get(path) or 'untouched'}, found {found.get(path) or 'untouched'}",
        )
    for path, lines in scenario.saved_text.items():
        path = harness.fill(path, tmp)
        entry = after.get(path)
        expected = "".join(harness.fill(line, tmp) + "\n" for line in lines)
        got = entry.payload.decode("utf-8", "replace") if entry and entry.payload is not None else None
        checks.check(f"text:{path}", got == expected, f"expected {expected!r}, saved {got!r}")


# One scenario ----------------------------------------------------------------


def run_scenario(scenario: Scenario, program: str, base: str) -> bool:
    tmp = os.path.join(base, "root")  # what the scenario sets up: compared
    run_dir = os.path.join(base, "run")  # the harness's own: not compared
    os.makedirs(tmp, 0o755)
    os.makedirs(run_dir, 0o755)
    guard = EtcGuard()
    port = harness.free_port()
    server = harness.Vsftpd(port, os.path.join(run_dir, "vsftpd.log"))
    checks = Checks()
    edit = tuple(harness.fill(part, tmp) for part in scenario.edit)
    edit_output = ""
    try:
        harness.prepare(scenario, tmp, port, guard)
        server.start()
        try:
            check_server("before", scenario, tmp, port, checks)
        finally:
            server.stop()
        if checks.failed:
            raise SetupError("the starting point is not as the scenario says: " + describe(checks.failed, tmp))

        tracked = ["/etc", tmp]
        top_modes = {path: os.lstat(path).st_mode for path in ("/", "/tmp", base)}
        before = capture(tracked)
        done, edit_output = run_edit(program, edit, run_dir)
        after = capture(tracked)
        for path, mode in top_modes.items():
            if os.lstat(path).st_mode != mode:
                os.chmod(path, stat.S_IMODE(mode))
                raise SetupError(f"the edit changed the mode of {path} (put back)")
        checks.check("edit", done, edit_output)
        check_saved(scenario, tmp, before, after, checks)

        try:
            server.start()
        except SetupError as error:
            checks.check("after:start", False, f"{error} {greeting(port)}".strip())
        else:
            try:
                check_server("after", scenario, tmp, port, checks)
            finally:
                server.stop()
    except (SetupError, OSError) as error:
        print(f"{scenario.name:28} ERROR {error}")
        if edit_output:
            print(f"{'':28} editchild: {edit_output}")
        return False
    finally:
        server.stop()
        guard.restore()

    failed = set(checks.failed)
    if scenario.known_fault:
        why, expected = scenario.known_fault
        ok = failed == expected
        if ok:
            outcome = f"ok, known engine fault: {why} [{describe(checks.failed, tmp)}]"
        elif not failed:
            outcome = f"FAIL: passes now; remove the known fault ({why})"
        else:
            outcome = f"FAIL: expected to fail {sorted(expected)}, failed: {describe(checks.failed, tmp)}"
    else:
        ok = not failed
        outcome = "ok" if ok else "FAIL: " + describe(checks.failed, tmp)
    print(f"{scenario.name:28} {' '.join(edit).replace(tmp, '{tmp}'):40} {checks.count:3} checks  {outcome}")
    if not ok and edit_output:
        print(f"{'':28} editchild: {edit_output}")
    return ok


def describe(failed: Dict[str, str], tmp: str) -> str:
    text = "; ".join(f"{name}: {detail}" for name, detail in sorted(failed.items()))
    return text.replace(tmp, "{tmp}")


def check_table() -> None:
    """Catches slips in the table itself before anything runs."""
    harness.check_names_and_keys(SCENARIOS)
    for scenario in SCENARIOS:
        where = f"scenario {scenario.name}"
        conf = {harness.key_of(line): line.split("=", 1)[1] for line in scenario.conf}
        if scenario.edit[0] not in ("grant", "deny", "rights", "directory"):
            raise SystemExit(f"{where}: unknown edit {scenario.edit[0]}")
        # The engine checks the rights against the user's root and offers
        # to add the missing bits; the root of a user who is not chrooted
        # is "/", and the machine's "/" must never be offered.
        if scenario.edit[0] == "rights" and conf.get("chroot_local_user", "").lower() != "yes":
            raise SystemExit(f"{where}: a rights edit needs chroot_local_user=YES")
        if not scenario.changes:
            raise SystemExit(f"{where}: an edit that changes no file proves nothing")
        for what in scenario.changes.values():
            if set(what.split("+")) - {CONTENT, MODE, CREATED, REMOVED}:
                raise SystemExit(f"{where}: unknown change {what!r}")
        for phase in (scenario.before, scenario.after):
            if set(phase.values()) - {ALLOWED, DENIED}:
                raise SystemExit(f"{where}: a login is neither {ALLOWED} nor {DENIED}")
        if scenario.before == scenario.after and not scenario.uploads and not scenario.listings:
            raise SystemExit(f"{where}: nothing the server does is to change")
        if scenario.known_fault and not scenario.known_fault[1]:
            raise SystemExit(f"{where}: a known fault names the checks it fails")


def main() -> int:
    return harness.main(
        script="saves.py",
        doc=__doc__,
        option="--edit",
        program_help="the editchild program",
        tools=(harness.VSFTPD, harness.CHPASSWD, "unshare", "mount"),
        table=SCENARIOS,
        check_table=check_table,
        prefix="ftpconfig-saves-",
        run_one=run_scenario,
    )


if __name__ == "__main__":
    sys.exit(main())

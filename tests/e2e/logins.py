"""The run of a table of logins, shared by verdicts.py and forecast.py: for
every scenario, write the files, start vsftpd, log every user in, stop the
server, and ask ftpconfig-report (JSON and text table) about the same files.
What a table may say is written at the head of verdicts.toml."""

import json
import os
from typing import Dict, List, Optional, Tuple

import harness
from harness import ALLOWED, ANONYMOUS, ANONYMOUS_ROW, CONF, DENIED, Scenario, SetupError

UNKNOWN = "unknown"
SEVERITIES = ("error", "warning", "info")
# The column of the text table that shows the forecast.
TABLE_COLUMN = "SERVER"


def split(expected: str) -> Tuple[str, str]:
    """"denied: piece" -> ("denied", "piece")."""
    status, _, piece = expected.partition(":")
    return status.strip(), piece.strip()


def table_column(text: str, column: str) -> Dict[str, str]:
    """user -> the value of one column of the text table, cut at the
    offsets of the header line (names hold blanks: "Anonymous users").
    The server's findings come in front of the table."""
    lines = text.splitlines()
    heads = [i for i, line in enumerate(lines) if line.startswith("USER ")]
    if not heads:
        return {}
    header, rows = lines[heads[0]], lines[heads[0] + 1 :]
    starts = [i for i, c in enumerate(header) if c != " " and (i == 0 or header[i - 1] == " ")]
    titles = [header[a:b].strip() for a, b in zip(starts, starts[1:] + [len(header)])]
    if column not in titles:
        return {}
    index = titles.index(column)
    end = starts[index + 1] if index + 1 < len(starts) else None
    return {line[: starts[1]].strip(): line[starts[index] : end].strip() for line in rows}


def finding_problems(findings, where: str) -> List[str]:
    """The shape every finding must have."""
    if not isinstance(findings, list):
        return [f"{where}: findings is not a list"]
    problems = []
    for finding in findings:
        if not isinstance(finding, dict):
            problems.append(f"{where}: a finding is not an object: {finding!r}")
        elif finding.get("severity") not in SEVERITIES or not finding.get("message"):
            problems.append(f"{where}: finding without a severity or a message: {finding!r}")
        elif not isinstance(finding.get("file"), str) or not isinstance(finding.get("line"), int):
            problems.append(f"{where}: finding without a file and a line number: {finding!r}")
    return problems


def describe(findings) -> str:
    if not isinstance(findings, list):
        return ""
    shown = [f for f in findings if isinstance(f, dict)]
    return "; ".join(f"{f.get('severity')} {f.get('file')}:{f.get('line')} {f.get('message')}" for f in shown)


# A finding of the forecast about what a TLS client gets begins so, and goes
# on with "logs in", "is refused" or (unknown) anything else.
TLS_FINDING = "a TLS client (AUTH TLS) "


def tls_forecast(findings) -> str:
    """What the forecast says a TLS client gets: allowed, denied, unknown, or
    "missing"."""
    for finding in findings if isinstance(findings, list) else []:
        message = finding.get("message", "") if isinstance(finding, dict) else ""
        if message.startswith(TLS_FINDING):
            rest = message[len(TLS_FINDING) :]
            return ALLOWED if rest.startswith("logs in") else DENIED if rest.startswith("is refused") else UNKNOWN
    return "missing"


def log_in_everybody(scenario: Scenario, port: int) -> Tuple[Dict[str, Tuple[str, str]], List[str]]:
    """Each user's login with the right password (and, for a user that says
    "tls", also as a TLS client, under "USER/tls"), and what went wrong with
    the wrong ones."""
    results: Dict[str, Tuple[str, str]] = {}
    problems: List[str] = []
    for user, expect in scenario.users.items():
        name, password = harness.credentials(scenario, user)
        if "tls" in expect:
            results[user + "/tls"] = harness.try_login(port, name, password, greeting_may_refuse=True, tls=True)
        results[user] = harness.try_login(port, name, password, greeting_may_refuse=True)
        if results[user][0] != ALLOWED or user == ANONYMOUS:
            continue
        wrong, reply = harness.try_login(port, name, password + "x", greeting_may_refuse=True)
        if wrong != (ALLOWED if expect.get("any_password") else DENIED):
            problems.append(f"{user}: the server answered {wrong} to a wrong password ({reply.strip()})")
    return results, problems


def check_server(scenario: Scenario, started: bool, log: str, results, document: dict, blamed: int):
    """(problems, the server's findings, known faults seen): is the scenario
    what it claims to be, and does "server" of the report say so?"""
    fails = scenario.fails
    problems = []
    if started == (fails == "start"):
        problems.append(f"the server {'started' if started else 'did not start: ' + log}, unlike the scenario says")
    for user, (result, reply) in results.items():
        if fails == "connect" and (result != DENIED or "OOPS" not in reply):
            problems.append(f"{user}: the connection did not fail ({reply.strip()})")
    server = document.get("server")
    if not isinstance(server, dict) or not isinstance(server.get("fails"), bool):
        return problems + [f'the report has no "server" object with a boolean "fails": {server!r}'], [], 0
    findings = server.get("findings")
    problems += finding_problems(findings, "server")
    findings = [f for f in findings if isinstance(f, dict)] if isinstance(findings, list) else []
    bug = scenario.server_bug
    if bug and server["fails"] == bool(fails):
        problems.append(f"forecast-bug {bug} no longer happens: remove the mark")
    elif not bug and server["fails"] != bool(fails):
        problems.append(f"server.fails is {server['fails']}, but the server " + ("fails" if fails else "works"))
    if fails and not any(f.get("severity") == "error" for f in findings):
        problems.append("the server fails, but server.findings holds no error")
    named = [(f.get("file"), f.get("line")) for f in findings if f.get("severity") == "error"]
    if blamed and (CONF, blamed) not in named:
        problems.append(f"no error finding names {CONF}:{blamed} ({scenario.blame!r})")
    outcome = "FAIL" if problems else f"FORECAST-BUG {bug}" if bug else "ok"
    detail = f" [{describe(findings)}]" if findings else ""
    print(f"{scenario.name:36} {'(server)':10} actual={'fails' if fails else 'works':8} {outcome}{detail}")
    return problems, findings, 1 if bug and not problems else 0


def check_user(
    scenario: Scenario, user: str, row: Optional[dict], result, server_findings, tls_result=None
) -> Tuple[bool, int]:
    """(passed, known faults seen) for one user: the server, the forecast
    and, where the table gives it, the verdict; for a user that says "tls",
    the TLS client's login and its finding too."""
    expect = scenario.users[user]
    actual, reply = result
    server, piece = split(expect["server"])
    notes: List[str] = []
    if actual != server:
        notes.append(f"the server was expected to say {server}")
    elif actual == DENIED and piece not in reply:
        notes.append(f"the server refused for another reason than {piece!r}")
    forecast = row.get("forecast") if row else None
    status, findings = "missing", []
    if not isinstance(forecast, dict):
        notes.append("no forecast in the report" if row else "no row in the report")
    else:
        status, findings = forecast.get("status"), forecast.get("findings", [])
        notes += finding_problems(findings, "findings")
        if status not in (ALLOWED, DENIED, UNKNOWN) or (status == DENIED and not findings and not server_findings):
            notes.append(f"forecast status {status!r} without a finding")
    tls = ""
    if tls_result:
        wanted, tls_piece = split(expect["tls"])
        said = tls_forecast(findings)
        if tls_result[0] != wanted:
            notes.append(f"the server was expected to say {wanted} to a TLS client")
        elif wanted == DENIED and tls_piece not in tls_result[1]:
            notes.append(f"the server refused a TLS client for another reason than {tls_piece!r}")
        elif said != tls_result[0]:
            notes.append(f"the forecast says {said} for a TLS client, the server {tls_result[0]}")
        tls = f" tls={tls_result[0]}"
        if tls_result[0] == DENIED:
            tls += f" [{tls_result[1].strip()}]"
    mark, why = split(expect.get("forecast", ""))
    bugs = 0
    outcome = "ok"
    if mark == "bug" and status == actual:
        notes.append(f"forecast-bug {why} no longer happens: remove the mark")
    elif mark == "bug":
        outcome, bugs = f"FORECAST-BUG {why}", 1
    elif mark == UNKNOWN and status == UNKNOWN:
        outcome = f"ok, cannot judge: {why}"
    elif status != actual:
        notes.append(f"the forecast says {status}, the server {actual}")
    verdict = ""
    if "report" in expect and row:
        wanted, engine = split(expect["report"])
        verdict, message = row.get("status"), row.get("message", "")
        virtual = any(user in users for users in scenario.dbs.values())
        kind = "anonymous" if user == ANONYMOUS else "virtual" if virtual else "local"
        if row.get("kind") != kind:
            notes.append(f"report kind {row.get('kind')}, expected {kind}")
        if verdict != wanted:
            notes.append(f"report expected {wanted}")
        elif engine not in message or bool(engine) != bool(message):
            notes.append(f"the report's reason {message!r} is not {engine!r}")
        elif expect.get("reason"):
            outcome += f", declared: {expect['reason']}"
        verdict = f" report={verdict:8}"
    if notes:
        outcome = "FAIL: " + "; ".join(notes)
    detail = f" [server: {reply.strip()}]" if actual == DENIED else ""
    detail += f" [forecast: {describe(findings)}]" if findings else ""
    detail += f" [engine: {row.get('message')}]" if row and row.get("message") and verdict else ""
    print(f"{scenario.name:36} {user:10} server={actual:8} forecast={status!s:8}{verdict}{tls} {outcome}{detail}")
    return not notes, bugs


def run_scenario(scenario: Scenario, report: str, tmp: str) -> Tuple[bool, int]:
    """(passed, logins with a known forecast fault)."""
    port = harness.free_port()
    server = harness.Vsftpd(port, os.path.join(tmp, "vsftpd.log"), may_fail=True)
    try:
        harness.prepare(scenario, tmp, port)
        try:
            started = server.start()
            results, problems = log_in_everybody(scenario, port) if started else ({}, [])
        finally:
            server.stop()
        results = results or {
            name: (DENIED, f"vsftpd did not start: {server.log()}")
            for user in scenario.users
            for name in (user, user + "/tls")
        }
        log = server.log()
        done = harness.run_report(report, tmp, "--json")
        table = harness.run_report(report, tmp).stdout if done.returncode == 0 else ""
        document = json.loads(done.stdout) if done.returncode == 0 else None
        conf = harness.conf_text(scenario, tmp, port).split("\n")
        blame = harness.fill(scenario.blame, tmp, port)
        blamed = conf.index(blame) + 1 if blame else 0
    except (SetupError, OSError, ValueError) as error:
        print(f"{scenario.name}: ERROR {error}")
        return False, 0
    finally:
        server.stop()

    refuses = scenario.report_refuses
    failure = (done.stdout + done.stderr).strip()
    passed, bugs = True, 0
    if refuses:
        if document is not None or refuses not in failure:
            problems.append(f"the report was expected to end with {refuses!r}: {failure or 'it ran'}")
        for user in scenario.users:
            actual, reply = results[user]
            server_says, piece = split(scenario.users[user]["server"])
            fine = actual == server_says and (actual == ALLOWED or piece in reply)
            passed &= fine
            outcome = "ok, the program ends first" if fine else f"FAIL: the server was expected to say {server_says}"
            print(f"{scenario.name:36} {user:10} server={actual:8} forecast=none {outcome} [server: {reply.strip()}]")
    elif document is None:
        problems.append(f"ftpconfig-report failed: {failure}")
    else:
        more, server_findings, bugs = check_server(scenario, started, log, results, document, blamed)
        problems += more
        rows = {row.get("name"): row for row in document.get("users", []) if isinstance(row, dict)}
        shown = table_column(table, TABLE_COLUMN)
        for user in scenario.users:
            name = ANONYMOUS_ROW if user == ANONYMOUS else user
            status = ((rows.get(name) or {}).get("forecast") or {}).get("status")
            if shown.get(name) != status:
                problems.append(f"{user}: the text table shows {shown.get(name)!r}, the JSON forecast {status!r}")
            fine, seen = check_user(
                scenario,
                user,
                rows.get(name),
                results[user],
                server_findings,
                results.get(user + "/tls") if "tls" in scenario.users[user] else None,
            )
            passed &= fine
            bugs += seen
    for problem in problems:
        print(f"{scenario.name}: FAIL {problem}")
    return passed and not problems, bugs


def check_table(table: List[Scenario]) -> None:
    """Catches slips in the table itself before anything runs."""
    for scenario in table:
        fails = scenario.fails
        if fails not in ("", "start", "connect"):
            raise SystemExit(f"scenario {scenario.name}: unknown kind of failure {fails!r}")
        if scenario.blame not in [""] + scenario.conf:
            raise SystemExit(f"scenario {scenario.name}: the blamed line is not one of its lines")
        for user, expect in scenario.users.items():
            where = f"scenario {scenario.name}, user {user}"
            server, piece = split(expect.get("server", ""))
            if server not in (ALLOWED, DENIED) or (fails and server != DENIED):
                raise SystemExit(f"{where}: the server says {ALLOWED} or {DENIED}, and only {DENIED} when it fails")
            if server == DENIED and not piece:
                raise SystemExit(f"{where}: a refusal must name the server's answer")
            if "tls" in expect and not scenario.certificate:
                raise SystemExit(f"{where}: a TLS client needs the scenario's certificate")
            if split(expect.get("tls", ALLOWED))[0] not in (ALLOWED, DENIED):
                raise SystemExit(f"{where}: a TLS client is {ALLOWED} or {DENIED}")
            if split(expect.get("forecast", ""))[0] not in ("", "bug", UNKNOWN):
                raise SystemExit(f"{where}: the forecast is either unknown or a known bug")
            if "report" not in expect:
                continue
            report, engine = split(expect["report"])
            if report not in (ALLOWED, DENIED) or (report == DENIED and not engine):
                raise SystemExit(f"{where}: a verdict is {ALLOWED} or {DENIED}, a refusal with the engine's reason")
            if (report != server) != bool(expect.get("reason")):
                raise SystemExit(f"{where}: a difference needs a reason id, and a reason id a difference")


def main(script: str, doc: str) -> int:
    bugs = 0

    def run_one(scenario: Scenario, report: str, tmp: str) -> bool:
        nonlocal bugs
        ok, seen = run_scenario(scenario, report, tmp)
        bugs += seen
        return ok

    return harness.main(
        script,
        doc,
        "--report",
        (harness.VSFTPD, harness.DB_LOAD, harness.CHPASSWD),
        {"fails": "", "blame": "", "server_bug": "", "report_refuses": ""},
        check_table,
        run_one,
        summary=lambda: f"; {bugs} with a known forecast bug (FORECAST-BUG)",
    )

#include "PamForecast.h"

#include "accounts/AccountStore.h"
#include "accounts/VirtualUserDb.h"

#include <QFile>
#include <QFileInfo>

#include <fstream>

namespace {

enum class Action { Ignore, Ok, Done, Bad, Die, Reset, Jump };

struct ParsedAction
{
    Action action = Action::Bad;
    int jump = 0;
};

const char *const CodeNames[] = {"success",          "auth_err",    "user_unknown", "authinfo_unavail", "acct_expired",
                                 "new_authtok_reqd", "perm_denied", "ignore",       "service_err"};

ParsedAction parseAction(const QByteArray &text)
{
    if (text == "ignore")
        return {Action::Ignore, 0};
    if (text == "ok")
        return {Action::Ok, 0};
    if (text == "done")
        return {Action::Done, 0};
    if (text == "bad")
        return {Action::Bad, 0};
    if (text == "die")
        return {Action::Die, 0};
    if (text == "reset")
        return {Action::Reset, 0};
    bool number = false;
    const int jump = text.toInt(&number);
    if (number && jump > 0)
        return {Action::Jump, jump};
    return {Action::Bad, 0};
}

QHash<QByteArray, QByteArray> simpleControl(const QByteArray &control)
{
    if (control == "required")
        return {{"success", "ok"}, {"new_authtok_reqd", "ok"}, {"ignore", "ignore"}, {"default", "bad"}};
    if (control == "requisite")
        return {{"success", "ok"}, {"new_authtok_reqd", "ok"}, {"ignore", "ignore"}, {"default", "die"}};
    if (control == "sufficient")
        return {{"success", "done"}, {"new_authtok_reqd", "done"}, {"default", "ignore"}};
    if (control == "optional")
        return {{"success", "ok"}, {"new_authtok_reqd", "ok"}, {"default", "ignore"}};
    return {};
}

QByteArray baseName(const QByteArray &module)
{
    return module.mid(module.lastIndexOf('/') + 1);
}

QByteArray argument(const QList<QByteArray> &args, const QByteArray &name)
{
    // Compared in place: this runs for every user and line.
    for (const QByteArray &arg : args) {
        if (arg.size() > name.size() && arg.startsWith(name) && arg.at(name.size()) == '=')
            return arg.mid(name.size() + 1);
    }
    return {};
}

struct State
{
    enum Impression { Undecided, Positive, Negative } impression = Undecided;
    PamForecast::Code status = PamForecast::AuthErr;
    int decidingLine = -1; // index into the stack
    QString reason;
    QString passedOver; // the last refusal a control ignored, to explain what follows it
};

} // namespace

PamForecast::PamForecast(const RootDirectory &root, const AccountStore &accounts, const QString &service,
                         const ConfigFile &serviceFile, QDate today)
    : m_root(root)
    , m_accounts(accounts)
    , m_service(service)
    , m_serviceFile(serviceFile)
    , m_today(today)
{
}

QString PamForecast::resolved(const QString &path) const
{
    return m_root.resolve(path);
}

const ConfigFile *PamForecast::includedFile(const QString &name)
{
    const QString path = name.startsWith(QLatin1Char('/')) ? name : QStringLiteral("/etc/pam.d/") + name;
    auto it = m_included.find(path);
    if (it == m_included.end()) {
        std::unique_ptr<ConfigFile> file;
        std::ifstream in(QFile::encodeName(resolved(path)).toStdString(), std::ios::in | std::ios::binary);
        if (in.is_open() && QFileInfo(resolved(path)).isFile()) {
            file = std::make_unique<ConfigFile>(SyntaxMode::TokenLine);
            file->parse(in);
        }
        it = m_included.emplace(path, std::move(file)).first;
    }
    return it->second.get();
}

void PamForecast::expand(const ConfigFile &file, const QString &name, const QByteArray &facility, QList<Line> &out,
                         int depth)
{
    if (depth > 16)
        return;
    for (const auto &element : file.elements) {
        const int lineNumber = element->yOffset() + 1;
        if (element->type() == ElementType::Include) {
            const auto include = std::static_pointer_cast<ConfigElementInclude>(element);
            const QString target = QString::fromStdString(include->argument).trimmed();
            if (const ConfigFile *included = includedFile(target))
                expand(*included, QStringLiteral("/etc/pam.d/") + target, facility, out, depth + 1);
            continue;
        }
        if (element->type() != ElementType::Expr)
            continue;
        const auto expr = std::static_pointer_cast<ConfigElementExpr>(element);
        QList<QByteArray> tokens;
        for (const auto &token : expr->tokens)
            tokens << QByteArray::fromStdString(token.text);
        if (tokens.size() < 3)
            continue;
        QByteArray type = tokens.takeFirst();
        if (type.startsWith('-'))
            type = type.mid(1);
        if (type != facility)
            continue;
        Line line;
        line.facility = facility;
        line.file = name;
        line.line = lineNumber;
        QByteArray control = tokens.takeFirst();
        if (control.startsWith('[')) {
            QByteArray bracket = control;
            while (!bracket.endsWith(']') && !tokens.isEmpty())
                bracket += ' ' + tokens.takeFirst();
            for (const QByteArray &pair : bracket.mid(1, bracket.size() - 2).simplified().split(' ')) {
                const int equals = pair.indexOf('=');
                if (equals > 0)
                    line.actions.insert(pair.left(equals), pair.mid(equals + 1));
            }
        } else if (control == "include" || control == "substack") {
            if (!tokens.isEmpty()) {
                const QString target = QString::fromUtf8(tokens.first());
                if (const ConfigFile *included = includedFile(target))
                    expand(*included, QStringLiteral("/etc/pam.d/") + target, facility, out, depth + 1);
            }
            continue;
        } else {
            line.actions = simpleControl(control);
            if (line.actions.isEmpty())
                line.actions.insert("default", "bad");
        }
        if (tokens.isEmpty())
            continue;
        line.module = baseName(tokens.takeFirst());
        line.args = tokens;
        out.append(line);
    }
}

QList<PamForecast::Line> PamForecast::stack(const QByteArray &facility)
{
    auto it = m_stacks.find(facility);
    if (it == m_stacks.end()) {
        QList<Line> lines;
        expand(m_serviceFile, QStringLiteral("/etc/pam.d/") + m_service, facility, lines, 0);
        for (Line &line : lines) {
            for (int code = 0; code < CodeCount; ++code) {
                const ParsedAction action
                    = parseAction(line.actions.value(CodeNames[code], line.actions.value("default", "bad")));
                line.parsedActions[static_cast<size_t>(code)] = {static_cast<int>(action.action), action.jump};
            }
        }
        it = m_stacks.emplace(facility, lines).first;
    }
    return it->second;
}

std::optional<QList<QByteArray>> PamForecast::shadowFields(const QByteArray &user)
{
    if (!m_shadow) {
        m_shadow.emplace();
        QFile file(resolved(QStringLiteral("/etc/shadow")));
        if (file.open(QIODevice::ReadOnly)) {
            for (const QByteArray &line : file.readAll().split('\n')) {
                const QList<QByteArray> fields = line.split(':');
                if (fields.size() >= 2 && !m_shadow->contains(fields[0]))
                    m_shadow->insert(fields[0], fields);
            }
        }
    }
    const auto it = m_shadow->find(user);
    if (it == m_shadow->end())
        return std::nullopt;
    return *it;
}

PamForecast::ModuleAnswer PamForecast::runUnix(const Line &line, const QByteArray &user)
{
    AccountRecord account;
    if (!m_accounts.getUserInfo(user, account))
        return {UserUnknown, QStringLiteral("there is no system account %1").arg(QString::fromUtf8(user))};
    const auto shadow = shadowFields(user);
    if (line.facility == "auth") {
        QByteArray hash = account.password;
        QString where = QStringLiteral("/etc/passwd");
        if (hash == "x") {
            if (!shadow)
                return {AuthErr, QStringLiteral("the password is kept in /etc/shadow, which has no line for it")};
            hash = shadow->value(1);
            where = QStringLiteral("/etc/shadow");
        }
        if (hash.isEmpty()) {
            if (line.args.contains("nullok"))
                return {Success, QStringLiteral("the password is empty and nullok admits it")};
            return {AuthErr,
                    QStringLiteral("the password in %1 is empty, and without nullok pam_unix refuses it").arg(where)};
        }
        if (hash.startsWith('!') || hash.startsWith('*'))
            return {AuthErr,
                    QStringLiteral("the password is locked (\"%1\" in %2)").arg(QString(QLatin1Char(hash[0])), where)};
        return {Success, QString()};
    }
    // account
    if (!shadow)
        return {Success, QString()};
    const qint64 today = QDate(1970, 1, 1).daysTo(m_today);
    const auto number = [&](int field) {
        bool ok = false;
        const qint64 value = shadow->value(field).toLongLong(&ok);
        return ok ? value : -1;
    };
    const qint64 lastChange = number(2);
    const qint64 maxDays = number(4);
    const qint64 inactive = number(6);
    const qint64 expire = number(7);
    if (expire != -1 && today >= expire) {
        return {AcctExpired,
                QStringLiteral("the account expired on %1 (/etc/shadow)")
                    .arg(QDate(1970, 1, 1).addDays(expire).toString(Qt::ISODate))};
    }
    if (lastChange == 0)
        return {NewAuthtokReqd, QStringLiteral("the password must be changed first (last change 0 in /etc/shadow)")};
    if (maxDays != -1 && lastChange != -1 && today - lastChange > maxDays) {
        if (inactive != -1 && today - lastChange > maxDays + inactive)
            return {AcctExpired, QStringLiteral("the password expired and the account is inactive (/etc/shadow)")};
        return {NewAuthtokReqd, QStringLiteral("the password expired and must be changed first (/etc/shadow)")};
    }
    return {Success, QString()};
}

PamForecast::ModuleAnswer PamForecast::runListfile(const Line &line, const QByteArray &user)
{
    const QByteArray item = argument(line.args, "item");
    const QByteArray sense = argument(line.args, "sense");
    const QByteArray file = argument(line.args, "file");
    const QByteArray onerr = argument(line.args, "onerr");
    const QByteArray apply = argument(line.args, "apply");
    const auto onError = [&](const QString &why) -> ModuleAnswer {
        if (onerr == "succeed")
            return {Success, why + QStringLiteral(", and onerr=succeed lets everybody through")};
        return {ServiceErr, why + QStringLiteral(", and onerr=fail refuses")};
    };
    AccountRecord account;
    const bool known = m_accounts.getUserInfo(user, account);
    if (!apply.isEmpty()) {
        const bool applies
            = apply.startsWith('@') ? known && m_accounts.isUserInGroup(user, apply.mid(1)) : apply == user;
        if (!applies)
            return {Ignore, QString()};
    }
    QList<QByteArray> candidates;
    if (item == "user") {
        candidates << user;
    } else if (item == "group") {
        if (!known)
            return onError(QStringLiteral("the groups of %1 are unknown").arg(QString::fromUtf8(user)));
        candidates = m_accounts.userGroups(user);
    } else if (item == "shell") {
        if (!known)
            return onError(QStringLiteral("the shell of %1 is unknown").arg(QString::fromUtf8(user)));
        candidates << account.shell;
    } else {
        return {
            std::nullopt,
            QStringLiteral("pam_listfile with item=%1, which depends on the connection").arg(QString::fromUtf8(item))};
    }
    if (sense != "allow" && sense != "deny")
        return onError(QStringLiteral("sense=%1 is neither allow nor deny").arg(QString::fromUtf8(sense)));
    const QHash<QByteArray, int> *entries = listEntries(file);
    if (!entries)
        return onError(QStringLiteral("the list %1 cannot be read").arg(QString::fromUtf8(file)));
    // The entry named is the first line of the file that matches a
    // candidate, as a reading from the top finds it.
    bool listed = false;
    QByteArray found;
    int foundLine = 0;
    for (const QByteArray &candidate : candidates) {
        const auto it = entries->find(candidate);
        if (it != entries->end() && (!listed || *it < foundLine)) {
            listed = true;
            found = candidate;
            foundLine = *it;
        }
    }
    const QString shownFile = QString::fromUtf8(file);
    if (sense == "allow") {
        if (listed)
            return {Success, QString()};
        return {AuthErr,
                QStringLiteral("%1 is not listed in %2 (sense=allow)")
                    .arg(QString::fromUtf8(candidates.value(0)), shownFile)};
    }
    if (listed)
        return {AuthErr, QStringLiteral("%1 is listed in %2 (sense=deny)").arg(QString::fromUtf8(found), shownFile)};
    return {Success, QString()};
}

const QHash<QByteArray, int> *PamForecast::listEntries(const QByteArray &file)
{
    auto it = m_lists.find(file);
    if (it == m_lists.end()) {
        std::optional<QHash<QByteArray, int>> entries;
        QFile list(resolved(QString::fromUtf8(file)));
        if (!file.isEmpty() && QFileInfo(list).isFile() && list.open(QIODevice::ReadOnly)) {
            entries.emplace();
            int line = 0;
            for (QByteArray entry : list.readAll().split('\n')) {
                ++line;
                if (entry.endsWith('\r'))
                    entry.chop(1);
                if (!entry.isEmpty() && !entries->contains(entry))
                    entries->insert(entry, line);
            }
        }
        it = m_lists.emplace(file, std::move(entries)).first;
    }
    return it->second ? &*it->second : nullptr;
}

const QSet<QByteArray> *PamForecast::userdbKeys(const QByteArray &path)
{
    // The database the account store has read, untouched since, is the one
    // pam_userdb would open: its names are not read a second time.
    const VirtualUserDb *stored = m_accounts.database();
    if (stored && stored->isOpen() && stored->filePath() == path && !m_accounts.virtualUsersChanged())
        return &m_accounts.virtualUserKeys();
    auto it = m_userdbs.find(path);
    if (it == m_userdbs.end()) {
        std::optional<QSet<QByteArray>> keys;
        if (QFileInfo(resolved(QString::fromUtf8(path))).isFile()) {
            try {
                VirtualUserDb db(path, m_root, VirtualUserDb::Access::ReadOnly);
                if (db.isOpen()) {
                    keys.emplace();
                    for (const auto &record : db.readAll())
                        keys->insert(record.first);
                }
            } catch (const std::exception &) {
                keys.reset();
            }
        }
        it = m_userdbs.emplace(path, keys).first;
    }
    return it->second ? &*it->second : nullptr;
}

PamForecast::ModuleAnswer PamForecast::runUserdb(const Line &line, const QByteArray &user)
{
    const QByteArray db = argument(line.args, "db");
    if (db.isEmpty())
        return {ServiceErr, QStringLiteral("pam_userdb has no db= argument")};
    // pam_userdb always appends ".db": "db=/x/users.db" opens /x/users.db.db.
    const QByteArray file = db + ".db";
    const QSet<QByteArray> *keys = userdbKeys(file);
    if (!keys) {
        return {AuthinfoUnavail,
                QStringLiteral("pam_userdb cannot open %1 (db=%2 with \".db\" appended)")
                    .arg(QString::fromUtf8(file), QString::fromUtf8(db))};
    }
    if (!keys->contains(user))
        return {UserUnknown, QStringLiteral("%1 is not in %2").arg(QString::fromUtf8(user), QString::fromUtf8(file))};
    return {Success, QString()};
}

PamForecast::ModuleAnswer PamForecast::run(const Line &line, const QByteArray &user)
{
    if (line.module == "pam_permit.so")
        return {Success, QString()};
    if (line.module == "pam_deny.so")
        return {AuthErr, QStringLiteral("pam_deny refuses everybody")};
    if (line.module == "pam_unix.so")
        return runUnix(line, user);
    if (line.module == "pam_listfile.so")
        return runListfile(line, user);
    if (line.module == "pam_userdb.so")
        return runUserdb(line, user);
    if (line.module == "pam_shells.so") {
        AccountRecord account;
        if (!m_accounts.getUserInfo(user, account))
            return {AuthErr,
                    QStringLiteral("there is no system account %1 to take a shell from").arg(QString::fromUtf8(user))};
        if (!m_shells) {
            QFile shells(resolved(QStringLiteral("/etc/shells")));
            if (shells.open(QIODevice::ReadOnly)) {
                m_shells.emplace();
                for (const QByteArray &entry : shells.readAll().split('\n')) {
                    if (!entry.trimmed().isEmpty() && !entry.startsWith('#'))
                        m_shells->insert(entry.trimmed());
                }
            }
        }
        if (!m_shells)
            return {AuthErr, QStringLiteral("/etc/shells cannot be read")};
        if (!m_shells->contains(account.shell)) {
            return {AuthErr,
                    QStringLiteral("the shell %1 is not listed in /etc/shells").arg(QString::fromUtf8(account.shell))};
        }
        return {Success, QString()};
    }
    if (line.module == "pam_nologin.so") {
        // file= names the one file to look for instead of the usual ones.
        const QByteArray named = argument(line.args, "file");
        const QList<QByteArray> files
            = named.isEmpty() ? QList<QByteArray>{"/var/run/nologin", "/etc/nologin"} : QList<QByteArray>{named};
        for (const QByteArray &path : files) {
            if (QFileInfo::exists(resolved(QString::fromUtf8(path)))) {
                AccountRecord account;
                if (m_accounts.getUserInfo(user, account) && account.uid == 0)
                    return {Ignore, QString()};
                return {AuthErr, QStringLiteral("%1 exists: only root may log in").arg(QString::fromUtf8(path))};
            }
        }
        return {Ignore, QString()};
    }
    return {std::nullopt, QStringLiteral("%1, which this forecast does not model").arg(QString::fromUtf8(line.module))};
}

PamForecast::Result PamForecast::evaluateStack(const QByteArray &facility, const QByteArray &user)
{
    const QList<Line> lines = stack(facility);
    std::vector<std::optional<ModuleAnswer>> answers(static_cast<size_t>(lines.size()));
    int budget = 64;

    // Walks the stack as Linux-PAM does; a module that is not modelled is
    // tried both ways.
    std::function<Result(int, State, std::optional<Code>)> walk
        = [&](int i, State state, std::optional<Code> forced) -> Result {
        while (i < lines.size()) {
            const Line &line = lines[i];
            auto &answer = answers[static_cast<size_t>(i)];
            if (!answer)
                answer = run(line, user);
            std::optional<Code> code = forced ? forced : answer->code;
            forced.reset();
            if (!code) {
                if (--budget < 0)
                    return {Outcome::Unknown, line.file, line.line, answer->reason};
                const Result yes = walk(i, state, Success);
                const Result no = walk(i, state, AuthErr);
                if (yes.outcome == no.outcome)
                    return no.outcome == Outcome::Failure ? no : yes;
                return {Outcome::Unknown, line.file, line.line,
                        QStringLiteral("the outcome depends on %1").arg(answer->reason)};
            }
            const auto &parsed = line.parsedActions[static_cast<size_t>(*code)];
            const ParsedAction action{static_cast<Action>(parsed.first), parsed.second};
            const QString reason = answer->code ? answer->reason : QString();
            const auto fail = [&]() {
                if (state.impression != State::Negative) {
                    state.impression = State::Negative;
                    state.status = *code;
                    state.decidingLine = i;
                    state.reason = reason;
                    // "pam_deny refuses everybody" says little: what sent the
                    // stack there does.
                    if (!state.passedOver.isEmpty())
                        state.reason += QStringLiteral(", reached because %1").arg(state.passedOver);
                }
            };
            if (*code != Success && *code != Ignore && !reason.isEmpty()
                && (action.action == Action::Ignore || action.action == Action::Jump)) {
                state.passedOver = QStringLiteral("%1 (%2:%3) answered: %4")
                                       .arg(QString::fromUtf8(line.module), line.file)
                                       .arg(line.line)
                                       .arg(reason);
            }
            switch (action.action) {
            case Action::Ignore:
                break;
            case Action::Ok:
            case Action::Done:
                if (state.impression == State::Undecided
                    || (state.impression == State::Positive && state.status == Success)) {
                    if (*code != Ignore) {
                        state.impression = State::Positive;
                        state.status = *code;
                        state.decidingLine = i;
                        state.reason = reason;
                    }
                }
                if (action.action == Action::Done && state.impression != State::Negative)
                    i = lines.size();
                break;
            case Action::Bad:
                fail();
                break;
            case Action::Die:
                fail();
                i = lines.size();
                break;
            case Action::Reset:
                state = State();
                break;
            case Action::Jump:
                i += action.jump;
                break;
            }
            ++i;
        }
        if (state.impression == State::Positive && state.status == Success) {
            const Line &line = lines[state.decidingLine];
            return {Outcome::Success, line.file, line.line, QString()};
        }
        if (state.decidingLine >= 0) {
            const Line &line = lines[state.decidingLine];
            QString why = state.reason;
            if (why.isEmpty())
                why = QStringLiteral("%1 answers %2")
                          .arg(QString::fromUtf8(line.module), QLatin1String(CodeNames[state.status]));
            return {Outcome::Failure, line.file, line.line,
                    QStringLiteral("PAM %1 refuses: %2 (%3)")
                        .arg(QString::fromUtf8(facility), why, QString::fromUtf8(line.module))};
        }
        return {Outcome::Failure, QStringLiteral("/etc/pam.d/") + m_service, 0,
                QStringLiteral("no %1 line of the PAM service admits the user").arg(QString::fromUtf8(facility))};
    };
    return walk(0, State(), std::nullopt);
}

PamForecast::Result PamForecast::evaluate(const QByteArray &user)
{
    const Result auth = evaluateStack("auth", user);
    if (auth.outcome != Outcome::Success)
        return auth;
    return evaluateStack("account", user);
}

#include "PamForecast.h"

#include "accounts/AccountStore.h"
#include "accounts/VirtualUserDb.h"
#include "policy/FtpServerConfig.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <fnmatch.h>
#include <fstream>
#include <sys/stat.h>

namespace {

enum class Action { Ignore, Ok, Done, Bad, Die, Reset, Jump };

struct ParsedAction
{
    Action action = Action::Bad;
    int jump = 0;
};

const char *const CodeNames[]
    = {"success",     "auth_err", "user_unknown", "authinfo_unavail", "acct_expired", "new_authtok_reqd",
       "perm_denied", "ignore",   "service_err",  "module_unknown",   "cred_err"};

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
                         const ConfigFile *serviceFile, bool sessions, QDate today)
    : m_root(root)
    , m_accounts(accounts)
    , m_service(service)
    , m_serviceFile(serviceFile)
    , m_sessions(sessions)
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

bool PamForecast::moduleExists(const QByteArray &module)
{
    // A bare name is looked for where Debian's Linux-PAM keeps its modules.
    // A root without that directory is no installed system: its modules
    // are taken to be there rather than every line failing.
    const QString directory = QFileInfo(QString::fromUtf8(FtpServerConfig::pamUserdbModule())).path();
    if (!m_moduleDirectory)
        m_moduleDirectory = QFileInfo(resolved(directory)).isDir();
    if (!*m_moduleDirectory && !module.startsWith('/'))
        return true;
    auto it = m_modules.find(module);
    if (it == m_modules.end()) {
        const QString path = module.startsWith('/') ? QString::fromUtf8(module)
                                                    : directory + QLatin1Char('/') + QString::fromUtf8(module);
        it = m_modules.emplace(module, QFileInfo(resolved(path)).isFile()).first;
    }
    return it->second;
}

void PamForecast::expand(const ConfigFile &file, const QString &name, const QByteArray &facility,
                         const QByteArray &requested, QList<Line> &out, int depth)
{
    if (depth > 16)
        return;
    const auto note = [this](const QString &where, int line, const QString &message) {
        for (const Note &known : m_notes) {
            if (known.file == where && known.line == line)
                return;
        }
        m_notes.append({where, line, message});
    };
    for (const auto &element : file.elements) {
        const int lineNumber = element->yOffset() + 1;
        if (element->type() == ElementType::Include) {
            const auto include = std::static_pointer_cast<ConfigElementInclude>(element);
            const QString target = QString::fromStdString(include->argument).trimmed();
            if (const ConfigFile *included = includedFile(target)) {
                expand(*included, QStringLiteral("/etc/pam.d/") + target, facility, requested, out, depth + 1);
            } else {
                // Linux-PAM gives up on the whole service: pam_start fails.
                const QString message = QStringLiteral("@include %1: the file does not exist, so pam_start fails and "
                                                       "PAM refuses every login")
                                            .arg(target);
                note(name, lineNumber, message);
                if (!m_startFails)
                    m_startFails = Note{name, lineNumber, message};
            }
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
        Line line;
        line.file = name;
        line.line = lineNumber;
        if (type != "auth" && type != "account" && type != "session" && type != "password") {
            // Linux-PAM installs a line of an unknown type as one that fails,
            // in the most sensitive stack it was asked for.
            if ((requested.isEmpty() ? QByteArray("auth") : requested) != facility)
                continue;
            line.broken = QStringLiteral("the line has the unknown type \"%1\", which Linux-PAM installs as a "
                                         "failing auth line")
                              .arg(QString::fromUtf8(type));
            note(name, lineNumber, line.broken);
        } else if (type != facility) {
            continue;
        }
        line.facility = facility;
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
        } else if (line.broken.isEmpty() && (control == "include" || control == "substack")) {
            if (!tokens.isEmpty()) {
                const QString target = QString::fromUtf8(tokens.first());
                if (const ConfigFile *included = includedFile(target)) {
                    expand(*included, QStringLiteral("/etc/pam.d/") + target, facility, facility, out, depth + 1);
                    continue;
                }
                // What cannot be loaded stands as one failing line.
                line.broken = QStringLiteral("%1 %2: the file does not exist, and Linux-PAM fails the %3 stack there")
                                  .arg(QString::fromUtf8(control), target, QString::fromUtf8(facility));
                note(name, lineNumber, line.broken);
                line.actions.insert("default", "bad");
                line.module = control;
                out.append(line);
            }
            continue;
        } else {
            line.actions = simpleControl(control);
            if (line.actions.isEmpty())
                line.actions.insert("default", "bad");
        }
        if (!line.broken.isEmpty())
            line.actions = {{"default", "bad"}};
        if (tokens.isEmpty())
            continue;
        const QByteArray module = tokens.takeFirst();
        line.module = baseName(module);
        line.args = tokens;
        if (line.broken.isEmpty() && !moduleExists(module)) {
            line.missing = true;
            note(name, lineNumber,
                 QStringLiteral("the module %1 does not exist: Linux-PAM answers module_unknown for this line")
                     .arg(QString::fromUtf8(module)));
        }
        out.append(line);
    }
}

QList<PamForecast::Line> PamForecast::stack(const QByteArray &facility)
{
    auto it = m_stacks.find(facility);
    if (it == m_stacks.end()) {
        QList<Line> lines;
        const QString own = QStringLiteral("/etc/pam.d/") + m_service;
        const QString other = QStringLiteral("/etc/pam.d/other");
        const ConfigFile *fallback = m_service == QLatin1String("other") ? nullptr : includedFile(other);
        if (m_serviceFile) {
            expand(*m_serviceFile, own, facility, {}, lines, 0);
            // A type the service's file has no line of is taken from "other".
            if (lines.isEmpty() && fallback) {
                expand(*fallback, other, facility, {}, lines, 0);
                m_notes.append({own, 0,
                                QStringLiteral("the file has no %1 line: Linux-PAM runs the %1 lines of %2")
                                    .arg(QString::fromUtf8(facility), other)});
            }
        } else if (fallback) {
            expand(*fallback, other, facility, {}, lines, 0);
        } else if (!m_startFails) {
            m_startFails = Note{own, 0,
                                QStringLiteral("neither %1 nor %2 exists: pam_start fails and PAM refuses every login")
                                    .arg(own, other)};
            m_notes.append(*m_startFails);
        }
        for (Line &line : lines) {
            for (int code = 0; code < CodeCount; ++code) {
                const ParsedAction action
                    = parseAction(line.actions.value(CodeNames[code], line.actions.value("default", "bad")));
                line.parsedActions[static_cast<size_t>(code)] = {static_cast<int>(action.action), action.jump};
            }
            if (line.module == "pam_userdb.so") {
                line.userdb = argument(line.args, "db");
                // pam_userdb always appends ".db": "db=/x/users.db" opens /x/users.db.db.
                line.userdbFile = line.userdb + ".db";
            }
        }
        it = m_stacks.emplace(facility, lines).first;
    }
    return it->second;
}

const QList<PamForecast::Note> &PamForecast::notes()
{
    if (!m_prepared) {
        m_prepared = true;
        if (!m_serviceFile && includedFile(QStringLiteral("other"))) {
            m_notes.append({QStringLiteral("/etc/pam.d/") + m_service, 0,
                            QStringLiteral("the PAM service file does not exist: Linux-PAM uses /etc/pam.d/other")});
        }
        stack("auth");
        stack("account");
        if (m_sessions)
            stack("session");
    }
    return m_notes;
}

bool PamForecast::sessionMakesHome()
{
    if (!m_sessions)
        return false;
    for (const Line &line : stack("session")) {
        if (line.module == "pam_mkhomedir.so" && !line.missing && line.broken.isEmpty())
            return true;
    }
    return false;
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
    if (item == "user" || item == "ruser") {
        candidates << user; // vsftpd gives the login name as the remote user too
    } else if (item == "tty") {
        candidates << "ftp"; // what vsftpd sets
    } else if (item == "rhost") {
        return {std::nullopt,
                QStringLiteral("pam_listfile with item=rhost (%1:%2), which depends on the client's "
                               "address")
                    .arg(line.file)
                    .arg(line.line)};
    } else if (item == "group") {
        if (!known)
            return onError(QStringLiteral("the groups of %1 are unknown").arg(QString::fromUtf8(user)));
        candidates = m_accounts.userGroups(user);
    } else if (item == "shell") {
        if (!known)
            return onError(QStringLiteral("the shell of %1 is unknown").arg(QString::fromUtf8(user)));
        candidates << account.shell;
    } else {
        return onError(QStringLiteral("item=%1 is none that pam_listfile knows").arg(QString::fromUtf8(item)));
    }
    if (sense != "allow" && sense != "deny")
        return onError(QStringLiteral("sense=%1 is neither allow nor deny").arg(QString::fromUtf8(sense)));
    if (!file.isEmpty() && untrusted(QString::fromUtf8(file)))
        return {AuthErr,
                QStringLiteral("the list %1 is writable by everybody or no plain file, and pam_listfile "
                               "refuses")
                    .arg(QString::fromUtf8(file))};
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
            // As pam_listfile reads it: one "\r" before the line feed is
            // dropped, blanks are not, empty lines name nobody.
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

const QSet<QByteArray> *PamForecast::userdbKeys(const QByteArray &db, const QByteArray &file)
{
    // The database the account store has read, untouched since, is the one
    // pam_userdb would open: its names are not read a second time.
    const VirtualUserDb *stored = m_accounts.database();
    if (stored && stored->isOpen() && stored->filePath() == file && !m_accounts.virtualUsersChanged())
        return &m_accounts.virtualUserKeys();
    auto it = m_userdbs.find(file);
    if (it == m_userdbs.end()) {
        std::optional<QSet<QByteArray>> keys;
        if (QFileInfo(resolved(QString::fromUtf8(file))).isFile()) {
            try {
                VirtualUserDb store(db, m_root, VirtualUserDb::Access::ReadOnly);
                if (store.isOpen()) {
                    keys.emplace();
                    for (const auto &record : store.readAll())
                        keys->insert(record.first);
                }
            } catch (const std::exception &) {
                keys.reset();
            }
        }
        it = m_userdbs.emplace(file, keys).first;
    }
    return it->second ? &*it->second : nullptr;
}

PamForecast::ModuleAnswer PamForecast::runUserdb(const Line &line, const QByteArray &user)
{
    const QByteArray &db = line.userdb;
    if (db.isEmpty())
        return {ServiceErr, QStringLiteral("pam_userdb has no db= argument")};
    const QByteArray &file = line.userdbFile;
    const QSet<QByteArray> *keys = userdbKeys(db, file);
    if (!keys) {
        return {AuthinfoUnavail,
                QStringLiteral("pam_userdb cannot open %1 (db=%2 with \".db\" appended)")
                    .arg(QString::fromUtf8(file), QString::fromUtf8(db))};
    }
    const bool known
        = keys == &m_accounts.virtualUserKeys() && !m_knownVirtualUser.isNull() && user == m_knownVirtualUser;
    if (!known && !keys->contains(user))
        return {UserUnknown, QStringLiteral("%1 is not in %2").arg(QString::fromUtf8(user), QString::fromUtf8(file))};
    return {Success, QString()};
}

void PamForecast::knownVirtualUser(const QByteArray &user)
{
    m_knownVirtualUser = user;
}

PamForecast::ModuleAnswer PamForecast::run(const Line &line, const QByteArray &user)
{
    if (!line.broken.isEmpty())
        return {PermDenied, line.broken};
    if (line.missing)
        return {ModuleUnknown, QStringLiteral("the module %1 does not exist").arg(QString::fromUtf8(line.module))};
    return runModule(line, user);
}

const QList<QByteArray> *PamForecast::fileLines(const QString &path)
{
    auto it = m_files.find(path);
    if (it == m_files.end()) {
        std::optional<QList<QByteArray>> lines;
        QFile file(resolved(path));
        if (QFileInfo(file).isFile() && file.open(QIODevice::ReadOnly)) {
            // Only the line feed ends a line: a "\r" or a blank before it
            // stays, as the modules read with fgets or getline.
            lines = file.readAll().split('\n');
            if (!lines->isEmpty() && lines->last().isEmpty())
                lines->removeLast();
        }
        it = m_files.emplace(path, std::move(lines)).first;
    }
    return it->second ? &*it->second : nullptr;
}

bool PamForecast::untrusted(const QString &path)
{
    auto it = m_untrusted.find(path);
    if (it == m_untrusted.end()) {
        struct stat info;
        const bool found = ::stat(QFile::encodeName(resolved(path)).constData(), &info) == 0;
        it = m_untrusted.emplace(path, found && (!S_ISREG(info.st_mode) || (info.st_mode & S_IWOTH))).first;
    }
    return it->second;
}

const QStringList &PamForecast::dropIns(const QString &directory)
{
    auto it = m_dropIns.find(directory);
    if (it == m_dropIns.end()) {
        QStringList files;
        const QDir listed(resolved(directory));
        for (const QString &name : listed.entryList({QStringLiteral("*.conf")}, QDir::Files, QDir::Name))
            files << directory + QLatin1Char('/') + name;
        it = m_dropIns.emplace(directory, files).first;
    }
    return it->second;
}

PamForecast::ModuleAnswer PamForecast::runShells(const QByteArray &user)
{
    AccountRecord account;
    if (!m_accounts.getUserInfo(user, account))
        return {AuthErr,
                QStringLiteral("there is no system account %1 to take a shell from").arg(QString::fromUtf8(user))};
    const QString path = QStringLiteral("/etc/shells");
    if (untrusted(path))
        return {AuthErr,
                QStringLiteral("/etc/shells is writable by everybody or no plain file, and pam_shells refuses")};
    const QList<QByteArray> *lines = fileLines(path);
    if (!lines)
        return {AuthErr, QStringLiteral("/etc/shells cannot be read")};
    // Whole lines: "/bin/bash " or "/bin/bash\r" is another shell.
    if (!lines->contains(account.shell)) {
        return {AuthErr,
                QStringLiteral("the shell %1 is not listed in /etc/shells (pam_shells compares whole lines)")
                    .arg(QString::fromUtf8(account.shell))};
    }
    return {Success, QString()};
}

PamForecast::ModuleAnswer PamForecast::runSucceedIf(const Line &line, const QByteArray &user)
{
    static const QSet<QByteArray> flags{"debug", "use_uid", "quiet", "quiet_fail", "quiet_success", "audit"};
    QList<QByteArray> words;
    for (const QByteArray &arg : line.args) {
        if (!flags.contains(arg))
            words << arg;
    }
    if (line.args.contains("use_uid"))
        return {std::nullopt, QStringLiteral("pam_succeed_if with use_uid, which asks about the server's own account")};
    if (words.size() % 3 != 0)
        return {ServiceErr, QStringLiteral("pam_succeed_if has an incomplete condition")};
    AccountRecord account;
    const bool known = m_accounts.getUserInfo(user, account);
    for (int i = 0; i < words.size(); i += 3) {
        const QByteArray field = words[i].toLower();
        const QByteArray op = words[i + 1].toLower();
        const QByteArray &right = words[i + 2];
        const QString condition
            = QStringLiteral("\"%1 %2 %3\"")
                  .arg(QString::fromUtf8(words[i]), QString::fromUtf8(words[i + 1]), QString::fromUtf8(right));
        QByteArray left;
        bool numeric = false;
        if (field == "login" || field == "user" || field == "ruser") {
            left = user; // vsftpd gives the login name as the remote user too
        } else if (field == "tty") {
            left = "ftp"; // what vsftpd sets
        } else if (field == "service") {
            left = m_service.toUtf8();
        } else if (field == "rhost") {
            return {
                std::nullopt,
                QStringLiteral("pam_succeed_if's condition %1, which depends on the client's address").arg(condition)};
        } else if (field == "uid" || field == "gid" || field == "shell" || field == "home") {
            if (!known)
                return {UserUnknown,
                        QStringLiteral("pam_succeed_if's condition %1 needs a system account %2")
                            .arg(condition, QString::fromUtf8(user))};
            numeric = field == "uid" || field == "gid";
            left = field == "uid"  ? QByteArray::number(account.uid)
                : field == "gid"   ? QByteArray::number(account.gid)
                : field == "shell" ? account.shell
                                   : account.home;
        } else {
            return {ServiceErr, QStringLiteral("pam_succeed_if does not know the field in %1").arg(condition)};
        }
        Q_UNUSED(numeric)
        std::optional<bool> met;
        const auto compare = [&](auto test) -> std::optional<bool> {
            bool a = false;
            bool b = false;
            const qlonglong l = left.toLongLong(&a);
            const qlonglong r = right.toLongLong(&b);
            if (!a || !b)
                return std::nullopt;
            return test(l, r);
        };
        if (op == "<" || op == "lt")
            met = compare([](qlonglong l, qlonglong r) { return l < r; });
        else if (op == "<=" || op == "le")
            met = compare([](qlonglong l, qlonglong r) { return l <= r; });
        else if (op == ">" || op == "gt")
            met = compare([](qlonglong l, qlonglong r) { return l > r; });
        else if (op == ">=" || op == "ge")
            met = compare([](qlonglong l, qlonglong r) { return l >= r; });
        else if (op == "eq")
            met = compare([](qlonglong l, qlonglong r) { return l == r; });
        else if (op == "ne")
            met = compare([](qlonglong l, qlonglong r) { return l != r; });
        else if (op == "=")
            met = left == right;
        else if (op == "!=")
            met = left != right;
        else if (op == "=~" || op == "glob")
            met = ::fnmatch(right.constData(), left.constData(), 0) == 0;
        else if (op == "!~" || op == "noglob")
            met = ::fnmatch(right.constData(), left.constData(), 0) != 0;
        else if (op == "in" || op == "notin")
            met = right.split(':').contains(left) == (op == "in");
        else if (op == "ingroup" || op == "notingroup")
            met = (known && m_accounts.isUserInGroup(user, right)) == (op == "ingroup");
        else if (op == "innetgr" || op == "notinnetgr")
            return {std::nullopt,
                    QStringLiteral("pam_succeed_if's condition %1, which asks a netgroup").arg(condition)};
        else
            return {ServiceErr, QStringLiteral("pam_succeed_if does not know the test in %1").arg(condition)};
        if (!met)
            return {ServiceErr, QStringLiteral("pam_succeed_if's condition %1 compares no numbers").arg(condition)};
        if (!*met)
            return {AuthErr, QStringLiteral("pam_succeed_if's condition %1 is not met").arg(condition)};
    }
    return {Success, QString()};
}

PamForecast::ModuleAnswer PamForecast::runAccess(const Line &line, const QByteArray &user)
{
    QByteArray separator = argument(line.args, "fieldsep");
    if (separator.isEmpty())
        separator = ":";
    const bool groupsByName = !line.args.contains("nodefgroup");
    const QByteArray named = argument(line.args, "accessfile");
    QStringList files{named.isEmpty() ? QStringLiteral("/etc/security/access.conf") : QString::fromUtf8(named)};
    if (named.isEmpty()) {
        // The drop-in files are read after the main one, in name order.
        files << dropIns(QStringLiteral("/etc/security/access.d"));
    }
    AccountRecord account;
    const bool known = m_accounts.getUserInfo(user, account);
    // One name of the users field: yes, no, or none when it cannot be told.
    const auto userToken = [&](const QByteArray &token) -> std::optional<bool> {
        if (token.compare("ALL", Qt::CaseInsensitive) == 0)
            return true;
        if (token.startsWith('(') && token.endsWith(')'))
            return known && m_accounts.isUserInGroup(user, token.mid(1, token.size() - 2));
        if (token.contains('@'))
            return std::nullopt; // a netgroup or a user at a host
        if (token.compare(user, Qt::CaseInsensitive) == 0)
            return true;
        return groupsByName && known && m_accounts.isUserInGroup(user, token);
    };
    // The list with its EXCEPT parts, as pam_access walks it.
    const std::function<std::optional<bool>(const QList<QByteArray> &, int)> listMatch
        = [&](const QList<QByteArray> &tokens, int from) -> std::optional<bool> {
        int i = from;
        std::optional<bool> match = false;
        for (; i < tokens.size() && tokens[i].compare("EXCEPT", Qt::CaseInsensitive) != 0; ++i) {
            match = userToken(tokens[i]);
            if (!match || *match)
                break;
        }
        if (!match || !*match)
            return match;
        while (i < tokens.size() && tokens[i].compare("EXCEPT", Qt::CaseInsensitive) != 0)
            ++i;
        if (i >= tokens.size())
            return true;
        const std::optional<bool> except = listMatch(tokens, i + 1);
        if (!except)
            return std::nullopt;
        return !*except;
    };
    for (const QString &path : files) {
        const QList<QByteArray> *lines = fileLines(path);
        if (!lines) {
            if (path == files.first())
                return {std::nullopt, QStringLiteral("pam_access, whose rules %1 cannot be read").arg(path)};
            continue;
        }
        int number = 0;
        for (const QByteArray &raw : *lines) {
            ++number;
            const QByteArray text = raw.trimmed();
            if (text.isEmpty() || text.startsWith('#'))
                continue;
            const QList<QByteArray> fields = text.split(separator.at(0));
            if (fields.size() != 3 || (fields[0].trimmed() != "+" && fields[0].trimmed() != "-"))
                continue; // pam_access passes over a line it cannot read
            const QString rule = QStringLiteral("rule \"%1\" (%2:%3)").arg(QString::fromUtf8(text), path).arg(number);
            QList<QByteArray> users = fields[1].simplified().replace(',', ' ').split(' ');
            users.removeAll(QByteArray());
            const std::optional<bool> userMatch = listMatch(users, 0);
            if (!userMatch)
                return {std::nullopt, QStringLiteral("pam_access's %1, which names a netgroup or a host").arg(rule)};
            if (!*userMatch)
                continue;
            if (fields[2].simplified().compare("ALL", Qt::CaseInsensitive) != 0)
                return {std::nullopt,
                        QStringLiteral("pam_access's %1, which depends on the client's address").arg(rule)};
            if (fields[0].trimmed() == "+")
                return {Success, QString()};
            return {PermDenied, QStringLiteral("pam_access's %1 refuses").arg(rule)};
        }
    }
    return {Success, QString()};
}

PamForecast::ModuleAnswer PamForecast::runTime(const QByteArray &user)
{
    const QString path = QStringLiteral("/etc/security/time.conf");
    const QList<QByteArray> *lines = fileLines(path);
    if (!lines)
        return {std::nullopt, QStringLiteral("pam_time, whose rules %1 cannot be read").arg(path)};
    // One field of a rule against one value: yes, no, or none when it
    // holds a logic this forecast does not follow.
    const auto matches = [](QByteArray field, const QByteArray &value) -> std::optional<bool> {
        field = field.trimmed();
        if (field.contains('&') || field.contains('|'))
            return std::nullopt;
        const bool negated = field.startsWith('!');
        if (negated)
            field = field.mid(1);
        return (::fnmatch(field.constData(), value.constData(), 0) == 0) != negated;
    };
    int number = 0;
    for (QByteArray text : *lines) {
        ++number;
        const int hash = text.indexOf('#');
        if (hash >= 0)
            text.truncate(hash);
        text = text.trimmed();
        if (text.isEmpty())
            continue;
        const QString rule = QStringLiteral("rule \"%1\" (%2:%3)").arg(QString::fromUtf8(text), path).arg(number);
        const QList<QByteArray> fields = text.split(';');
        if (fields.size() != 4 || text.endsWith('\\'))
            return {std::nullopt, QStringLiteral("pam_time's %1, which this forecast cannot read").arg(rule)};
        bool applies = true;
        const QByteArray values[] = {m_service.toUtf8(), QByteArray("ftp"), user};
        for (int i = 0; i < 3 && applies; ++i) {
            const std::optional<bool> match = matches(fields[i], values[i]);
            if (!match)
                return {std::nullopt, QStringLiteral("pam_time's %1, which this forecast cannot read").arg(rule)};
            applies = *match;
        }
        if (!applies)
            continue;
        const QByteArray times = fields[3].trimmed();
        if (times == "Al0000-2400")
            continue;
        if (times == "!Al0000-2400")
            return {PermDenied, QStringLiteral("pam_time's %1 refuses at every hour").arg(rule)};
        return {std::nullopt, QStringLiteral("pam_time's %1, which depends on the hour of the login").arg(rule)};
    }
    return {Success, QString()};
}

PamForecast::ModuleAnswer PamForecast::runLimits(const QByteArray &user)
{
    AccountRecord account;
    if (!m_accounts.getUserInfo(user, account))
        return {UserUnknown, QStringLiteral("pam_limits finds no system account %1").arg(QString::fromUtf8(user))};
    QStringList files{QStringLiteral("/etc/security/limits.conf")};
    files << dropIns(QStringLiteral("/etc/security/limits.d"));
    // Limits are set and the session goes on; only a limit on the number
    // of logins refuses, and that depends on the sessions already open.
    for (const QString &path : files) {
        const QList<QByteArray> *lines = fileLines(path);
        int number = 0;
        for (const QByteArray &raw : lines ? *lines : QList<QByteArray>()) {
            ++number;
            const QList<QByteArray> fields = raw.simplified().split(' ');
            if (fields.size() < 4 || fields[0].startsWith('#'))
                continue;
            const QByteArray item = fields[2].toLower();
            if (item != "maxlogins" && item != "maxsyslogins")
                continue;
            const QByteArray &domain = fields[0];
            if (domain != "*" && !domain.startsWith('@') && !domain.startsWith('%') && !domain.contains(':')
                && domain != user)
                continue;
            return {std::nullopt,
                    QStringLiteral("pam_limits' rule \"%1\" (%2:%3), which depends on the sessions "
                                   "already open")
                        .arg(QString::fromUtf8(raw.simplified()), path)
                        .arg(number)};
        }
    }
    return {Success, QString()};
}

PamForecast::ModuleAnswer PamForecast::runModule(const Line &line, const QByteArray &user)
{
    const QByteArray &module = line.module;
    const bool session = line.facility == "session";
    if (module == "pam_permit.so")
        return {Success, QString()};
    if (module == "pam_deny.so")
        return {AuthErr, QStringLiteral("pam_deny refuses everybody")};
    if (module == "pam_unix.so") {
        AccountRecord account;
        if (session)
            return m_accounts.getUserInfo(user, account)
                ? ModuleAnswer{Success, QString()}
                : ModuleAnswer{std::nullopt,
                               QStringLiteral("pam_unix opening a session for %1, who has no system "
                                              "account")
                                   .arg(QString::fromUtf8(user))};
        return runUnix(line, user);
    }
    if (module == "pam_listfile.so")
        return runListfile(line, user);
    if (module == "pam_userdb.so" && !session)
        return runUserdb(line, user);
    if (module == "pam_shells.so" && !session)
        return runShells(user);
    if (module == "pam_succeed_if.so")
        return runSucceedIf(line, user);
    if (module == "pam_access.so")
        return runAccess(line, user);
    if (module == "pam_time.so" && line.facility == "account")
        return runTime(user);
    if (module == "pam_limits.so" && session)
        return runLimits(user);
    if (module == "pam_env.so" && (session || line.facility == "auth"))
        return {session ? Success : Ignore, QString()};
    if ((module == "pam_loginuid.so" || module == "pam_mkhomedir.so") && session) {
        AccountRecord account;
        if (!m_accounts.getUserInfo(user, account))
            return {module == "pam_mkhomedir.so" ? UserUnknown : AuthErr,
                    QStringLiteral("%1 finds no system account %2")
                        .arg(QString::fromUtf8(module.left(module.size() - 3)), QString::fromUtf8(user))};
        return {Success, QString()};
    }
    if (module == "pam_nologin.so" && !session) {
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
    return {std::nullopt, QStringLiteral("%1, which this forecast does not model").arg(QString::fromUtf8(module))};
}

std::optional<PamForecast::Code> PamForecast::setcredAnswer(const Line &line, std::optional<Code> authenticated)
{
    // Tried with pamtester on Debian 12's Linux-PAM 1.5.2.
    if (!line.broken.isEmpty())
        return PermDenied;
    if (line.missing)
        return ModuleUnknown;
    const QByteArray &module = line.module;
    if (module == "pam_permit.so" || module == "pam_listfile.so" || module == "pam_userdb.so"
        || module == "pam_shells.so" || module == "pam_env.so")
        return Success;
    // With likeauth pam_unix repeats what it answered to the authentication.
    if (module == "pam_unix.so")
        return authenticated && line.args.contains("likeauth") ? *authenticated : Success;
    if (module == "pam_deny.so")
        return CredErr;
    if (module == "pam_succeed_if.so" || module == "pam_access.so" || module == "pam_nologin.so")
        return Ignore;
    // Any other module is taken to answer as it did to the authentication.
    return authenticated;
}

PamForecast::Result PamForecast::setcredStack(const QList<Line> &lines, const std::vector<std::optional<Code>> &frozen,
                                              int &budget)
{
    // Linux-PAM calls every line again, acting on what each answered to
    // pam_authenticate, but a success must come from the pam_setcred
    // answers; a line that did not run then acts on its new answer.
    std::function<Result(int, State, std::optional<Code>)> walk
        = [&](int i, State state, std::optional<Code> forced) -> Result {
        QString ignored; // the lines whose success pam_setcred ignores
        for (; i < lines.size(); ++i) {
            const Line &line = lines[i];
            const std::optional<Code> &authenticated = frozen[static_cast<size_t>(i)];
            std::optional<Code> code = forced ? forced : setcredAnswer(line, authenticated);
            forced.reset();
            if (!code) {
                const QString rule = QStringLiteral("what %1 answers to pam_setcred, which this forecast does "
                                                    "not model")
                                         .arg(QString::fromUtf8(line.module));
                if (--budget < 0)
                    return {Outcome::Unknown, line.file, line.line, rule};
                const Result yes = walk(i, state, Success);
                const Result no = walk(i, state, CredErr);
                if (yes.outcome == no.outcome)
                    return no.outcome == Outcome::Failure ? no : yes;
                return {Outcome::Unknown, line.file, line.line, QStringLiteral("the outcome depends on %1").arg(rule)};
            }
            const Code acted = authenticated ? *authenticated : *code;
            const auto &parsed = line.parsedActions[static_cast<size_t>(acted)];
            const ParsedAction action{static_cast<Action>(parsed.first), parsed.second};
            switch (action.action) {
            case Action::Ignore:
                break;
            case Action::Ok:
            case Action::Done:
            case Action::Jump:
                if (state.impression == State::Undecided
                    || (state.impression == State::Positive && state.status == Success)) {
                    if (*code != Ignore || acted == Ignore) {
                        state.impression = State::Positive;
                        state.status = *code;
                        state.decidingLine = i;
                    } else if (ignored.isEmpty()) {
                        ignored = QStringLiteral("%1 (%2:%3)")
                                      .arg(QString::fromUtf8(line.module), line.file)
                                      .arg(line.line);
                    }
                }
                if (action.action == Action::Done && state.impression == State::Positive)
                    i = lines.size();
                if (action.action == Action::Jump)
                    i += action.jump;
                break;
            case Action::Bad:
            case Action::Die:
                if (state.impression != State::Negative) {
                    state.impression = State::Negative;
                    state.status = *code == Ignore ? PermDenied : *code;
                    state.decidingLine = i;
                }
                if (action.action == Action::Die)
                    i = lines.size();
                break;
            case Action::Reset:
                state = State();
                state.status = PermDenied;
                break;
            }
        }
        if (state.impression == State::Positive && state.status == Success)
            return {Outcome::Success, QString(), 0, QString()};
        Result refused{Outcome::Failure, QStringLiteral("/etc/pam.d/") + m_service, 0,
                       QStringLiteral("no auth line answers success to pam_setcred")};
        if (state.decidingLine >= 0) {
            const Line &line = lines[state.decidingLine];
            refused.file = line.file;
            refused.line = line.line;
            refused.message = QStringLiteral("%1 answers %2 to pam_setcred")
                                  .arg(QString::fromUtf8(line.module), QLatin1String(CodeNames[state.status]));
        }
        if (!ignored.isEmpty())
            refused.message += QStringLiteral(" (%1 admitted the user, but ignores pam_setcred)").arg(ignored);
        refused.message = QStringLiteral("PAM setcred refuses, after the account stack: ") + refused.message;
        return refused;
    };
    State initial;
    initial.status = PermDenied;
    return walk(0, initial, std::nullopt);
}

PamForecast::Result PamForecast::evaluateStack(const QByteArray &facility, const QByteArray &user, bool setcred)
{
    const QList<Line> lines = stack(facility);
    std::vector<std::optional<ModuleAnswer>> answers(static_cast<size_t>(lines.size()));
    // What each line answered on the path being walked: the chain
    // pam_authenticate freezes for pam_setcred.
    std::vector<std::optional<Code>> frozen(static_cast<size_t>(lines.size()));
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
                std::fill(frozen.begin() + i, frozen.end(), std::nullopt);
                const Result yes = walk(i, state, Success);
                std::fill(frozen.begin() + i, frozen.end(), std::nullopt);
                const Result no = walk(i, state, AuthErr);
                if (yes.outcome == no.outcome)
                    return no.outcome == Outcome::Failure ? no : yes;
                return {Outcome::Unknown, line.file, line.line,
                        QStringLiteral("the outcome depends on %1").arg(answer->reason)};
            }
            frozen[static_cast<size_t>(i)] = code;
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
            if (setcred) {
                Result credentials = setcredStack(lines, frozen, budget);
                if (credentials.outcome != Outcome::Success) {
                    credentials.credentials = true;
                    return credentials;
                }
            }
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
    notes();
    if (m_startFails)
        return {Outcome::Failure, m_startFails->file, m_startFails->line, m_startFails->message};
    const Result auth = evaluateStack("auth", user, true);
    if (auth.outcome != Outcome::Success && !auth.credentials)
        return auth;
    const Result account = evaluateStack("account", user);
    if (account.outcome == Outcome::Failure)
        return account;
    // vsftpd asks for the credentials after the account stack.
    if (auth.outcome != Outcome::Success)
        return auth;
    if (!m_sessions)
        return account;
    // vsftpd opens the session last; its refusal ends the login as well.
    const Result session = evaluateStack("session", user);
    if (session.outcome != Outcome::Success)
        return session;
    return account;
}

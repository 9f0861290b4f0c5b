#pragma once

#include "common/RootDirectory.h"
#include "config/ConfigFile.h"

#include <QByteArray>
#include <QDate>
#include <QHash>
#include <QList>
#include <QSet>
#include <QString>

#include <array>
#include <functional>
#include <map>
#include <optional>
#include <vector>

class AccountStore;

// What Linux-PAM will answer for one user who types the right password,
// from the service file and the files its modules read, as vsftpd asks it:
// the auth and the account stacks, pam_setcred over the auth stack, and the
// session stack when vsftpd opens sessions (session_support). Linux-PAM's own fallbacks are followed: a
// missing service file and a type the file has no line of take
// /etc/pam.d/other, a missing module fails its line, a missing @include
// fails every login. Modelled: the controls required, requisite,
// sufficient, optional and "[value=action ...]", and the modules pam_unix,
// pam_shells, pam_listfile, pam_userdb, pam_nologin, pam_deny, pam_permit,
// pam_succeed_if, pam_access, pam_time, pam_limits, pam_env, pam_loginuid
// and pam_mkhomedir. Any other module, and a rule that depends on the
// connection or the clock, may answer either way; the result is then
// unknown unless both answers lead to the same end.
class PamForecast
{
public:
    enum class Outcome { Success, Failure, Unknown };

    struct Result
    {
        Outcome outcome = Outcome::Unknown;
        QString file; // where the deciding line is, as the administrator knows it
        int line = 0; // 1-based
        QString message; // why, in a sentence
        bool credentials = false; // the refusal is pam_setcred's, asked after the account stack
    };

    // What the service's files make of every login, said once: a file
    // that is missing, a fallback Linux-PAM takes.
    struct Note
    {
        QString file;
        int line = 0;
        QString message;
    };

    // serviceFile is null when the service has no file of its own.
    PamForecast(const RootDirectory &root, const AccountStore &accounts, const QString &service,
                const ConfigFile *serviceFile, bool sessions, QDate today = QDate::currentDate());

    // "auth", "account", pam_setcred, then "session" when sessions are
    // opened.
    Result evaluate(const QByteArray &user);
    // With setcred, a path through the auth stack that admits the user is
    // replayed as pam_setcred replays it.
    Result evaluateStack(const QByteArray &facility, const QByteArray &user, bool setcred = false);
    // Builds the stacks vsftpd runs and says what they fall back to.
    const QList<Note> &notes();
    // A session stack that holds pam_mkhomedir makes a missing home.
    bool sessionMakesHome();
    // The names in the database file pam_userdb opens for the argument
    // db=, file (its value with ".db"), read once; null when it cannot be
    // opened.
    const QSet<QByteArray> *userdbKeys(const QByteArray &db, const QByteArray &file);
    // The user is one of the account store's virtual users, so one of the
    // names of its database: the names are not searched for it.
    void knownVirtualUser(const QByteArray &user);

    // Codes a module answers with, by their names in "[value=action]".
    enum Code {
        Success,
        AuthErr,
        UserUnknown,
        AuthinfoUnavail,
        AcctExpired,
        NewAuthtokReqd,
        PermDenied,
        Ignore,
        ServiceErr,
        ModuleUnknown,
        CredErr,
        CodeCount
    };

private:
    struct Line
    {
        QByteArray facility;
        QByteArray module; // the file name of the module, "pam_unix.so"
        QList<QByteArray> args; // after the module
        QHash<QByteArray, QByteArray> actions; // value -> action, "default" included
        // The action each code leads to (its kind and the jump of "N"),
        // parsed once when the stack is built rather than for every user.
        std::array<std::pair<int, int>, CodeCount> parsedActions{};
        // pam_userdb's db= and the file it opens, db= with ".db" appended.
        QByteArray userdb;
        QByteArray userdbFile;
        QString file;
        int line = 0;
        // Not empty for a line Linux-PAM could not load: it fails as
        // dispatched, whatever its module.
        QString broken;
        bool missing = false; // the module file does not exist
    };

    struct ModuleAnswer
    {
        std::optional<Code> code; // none: not modelled
        QString reason;
    };

    QList<Line> stack(const QByteArray &facility);
    void expand(const ConfigFile &file, const QString &name, const QByteArray &facility, const QByteArray &requested,
                QList<Line> &out, int depth);
    const ConfigFile *includedFile(const QString &name);
    bool moduleExists(const QByteArray &module);
    ModuleAnswer run(const Line &line, const QByteArray &user);
    ModuleAnswer runModule(const Line &line, const QByteArray &user);
    ModuleAnswer runShells(const QByteArray &user);
    ModuleAnswer runSucceedIf(const Line &line, const QByteArray &user);
    ModuleAnswer runAccess(const Line &line, const QByteArray &user);
    ModuleAnswer runTime(const QByteArray &user);
    ModuleAnswer runLimits(const QByteArray &user);
    // The lines of a file as Linux-PAM's modules read it, once a forecast;
    // null when it cannot be read.
    const QList<QByteArray> *fileLines(const QString &path);
    // A file a module refuses to trust: not a plain file, or writable by
    // everybody.
    bool untrusted(const QString &path);
    // The "*.conf" files of a drop-in directory, in name order.
    const QStringList &dropIns(const QString &directory);
    ModuleAnswer runUnix(const Line &line, const QByteArray &user);
    ModuleAnswer runListfile(const Line &line, const QByteArray &user);
    ModuleAnswer runUserdb(const Line &line, const QByteArray &user);
    // A module's answer to pam_setcred, given what it answered to
    // pam_authenticate (none: it did not run); none when not modelled.
    static std::optional<Code> setcredAnswer(const Line &line, std::optional<Code> authenticated);
    // pam_setcred over the auth stack frozen by one path of the walk.
    Result setcredStack(const QList<Line> &lines, const std::vector<std::optional<Code>> &frozen, int &budget);
    // The entries of a pam_listfile list, each with the line it first
    // appears on; null when the file cannot be read.
    const QHash<QByteArray, int> *listEntries(const QByteArray &file);
    std::optional<QList<QByteArray>> shadowFields(const QByteArray &user);
    QString resolved(const QString &path) const;

    RootDirectory m_root;
    const AccountStore &m_accounts;
    QString m_service;
    const ConfigFile *m_serviceFile;
    bool m_sessions;
    QDate m_today;
    QList<Note> m_notes;
    bool m_prepared = false;
    // Set when pam_start itself fails: every login is refused.
    std::optional<Note> m_startFails;
    std::map<QByteArray, bool> m_modules;
    std::optional<bool> m_moduleDirectory;
    std::map<QString, std::optional<QList<QByteArray>>> m_files;
    std::map<QString, bool> m_untrusted;
    std::map<QString, QStringList> m_dropIns;
    std::map<QString, std::unique_ptr<ConfigFile>> m_included;
    std::map<QByteArray, QList<Line>> m_stacks;
    // Lists and databases are read once per forecast, not once per user.
    std::map<QByteArray, std::optional<QHash<QByteArray, int>>> m_lists;
    std::map<QByteArray, std::optional<QSet<QByteArray>>> m_userdbs;
    QByteArray m_knownVirtualUser;
    std::optional<QHash<QByteArray, QList<QByteArray>>> m_shadow;
};

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

class AccountStore;

// What Linux-PAM will answer for one user who types the right password,
// from the service file and the files its modules read: the auth and the
// account stacks, @include, the controls required, requisite, sufficient,
// optional and "[value=action ...]", and the modules pam_unix, pam_shells,
// pam_listfile, pam_userdb, pam_nologin, pam_deny and pam_permit. Any other
// module may answer either way; the result is then unknown unless both
// answers lead to the same end.
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
    };

    PamForecast(const RootDirectory &root, const AccountStore &accounts, const QString &service,
                const ConfigFile &serviceFile, QDate today = QDate::currentDate());

    // "auth" then "account" for the login name.
    Result evaluate(const QByteArray &user);
    Result evaluateStack(const QByteArray &facility, const QByteArray &user);

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
        QString file;
        int line = 0;
    };

    struct ModuleAnswer
    {
        std::optional<Code> code; // none: not modelled
        QString reason;
    };

    QList<Line> stack(const QByteArray &facility);
    void expand(const ConfigFile &file, const QString &name, const QByteArray &facility, QList<Line> &out, int depth);
    const ConfigFile *includedFile(const QString &name);
    ModuleAnswer run(const Line &line, const QByteArray &user);
    ModuleAnswer runUnix(const Line &line, const QByteArray &user);
    ModuleAnswer runListfile(const Line &line, const QByteArray &user);
    ModuleAnswer runUserdb(const Line &line, const QByteArray &user);
    // The entries of a pam_listfile list, each with the line it first
    // appears on; null when the file cannot be read.
    const QHash<QByteArray, int> *listEntries(const QByteArray &file);
    const QSet<QByteArray> *userdbKeys(const QByteArray &path);
    std::optional<QList<QByteArray>> shadowFields(const QByteArray &user);
    QString resolved(const QString &path) const;

    RootDirectory m_root;
    const AccountStore &m_accounts;
    QString m_service;
    const ConfigFile &m_serviceFile;
    QDate m_today;
    std::map<QString, std::unique_ptr<ConfigFile>> m_included;
    std::map<QByteArray, QList<Line>> m_stacks;
    // Lists and databases are read once per forecast, not once per user.
    std::map<QByteArray, std::optional<QHash<QByteArray, int>>> m_lists;
    std::map<QByteArray, std::optional<QSet<QByteArray>>> m_userdbs;
    std::optional<QHash<QByteArray, QList<QByteArray>>> m_shadow;
    std::optional<QSet<QByteArray>> m_shells;
};

#pragma once

#include "common/NameFilter.h"
#include "config/ConfigFile.h"
#include "forecast/VsftpdSettings.h"

#include <QByteArray>
#include <QDate>
#include <QList>
#include <QSet>
#include <QString>

#include <functional>
#include <map>
#include <memory>
#include <optional>

class FtpServerConfig;
class PamForecast;

struct ForecastFinding
{
    enum class Severity { Error, Warning, Info };
    Severity severity = Severity::Error;
    QString file; // as the administrator knows it; empty when no file is to blame
    int line = 0; // 1-based; 0 when no line is
    QString message;
};

enum class ForecastStatus { Allowed, Denied, Unknown };

struct UserForecast
{
    ForecastStatus status = ForecastStatus::Unknown;
    QList<ForecastFinding> findings; // the deciding one first
};

// What vsftpd itself will do when a user logs in with the right password,
// judged from the files the engine loaded, by the server's own rules and
// defaults (vsftpd 3.0.3 as Debian 12 builds it): the configuration as the
// server parses it, the userlist, PAM, the session's account, its home and
// chroot. Nothing is started and nothing is changed. It stands beside the
// verdict of checkAccess and never replaces it.
class LoginForecast
{
public:
    explicit LoginForecast(FtpServerConfig &config, QDate today = QDate::currentDate());
    ~LoginForecast();

    // Problems with which the server does not start or fails every
    // connection (errors), and notes about the configuration.
    const QList<ForecastFinding> &serverFindings() const;
    bool serverFails() const;

    // A user of the table: a local account, a virtual user, or the
    // anonymous row. The findings end with the server-wide ones.
    UserForecast forecast(const QByteArray &user);
    // The same without the server-wide findings, for a listing that gives
    // them once for all users: a failing server leaves none of the user's.
    UserForecast userForecast(const QByteArray &user);
    // The caller took the user from the account store's virtual users: the
    // forecast that follows does not search their names for it again.
    void knownVirtualUser(const QByteArray &user);

private:
    UserForecast forecastAnonymous();
    UserForecast forecastLogin(const QByteArray &login);
    void checkServer();
    bool isListed(const QByteArray &login) const;
    std::optional<ForecastFinding> checkRoot(const QByteArray &account, const QByteArray &directory, bool chrooted,
                                             bool allowWriteable, bool mustEnter,
                                             const std::function<QString()> &what) const;
    const VsftpdSettings *userSettings(const QByteArray &login);
    void checkTls();
    void checkSecureChrootDir();
    void checkUserdbFile(const QByteArray &service, const ConfigFile *serviceFile);
    // What a plain FTP client and a TLS client get when ssl_enable is on:
    // the session's own forecast is the TLS client's, the status the plain
    // client's.
    UserForecast withTls(UserForecast session, bool anonymous) const;

    FtpServerConfig &m_config;
    QDate m_today;
    VsftpdSettings m_settings;
    QString m_mainPath;
    QByteArray m_anonymousRow;
    bool m_anonymousOn;
    QList<ForecastFinding> m_serverFindings;
    bool m_serverFails = false;
    QByteArray m_userlistFile;
    std::optional<QSet<QByteArray>> m_userlist;
    NameFilter m_userlistFilter;
    QByteArray m_chrootListFile;
    // The lines of banned_email_file when deny_email_enable is on.
    QList<QByteArray> m_bannedEmails;
    std::optional<QSet<QByteArray>> m_chrootList;
    std::unique_ptr<ConfigFile> m_ownPam; // when the server's service is another
    std::unique_ptr<PamForecast> m_pam;
    std::map<QByteArray, std::unique_ptr<VsftpdSettings>> m_userFiles;
    // The names in user_config_dir, listed when the first user is looked
    // up; none when it cannot be listed.
    std::optional<QSet<QByteArray>> m_userFileNames;
    NameFilter m_userFileFilter;
    bool m_userFileNamesRead = false;
};

QString forecastStatusText(ForecastStatus status);
QString severityText(ForecastFinding::Severity severity);
// "file:line: message", the parts that are known.
QString findingText(const ForecastFinding &finding);

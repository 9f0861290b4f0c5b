#include "LoginForecast.h"

#include "common/AppStrings.h"
#include "forecast/PamForecast.h"
#include "policy/FtpServerConfig.h"

#include <QFile>
#include <QFileInfo>

#include <algorithm>
#include <dirent.h>
#include <fstream>
#include <sys/stat.h>

namespace {

using Severity = ForecastFinding::Severity;

QString text(const QByteArray &bytes)
{
    return QString::fromUtf8(bytes);
}

// The lines of a list file, read once: vsftpd compares each login with
// whole lines, case-sensitively; a "\r" or a blank before the line end is
// part of the line, and "bob\r" does not name bob.
std::optional<QSet<QByteArray>> readNames(const QString &path)
{
    QFile file(path);
    if (!QFileInfo(path).isFile() || !file.open(QIODevice::ReadOnly))
        return std::nullopt;
    QSet<QByteArray> names;
    for (const QByteArray &line : file.readAll().split('\n'))
        names.insert(line);
    return names;
}

} // namespace

QString forecastStatusText(ForecastStatus status)
{
    switch (status) {
    case ForecastStatus::Allowed:
        return QStringLiteral("allowed");
    case ForecastStatus::Denied:
        return QStringLiteral("denied");
    case ForecastStatus::Unknown:
        break;
    }
    return QStringLiteral("unknown");
}

QString severityText(ForecastFinding::Severity severity)
{
    switch (severity) {
    case Severity::Error:
        return QStringLiteral("error");
    case Severity::Warning:
        return QStringLiteral("warning");
    case Severity::Info:
        break;
    }
    return QStringLiteral("info");
}

QString findingText(const ForecastFinding &finding)
{
    QString out;
    if (!finding.file.isEmpty())
        out += finding.file + (finding.line > 0 ? QStringLiteral(":%1").arg(finding.line) : QString())
            + QStringLiteral(": ");
    return out + finding.message;
}

LoginForecast::LoginForecast(FtpServerConfig &config, QDate today)
    : m_config(config)
    , m_today(today)
    , m_settings(config.mainConfig().elements)
    , m_mainPath(AppStrings::instance().mainConfigPath)
    , m_anonymousRow(AppStrings::instance().anonymousUsers.toLocal8Bit())
    , m_anonymousOn(m_settings.isYes("anonymous_enable", true))
{
    checkServer();
}

LoginForecast::~LoginForecast() = default;

const QList<ForecastFinding> &LoginForecast::serverFindings() const
{
    return m_serverFindings;
}

bool LoginForecast::serverFails() const
{
    return m_serverFails;
}

void LoginForecast::checkServer()
{
    const auto error = [this](const QString &file, int line, const QString &message) {
        m_serverFindings.append({Severity::Error, file, line, message});
        m_serverFails = true;
    };
    const RootDirectory &root = m_config.root();
    const AccountStore &accounts = m_config.accounts();
    AccountRecord record;

    if (!m_config.mainConfigExisted())
        error(m_mainPath, 0, QStringLiteral("the file does not exist: vsftpd does not start"));
    for (const auto &problem : m_settings.errors())
        error(m_mainPath, problem.line, problem.message);
    for (const auto &repeat : m_settings.repeats())
        m_serverFindings.append({Severity::Warning, m_mainPath, repeat.line, repeat.message});

    const bool listen = m_settings.isYes("listen", false);
    const bool listen6 = m_settings.isYes("listen_ipv6", false);
    if (listen && listen6) {
        error(m_mainPath, m_settings.line("listen_ipv6"),
              QStringLiteral("listen and listen_ipv6 are both YES: vsftpd refuses to start (one copy listens for "
                             "IPv4, another for IPv6)"));
    } else if (!listen && !listen6) {
        error(m_mainPath, m_settings.line("listen"),
              QStringLiteral("neither listen nor listen_ipv6 is YES: vsftpd does not listen by itself and every "
                             "connection to the service fails"));
    }

    const bool local = m_settings.isYes("local_enable", false);
    const bool anonymous = m_settings.isYes("anonymous_enable", true);
    if (!local && !anonymous) {
        error(m_mainPath, m_settings.line("local_enable"),
              QStringLiteral("local_enable and anonymous_enable are both off: vsftpd ends every connection"));
    }
    if (anonymous) {
        const QByteArray ftpUser = m_settings.value("ftp_username", "ftp");
        if (!accounts.getUserInfo(ftpUser, record)) {
            error(m_mainPath, m_settings.line("ftp_username"),
                  QStringLiteral("anonymous logins are on, but the account %1 (ftp_username) does not exist: vsftpd "
                                 "ends every connection")
                      .arg(text(ftpUser)));
        }
    }
    if (m_settings.isYes("guest_enable", false)) {
        const QByteArray guest = m_settings.value("guest_username", "ftp");
        if (!accounts.getUserInfo(guest, record)) {
            error(m_mainPath, m_settings.line("guest_username"),
                  QStringLiteral("guest_enable is on, but the account %1 (guest_username) does not exist: vsftpd "
                                 "ends every connection")
                      .arg(text(guest)));
        }
    }
    const QByteArray nopriv = m_settings.value("nopriv_user", "nobody");
    if (!accounts.getUserInfo(nopriv, record)) {
        error(m_mainPath, m_settings.line("nopriv_user"),
              QStringLiteral("the account %1 (nopriv_user) does not exist: vsftpd ends every connection")
                  .arg(text(nopriv)));
    }
    checkSecureChrootDir();
    if (m_settings.isYes("deny_email_enable", false)) {
        // Read when a connection comes in, whether anonymous logins are on
        // or not; a directory reads as an empty list.
        const QByteArray banned = m_settings.value("banned_email_file", "/etc/vsftpd.banned_emails");
        const QString path = root.resolve(text(banned));
        QFile file(path);
        if (QFileInfo(path).isDir()) {
        } else if (file.open(QIODevice::ReadOnly)) {
            // Whole lines, compared as they are: a "\r" or a blank at the
            // end is part of the address.
            m_bannedEmails = file.readAll().split('\n');
            if (m_bannedEmails.constLast().isEmpty())
                m_bannedEmails.removeLast();
        } else {
            error(m_mainPath,
                  m_settings.line("banned_email_file") ? m_settings.line("banned_email_file")
                                                       : m_settings.line("deny_email_enable"),
                  QStringLiteral("deny_email_enable is on, but %1 (banned_email_file) cannot be read: vsftpd ends "
                                 "every connection (cannot read anon e-mail list file)")
                      .arg(text(banned)));
        }
    }
    if (m_settings.isYes("ssl_enable", false))
        checkTls();
    if (m_settings.isYes("userlist_enable", false)) {
        m_userlistFile = m_settings.value("userlist_file", "/etc/vsftpd.user_list");
        m_userlist = readNames(root.resolve(text(m_userlistFile)));
        if (m_userlist) {
            m_userlistFilter.reset(m_userlist->size());
            for (const QByteArray &name : *m_userlist)
                m_userlistFilter.add(name);
        } else {
            error(m_mainPath, m_settings.line("userlist_file"),
                  QStringLiteral("userlist_enable is on, but %1 cannot be read: vsftpd ends every connection")
                      .arg(text(m_userlistFile)));
        }
    }
    m_chrootListFile = m_settings.value("chroot_list_file", "/etc/vsftpd.chroot_list");
    if (m_settings.isYes("chroot_list_enable", false))
        m_chrootList = readNames(root.resolve(text(m_chrootListFile)));

    // The PAM service the server uses: the last pam_service_name, which is
    // the one the engine loaded unless the key is repeated.
    const QByteArray service = m_settings.value("pam_service_name", "vsftpd");
    const ConfigFile *serviceFile = m_config.pamConfigExisted() ? &m_config.pamConfig() : nullptr;
    if (service != m_config.pamServiceName()) {
        const QString path = root.resolve(QStringLiteral("/etc/pam.d/") + text(service));
        std::ifstream in(QFile::encodeName(path).toStdString(), std::ios::in | std::ios::binary);
        serviceFile = nullptr;
        if (in.is_open() && QFileInfo(path).isFile()) {
            m_ownPam = std::make_unique<ConfigFile>(SyntaxMode::TokenLine);
            m_ownPam->parse(in);
            serviceFile = m_ownPam.get();
        }
    }
    // vsftpd runs the session stack only when it opens PAM sessions.
    m_pam = std::make_unique<PamForecast>(root, accounts, text(service), serviceFile,
                                          m_settings.isYes("session_support", false), m_today);
    for (const PamForecast::Note &note : m_pam->notes())
        m_serverFindings.append({Severity::Warning, note.file, note.line, note.message});
    checkUserdbFile(service, serviceFile);
}

void LoginForecast::checkUserdbFile(const QByteArray &service, const ConfigFile *serviceFile)
{
    // pam_userdb appends ".db" to its db= argument whatever it ends in, and
    // the program reads the same file; a value that ends in ".db" most
    // likely means the file without the second one, which nobody reads.
    if (!serviceFile)
        return;
    const QByteArray db = QByteArray::fromStdString(moduleArgument(serviceFile->elements, "pam_userdb.so", "db"));
    if (!db.endsWith(".db"))
        return;
    QString message = QStringLiteral("pam_userdb and this program read %1 (db=%2 with \".db\" appended)")
                          .arg(text(db + ".db"), text(db));
    if (QFileInfo::exists(m_config.root().resolve(text(db))))
        message += QStringLiteral("; neither reads %1").arg(text(db));
    m_serverFindings.append({Severity::Warning, QStringLiteral("/etc/pam.d/") + text(service), 0, message});
}

void LoginForecast::checkSecureChrootDir()
{
    // Every connection is chrooted there as nopriv_user before the login,
    // with the same refusal of a root that account can write to.
    const QByteArray secure = m_settings.value("secure_chroot_dir", "/var/run/vsftpd/empty");
    const int line = m_settings.line("secure_chroot_dir");
    const auto error = [&](const QString &message) {
        m_serverFindings.append({Severity::Error, m_mainPath, line, message});
        m_serverFails = true;
    };
    if (!secure.startsWith('/')) {
        error(QStringLiteral("the directory %1 (secure_chroot_dir) is not an absolute path: vsftpd ends every "
                             "connection (not found: directory given in 'secure_chroot_dir')")
                  .arg(text(secure)));
        return;
    }
    const auto status = m_config.pathStatus(secure);
    if (!status || !S_ISDIR(status->st_mode)) {
        error(QStringLiteral("the directory %1 (secure_chroot_dir) does not exist or is no directory: vsftpd ends "
                             "every connection")
                  .arg(text(secure)));
        return;
    }
    const QByteArray nopriv = m_settings.value("nopriv_user", "nobody");
    AccountRecord record;
    if (!m_config.accounts().getUserInfo(nopriv, record))
        return; // said already
    const std::function<QString()> what = [&] { return QStringLiteral("the directory (secure_chroot_dir)"); };
    if (auto problem = checkRoot(nopriv, secure, true, false, false, what)) {
        error(QStringLiteral("the directory %1 (secure_chroot_dir) is writable by %2 (nopriv_user): vsftpd ends "
                             "every connection (writable root inside chroot)")
                  .arg(text(secure), text(nopriv)));
    }
}

void LoginForecast::checkTls()
{
    const RootDirectory &root = m_config.root();
    // What OpenSSL finds in a PEM file, as far as a look at it tells; the
    // server reads it as root.
    const auto check = [&](const QByteArray &key, const QByteArray &path, const QList<QByteArray> &markers,
                           const QString &what, const QString &oops) -> bool {
        const int line = m_settings.line(key) ? m_settings.line(key) : m_settings.line("ssl_enable");
        const QString onDisk = root.resolve(text(path));
        QFile file(onDisk);
        const QString head = QStringLiteral("ssl_enable is on, but the %1 %2 (%3) ").arg(what, text(path), text(key));
        if (!QFileInfo(onDisk).isFile()) {
            m_serverFindings.append(
                {Severity::Error, m_mainPath, line,
                 head + QStringLiteral("does not exist or is no file: vsftpd does not start (%1)").arg(oops)});
            m_serverFails = true;
            return false;
        } else if (!file.open(QIODevice::ReadOnly)) {
            m_serverFindings.append(
                {Severity::Warning, m_mainPath, line,
                 head + QStringLiteral("cannot be read by this program: whether vsftpd can load it is not judged")});
        } else {
            const QByteArray content = file.readAll();
            if (std::none_of(markers.begin(), markers.end(),
                             [&](const QByteArray &m) { return content.contains(m); })) {
                m_serverFindings.append(
                    {Severity::Error, m_mainPath, line,
                     head + QStringLiteral("holds no PEM %1: vsftpd does not start (%2)").arg(what, oops)});
                m_serverFails = true;
                return false;
            } else if (content.contains("ENCRYPTED")) {
                m_serverFindings.append(
                    {Severity::Warning, m_mainPath, line,
                     head + QStringLiteral("is encrypted: whether vsftpd can load it is not judged")});
            }
        }
        return true;
    };
    const QByteArray certificate = m_settings.value("rsa_cert_file", "/usr/share/ssl/certs/vsftpd.pem");
    // The server stops at the first file it cannot load.
    if (!check("rsa_cert_file", certificate, {"-----BEGIN CERTIFICATE-----", "-----BEGIN TRUSTED CERTIFICATE-----"},
               QStringLiteral("certificate"), QStringLiteral("SSL: cannot load RSA certificate")))
        return;
    // Without a key file of its own the key is looked for in the
    // certificate's file.
    if (m_settings.contains("rsa_private_key_file")) {
        check("rsa_private_key_file", m_settings.value("rsa_private_key_file"), {"PRIVATE KEY-----"},
              QStringLiteral("private key"), QStringLiteral("SSL: cannot load RSA private key"));
    } else {
        check("rsa_cert_file", certificate, {"PRIVATE KEY-----"}, QStringLiteral("private key"),
              QStringLiteral("SSL: cannot load RSA private key"));
    }
    for (const char *key : {"ssl_sslv2", "ssl_sslv3", "ssl_tlsv1"}) {
        if (m_settings.contains(QByteArray::fromRawData(key, int(qstrlen(key))))) {
            m_serverFindings.append(
                {Severity::Info, m_mainPath, m_settings.line(QByteArray::fromRawData(key, int(qstrlen(key)))),
                 QStringLiteral("%1 does not change what a TLS client gets: with Debian 12's OpenSSL, vsftpd 3.0.3 "
                                "accepts TLS 1.2 and 1.3 whatever ssl_sslv2, ssl_sslv3 and ssl_tlsv1 say, and "
                                "refuses SSL 2, SSL 3, TLS 1.0 and 1.1")
                     .arg(QString::fromLatin1(key))});
            break;
        }
    }
}

UserForecast LoginForecast::withTls(UserForecast session, bool anonymous) const
{
    if (!m_settings.isYes("ssl_enable", false))
        return session;
    // Both checks come when the name is typed, before the userlist and PAM.
    const QByteArray loginsKey = anonymous ? "force_anon_logins_ssl" : "force_local_logins_ssl";
    const QByteArray dataKey = anonymous ? "force_anon_data_ssl" : "force_local_data_ssl";
    // A local login on an anonymous-only server is refused before that.
    const bool plainRefused
        = m_settings.isYes(loginsKey, !anonymous) && (anonymous || m_settings.isYes("local_enable", false));
    const bool dataForced = m_settings.isYes(dataKey, !anonymous);
    const bool tlsRefused = anonymous && !m_settings.isYes("allow_anon_ssl", false) && !plainRefused;
    const QString reason = session.findings.isEmpty() ? QString() : session.findings.constFirst().message;
    const auto outcome = [&](const QString &client) -> ForecastFinding {
        switch (session.status) {
        case ForecastStatus::Allowed:
            return {Severity::Info, QString(), 0, client + QStringLiteral(" logs in")};
        case ForecastStatus::Denied:
            return {Severity::Error, QString(), 0, client + QStringLiteral(" is refused: ") + reason};
        case ForecastStatus::Unknown:
            break;
        }
        return {Severity::Warning, QString(), 0, client + QStringLiteral(" may or may not log in: ") + reason};
    };
    const QString plainClient = QStringLiteral("a plain FTP client");
    const QString tlsClient = QStringLiteral("a TLS client (AUTH TLS)");
    ForecastFinding plain = outcome(plainClient);
    if (plainRefused) {
        plain = {Severity::Error, m_mainPath, m_settings.line(loginsKey),
                 QStringLiteral("%1 is refused before its password: %2 is on, and vsftpd answers \"530 %3 sessions "
                                "must use encryption.\"")
                     .arg(plainClient, text(loginsKey),
                          anonymous ? QStringLiteral("Anonymous") : QStringLiteral("Non-anonymous"))};
    } else if (session.status == ForecastStatus::Allowed && dataForced) {
        plain.file = m_mainPath;
        plain.line = m_settings.line(dataKey);
        plain.message += QStringLiteral(", but %1 is on: vsftpd refuses its data connections (no listing and no "
                                        "transfer without TLS)")
                             .arg(text(dataKey));
    }
    ForecastFinding tls = outcome(tlsClient);
    if (tlsRefused) {
        tls = {Severity::Error, m_mainPath, m_settings.line("allow_anon_ssl"),
               QStringLiteral("%1 is refused before its password: allow_anon_ssl is off, and vsftpd answers \"530 "
                              "Anonymous sessions may not use encryption.\"")
                   .arg(tlsClient)};
    }
    UserForecast result;
    result.status = plainRefused ? ForecastStatus::Denied : session.status;
    // The plain client's finding decides the status; it comes first when it
    // is the refusal, after the session's own otherwise.
    if (plainRefused)
        result.findings = {plain, tls};
    result.findings += session.findings;
    if (!plainRefused)
        result.findings += {plain, tls};
    return result;
}

bool LoginForecast::isListed(const QByteArray &login) const
{
    return m_userlist && m_userlistFilter.mayContain(login) && m_userlist->contains(login);
}

const VsftpdSettings *LoginForecast::userSettings(const QByteArray &login)
{
    // The server reads per-user files only when user_config_dir is set, and
    // never for a name with a "/".
    if (!m_settings.contains("user_config_dir") || login.contains('/'))
        return nullptr;
    const auto userFileDirectory = [this] {
        QByteArray directory = m_settings.value("user_config_dir");
        if (!directory.endsWith('/'))
            directory += '/';
        return directory;
    };
    // Most users have no file: the directory is listed once, and only the
    // names it holds are opened (a name with a "/" goes below it).
    if (!m_userFileNamesRead) {
        m_userFileNamesRead = true;
        m_userFileNames.emplace();
        const QByteArray onDisk = QFile::encodeName(m_config.root().resolve(text(userFileDirectory())));
        if (DIR *listed = ::opendir(onDisk.constData())) {
            while (const dirent *entry = ::readdir(listed))
                m_userFileNames->insert(QByteArray(entry->d_name));
            ::closedir(listed);
            m_userFileFilter.reset(m_userFileNames->size());
            for (const QByteArray &name : *m_userFileNames)
                m_userFileFilter.add(name);
        } else {
            m_userFileNames.reset();
        }
    }
    // A directory that cannot be listed is tried name by name; a name it
    // does not hold has no file, and nothing to remember.
    if (m_userFileNames && (!m_userFileFilter.mayContain(login) || !m_userFileNames->contains(login)))
        return nullptr;
    auto it = m_userFiles.find(login);
    if (it == m_userFiles.end()) {
        const QByteArray directory = userFileDirectory();
        std::unique_ptr<VsftpdSettings> settings;
        const QString path = m_config.root().resolve(text(directory + login));
        struct stat info;
        if (::stat(QFile::encodeName(path).constData(), &info) == 0) {
            // The server reads it as root and ends the session on a file it
            // does not trust, whatever it holds.
            if (!S_ISREG(info.st_mode) || info.st_uid != 0) {
                settings = std::make_unique<VsftpdSettings>(ConfigElementList());
                settings->addError(0,
                                   QStringLiteral("the per-user file %1: vsftpd ends the session (config file not "
                                                  "owned by correct user, or not a file)")
                                       .arg(S_ISDIR(info.st_mode) ? QStringLiteral("is a directory")
                                                : !S_ISREG(info.st_mode)
                                                ? QStringLiteral("is no plain file")
                                                : QStringLiteral("belongs to uid %1, not root").arg(info.st_uid)));
            } else {
                std::ifstream in(QFile::encodeName(path).toStdString(), std::ios::in | std::ios::binary);
                ConfigFile file(SyntaxMode::KeyValue);
                file.parse(in);
                settings = std::make_unique<VsftpdSettings>(file.elements);
            }
        }
        it = m_userFiles.emplace(login, std::move(settings)).first;
    }
    return it->second.get();
}

std::optional<ForecastFinding> LoginForecast::checkRoot(const QByteArray &account, const QByteArray &directory,
                                                        bool chrooted, bool allowWriteable, bool mustEnter,
                                                        const std::function<QString()> &what) const
{
    AccountRecord record;
    m_config.accounts().getUserInfo(account, record);
    std::optional<struct stat> status;
    if (!directory.isEmpty())
        status = m_config.pathStatus(directory);
    if (!status || !S_ISDIR(status->st_mode)) {
        return ForecastFinding{Severity::Error, QString(), 0,
                               QStringLiteral("%1 %2 does not exist: vsftpd ends the session (cannot change "
                                              "directory)")
                                   .arg(what(), text(directory))};
    }
    const struct stat &info = *status;
    int shift = 0;
    if (record.uid == 0)
        shift = -1;
    else if (info.st_uid == record.uid)
        shift = 6;
    else if (info.st_gid == record.gid || m_config.accounts().isUserInGroup(account, [&] {
                 const auto group = m_config.accounts().groups().find(info.st_gid);
                 return group == m_config.accounts().groups().end() ? QByteArray() : group->second.name;
             }()))
        shift = 3;
    const bool enterable = shift < 0 || (info.st_mode & (S_IXOTH << shift));
    const bool writable = shift < 0 || (info.st_mode & (S_IWOTH << shift));
    if (mustEnter && !enterable) {
        return ForecastFinding{Severity::Error, QString(), 0,
                               QStringLiteral("%1 %2 cannot be entered by the account %3: vsftpd ends the session")
                                   .arg(what(), text(directory), text(account))};
    }
    if (chrooted && writable && !allowWriteable) {
        return ForecastFinding{Severity::Error, QString(), 0,
                               QStringLiteral("%1 %2 is writable by the account %3 and is the chroot: vsftpd refuses "
                                              "(writable root inside chroot) unless allow_writeable_chroot=YES")
                                   .arg(what(), text(directory), text(account))};
    }
    return std::nullopt;
}

UserForecast LoginForecast::forecast(const QByteArray &user)
{
    UserForecast result = userForecast(user);
    for (const ForecastFinding &finding : m_serverFindings) {
        if (!m_serverFails || finding.severity == Severity::Error)
            result.findings.append(finding);
    }
    return result;
}

void LoginForecast::knownVirtualUser(const QByteArray &user)
{
    m_pam->knownVirtualUser(user);
}

UserForecast LoginForecast::userForecast(const QByteArray &user)
{
    if (m_serverFails)
        return UserForecast{ForecastStatus::Denied, {}};
    // The table's anonymous row, and the names vsftpd itself takes for
    // anonymous logins while they are on.
    if (user == m_anonymousRow || (m_anonymousOn && (user == "anonymous" || user == "ftp")))
        return withTls(forecastAnonymous(), true);
    return withTls(forecastLogin(user), false);
}

UserForecast LoginForecast::forecastAnonymous()
{
    const auto denied = [](const QString &file, int line, const QString &message) {
        return UserForecast{ForecastStatus::Denied, {{Severity::Error, file, line, message}}};
    };
    if (!m_settings.isYes("anonymous_enable", true)) {
        return denied(m_mainPath, m_settings.line("anonymous_enable"),
                      QStringLiteral("anonymous_enable is off: vsftpd refuses anonymous logins"));
    }
    // The list is looked up with the name typed at login, "anonymous" for
    // the table's row ("ftp" would be looked up as itself).
    if (m_userlist) {
        const bool deny = m_settings.isYes("userlist_deny", true);
        const bool listed = isListed("anonymous");
        if (deny && listed) {
            return denied(text(m_userlistFile), 0,
                          QStringLiteral("anonymous is listed in the userlist and userlist_deny is on: vsftpd refuses "
                                         "anonymous logins"));
        }
        if (!deny && !listed) {
            return denied(text(m_userlistFile), 0,
                          QStringLiteral("anonymous is not listed in the userlist and userlist_deny is off: vsftpd "
                                         "refuses anonymous logins"));
        }
    }
    const QByteArray account = m_settings.value("ftp_username", "ftp");
    // An anonymous session reads the per-user file of ftp_username.
    if (const VsftpdSettings *own = userSettings(account); own && !own->errors().isEmpty()) {
        QByteArray directory = m_settings.value("user_config_dir");
        if (!directory.endsWith('/'))
            directory += '/';
        return denied(text(directory + account), own->errors().first().line, own->errors().first().message);
    }
    AccountRecord record;
    m_config.accounts().getUserInfo(account, record);
    const bool anonRoot = m_settings.contains("anon_root");
    const QByteArray root = anonRoot ? m_settings.value("anon_root") : record.home;
    const auto what = [&] {
        return anonRoot ? QStringLiteral("the anonymous root (anon_root)")
                        : QStringLiteral("the anonymous root (home of %1)").arg(text(account));
    };
    // The anonymous root is entered with root's rights, and allow_writeable_chroot
    // does not apply to anonymous sessions.
    if (auto problem = checkRoot(account, root, true, false, false, what)) {
        problem->message.replace(QStringLiteral("unless allow_writeable_chroot=YES"),
                                 QStringLiteral("(allow_writeable_chroot does not apply to anonymous sessions)"));
        problem->file = anonRoot ? m_mainPath : QStringLiteral("/etc/passwd");
        problem->line = anonRoot ? m_settings.line("anon_root") : 0;
        return UserForecast{ForecastStatus::Denied, {*problem}};
    }
    UserForecast result{ForecastStatus::Allowed, {}};
    // The ban depends on the password the client gives, which the forecast
    // does not know: unknown, and the finding names the passwords refused.
    if (m_settings.isYes("deny_email_enable", false) && !m_bannedEmails.isEmpty()) {
        const int line = m_settings.line("deny_email_enable");
        const QByteArray file = m_settings.value("banned_email_file", "/etc/vsftpd.banned_emails");
        if (m_settings.isYes("no_anon_password", false)) {
            result.findings.append({Severity::Info, m_mainPath, line,
                                    QStringLiteral("deny_email_enable bans no one: no_anon_password is on, and vsftpd "
                                                   "asks anonymous clients for no password")});
        } else {
            result.status = ForecastStatus::Unknown;
            QStringList shown;
            for (const QByteArray &address : m_bannedEmails)
                shown.append(QLatin1Char('"') + text(address).replace(QLatin1Char('\r'), QLatin1String("\\r"))
                             + QLatin1Char('"'));
            result.findings.append(
                {Severity::Warning, text(file), 0,
                 QStringLiteral("deny_email_enable is on: vsftpd refuses an anonymous login whose password is one of "
                                "the lines of this file, compared whole and case-sensitively (%1); any other "
                                "password logs in")
                     .arg(shown.size() > 5 ? shown.mid(0, 5).join(QLatin1String(", ")) + QStringLiteral(", ...")
                                           : shown.join(QLatin1String(", ")))});
        }
    }
    return result;
}

UserForecast LoginForecast::forecastLogin(const QByteArray &login)
{
    UserForecast result{ForecastStatus::Allowed, {}};
    const auto deny = [&](const QString &file, int line, const QString &message) {
        result.findings.prepend({Severity::Error, file, line, message});
        result.status = ForecastStatus::Denied;
        return result;
    };
    if (!m_settings.isYes("local_enable", false)) {
        return deny(m_mainPath, m_settings.line("local_enable"),
                    QStringLiteral("local_enable is off: vsftpd admits anonymous logins only"));
    }
    if (m_userlist) {
        const bool deny_ = m_settings.isYes("userlist_deny", true);
        const bool listed = isListed(login);
        if (deny_ && listed) {
            return deny(text(m_userlistFile), 0,
                        QStringLiteral("%1 is listed in the userlist and userlist_deny is on: vsftpd refuses before "
                                       "asking the password")
                            .arg(text(login)));
        }
        if (!deny_ && !listed) {
            return deny(text(m_userlistFile), 0,
                        QStringLiteral("%1 is not listed in the userlist and userlist_deny is off: vsftpd refuses "
                                       "before asking the password")
                            .arg(text(login)));
        }
    }

    const PamForecast::Result pam = m_pam->evaluate(login);
    if (pam.outcome == PamForecast::Outcome::Failure)
        return deny(pam.file, pam.line, pam.message);
    if (pam.outcome == PamForecast::Outcome::Unknown) {
        result.status = ForecastStatus::Unknown;
        result.findings.append({Severity::Warning, pam.file, pam.line, pam.message});
    }

    const VsftpdSettings *own = userSettings(login);
    // Named only in a finding: most users have no file of their own.
    const auto ownPath = [&] {
        QByteArray ownDirectory = m_settings.value("user_config_dir");
        if (!ownDirectory.endsWith('/'))
            ownDirectory += '/';
        return text(ownDirectory + login);
    };
    if (own && !own->errors().isEmpty()) {
        const auto &problem = own->errors().first();
        return deny(ownPath(), problem.line, problem.message);
    }
    const auto setting = [&](const auto &key) -> const VsftpdSettings::Setting * {
        if (own) {
            if (const auto *value = own->find(key))
                return value;
        }
        return m_settings.find(key);
    };
    const auto yes = [&](const auto &key, bool defaultValue) {
        if (own && own->contains(key))
            return own->isYes(key, defaultValue);
        return m_settings.isYes(key, defaultValue);
    };

    // The session becomes its account after the per-user file is read:
    // guest_enable and guest_username there apply.
    const AccountStore &accounts = m_config.accounts();
    const bool guest = yes("guest_enable", false);
    const auto *guestName = setting("guest_username");
    const QByteArray account = guest ? (guestName ? guestName->value : QByteArray("ftp")) : login;
    AccountRecord record;
    if (!accounts.getUserInfo(account, record)) {
        if (guest) {
            return deny(own && own->find("guest_username") ? ownPath() : m_mainPath, guestName ? guestName->line : 0,
                        QStringLiteral("the guest account %1 (guest_username) does not exist: vsftpd ends the "
                                       "session (cannot locate user entry)")
                            .arg(text(account)));
        }
        return deny(m_mainPath, m_settings.line("guest_enable"),
                    QStringLiteral("PAM admits %1, but there is no system account %1 and guest_enable is off: vsftpd "
                                   "ends the session")
                        .arg(text(login)));
    }

    bool chrooted = false;
    if (guest && !yes("virtual_use_local_privs", false)) {
        chrooted = true;
    } else {
        // Decided before the per-user file is read: its chroot keys do
        // nothing.
        chrooted = m_settings.isYes("chroot_local_user", false);
        if (m_settings.isYes("chroot_list_enable", false)) {
            if (!m_chrootList) {
                return deny(m_mainPath, m_settings.line("chroot_list_enable"),
                            QStringLiteral("chroot_list_enable is on, but the chroot list %1 cannot be read: vsftpd "
                                           "ends every local login")
                                .arg(text(m_chrootListFile)));
            }
            if (m_chrootList->contains(login))
                chrooted = !chrooted;
        }
    }

    // The session starts in the home of its account; a local_root that
    // exists replaces it, one that does not is passed over.
    // user_sub_token stands for the name typed at login in the home (the
    // guest account's too) and in local_root.
    const QByteArray token = setting("user_sub_token") ? setting("user_sub_token")->value : QByteArray();
    const auto expand = [&](QByteArray path) { return token.isEmpty() ? path : path.replace(token, login); };
    const QByteArray home = expand(record.home);
    const std::function<QString()> homeWhat
        = [&] { return QStringLiteral("the home directory of %1").arg(text(account)); };
    // passwd_chroot_enable: a confined session whose home holds "/./" is
    // chrooted to the part before it, local_root and the home passed over.
    const int jailEnd = home.indexOf("/./");
    if (chrooted && jailEnd >= 0 && yes("passwd_chroot_enable", false)) {
        const QByteArray jail = jailEnd == 0 ? QByteArray("/") : home.left(jailEnd);
        const std::function<QString()> jailWhat = [&] {
            return QStringLiteral("the chroot of %1 (its home up to \"/./\", passwd_chroot_enable)").arg(text(account));
        };
        if (auto problem = checkRoot(account, jail, true, yes("allow_writeable_chroot", false), true, jailWhat))
            return deny(QStringLiteral("/etc/passwd"), 0, problem->message);
        return result;
    }
    // pam_mkhomedir in the session stack makes a missing home before
    // vsftpd changes into it.
    if (m_pam->sessionMakesHome() && !m_config.pathStatus(home)) {
        result.findings.append({Severity::Info, QStringLiteral("/etc/passwd"), 0,
                                QStringLiteral("the home directory of %1 %2 does not exist: pam_mkhomedir makes it "
                                               "when the session opens")
                                    .arg(text(account), text(home))});
    } else if (auto problem = checkRoot(account, home, false, true, true, homeWhat)) {
        return deny(QStringLiteral("/etc/passwd"), 0, problem->message);
    }
    QByteArray root = home;
    std::function<QString()> rootWhat = homeWhat;
    if (const auto *localRoot = setting("local_root")) {
        QByteArray directory = expand(localRoot->value);
        // A relative local_root is entered from the home.
        if (!directory.startsWith('/'))
            directory = home + (home.endsWith('/') ? "" : "/") + directory;
        const auto status = m_config.pathStatus(directory);
        if (status && S_ISDIR(status->st_mode)) {
            root = directory;
            rootWhat = [] { return QStringLiteral("the local_root"); };
        } else if (chrooted) {
            // Confined, the session must change into it before the chroot.
            return deny(own && own->find("local_root") ? ownPath() : m_mainPath, localRoot->line,
                        QStringLiteral("local_root %1 does not exist and the session is confined to it: vsftpd ends "
                                       "the session (cannot change directory)")
                            .arg(text(directory)));
        } else {
            const QString where = own && own->find("local_root") ? ownPath() : m_mainPath;
            result.findings.append({Severity::Info, where, localRoot->line,
                                    QStringLiteral("local_root %1 does not exist: the session starts in %2")
                                        .arg(text(directory), text(home))});
        }
    }
    if (chrooted) {
        if (auto problem = checkRoot(account, root, true, yes("allow_writeable_chroot", false), true, rootWhat)) {
            const bool fromPasswd = root == home;
            return deny(fromPasswd ? QStringLiteral("/etc/passwd") : m_mainPath, 0, problem->message);
        }
    }
    return result;
}

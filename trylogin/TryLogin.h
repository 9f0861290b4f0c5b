#pragma once

#include <QByteArray>
#include <QString>

#include <atomic>
#include <functional>

class FtpServerConfig;

// One step of a trial login and what came back: a PAM call and its
// pam_strerror text, or an FTP command and the server's reply.
struct TryLoginStep
{
    enum class Stage { Pam, Ftp, FtpTls };
    enum class Outcome { Passed, Failed, Skipped };

    Stage stage = Stage::Pam;
    // "pam_authenticate", "USER bob", "PASS ********", ...; never the
    // password.
    QString command;
    Outcome outcome = Outcome::Skipped;
    QString text;
};

// What to try, read from the configuration: the PAM service and where the
// local vsftpd listens. The password is the caller's to clear.
struct TryLoginRequest
{
    QByteArray user;
    QByteArray password;
    QByteArray pamService = "vsftpd";
    QString address = QStringLiteral("127.0.0.1");
    quint16 port = 21;
    bool tls = false;
    // The anonymous row: the login is "anonymous", its password any
    // e-mail address, and vsftpd asks PAM nothing.
    bool anonymous = false;
    // Empty when PAM and the server of this machine are the ones the
    // configuration describes; otherwise why they are not tried.
    QString skipReason;
    // Each network step waits this long at most.
    int stepTimeoutMs = 4000;

    // pam_service_name, listen_address, listen_port and ssl_enable of the
    // configuration; on another root than "/" the skip reason says why the
    // machine's PAM and server are not that configuration's.
    static TryLoginRequest fromConfig(const FtpServerConfig &config, const QByteArray &user);
};

using TryLoginReport = std::function<void(const TryLoginStep &)>;

// Runs PAM, then the plain FTP login, then the TLS one when ssl_enable is
// on, reporting each step as it ends. Blocking and bounded: meant for a
// worker thread. cancel ends it between steps.
void tryLogin(const TryLoginRequest &request, const TryLoginReport &report, const std::atomic_bool &cancel);

// The service's auth and account stacks for the user, as vsftpd runs them.
void tryPamLogin(const TryLoginRequest &request, const TryLoginReport &report);

// A login to the server with every reply reported: banner, (AUTH TLS,)
// USER, PASS, PWD, PASV and LIST, QUIT. False when nothing listens.
bool tryFtpLogin(const TryLoginRequest &request, bool tls, const TryLoginReport &report,
                 const std::atomic_bool &cancel);

QString stageText(TryLoginStep::Stage stage);
QString outcomeText(TryLoginStep::Outcome outcome);

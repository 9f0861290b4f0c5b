#include "TryLogin.h"

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QHostAddress>
#include <QRegularExpression>
#include <QSslCertificate>
#include <QSslCipher>
#include <QSslConfiguration>
#include <QSslSocket>
#include <QStringList>

#include <memory>

namespace {

QString tr(const char *text)
{
    return QCoreApplication::translate("TryLogin", text);
}

// Lines of a listing shown at most; the rest is counted.
constexpr int listingLines = 20;

// The control connection of one session, blocking with a deadline for each
// step (it runs on a worker thread).
class Session
{
public:
    Session(const TryLoginRequest &request, bool tls, const TryLoginReport &report)
        : m_request(request)
        , m_tls(tls)
        , m_report(report)
    {
    }

    void step(const QString &command, TryLoginStep::Outcome outcome, const QString &text)
    {
        m_report({m_tls ? TryLoginStep::Stage::FtpTls : TryLoginStep::Stage::Ftp, command, outcome, text});
    }

    bool connect()
    {
        const QString where = m_request.address + QLatin1Char(':') + QString::number(m_request.port);
        m_socket.connectToHost(m_request.address, m_request.port);
        if (!m_socket.waitForConnected(m_request.stepTimeoutMs)) {
            step(tr("connect to %1").arg(where), TryLoginStep::Outcome::Failed,
                 tr("vsftpd is not listening on %1: %2").arg(where, m_socket.errorString()));
            return false;
        }
        return true;
    }

    // The reply's code (0 when none came) and its lines joined.
    int reply(QString *text)
    {
        QStringList lines;
        QDeadlineTimer deadline(m_request.stepTimeoutMs);
        QByteArray code;
        while (true) {
            while (!m_socket.canReadLine()) {
                const bool connected = m_socket.state() == QAbstractSocket::ConnectedState;
                if (connected && !deadline.hasExpired() && m_socket.waitForReadyRead(int(deadline.remainingTime())))
                    continue;
                if (m_socket.canReadLine())
                    break;
                // A line cut short stays unread: the reply is what came
                // before it.
                lines << (m_socket.state() == QAbstractSocket::ConnectedState
                              ? tr("(no reply within %1 s)").arg(m_request.stepTimeoutMs / 1000.0)
                              : tr("(connection closed by the server)"));
                *text = lines.join(QLatin1Char('\n'));
                return 0;
            }
            const QByteArray line = m_socket.readLine().trimmed();
            lines << QString::fromUtf8(line);
            // A reply of several lines begins "123-" and ends "123 ".
            if (code.isEmpty() && line.size() >= 3)
                code = line.left(3);
            if (line.size() >= 3 && line.left(3) == code && (line.size() == 3 || line.at(3) == ' ')) {
                *text = lines.join(QLatin1Char('\n'));
                return code.toInt();
            }
        }
    }

    // Sends a command (shown as `shown`) and reports its reply; true when
    // the reply's code is one of the expected first digits.
    int command(const QByteArray &line, const QString &shown, const QByteArray &expected, QString *replyText = nullptr)
    {
        m_socket.write(line + "\r\n");
        m_socket.waitForBytesWritten(m_request.stepTimeoutMs);
        QString text;
        const int code = reply(&text);
        const bool ok = code != 0 && expected.contains(char('0' + code / 100));
        // A server that ends the session after a refusal leaves nothing to
        // quit: no fault of the QUIT.
        const bool ended = code == 0 && line == "QUIT" && m_socket.state() != QAbstractSocket::ConnectedState;
        step(shown,
             ok          ? TryLoginStep::Outcome::Passed
                 : ended ? TryLoginStep::Outcome::Skipped
                         : TryLoginStep::Outcome::Failed,
             text);
        if (replyText)
            *replyText = text;
        return ok ? code : -code - 1;
    }

    bool run(const std::atomic_bool &cancel)
    {
        if (!connect())
            return false;
        QString text;
        const int banner = reply(&text);
        step(tr("banner"), banner / 100 == 2 ? TryLoginStep::Outcome::Passed : TryLoginStep::Outcome::Failed, text);
        if (banner / 100 != 2 || cancel)
            return true;
        if (m_tls && !startTls())
            return true;
        if (!cancel && login() && !cancel)
            listing();
        if (m_socket.state() == QAbstractSocket::ConnectedState)
            command("QUIT", QStringLiteral("QUIT"), "2");
        m_socket.disconnectFromHost();
        return true;
    }

private:
    bool startTls()
    {
        if (command("AUTH TLS", QStringLiteral("AUTH TLS"), "2") < 0)
            return false;
        // The server's certificate is taken as it is: this is a test of the
        // local server, not a client that trusts it.
        m_socket.setPeerVerifyMode(QSslSocket::VerifyNone);
        // Kept, so that the data connection can resume the session.
        QSslConfiguration configuration = m_socket.sslConfiguration();
        configuration.setSslOption(QSsl::SslOptionDisableSessionPersistence, false);
        m_socket.setSslConfiguration(configuration);
        m_socket.startClientEncryption();
        if (!m_socket.waitForEncrypted(m_request.stepTimeoutMs)) {
            step(tr("TLS handshake"), TryLoginStep::Outcome::Failed, m_socket.errorString());
            return false;
        }
        const QSslCipher cipher = m_socket.sessionCipher();
        step(tr("TLS handshake"), TryLoginStep::Outcome::Passed,
             tr("%1, %2; the server's certificate (%3) is accepted unchecked for this local test")
                 .arg(cipher.protocolString(), cipher.name(),
                      m_socket.peerCertificate().subjectDisplayName().isEmpty()
                          ? tr("none")
                          : m_socket.peerCertificate().subjectDisplayName()));
        return command("PBSZ 0", QStringLiteral("PBSZ 0"), "2") > 0
            && command("PROT P", QStringLiteral("PROT P"), "2") > 0;
    }

    bool login()
    {
        const QByteArray user = "USER " + m_request.user;
        const int userCode = command(user, QString::fromUtf8(user), "23");
        if (userCode < 0)
            return false;
        if (userCode == 331) {
            QByteArray pass = "PASS " + m_request.password;
            const int passCode = command(pass, QStringLiteral("PASS ********"), "2");
            pass.fill('\0');
            if (passCode < 0)
                return false;
        }
        return command("PWD", QStringLiteral("PWD"), "2") > 0;
    }

    void listing()
    {
        QString text;
        if (command("PASV", QStringLiteral("PASV"), "2", &text) < 0)
            return;
        const QRegularExpressionMatch match
            = QRegularExpression(QStringLiteral("\\((\\d+),(\\d+),(\\d+),(\\d+),(\\d+),(\\d+)\\)")).match(text);
        if (!match.hasMatch()) {
            step(QStringLiteral("LIST"), TryLoginStep::Outcome::Failed, tr("No address in the PASV reply."));
            return;
        }
        // vsftpd names its own address; connecting to the one the control
        // connection uses keeps the test on this machine.
        const quint16 port = quint16(match.captured(5).toInt() * 256 + match.captured(6).toInt());
        QSslSocket data;
        if (m_tls) {
            // The server asks for the control connection's TLS session
            // again on the data connection (require_ssl_reuse).
            data.setSslConfiguration(m_socket.sslConfiguration());
            data.setPeerVerifyMode(QSslSocket::VerifyNone);
        }
        data.connectToHost(m_request.address, port);
        if (!data.waitForConnected(m_request.stepTimeoutMs)) {
            step(QStringLiteral("LIST"), TryLoginStep::Outcome::Failed,
                 tr("Cannot open the data connection: %1").arg(data.errorString()));
            return;
        }
        if (command("LIST", QStringLiteral("LIST"), "1") < 0)
            return;
        if (m_tls) {
            data.startClientEncryption();
            if (!data.waitForEncrypted(m_request.stepTimeoutMs))
                step(tr("data TLS handshake"), TryLoginStep::Outcome::Failed, data.errorString());
        }
        QByteArray listing;
        QDeadlineTimer deadline(m_request.stepTimeoutMs);
        while (data.state() == QAbstractSocket::ConnectedState && !deadline.hasExpired()) {
            data.waitForReadyRead(int(qMax<qint64>(1, deadline.remainingTime())));
            listing += data.readAll();
        }
        listing += data.readAll();
        data.abort();
        QStringList lines = QString::fromUtf8(listing).split(QStringLiteral("\r\n"), Qt::SkipEmptyParts);
        const int total = lines.size();
        if (total > listingLines) {
            lines = lines.mid(0, listingLines);
            lines << tr("... %1 more").arg(total - listingLines);
        }
        step(tr("listing"), TryLoginStep::Outcome::Passed,
             total ? lines.join(QLatin1Char('\n')) : tr("(empty directory)"));
        QString done;
        const int code = reply(&done);
        step(tr("end of LIST"), code / 100 == 2 ? TryLoginStep::Outcome::Passed : TryLoginStep::Outcome::Failed, done);
    }

    const TryLoginRequest &m_request;
    bool m_tls;
    const TryLoginReport &m_report;
    QSslSocket m_socket;
};

} // namespace

bool tryFtpLogin(const TryLoginRequest &request, bool tls, const TryLoginReport &report, const std::atomic_bool &cancel)
{
    Session session(request, tls, report);
    return session.run(cancel);
}

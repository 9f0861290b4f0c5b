#include "TryLogin.h"

#include "policy/FtpServerConfig.h"

#include <QCoreApplication>

namespace {

QString tr(const char *text)
{
    return QCoreApplication::translate("TryLogin", text);
}

} // namespace

TryLoginRequest TryLoginRequest::fromConfig(const FtpServerConfig &config, const QByteArray &user)
{
    TryLoginRequest request;
    request.anonymous = config.isAnonymousUser(user);
    request.user = request.anonymous ? QByteArray("anonymous") : user;
    request.pamService = config.pamServiceName();
    // vsftpd listens on every address unless told one; the loopback one
    // reaches it from here.
    const QByteArray address = config.value("listen_address");
    if (!address.isEmpty())
        request.address = QString::fromLatin1(address);
    bool ok = false;
    const uint port = config.value("listen_port", "21").toUInt(&ok);
    request.port = ok && port > 0 && port < 65536 ? quint16(port) : 21;
    request.tls = config.isYes("ssl_enable");
    if (!config.root().isSystemRoot())
        request.skipReason
            = tr("Not run: the program works on %1, while libpam and a running vsftpd read this machine's /etc.")
                  .arg(config.root().path());
    return request;
}

void tryLogin(const TryLoginRequest &request, const TryLoginReport &report, const std::atomic_bool &cancel)
{
    tryPamLogin(request, report);
    if (cancel)
        return;
    if (!request.skipReason.isEmpty()) {
        report({TryLoginStep::Stage::Ftp, tr("connect"), TryLoginStep::Outcome::Skipped, request.skipReason});
        return;
    }
    if (!tryFtpLogin(request, false, report, cancel) || cancel)
        return;
    if (request.tls)
        tryFtpLogin(request, true, report, cancel);
}

QString stageText(TryLoginStep::Stage stage)
{
    switch (stage) {
    case TryLoginStep::Stage::Pam:
        return tr("PAM");
    case TryLoginStep::Stage::Ftp:
        return tr("FTP");
    case TryLoginStep::Stage::FtpTls:
        return tr("FTP over TLS");
    }
    return {};
}

QString outcomeText(TryLoginStep::Outcome outcome)
{
    switch (outcome) {
    case TryLoginStep::Outcome::Passed:
        return tr("passed");
    case TryLoginStep::Outcome::Failed:
        return tr("failed");
    case TryLoginStep::Outcome::Skipped:
        return tr("skipped");
    }
    return {};
}

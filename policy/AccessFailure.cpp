#include "AccessFailure.h"

#include <QCoreApplication>

QString failureKindText(FailureKind kind)
{
    return failureKindText(static_cast<uint32_t>(kind));
}

QString failureKindText(uint32_t kind)
{
    switch (kind) {
    case 0:
        return QCoreApplication::translate("FtpServerConfig", "none");
    case 1:
        return QCoreApplication::translate("FtpServerConfig", "PAM ftpusers file");
    case 2:
        return QCoreApplication::translate("FtpServerConfig", "FTP userlist file");
    case 3:
        return QCoreApplication::translate("FtpServerConfig", "main vsftpd configuration file");
    case 5:
        return QCoreApplication::translate("FtpServerConfig", "/etc/passwd or /etc/shadow");
    case 6:
        return QCoreApplication::translate("FtpServerConfig", "filesystem permissions");
    default:
        return QString();
    }
}

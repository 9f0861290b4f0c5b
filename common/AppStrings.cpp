#include "AppStrings.h"

#include <QCoreApplication>

const AppStrings &AppStrings::instance()
{
    static const AppStrings strings;
    return strings;
}

AppStrings::AppStrings()
    : everybody(tr("Everybody"))
    , localUsers(tr("Local users"))
    , virtualUsers(tr("Virtual users"))
    , anonymousUsers(tr("Anonymous users"))
    , anonymousWord(tr("anonymous"))
    , allowed(tr("allowed"))
    , denied(tr("denied"))
    , fullAccess(tr("full access"))
    , write(tr("write"))
    , download(tr("download"))
    , upload(tr("upload"))
    , mkdir(tr("mkdir"))
    , ownerLabel(tr("Owner: "))
    , groupLabel(tr("Group: "))
    , otherLabel(tr("Other: "))
    , optionPageTitles({tr("General"), tr("Connection message"), tr("Allowed commands"), tr("Filename patterns"),
                        tr("Anonymous"), tr("Deny by email"), tr("Download and upload"), tr("Users chroot"),
                        tr("Miscellaneous")})
    , allInterfaces(tr("All interfaces"))
    , mainConfigPath(QStringLiteral("/etc/vsftpd.conf"))
    , pamDirectory(QStringLiteral("/etc/pam.d/"))
    , passwdPath(QStringLiteral("/etc/passwd"))
    , shadowPath(QStringLiteral("/etc/shadow"))
    , groupPath(QStringLiteral("/etc/group"))
    , stateDirectory(QStringLiteral("/var/lib/ftpconfig"))
    , virtualUsersDbName(QStringLiteral("vsftpd_virtual_users.db"))
    , anonymousAccount(QStringLiteral("ftp"))
{
}

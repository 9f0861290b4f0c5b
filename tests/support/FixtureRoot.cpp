#include "FixtureRoot.h"

#include "Process.h"

#include <QDir>
#include <QFileInfo>

#include <sys/stat.h>

FixtureRoot::FixtureRoot(const QString &base)
    : TemporaryRoot(base)
{
}

FileMap FixtureRoot::defaults()
{
    return {
        {QStringLiteral("/etc/passwd"),
         "root:x:0:0:root:/root:/bin/bash\n"
         "ftp:x:107:113:ftp daemon:/srv/ftp:/usr/sbin/nologin\n"
         "bob:x:1000:1000:Bob:/home/bob:/bin/bash\n"
         "alice:x:1001:1001:Alice:/home/alice:/bin/bash\n"
         "locked:x:1002:1002::/home/locked:/bin/bash\n"
         "starred:*:1003:1003::/home/starred:/bin/bash\n"
         "lockedhash:x:1004:1004::/home/lockedhash:/bin/bash\n"
         "doublebang:x:1005:1005::/home/doublebang:/bin/bash\n"},
        {QStringLiteral("/etc/shadow"),
         "root:*:19000:0:99999:7:::\n"
         "ftp:*:19000:0:99999:7:::\n"
         "bob:$6$salt$bobhash:19000:0:99999:7:::\n"
         "alice:$6$salt$alicehash:19000:0:99999:7:::\n"
         "locked:!:19000:0:99999:7:::\n"
         "starred:$6$salt$h:19000:0:99999:7:::\n"
         "lockedhash:!$6$salt$h:19000:0:99999:7:::\n"
         "doublebang:!!:19000:0:99999:7:::\n"},
        {QStringLiteral("/etc/group"),
         "root:x:0:\nftp:x:113:\nbob:x:1000:\nalice:x:1001:\nlocked:x:1002:\nstarred:x:1003:\n"
         "lockedhash:x:1004:\ndoublebang:x:1005:\nftpusers:x:2000:alice\nwriters:x:2001:ftp\n"},
        {QStringLiteral("/etc/vsftpd.conf"), "listen=YES\nlocal_enable=YES\n"},
        {QStringLiteral("/etc/pam.d/vsftpd"),
         "# Standard behaviour for ftpd(8).\n"
         "auth\trequired\tpam_listfile.so item=user sense=deny file=/etc/ftpusers onerr=succeed\n"
         "\n"
         "@include common-account\n"
         "@include common-session\n"
         "@include common-auth\n"
         "auth\trequired\tpam_shells.so\n"},
        {QStringLiteral("/etc/ftpusers"), "# /etc/ftpusers: list of users disallowed FTP access.\n\nroot\n"},
    };
}

bool FixtureRoot::write(const FileMap &files)
{
    FileMap all = defaults();
    for (auto it = files.begin(); it != files.end(); ++it)
        all[it.key()] = it.value();
    for (auto it = all.begin(); it != all.end(); ++it) {
        if (it.value().isNull())
            continue;
        if (!writeFile(it.key(), it.value(), it.key() == QLatin1String("/etc/shadow") ? 0640 : 0644))
            return false;
    }
    for (const char *home : {"/root", "/home/bob", "/home/alice", "/home/locked", "/home/starred", "/home/lockedhash",
                             "/home/doublebang"}) {
        if (!makeDirectory(QString::fromLatin1(home)))
            return false;
    }
    // The anonymous root belongs to root and is not writable by the group.
    if (!makeDirectory(QStringLiteral("/srv/ftp")))
        return false;
    return ::chmod(QFile::encodeName(filePath(QStringLiteral("/srv/ftp"))).constData(), 0755) == 0;
}

bool FixtureRoot::writeVirtualUsers(const QString &path, const QMap<QByteArray, QByteArray> &users)
{
    QByteArray pairs;
    for (auto it = users.begin(); it != users.end(); ++it)
        pairs += it.key() + '\n' + it.value() + '\n';
    const QString file = filePath(path);
    QDir().mkpath(QFileInfo(file).absolutePath());
    QFile::remove(file);
    const ProcessResult result
        = runProcess(QStringLiteral("db5.3_load"),
                     {QStringLiteral("-T"), QStringLiteral("-t"), QStringLiteral("hash"), file}, pairs);
    return result.finished && result.exitCode == 0;
}

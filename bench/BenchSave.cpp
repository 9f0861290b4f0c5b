// Saves a root with 100,000 virtual users and 1,000 per-user files: with
// nothing changed, with every per-user file changed, and with virtual users
// added. Usage: benchsave [virtual-users] [per-user-files] [added-users]
#include "BenchSupport.h"
#include "policy/FtpServerConfig.h"
#include "report/AccessReport.h"

#include <QCoreApplication>
#include <QDir>
#include <QElapsedTimer>
#include <QFile>
#include <QStandardPaths>
#include <QTemporaryDir>

#include <cstdio>
#include <iostream>
#include <sstream>

namespace {

double ms(const QElapsedTimer &timer)
{
    return timer.nsecsElapsed() / 1e6;
}

} // namespace

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    QStandardPaths::setTestModeEnabled(true);
    const int virtualUsers = argc > 1 ? std::atoi(argv[1]) : 100000;
    const int perUserFiles = argc > 2 ? std::atoi(argv[2]) : 1000;
    const int added = argc > 3 ? std::atoi(argv[3]) : 1000;

    QTemporaryDir dir;
    const QString root = dir.path();
    QByteArray passwd = "root:x:0:0::/root:/bin/sh\nftp:x:107:113::/srv/ftp:/usr/sbin/nologin\n";
    for (int i = 0; i < perUserFiles; ++i) {
        passwd += "user" + QByteArray::number(i) + ":x:" + QByteArray::number(10000 + i) + ":1000::/home/u:/bin/sh\n";
        writeBenchFile(root + QLatin1String("/etc/vsftpd.d/users.d/user") + QString::number(i),
                       "# per-user settings\nlocal_root=/srv/user" + QByteArray::number(i) + "\ndownload_enable=YES\n");
    }
    writeBenchFile(root + QLatin1String("/etc/passwd"), passwd);
    writeBenchFile(root + QLatin1String("/etc/shadow"), "");
    writeBenchFile(root + QLatin1String("/etc/group"), "users:x:1000:\n");
    writeBenchFile(root + QLatin1String("/etc/vsftpd.conf"),
                   "listen=YES\nlocal_enable=YES\nguest_enable=YES\nuserlist_enable=YES\n");
    writeBenchFile(root + QLatin1String("/etc/vsftpd.d/allowed_user_list.conf"), "");
    writeBenchFile(root + QLatin1String("/etc/vsftpd.chroot_list"), "");
    writeBenchFile(root + QLatin1String("/etc/pam.d/vsftpd"),
                   "auth sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n"
                   "account sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n");
    loadBenchDatabase(root + QLatin1String("/var/lib/ftpconfig/users.db"), virtualUserPairs(virtualUsers));

    std::ostringstream quiet;
    std::streambuf *out = std::cout.rdbuf(quiet.rdbuf());
    ReportInteraction interaction;
    QElapsedTimer timer;
    timer.start();
    FtpServerConfig config(interaction, RootDirectory(root));
    config.load();
    const double loadMs = ms(timer);

    config.save(); // the first save adds nothing worth timing: settle the files
    timer.restart();
    config.save();
    const double unchangedMs = ms(timer);

    QList<QByteArray> users;
    for (const auto &entry : config.userConfigs())
        users << entry.first;
    for (const QByteArray &user : users)
        config.setUserRights(user, QStringLiteral("write, download"));
    timer.restart();
    const bool filesOk = config.save();
    const double filesMs = ms(timer);

    for (int i = 0; i < added; ++i)
        config.accounts().addVirtualUser("added" + QByteArray::number(i), "pw" + QByteArray::number(i));
    timer.restart();
    const bool addedOk = config.save();
    const double addedMs = ms(timer);

    std::cout.rdbuf(out);
    std::printf("virtual users %d, per-user files %d: load %.0f ms\n", virtualUsers, perUserFiles, loadMs);
    std::printf("save, nothing changed: %.1f ms\n", unchangedMs);
    std::printf("save, %d per-user files changed: %.1f ms (%s)\n", perUserFiles, filesMs, filesOk ? "ok" : "failed");
    std::printf("save, %d virtual users added: %.1f ms (%s)\n", added, addedMs, addedOk ? "ok" : "failed");
    return 0;
}

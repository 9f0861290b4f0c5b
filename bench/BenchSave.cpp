// Saves a root with 100,000 virtual users and 1,000 per-user files: with
// nothing changed, with every per-user file changed, and with virtual users
// added. Usage: benchsave [virtual-users] [per-user-files] [added-users]
#include "policy/AccessReport.h"
#include "policy/FtpServerConfig.h"

#include <QCoreApplication>
#include <QDir>
#include <QElapsedTimer>
#include <QFile>
#include <QProcess>
#include <QStandardPaths>
#include <QTemporaryDir>

#include <cstdio>
#include <iostream>
#include <sstream>

namespace {

void writeFile(const QString &path, const QByteArray &content)
{
    QDir().mkpath(QFileInfo(path).absolutePath());
    QFile file(path);
    if (!file.open(QIODevice::WriteOnly) || file.write(content) != content.size())
        std::fprintf(stderr, "cannot write %s\n", qPrintable(path));
}

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
        writeFile(root + "/etc/vsftpd.d/users.d/user" + QString::number(i),
                  "# per-user settings\nlocal_root=/srv/user" + QByteArray::number(i) + "\ndownload_enable=YES\n");
    }
    writeFile(root + "/etc/passwd", passwd);
    writeFile(root + "/etc/shadow", "");
    writeFile(root + "/etc/group", "users:x:1000:\n");
    writeFile(root + "/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nguest_enable=YES\nuserlist_enable=YES\n");
    writeFile(root + "/etc/vsftpd.d/allowed_user_list.conf", "");
    writeFile(root + "/etc/vsftpd.chroot_list", "");
    writeFile(root + "/etc/pam.d/vsftpd",
              "auth sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n"
              "account sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n");
    QByteArray pairs;
    for (int i = 0; i < virtualUsers; ++i)
        pairs += "virtual" + QByteArray::number(i) + "\npassword" + QByteArray::number(i) + "\n";
    QDir().mkpath(root + "/var/lib/ftpconfig");
    QProcess load;
    load.start("db5.3_load", {"-T", "-t", "hash", root + "/var/lib/ftpconfig/users.db"});
    load.write(pairs);
    load.closeWriteChannel();
    load.waitForFinished(600000);

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

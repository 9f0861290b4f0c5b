// Loads a root, changes a little of everything and saves it: the process
// the crash test kills in the middle of its save. Prints "SAVING" just
// before the save begins and "SAVED" once it is done.
#include "policy/FtpServerConfig.h"
#include "report/AccessReport.h"

#include <QCoreApplication>

#include <cstdio>
#include <iostream>
#include <sstream>

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    if (argc < 2)
        return 2;
    std::ostringstream quiet;
    std::cout.rdbuf(quiet.rdbuf());
    ReportInteraction interaction;
    FtpServerConfig config(interaction, RootDirectory(QString::fromLocal8Bit(argv[1])));
    config.load();

    setValue(config.mainConfig().elements, "", "banner_file", "/etc/vsftpd.banner-new");
    config.userlist().append(QStringLiteral("newcomer"));
    config.chrootList().append(QStringLiteral("confined"));
    removeTokenEverywhere(config.ftpusersList().elements, "user5");
    QList<QByteArray> users;
    for (const auto &entry : config.userConfigs())
        users << entry.first;
    for (const QByteArray &user : users)
        config.setUserRights(user, QStringLiteral("write, download"));

    std::fputs("SAVING\n", stdout);
    std::fflush(stdout);
    const bool ok = config.save();
    std::fputs(ok ? "SAVED\n" : "FAILED\n", stdout);
    std::fflush(stdout);
    return ok ? 0 : 1;
}

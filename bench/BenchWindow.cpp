// From start to the main window shown, on a generated root with many local
// and virtual users, and the peak memory of the process by then.
// Usage: benchwindow [accounts] [virtual-users] [idle-ms before the filters]
// (QT_QPA_PLATFORM=offscreen)
#include "BenchSupport.h"
#include "app/CMainWindow.h"

#include <QAction>
#include <QApplication>
#include <QElapsedTimer>
#include <QTemporaryDir>
#include <QWindow>

#include <cstdio>
#include <sys/resource.h>

namespace {

void generate(const QString &root, int accounts, int virtualUsers)
{
    QByteArray passwd = "root:x:0:0::/root:/bin/sh\nftp:x:107:113::/srv/ftp:/usr/sbin/nologin\n"
                        "nobody:x:65534:65534::/nonexistent:/usr/sbin/nologin\n";
    QByteArray shadow = "root:*:19000:0:99999:7:::\nftp:*:19000:0:99999:7:::\n";
    for (int i = 0; i < accounts; ++i) {
        const QByteArray n = QByteArray::number(i);
        passwd += "user" + n + ":x:" + QByteArray::number(10000 + i) + ":1000::/home/user" + n + ":/bin/bash\n";
        shadow += "user" + n + ":" + (i % 10 ? "$6$salt$hash" : "!") + ":19000:0:99999:7:::\n";
    }
    writeBenchFile(root + QStringLiteral("/etc/passwd"), passwd);
    writeBenchFile(root + QStringLiteral("/etc/shadow"), shadow);
    writeBenchFile(root + QStringLiteral("/etc/group"), "root:x:0:\nftp:x:113:\nusers:x:1000:\n");
    writeBenchFile(root + QStringLiteral("/etc/vsftpd.conf"), "listen=YES\nlocal_enable=YES\nguest_enable=YES\n");
    writeBenchFile(root + QStringLiteral("/etc/pam.d/vsftpd"),
                   "auth sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n"
                   "account sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n"
                   "@include common-auth\n");
    QDir().mkpath(root + QStringLiteral("/srv/ftp"));
    loadBenchDatabase(root + QStringLiteral("/var/lib/ftpconfig/users.db"), virtualUserPairs(virtualUsers));
}

} // namespace

int main(int argc, char **argv)
{
    const int accounts = argc > 1 ? std::atoi(argv[1]) : 10000;
    const int virtualUsers = argc > 2 ? std::atoi(argv[2]) : 100000;
    const int idleMs = argc > 3 ? std::atoi(argv[3]) : 0;
    QTemporaryDir root;
    QTemporaryDir settings;
    generate(root.path(), accounts, virtualUsers);
    qputenv("FTPCONFIG_ROOT", QFile::encodeName(root.path()));
    qputenv("XDG_CONFIG_HOME", QFile::encodeName(settings.path()));

    QElapsedTimer timer;
    timer.start();
    QApplication app(argc, argv);
    const double appMs = timer.nsecsElapsed() / 1e6;
    CMainWindow window;
    const double builtMs = timer.nsecsElapsed() / 1e6;
    window.show();
    // Shown means painted once: the first rows' verdicts are computed then.
    while (!window.isVisible() || !window.windowHandle() || !window.windowHandle()->isExposed())
        QCoreApplication::processEvents(QEventLoop::AllEvents, 10);
    QCoreApplication::processEvents();
    const double shownMs = timer.nsecsElapsed() / 1e6;

    // The operator's first move comes a moment after the window shows;
    // the table uses that time to make every verdict ready.
    QElapsedTimer idle;
    idle.start();
    while (idle.elapsed() < idleMs)
        QCoreApplication::processEvents(QEventLoop::AllEvents, 5);

    // Each filter on and off, twice: the first filter that needs every
    // user's verdict evaluates them all; later toggles reuse the values.
    QList<QPair<QString, double>> toggles;
    for (int round = 0; round < 2; ++round) {
        for (const char *name : {"hideDeniedUsersAction", "hideAllowedUsersAction", "hideSystemUsersAction"}) {
            auto *action = window.findChild<QAction *>(QLatin1String(name));
            if (!action)
                continue;
            for (int flip = 0; flip < 2; ++flip) {
                QElapsedTimer toggle;
                toggle.start();
                action->trigger();
                QCoreApplication::processEvents();
                toggles.append(
                    {QLatin1String(name) + (action->isChecked() ? QLatin1String(" on") : QLatin1String(" off")),
                     toggle.nsecsElapsed() / 1e6});
            }
        }
    }

    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    std::printf("%d accounts, %d virtual users, filters after %d ms idle\n", accounts, virtualUsers, idleMs);
    std::printf("application %.0f ms, window built %.0f ms, window shown %.0f ms\n", appMs, builtMs, shownMs);
    for (const auto &[name, ms] : toggles)
        std::printf("toggle %s: %.0f ms\n", qPrintable(name), ms);
    std::printf("peak memory %.0f MB\n", usage.ru_maxrss / 1024.0);
    return 0;
}

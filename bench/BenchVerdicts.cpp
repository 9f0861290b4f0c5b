// Loads a generated root and evaluates every user of the table, at the
// given size and at twice that size, to show that the cost grows linearly.
// Usage: benchverdicts [accounts] [virtual-users] [userlist-names] [runs]
#include "BenchSupport.h"
#include "forecast/LoginForecast.h"
#include "policy/FtpServerConfig.h"
#include "report/AccessReport.h"

#include <QCoreApplication>
#include <QDir>
#include <QElapsedTimer>
#include <QFile>
#include <QStandardPaths>
#include <QTemporaryDir>

#include <algorithm>
#include <cstdio>
#include <iostream>
#include <sstream>

namespace {

struct Sizes
{
    int accounts;
    int virtualUsers;
    int userlist;
};

struct Figures
{
    double rawRead = 1e12;
    double load = 1e12;
    double evaluate = 1e12;
    double forecast = 1e12;
    int allowed = 0;
    int denied = 0;
    int forecastAllowed = 0;
};

void generate(const QString &root, const Sizes &sizes)
{
    QByteArray passwd = "root:x:0:0::/root:/bin/sh\nftp:x:107:113::/srv/ftp:/usr/sbin/nologin\n"
                        "nobody:x:65534:65534::/nonexistent:/usr/sbin/nologin\n";
    QByteArray shadow = "root:*:19000:0:99999:7:::\nftp:*:19000:0:99999:7:::\n";
    QByteArray group = "root:x:0:\nftp:x:113:\n";
    for (int i = 0; i < sizes.accounts; ++i) {
        const QByteArray n = QByteArray::number(i);
        passwd += "user" + n + ":x:" + QByteArray::number(10000 + i) + ":1000::/home/user" + n + ":/bin/bash\n";
        shadow += "user" + n + ":" + (i % 10 ? "$6$salt$hash" : "!") + ":19000:0:99999:7:::\n";
    }
    group += "users:x:1000:\n";
    QByteArray userlist;
    for (int i = 0; i < sizes.userlist; ++i)
        userlist += "user" + QByteArray::number(i * 3) + "\n";

    writeBenchFile(root + QLatin1String("/etc/passwd"), passwd);
    writeBenchFile(root + QLatin1String("/etc/shadow"), shadow);
    writeBenchFile(root + QLatin1String("/etc/group"), group);
    // The userlist doubles as the chroot list: the forecast looks every
    // user up in both.
    writeBenchFile(root + QLatin1String("/etc/vsftpd.conf"),
                   "listen=YES\nlocal_enable=YES\nguest_enable=YES\nuserlist_enable=YES\n"
                   "userlist_file=/etc/vsftpd.d/allowed_user_list.conf\nchroot_list_enable=YES\n"
                   "chroot_list_file=/etc/vsftpd.d/allowed_user_list.conf\n");
    writeBenchFile(root + QLatin1String("/etc/pam.d/vsftpd"),
                   "auth sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n"
                   "account sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n"
                   "auth required pam_listfile.so item=user sense=deny file=/etc/ftpusers\n"
                   "@include common-auth\n");
    writeBenchFile(root + QLatin1String("/etc/ftpusers"), "root\nuser7\n");
    writeBenchFile(root + QLatin1String("/etc/vsftpd.d/allowed_user_list.conf"), userlist);
    QDir().mkpath(root + QLatin1String("/srv/ftp"));
    QDir().mkpath(root + QLatin1String("/var/run/vsftpd/empty"));
    writeBenchFile(root + QLatin1String("/etc/shells"), "/bin/sh\n/bin/bash\n");
    QDir().mkpath(root + QLatin1String("/etc/vsftpd.d/users.d"));
    loadBenchDatabase(root + QLatin1String("/var/lib/ftpconfig/users.db"), virtualUserPairs(sizes.virtualUsers));
}

double ms(const QElapsedTimer &timer)
{
    return timer.nsecsElapsed() / 1e6;
}

Figures measure(const Sizes &sizes, int runs)
{
    QTemporaryDir dir;
    generate(dir.path(), sizes);
    Figures figures;
    for (int run = 0; run < runs; ++run) {
        QElapsedTimer timer;
        timer.start();
        qint64 bytes = 0;
        for (const char *file : {"/etc/passwd", "/etc/shadow", "/etc/group", "/etc/vsftpd.d/allowed_user_list.conf",
                                 "/var/lib/ftpconfig/users.db"}) {
            QFile f(dir.path() + QLatin1String(file));
            if (f.open(QIODevice::ReadOnly))
                bytes += f.readAll().size();
        }
        figures.rawRead = std::min(figures.rawRead, ms(timer));

        ReportInteraction interaction;
        std::ostringstream sink;
        std::streambuf *out = std::cout.rdbuf(sink.rdbuf());
        timer.restart();
        FtpServerConfig config(interaction, RootDirectory(dir.path()));
        config.load();
        figures.load = std::min(figures.load, ms(timer));
        QList<QByteArray> users;
        for (const auto &entry : config.accounts().accounts())
            users << entry.first;
        for (const auto &entry : config.accounts().virtualUsers())
            users << entry.first;
        users << "Anonymous users";
        timer.restart();
        int allowed = 0;
        for (const QByteArray &user : users)
            allowed += config.checkAccess(user, false) ? 1 : 0;
        figures.evaluate = std::min(figures.evaluate, ms(timer));
        timer.restart();
        LoginForecast forecast(config);
        int forecastAllowed = 0;
        for (const QByteArray &user : users)
            forecastAllowed += forecast.forecast(user).status == ForecastStatus::Allowed ? 1 : 0;
        figures.forecast = std::min(figures.forecast, ms(timer));
        std::cout.rdbuf(out);
        figures.allowed = allowed;
        figures.denied = users.size() - allowed;
        figures.forecastAllowed = forecastAllowed;
        Q_UNUSED(bytes);
    }
    return figures;
}

} // namespace

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    QStandardPaths::setTestModeEnabled(true);
    const Sizes base{argc > 1 ? std::atoi(argv[1]) : 10000, argc > 2 ? std::atoi(argv[2]) : 100000,
                     argc > 3 ? std::atoi(argv[3]) : 10000};
    const int runs = argc > 4 ? std::atoi(argv[4]) : 3;
    const Sizes doubled{base.accounts * 2, base.virtualUsers * 2, base.userlist * 2};

    const Figures n = measure(base, runs);
    const Figures n2 = measure(doubled, runs);
    for (const auto &[sizes, f] : {std::pair<Sizes, Figures>{base, n}, {doubled, n2}}) {
        std::printf("accounts %d, virtual %d, userlist %d: raw read %.1f ms, load %.1f ms, verdicts %.1f ms "
                    "(%d allowed, %d denied), forecast %.1f ms (%d allowed), forecast/verdicts %.2f\n",
                    sizes.accounts, sizes.virtualUsers, sizes.userlist, f.rawRead, f.load, f.evaluate, f.allowed,
                    f.denied, f.forecast, f.forecastAllowed, f.forecast / f.evaluate);
    }
    std::printf("t(2N)/t(N): load %.2f, evaluate %.2f, forecast %.2f, load+evaluate+forecast %.2f (best of %d)\n",
                n2.load / n.load, n2.evaluate / n.evaluate, n2.forecast / n.forecast,
                (n2.load + n2.evaluate + n2.forecast) / (n.load + n.evaluate + n.forecast), runs);
    return 0;
}

// Builds a root like a Debian 12 machine's and times ftpconfig-report on it
// beside the raw read of the same files, then the same at twice the users.
// Every user's forecast must run to its end for the figures to mean
// anything: the program counts the forecasts that do.
// Usage: benchreport [accounts] [virtual-users] [userlist-names] [per-user-files] [runs] [json-copy]
// (json-copy: where to keep the JSON report of the first size)
#include "BenchSupport.h"
#include "forecast/LoginForecast.h"
#include "policy/FtpServerConfig.h"
#include "report/AccessReport.h"

#include <QCoreApplication>
#include <QDirIterator>
#include <QElapsedTimer>
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
    int userFiles;
};

struct Figures
{
    int users = 0;
    int forecastsRun = 0; // reached the end of the login forecast
    int allowed = 0;
    double rawRead = 1e12;
    double checkAccess = 1e12;
    double checkAccessPass = 1e12;
    double json = 1e12;
    double text = 1e12;
    qint64 jsonPeakKb = 0;
    qint64 textPeakKb = 0;
    qint64 jsonBytes = 0;
};

double ms(const QElapsedTimer &timer)
{
    return timer.nsecsElapsed() / 1e6;
}

void generate(const QString &root, const Sizes &sizes)
{
    QByteArray passwd = "root:x:0:0:root:/root:/bin/bash\n"
                        "daemon:x:1:1:daemon:/usr/sbin:/usr/sbin/nologin\n"
                        "ftp:x:107:113:ftp daemon,,,:/srv/ftp:/usr/sbin/nologin\n"
                        "nobody:x:65534:65534:nobody:/nonexistent:/usr/sbin/nologin\n";
    QByteArray shadow = "root:*:19000:0:99999:7:::\ndaemon:*:19000:0:99999:7:::\nftp:*:19000:0:99999:7:::\n"
                        "nobody:*:19000:0:99999:7:::\n";
    QByteArray group = "root:x:0:\ndaemon:x:1:\nftp:x:113:\nnogroup:x:65534:\nusers:x:100:\n";
    for (const char *home : {"/root", "/usr/sbin", "/srv/ftp"})
        QDir().mkpath(root + QLatin1String(home));
    for (int i = 0; i < sizes.accounts; ++i) {
        const QByteArray n = QByteArray::number(i);
        passwd += "user" + n + ":x:" + QByteArray::number(10000 + i) + ":100::/home/user" + n + ":/bin/bash\n";
        shadow += "user" + n + ":$6$salt$hash" + n + ":19000:0:99999:7:::\n";
        QDir().mkpath(root + QLatin1String("/home/user") + QString::number(i));
    }
    // A deny list of names that have no account: every login passes it and
    // goes on to PAM, its account and its directories.
    QByteArray userlist = "# vsftpd userlist\n";
    for (int i = 0; i < sizes.userlist; ++i)
        userlist += "blocked" + QByteArray::number(i) + "\n";

    writeBenchFile(root + QLatin1String("/etc/passwd"), passwd);
    writeBenchFile(root + QLatin1String("/etc/shadow"), shadow);
    writeBenchFile(root + QLatin1String("/etc/group"), group);
    writeBenchFile(root + QLatin1String("/etc/vsftpd.conf"),
                   "listen=YES\nlisten_ipv6=NO\nanonymous_enable=NO\nlocal_enable=YES\nwrite_enable=YES\n"
                   "local_umask=022\ndirmessage_enable=YES\nuse_localtime=YES\nxferlog_enable=YES\n"
                   "connect_from_port_20=YES\nsecure_chroot_dir=/var/run/vsftpd/empty\npam_service_name=vsftpd\n"
                   "guest_enable=YES\nguest_username=ftp\nvirtual_use_local_privs=NO\n"
                   "userlist_enable=YES\nuserlist_file=/etc/vsftpd.d/user_list\n"
                   "chroot_local_user=YES\nchroot_list_enable=YES\nchroot_list_file=/etc/vsftpd.d/user_list\n"
                   "user_config_dir=/etc/vsftpd.d/users.d\n");
    writeBenchFile(root + QLatin1String("/etc/pam.d/vsftpd"),
                   "auth sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n"
                   "account sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n"
                   "# Standard behaviour for ftpd(8).\n"
                   "auth\trequired\tpam_listfile.so item=user sense=deny file=/etc/ftpusers onerr=succeed\n"
                   "\n@include common-account\n@include common-session\n@include common-auth\n"
                   "auth\trequired\tpam_shells.so\n");
    // Debian's own stacks, as this machine has them.
    for (const char *common : {"common-auth", "common-account", "common-session", "common-password"}) {
        QFile file(QLatin1String("/etc/pam.d/") + QLatin1String(common));
        if (!file.open(QIODevice::ReadOnly))
            std::fprintf(stderr, "cannot read /etc/pam.d/%s\n", common);
        writeBenchFile(root + QLatin1String("/etc/pam.d/") + QLatin1String(common), file.readAll());
    }
    writeBenchFile(root + QLatin1String("/etc/ftpusers"), "# /etc/ftpusers\nroot\ndaemon\nnobody\n");
    writeBenchFile(root + QLatin1String("/etc/shells"), "/bin/sh\n/bin/bash\n/usr/bin/bash\n/bin/dash\n");
    writeBenchFile(root + QLatin1String("/etc/vsftpd.d/user_list"), userlist);
    for (int i = 0; i < sizes.userFiles; ++i) {
        writeBenchFile(root + QLatin1String("/etc/vsftpd.d/users.d/virtual") + QString::number(i),
                       i % 2 ? "write_enable=NO\n" : "write_enable=YES\nanon_upload_enable=YES\n");
    }
    QDir().mkpath(root + QLatin1String("/var/run/vsftpd/empty"));
    loadBenchDatabase(root + QLatin1String("/var/lib/ftpconfig/users.db"), virtualUserPairs(sizes.virtualUsers));
}

// Reads the bytes of every file below /etc and dumps the database: what
// any program that looks at the same files cannot do without.
double rawRead(const QString &root)
{
    QElapsedTimer timer;
    timer.start();
    qint64 bytes = 0;
    QDirIterator it(root + QLatin1String("/etc"), QDir::Files, QDirIterator::Subdirectories);
    while (it.hasNext()) {
        QFile file(it.next());
        if (file.open(QIODevice::ReadOnly))
            bytes += file.readAll().size();
    }
    QProcess dump;
    dump.setStandardOutputFile(QProcess::nullDevice());
    dump.start(QStringLiteral("db5.3_dump"),
               {QStringLiteral("-p"), root + QLatin1String("/var/lib/ftpconfig/users.db")});
    dump.waitForFinished(600000);
    if (bytes == 0 || dump.exitCode() != 0)
        std::fprintf(stderr, "raw read failed\n");
    return ms(timer);
}

// Runs the report under /usr/bin/time; returns the time and the peak
// resident memory in kB, and the size of what it printed.
double runReport(const QString &root, bool json, qint64 &peakKb, qint64 &bytes, const QString &copy)
{
    QTemporaryDir dir;
    const QString out = copy.isEmpty() ? dir.filePath(QStringLiteral("out")) : copy;
    // BENCH_REPORT_PROGRAM times another build of the program on the same root.
    const QString program = qEnvironmentVariableIsSet("BENCH_REPORT_PROGRAM")
        ? qEnvironmentVariable("BENCH_REPORT_PROGRAM")
        : QStringLiteral(FTPCONFIG_REPORT_PROGRAM);
    QStringList args{QStringLiteral("-f"), QStringLiteral("%M"), program, QStringLiteral("--root"), root};
    if (json)
        args << QStringLiteral("--json");
    QProcess process;
    process.setStandardOutputFile(out);
    QElapsedTimer timer;
    timer.start();
    process.start(QStringLiteral("/usr/bin/time"), args);
    process.waitForFinished(600000);
    const double elapsed = ms(timer);
    const QList<QByteArray> err = process.readAllStandardError().trimmed().split('\n');
    if (process.exitCode() != 0)
        std::fprintf(stderr, "ftpconfig-report failed: %s\n", err.join('\n').constData());
    peakKb = err.last().toLongLong();
    bytes = QFileInfo(out).size();
    return elapsed;
}

// Generates the root and measures what runs in this process.
Figures prepare(const QString &root, const Sizes &sizes, int runs, const QString &keep)
{
    // BENCH_ROOT keeps a copy of the first size's root there, to profile or
    // compare outputs on.
    generate(root, sizes);
    if (!keep.isEmpty())
        QProcess::execute(QStringLiteral("cp"), {QStringLiteral("-a"), root, keep});
    Figures figures;
    {
        ReportInteraction interaction;
        std::ostringstream sink;
        std::streambuf *out = std::cout.rdbuf(sink.rdbuf());
        FtpServerConfig config(interaction, RootDirectory(root), FtpServerConfig::Mode::ReadOnly);
        config.load();
        QList<QByteArray> users;
        for (const auto &entry : config.accounts().accounts())
            users << entry.first;
        for (const auto &entry : config.accounts().virtualUsers())
            users << entry.first;
        figures.users = users.size();
        LoginForecast forecast(config);
        if (!forecast.serverFindings().isEmpty())
            std::fprintf(stderr, "server: %s\n", qPrintable(findingText(forecast.serverFindings().first())));
        for (const QByteArray &user : users) {
            const UserForecast result = forecast.forecast(user);
            // A denial returns early; allowed and unknown run every check.
            figures.forecastsRun += result.status != ForecastStatus::Denied ? 1 : 0;
            figures.allowed += result.status == ForecastStatus::Allowed ? 1 : 0;
        }
        for (int run = 0; run < runs; ++run) {
            QElapsedTimer timer;
            timer.start();
            for (const QByteArray &user : users)
                config.checkAccess(user, false);
            figures.checkAccess = std::min(figures.checkAccess, ms(timer));
            // The same in one pass, as the report evaluates them.
            timer.restart();
            {
                const FtpServerConfig::MetadataPass pass(config);
                for (const QByteArray &user : users)
                    config.checkAccess(user, false);
            }
            figures.checkAccessPass = std::min(figures.checkAccessPass, ms(timer));
        }
        std::cout.rdbuf(out);
    }
    return figures;
}

// One run of the raw read and of the program, kept where it is the fastest.
void timeRun(const QString &root, Figures &figures, const QString &jsonCopy)
{
    figures.rawRead = std::min(figures.rawRead, rawRead(root));
    qint64 peak = 0;
    figures.json = std::min(figures.json, runReport(root, true, peak, figures.jsonBytes, jsonCopy));
    figures.jsonPeakKb = std::max(figures.jsonPeakKb, peak);
    qint64 bytes = 0;
    figures.text = std::min(figures.text, runReport(root, false, peak, bytes, QString()));
    figures.textPeakKb = std::max(figures.textPeakKb, peak);
}

} // namespace

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    QStandardPaths::setTestModeEnabled(true);
    const auto arg = [&](int i, int fallback) { return argc > i ? std::atoi(argv[i]) : fallback; };
    const Sizes base{arg(1, 10000), arg(2, 100000), arg(3, 10000), arg(4, 1000)};
    const int runs = arg(5, 3);
    const QString jsonCopy = argc > 6 ? QString::fromLocal8Bit(argv[6]) : QString();
    const Sizes doubled{base.accounts * 2, base.virtualUsers * 2, base.userlist * 2, base.userFiles * 2};

    QTemporaryDir baseRoot;
    QTemporaryDir doubledRoot;
    Figures n = prepare(baseRoot.path(), base, runs, qEnvironmentVariable("BENCH_ROOT"));
    Figures n2 = prepare(doubledRoot.path(), doubled, runs, QString());
    // Both sizes in turn, run by run: this machine's speed drifts within
    // minutes, and their ratio means something only when both saw the same.
    for (int run = 0; run < runs; ++run) {
        timeRun(baseRoot.path(), n, jsonCopy);
        timeRun(doubledRoot.path(), n2, QString());
    }
    for (const auto &[sizes, f] : {std::pair<Sizes, Figures>{base, n}, {doubled, n2}}) {
        std::printf("accounts %d, virtual %d, userlist %d, per-user files %d: %d users, forecasts run to the end %d "
                    "(%d allowed)\n"
                    "  raw read %.0f ms, checkAccess all %.0f ms (in one pass %.0f ms)\n"
                    "  report --json %.0f ms (%.1fx raw), peak %lld MB, %lld bytes\n"
                    "  report text   %.0f ms (%.1fx raw), peak %lld MB\n",
                    sizes.accounts, sizes.virtualUsers, sizes.userlist, sizes.userFiles, f.users, f.forecastsRun,
                    f.allowed, f.rawRead, f.checkAccess, f.checkAccessPass, f.json, f.json / f.rawRead,
                    f.jsonPeakKb / 1024, f.jsonBytes, f.text, f.text / f.rawRead, f.textPeakKb / 1024);
    }
    std::printf("t(2N)/t(N): raw read %.2f, checkAccess %.2f, json %.2f, text %.2f (best of %d)\n",
                n2.rawRead / n.rawRead, n2.checkAccess / n.checkAccess, n2.json / n.json, n2.text / n.text, runs);
    return 0;
}

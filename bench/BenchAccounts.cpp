// Loads 10,000 accounts and 100,000 virtual users from a generated root and
// compares with the time db5.3_dump needs for the same database file.
// Usage: benchaccounts [accounts] [virtual-users] [runs]
#include "BenchSupport.h"
#include "accounts/AccountStore.h"

#include <QCoreApplication>
#include <QDir>
#include <QElapsedTimer>
#include <QFile>
#include <QTemporaryDir>

#include <algorithm>
#include <cstdio>

namespace {

} // namespace

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    const int accounts = argc > 1 ? std::atoi(argv[1]) : 10000;
    const int virtualUsers = argc > 2 ? std::atoi(argv[2]) : 100000;
    const int runs = argc > 3 ? std::atoi(argv[3]) : 5;

    QTemporaryDir dir;
    const QString root = dir.path();
    QByteArray passwd, shadow, group;
    for (int i = 0; i < accounts; ++i) {
        const QByteArray n = QByteArray::number(i);
        passwd += "user" + n + ":x:" + QByteArray::number(10000 + i) + ":" + QByteArray::number(10000 + i % 1000)
            + ":User " + n + ":/home/user" + n + ":/bin/bash\n";
        shadow += "user" + n + ":" + (i % 10 ? "$6$salt$hash" : "!") + ":19000:0:99999:7:::\n";
    }
    for (int g = 0; g < 1000; ++g)
        group += "group" + QByteArray::number(g) + ":x:" + QByteArray::number(10000 + g) + ":user"
            + QByteArray::number(g) + ",user" + QByteArray::number(g + 1000) + "\n";
    writeBenchFile(root + QLatin1String("/etc/passwd"), passwd);
    writeBenchFile(root + QLatin1String("/etc/shadow"), shadow);
    writeBenchFile(root + QLatin1String("/etc/group"), group);
    const QString dbFile = root + QLatin1String("/var/lib/ftpconfig/vsftpd_virtual_users.db");
    const double loadMs = loadBenchDatabase(dbFile, virtualUserPairs(virtualUsers));

    double bestRw = 1e12, bestRo = 1e12, bestDump = 1e12;
    size_t loaded = 0;
    for (int run = 0; run < runs; ++run) {
        QElapsedTimer timer;
        timer.start();
        {
            AccountStore store("/var/lib/ftpconfig/vsftpd_virtual_users", RootDirectory(root));
            loaded = store.virtualUsers().size() + store.accounts().size();
            bestRw = std::min(bestRw, timer.nsecsElapsed() / 1e6);
        }
        timer.restart();
        {
            AccountStore store("/var/lib/ftpconfig/vsftpd_virtual_users", RootDirectory(root),
                               AccountStore::Access::ReadOnly);
            bestRo = std::min(bestRo, timer.nsecsElapsed() / 1e6);
        }
        bestDump = std::min(
            bestDump,
            runBenchProgram(QStringLiteral("db5.3_dump"),
                            {QStringLiteral("-p"), QStringLiteral("-f"), QStringLiteral("/dev/null"), dbFile}));
    }
    std::printf("accounts %d, virtual users %d, records loaded %zu, db file %lld bytes (db5.3_load %.0f ms)\n",
                accounts, virtualUsers, loaded, static_cast<long long>(QFileInfo(dbFile).size()), loadMs);
    std::printf("AccountStore read-write %.1f ms, read-only %.1f ms, db5.3_dump -p %.1f ms (best of %d)\n", bestRw,
                bestRo, bestDump, runs);
    return 0;
}

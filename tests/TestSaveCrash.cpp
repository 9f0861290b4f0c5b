// Kills a saving process at random points, many times, and checks that every
// file is then either its old or its new version: never torn, never empty.
#include "FixtureRoot.h"
#include "Process.h"
#include "TestMain.h"

#include <QElapsedTimer>
#include <QProcess>
#include <QRandomGenerator>
#include <QtTest>

#include <csignal>

namespace {

const QString Child = QStringLiteral(FTPCONFIG_SAVECHILD);

// The files below the root; those an interrupted save left beside their
// targets are counted apart, and so are the backups of the files it
// replaced (a save killed early has made fewer). The database is written
// record by record in transactions of its own and is not compared.
FileMap snapshot(const QString &root, QStringList *leftovers = nullptr, FileMap *backups = nullptr)
{
    FileMap files = regularFiles(root);
    for (const QString &path : files.keys()) {
        if (path.endsWith(QLatin1String(".ftpconfig-bak"))) {
            if (backups)
                backups->insert(path.chopped(14), files.value(path));
            files.remove(path);
        } else if (leftovers && path.contains(QLatin1String(".ftpconfig-"))) {
            leftovers->append(path);
            files.remove(path);
        }
    }
    return files;
}

bool copyTree(const QString &from, const QString &to)
{
    QDir(to).removeRecursively();
    QDir().mkpath(to);
    const ProcessResult result
        = runProcess(QStringLiteral("cp"), {QStringLiteral("-a"), from + QStringLiteral("/."), to});
    return result.exitCode == 0;
}

bool waitForLine(QProcess &process, const QByteArray &line, int timeoutMs)
{
    QElapsedTimer timer;
    timer.start();
    QByteArray seen;
    while (timer.elapsed() < timeoutMs) {
        if (process.canReadLine() || process.waitForReadyRead(50)) {
            seen += process.readAll();
            if (seen.contains(line))
                return true;
        }
        if (process.state() == QProcess::NotRunning)
            return seen.contains(line);
    }
    return false;
}

} // namespace

class TestSaveCrash : public QObject
{
    Q_OBJECT

private slots:
    void killedMidSave()
    {
        // A root big enough for a save to take a while: a long main
        // configuration, long lists and many per-user files.
        FixtureRoot pristine;
        QByteArray main = "listen=YES\nlocal_enable=YES\n";
        for (int i = 0; i < 20000; ++i)
            main += "# option " + QByteArray::number(i) + "\n#setting_" + QByteArray::number(i) + "=value\n";
        QByteArray userlist;
        QByteArray ftpusers = "root\n";
        for (int i = 0; i < 20000; ++i) {
            userlist += "user" + QByteArray::number(i) + "\n";
            ftpusers += "user" + QByteArray::number(i) + "\n";
        }
        FileMap files{{QStringLiteral("/etc/vsftpd.conf"), main},
                      {QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf"), userlist},
                      {QStringLiteral("/etc/vsftpd.chroot_list"), "bob\n"},
                      {QStringLiteral("/etc/ftpusers"), ftpusers}};
        for (int i = 0; i < 150; ++i)
            files.insert(QStringLiteral("/etc/vsftpd.d/users.d/user%1").arg(i),
                         "local_root=/srv/user" + QByteArray::number(i) + "\n");
        QVERIFY(pristine.write(files));

        // The old and the new version of every file, from one complete save.
        const auto before = snapshot(pristine.path());
        QTemporaryDir scratch;
        const QString work = scratch.filePath(QStringLiteral("root"));
        QVERIFY(copyTree(pristine.path(), work));
        QProcess full;
        full.start(Child, {work});
        QVERIFY(waitForLine(full, "SAVING", 60000));
        QElapsedTimer saving;
        saving.start();
        QVERIFY(waitForLine(full, "SAVED", 60000));
        const qint64 saveMs = saving.elapsed();
        QVERIFY(full.waitForFinished(10000));
        const auto after = snapshot(work);
        QStringList changed;
        for (auto it = after.begin(); it != after.end(); ++it) {
            if (before.value(it.key()) != it.value())
                changed << it.key();
        }
        QVERIFY2(changed.size() >= 150, qPrintable(QString::number(changed.size())));

        const int kills = 30;
        int untouched = 0;
        int partial = 0;
        int complete = 0;
        int leftoverFiles = 0;
        for (int round = 0; round < kills; ++round) {
            QVERIFY(copyTree(pristine.path(), work));
            QProcess child;
            child.start(Child, {work});
            QVERIFY(waitForLine(child, "SAVING", 60000));
            QThread::usleep(static_cast<unsigned long>(
                QRandomGenerator::global()->bounded(static_cast<quint32>(saveMs * 1000 + 1))));
            ::kill(static_cast<pid_t>(child.processId()), SIGKILL);
            QVERIFY(child.waitForFinished(10000));

            QStringList leftovers;
            FileMap backups;
            const auto state = snapshot(work, &leftovers, &backups);
            leftoverFiles += leftovers.size();
            QCOMPARE(state.keys(), after.keys());
            // A backup is whole, or not there yet.
            for (auto it = backups.begin(); it != backups.end(); ++it)
                QVERIFY2(*it == before.value(it.key()), qPrintable(QStringLiteral("torn backup of ") + it.key()));
            int fresh = 0;
            for (auto it = state.begin(); it != state.end(); ++it) {
                const bool old = before.contains(it.key()) && it.value() == before.value(it.key());
                const bool updated = it.value() == after.value(it.key());
                QVERIFY2(old || updated, qPrintable(QStringLiteral("torn after a kill: ") + it.key()));
                if (updated && !old)
                    ++fresh;
            }
            if (fresh == 0)
                ++untouched;
            else if (fresh == changed.size())
                ++complete;
            else
                ++partial;
        }
        qInfo("%d kills during a %lld ms save: %d before any file was replaced, %d partway, %d after the last; "
              "%d temporary files left behind",
              kills, saveMs, untouched, partial, complete, leftoverFiles);
        // The kills must have landed inside the save to prove anything.
        QVERIFY(partial > 0);
    }
};

FTPCONFIG_TEST_GUILESS_MAIN(TestSaveCrash)

#include "TestSaveCrash.moc"

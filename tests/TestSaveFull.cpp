// A save into a full file system reports each failure and leaves the old
// files as they were. Runs inside scripts/with-private-etc.sh, whose private
// mount namespace lets it mount a small tmpfs of its own.
#include "CaptureStream.h"
#include "FixtureRoot.h"
#include "Process.h"
#include "ScriptedInteraction.h"
#include "TestMain.h"
#include "policy/FtpServerConfig.h"

#include <QStandardPaths>
#include <QtTest>

#include <fcntl.h>
#include <iostream>
#include <unistd.h>

class TestSaveFull : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase()
    {
        QVERIFY2(qEnvironmentVariable("FTPCONFIG_PRIVATE_ETC") == QLatin1String("1"),
                 "run this test through scripts/with-private-etc.sh: it mounts a file system");
        QStandardPaths::setTestModeEnabled(true);
        QVERIFY(m_mountPoint.isValid());
        const ProcessResult mount = runProcess(
            QStringLiteral("mount"),
            QStringLiteral("-t tmpfs -o size=8m ftpconfig-full").split(QLatin1Char(' ')) << m_mountPoint.path());
        QVERIFY2(mount.exitCode == 0, mount.err.constData());
        m_mounted = true;
    }

    void cleanupTestCase()
    {
        if (m_mounted)
            runProcess(QStringLiteral("umount"), {m_mountPoint.path()});
    }

    void fullFileSystem()
    {
        FixtureRoot root(m_mountPoint.path());
        QVERIFY(root.write({{QStringLiteral("/etc/vsftpd.d/users.d/bob"), "local_root=/srv/bob\n"},
                            {QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf"), "carl\n"}}));
        // The database environment lives elsewhere: its region files are
        // re-created at every save and would free room the test needs gone.
        QTemporaryDir state;
        QVERIFY(root.makeDirectory(QStringLiteral("/var/lib")));
        QVERIFY(QFile::link(state.path(), root.filePath(QStringLiteral("/var/lib/ftpconfig"))));
        ScriptedInteraction interaction;
        CaptureStream out(std::cout);
        CaptureStream err(std::cerr);
        FtpServerConfig config(interaction, RootDirectory(root.path()));
        config.load();
        const FileMap before = root.files();

        // Fill the file system to the last byte.
        const QString filler = root.filePath(QStringLiteral("/filler"));
        const int fd = ::open(QFile::encodeName(filler).constData(), O_WRONLY | O_CREAT, 0600);
        QVERIFY(fd >= 0);
        const QByteArray chunk(4096, 'f');
        while (::write(fd, chunk.constData(), static_cast<size_t>(chunk.size())) == chunk.size()) { }
        while (::write(fd, "f", 1) == 1) { }
        ::close(fd);

        for (int i = 0; i < 2000; ++i)
            setValue(config.mainConfig().elements, "", "key_" + std::to_string(i), "a value long enough to need room");
        for (int i = 0; i < 2000; ++i)
            config.userlist().append(QStringLiteral("newcomer%1").arg(i));
        QVERIFY(config.setUserRoot("bob", "/srv/a/much/longer/root/than/before/for/bob"));

        QVERIFY(!config.save());
        const QString texts = interaction.texts().join(QLatin1Char('\n'));
        for (const char *file :
             {"/etc/vsftpd.d/allowed_user_list.conf", "/etc/vsftpd.d/users.d/bob", "/etc/vsftpd.conf"})
            QVERIFY2(texts.contains(QStringLiteral("|Unable to save %1|").arg(QLatin1String(file))), qPrintable(texts));
        // Nothing was torn, emptied or left half-written. The missing chroot
        // list could be created: an empty file needs no room.
        FileMap afterFailure = root.files();
        afterFailure.remove(QStringLiteral("/filler"));
        // A backup is the replaced file linked under another name and needs no
        // room: one may be there, the same as the file it keeps.
        for (const QString &path : afterFailure.keys()) {
            if (path.endsWith(QLatin1String(".ftpconfig-bak")))
                QCOMPARE(afterFailure.take(path), before.value(path.chopped(14)));
        }
        QCOMPARE(afterFailure.take(QStringLiteral("/etc/vsftpd.chroot_list")), QByteArray(""));
        QCOMPARE(afterFailure, before);

        // With room again, the same save goes through.
        QVERIFY(QFile::remove(filler));
        interaction.records.clear();
        QVERIFY(config.save());
        QCOMPARE(interaction.records.size(), 0);
        QVERIFY(
            root.readFile(QStringLiteral("/etc/vsftpd.conf")).contains("key_1999=a value long enough to need room\n"));
        QVERIFY(root.readFile(QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf")).endsWith("newcomer1999\n"));
        QCOMPARE(root.readFile(QStringLiteral("/etc/vsftpd.d/users.d/bob")),
                 QByteArray("local_root=/srv/a/much/longer/root/than/before/for/bob\n\n"));
    }

private:
    QTemporaryDir m_mountPoint;
    bool m_mounted = false;
};

FTPCONFIG_TEST_GUILESS_MAIN(TestSaveFull)

#include "TestSaveFull.moc"

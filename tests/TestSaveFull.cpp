// A save into a full file system reports each failure and leaves the old
// files as they were. Runs inside scripts/with-private-etc.sh, whose private
// mount namespace lets it mount a small tmpfs of its own.
#include "CaptureStream.h"
#include "FixtureRoot.h"
#include "Process.h"
#include "ScriptedInteraction.h"
#include "TestMain.h"
#include "policy/FtpServerConfig.h"

#include <QDirIterator>
#include <QStandardPaths>
#include <QtTest>

#include <fcntl.h>
#include <iostream>
#include <unistd.h>

namespace {

QMap<QString, QByteArray> snapshot(const QString &root)
{
    QMap<QString, QByteArray> files;
    QDirIterator it(root, QDir::Files | QDir::Hidden | QDir::System, QDirIterator::Subdirectories);
    while (it.hasNext()) {
        const QString path = it.next().mid(root.size());
        if (path.startsWith(QLatin1String("/var/lib/ftpconfig/")) || path == QLatin1String("/filler"))
            continue;
        QFile file(root + path);
        file.open(QIODevice::ReadOnly);
        files.insert(path, file.readAll());
    }
    return files;
}

} // namespace

class TestSaveFull : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase();
    void cleanupTestCase();
    void fullFileSystem();

private:
    QTemporaryDir m_mountPoint;
    bool m_mounted = false;
};

void TestSaveFull::initTestCase()
{
    QVERIFY2(qEnvironmentVariable("FTPCONFIG_PRIVATE_ETC") == QLatin1String("1"),
             "run this test through scripts/with-private-etc.sh: it mounts a file system");
    QStandardPaths::setTestModeEnabled(true);
    QVERIFY(m_mountPoint.isValid());
    const ProcessResult mount
        = runProcess(QStringLiteral("mount"), {"-t", "tmpfs", "-o", "size=8m", "ftpconfig-full", m_mountPoint.path()});
    QVERIFY2(mount.exitCode == 0, mount.err.constData());
    m_mounted = true;
}

void TestSaveFull::cleanupTestCase()
{
    if (m_mounted)
        runProcess(QStringLiteral("umount"), {m_mountPoint.path()});
}

void TestSaveFull::fullFileSystem()
{
    FixtureRoot root(m_mountPoint.path());
    QVERIFY(root.write(
        {{"/etc/vsftpd.d/users.d/bob", "local_root=/srv/bob\n"}, {"/etc/vsftpd.d/allowed_user_list.conf", "carl\n"}}));
    // The database environment lives elsewhere: its region files are
    // re-created at every save and would free room the test needs gone.
    QTemporaryDir state;
    QVERIFY(root.makeDirectory("/var/lib"));
    QVERIFY(QFile::link(state.path(), root.filePath("/var/lib/ftpconfig")));
    ScriptedInteraction interaction;
    CaptureStream out(std::cout);
    CaptureStream err(std::cerr);
    FtpServerConfig config(interaction, RootDirectory(root.path()));
    config.load();
    const auto before = snapshot(root.path());

    // Fill the file system to the last byte.
    const int fd = ::open(QFile::encodeName(root.filePath("/filler")).constData(), O_WRONLY | O_CREAT, 0600);
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
    const QStringList texts = interaction.texts();
    QVERIFY2(!texts.filter("|Unable to save /etc/vsftpd.d/allowed_user_list.conf|").isEmpty(),
             qPrintable(texts.join('\n')));
    QVERIFY2(!texts.filter("|Unable to save /etc/vsftpd.d/users.d/bob|").isEmpty(), qPrintable(texts.join('\n')));
    QVERIFY2(!texts.filter("|Unable to save /etc/vsftpd.conf|").isEmpty(), qPrintable(texts.join('\n')));
    // Nothing was torn, emptied or left half-written. The missing chroot
    // list could be created: an empty file needs no room.
    auto afterFailure = snapshot(root.path());
    QCOMPARE(afterFailure.take("/etc/vsftpd.chroot_list"), QByteArray(""));
    QCOMPARE(afterFailure, before);

    // With room again, the same save goes through.
    QVERIFY(QFile::remove(root.filePath("/filler")));
    interaction.records.clear();
    QVERIFY(config.save());
    QCOMPARE(interaction.records.size(), 0);
    QVERIFY(root.readFile("/etc/vsftpd.conf").contains("key_1999=a value long enough to need room\n"));
    QVERIFY(root.readFile("/etc/vsftpd.d/allowed_user_list.conf").endsWith("newcomer1999\n"));
    QCOMPARE(root.readFile("/etc/vsftpd.d/users.d/bob"),
             QByteArray("local_root=/srv/a/much/longer/root/than/before/for/bob\n\n"));
}

FTPCONFIG_TEST_GUILESS_MAIN(TestSaveFull)
#include "TestSaveFull.moc"

// Rights, roots and the permissions of roots: the rows of rights.txt,
// chroot.txt and folders.txt in tests/data/scenarios, and the edits that
// must refuse or create.
#include "CaptureStream.h"
#include "EngineFixture.h"
#include "TestMain.h"

#include <QStandardPaths>
#include <QtTest>

#include <iostream>
#include <sys/stat.h>
#include <unistd.h>

namespace {

const QByteArray Anonymous = "Anonymous users";

QString mode(const QString &path)
{
    struct stat info
    {
    };
    ::stat(QFile::encodeName(path).constData(), &info);
    return permissionLetters(info.st_mode & 0777);
}

} // namespace

class TestRights : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase()
    {
        QStandardPaths::setTestModeEnabled(true);
    }

    void rights_data()
    {
        addScenarioRows(QStringLiteral("rights.txt"));
    }

    void rights()
    {
        QFETCH(Scenario, scenario);
        EngineFixture engine;
        QVERIFY(engine.load(scenario));
        FtpServerConfig &config = *engine.config;
        const QByteArray user = scenario.bytes(QStringLiteral("user"));
        CaptureStream out(std::cout);
        if (scenario.has(QStringLiteral("shown"))) {
            // What the table shows and writes back reads the same again.
            const QString shown = scenario.value(QStringLiteral("shown"));
            QCOMPARE(rightsText(config.userRights(user)), shown);
            QVERIFY(config.setUserRights(user, shown));
            QCOMPARE(rightsText(config.userRights(user)), shown);
            return;
        }
        const QString rights = scenario.value(QStringLiteral("set"));
        QVERIFY(config.setUserRights(user, rights));
        QVERIFY(
            QString::fromStdString(out.text())
                .endsWith(QStringLiteral("Set permissions: %1 for user %2\n").arg(rights, QString::fromUtf8(user))));
        QCOMPARE(user == Anonymous ? engine.mainText() : engine.userFile(user),
                 scenario.bytes(QStringLiteral("written")));
        // A new per-user file is on disk at once with its first line only.
        if (user != Anonymous)
            QCOMPARE(engine.root.readFile(QStringLiteral("/etc/vsftpd.d/users.d/") + QString::fromUtf8(user)),
                     QByteArray("# File was created by FTP manager\n"));
        QVERIFY(config.isModified());
    }

    void texts()
    {
        QCOMPARE(rightsText({QStringLiteral("mkdir"), QStringLiteral("write"), QStringLiteral("bogus"),
                             QStringLiteral("download")}),
                 QStringLiteral("write, download, mkdir"));
        QCOMPARE(rightsText({QStringLiteral("full access"), QStringLiteral("upload")}),
                 QStringLiteral("full access, upload"));
        QCOMPARE(permissionLetters(04421), QStringLiteral("r---w---x"));
    }

    void perUserFileNames_data()
    {
        QTest::addColumn<QByteArray>("user");
        QTest::addColumn<QString>("reason");
        QTest::newRow("slash") << QByteArray("../../etc/passwd") << QStringLiteral("the name contains \"/\"");
        QTest::newRow("leading dot") << QByteArray(".hidden") << QStringLiteral("the name begins with \".\"");
        QTest::newRow("newline") << QByteArray("bob\nroot") << QStringLiteral("the name contains a line break");
        QTest::newRow("control character")
            << QByteArray("bob\x1b[31m") << QStringLiteral("the name contains a control character");
        QTest::newRow("empty") << QByteArray("") << QStringLiteral("the name is empty");
    }

    void perUserFileNames()
    {
        QFETCH(QByteArray, user);
        QFETCH(QString, reason);

        EngineFixture engine;
        QVERIFY(engine.load());
        const QStringList before
            = QDir(engine.root.filePath(QStringLiteral("/etc"))).entryList(QDir::AllEntries | QDir::Hidden);
        CaptureStream out(std::cout);
        CaptureStream err(std::cerr);
        QVERIFY(!engine.config->setUserRights(user, QStringLiteral("write")));
        QVERIFY(!engine.config->setUserRoot(user, "/srv/x"));
        QCOMPARE(engine.interaction.records.size(), 2);
        QCOMPARE(engine.interaction.records.constFirst().message.text,
                 QStringLiteral("Unable to create per-user config file.\n\"%1\" cannot be a file name: %2.")
                     .arg(QString::fromUtf8(user), reason));
        QVERIFY(QString::fromStdString(out.text()).contains(QLatin1String("Unable to create userconf file\n")));
        QVERIFY(!engine.config->userConfig(user));
        QCOMPARE(QDir(engine.root.filePath(QStringLiteral("/etc"))).entryList(QDir::AllEntries | QDir::Hidden), before);
        QCOMPARE(
            QDir(engine.root.filePath(QStringLiteral("/etc/vsftpd.d/users.d"))).entryList(QDir::Files | QDir::Hidden),
            QStringList());
    }

    void roots()
    {
        EngineFixture engine;
        QVERIFY(engine.load({{QStringLiteral("/etc/vsftpd.conf"), "local_enable=YES\nchroot_local_user=YES\n"}}));
        FtpServerConfig &config = *engine.config;
        QVERIFY(config.setUserRoot("bob", "/srv/bob"));
        QVERIFY(config.setUserRoot(Anonymous, "/srv/anon"));
        QCOMPARE(engine.userFile("bob"), QByteArray("# File was created by FTP manager\nlocal_root=/srv/bob\n"));
        QVERIFY(engine.mainText().contains("anon_root=/srv/anon\n"));
        QCOMPARE(config.effectiveRoot("bob"), QByteArray("/srv/bob"));
        QCOMPARE(config.effectiveRoot(Anonymous), QByteArray("/srv/anon"));
        QVERIFY(config.setUserRoot("bob", "/srv/other"));
        QCOMPARE(engine.userFile("bob"), QByteArray("# File was created by FTP manager\nlocal_root=/srv/other\n"));
    }

    void setChrooted_data()
    {
        addScenarioRows(QStringLiteral("chroot.txt"));
    }

    void setChrooted()
    {
        QFETCH(Scenario, scenario);
        EngineFixture engine;
        QVERIFY(engine.load(scenario));
        const QByteArray user = scenario.bytes(QStringLiteral("user"));
        engine.config->setChrooted(user);
        QCOMPARE(engine.config->chrootList().join(QLatin1Char(',')), scenario.value(QStringLiteral("chroot-list")));
        QCOMPARE(engine.config->isYes("chroot_list_enable"),
                 scenario.value(QStringLiteral("list-enabled")) == QLatin1String("yes"));
        QVERIFY(engine.config->isChrooted(user));
    }

    void folderPermissions_data()
    {
        addScenarioRows(QStringLiteral("folders.txt"));
    }

    void folderPermissions()
    {
        QFETCH(Scenario, scenario);
        EngineFixture engine;
        QVERIFY(engine.load({{QStringLiteral("/etc/vsftpd.conf"),
                              "local_enable=YES\nchroot_local_user=YES\nguest_enable=NO\nanon_root=/srv/ftp\n"},
                             {QStringLiteral("/etc/pam.d/vsftpd"),
                              "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                              "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"}}));
        const QByteArray user = scenario.bytes(QStringLiteral("user"));
        // Guest mode makes vic's root the guest account's.
        if (user == "vic")
            setValue(engine.config->mainConfig().elements, "", "guest_enable", "YES");
        const QString path = engine.root.filePath(QString::fromUtf8(engine.config->effectiveRoot(user)));
        QVERIFY(QDir().mkpath(path));
        const QStringList owner = scenario.value(QStringLiteral("owner")).split(QLatin1Char(':'));
        QCOMPARE(::chown(QFile::encodeName(path).constData(), owner[0].toUInt(), owner[1].toUInt()), 0);
        QCOMPARE(::chmod(QFile::encodeName(path).constData(), owner[2].toUInt(nullptr, 8)), 0);
        QVERIFY(engine.interaction.script(scenario.values(QStringLiteral("answer"))));

        engine.config->checkFolderPermissions(user, scenario.values(QStringLiteral("rights")));
        // A mapped account is named in the details.
        for (const auto &record : qAsConst(engine.interaction.records))
            QVERIFY(user != "vic"
                    || record.message.detailedText.startsWith(QLatin1String("Detected mapped system user: ftp\n")));
        QCOMPARE(engine.interaction.texts(), scenario.values(QStringLiteral("text")));
        QCOMPARE(mode(path), scenario.value(QStringLiteral("mode")));
        QVERIFY(engine.interaction.allAnswersUsed());
    }

    void rootOfAnUnconfinedUserIsLeftAlone()
    {
        EngineFixture engine;
        QVERIFY(engine.load({{QStringLiteral("/etc/vsftpd.conf"), "local_enable=YES\n"}}));
        QCOMPARE(engine.config->effectiveRoot("bob"), QByteArray("/"));
        QCOMPARE(::chmod(QFile::encodeName(engine.root.path()).constData(), 0755), 0);
        engine.interaction.answers << Interaction::Button::Yes << Interaction::Button::Yes;
        engine.config->checkFolderPermissions("bob", {QStringLiteral("full access")});
        QCOMPARE(mode(engine.root.path()), QStringLiteral("rwxr-xr-x"));
        QCOMPARE(engine.interaction.records.size(), 0);
    }

    void createRootDirectory_data()
    {
        QTest::addColumn<QByteArray>("user");
        QTest::addColumn<QString>("expected"); // uid:gid:letters
        QTest::addColumn<QString>("stdoutText");

        QTest::newRow("local user") << QByteArray("bob") << QStringLiteral("1000:1000:rwxrwxr-x") << QString();
        QTest::newRow("anonymous root read-only") << Anonymous << QStringLiteral("107:113:r-xr-xr-x") << QString();
        QTest::newRow("account without a group") << QByteArray("nogroup") << QStringLiteral("1020:0:rwxrwxr-x")
                                                 << QStringLiteral("Error: user nogrouphas no group.\n");
    }

    void createRootDirectory()
    {
        QFETCH(QByteArray, user);
        QFETCH(QString, expected);
        QFETCH(QString, stdoutText);

        EngineFixture engine;
        Scenario scenario;
        scenario.fields[QStringLiteral("passwd")] << QStringLiteral("nogroup:x:1020:4242::/home/ng:/bin/sh");
        QVERIFY(engine.load(scenario));
        CaptureStream out(std::cout);
        CaptureStream err(std::cerr);
        AccessFailure failure;
        QVERIFY(engine.config->createRootDirectory(user, "/srv/new/root", &failure));
        QCOMPARE(QString::fromStdString(out.text()), stdoutText);
        struct stat info
        {
        };
        QCOMPARE(::stat(QFile::encodeName(engine.root.filePath(QStringLiteral("/srv/new/root"))).constData(), &info),
                 0);
        QCOMPARE(
            QStringLiteral("%1:%2:%3").arg(info.st_uid).arg(info.st_gid).arg(permissionLetters(info.st_mode & 0777)),
            expected);

        // A directory that cannot be made is a refusal of its own.
        QVERIFY(engine.root.writeFile(QStringLiteral("/srv/file"), "x"));
        QVERIFY(!engine.config->createRootDirectory(user, "/srv/file/sub", &failure));
        QCOMPARE(failure.kind, FailureKind::Filesystem);
        QCOMPARE(failure.message, QStringLiteral("***Result: FALSE. Check: Unable to create directory /srv/file/sub."));
    }
};

FTPCONFIG_TEST_GUILESS_MAIN(TestRights)

#include "TestRights.moc"

#include "TestMain.h"
#include "CaptureStream.h"
#include "FixtureRoot.h"
#include "ScriptedInteraction.h"
#include "policy/FtpServerConfig.h"

#include <QStandardPaths>
#include <QtTest>

#include <iostream>
#include <memory>
#include <sys/stat.h>
#include <unistd.h>

using FileMap = QMap<QString, QByteArray>;
Q_DECLARE_METATYPE(FileMap)

namespace {

struct Engine
{
    FixtureRoot root;
    ScriptedInteraction interaction;
    std::unique_ptr<FtpServerConfig> config;
    std::string out;

    bool load(const FileMap &files)
    {
        if (!root.write(files) || !root.writeVirtualUsers("/etc/vsftpd/virtual.db", {{"vic", "secret"}}))
            return false;
        config = std::make_unique<FtpServerConfig>(interaction, RootDirectory(root.path()));
        CaptureStream capture(std::cout);
        config->load();
        return true;
    }

    QByteArray userFile(const QByteArray &user) const
    {
        const ConfigFile *file = config->userConfig(user);
        return file ? QByteArray::fromStdString(file->text()) : QByteArray("<none>");
    }
};

const QByteArray PamWithUserdb = "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                                 "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n";

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
    void initTestCase();
    void rightsToKeys_data();
    void rightsToKeys();
    void keysToRights_data();
    void keysToRights();
    void rightsText();
    void permissionLetters_data();
    void permissionLetters();
    void perUserFileNames_data();
    void perUserFileNames();
    void roots();
    void setChrooted_data();
    void setChrooted();
    void folderPermissions_data();
    void folderPermissions();
    void rootOfAnUnconfinedUserIsLeftAlone();
    void createRootDirectory_data();
    void createRootDirectory();
};

void TestRights::initTestCase()
{
    QStandardPaths::setTestModeEnabled(true);
}

void TestRights::rightsToKeys_data()
{
    QTest::addColumn<QByteArray>("conf");
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<QString>("rights");
    QTest::addColumn<QByteArray>("written"); // the per-user file, or the main configuration for anonymous

    const QByteArray created = "# File was created by FTP manager\n";
    const QByteArray local = "local_enable=YES\n";
    const QByteArray guest = "local_enable=YES\nguest_enable=YES\n";
    QTest::newRow("full access, local") << local << QByteArray("bob") << "full access"
                                        << created + "write_enable=yes\ndownload_enable=yes\nanon_upload_enable=yes\n";
    QTest::newRow("nothing, local") << local << QByteArray("bob") << ""
                                    << created + "write_enable=no\ndownload_enable=no\nanon_upload_enable=no\n";
    QTest::newRow("mkdir alone turns writing back on, local")
        << local << QByteArray("bob") << "mkdir"
        << created + "write_enable=yes\ndownload_enable=no\nanon_upload_enable=no\n";
    QTest::newRow("write and download, local")
        << local << QByteArray("bob") << "write, download"
        << created + "write_enable=yes\ndownload_enable=yes\nanon_upload_enable=no\n";
    QTest::newRow("full access, guest mode") << guest << QByteArray("vic") << "full access"
                                             << created
            + "write_enable=yes\nanon_other_write_enable=yes\ndownload_enable=yes\nanon_upload_enable=yes\n"
              "anon_mkdir_write_enable=yes\n";
    QTest::newRow("nothing, guest mode") << guest << QByteArray("vic") << "download"
                                         << created
            + "write_enable=no\nanon_other_write_enable=no\ndownload_enable=yes\nanon_upload_enable=no\n"
              "anon_mkdir_write_enable=no\n";
    QTest::newRow("mkdir alone, guest mode") << guest << QByteArray("vic") << "mkdir"
                                             << created
            + "write_enable=yes\nanon_other_write_enable=no\ndownload_enable=no\nanon_upload_enable=no\n"
              "anon_mkdir_write_enable=yes\n";
    QTest::newRow("words compare case-sensitively")
        << local << QByteArray("bob") << "Write, download"
        << created + "write_enable=no\ndownload_enable=yes\nanon_upload_enable=no\n";
    QTest::newRow("anonymous into the main configuration")
        << QByteArray("local_enable=YES\nwrite_enable=NO\n") << QByteArray("Anonymous users") << "upload, download"
        << QByteArray("local_enable=YES\nwrite_enable=no\nlisten=yes\nanon_other_write_enable=no\ndownload_enable=yes\n"
                      "anon_upload_enable=yes\nanon_mkdir_write_enable=no\n");
}

void TestRights::rightsToKeys()
{
    QFETCH(QByteArray, conf);
    QFETCH(QByteArray, user);
    QFETCH(QString, rights);
    QFETCH(QByteArray, written);

    Engine engine;
    QVERIFY(engine.load({{"/etc/vsftpd.conf", conf}, {"/etc/pam.d/vsftpd", PamWithUserdb}}));
    CaptureStream out(std::cout);
    QVERIFY(engine.config->setUserRights(user, rights));
    QVERIFY(QString::fromStdString(out.text())
                .endsWith(QStringLiteral("Set permissions: %1 for user %2\n").arg(rights, QString::fromUtf8(user))));
    const bool anonymous = engine.config->isAnonymousUser(user);
    QCOMPARE(anonymous ? QByteArray::fromStdString(engine.config->mainConfig().text()) : engine.userFile(user),
             written);
    if (!anonymous) {
        // The new file is on disk at once with its first line only.
        QCOMPARE(engine.root.readFile("/etc/vsftpd.d/users.d/" + QString::fromUtf8(user)),
                 QByteArray("# File was created by FTP manager\n"));
    }
    QVERIFY(engine.config->isModified());
}

void TestRights::keysToRights_data()
{
    QTest::addColumn<QByteArray>("conf");
    QTest::addColumn<QByteArray>("bobFile");
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<QString>("shown");

    QTest::newRow("server defaults") << QByteArray("local_enable=YES\n") << QByteArray() << QByteArray("bob")
                                     << "download";
    QTest::newRow("write from the main configuration")
        << QByteArray("write_enable=YES\n") << QByteArray() << QByteArray("bob") << "write, download, mkdir";
    QTest::newRow("per-user file overrides")
        << QByteArray("write_enable=YES\n") << QByteArray("write_enable=NO\ndownload_enable=NO\n") << QByteArray("bob")
        << "";
    QTest::newRow("everything is full access")
        << QByteArray("local_enable=YES\n") << QByteArray("write_enable=yes\nanon_upload_enable=yes\n")
        << QByteArray("bob") << "full access";
    QTest::newRow("anonymous needs its own write keys")
        << QByteArray("write_enable=YES\nanon_upload_enable=YES\n") << QByteArray() << QByteArray("Anonymous users")
        << "download, upload";
    QTest::newRow("anonymous with everything")
        << QByteArray("write_enable=YES\nanon_upload_enable=YES\nanon_mkdir_write_enable=YES\n"
                      "anon_other_write_enable=YES\n")
        << QByteArray() << QByteArray("Anonymous users") << "full access";
}

void TestRights::keysToRights()
{
    QFETCH(QByteArray, conf);
    QFETCH(QByteArray, bobFile);
    QFETCH(QByteArray, user);
    QFETCH(QString, shown);

    Engine engine;
    FileMap files{{"/etc/vsftpd.conf", conf}};
    if (!bobFile.isNull())
        files.insert("/etc/vsftpd.d/users.d/bob", bobFile);
    QVERIFY(engine.load(files));
    QCOMPARE(::rightsText(engine.config->userRights(user)), shown);

    // What the table shows and writes back reads the same again.
    CaptureStream out(std::cout);
    QVERIFY(engine.config->setUserRights(user, shown));
    QCOMPARE(::rightsText(engine.config->userRights(user)), shown);
}

void TestRights::rightsText()
{
    QCOMPARE(::rightsText({"mkdir", "write", "bogus", "download"}), QStringLiteral("write, download, mkdir"));
    QCOMPARE(::rightsText({"full access", "upload"}), QStringLiteral("full access, upload"));
    QCOMPARE(::rightsText({}), QString());
}

void TestRights::permissionLetters_data()
{
    QTest::addColumn<int>("flags");
    QTest::addColumn<QString>("letters");
    QTest::newRow("0755") << 0755 << "rwxr-xr-x";
    QTest::newRow("0640") << 0640 << "rw-r-----";
    QTest::newRow("0000") << 0000 << "---------";
    QTest::newRow("0421") << 0421 << "r---w---x";
    QTest::newRow("setuid ignored") << 04777 << "rwxrwxrwx";
}

void TestRights::permissionLetters()
{
    QFETCH(int, flags);
    QFETCH(QString, letters);
    QCOMPARE(::permissionLetters(static_cast<unsigned>(flags)), letters);
}

void TestRights::perUserFileNames_data()
{
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<QString>("reason");
    QTest::newRow("slash") << QByteArray("../../etc/passwd") << "the name contains \"/\"";
    QTest::newRow("leading dot") << QByteArray(".hidden") << "the name begins with \".\"";
    QTest::newRow("newline") << QByteArray("bob\nroot") << "the name contains a line break";
    QTest::newRow("control character") << QByteArray("bob\x1b[31m") << "the name contains a control character";
    QTest::newRow("empty") << QByteArray("") << "the name is empty";
}

void TestRights::perUserFileNames()
{
    QFETCH(QByteArray, user);
    QFETCH(QString, reason);

    Engine engine;
    QVERIFY(engine.load({}));
    const QStringList before = QDir(engine.root.filePath("/etc")).entryList(QDir::AllEntries | QDir::Hidden);
    CaptureStream out(std::cout);
    CaptureStream err(std::cerr);
    QVERIFY(!engine.config->setUserRights(user, QStringLiteral("write")));
    QVERIFY(!engine.config->setUserRoot(user, "/srv/x"));
    QCOMPARE(engine.interaction.records.size(), 2);
    QCOMPARE(engine.interaction.records.first().message.text,
             QStringLiteral("Unable to create per-user config file.\n\"%1\" cannot be a file name: %2.")
                 .arg(QString::fromUtf8(user), reason));
    QVERIFY(QString::fromStdString(out.text()).contains("Unable to create userconf file\n"));
    QVERIFY(!engine.config->userConfig(user));
    QCOMPARE(QDir(engine.root.filePath("/etc")).entryList(QDir::AllEntries | QDir::Hidden), before);
    QCOMPARE(QDir(engine.root.filePath("/etc/vsftpd.d/users.d")).entryList(QDir::Files | QDir::Hidden), QStringList());
}

void TestRights::roots()
{
    Engine engine;
    QVERIFY(engine.load({{"/etc/vsftpd.conf", "local_enable=YES\nchroot_local_user=YES\n"}}));
    QVERIFY(engine.config->setUserRoot("bob", "/srv/bob"));
    QVERIFY(engine.config->setUserRoot("Anonymous users", "/srv/anon"));
    QCOMPARE(engine.userFile("bob"), QByteArray("# File was created by FTP manager\nlocal_root=/srv/bob\n"));
    QVERIFY(engine.config->mainConfig().text().find("anon_root=/srv/anon\n") != std::string::npos);
    QCOMPARE(engine.config->effectiveRoot("bob"), QByteArray("/srv/bob"));
    QCOMPARE(engine.config->effectiveRoot("Anonymous users"), QByteArray("/srv/anon"));
    QVERIFY(engine.config->setUserRoot("bob", "/srv/other"));
    QCOMPARE(engine.userFile("bob"), QByteArray("# File was created by FTP manager\nlocal_root=/srv/other\n"));
}

void TestRights::setChrooted_data()
{
    QTest::addColumn<QByteArray>("conf");
    QTest::addColumn<QByteArray>("list");
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<QString>("listAfter");
    QTest::addColumn<bool>("listEnabledAfter");

    QTest::newRow("list enabled, local off: add")
        << QByteArray("chroot_list_enable=YES\n") << QByteArray("alice\n") << QByteArray("bob") << "alice,bob" << true;
    QTest::newRow("both on: remove") << QByteArray("chroot_list_enable=YES\nchroot_local_user=YES\n")
                                     << QByteArray("bob\nalice\n") << QByteArray("bob") << "alice" << true;
    QTest::newRow("neither: enable the list")
        << QByteArray("local_enable=YES\n") << QByteArray() << QByteArray("bob") << "bob" << true;
    QTest::newRow("already chrooted") << QByteArray("chroot_local_user=YES\n") << QByteArray() << QByteArray("bob")
                                      << "" << false;
    QTest::newRow("guest mode: nothing") << QByteArray("guest_enable=YES\n") << QByteArray() << QByteArray("bob") << ""
                                         << false;
    QTest::newRow("not a local account: nothing")
        << QByteArray("local_enable=YES\n") << QByteArray() << QByteArray("vic") << "" << false;
}

void TestRights::setChrooted()
{
    QFETCH(QByteArray, conf);
    QFETCH(QByteArray, list);
    QFETCH(QByteArray, user);
    QFETCH(QString, listAfter);
    QFETCH(bool, listEnabledAfter);

    Engine engine;
    QVERIFY(engine.load({{"/etc/vsftpd.conf", conf}, {"/etc/vsftpd.chroot_list", list}}));
    engine.config->setChrooted(user);
    QCOMPARE(engine.config->chrootList().join(QLatin1Char(',')), listAfter);
    QCOMPARE(engine.config->isYes("chroot_list_enable"), listEnabledAfter);
    QVERIFY(engine.config->isChrooted(user));
}

void TestRights::folderPermissions_data()
{
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<QString>("owner"); // uid:gid:mode of the root
    QTest::addColumn<QStringList>("rights");
    QTest::addColumn<QStringList>("answers");
    QTest::addColumn<QStringList>("texts");
    QTest::addColumn<QString>("modeAfter");

    const QString noRead = "|User may download, but folder has no READ permission for user %1|Let me fix it?|";
    const QString noWrite = "|User may write, but folder has no WRITE permission for user %1|Let me fix it?|";
    QTest::newRow("owner class, fix read")
        << QByteArray("bob") << "1000:1000:0300" << QStringList{"download"} << QStringList{"yes"}
        << QStringList{noRead.arg("bob")
                       + "Folder owner: bob\nFolder group: bob\n\nCurrent permissions:\n-wx------\n"
                         "New permissions:\nrwx------"}
        << "rwx------";
    QTest::newRow("owner class, refuse") << QByteArray("bob") << "1000:1000:0300" << QStringList{"download"}
                                         << QStringList{"no"}
                                         << QStringList{noRead.arg("bob")
                                                        + "Folder owner: bob\nFolder group: bob\n\n"
                                                          "Current permissions:\n-wx------\nNew "
                                                          "permissions:\nrwx------"}
                                         << "-wx------";
    QTest::newRow("group class, fix write")
        << QByteArray("alice") << "0:2000:0750" << QStringList{"mkdir"} << QStringList{"yes"}
        << QStringList{noWrite.arg("alice")
                       + "Folder owner: root\nFolder group: ftpusers\n\nCurrent permissions:\n"
                         "rwxr-x---\nNew permissions:\nrwxrwx---"}
        << "rwxrwx---";
    QTest::newRow("other class, both")
        << QByteArray("bob") << "0:0:0700" << QStringList{"full access"} << QStringList{"yes", "yes"}
        << QStringList{noRead.arg("bob")
                           + "Folder owner: root\nFolder group: root\n\nCurrent permissions:\n"
                             "rwx------\nNew permissions:\nrwx---r--",
                       noWrite.arg("bob")
                           + "Folder owner: root\nFolder group: root\n\nCurrent permissions:\n"
                             "rwx---r--\nNew permissions:\nrwx---rw-"}
        << "rwx---rw-";
    QTest::newRow("enough already") << QByteArray("bob") << "1000:1000:0700" << QStringList{"full access"}
                                    << QStringList() << QStringList() << "rwx------";
    QTest::newRow("virtual user judged as its guest account")
        << QByteArray("vic") << "107:113:0500" << QStringList{"download"} << QStringList() << QStringList()
        << "r-x------";
    QTest::newRow("anonymous root stays read-only")
        << QByteArray("Anonymous users") << "0:113:0755" << QStringList{"write"} << QStringList()
        << QStringList{"|Root folder for anonymous user must be read-only by him."} << "rwxr-xr-x";
}

void TestRights::folderPermissions()
{
    QFETCH(QByteArray, user);
    QFETCH(QString, owner);
    QFETCH(QStringList, rights);
    QFETCH(QStringList, answers);
    QFETCH(QStringList, texts);
    QFETCH(QString, modeAfter);

    Engine engine;
    QVERIFY(engine.load({{"/etc/vsftpd.conf",
                          "local_enable=YES\nchroot_local_user=YES\nguest_enable=NO\n"
                          "anon_root=/srv/ftp\n"},
                         {"/etc/pam.d/vsftpd", PamWithUserdb}}));
    if (user == "vic")
        setValue(engine.config->mainConfig().elements, "", "guest_enable", "YES");
    const QByteArray root = engine.config->effectiveRoot(user);
    const QString path = engine.root.filePath(QString::fromUtf8(root));
    QVERIFY(QDir().mkpath(path));
    const QStringList o = owner.split(QLatin1Char(':'));
    QCOMPARE(::chown(QFile::encodeName(path).constData(), o[0].toUInt(), o[1].toUInt()), 0);
    QCOMPARE(::chmod(QFile::encodeName(path).constData(), o[2].toUInt(nullptr, 8)), 0);
    for (const QString &answer : answers)
        engine.interaction.answers << (answer == "yes" ? Interaction::Button::Yes : Interaction::Button::No);

    engine.config->checkFolderPermissions(user, rights);
    QStringList shown = engine.interaction.texts();
    if (user == "vic") {
        // A mapped account is named in the details.
        for (const auto &record : engine.interaction.records)
            QVERIFY(record.message.detailedText.startsWith("Detected mapped system user: ftp\n"));
    }
    QCOMPARE(shown, texts);
    QCOMPARE(mode(path), modeAfter);
    QVERIFY(engine.interaction.allAnswersUsed());
}

void TestRights::rootOfAnUnconfinedUserIsLeftAlone()
{
    Engine engine;
    QVERIFY(engine.load({{"/etc/vsftpd.conf", "local_enable=YES\n"}}));
    QCOMPARE(engine.config->effectiveRoot("bob"), QByteArray("/"));
    const QByteArray root = QFile::encodeName(engine.root.path());
    QCOMPARE(::chmod(root.constData(), 0755), 0);
    engine.interaction.answers << Interaction::Button::Yes << Interaction::Button::Yes;
    engine.config->checkFolderPermissions("bob", {"full access"});
    QCOMPARE(mode(engine.root.path()), QStringLiteral("rwxr-xr-x"));
    QCOMPARE(engine.interaction.records.size(), 0);
}

void TestRights::createRootDirectory_data()
{
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<QString>("expected"); // uid:gid:letters
    QTest::addColumn<QString>("stdoutText");

    QTest::newRow("local user") << QByteArray("bob") << "1000:1000:rwxrwxr-x"
                                << "";
    QTest::newRow("anonymous root read-only") << QByteArray("Anonymous users") << "107:113:r-xr-xr-x"
                                              << "";
    QTest::newRow("account without a group") << QByteArray("nogroup") << "1020:0:rwxrwxr-x"
                                             << "Error: user nogrouphas no group.\n";
}

void TestRights::createRootDirectory()
{
    QFETCH(QByteArray, user);
    QFETCH(QString, expected);
    QFETCH(QString, stdoutText);

    Engine engine;
    QVERIFY(engine.load(
        {{"/etc/passwd", FixtureRoot::defaults()["/etc/passwd"] + "nogroup:x:1020:4242::/home/ng:/bin/sh\n"}}));
    CaptureStream out(std::cout);
    CaptureStream err(std::cerr);
    AccessFailure failure;
    QVERIFY(engine.config->createRootDirectory(user, "/srv/new/root", &failure));
    QCOMPARE(QString::fromStdString(out.text()), stdoutText);
    struct stat info
    {
    };
    QCOMPARE(::stat(QFile::encodeName(engine.root.filePath("/srv/new/root")).constData(), &info), 0);
    QCOMPARE(QStringLiteral("%1:%2:%3").arg(info.st_uid).arg(info.st_gid).arg(::permissionLetters(info.st_mode & 0777)),
             expected);

    // A directory that cannot be made is a refusal of its own.
    QVERIFY(engine.root.writeFile("/srv/file", "x"));
    QVERIFY(!engine.config->createRootDirectory(user, "/srv/file/sub", &failure));
    QCOMPARE(failure.kind, FailureKind::Filesystem);
    QCOMPARE(failure.message, QStringLiteral("***Result: FALSE. Check: Unable to create directory /srv/file/sub."));
}

FTPCONFIG_TEST_GUILESS_MAIN(TestRights)
#include "TestRights.moc"

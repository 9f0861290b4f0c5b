#include "CaptureStream.h"
#include "FixtureRoot.h"
#include "ScriptedInteraction.h"
#include "TestMain.h"
#include "policy/FtpServerConfig.h"

#include <QSettings>
#include <QStandardPaths>
#include <QtTest>

#include <iostream>
#include <memory>
#include <sys/stat.h>
#include <unistd.h>

using FileMap = QMap<QString, QByteArray>;
Q_DECLARE_METATYPE(FileMap)

namespace {

const QByteArray PamWithUserdb = "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                                 "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                                 "@include common-auth\n";

// One engine on a fixture root, loaded with the interaction scripted and the
// standard streams captured.
struct Engine
{
    FixtureRoot root;
    ScriptedInteraction interaction;
    std::unique_ptr<FtpServerConfig> config;
    std::string out;
    std::string err;
    int exitStatus = 0; // 0: the load did not end the process

    bool load(const FileMap &files, const QMap<QByteArray, QByteArray> &virtualUsers = {})
    {
        if (!root.write(files))
            return false;
        if (!virtualUsers.isEmpty() && !root.writeVirtualUsers("/etc/vsftpd/virtual.db", virtualUsers))
            return false;
        config = std::make_unique<FtpServerConfig>(interaction, RootDirectory(root.path()));
        CaptureStream capturedOut(std::cout);
        CaptureStream capturedErr(std::cerr);
        try {
            config->load();
        } catch (const ProcessExit &exit) {
            exitStatus = exit.status;
        }
        out = capturedOut.text();
        err = capturedErr.text();
        return true;
    }

    QByteArray main() const
    {
        return QByteArray::fromStdString(config->mainConfig().text());
    }
};

QString describeLoaded(FtpServerConfig &config)
{
    QStringList parts;
    parts << "userlist=" + config.userlist().join(QLatin1Char(','));
    parts << "chroot=" + config.chrootList().join(QLatin1Char(','));
    parts << "confdir=" + QString::fromUtf8(config.userConfigDir());
    QStringList users;
    for (const auto &entry : config.userConfigs())
        users << QString::fromUtf8(entry.first);
    parts << "userconfigs=" + users.join(QLatin1Char(','));
    if (const auto &rule = config.ftpusersRule()) {
        parts << QStringLiteral("rule=%1/%2/%3/%4/%5")
                     .arg(QString::fromUtf8(rule->item), QString::fromUtf8(rule->sense), QString::fromUtf8(rule->file),
                          QString::fromUtf8(rule->onerr), QString::fromUtf8(rule->apply));
    } else {
        parts << QStringLiteral("rule=none");
    }
    parts << "ftpusers=" + QString::fromStdString(config.ftpusersList().text()).replace('\n', QLatin1Char('/'));
    parts << "db=" + QString::fromUtf8(config.virtualUsersDbPath());
    parts << "main=" + QString::fromStdString(config.mainConfig().text()).replace('\n', QLatin1Char('/'));
    return parts.join(QLatin1Char(';'));
}

} // namespace

class TestFtpServerConfig : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase();
    void init();
    void fatalLoad_data();
    void fatalLoad();
    void loading_data();
    void loading();
    void failureKindTexts();
    void verdicts_data();
    void verdicts();
    void repairs_data();
    void repairs();
    void rootDirectoryRepairs_data();
    void rootDirectoryRepairs();
    void chrootAndRoots_data();
    void chrootAndRoots();
    void blockUser_data();
    void blockUser();
    void pamUserdb_data();
    void pamUserdb();
    void failureDialog();
};

void TestFtpServerConfig::initTestCase()
{
    // The PAM check remembers "Valid" in the settings: keep them away from
    // the administrator's own.
    QStandardPaths::setTestModeEnabled(true);
    QCoreApplication::setApplicationName(QStringLiteral("ftpconfig-test"));
}

void TestFtpServerConfig::init()
{
    QSettings().clear();
}

void TestFtpServerConfig::fatalLoad_data()
{
    QTest::addColumn<FileMap>("files");
    QTest::addColumn<QString>("stdoutText");
    QTest::addColumn<QStringList>("texts");
    QTest::addColumn<int>("status");

    QTest::newRow("missing main configuration is created")
        << FileMap{{"/etc/vsftpd.conf", QByteArray()}} << "/etc/vsftpd.conf not found\n"
        << QStringList() << 0;
    QTest::newRow("main configuration is a directory")
        << FileMap{{"/etc/vsftpd.conf", QByteArray()}, {"/etc/vsftpd.conf/x", "a directory in the way"}}
        << "/etc/vsftpd.conf could not be opened\n"
        << QStringList{"Initialization error|Unable to open /etc/vsftpd.conf"} << -1;
    QTest::newRow("missing PAM file") << FileMap{{"/etc/pam.d/vsftpd", QByteArray()}} << "/etc/pam.d/vsftpd not found\n"
                                      << QStringList{"Initialization error|Unable to find /etc/pam.d/vsftpd"} << -1;
    QTest::newRow("missing PAM file of another service")
        << FileMap{{"/etc/vsftpd.conf", "pam_service_name=ftp\n"}} << "/etc/pam.d/ftp not found\n"
        << QStringList{"Initialization error|Unable to find /etc/pam.d/ftp"} << -1;
}

void TestFtpServerConfig::fatalLoad()
{
    QFETCH(FileMap, files);
    QFETCH(QString, stdoutText);
    QFETCH(QStringList, texts);
    QFETCH(int, status);

    Engine engine;
    QVERIFY(engine.load(files));
    QCOMPARE(QString::fromStdString(engine.out), stdoutText);
    QCOMPARE(engine.interaction.texts(), texts);
    QCOMPARE(engine.exitStatus, status);
    if (status == 0)
        QCOMPARE(engine.root.readFile("/etc/vsftpd.conf"), QByteArray("listen=YES\n"));
}

void TestFtpServerConfig::loading_data()
{
    QTest::addColumn<FileMap>("files");
    QTest::addColumn<QStringList>("expected"); // parts of the loaded state

    QTest::newRow("defaults") << FileMap{{"/etc/vsftpd.conf", "local_enable=YES\n"}}
                              << QStringList{"userlist=;", "confdir=/etc/vsftpd.d/users.d/;",
                                             "rule=user/deny//etc/ftpusers/succeed/;",
                                             "db=/var/lib/ftpconfig/vsftpd_virtual_users.db;",
                                             "main=local_enable=YES/listen=yes/"};
    QTest::newRow("userlist lines simplified")
        << FileMap{{"/etc/vsftpd.d/allowed_user_list.conf", "  bob  \n\nalice\t smith\n#root\n"}}
        << QStringList{"userlist=bob,alice smith,#root;"};
    QTest::newRow("userlist from its key")
        << FileMap{{"/etc/vsftpd.conf", "userlist_file=/etc/vsftpd.user_list\n"}, {"/etc/vsftpd.user_list", "carl\n"}}
        << QStringList{"userlist=carl;"};
    QTest::newRow("chroot list from its key")
        << FileMap{{"/etc/vsftpd.conf", "chroot_list_file=/etc/chroots\n"}, {"/etc/chroots", "bob\n"}}
        << QStringList{"chroot=bob;"};
    QTest::newRow("per-user directory without a final slash")
        << FileMap{{"/etc/vsftpd.conf", "user_config_dir=/etc/ftpusers.d\n"},
                   {"/etc/ftpusers.d/bob", "local_root=/x\n"}}
        << QStringList{"confdir=/etc/ftpusers.d/;", "userconfigs=bob;"};
    QTest::newRow("listen kept as it is")
        << FileMap{{"/etc/vsftpd.conf", "listen=NO\n"}} << QStringList{"main=listen=NO/"};
    QTest::newRow("listen_ipv6 alone is enough")
        << FileMap{{"/etc/vsftpd.conf", "listen_ipv6=YES\n"}} << QStringList{"main=listen_ipv6=YES/"};
    QTest::newRow("no pam_listfile line, no rule")
        << FileMap{{"/etc/pam.d/vsftpd", "@include common-auth\n"}} << QStringList{"rule=none;", "ftpusers=;"};
    QTest::newRow("rule arguments") << FileMap{{"/etc/pam.d/vsftpd",
                                                "auth required pam_listfile.so onerr=fail item=group sense=allow "
                                                "file=/etc/ftpgroups apply=@staff\n"},
                                               {"/etc/ftpgroups", "ftpusers\n"}}
                                    << QStringList{"rule=group/allow//etc/ftpgroups/fail/@staff;",
                                                   "ftpusers=ftpusers/;"};
    QTest::newRow("database named by pam_userdb")
        << FileMap{{"/etc/pam.d/vsftpd", PamWithUserdb}} << QStringList{"db=/etc/vsftpd/virtual.db;"};
    QTest::newRow("database named with its suffix")
        << FileMap{{"/etc/pam.d/vsftpd", "auth sufficient pam_userdb.so db=/srv/users.db\n"}}
        << QStringList{"db=/srv/users.db;"};
}

void TestFtpServerConfig::loading()
{
    QFETCH(FileMap, files);
    QFETCH(QStringList, expected);

    Engine engine;
    QVERIFY(engine.load(files));
    QCOMPARE(engine.exitStatus, 0);
    const QString loaded = describeLoaded(*engine.config) + QLatin1Char(';');
    for (const QString &part : expected)
        QVERIFY2(loaded.contains(part), qPrintable(loaded));
    QVERIFY(engine.root.exists(QString::fromUtf8(engine.config->userConfigDir())));
    QCOMPARE(engine.interaction.records.size(), 0);
}

void TestFtpServerConfig::failureKindTexts()
{
    const QStringList texts{
        "none", "PAM ftpusers file",          "FTP userlist file",      "main vsftpd configuration file",
        "",     "/etc/passwd or /etc/shadow", "filesystem permissions", "",
        ""};
    for (uint32_t kind = 0; kind < static_cast<uint32_t>(texts.size()); ++kind)
        QCOMPARE(failureKindText(kind), texts[static_cast<int>(kind)]);
    QCOMPARE(failureKindText(FailureKind::PamUserDb), QString());
}

void TestFtpServerConfig::verdicts_data()
{
    QTest::addColumn<FileMap>("files");
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<bool>("allowed");
    QTest::addColumn<int>("kind");
    QTest::addColumn<QString>("message");

    const QString prefix = QStringLiteral("***Result: FALSE. Check: ");
    const QByteArray anon = "Anonymous users";

    // Main configuration.
    QTest::newRow("anonymous admitted by default") << FileMap{} << anon << true << 0 << "";
    QTest::newRow("anonymous_enable=NO") << FileMap{{"/etc/vsftpd.conf", "anonymous_enable=NO\nlocal_enable=YES\n"}}
                                         << anon << false << 3
                                         << prefix + "main ftp config has anonymous_enable option != yes.";
    QTest::newRow("anonymous_enable in capitals")
        << FileMap{{"/etc/vsftpd.conf", "anonymous_enable=YES\n"}} << QByteArray("anonymous") << true << 0 << "";
    QTest::newRow("local ftp account is anonymous")
        << FileMap{{"/etc/vsftpd.conf", "anonymous_enable=no\n"}} << QByteArray("ftp") << false << 3
        << prefix + "main ftp config has anonymous_enable option != yes.";
    QTest::newRow("local_enable absent") << FileMap{{"/etc/vsftpd.conf", "listen=YES\n"}} << QByteArray("bob") << false
                                         << 3 << prefix + "main ftp config has no local_enable defined";
    QTest::newRow("local_enable=NO") << FileMap{{"/etc/vsftpd.conf", "local_enable=NO\n"}} << QByteArray("bob") << false
                                     << 3 << prefix + "main ftp config has local_enable != yes";
    QTest::newRow("virtual without guest mode")
        << FileMap{{"/etc/pam.d/vsftpd", PamWithUserdb}} << QByteArray("vic") << false << 3
        << prefix + "user is virtual, but in main ftp config guest users are not enabled (but have to be).";

    // Root directory.
    QTest::newRow("chrooted home missing")
        << FileMap{{"/etc/vsftpd.conf", "local_enable=YES\nchroot_local_user=YES\n"},
                   {"/etc/passwd", FixtureRoot::defaults()["/etc/passwd"] + "nohome:x:1010:1000::/home/none:/bin/sh\n"}}
        << QByteArray("nohome") << false << 6 << prefix + "user home directory /home/none does not exist.";
    QTest::newRow("unchrooted user lands in /")
        << FileMap{{"/etc/passwd", FixtureRoot::defaults()["/etc/passwd"] + "nohome:x:1010:1000::/home/none:/bin/sh\n"}}
        << QByteArray("nohome") << true << 0 << "";
    QTest::newRow("anonymous root missing") << FileMap{{"/etc/vsftpd.conf", "anon_root=/srv/none\n"}} << anon << false
                                            << 6 << prefix + "user home directory /srv/none does not exist.";

    // PAM ftpusers list.
    QTest::newRow("listed in a deny list")
        << FileMap{} << QByteArray("root") << false << 1
        << prefix + "ftpusers file (item:user|ruser, sense:deny) contains  root record.";
    QTest::newRow("ruser works like user")
        << FileMap{{"/etc/pam.d/vsftpd", "auth required pam_listfile.so item=ruser sense=deny file=/etc/ftpusers\n"}}
        << QByteArray("root") << false << 1
        << prefix + "ftpusers file (item:user|ruser, sense:deny) contains  root record.";
    QTest::newRow("missing from an allow list")
        << FileMap{{"/etc/pam.d/vsftpd", "auth required pam_listfile.so item=user sense=allow file=/etc/ftpusers\n"}}
        << QByteArray("bob") << false << 1
        << prefix + "ftpusers file (item:user|ruser, sense:allow) has no bob record.";
    QTest::newRow("group allow list without the user's group")
        << FileMap{{"/etc/pam.d/vsftpd", "auth required pam_listfile.so item=group sense=allow file=/etc/ftpusers\n"},
                   {"/etc/ftpusers", "ftpusers\n"}}
        << QByteArray("bob") << false << 1
        << prefix + "ftpusers file (item:group, sense:allow) has no group, in which participates user bob";
    QTest::newRow("group allow list with a supplementary group")
        << FileMap{{"/etc/pam.d/vsftpd", "auth required pam_listfile.so item=group sense=allow file=/etc/ftpusers\n"},
                   {"/etc/ftpusers", "ftpusers\n"}}
        << QByteArray("alice") << true << 0 << "";
    QTest::newRow("group deny list with the primary group")
        << FileMap{{"/etc/pam.d/vsftpd", "auth required pam_listfile.so item=group sense=deny file=/etc/ftpusers\n"},
                   {"/etc/ftpusers", "bob\n"}}
        << QByteArray("bob") << false << 1
        << prefix + "ftpusers file (item:group, sense:deny) contains group, in which participates user  bob";
    QTest::newRow("unknown item lets everybody through")
        << FileMap{{"/etc/pam.d/vsftpd", "auth required pam_listfile.so item=tty sense=allow file=/etc/ftpusers\n"}}
        << QByteArray("bob") << true << 0 << "";

    // Userlist.
    QTest::newRow("no userlist keys: a black list")
        << FileMap{{"/etc/vsftpd.d/allowed_user_list.conf", "bob\n"}} << QByteArray("bob") << false << 2
        << prefix + "userlist file contains bob, userlist file mode = black users";
    QTest::newRow("white list without the user")
        << FileMap{{"/etc/vsftpd.conf", "local_enable=YES\nuserlist_deny=NO\n"},
                   {"/etc/vsftpd.d/allowed_user_list.conf", "alice\n"}}
        << QByteArray("bob") << false << 2
        << prefix + "userlist file doesn't contains bob, userlist file mode = white users";
    QTest::newRow("white list with the user") << FileMap{{"/etc/vsftpd.conf", "local_enable=YES\nuserlist_deny=no\n"},
                                                         {"/etc/vsftpd.d/allowed_user_list.conf", "bob\n"}}
                                              << QByteArray("bob") << true << 0 << "";
    QTest::newRow("userlist disabled") << FileMap{{"/etc/vsftpd.conf", "local_enable=YES\nuserlist_enable=NO\n"},
                                                  {"/etc/vsftpd.d/allowed_user_list.conf", "bob\n"}}
                                       << QByteArray("bob") << true << 0 << "";
    QTest::newRow("userlist names compare case-sensitively")
        << FileMap{{"/etc/vsftpd.d/allowed_user_list.conf", "Bob\n"}} << QByteArray("bob") << true << 0 << "";

    // Passwords.
    QTest::newRow("unknown account has no root")
        << FileMap{} << QByteArray("ghost") << false << 6 << prefix + "user home directory  does not exist.";
    QTest::newRow("unknown account") << FileMap{{"/etc/vsftpd.conf", "local_enable=YES\nlocal_root=/srv/ftp\n"}}
                                     << QByteArray("ghost") << false << 5
                                     << prefix + "user ghost could not be found in local user db.";
    QTest::newRow("star in passwd") << FileMap{} << QByteArray("starred") << false << 5
                                    << prefix + "user starred  has bad passwd in /etc/passwd (* or !).";
    QTest::newRow("bang in shadow") << FileMap{} << QByteArray("locked") << false << 5
                                    << prefix + "user locked  has bad passwd in /etc/shadow (* or !).";
    QTest::newRow("locked hash is no refusal") << FileMap{} << QByteArray("lockedhash") << true << 0 << "";
    QTest::newRow("double bang is no refusal") << FileMap{} << QByteArray("doublebang") << true << 0 << "";
    QTest::newRow("plain local user") << FileMap{} << QByteArray("bob") << true << 0 << "";

    // Virtual users.
    QTest::newRow("virtual user in guest mode")
        << FileMap{{"/etc/vsftpd.conf", "local_enable=YES\nguest_enable=YES\n"}, {"/etc/pam.d/vsftpd", PamWithUserdb}}
        << QByteArray("vic") << true << 0 << "";
}

void TestFtpServerConfig::verdicts()
{
    QFETCH(FileMap, files);
    QFETCH(QByteArray, user);
    QFETCH(bool, allowed);
    QFETCH(int, kind);
    QFETCH(QString, message);

    Engine engine;
    QVERIFY(engine.load(files, {{"vic", "secret"}}));
    QCOMPARE(engine.exitStatus, 0);
    const QByteArray before = engine.main();
    AccessFailure failure;
    QCOMPARE(engine.config->checkAccess(user, false, &failure), allowed);
    QCOMPARE(static_cast<int>(failure.kind), kind);
    QCOMPARE(failure.message, message);
    // Without repair nothing changes and nobody is asked.
    QCOMPARE(engine.main(), before);
    QVERIFY(!engine.config->isModified());
    QCOMPARE(engine.interaction.records.size(), 0);
}

void TestFtpServerConfig::repairs_data()
{
    QTest::addColumn<FileMap>("files");
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<QByteArray>("mainAfter");
    QTest::addColumn<QString>("userlistAfter");
    QTest::addColumn<QByteArray>("ftpusersAfter");

    const QByteArray ftpusers = FixtureRoot::defaults()["/etc/ftpusers"];
    QTest::newRow("anonymous_enable set to yes")
        << FileMap{{"/etc/vsftpd.conf", "anonymous_enable = NO\nlocal_enable=YES\n"}} << QByteArray("Anonymous users")
        << QByteArray("anonymous_enable = yes\nlocal_enable=YES\nlisten=yes\n") << "" << ftpusers;
    QTest::newRow("local_enable appended before empty lines")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\n\n"}} << QByteArray("bob")
        << QByteArray("listen=YES\nlocal_enable=yes\n\n") << "" << ftpusers;
    QTest::newRow("local_enable set to yes")
        << FileMap{{"/etc/vsftpd.conf", "# off\nlocal_enable=NO\n"}} << QByteArray("bob")
        << QByteArray("# off\nlocal_enable=yes\nlisten=yes\n") << "" << ftpusers;
    QTest::newRow("guest mode for a virtual user")
        << FileMap{{"/etc/vsftpd.conf", "local_enable=YES\nguest_enable=NO\n"}, {"/etc/pam.d/vsftpd", PamWithUserdb}}
        << QByteArray("vic") << QByteArray("local_enable=YES\nguest_enable=yes\nlisten=yes\n") << "" << QByteArray();
    QTest::newRow("removed from a black userlist")
        << FileMap{{"/etc/vsftpd.d/allowed_user_list.conf", "bob\nalice\nbob\n"}} << QByteArray("bob")
        << QByteArray("listen=YES\nlocal_enable=YES\n") << "alice" << ftpusers;
    QTest::newRow("added to a white userlist")
        << FileMap{{"/etc/vsftpd.conf", "local_enable=YES\nuserlist_deny=NO\n"},
                   {"/etc/vsftpd.d/allowed_user_list.conf", "alice\n"}}
        << QByteArray("bob") << QByteArray("local_enable=YES\nuserlist_deny=NO\nlisten=yes\n") << "alice,bob"
        << ftpusers;
    QTest::newRow("removed from the ftpusers deny list")
        << FileMap{{"/etc/ftpusers", "# no ftp\nroot\nbob\n"}} << QByteArray("bob")
        << QByteArray("listen=YES\nlocal_enable=YES\n") << "" << QByteArray("# no ftp\nroot\n");
    QTest::newRow("added to the ftpusers allow list")
        << FileMap{{"/etc/pam.d/vsftpd", "auth required pam_listfile.so item=user sense=allow file=/etc/ftpusers\n"},
                   {"/etc/ftpusers", "alice\n\n"}}
        << QByteArray("bob") << QByteArray("listen=YES\nlocal_enable=YES\n") << "" << QByteArray("alice\nbob\n\n");
    QTest::newRow("primary group added to a group allow list")
        << FileMap{{"/etc/pam.d/vsftpd", "auth required pam_listfile.so item=group sense=allow file=/etc/ftpusers\n"},
                   {"/etc/ftpusers", "staff\n"}}
        << QByteArray("alice") << QByteArray("listen=YES\nlocal_enable=YES\n") << "" << QByteArray("staff\nftpusers\n");
    QTest::newRow("groups removed from a group deny list")
        << FileMap{{"/etc/pam.d/vsftpd", "auth required pam_listfile.so item=group sense=deny file=/etc/ftpusers\n"},
                   {"/etc/ftpusers", "ftpusers\nstaff\nalice\n"}}
        << QByteArray("alice") << QByteArray("listen=YES\nlocal_enable=YES\n") << "" << QByteArray("staff\n");
}

void TestFtpServerConfig::repairs()
{
    QFETCH(FileMap, files);
    QFETCH(QByteArray, user);
    QFETCH(QByteArray, mainAfter);
    QFETCH(QString, userlistAfter);
    QFETCH(QByteArray, ftpusersAfter);

    Engine engine;
    QVERIFY(engine.load(files, {{"vic", "secret"}}));
    FtpServerConfig &config = *engine.config;
    QVERIFY(!config.checkAccess(user, false));
    QVERIFY(!config.isModified());
    AccessFailure failure;
    QVERIFY(config.checkAccess(user, true, &failure));
    QCOMPARE(failure.message, QString());
    QVERIFY(config.isModified());
    QCOMPARE(engine.main(), mainAfter);
    QCOMPARE(config.userlist().join(QLatin1Char(',')), userlistAfter);
    QCOMPARE(QByteArray::fromStdString(config.ftpusersList().text()), ftpusersAfter);
    QCOMPARE(config.userlistModified(), userlistAfter != files.value("/etc/vsftpd.d/allowed_user_list.conf").trimmed());
    QCOMPARE(engine.interaction.records.size(), 0);
    // Repaired in memory, so a second look admits the user; the disk is
    // untouched until a save.
    QVERIFY(config.checkAccess(user, false));
    QCOMPARE(engine.root.readFile("/etc/vsftpd.conf"),
             files.value("/etc/vsftpd.conf", FixtureRoot::defaults()["/etc/vsftpd.conf"]));
}

void TestFtpServerConfig::rootDirectoryRepairs_data()
{
    QTest::addColumn<QString>("setup");
    QTest::addColumn<QStringList>("answers");
    QTest::addColumn<bool>("granted");
    QTest::addColumn<QStringList>("texts");
    QTest::addColumn<QString>("message");
    QTest::addColumn<QString>("after"); // owner:group:mode of /srv/ftp, or of /home/none

    const QString prefix = QStringLiteral("***Result: FALSE. Check: ");
    const QString create = "|User home directory /home/none does not exist.|Do you want to create it?";
    const QString group = "Invalid group of FTP root folder|FTP root folder is writeable by group it belongs - it is "
                          "forbidden. Do you allow to change directory permissions?";

    QTest::newRow("create a missing home") << "missing" << QStringList{"accept"} << true << QStringList{create} << ""
                                           << "1010:1000:775";
    QTest::newRow("refuse to create a home") << "missing" << QStringList{"cancel"} << false << QStringList{create}
                                             << prefix + "user home directory /home/none does not exist."
                                             << "";
    QTest::newRow("anonymous root owned by ftp, new owner")
        << "owned" << QStringList{"owner:bob"} << true << QStringList{"|"} << ""
        << "1000:0:755";
    QTest::newRow("anonymous root owned by ftp, cancelled")
        << "owned" << QStringList{"owner:"} << false << QStringList{"|"}
        << prefix + "user home directory /srv/ftp is owned by anonymous user ftp."
        << "107:0:755";
    QTest::newRow("group-writable anonymous root fixed")
        << "groupwrite" << QStringList{"yes"} << true << QStringList{group} << ""
        << "0:2001:755";
    QTest::newRow("group-writable anonymous root kept")
        << "groupwrite" << QStringList{"no"} << false << QStringList{group}
        << prefix
            + "user home directory /srv/ftp is writable by group writers, in which anonymous user writers "
              "participates in."
        << "0:2001:775";
}

void TestFtpServerConfig::rootDirectoryRepairs()
{
    QFETCH(QString, setup);
    QFETCH(QStringList, answers);
    QFETCH(bool, granted);
    QFETCH(QStringList, texts);
    QFETCH(QString, message);
    QFETCH(QString, after);

    Engine engine;
    FileMap files{{"/etc/vsftpd.conf", "local_enable=YES\nchroot_local_user=YES\nanon_root=/srv/ftp\n"},
                  {"/etc/passwd", FixtureRoot::defaults()["/etc/passwd"] + "none:x:1010:1000::/home/none:/bin/sh\n"}};
    QVERIFY(engine.load(files));
    const QString srv = engine.root.filePath("/srv/ftp");
    if (setup == QLatin1String("owned"))
        QCOMPARE(::chown(QFile::encodeName(srv).constData(), 107, 0), 0);
    if (setup == QLatin1String("groupwrite")) {
        QCOMPARE(::chown(QFile::encodeName(srv).constData(), 0, 2001), 0);
        QCOMPARE(::chmod(QFile::encodeName(srv).constData(), 0775), 0);
    }
    for (const QString &answer : answers) {
        if (answer.startsWith(QLatin1String("owner:")))
            engine.interaction.owners << (answer.mid(6).isEmpty() ? std::nullopt
                                                                  : std::optional<QString>(answer.mid(6)));
        else if (answer == QLatin1String("accept"))
            engine.interaction.answers << Interaction::Button::Accept;
        else if (answer == QLatin1String("cancel"))
            engine.interaction.answers << Interaction::Button::Cancel;
        else
            engine.interaction.answers << (answer == QLatin1String("yes") ? Interaction::Button::Yes
                                                                          : Interaction::Button::No);
    }
    const QByteArray user = setup == QLatin1String("missing") ? "none" : "Anonymous users";
    AccessFailure failure;
    CaptureStream out(std::cout);
    QCOMPARE(engine.config->checkAccess(user, true, &failure), granted);
    QCOMPARE(failure.message, message);
    QCOMPARE(engine.interaction.texts(), texts);
    QVERIFY(engine.interaction.allAnswersUsed());
    QCOMPARE(engine.interaction.unexpected, 0);
    if (!after.isEmpty()) {
        struct stat info
        {
        };
        const QString path = engine.root.filePath(setup == QLatin1String("missing") ? "/home/none" : "/srv/ftp");
        QCOMPARE(::stat(QFile::encodeName(path).constData(), &info), 0);
        QCOMPARE(QStringLiteral("%1:%2:%3").arg(info.st_uid).arg(info.st_gid).arg(info.st_mode & 0777, 0, 8), after);
    }
    if (setup == QLatin1String("owned") && granted) {
        const auto &record = engine.interaction.records.first();
        QCOMPARE(record.kind, QStringLiteral("owner"));
        QVERIFY(record.choices.contains("bob"));
        QVERIFY(record.choices.contains("root"));
    }
}

void TestFtpServerConfig::chrootAndRoots_data()
{
    QTest::addColumn<QByteArray>("conf");
    QTest::addColumn<QByteArray>("bobConfig"); // per-user file of bob, or null
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<bool>("chrooted");
    QTest::addColumn<QByteArray>("root");
    QTest::addColumn<QByteArray>("account");

    const QByteArray base = "local_enable=YES\nchroot_list_enable=YES\n";
    QTest::newRow("local user, no chroot") << QByteArray("local_enable=YES\n") << QByteArray() << QByteArray("bob")
                                           << false << QByteArray("/") << QByteArray("bob");
    QTest::newRow("chroot_local_user") << QByteArray("chroot_local_user=YES\n") << QByteArray() << QByteArray("bob")
                                       << true << QByteArray("/home/bob") << QByteArray("bob");
    QTest::newRow("listed in the chroot list")
        << base << QByteArray() << QByteArray("bob") << true << QByteArray("/home/bob") << QByteArray("bob");
    QTest::newRow("not listed") << base << QByteArray() << QByteArray("alice") << false << QByteArray("/")
                                << QByteArray("alice");
    QTest::newRow("list inverts chroot_local_user")
        << base + "chroot_local_user=YES\n"
        << QByteArray() << QByteArray("bob") << false << QByteArray("/") << QByteArray("bob");
    QTest::newRow("per-user local_root wins")
        << QByteArray("chroot_local_user=YES\nlocal_root=/srv/all\n") << QByteArray("local_root=/srv/bob\n")
        << QByteArray("bob") << true << QByteArray("/srv/bob") << QByteArray("bob");
    QTest::newRow("global local_root") << QByteArray("chroot_local_user=YES\nlocal_root=/srv/all\n") << QByteArray()
                                       << QByteArray("bob") << true << QByteArray("/srv/all") << QByteArray("bob");
    QTest::newRow("anonymous: anon_root")
        << QByteArray("anon_root=/srv/anon\nftp_username=bob\n") << QByteArray() << QByteArray("Anonymous users")
        << true << QByteArray("/srv/anon") << QByteArray("bob");
    QTest::newRow("anonymous: home of the guest account")
        << QByteArray("guest_username=alice\n") << QByteArray() << QByteArray("anonymous") << true
        << QByteArray("/home/alice") << QByteArray("ftp");
    QTest::newRow("virtual user: guest home")
        << QByteArray("guest_enable=YES\nguest_username=alice\n") << QByteArray() << QByteArray("vic") << true
        << QByteArray("/home/alice") << QByteArray("alice");
    QTest::newRow("guest mode chroots local users too")
        << QByteArray("guest_enable=yes\n") << QByteArray() << QByteArray("bob") << true << QByteArray("/home/bob")
        << QByteArray("bob");
}

void TestFtpServerConfig::chrootAndRoots()
{
    QFETCH(QByteArray, conf);
    QFETCH(QByteArray, bobConfig);
    QFETCH(QByteArray, user);
    QFETCH(bool, chrooted);
    QFETCH(QByteArray, root);
    QFETCH(QByteArray, account);

    Engine engine;
    FileMap files{
        {"/etc/vsftpd.conf", conf}, {"/etc/vsftpd.chroot_list", "bob\n"}, {"/etc/pam.d/vsftpd", PamWithUserdb}};
    if (!bobConfig.isNull())
        files.insert("/etc/vsftpd.d/users.d/bob", bobConfig);
    QVERIFY(engine.load(files, {{"vic", "secret"}}));
    QCOMPARE(engine.config->isChrooted(user), chrooted);
    QCOMPARE(engine.config->effectiveRoot(user), root);
    QCOMPARE(engine.config->ftpAccountName(user), account);
}

void TestFtpServerConfig::blockUser_data()
{
    QTest::addColumn<QByteArray>("conf");
    QTest::addColumn<QByteArray>("list");
    QTest::addColumn<QStringList>("answers");
    QTest::addColumn<QByteArray>("mainAfter");
    QTest::addColumn<QString>("listAfter");
    QTest::addColumn<QStringList>("texts");

    const QString warning = "|Warning! Changing contents logic of file /etc/vsftpd.d/allowed_user_list.conf. Was: "
                            "allowed. To be done: blocked.|(Do you want to continue?";
    QTest::newRow("black list") << QByteArray("local_enable=YES\n") << QByteArray("alice\n") << QStringList()
                                << QByteArray("local_enable=YES\nlisten=yes\nuserlist_enable=yes\nuserlist_file=/etc/"
                                              "vsftpd.d/allowed_user_list.conf\n")
                                << "alice,bob" << QStringList();
    QTest::newRow("disabled list enabled")
        << QByteArray("userlist_enable=NO\nuserlist_file=/etc/ul\n") << QByteArray() << QStringList()
        << QByteArray("userlist_enable=yes\nuserlist_file=/etc/ul\nlisten=yes\n") << "bob" << QStringList();
    QTest::newRow("white list inverted")
        << QByteArray("userlist_deny=NO\n") << QByteArray("alice\n") << QStringList{"yes"}
        << QByteArray("userlist_deny=yes\nlisten=yes\nuserlist_enable=yes\nuserlist_file=/etc/vsftpd.d/"
                      "allowed_user_list.conf\n")
        << "bob" << QStringList{warning};
    QTest::newRow("white list kept") << QByteArray("userlist_deny=NO\n") << QByteArray("alice\n") << QStringList{"no"}
                                     << QByteArray("userlist_deny=NO\nlisten=yes\nuserlist_enable=yes\n") << "alice"
                                     << QStringList{warning};
}

void TestFtpServerConfig::blockUser()
{
    QFETCH(QByteArray, conf);
    QFETCH(QByteArray, list);
    QFETCH(QStringList, answers);
    QFETCH(QByteArray, mainAfter);
    QFETCH(QString, listAfter);
    QFETCH(QStringList, texts);

    Engine engine;
    FileMap files{{"/etc/vsftpd.conf", conf}, {"/etc/vsftpd.d/allowed_user_list.conf", list}, {"/etc/ul", list}};
    QVERIFY(engine.load(files));
    for (const QString &answer : answers)
        engine.interaction.answers << (answer == QLatin1String("yes") ? Interaction::Button::Yes
                                                                      : Interaction::Button::No);
    engine.config->blockUserByUserlist("bob");
    QCOMPARE(engine.main(), mainAfter);
    QCOMPARE(engine.config->userlist().join(QLatin1Char(',')), listAfter);
    QCOMPARE(engine.interaction.texts(), texts);
    QCOMPARE(engine.config->userlistModified(), listAfter.contains(QLatin1String("bob")));
}

void TestFtpServerConfig::pamUserdb_data()
{
    QTest::addColumn<QByteArray>("pam");
    QTest::addColumn<bool>("interactive");
    QTest::addColumn<QStringList>("answers");
    QTest::addColumn<bool>("result");
    QTest::addColumn<int>("kind");
    QTest::addColumn<QByteArray>("pamAfter");
    QTest::addColumn<QStringList>("texts");
    QTest::addColumn<bool>("skipAfter");

    const QByteArray module = FtpServerConfig::pamUserdbModule();
    const QByteArray good = PamWithUserdb;
    const QByteArray missing = "auth sufficient pam_userdb.so db=/srv/gone/users\n"
                               "account sufficient pam_userdb.so db=/srv/gone/users\n";
    const QByteArray unixFirst = "auth required pam_unix.so\n" + good;
    const QString fixLabel = "|Enter new virtual users database file path:";
    const QString missingLabel
        = "|Virtual users database file defined in vsftpd PAM configuration is not found.\nIt means, that FTP config "
          "was unable to create the following db file: /srv/gone/users.db\nPlease, define new db file path.";
    const QString restart = "Information|Please, restart FTP configurator.\nChanges you have performed will be used "
                            "only after restart";

    QTest::newRow("usable lines") << good << true << QStringList() << true << 0 << good << QStringList() << false;
    QTest::newRow("short module name passes")
        << QByteArray("auth sufficient pam_userdb db=/etc/vsftpd/virtual\n") << false << QStringList() << true << 0
        << QByteArray("auth sufficient pam_userdb db=/etc/vsftpd/virtual\n") << QStringList() << false;
    QTest::newRow("missing database, not interactive")
        << missing << false << QStringList() << true << 7 << missing << QStringList() << false;
    QTest::newRow("missing database, new path")
        << missing << true << QStringList{"path:/srv/new/users.db", "path:/srv/new2/users"} << true << 0
        << QByteArray("auth sufficient pam_userdb.so db=/srv/new/users\naccount sufficient pam_userdb.so "
                      "db=/srv/new2/users\n")
        << QStringList{missingLabel, restart, missingLabel, restart} << false;
    QTest::newRow("missing database, cancelled") << missing << true << QStringList{"path:", "path:"} << true << 0
                                                 << missing << QStringList{missingLabel, missingLabel} << false;
    QTest::newRow("other module first: skip") << unixFirst << true << QStringList{"pam:skip"} << false << 0 << unixFirst
                                              << QStringList{"PAM configuration problem|"} << false;
    QTest::newRow("other module first: valid") << unixFirst << true << QStringList{"pam:valid"} << true << 0
                                               << unixFirst << QStringList{"PAM configuration problem|"} << true;
    QTest::newRow("other module first: fix")
        << unixFirst << true << QStringList{"pam:fix", "path:/srv/fixed/users.db"} << true << 0
        << "auth sufficient " + module + " db=/srv/fixed/users\naccount sufficient " + module + " db=/srv/fixed/users\n"
            + unixFirst
        << QStringList{"PAM configuration problem|", fixLabel} << false;
    QTest::newRow("fix cancelled") << unixFirst << true << QStringList{"pam:fix", "path:"} << false << 0 << unixFirst
                                   << QStringList{"PAM configuration problem|", fixLabel} << false;
    QTest::newRow("requisite control is unusable")
        << QByteArray("auth requisite pam_userdb.so db=/etc/vsftpd/virtual\n") << true << QStringList{"pam:skip"}
        << false << 0 << QByteArray("auth requisite pam_userdb.so db=/etc/vsftpd/virtual\n")
        << QStringList{"PAM configuration problem|"} << false;
}

void TestFtpServerConfig::pamUserdb()
{
    QFETCH(QByteArray, pam);
    QFETCH(bool, interactive);
    QFETCH(QStringList, answers);
    QFETCH(bool, result);
    QFETCH(int, kind);
    QFETCH(QByteArray, pamAfter);
    QFETCH(QStringList, texts);
    QFETCH(bool, skipAfter);

    Engine engine;
    // The users come from the database the fixture writes; the PAM file
    // under test is put in place after loading.
    QVERIFY(engine.load({{"/etc/pam.d/vsftpd", PamWithUserdb}}, {{"vic", "secret"}}));
    engine.config->pamConfig().parseText(pam.toStdString());
    for (const QString &answer : answers) {
        if (answer.startsWith(QLatin1String("path:"))) {
            const QString path = answer.mid(5);
            engine.interaction.paths << (path.isEmpty() ? std::nullopt : std::optional<QString>(path));
        } else if (answer == QLatin1String("pam:skip")) {
            engine.interaction.pamChoices << Interaction::PamChoice::Skip;
        } else if (answer == QLatin1String("pam:valid")) {
            engine.interaction.pamChoices << Interaction::PamChoice::Valid;
        } else {
            engine.interaction.pamChoices << Interaction::PamChoice::Fix;
        }
    }
    AccessFailure failure;
    QCOMPARE(engine.config->checkPamUserdb("vic", interactive, &failure), result);
    QCOMPARE(static_cast<int>(failure.kind), kind);
    if (kind == 7) {
        QCOMPARE(failure.message,
                 QStringLiteral("***Result: FALSE. Check: in vsftpd PAM file module pam_userdb.so "
                                "contains invalid path to virtual user db file."));
    }
    QCOMPARE(QByteArray::fromStdString(engine.config->pamConfig().text()), pamAfter);
    QCOMPARE(engine.interaction.texts(), texts);
    QVERIFY(engine.interaction.allAnswersUsed());
    QCOMPARE(QSettings().value("skip_pam_check", false).toBool(), skipAfter);
    // Local users are never looked at.
    QVERIFY(engine.config->checkPamUserdb("bob", interactive, nullptr));
    // Valid never asks again; Skip asks no more in this run.
    if (skipAfter || answers.contains(QStringLiteral("pam:skip"))) {
        const int asked = engine.interaction.records.size();
        QCOMPARE(engine.config->checkPamUserdb("vic", true, nullptr), skipAfter);
        QCOMPARE(engine.interaction.records.size(), asked);
    }
}

void TestFtpServerConfig::failureDialog()
{
    ScriptedInteraction interaction;
    showFailureDialog(interaction, {FailureKind::UserlistFile, QStringLiteral("why")});
    QCOMPARE(interaction.texts(), QStringList{"|why|Failure classification: FTP userlist file"});
    QCOMPARE(interaction.records.first().message.icon, Interaction::Icon::Critical);
}

FTPCONFIG_TEST_GUILESS_MAIN(TestFtpServerConfig)
#include "TestFtpServerConfig.moc"

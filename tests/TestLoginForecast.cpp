#include "TestMain.h"
#include "CaptureStream.h"
#include "FixtureRoot.h"
#include "ScriptedInteraction.h"
#include "policy/FtpServerConfig.h"
#include "forecast/LoginForecast.h"

#include <QStandardPaths>
#include <QtTest>

#include <iostream>
#include <memory>
#include <sys/stat.h>
#include <unistd.h>

using FileMap = QMap<QString, QByteArray>;
Q_DECLARE_METATYPE(FileMap)

namespace {

const QDate Today(2026, 11, 22);

QByteArray day(int offset)
{
    return QByteArray::number(QDate(1970, 1, 1).daysTo(Today) + offset);
}

// A small machine the way the server sees it: accounts with shadow aging,
// Debian's common PAM stacks, the directories vsftpd needs.
FileMap machine()
{
    const QByteArray today = day(0);
    return {
        {"/etc/passwd",
         "root:x:0:0:root:/root:/bin/bash\n"
         "nobody:x:65534:65534::/nonexistent:/usr/sbin/nologin\n"
         "ftp:x:107:113:ftp daemon:/srv/ftp:/usr/sbin/nologin\n"
         "bob:x:1000:1000:Bob:/home/bob:/bin/bash\n"
         "alice:x:1001:1001:Alice:/home/alice:/bin/bash\n"
         "locked:x:1002:1002::/home/locked:/bin/bash\n"
         "nologin:x:1003:1003::/home/nologin:/usr/sbin/nologin\n"
         "expired:x:1004:1004::/home/expired:/bin/bash\n"
         "mustchange:x:1005:1005::/home/mustchange:/bin/bash\n"
         "empty:x:1006:1006::/home/empty:/bin/bash\n"
         "guest:x:1100:1100::/srv/guest:/usr/sbin/nologin\n"},
        {"/etc/shadow",
         "root:*:" + today
             + ":0:99999:7:::\n"
               "nobody:*:"
             + today
             + ":0:99999:7:::\n"
               "ftp:*:"
             + today
             + ":0:99999:7:::\n"
               "bob:$6$salt$hash:"
             + today
             + ":0:99999:7:::\n"
               "alice:$6$salt$hash:"
             + today
             + ":0:99999:7:::\n"
               "locked:!$6$salt$hash:"
             + today
             + ":0:99999:7:::\n"
               "nologin:$6$salt$hash:"
             + today
             + ":0:99999:7:::\n"
               "expired:$6$salt$hash:"
             + today + ":0:99999:7::" + day(-1)
             + ":\n"
               "mustchange:$6$salt$hash:0:0:99999:7:::\n"
               "empty::"
             + today
             + ":0:99999:7:::\n"
               "guest:*:"
             + today + ":0:99999:7:::\n"},
        {"/etc/group",
         "root:x:0:\nnogroup:x:65534:\nftp:x:113:\nbob:x:1000:\nalice:x:1001:\nlocked:x:1002:\n"
         "nologin:x:1003:\nexpired:x:1004:\nmustchange:x:1005:\nempty:x:1006:\nguest:x:1100:\n"
         "staff:x:50:alice\n"},
        {"/etc/shells", "/bin/sh\n/bin/bash\n"},
        {"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\n"},
        {"/etc/pam.d/common-auth",
         "auth\t[success=1 default=ignore]\tpam_unix.so nullok\n"
         "auth\trequisite\t\t\tpam_deny.so\n"
         "auth\trequired\t\t\tpam_permit.so\n"},
        {"/etc/pam.d/common-account",
         "account\t[success=1 new_authtok_reqd=done default=ignore]\tpam_unix.so\n"
         "account\trequisite\t\t\tpam_deny.so\n"
         "account\trequired\t\t\tpam_permit.so\n"},
        {"/etc/pam.d/vsftpd",
         "auth\trequired\tpam_listfile.so item=user sense=deny file=/etc/ftpusers onerr=succeed\n"
         "@include common-account\n"
         "@include common-auth\n"
         "auth\trequired\tpam_shells.so\n"},
        {"/etc/ftpusers", "root\n"},
    };
}

struct Forecaster
{
    FixtureRoot root;
    ScriptedInteraction interaction;
    std::unique_ptr<FtpServerConfig> config;
    std::unique_ptr<LoginForecast> forecast;

    bool load(const FileMap &files, const QMap<QByteArray, QByteArray> &virtualUsers = {})
    {
        FileMap all = machine();
        for (auto it = files.begin(); it != files.end(); ++it)
            all[it.key()] = it.value();
        if (!root.write(all))
            return false;
        for (const char *dir : {"/var/run/vsftpd/empty", "/srv/guest", "/home/nologin", "/home/expired",
                                "/home/mustchange", "/home/empty"}) {
            if (!root.makeDirectory(QString::fromLatin1(dir)))
                return false;
        }
        // Homes belong to their users and are not writable by others; the
        // guest home is read-only, as a chroot must be.
        const QList<QPair<const char *, uid_t>> owners{
            {"/home/bob", 1000}, {"/home/alice", 1001}, {"/srv/guest", 1100}};
        for (const auto &owner : owners) {
            const QByteArray path = QFile::encodeName(root.filePath(QString::fromLatin1(owner.first)));
            const mode_t mode = owner.second == 1100 ? 0555 : 0755;
            if (::chown(path.constData(), owner.second, owner.second) != 0 || ::chmod(path.constData(), mode) != 0)
                return false;
        }
        if (!virtualUsers.isEmpty() && !root.writeVirtualUsers("/etc/vsftpd/virtual.db", virtualUsers))
            return false;
        config = std::make_unique<FtpServerConfig>(interaction, RootDirectory(root.path()),
                                                   FtpServerConfig::Mode::ReadOnly);
        CaptureStream out(std::cout);
        CaptureStream err(std::cerr);
        try {
            config->load();
        } catch (const ProcessExit &) {
            return false;
        }
        forecast = std::make_unique<LoginForecast>(*config, Today);
        return true;
    }
};

QString first(const UserForecast &forecast)
{
    if (forecast.findings.isEmpty())
        return QString();
    const ForecastFinding &f = forecast.findings.first();
    return QStringLiteral("%1:%2: %3").arg(f.file).arg(f.line).arg(f.message);
}

const QByteArray VirtualPam = "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                              "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                              "@include common-auth\n@include common-account\n";

} // namespace

class TestLoginForecast : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase();
    void configurationSyntax_data();
    void configurationSyntax();
    void serverWide_data();
    void serverWide();
    void logins_data();
    void logins();
    void pamStacks_data();
    void pamStacks();
    void homesAndChroot_data();
    void homesAndChroot();
    void missingMainConfiguration();
};

void TestLoginForecast::initTestCase()
{
    QStandardPaths::setTestModeEnabled(true);
}

void TestLoginForecast::configurationSyntax_data()
{
    QTest::addColumn<QByteArray>("conf");
    QTest::addColumn<bool>("fails");
    QTest::addColumn<QString>("finding"); // the first server finding: "line: text..."

    QTest::newRow("clean") << QByteArray("listen=YES\nlocal_enable=YES\n") << false << "";
    QTest::newRow("blank before =") << QByteArray("listen=YES\nlocal_enable =YES\n") << true
                                    << "2: unknown setting \"local_enable \"";
    QTest::newRow("blank after = of a yes/no")
        << QByteArray("listen=YES\nlocal_enable= YES\n") << true << "2: local_enable=\" YES\" is not a yes/no value";
    QTest::newRow("trailing blank after a yes/no")
        << QByteArray("listen=YES \nlocal_enable=YES\n") << true << "1: listen=\"YES \" is not a yes/no value";
    QTest::newRow("unknown key") << QByteArray("listen=YES\nlocal_enabled=YES\n") << true
                                 << "2: unknown setting \"local_enabled\"";
    QTest::newRow("bad yes/no") << QByteArray("listen=YES\nlocal_enable=si\n") << true
                                << "2: local_enable=\"si\" is not a yes/no value";
    QTest::newRow("indented setting is read") << QByteArray("listen=YES\n  local_enable=YES\n") << false << "";
    QTest::newRow("indented comment") << QByteArray("listen=YES\n  # note\nlocal_enable=YES\n") << true
                                      << "2: the comment is indented";
    QTest::newRow("line without =") << QByteArray("listen\nlocal_enable=YES\n") << true
                                    << "1: \"listen\" has no \"=\": vsftpd stops (missing value in config file)";
    QTest::newRow("carriage return") << QByteArray("listen=YES\r\nlocal_enable=YES\n") << true
                                     << "1: listen=\"YES\r\" is not a yes/no value";
    QTest::newRow("yes/no words in any case")
        << QByteArray("listen=true\nlocal_enable=1\nanonymous_enable=No\nwrite_enable=FALSE\nhide_ids=0\n") << false
        << "";
    QTest::newRow("a blank in a string value is kept")
        << QByteArray("listen=YES\nlocal_enable=YES\nftpd_banner= hi\n") << false << "";
    QTest::newRow("repeated key: last wins")
        << QByteArray("listen=YES\nlocal_enable=NO\nlocal_enable=YES\n") << false
        << "3: local_enable is set again here (first on line 2): vsftpd uses this last value, \"YES\"; this "
           "program's verdict reads the first, \"NO\"";
}

void TestLoginForecast::configurationSyntax()
{
    QFETCH(QByteArray, conf);
    QFETCH(bool, fails);
    QFETCH(QString, finding);

    Forecaster f;
    QVERIFY(f.load({{"/etc/vsftpd.conf", conf}}));
    QCOMPARE(f.forecast->serverFails(), fails);
    const auto &findings = f.forecast->serverFindings();
    if (finding.isEmpty()) {
        QCOMPARE(findings.size(), 0);
    } else {
        QVERIFY(!findings.isEmpty());
        const QString actual = QStringLiteral("%1: %2").arg(findings.first().line).arg(findings.first().message);
        QVERIFY2(actual.startsWith(finding), qPrintable(actual));
        QCOMPARE(findings.first().file, QStringLiteral("/etc/vsftpd.conf"));
    }
    // A server that does not start refuses everybody with the same reason.
    const UserForecast bob = f.forecast->forecast("bob");
    QCOMPARE(bob.status, fails ? ForecastStatus::Denied : ForecastStatus::Allowed);
    if (fails)
        QCOMPARE(bob.findings.first().message, findings.first().message);
}

void TestLoginForecast::serverWide_data()
{
    QTest::addColumn<FileMap>("files");
    QTest::addColumn<QString>("finding");

    QTest::newRow("both access kinds off") << FileMap{{"/etc/vsftpd.conf", "listen=YES\nanonymous_enable=NO\n"}}
                                           << "local_enable and anonymous_enable are both off";
    QTest::newRow("anonymous account missing")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nftp_username=anon\n"}}
        << "anonymous logins are on, but the account anon (ftp_username) does not exist";
    QTest::newRow("guest account missing")
        << FileMap{{"/etc/vsftpd.conf",
                    "listen=YES\nlocal_enable=YES\nanonymous_enable=NO\nguest_enable=YES\n"
                    "guest_username=visitor\n"}}
        << "guest_enable is on, but the account visitor (guest_username) does not exist";
    QTest::newRow("enabled userlist without its file")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nuserlist_enable=YES\n"}}
        << "userlist_enable is on, but /etc/vsftpd.user_list cannot be read";
    QTest::newRow("listen twice") << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlisten_ipv6=YES\nlocal_enable=YES\n"}}
                                  << "listen and listen_ipv6 are both YES";
    QTest::newRow("no listener") << FileMap{{"/etc/vsftpd.conf", "local_enable=YES\n"}}
                                 << "neither listen nor listen_ipv6 is YES";
    QTest::newRow("secure_chroot_dir missing")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nsecure_chroot_dir=/var/empty/none\n"}}
        << "the directory /var/empty/none (secure_chroot_dir) does not exist";
}

void TestLoginForecast::serverWide()
{
    QFETCH(FileMap, files);
    QFETCH(QString, finding);

    Forecaster f;
    QVERIFY(f.load(files));
    QVERIFY(f.forecast->serverFails());
    QVERIFY2(f.forecast->serverFindings().first().message.startsWith(finding),
             qPrintable(f.forecast->serverFindings().first().message));
    for (const QByteArray &user : {QByteArray("bob"), QByteArray("Anonymous users")}) {
        const UserForecast forecast = f.forecast->forecast(user);
        QCOMPARE(forecast.status, ForecastStatus::Denied);
        QVERIFY(forecast.findings.first().message.startsWith(finding));
    }
}

void TestLoginForecast::logins_data()
{
    QTest::addColumn<FileMap>("files");
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<int>("status");
    QTest::addColumn<QString>("finding"); // start of the first finding, "file:line: text"

    const int allowed = static_cast<int>(ForecastStatus::Allowed);
    const int denied = static_cast<int>(ForecastStatus::Denied);
    const QByteArray anon = "Anonymous users";

    QTest::newRow("local user") << FileMap{} << QByteArray("bob") << allowed << "";
    QTest::newRow("anonymous by default") << FileMap{} << anon << allowed << "";
    QTest::newRow("local_enable absent means off") << FileMap{{"/etc/vsftpd.conf", "listen=YES\n"}} << QByteArray("bob")
                                                   << denied << "/etc/vsftpd.conf:0: local_enable is off";
    QTest::newRow("anonymous_enable=NO") << FileMap{{"/etc/vsftpd.conf",
                                                     "listen=YES\nlocal_enable=YES\nanonymous_enable=NO\n"}}
                                         << anon << denied << "/etc/vsftpd.conf:3: anonymous_enable is off";
    QTest::newRow("userlist off by default")
        << FileMap{{"/etc/vsftpd.user_list", "bob\n"}} << QByteArray("bob") << allowed << "";
    QTest::newRow("userlist denies by default")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nuserlist_enable=YES\n"},
                   {"/etc/vsftpd.user_list", "bob\n"}}
        << QByteArray("bob") << denied << "/etc/vsftpd.user_list:0: bob is listed in the userlist";
    QTest::newRow("white userlist")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nuserlist_enable=YES\nuserlist_deny=NO\n"},
                   {"/etc/vsftpd.user_list", "alice\n"}}
        << QByteArray("bob") << denied << "/etc/vsftpd.user_list:0: bob is not listed in the userlist";
    QTest::newRow("white userlist must name anonymous too")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nuserlist_enable=YES\nuserlist_deny=NO\n"},
                   {"/etc/vsftpd.user_list", "bob\n"}}
        << anon << denied << "/etc/vsftpd.user_list:0: anonymous is not listed in the userlist";
    QTest::newRow("white userlist naming anonymous")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nuserlist_enable=YES\nuserlist_deny=NO\n"},
                   {"/etc/vsftpd.user_list", "anonymous\n"}}
        << anon << allowed << "";
    QTest::newRow("black userlist naming anonymous")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nuserlist_enable=YES\n"},
                   {"/etc/vsftpd.user_list", "anonymous\n"}}
        << anon << denied << "/etc/vsftpd.user_list:0: anonymous is listed in the userlist";
    QTest::newRow("userlist from its key")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nuserlist_enable=YES\nuserlist_file=/etc/ul\n"},
                   {"/etc/ul", "alice\n"}}
        << QByteArray("alice") << denied << "/etc/ul:0: alice is listed";
    QTest::newRow("anonymous never asks PAM")
        << FileMap{{"/etc/pam.d/vsftpd", "auth required pam_deny.so\n"}} << anon << allowed << "";
    QTest::newRow("guest mode maps local users")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nguest_enable=YES\nguest_username=guest\n"}}
        << QByteArray("bob") << allowed << "";
    QTest::newRow("virtual user") << FileMap{{"/etc/vsftpd.conf",
                                              "listen=YES\nlocal_enable=YES\nguest_enable=YES\n"
                                              "guest_username=guest\n"},
                                             {"/etc/pam.d/vsftpd", VirtualPam}}
                                  << QByteArray("vic") << allowed << "";
    QTest::newRow("virtual user without guest mode")
        << FileMap{{"/etc/pam.d/vsftpd", VirtualPam}} << QByteArray("vic") << denied
        << "/etc/vsftpd.conf:0: PAM admits vic, but there is no system account vic";
    QTest::newRow("virtual user without an account line")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nguest_enable=YES\nguest_username=guest\n"},
                   {"/etc/pam.d/vsftpd",
                    "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                    "@include common-auth\n@include common-account\n"}}
        << QByteArray("vic") << denied << "/etc/pam.d/common-account:2: PAM account refuses";
    QTest::newRow("virtual user without local_enable")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nguest_enable=YES\nguest_username=guest\n"},
                   {"/etc/pam.d/vsftpd", VirtualPam}}
        << QByteArray("vic") << denied << "/etc/vsftpd.conf:0: local_enable is off";
}

void TestLoginForecast::logins()
{
    QFETCH(FileMap, files);
    QFETCH(QByteArray, user);
    QFETCH(int, status);
    QFETCH(QString, finding);

    Forecaster f;
    QVERIFY(f.load(files, {{"vic", "secret"}}));
    QCOMPARE(f.forecast->serverFails(), false);
    const UserForecast forecast = f.forecast->forecast(user);
    QCOMPARE(first(forecast).left(finding.size()), finding);
    QCOMPARE(static_cast<int>(forecast.status), status);
}

void TestLoginForecast::pamStacks_data()
{
    QTest::addColumn<QByteArray>("pam");
    QTest::addColumn<FileMap>("files");
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<int>("status");
    QTest::addColumn<QString>("finding");

    const int allowed = static_cast<int>(ForecastStatus::Allowed);
    const int denied = static_cast<int>(ForecastStatus::Denied);
    const int unknown = static_cast<int>(ForecastStatus::Unknown);
    const QByteArray debian = machine()["/etc/pam.d/vsftpd"];

    QTest::newRow("Debian's file, a plain user") << debian << FileMap{} << QByteArray("bob") << allowed << "";
    QTest::newRow("Debian's file, listed in ftpusers")
        << debian << FileMap{} << QByteArray("root") << denied
        << "/etc/pam.d/vsftpd:1: PAM auth refuses: root is listed in /etc/ftpusers (sense=deny)";
    QTest::newRow("locked hash") << debian << FileMap{} << QByteArray("locked") << denied
                                 << "/etc/pam.d/common-auth:2: PAM auth refuses: pam_deny refuses everybody, reached "
                                    "because pam_unix.so (/etc/pam.d/common-auth:1) answered: the password is locked";
    QTest::newRow("shell not in /etc/shells") << debian << FileMap{} << QByteArray("nologin") << denied
                                              << "/etc/pam.d/vsftpd:4: PAM auth refuses: the shell /usr/sbin/nologin";
    QTest::newRow("expired account") << debian << FileMap{} << QByteArray("expired") << denied
                                     << "/etc/pam.d/common-account:2: PAM account refuses";
    QTest::newRow("forced password change") << debian << FileMap{} << QByteArray("mustchange") << denied
                                            << "/etc/pam.d/common-account:1: PAM account refuses: the password must be "
                                               "changed first";
    QTest::newRow("empty password with nullok") << debian << FileMap{} << QByteArray("empty") << allowed << "";
    QTest::newRow("empty password without nullok")
        << QByteArray("auth required pam_unix.so\naccount required pam_unix.so\n") << FileMap{} << QByteArray("empty")
        << denied << "/etc/pam.d/vsftpd:1: PAM auth refuses: the password in /etc/shadow is empty";
    QTest::newRow("listfile, missing list, onerr=succeed")
        << QByteArray("auth required pam_listfile.so item=user sense=allow file=/etc/none onerr=succeed\n"
                      "auth required pam_permit.so\naccount required pam_permit.so\n")
        << FileMap{} << QByteArray("bob") << allowed << "";
    QTest::newRow("listfile, missing list, onerr=fail")
        << QByteArray("auth required pam_listfile.so item=user sense=allow file=/etc/none onerr=fail\n"
                      "account required pam_permit.so\n")
        << FileMap{} << QByteArray("bob") << denied << "/etc/pam.d/vsftpd:1: PAM auth refuses: the list /etc/none";
    QTest::newRow("listfile allow by group")
        << QByteArray("auth required pam_listfile.so item=group sense=allow file=/etc/ftpgroups\n"
                      "account required pam_permit.so\n")
        << FileMap{{"/etc/ftpgroups", "staff\n"}} << QByteArray("alice") << allowed << "";
    QTest::newRow("listfile allow by group, not a member")
        << QByteArray("auth required pam_listfile.so item=group sense=allow file=/etc/ftpgroups\n"
                      "account required pam_permit.so\n")
        << FileMap{{"/etc/ftpgroups", "staff\n"}} << QByteArray("bob") << denied
        << "/etc/pam.d/vsftpd:1: PAM auth refuses: bob is not listed in /etc/ftpgroups";
    QTest::newRow("userdb appends .db to a name with .db")
        << QByteArray("auth required pam_userdb.so db=/etc/vsftpd/virtual.db\naccount required pam_permit.so\n")
        << FileMap{{"/etc/vsftpd.conf", "listen=YES\nlocal_enable=YES\nguest_enable=YES\nguest_username=guest\n"}}
        << QByteArray("vic") << denied
        << "/etc/pam.d/vsftpd:1: PAM auth refuses: pam_userdb cannot open "
           "/etc/vsftpd/virtual.db.db";
    QTest::newRow("nologin file") << QByteArray("auth required pam_nologin.so\nauth required pam_permit.so\n"
                                                "account required pam_permit.so\n")
                                  << FileMap{{"/etc/nologin", "maintenance\n"}} << QByteArray("bob") << denied
                                  << "/etc/pam.d/vsftpd:1: PAM auth refuses: /etc/nologin exists";
    QTest::newRow("nologin file named by file=")
        << QByteArray("auth requisite pam_nologin.so file=/srv/closed\nauth required pam_permit.so\n"
                      "account required pam_permit.so\n")
        << FileMap{{"/srv/closed", "x"}} << QByteArray("bob") << denied
        << "/etc/pam.d/vsftpd:1: PAM auth refuses: /srv/closed exists";
    QTest::newRow("no nologin file") << QByteArray("auth required pam_nologin.so\nauth required pam_permit.so\n"
                                                   "account required pam_permit.so\n")
                                     << FileMap{} << QByteArray("bob") << allowed << "";
    QTest::newRow("unknown module decides")
        << QByteArray("auth required pam_radius_auth.so\naccount required pam_permit.so\n") << FileMap{}
        << QByteArray("bob") << unknown
        << "/etc/pam.d/vsftpd:1: the outcome depends on pam_radius_auth.so, which this forecast does not model";
    QTest::newRow("unknown module after a decision")
        << QByteArray("auth requisite pam_deny.so\nauth required pam_radius_auth.so\naccount required pam_permit.so\n")
        << FileMap{} << QByteArray("bob") << denied << "/etc/pam.d/vsftpd:1: PAM auth refuses: pam_deny";
    QTest::newRow("optional unknown module changes nothing")
        << QByteArray("auth required pam_permit.so\nauth optional pam_cap.so\naccount required pam_permit.so\n")
        << FileMap{} << QByteArray("bob") << allowed << "";
    QTest::newRow("sufficient stops the stack")
        << QByteArray("auth sufficient pam_permit.so\nauth required pam_deny.so\naccount required pam_permit.so\n")
        << FileMap{} << QByteArray("bob") << allowed << "";
    QTest::newRow("required failure is not undone by sufficient")
        << QByteArray("auth required pam_deny.so\nauth sufficient pam_permit.so\naccount required pam_permit.so\n")
        << FileMap{} << QByteArray("bob") << denied << "/etc/pam.d/vsftpd:1: PAM auth refuses";
    QTest::newRow("bracket jump") << QByteArray("auth [success=2 default=ignore] pam_permit.so\nauth requisite "
                                                "pam_deny.so\nauth requisite pam_deny.so\nauth required pam_permit.so\n"
                                                "account required pam_permit.so\n")
                                  << FileMap{} << QByteArray("bob") << allowed << "";
    QTest::newRow("include by control") << QByteArray("auth include common-auth\naccount include common-account\n")
                                        << FileMap{} << QByteArray("locked") << denied << "/etc/pam.d/common-auth:2";
    QTest::newRow("no auth line at all") << QByteArray("account required pam_permit.so\n") << FileMap{}
                                         << QByteArray("bob") << denied
                                         << "/etc/pam.d/vsftpd:0: no auth line of the PAM service admits the user";
}

void TestLoginForecast::pamStacks()
{
    QFETCH(QByteArray, pam);
    QFETCH(FileMap, files);
    QFETCH(QByteArray, user);
    QFETCH(int, status);
    QFETCH(QString, finding);

    files.insert("/etc/pam.d/vsftpd", pam);
    Forecaster f;
    QVERIFY(f.load(files, {{"vic", "secret"}}));
    const UserForecast forecast = f.forecast->forecast(user);
    QCOMPARE(first(forecast).left(finding.size()), finding);
    QCOMPARE(static_cast<int>(forecast.status), status);
}

void TestLoginForecast::homesAndChroot_data()
{
    QTest::addColumn<QByteArray>("conf");
    QTest::addColumn<QString>("setup");
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<int>("status");
    QTest::addColumn<QString>("finding");

    const int allowed = static_cast<int>(ForecastStatus::Allowed);
    const int denied = static_cast<int>(ForecastStatus::Denied);
    const QByteArray base = "listen=YES\nlocal_enable=YES\n";

    QTest::newRow("home missing without chroot") << base << "nohome" << QByteArray("bob") << denied
                                                 << "/etc/passwd:0: the home directory of bob /home/bob does not exist";
    QTest::newRow("home not enterable") << base << "closed" << QByteArray("bob") << denied
                                        << "/etc/passwd:0: the home directory of bob /home/bob cannot be entered";
    QTest::newRow("chrooted into a writable home") << base + "chroot_local_user=YES\n"
                                                   << "" << QByteArray("bob") << denied
                                                   << "/etc/passwd:0: the home directory of bob /home/bob is "
                                                      "writable";
    QTest::newRow("writable chroot allowed") << base + "chroot_local_user=YES\nallow_writeable_chroot=YES\n"
                                             << "" << QByteArray("bob") << allowed << "";
    QTest::newRow("writable chroot allowed by the per-user file")
        << base + "chroot_local_user=YES\nuser_config_dir=/etc/vsftpd/users\n"
        << "peruser" << QByteArray("bob") << allowed << "";
    QTest::newRow("chroot into a read-only home") << base + "chroot_local_user=YES\n"
                                                  << "readonly" << QByteArray("bob") << allowed << "";
    QTest::newRow("chroot list exempts") << base + "chroot_local_user=YES\nchroot_list_enable=YES\n"
                                         << "list" << QByteArray("bob") << allowed << "";
    QTest::newRow("chroot list missing") << base + "chroot_list_enable=YES\n"
                                         << "" << QByteArray("bob") << denied
                                         << "/etc/vsftpd.conf:3: chroot_list_enable is on, but the chroot list";
    QTest::newRow("missing local_root is passed over")
        << base + "local_root=/srv/none\n"
        << "" << QByteArray("bob") << allowed
        << "/etc/vsftpd.conf:3: local_root /srv/none does not exist: the session starts in /home/bob";
    QTest::newRow("missing local_root of a confined user")
        << base + "chroot_local_user=YES\nlocal_root=/srv/none\n"
        << "readonly" << QByteArray("bob") << denied
        << "/etc/vsftpd.conf:4: local_root /srv/none does not exist and the session is confined to it";
    QTest::newRow("anonymous root writable even when allowed")
        << base + "allow_writeable_chroot=YES\n"
        << "ftpowned" << QByteArray("Anonymous users") << denied
        << "/etc/passwd:0: the anonymous root (home of ftp) /srv/ftp is writable";
    QTest::newRow("anonymous root closed to the account")
        << base << "ftpclosed" << QByteArray("Anonymous users") << allowed << "";
    QTest::newRow("local_root with the user token")
        << base + "chroot_local_user=YES\nuser_sub_token=$USER\nlocal_root=/srv/$USER\n"
        << "userroot" << QByteArray("bob") << allowed << "";
    QTest::newRow("anonymous root writable by ftp")
        << base << "ftpowned" << QByteArray("Anonymous users") << denied
        << "/etc/passwd:0: the anonymous root (home of ftp) /srv/ftp is writable";
    QTest::newRow("anonymous root from anon_root") << base + "anon_root=/srv/none\n"
                                                   << "" << QByteArray("Anonymous users") << denied
                                                   << "/etc/vsftpd.conf:3: the anonymous root (anon_root) /srv/none "
                                                      "does not exist";
    QTest::newRow("guests chrooted into the guest home")
        << base + "guest_enable=YES\nguest_username=guest\n"
        << "guestwritable" << QByteArray("bob") << denied
        << "/etc/passwd:0: the home directory of guest /srv/guest is writable";
    QTest::newRow("virtual_use_local_privs: no chroot")
        << base + "guest_enable=YES\nguest_username=guest\nvirtual_use_local_privs=YES\n"
        << "" << QByteArray("bob") << allowed << "";
}

void TestLoginForecast::homesAndChroot()
{
    QFETCH(QByteArray, conf);
    QFETCH(QString, setup);
    QFETCH(QByteArray, user);
    QFETCH(int, status);
    QFETCH(QString, finding);

    FileMap files{{"/etc/vsftpd.conf", conf}, {"/etc/vsftpd.chroot_list", "bob\n"}};
    if (setup == QLatin1String("list"))
        files.insert("/etc/vsftpd.chroot_list", "bob\n");
    else
        files.insert("/etc/vsftpd.chroot_list", QByteArray());
    if (setup == QLatin1String("peruser"))
        files.insert("/etc/vsftpd/users/bob", "allow_writeable_chroot=YES\n");
    Forecaster f;
    QVERIFY(f.load(files));
    const auto path = [&](const char *p) { return QFile::encodeName(f.root.filePath(QString::fromLatin1(p))); };
    if (setup == QLatin1String("nohome"))
        QVERIFY(QDir(f.root.filePath("/home/bob")).removeRecursively());
    if (setup == QLatin1String("closed"))
        QCOMPARE(::chown(path("/home/bob").constData(), 0, 0) + ::chmod(path("/home/bob").constData(), 0700), 0);
    if (setup == QLatin1String("readonly"))
        QCOMPARE(::chmod(path("/home/bob").constData(), 0555), 0);
    if (setup == QLatin1String("userroot")) {
        QVERIFY(f.root.makeDirectory("/srv/bob"));
        QCOMPARE(::chmod(path("/srv/bob").constData(), 0755), 0);
    }
    if (setup == QLatin1String("guestwritable"))
        QCOMPARE(::chmod(path("/srv/guest").constData(), 0755), 0);
    if (setup == QLatin1String("ftpclosed"))
        QCOMPARE(::chmod(path("/srv/ftp").constData(), 0700), 0);
    if (setup == QLatin1String("ftpowned"))
        QCOMPARE(::chown(path("/srv/ftp").constData(), 107, 113), 0);
    const UserForecast forecast = f.forecast->forecast(user);
    QCOMPARE(first(forecast).left(finding.size()), finding);
    QCOMPARE(static_cast<int>(forecast.status), status);
}

void TestLoginForecast::missingMainConfiguration()
{
    Forecaster f;
    QVERIFY(f.load({{"/etc/vsftpd.conf", QByteArray()}}));
    QVERIFY(f.forecast->serverFails());
    QCOMPARE(first(f.forecast->forecast("Anonymous users")),
             QStringLiteral("/etc/vsftpd.conf:0: the file does not exist: vsftpd does not start"));
}

FTPCONFIG_TEST_GUILESS_MAIN(TestLoginForecast)
#include "TestLoginForecast.moc"

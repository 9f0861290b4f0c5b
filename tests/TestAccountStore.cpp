#include "CaptureStream.h"
#include "TemporaryRoot.h"
#include "TestMain.h"
#include "accounts/AccountStore.h"

#include <QtTest>

#include <iostream>

namespace {

QByteArray joined(const QList<QByteArray> &list)
{
    QByteArray out;
    for (const QByteArray &item : list)
        out += (out.isEmpty() ? "" : ",") + item;
    return out;
}

} // namespace

class TestAccountStore : public QObject
{
    Q_OBJECT

private slots:
    void badPassword_data();
    void badPassword();
    void firstRecordWins();
    void userGroups_data();
    void userGroups();
    void missingFiles_data();
    void missingFiles();
    void systemEnumeration();
    void systemUsers_data();
    void systemUsers();
    void names();
};

void TestAccountStore::badPassword_data()
{
    QTest::addColumn<QByteArray>("passwdField");
    QTest::addColumn<QByteArray>("shadowField"); // "-" for no shadow line
    QTest::addColumn<bool>("bad");

    QTest::newRow("x and star") << QByteArray("x") << QByteArray("*") << true;
    QTest::newRow("x and bang") << QByteArray("x") << QByteArray("!") << true;
    QTest::newRow("locked hash") << QByteArray("x") << QByteArray("!$6$salt$hash") << false;
    QTest::newRow("double bang") << QByteArray("x") << QByteArray("!!") << false;
    QTest::newRow("hash") << QByteArray("x") << QByteArray("$6$salt$hash") << false;
    QTest::newRow("empty shadow field") << QByteArray("x") << QByteArray("") << false;
    QTest::newRow("star in passwd") << QByteArray("*") << QByteArray("-") << true;
    QTest::newRow("bang in passwd, good shadow") << QByteArray("!") << QByteArray("$6$h") << true;
    QTest::newRow("star with more") << QByteArray("x") << QByteArray("*LK*") << false;
}

void TestAccountStore::badPassword()
{
    QFETCH(QByteArray, passwdField);
    QFETCH(QByteArray, shadowField);
    QFETCH(bool, bad);

    TemporaryRoot root;
    QVERIFY(
        root.writeFile(QStringLiteral("/etc/passwd"), "bob:" + passwdField + ":1000:1000:Bob:/home/bob:/bin/bash\n"));
    QByteArray shadow = "shadowonly:!:19000:0:99999:7:::\n";
    if (shadowField != "-")
        shadow += "bob:" + shadowField + ":19000:0:99999:7:::\n";
    QVERIFY(root.writeFile(QStringLiteral("/etc/shadow"), shadow, 0600));
    QVERIFY(root.writeFile(QStringLiteral("/etc/group"), "bob:x:1000:\n"));

    const AccountStore store({}, RootDirectory(root.path()));
    QCOMPARE(store.isBadPassword("bob"), bad);
    QCOMPARE(store.shadowPassword("bob"), shadowField == "-" ? QByteArray() : shadowField);
    // A name found only in the shadow file still counts.
    QVERIFY(store.isBadPassword("shadowonly"));
    QVERIFY(!store.isBadPassword("nobody-here"));
}

void TestAccountStore::firstRecordWins()
{
    TemporaryRoot root;
    QVERIFY(root.writeFile(QStringLiteral("/etc/passwd"),
                           "bob:x:1000:1000::/home/first:/bin/sh\n"
                           "bob:x:1001:1001::/home/second:/bin/sh\n"));
    QVERIFY(root.writeFile(QStringLiteral("/etc/shadow"), "bob:$6$h:1:0:9:7:::\nbob:*:1:0:9:7:::\n"));
    QVERIFY(root.writeFile(QStringLiteral("/etc/group"), "first:x:1000:\nsecond:x:1000:bob\nthird:x:1001:\n"));

    const AccountStore store({}, RootDirectory(root.path()));
    AccountRecord record;
    QVERIFY(store.getUserInfo("bob", record));
    QCOMPARE(record.home, QByteArray("/home/first"));
    QCOMPARE(record.uid, 1000u);
    QVERIFY(!store.isBadPassword("bob"));
    QCOMPARE(store.groups().at(1000).name, QByteArray("first"));
    QCOMPARE(store.groupIdByName("third"), 1001);
    QCOMPARE(store.groupIdByName("second"), -1);

    AccountRecord untouched;
    untouched.home = "kept";
    QVERIFY(!store.getUserInfo("alice", untouched));
    QCOMPARE(untouched.home, QByteArray("kept"));
}

void TestAccountStore::userGroups_data()
{
    QTest::addColumn<QByteArray>("groupFile");
    QTest::addColumn<QByteArray>("user");
    QTest::addColumn<QByteArray>("groups");
    QTest::addColumn<QByteArray>("stderrText");

    const QByteArray base = "wheel:x:10:bob\nusers:x:100:alice,bob\nftp:x:50:\n";
    QTest::newRow("supplementary in gid order, primary last")
        << base + "bob:x:1000:\n"
        << QByteArray("bob") << QByteArray("wheel,users,bob") << QByteArray();
    QTest::newRow("member of own primary group appears twice")
        << base + "bob:x:1000:bob\n"
        << QByteArray("bob") << QByteArray("wheel,users,bob,bob") << QByteArray();
    QTest::newRow("primary group missing")
        << base << QByteArray("bob") << QByteArray("wheel,users")
        << QByteArray("Warning: user has gid=1000, but such group could not be found\n");
    QTest::newRow("no account, only memberships") << base << QByteArray("alice") << QByteArray("users") << QByteArray();
    QTest::newRow("primary group by gid") << base << QByteArray("ftp") << QByteArray("ftp") << QByteArray();
}

void TestAccountStore::userGroups()
{
    QFETCH(QByteArray, groupFile);
    QFETCH(QByteArray, user);
    QFETCH(QByteArray, groups);
    QFETCH(QByteArray, stderrText);

    TemporaryRoot root;
    QVERIFY(root.writeFile(QStringLiteral("/etc/passwd"),
                           "bob:x:1000:1000::/home/bob:/bin/bash\nftp:x:107:50::/srv/ftp:/bin/false\n"));
    QVERIFY(root.writeFile(QStringLiteral("/etc/shadow"), "", 0600));
    QVERIFY(root.writeFile(QStringLiteral("/etc/group"), groupFile));
    const AccountStore store({}, RootDirectory(root.path()));

    CaptureStream err(std::cerr);
    QCOMPARE(joined(store.userGroups(user)), groups);
    QCOMPARE(QByteArray::fromStdString(err.text()), stderrText);
    const QList<QByteArray> list = store.userGroups(user);
    for (const QByteArray &group : list)
        QVERIFY(store.isUserInGroup(user, group));
    QVERIFY(!store.isUserInGroup(user, "no-such-group"));
}

void TestAccountStore::missingFiles_data()
{
    QTest::addColumn<QString>("missing");
    QTest::newRow("shadow") << "/etc/shadow";
    QTest::newRow("group") << "/etc/group";
    QTest::newRow("passwd") << "/etc/passwd";
}

void TestAccountStore::missingFiles()
{
    QFETCH(QString, missing);
    TemporaryRoot root;
    const FileMap files{{QStringLiteral("/etc/passwd"), "bob:x:1000:1000::/home/bob:/bin/sh\n"},
                        {QStringLiteral("/etc/shadow"), "bob:*:1:0:9:7:::\n"},
                        {QStringLiteral("/etc/group"), "bob:x:1000:\n"}};
    for (auto it = files.begin(); it != files.end(); ++it) {
        if (it.key() != missing)
            QVERIFY(root.writeFile(it.key(), it.value()));
    }
    CaptureStream err(std::cerr);
    const AccountStore store({}, RootDirectory(root.path()));
    QCOMPARE(QString::fromStdString(err.text()), QStringLiteral("Unable to open %1\n").arg(missing));
    QCOMPARE(store.accounts().empty(), missing == QLatin1String("/etc/passwd"));
    QCOMPARE(store.shadow().empty(), missing == QLatin1String("/etc/shadow"));
    QCOMPARE(store.groups().empty(), missing == QLatin1String("/etc/group"));
}

void TestAccountStore::systemEnumeration()
{
    // On the system root the accounts come from the name service, whatever
    // FTPCONFIG_ROOT says elsewhere.
    const AccountStore store({});
    AccountRecord root;
    QVERIFY(store.getUserInfo("root", root));
    QCOMPARE(root.uid, 0u);
    QVERIFY(!store.groups().empty());
}

void TestAccountStore::systemUsers_data()
{
    QTest::addColumn<QByteArray>("loginDefs"); // "-" for no login.defs
    QTest::addColumn<QByteArray>("passwdLine");
    QTest::addColumn<bool>("system");

    const QByteArray debian = "# comment\nUID_MIN\t\t\t 1000\nUID_MAX 60000\n";
    QTest::newRow("person") << debian << QByteArray("ann:x:1000:1000::/home/ann:/bin/bash") << false;
    QTest::newRow("service account") << debian << QByteArray("www-data:x:33:33::/var/www:/usr/sbin/nologin") << true;
    QTest::newRow("low id with a shell") << debian << QByteArray("root:x:0:0::/root:/bin/bash") << true;
    QTest::newRow("high id, nologin") << debian << QByteArray("svc:x:5000:5000::/srv:/usr/sbin/nologin") << true;
    QTest::newRow("high id, false") << debian << QByteArray("svc:x:5000:5000::/srv:/bin/false") << true;
    QTest::newRow("UID_MIN raised") << QByteArray("UID_MIN 2000\n") << QByteArray("ann:x:1500:1500::/h:/bin/sh")
                                    << true;
    QTest::newRow("no login.defs") << QByteArray("-") << QByteArray("ann:x:999:999::/h:/bin/sh") << true;
    QTest::newRow("empty shell is sh") << debian << QByteArray("ann:x:1001:1001::/h:") << false;
}

void TestAccountStore::systemUsers()
{
    QFETCH(QByteArray, loginDefs);
    QFETCH(QByteArray, passwdLine);
    QFETCH(bool, system);

    TemporaryRoot root;
    QVERIFY(root.writeFile(QStringLiteral("/etc/passwd"), passwdLine + '\n'));
    QVERIFY(root.writeFile(QStringLiteral("/etc/shadow"), "", 0600));
    QVERIFY(root.writeFile(QStringLiteral("/etc/group"), ""));
    if (loginDefs != "-")
        QVERIFY(root.writeFile(QStringLiteral("/etc/login.defs"), loginDefs));
    const AccountStore store({}, RootDirectory(root.path()));
    QCOMPARE(store.isSystemUser(passwdLine.left(passwdLine.indexOf(':'))), system);
    QVERIFY(!store.isSystemUser("no-such-account"));
}

void TestAccountStore::names()
{
    QVERIFY(sameName(QStringLiteral("jürgen"), QByteArray("j\xc3\xbcrgen")));
    QVERIFY(sameName(QByteArray("bob"), QStringLiteral("bob")));
    QVERIFY(!sameName(QStringLiteral("Bob"), QByteArray("bob")));
    QVERIFY(!sameName(QStringLiteral("bob "), QByteArray("bob")));
}

FTPCONFIG_TEST_GUILESS_MAIN(TestAccountStore)
#include "TestAccountStore.moc"

// The account files as the store reads them: the rows of
// tests/data/scenarios/accounts.txt, and the system's own accounts.
#include "CaptureStream.h"
#include "Scenario.h"
#include "TestMain.h"
#include "accounts/AccountStore.h"

#include <QtTest>

#include <iostream>

class TestAccountStore : public QObject
{
    Q_OBJECT

private slots:
    void accounts_data()
    {
        addScenarioRows(QStringLiteral("accounts.txt"));
    }

    void accounts()
    {
        QFETCH(Scenario, scenario);
        TemporaryRoot root;
        for (auto it = scenario.files.cbegin(); it != scenario.files.cend(); ++it)
            QVERIFY(it.value().isNull() || root.writeFile(it.key(), it.value()));
        CaptureStream err(std::cerr);
        const AccountStore store({}, RootDirectory(root.path()));
        const QByteArray user = scenario.bytes(QStringLiteral("user"));
        const auto expect = [&](const char *key) { return scenario.value(QLatin1String(key)); };
        const auto yes = [&](const char *key) { return expect(key) == QLatin1String("yes"); };

        if (scenario.has(QStringLiteral("bad-password")))
            QCOMPARE(store.isBadPassword(user), yes("bad-password"));
        if (scenario.has(QStringLiteral("shadow-field")))
            QCOMPARE(store.shadowPassword(user), scenario.bytes(QStringLiteral("shadow-field")));
        if (scenario.has(QStringLiteral("system")))
            QCOMPARE(store.isSystemUser(user), yes("system"));
        // What the store says while it loads and gathers the groups.
        const bool withGroups = scenario.has(QStringLiteral("groups"));
        const QList<QByteArray> groups = withGroups ? store.userGroups(user) : QList<QByteArray>();
        QCOMPARE(QString::fromStdString(err.text()), expect("stderr"));
        if (withGroups)
            QCOMPARE(QByteArrayList(groups).join(','), scenario.bytes(QStringLiteral("groups")));
        for (const QByteArray &group : groups)
            QVERIFY(store.isUserInGroup(user, group));
        QVERIFY(!store.isUserInGroup(user, "no-such-group"));
        AccountRecord record;
        QCOMPARE(store.getUserInfo(user, record), store.accounts().count(user) == 1);
        if (scenario.has(QStringLiteral("home")))
            QCOMPARE(QStringLiteral("%1 %2").arg(record.uid).arg(QString::fromUtf8(record.home)),
                     expect("uid") + QLatin1Char(' ') + expect("home"));
        for (const QString &group : scenario.values(QStringLiteral("group")))
            QCOMPARE(QString::fromUtf8(store.groups().at(group.section(QLatin1Char(' '), 0, 0).toUInt()).name),
                     group.section(QLatin1Char(' '), 1));
        for (const QString &group : scenario.values(QStringLiteral("group-id")))
            QCOMPARE(store.groupIdByName(group.section(QLatin1Char(' '), 0, 0).toUtf8()),
                     group.section(QLatin1Char(' '), 1).toInt());
        const QStringList loaded = expect("loaded").split(QLatin1Char(','));
        if (scenario.has(QStringLiteral("loaded"))) {
            QCOMPARE(!store.accounts().empty(), loaded.contains(QLatin1String("passwd")));
            QCOMPARE(!store.shadow().empty(), loaded.contains(QLatin1String("shadow")));
            QCOMPARE(!store.groups().empty(), loaded.contains(QLatin1String("group")));
        }

        // Names nobody has are nothing at all.
        QVERIFY(!store.isBadPassword("no-such-account"));
        QVERIFY(!store.isSystemUser("no-such-account"));
        AccountRecord untouched;
        untouched.home = "kept";
        QVERIFY(!store.getUserInfo("no-such-account", untouched));
        QCOMPARE(untouched.home, QByteArray("kept"));
    }

    void systemEnumeration()
    {
        // On the system root the accounts come from the name service, whatever
        // FTPCONFIG_ROOT says elsewhere.
        const AccountStore store({});
        AccountRecord root;
        QVERIFY(store.getUserInfo("root", root));
        QCOMPARE(root.uid, 0u);
        QVERIFY(!store.groups().empty());
    }

    void names()
    {
        QVERIFY(sameName(QStringLiteral("jürgen"), QByteArray("j\xc3\xbcrgen")));
        QVERIFY(sameName(QByteArray("bob"), QStringLiteral("bob")));
        QVERIFY(!sameName(QStringLiteral("Bob"), QByteArray("bob")));
        QVERIFY(!sameName(QStringLiteral("bob "), QByteArray("bob")));
    }
};

FTPCONFIG_TEST_GUILESS_MAIN(TestAccountStore)

#include "TestAccountStore.moc"

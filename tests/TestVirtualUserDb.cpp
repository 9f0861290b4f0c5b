#include "CaptureStream.h"
#include "FixtureRoot.h"
#include "Process.h"
#include "Scenario.h"
#include "TestMain.h"
#include "accounts/AccountStore.h"

#include <QDir>
#include <QFileInfo>
#include <QtTest>

#include <db_cxx.h>

#include <iostream>
#include <memory>
#include <sys/stat.h>

namespace {

const QByteArray DbPath = "/var/lib/ftpconfig/vsftpd_virtual_users";
const QString DbFile = QStringLiteral("/var/lib/ftpconfig/vsftpd_virtual_users.db");

// "name=password/previous/state ..." in name order.
QString describe(const std::map<QByteArray, VirtualUserRecord> &users)
{
    static const char *const states[] = {"Unchanged", "Modified", "Added", "Deleted"};
    QStringList parts;
    for (const auto &[name, record] : users) {
        parts << QStringLiteral("%1=%2/%3/%4")
                     .arg(QString::fromUtf8(name), QString::fromUtf8(record.password),
                          QString::fromUtf8(record.previousName),
                          QLatin1String(states[static_cast<int>(record.state)]));
    }
    return parts.join(QLatin1Char(' '));
}

// db5.3_dump -p of a file as "name=password ..." in name order.
QString dumped(const QString &file)
{
    const ProcessResult result = runProcess(QStringLiteral("db5.3_dump"), {QStringLiteral("-p"), file});
    if (result.exitCode != 0 || !result.out.contains("\ntype=hash\n"))
        return QStringLiteral("no hash database: ") + QString::fromUtf8(result.err + result.out);
    // After the header, printable lines start with a blank: a key, then its value.
    const QList<QByteArray> lines = result.out.mid(result.out.indexOf("HEADER=END\n") + 11).split('\n');
    QMap<QString, QString> records;
    for (int i = 0; i + 1 < lines.size() && lines[i].startsWith(' '); i += 2)
        records.insert(QString::fromUtf8(lines[i].mid(1)), QString::fromUtf8(lines[i + 1].mid(1)));
    QStringList parts;
    for (auto it = records.begin(); it != records.end(); ++it)
        parts << it.key() + QLatin1Char('=') + it.value();
    return parts.join(QLatin1Char(' '));
}

int fileMode(const QString &path)
{
    struct stat info
    {
    };
    if (::stat(QFile::encodeName(path).constData(), &info) != 0)
        return -1;
    return static_cast<int>(info.st_mode & 07777);
}

} // namespace

class TestVirtualUserDb : public QObject
{
    Q_OBJECT

private slots:
    void editStates_data()
    {
        addScenarioRows(QStringLiteral("virtual-users.txt"));
    }

    void editStates()
    {
        QFETCH(Scenario, scenario);
        FixtureRoot root;
        QVERIFY(root.write());
        QVERIFY(root.writeVirtualUsers(DbFile, {{"anna", "a1"}, {"ben", "b1"}}));

        AccountStore store(DbPath, RootDirectory(root.path()));
        for (const QString &operation : scenario.values(QStringLiteral("do"))) {
            const QList<QByteArray> w = operation.toUtf8().split(' ');
            const auto bytes = [&](int i) { return w.at(i) == "-" ? QByteArray() : w.at(i); };
            if (w[0] == "add")
                store.addVirtualUser(bytes(1), bytes(2));
            else if (w[0] == "remove")
                store.removeVirtualUser(bytes(1));
            else if (w[0] == "change")
                store.changeVirtualUser(bytes(1), bytes(2), bytes(3));
            else
                QFAIL("unknown operation");
        }
        QCOMPARE(describe(store.virtualUsers()), scenario.value(QStringLiteral("users")));
        for (const auto &[name, record] : store.virtualUsers())
            QVERIFY(store.isVirtualUser(name));
        store.syncVirtualUsers();
        QCOMPARE(dumped(root.filePath(DbFile)), scenario.value(QStringLiteral("saved")));
    }

    void saveAndReload()
    {
        FixtureRoot root;
        QVERIFY(root.write());
        {
            AccountStore store(DbPath, RootDirectory(root.path()));
            QCOMPARE(store.database()->filePath(), QByteArray(DbFile.toUtf8()));
            QCOMPARE(store.database()->envHome(), QByteArray("/var/lib/ftpconfig"));
            QVERIFY(store.virtualUsers().empty());
            store.addVirtualUser("anna", "a1");
            store.addVirtualUser("ben", "b 1");
            store.addVirtualUser("carl", "c1");
            store.syncVirtualUsers();
            QCOMPARE(fileMode(root.filePath(DbFile)), 0600);
            QCOMPARE(dumped(root.filePath(DbFile)), QStringLiteral("anna=a1 ben=b 1 carl=c1"));

            store.changeVirtualUser("anna", "anne", "a2");
            store.changeVirtualUser("ben", "ben", "b2");
            store.removeVirtualUser("carl");
            store.addVirtualUser("dora", "d1");
            store.syncVirtualUsers();
            QCOMPARE(dumped(root.filePath(DbFile)), QStringLiteral("anne=a2 ben=b2 dora=d1"));
            QCOMPARE(fileMode(root.filePath(DbFile)), 0600);
            // Saved, memory says what the disk holds: a second rename moves the
            // name the user has now, and the deleted name is nobody.
            QCOMPARE(describe(store.virtualUsers()),
                     QStringLiteral("anne=a2//Unchanged ben=b2//Unchanged dora=d1//Unchanged"));
            QVERIFY(!store.isVirtualUser("carl"));
            store.changeVirtualUser("anne", "anya", {});
            store.syncVirtualUsers();
            QCOMPARE(dumped(root.filePath(DbFile)), QStringLiteral("anya=a2 ben=b2 dora=d1"));
        }
        const AccountStore reloaded(DbPath, RootDirectory(root.path()));
        QCOMPARE(describe(reloaded.virtualUsers()),
                 QStringLiteral("anya=a2//Unchanged ben=b2//Unchanged dora=d1//Unchanged"));
    }

    void filePaths_data()
    {
        QTest::addColumn<QByteArray>("configured");
        QTest::addColumn<QByteArray>("filePath");
        QTest::addColumn<bool>("opens");

        QTest::newRow("without suffix") << QByteArray("/srv/db/users") << QByteArray("/srv/db/users.db") << true;
        // pam_userdb appends ".db" whatever the name ends in, and so must the store.
        QTest::newRow("with suffix") << QByteArray("/srv/db/users.db") << QByteArray("/srv/db/users.db.db") << true;
        QTest::newRow("other suffix") << QByteArray("/srv/db/users.DB") << QByteArray("/srv/db/users.DB.db") << true;
        QTest::newRow("directory") << QByteArray("/srv/db/") << QByteArray("/srv/db/") << false;
        QTest::newRow("no slash") << QByteArray("users") << QByteArray("./users.db") << true;
    }

    void filePaths()
    {
        QFETCH(QByteArray, configured);
        QFETCH(QByteArray, filePath);
        QFETCH(bool, opens);

        FixtureRoot root;
        QVERIFY(root.write());
        QVERIFY(root.makeDirectory(QStringLiteral("/work")));
        const QString previous = QDir::currentPath();
        QVERIFY(QDir::setCurrent(root.filePath(QStringLiteral("/work"))));
        CaptureStream err(std::cerr);
        {
            VirtualUserDb db(configured, RootDirectory(root.path()));
            QCOMPARE(db.filePath(), filePath);
            QCOMPARE(db.isOpen(), opens);
            if (opens) {
                const QString onDisk = filePath.startsWith('/')
                    ? root.filePath(QString::fromUtf8(filePath))
                    : root.filePath(QStringLiteral("/work/") + QString::fromUtf8(filePath));
                QVERIFY2(QFileInfo::exists(onDisk), qPrintable(onDisk));
                QCOMPARE(fileMode(onDisk), 0600);
            } else {
                QVERIFY(QByteArray::fromStdString(err.text()).startsWith("Error opening database: " + filePath + '\n'));
                QVERIFY_EXCEPTION_THROWN(db.readAll(), DbException);
                QVERIFY_EXCEPTION_THROWN(db.put("a", "b"), DbException);
            }
        }
        QVERIFY(QDir::setCurrent(previous));
    }

    void unusableDirectory()
    {
        FixtureRoot root;
        QVERIFY(root.write());
        QVERIFY(root.writeFile(QStringLiteral("/srv/file"), "not a directory"));
        try {
            AccountStore store("/srv/file/db/users", RootDirectory(root.path()));
            QFAIL("no exception");
        } catch (const std::runtime_error &e) {
            QCOMPARE(QString::fromLocal8Bit(e.what()),
                     QStringLiteral("Unable to create path for virtual user database: /srv/file/db/"));
        }
    }

    void damaged_data()
    {
        QTest::addColumn<QString>("damage");
        QTest::addColumn<bool>("recovers");
        // A damaged database file is never deleted: the recovery deletes the
        // configured path as written, and the file opened has ".db" appended.
        QTest::newRow("truncated database") << "truncate" << false;
        QTest::newRow("garbage database") << "garbage" << false;
        QTest::newRow("garbage environment") << "environment" << true;
        QTest::newRow("database is a directory") << "directory" << false;
    }

    void damaged()
    {
        QFETCH(QString, damage);
        QFETCH(bool, recovers);

        FixtureRoot root;
        QVERIFY(root.write());
        QMap<QByteArray, QByteArray> users;
        for (int i = 0; i < 300; ++i)
            users.insert("user" + QByteArray::number(i), "password" + QByteArray::number(i));
        QVERIFY(root.writeVirtualUsers(DbFile, users));
        const QString file = root.filePath(DbFile);
        QByteArray oldBytes = root.readFile(DbFile);
        QVERIFY(oldBytes.size() > 8192);

        if (damage == QLatin1String("truncate")) {
            QVERIFY(QFile::resize(file, oldBytes.size() / 3));
            oldBytes.truncate(oldBytes.size() / 3);
        } else if (damage == QLatin1String("garbage")) {
            oldBytes = QByteArray(5000, 'G');
            QVERIFY(root.writeFile(DbFile, oldBytes, 0600));
        } else if (damage == QLatin1String("environment")) {
            QVERIFY(root.writeFile(QStringLiteral("/var/lib/ftpconfig/__db.001"), QByteArray(3000, '\x7f')));
            QVERIFY(root.writeFile(QStringLiteral("/var/lib/ftpconfig/log.0000000001"), QByteArray(3000, 'L')));
            QVERIFY(root.writeFile(QStringLiteral("/var/lib/ftpconfig/__db.register"), "junk"));
        } else {
            QVERIFY(QFile::remove(file));
            QVERIFY(root.makeDirectory(DbFile));
        }

        CaptureStream err(std::cerr);
        AccountStore store({}, RootDirectory(root.path()));
        bool loaded = true;
        try {
            store.loadVirtualUsers(DbPath);
        } catch (const std::exception &) {
            loaded = false;
        }
        if (!loaded)
            QVERIFY2(!err.text().empty(), "a failed load must say why on standard error");

        store.addVirtualUser("fresh", "new-password");
        if (!recovers) {
            // Nothing can be written there: the save says so, and the users
            // the file still holds are left for the administrator.
            QVERIFY_EXCEPTION_THROWN(store.saveVirtualUsers(), std::exception);
            QVERIFY(store.database()->lastBackupPath().isEmpty());
            if (damage == QLatin1String("directory"))
                QVERIFY(QFileInfo(file).isDir());
            else
                QCOMPARE(root.readFile(DbFile), oldBytes);
            return;
        }
        store.saveVirtualUsers();

        const QByteArray text = QByteArray::fromStdString(err.text());
        if (!loaded) {
            for (const char *line : {"Db env. error. Re-creating database\n", "Closing db...\nRemoving db...\n",
                                     "Home db: /var/lib/ftpconfig\n", "Iniit db...\n"})
                QVERIFY2(text.contains(line), text.constData());
        }
        QVERIFY(dumped(file).contains(QStringLiteral("fresh=new-password user0=password0 user1=password1 ")));
        QCOMPARE(fileMode(file), 0600);
    }

    void recreateDeletesAsWritten_data()
    {
        QTest::addColumn<QByteArray>("configured");
        QTest::addColumn<QString>("copy");

        // Re-creation deletes the file by the path as configured, never the
        // one opened (".db" appended): the old records stay. A file that the
        // path as written names is kept as a copy, then deleted.
        QTest::newRow("configured with .db, a file as written") << DbPath + ".db"
                                                                << "old=o1";
        QTest::newRow("configured without .db") << DbPath << "";
    }

    void recreateDeletesAsWritten()
    {
        QFETCH(QByteArray, configured);
        QFETCH(QString, copy);

        FixtureRoot root;
        QVERIFY(root.write());
        const QString live = QString::fromUtf8(configured + ".db");
        if (!copy.isEmpty())
            QVERIFY(root.writeVirtualUsers(QString::fromUtf8(configured), {{"old", "o1"}}));
        {
            AccountStore store(configured, RootDirectory(root.path()));
            store.addVirtualUser("anna", "a1");
            store.addVirtualUser("ben", "b1");
            store.syncVirtualUsers();
        }

        {
            AccountStore later(configured, RootDirectory(root.path()));
            later.changeVirtualUser("ben", "ben", "b2");
            CaptureStream err(std::cerr);
            later.recreateVirtualUserDb();
            later.syncVirtualUsers();
            QCOMPARE(dumped(root.filePath(live)), QStringLiteral("anna=a1 ben=b2"));
            const QByteArray backup = later.database()->lastBackupPath();
            QCOMPARE(backup.isEmpty(), copy.isEmpty());
            QVERIFY(!root.exists(QString::fromUtf8(configured)));
            if (!copy.isEmpty())
                QCOMPARE(dumped(root.filePath(QString::fromUtf8(backup))), copy);
            QVERIFY(QString::fromStdString(err.text())
                        .contains(QRegularExpression(QStringLiteral("\nRemovinglog\\.0+1\n"))));
        }
        // What the re-created file holds survives another program run (one
        // at a time: the environment is not shared).
        const AccountStore reloaded(configured, RootDirectory(root.path()));
        QCOMPARE(reloaded.virtualUsers().at("ben").password, QByteArray("b2"));
    }

    void readOnlyCreatesNothing()
    {
        FixtureRoot root;
        QVERIFY(root.write());
        {
            const AccountStore store(DbPath, RootDirectory(root.path()), AccountStore::Access::ReadOnly);
            QVERIFY(store.virtualUsers().empty());
        }
        QVERIFY(!root.exists(QStringLiteral("/var/lib/ftpconfig")));
        // As db_load writes it, with a blank and UTF-8 in the passwords.
        QVERIFY(root.writeVirtualUsers(DbFile, {{"anna", "pass word"}, {"yvonne", "\xc3\xa9t\xc3\xa9"}}));
        const QStringList before
            = QDir(root.filePath(QStringLiteral("/var/lib/ftpconfig"))).entryList(QDir::AllEntries | QDir::Hidden);
        AccountStore store(DbPath, RootDirectory(root.path()), AccountStore::Access::ReadOnly);
        QCOMPARE(describe(store.virtualUsers()), QString::fromUtf8("anna=pass word//Unchanged yvonne=été//Unchanged"));
        QVERIFY_EXCEPTION_THROWN(store.database()->put("x", "y"), DbException);
        QCOMPARE(QDir(root.filePath(QStringLiteral("/var/lib/ftpconfig"))).entryList(QDir::AllEntries | QDir::Hidden),
                 before);
    }
};

FTPCONFIG_TEST_GUILESS_MAIN(TestVirtualUserDb)

#include "TestVirtualUserDb.moc"

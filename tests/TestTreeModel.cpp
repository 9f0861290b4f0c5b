// The users table over a fixture root: its tree, the cells of every kind of
// user, edits that become engine changes, Save, and the filter proxy.
#include "CaptureStream.h"
#include "FixtureRoot.h"
#include "ScriptedInteraction.h"
#include "TestMain.h"
#include "TestStrings.h"
#include "policy/FtpServerConfig.h"
#include "usertable/CUsersFilterProxyModel.h"
#include "usertable/TreeModel.h"

#include <QAbstractItemModelTester>
#include <QIcon>
#include <QtTest>

#include <iostream>
#include <memory>

namespace {

const QByteArray UserdbPam = "auth sufficient pam_userdb.so db=/var/lib/ftpconfig/vsftpd_virtual_users\n"
                             "account sufficient pam_userdb.so db=/var/lib/ftpconfig/vsftpd_virtual_users\n"
                             "auth required pam_listfile.so item=user sense=deny file=/etc/ftpusers onerr=succeed\n"
                             "auth required pam_unix.so\n"
                             "account required pam_unix.so\n";

const QStringList localUsers
    = strings("alice", "bob", "doublebang", "ftp", "locked", "lockedhash", "nobody", "root", "starred");

struct Table
{
    FixtureRoot root;
    ScriptedInteraction interaction;
    std::unique_ptr<TreeModel> model;
    std::unique_ptr<QAbstractItemModelTester> tester;

    bool load(const FileMap &files = {})
    {
        // With nopriv_user's account and bob's home, the server itself
        // lets bob and the anonymous user in.
        FileMap all{{QStringLiteral("/etc/pam.d/vsftpd"), UserdbPam},
                    {QStringLiteral("/etc/passwd"),
                     FixtureRoot::defaults()[QStringLiteral("/etc/passwd")]
                         + "nobody:x:65534:65534::/nonexistent:/usr/sbin/nologin\n"},
                    {QStringLiteral("/srv/ftp/.keep"), ""},
                    {QStringLiteral("/var/run/vsftpd/empty/.keep"), ""},
                    {QStringLiteral("/home/bob/.keep"), ""}};
        all.insert(files);
        return root.write(all)
            && root.writeVirtualUsers(QStringLiteral("/var/lib/ftpconfig/vsftpd_virtual_users.db"),
                                      {{"vic", "v"}, {"wendy", "w"}})
            && reload();
    }

    bool reload()
    {
        tester.reset();
        // One database environment at a time: a second one opened over the
        // same home runs recovery under the first one's feet.
        model.reset();
        qputenv("FTPCONFIG_ROOT", QFile::encodeName(root.path()));
        CaptureStream out(std::cout);
        model = std::make_unique<TreeModel>(strings("users", "status", "directory", "mode", "server"), interaction);
        tester = std::make_unique<QAbstractItemModelTester>(model.get(),
                                                            QAbstractItemModelTester::FailureReportingMode::QtTest);
        return true;
    }

    QModelIndex user(const QString &name, int column = TreeModel::UsersColumn) const
    {
        return model->indexOfUser(name, column);
    }
    QString cell(const QString &name, int column) const
    {
        return model->data(user(name, column)).toString();
    }
};

QStringList childNames(const QAbstractItemModel &model, const QModelIndex &parent)
{
    QStringList names;
    for (int row = 0; row < model.rowCount(parent); ++row)
        names << model.index(row, 0, parent).data().toString();
    return names;
}

QString verdict(bool allowed)
{
    return allowed ? QStringLiteral("allowed") : QStringLiteral("denied");
}

bool sameIcon(const QVariant &decoration, const char *resource)
{
    return decoration.value<QIcon>().pixmap(16).toImage() == QIcon(QLatin1String(resource)).pixmap(16).toImage();
}

} // namespace

class TestTreeModel : public QObject
{
    Q_OBJECT

private slots:
    void tree()
    {
        Table table;
        QVERIFY(table.load());
        const TreeModel &model = *table.model;
        QCOMPARE(childNames(model, {}), strings("Everybody"));
        const QModelIndex everybody = model.index(0, 0);
        QCOMPARE(childNames(model, everybody), (strings("Local users", "Virtual users", "Anonymous users")));
        QCOMPARE(childNames(model, model.index(0, 0, everybody)), localUsers);
        QCOMPARE(childNames(model, model.index(1, 0, everybody)), (strings("vic", "wendy")));
        // Group rows have a name and the arrow, nothing else, and edit nothing.
        for (const QModelIndex &group : {everybody, model.index(0, 0, everybody), model.index(1, 0, everybody)}) {
            QVERIFY(sameIcon(group.data(Qt::DecorationRole), ":/prefix/icons/arrow_right.png"));
            QCOMPARE(group.siblingAtColumn(1).data().toString(), QString());
            QVERIFY(!(model.flags(group.siblingAtColumn(1)) & Qt::ItemIsEditable));
        }
        QVERIFY(model.isInVirtualGroup(table.user(QStringLiteral("vic"))));
        QVERIFY(!model.isInVirtualGroup(table.user(QStringLiteral("bob"))));
        QVERIFY(model.flags(table.user(QStringLiteral("bob"), TreeModel::StatusColumn)) & Qt::ItemIsEditable);
        QVERIFY(!(model.flags(table.user(QStringLiteral("bob"), TreeModel::ServerColumn)) & Qt::ItemIsEditable));
        QVERIFY(!table.model->hasUnsavedChanges());
        QCOMPARE(table.interaction.records.size(), 0);
    }

    void users_data()
    {
        QTest::addColumn<QString>("name");
        QTest::addColumn<bool>("allowed");
        QTest::addColumn<int>("kind");
        QTest::addColumn<QString>("directory");
        QTest::addColumn<bool>("serverAllows");

        QTest::newRow("plain local user") << "bob" << true << 0 << "/home/bob" << true;
        QTest::newRow("listed in ftpusers") << "root" << false << 1 << "/root" << false;
        QTest::newRow("locked in shadow") << "locked" << false << 5 << "/home/locked" << false;
        QTest::newRow("virtual without guest mode") << "vic" << false << 3 << "" << false;
        QTest::newRow("anonymous row") << "Anonymous users" << true << 0 << "/srv/ftp" << true;
    }

    void users()
    {
        QFETCH(QString, name);
        QFETCH(bool, allowed);
        QFETCH(int, kind);
        QFETCH(QString, directory);
        QFETCH(bool, serverAllows);

        Table table;
        QVERIFY(
            table.load({{QStringLiteral("/etc/vsftpd.conf"), "listen=YES\nlocal_enable=YES\nanonymous_enable=YES\n"}}));
        QCOMPARE(table.cell(name, TreeModel::StatusColumn), verdict(allowed));
        QCOMPARE(table.model->failure(table.user(name))->kind, static_cast<FailureKind>(kind));
        QVERIFY(sameIcon(table.user(name).data(Qt::DecorationRole),
                         allowed ? ":/prefix/icons/user_green.png" : ":/prefix/icons/user_red.png"));
        QCOMPARE(table.cell(name, TreeModel::DirectoryColumn), directory);
        QVERIFY(!table.cell(name, TreeModel::ModeColumn).isEmpty());
        QVERIFY2(table.cell(name, TreeModel::ServerColumn) == verdict(serverAllows),
                 qPrintable(table.user(name, TreeModel::ServerColumn).data(Qt::ToolTipRole).toString()));
        // The tool tips explain: the verdict's kind and message, the server's
        // first finding.
        const QString statusTip = table.user(name, TreeModel::StatusColumn).data(Qt::ToolTipRole).toString();
        if (kind != 0)
            QVERIFY2(statusTip.contains(table.model->failure(table.user(name))->message), qPrintable(statusTip));
        const auto forecast = table.model->forecast(table.user(name));
        QVERIFY(forecast.has_value());
        if (!forecast->findings.isEmpty()) {
            const QString serverTip = table.user(name, TreeModel::ServerColumn).data(Qt::ToolTipRole).toString();
            QVERIFY2(serverTip.contains(forecast->findings.first().message), qPrintable(serverTip));
        }
    }

    void edits_data()
    {
        QTest::addColumn<QString>("name");
        QTest::addColumn<int>("column");
        QTest::addColumn<QString>("value");
        QTest::addColumn<bool>("unsaved");
        QTest::addColumn<QString>("expected"); // the cell afterwards
        QTest::addColumn<QStringList>("texts"); // what the operator was told

        const QString invalid = QStringLiteral("|Unable to set data. Data is invalid.");
        QTest::newRow("allow a user the userlist blocks")
            << "alice" << 1 << "allowed" << true << "allowed" << QStringList();
        QTest::newRow("deny through the userlist") << "bob" << 1 << "denied" << true << "denied" << QStringList();
        QTest::newRow("allow root: ftpusers repaired, shadow refuses")
            << "root" << 1 << "allowed" << false << "denied"
            << strings("|Unable to change access status.|Failed check type: /etc/passwd or /etc/shadow|***Result: "
                       "FALSE. Check: user root  has bad passwd in /etc/shadow (* or !).");
        QTest::newRow("allow a virtual user: guest mode")
            << "vic" << 1 << "allowed" << true << "allowed" << QStringList();
        QTest::newRow("anonymous off") << "Anonymous users" << 1 << "denied" << true << "denied" << QStringList();
        QTest::newRow("no such status") << "bob" << 1 << "maybe" << false << "allowed"
                                        << QStringList{invalid + QLatin1String(" Reason is unknown")};
        QTest::newRow("rename a local user")
            << "bob" << 0 << "robert" << false << "bob"
            << strings("|You can change only virtual user names. Skipping change bob to robert");
        QTest::newRow("rename a virtual user to a bad name")
            << "vic" << 0 << ".hidden" << false << "vic"
            << QStringList{invalid + QLatin1String("||the name begins with \".\"")};
        QTest::newRow("rights") << "bob" << 3 << "download, upload" << true << "download, upload" << QStringList();
    }

    void edits()
    {
        QFETCH(QString, name);
        QFETCH(int, column);
        QFETCH(QString, value);
        QFETCH(bool, unsaved);
        QFETCH(QString, expected);
        QFETCH(QStringList, texts);

        Table table;
        QVERIFY(table.load({{QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf"), "alice\n"}}));
        QSignalSpy changed(table.model.get(), &QAbstractItemModel::dataChanged);
        CaptureStream out(std::cout);
        QCOMPARE(table.model->setData(table.user(name, column), value), unsaved);
        QCOMPARE(table.cell(name, column), expected);
        QCOMPARE(table.interaction.texts(), texts);
        QCOMPARE(table.interaction.unexpected, 0);
        QCOMPARE(table.model->hasUnsavedChanges(), unsaved);
        QCOMPARE(changed.isEmpty(), !unsaved);
    }

    void saveWritesAndClears()
    {
        Table table;
        QVERIFY(table.load());
        CaptureStream out(std::cout);
        QVERIFY(
            table.model->setData(table.user(QStringLiteral("bob"), TreeModel::StatusColumn), QStringLiteral("denied")));
        // A virtual user renamed in memory is written under the new name.
        QVERIFY(table.model->setData(table.user(QStringLiteral("vic")), QStringLiteral("victor")));
        QVERIFY(table.user(QStringLiteral("victor")).isValid());
        QVERIFY(table.model->hasUnsavedChanges());
        table.model->onSave();
        QVERIFY(!table.model->hasUnsavedChanges());
        QCOMPARE(table.root.readFile(QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf")), QByteArray("bob\n"));
        QVERIFY(table.root.readFile(QStringLiteral("/etc/vsftpd.conf")).contains("userlist_enable=yes"));
        QVERIFY(table.reload());
        QVERIFY(table.user(QStringLiteral("victor")).isValid());
        QVERIFY(!table.user(QStringLiteral("vic")).isValid());
        QCOMPARE(table.cell(QStringLiteral("bob"), TreeModel::StatusColumn), QStringLiteral("denied"));
    }

    void filters_data()
    {
        QTest::addColumn<bool>("system");
        QTest::addColumn<bool>("denied");
        QTest::addColumn<bool>("allowed");
        QTest::addColumn<QStringList>("local");
        QTest::addColumn<QStringList>("virtuals");

        // The virtual "root" shares a system account's name. Without
        // guest_enable every virtual user is denied.
        const QStringList virtuals = strings("root", "vic", "wendy");
        QTest::newRow("nothing hidden") << false << false << false << localUsers << virtuals;
        QTest::newRow("system users") << true << false << false
                                      << strings("alice", "bob", "doublebang", "locked", "lockedhash", "starred")
                                      << strings("vic", "wendy");
        QTest::newRow("denied") << false << true << false
                                << strings("alice", "bob", "doublebang", "ftp", "lockedhash", "nobody")
                                << QStringList();
        QTest::newRow("allowed") << false << false << true << strings("locked", "root", "starred") << virtuals;
        QTest::newRow("allowed and denied") << false << true << true << QStringList() << QStringList();
    }

    void filters()
    {
        QFETCH(bool, system);
        QFETCH(bool, denied);
        QFETCH(bool, allowed);
        QFETCH(QStringList, local);
        QFETCH(QStringList, virtuals);

        Table table;
        QVERIFY(table.load());
        QVERIFY(table.root.writeVirtualUsers(QStringLiteral("/var/lib/ftpconfig/vsftpd_virtual_users.db"),
                                             {{"vic", "v"}, {"wendy", "w"}, {"root", "r"}}));
        QVERIFY(table.reload());
        CUsersFilterProxyModel proxy;
        QAbstractItemModelTester tester(&proxy, QAbstractItemModelTester::FailureReportingMode::QtTest);
        proxy.setSourceModel(table.model.get());
        proxy.setHideSystemUsers(system);
        proxy.setHideDeniedUsers(denied);
        proxy.setHideAllowedUsers(allowed);
        const QModelIndex everybody = proxy.index(0, 0);
        // Group rows are never hidden.
        QCOMPARE(childNames(proxy, everybody).mid(0, 2), (strings("Local users", "Virtual users")));
        QCOMPARE(childNames(proxy, proxy.index(0, 0, everybody)), local);
        QCOMPARE(childNames(proxy, proxy.index(1, 0, everybody)), virtuals);
    }
};

FTPCONFIG_TEST_MAIN(TestTreeModel)
#include "TestTreeModel.moc"

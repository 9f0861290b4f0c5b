#include "FixtureRoot.h"
#include "ModalHelper.h"
#include "TestMain.h"
#include "app/CMainWindow.h"
#include "app/LoginCheckDock.h"
#include "app/Server.h"
#include "app/VexIntegration.h"
#include "usertable/CMainTreeView.h"
#include "usertable/CUsersFilterProxyModel.h"
#include "usertable/TreeModel.h"

#include <QAbstractItemModelTester>
#include <QAction>
#include <QHeaderView>
#include <QLabel>
#include <QSettings>
#include <QTemporaryDir>
#include <QToolBar>
#include <QTreeWidget>

#include <memory>

namespace {

const QString settingsKeys[] = {QStringLiteral("MW/width"), QStringLiteral("MW/height"), QStringLiteral("MW/toolbars"),
                                QStringLiteral("MW/toolbar_Orientation"), QStringLiteral("MW/treeHeaderState")};

QStringList storedKeys()
{
    QStringList keys;
    for (const QString &key : settingsKeys) {
        if (QSettings().contains(key))
            keys << key;
    }
    return keys;
}

} // namespace

// The main window on a fixture root: local users of FixtureRoot, the
// virtual users carol and dave, and a service that always fails (a bus
// that is not connected), so that nothing on this machine is started.
class TestMainWindow : public QObject
{
    Q_OBJECT

private Q_SLOTS:
    void initTestCase();
    void init();
    void cleanup();
    void firstRun();
    void closeWithUnsavedChanges_data();
    void closeWithUnsavedChanges();
    void startWithUnsavedChanges_data();
    void startWithUnsavedChanges();
    void filterKeepsCurrentRow_data();
    void filterKeepsCurrentRow();
    void userActionsFollowSelection_data();
    void userActionsFollowSelection();
    void deleteVirtualUser_data();
    void deleteVirtualUser();
    void loginCheckFollowsEdits();

private:
    QModelIndex sourceIndex(const QString &name, int column = TreeModel::UsersColumn) const;
    void select(const QString &name);
    QAction *action(const char *name) const;
    QString userlist() const;

    QTemporaryDir m_config;
    std::unique_ptr<Server> m_server;
    std::unique_ptr<FixtureRoot> m_root;
    std::unique_ptr<CMainWindow> m_window;
    std::unique_ptr<QAbstractItemModelTester> m_tester;
};

void TestMainWindow::initTestCase()
{
    QVERIFY(m_config.isValid());
    qputenv("XDG_CONFIG_HOME", QFile::encodeName(m_config.path()));
    vexInit("1.2.13", "Program to control FTP server VSFTPD");
    QApplication::setQuitOnLastWindowClosed(false);
    QVERIFY2(QSettings().fileName().startsWith(m_config.path()), qPrintable(QSettings().fileName()));
    m_server = std::make_unique<Server>(QDBusConnection(QStringLiteral("ftpconfig-no-bus")));
}

void TestMainWindow::init()
{
    QSettings().clear();
    m_root = std::make_unique<FixtureRoot>();
    const QByteArray userdb = "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                              "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n";
    QVERIFY(m_root->write({{"/etc/pam.d/vsftpd", userdb + FixtureRoot::defaults().value("/etc/pam.d/vsftpd")}}));
    QVERIFY(m_root->writeVirtualUsers(QStringLiteral("/etc/vsftpd/virtual.db"), {{"carol", "c"}, {"dave", "d"}}));
    qputenv("FTPCONFIG_ROOT", QFile::encodeName(m_root->path()));
    m_window = std::make_unique<CMainWindow>(*m_server);
    QVERIFY(m_window->model());
    m_tester = std::make_unique<QAbstractItemModelTester>(m_window->proxy(),
                                                          QAbstractItemModelTester::FailureReportingMode::QtTest);
    m_window->show();
    QVERIFY(QTest::qWaitForWindowExposed(m_window.get()));
}

void TestMainWindow::cleanup()
{
    m_tester.reset();
    m_window.reset();
    m_root.reset();
    QCoreApplication::sendPostedEvents(nullptr, QEvent::DeferredDelete);
    const QWidgetList left = QApplication::topLevelWidgets();
    QVERIFY2(left.isEmpty(), left.isEmpty() ? "" : left.first()->metaObject()->className());
}

QModelIndex TestMainWindow::sourceIndex(const QString &name, int column) const
{
    TreeModel *model = m_window->model();
    const QModelIndexList found
        = model->match(model->index(0, 0), Qt::DisplayRole, name, 1, Qt::MatchExactly | Qt::MatchRecursive);
    return found.isEmpty() ? QModelIndex() : found.first().siblingAtColumn(column);
}

void TestMainWindow::select(const QString &name)
{
    const QModelIndex index = m_window->proxy()->mapFromSource(sourceIndex(name));
    QVERIFY2(index.isValid(), qPrintable(name));
    m_window->view()->setCurrentIndex(index);
}

QAction *TestMainWindow::action(const char *name) const
{
    return m_window->findChild<QAction *>(QLatin1String(name));
}

QString TestMainWindow::userlist() const
{
    return QString::fromUtf8(m_root->readFile(QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf")));
}

void TestMainWindow::firstRun()
{
    QCOMPARE(m_window->size(), QSize(640, 480));
    QCOMPARE(m_window->findChild<QToolBar *>()->orientation(), Qt::Horizontal);
    const QHeaderView *header = m_window->view()->header();
    // QTreeView hides the hint of QAbstractItemView, which is public.
    const QAbstractItemView *view = m_window->view();
    QCOMPARE(header->count(), 5);
    QCOMPARE(m_window->model()->headerData(TreeModel::ServerColumn, Qt::Horizontal).toString(),
             QStringLiteral("server"));
    for (int column = 0; column < header->count(); ++column) {
        const int contents = qMax(view->sizeHintForColumn(column), header->sectionSizeHint(column));
        // The last column stretches over what the others leave.
        if (column < header->count() - 1)
            QCOMPARE(header->sectionSize(column), contents);
        else
            QVERIFY(header->sectionSize(column) >= contents);
    }
    // Nothing changed yet: no Save, no label; the service is stopped.
    QVERIFY(!action("actionSave")->isEnabled());
    QVERIFY(!m_window->findChild<QLabel *>(QStringLiteral("unsavedChangesLabel"))->isVisible());
    QCOMPARE(action("actionStartStopService")->text(), QStringLiteral("Start FTP service"));
    // Checked from the start, yet system users stay until toggled twice.
    QAction *hideSystem = action("hideSystemUsersAction");
    QVERIFY(hideSystem->isChecked());
    QVERIFY(!m_window->proxy()->hideSystemUsers());
    hideSystem->trigger();
    QVERIFY(!m_window->proxy()->hideSystemUsers());
    hideSystem->trigger();
    QVERIFY(m_window->proxy()->hideSystemUsers());
}

void TestMainWindow::closeWithUnsavedChanges_data()
{
    QTest::addColumn<QString>("answer");
    QTest::addColumn<bool>("closed");
    QTest::newRow("Cancel keeps the window and writes no setting") << QStringLiteral("Cancel") << false;
    QTest::newRow("No closes unsaved and still writes the settings") << QStringLiteral("No") << true;
}

void TestMainWindow::closeWithUnsavedChanges()
{
    QFETCH(QString, answer);
    QFETCH(bool, closed);
    // bob denied: the userlist gets him, in memory until saved.
    const QString before = userlist();
    QVERIFY(m_window->model()->setData(sourceIndex(QStringLiteral("bob"), TreeModel::StatusColumn),
                                       QStringLiteral("denied")));
    QVERIFY(action("actionSave")->isEnabled());
    QVERIFY(m_window->findChild<QLabel *>(QStringLiteral("unsavedChangesLabel"))->isVisible());

    ModalHelper modal;
    modal.expect(QStringLiteral("Do you want to save changes?"), answer);
    QCOMPARE(m_window->close(), closed);
    QVERIFY2(modal.done(), qPrintable(modal.report()));
    QCOMPARE(modal.seen().first().icon, QMessageBox::Question);
    QCOMPARE(m_window->isVisible(), !closed);
    QCOMPARE(storedKeys().size(), closed ? 5 : 0);
    QCOMPARE(userlist(), before);
}

void TestMainWindow::startWithUnsavedChanges_data()
{
    QTest::addColumn<QString>("answer");
    QTest::addColumn<bool>("started");
    QTest::addColumn<bool>("saved");
    QTest::newRow("Cancel: neither saved nor started") << QStringLiteral("Cancel") << false << false;
    QTest::newRow("No: started unsaved") << QStringLiteral("No") << true << false;
    QTest::newRow("Yes: saved, then started") << QStringLiteral("Yes") << true << true;
}

void TestMainWindow::startWithUnsavedChanges()
{
    QFETCH(QString, answer);
    QFETCH(bool, started);
    QFETCH(bool, saved);
    QVERIFY(m_window->model()->setData(sourceIndex(QStringLiteral("bob"), TreeModel::StatusColumn),
                                       QStringLiteral("denied")));

    ModalHelper modal;
    modal.expect(QStringLiteral("You have unsaved changes. Do you want to save them before service start?"), answer);
    // The service fails to start here, which is how a start shows.
    if (started)
        modal.expect(QString(), QStringLiteral("OK"));
    action("actionStartStopService")->trigger();
    QVERIFY2(modal.done(), qPrintable(modal.report()));
    QCOMPARE(modal.seen().first().icon, QMessageBox::Warning);
    if (started) {
        QCOMPARE(modal.seen().last().text, QStringLiteral("Failed to start vsftpd.\n") + m_server->lastError());
        QCOMPARE(modal.seen().last().icon, QMessageBox::NoIcon);
    }
    QCOMPARE(userlist().contains(QLatin1String("bob")), saved);
    QCOMPARE(action("actionSave")->isEnabled(), !saved);
}

void TestMainWindow::filterKeepsCurrentRow_data()
{
    QTest::addColumn<QString>("filter");
    QTest::addColumn<QString>("user");
    QTest::newRow("system") << QStringLiteral("hideSystemUsersAction") << QStringLiteral("bob");
    QTest::newRow("denied") << QStringLiteral("hideDeniedUsersAction") << QStringLiteral("bob");
    QTest::newRow("allowed") << QStringLiteral("hideAllowedUsersAction") << QStringLiteral("root");
}

void TestMainWindow::filterKeepsCurrentRow()
{
    QFETCH(QString, filter);
    QFETCH(QString, user);
    select(user);
    const int before = m_window->proxy()->rowCount(m_window->proxy()->mapFromSource(sourceIndex(user).parent()));
    QAction *toggle = action(qPrintable(filter));
    // Hide system users starts checked but unapplied: twice applies it.
    toggle->trigger();
    if (!toggle->isChecked())
        toggle->trigger();
    const QModelIndex current = m_window->view()->currentIndex();
    QCOMPARE(m_window->proxy()->mapToSource(current), sourceIndex(user));
    QVERIFY(m_window->view()->selectionModel()->isSelected(current));
    // The filter did hide someone beside the kept row.
    QVERIFY(m_window->proxy()->rowCount(current.parent()) < before);
}

void TestMainWindow::userActionsFollowSelection_data()
{
    QTest::addColumn<QString>("row");
    QTest::addColumn<bool>("shown");
    QTest::newRow("group") << QStringLiteral("Virtual users") << false;
    QTest::newRow("top row") << QStringLiteral("Everybody") << false;
    QTest::newRow("local user") << QStringLiteral("bob") << false;
    QTest::newRow("anonymous") << QStringLiteral("Anonymous users") << false;
    QTest::newRow("virtual user") << QStringLiteral("carol") << true;
}

void TestMainWindow::userActionsFollowSelection()
{
    QFETCH(QString, row);
    QFETCH(bool, shown);
    select(QStringLiteral("dave"));
    select(row);
    QCOMPARE(action("actionEdit_user")->isVisible(), shown);
    QCOMPARE(action("actionDelete_user")->isVisible(), shown);
    // The login check follows the same selection.
    QCOMPARE(m_window->loginCheckDock()->userName(), m_window->model()->isUserRow(sourceIndex(row)) ? row : QString());
}

void TestMainWindow::deleteVirtualUser_data()
{
    QTest::addColumn<QString>("row");
    QTest::addColumn<QString>("question");
    QTest::addColumn<QString>("answer");
    QTest::addColumn<bool>("removed");
    QTest::newRow("OK removes") << QStringLiteral("carol")
                                << QStringLiteral("Are you sure you want to delete virtual user carol?")
                                << QStringLiteral("OK") << true;
    QTest::newRow("Cancel keeps") << QStringLiteral("carol")
                                  << QStringLiteral("Are you sure you want to delete virtual user carol?")
                                  << QStringLiteral("Cancel") << false;
    QTest::newRow("no row") << QString() << QStringLiteral("Please, select virtual user which has to be changed.")
                            << QStringLiteral("OK") << false;
}

void TestMainWindow::deleteVirtualUser()
{
    QFETCH(QString, row);
    QFETCH(QString, question);
    QFETCH(QString, answer);
    QFETCH(bool, removed);
    if (row.isEmpty())
        m_window->view()->setCurrentIndex(QModelIndex());
    else
        select(row);
    ModalHelper modal;
    modal.expect(question, answer);
    m_window->deleteUser();
    QVERIFY2(modal.done(), qPrintable(modal.report()));
    QCOMPARE(modal.seen().first().icon, QMessageBox::Warning);
    QCOMPARE(sourceIndex(QStringLiteral("carol")).isValid(), !removed);
    QVERIFY(sourceIndex(QStringLiteral("dave")).isValid());
    QCOMPARE(action("actionSave")->isEnabled(), removed);
    if (removed)
        QVERIFY(!action("actionDelete_user")->isVisible());
}

void TestMainWindow::loginCheckFollowsEdits()
{
    select(QStringLiteral("bob"));
    const QTreeWidget *tree = m_window->loginCheckDock()->findingsTree();
    const auto verdict = [tree] {
        // Server first, then the user with the verdict as first child.
        const QTreeWidgetItem *user = tree->topLevelItem(1);
        return user && user->text(LoginCheckDock::CheckColumn) == QLatin1String("bob") && user->childCount() == 2
            ? user->child(0)
            : nullptr;
    };
    QVERIFY(verdict());
    QCOMPARE(tree->topLevelItem(0)->text(LoginCheckDock::CheckColumn), QStringLiteral("Server"));
    QCOMPARE(verdict()->text(LoginCheckDock::ResultColumn), QStringLiteral("allowed"));

    QVERIFY(m_window->model()->setData(sourceIndex(QStringLiteral("bob"), TreeModel::StatusColumn),
                                       QStringLiteral("denied")));
    QTRY_VERIFY(verdict() && verdict()->text(LoginCheckDock::ResultColumn) == QLatin1String("denied"));
    QCOMPARE(verdict()->text(LoginCheckDock::WhereColumn), QStringLiteral("FTP userlist file"));
    QVERIFY(verdict()->text(LoginCheckDock::MessageColumn).startsWith(QLatin1String("***Result: FALSE.")));
    // The server reads the same userlist: its forecast has a finding too.
    const QTreeWidgetItem *forecast = tree->topLevelItem(1)->child(1);
    QCOMPARE(forecast->text(LoginCheckDock::ResultColumn), QStringLiteral("denied"));
    QVERIFY(forecast->childCount() > 0);
    QVERIFY(!forecast->child(0)->text(LoginCheckDock::WhereColumn).isEmpty());
}

FTPCONFIG_TEST_MAIN(TestMainWindow)
#include "TestMainWindow.moc"

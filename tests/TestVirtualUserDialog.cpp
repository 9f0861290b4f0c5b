#include "FixtureRoot.h"
#include "ModalHelper.h"
#include "TestMain.h"
#include "accounts/AccountStore.h"
#include "app/CMainWindow.h"
#include "app/Server.h"
#include "policy/FtpServerConfig.h"
#include "usertable/CMainTreeView.h"
#include "usertable/CUsersFilterProxyModel.h"
#include "usertable/CreateVUserDialog.h"
#include "usertable/TreeModel.h"

#include <QAction>
#include <QCheckBox>
#include <QLineEdit>
#include <QPushButton>
#include <QSettings>
#include <QTemporaryDir>

#include <memory>

namespace {

const QString createTitle = QStringLiteral("Create virtual user");
const QString editTitle = QStringLiteral("Edit virtual user");
const QString selectMessage = QStringLiteral("Please, select virtual user which has to be changed.");
const QString storedDb = QStringLiteral("/etc/vsftpd/virtual.db");

QStringList fields(const CreateVUserDialog *dialog)
{
    return {dialog->nameLineEdit()->text(), dialog->passwordLineEdit()->text(), dialog->confirmationLineEdit()->text()};
}

} // namespace

// The virtual user dialogs run from the main window over a fixture root
// with the virtual users carol ("c") and dave ("d"), and what Save then
// leaves in the database that pam_userdb reads.
class TestVirtualUserDialog : public QObject
{
    Q_OBJECT

private Q_SLOTS:
    void initTestCase();
    void init();
    void cleanup();
    void validation_data();
    void validation();
    void add_data();
    void add();
    void edit_data();
    void edit();
    void noVirtualUserSelected_data();
    void noVirtualUserSelected();

private:
    // Types into the dialog (the first keystroke is what releases Ok), then
    // presses Ok; okHeldBack tells whether Ok was disabled before.
    ModalHelper::Action fillAndAccept(const QStringList &values, bool *okHeldBack = nullptr);
    void select(const QString &name);
    QStringList database() const;

    QTemporaryDir m_config;
    std::unique_ptr<Server> m_server;
    std::unique_ptr<FixtureRoot> m_root;
    std::unique_ptr<CMainWindow> m_window;
};

void TestVirtualUserDialog::initTestCase()
{
    QVERIFY(m_config.isValid());
    qputenv("XDG_CONFIG_HOME", QFile::encodeName(m_config.path()));
    QApplication::setQuitOnLastWindowClosed(false);
    m_server = std::make_unique<Server>(QDBusConnection(QStringLiteral("ftpconfig-no-bus")));
}

void TestVirtualUserDialog::init()
{
    QSettings().clear();
    m_root = std::make_unique<FixtureRoot>();
    const QByteArray userdb = "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                              "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n";
    QVERIFY(m_root->write({{"/etc/pam.d/vsftpd", userdb + FixtureRoot::defaults().value("/etc/pam.d/vsftpd")}}));
    QVERIFY(m_root->writeVirtualUsers(storedDb, {{"carol", "c"}, {"dave", "d"}}));
    qputenv("FTPCONFIG_ROOT", QFile::encodeName(m_root->path()));
    m_window = std::make_unique<CMainWindow>(*m_server);
    QVERIFY(m_window->model());
    m_window->show();
    QVERIFY(QTest::qWaitForWindowExposed(m_window.get()));
}

void TestVirtualUserDialog::cleanup()
{
    m_window.reset();
    m_root.reset();
    QCoreApplication::sendPostedEvents(nullptr, QEvent::DeferredDelete);
    const QWidgetList left = QApplication::topLevelWidgets();
    QVERIFY2(left.isEmpty(), left.isEmpty() ? "" : left.first()->metaObject()->className());
}

ModalHelper::Action TestVirtualUserDialog::fillAndAccept(const QStringList &values, bool *okHeldBack)
{
    return [values, okHeldBack](QWidget *widget) {
        auto *dialog = qobject_cast<CreateVUserDialog *>(widget);
        QPushButton *ok = dialog->buttonBox()->button(QDialogButtonBox::Ok);
        if (okHeldBack)
            *okHeldBack = !ok->isEnabled();
        QTest::keyClick(dialog->nameLineEdit(), Qt::Key_X);
        // Control characters cannot be typed: the exact texts are set.
        dialog->nameLineEdit()->setText(values.at(0));
        dialog->passwordLineEdit()->setText(values.at(1));
        dialog->confirmationLineEdit()->setText(values.at(2));
        ok->click();
    };
}

void TestVirtualUserDialog::select(const QString &name)
{
    const QModelIndex index = m_window->proxy()->mapFromSource(m_window->model()->indexOfUser(name));
    QVERIFY2(name.isEmpty() || index.isValid(), qPrintable(name));
    m_window->view()->setCurrentIndex(index);
}

QStringList TestVirtualUserDialog::database() const
{
    const AccountStore store(storedDb.toUtf8(), RootDirectory(m_root->path()), AccountStore::Access::ReadOnly);
    QStringList records;
    for (const auto &[name, record] : store.virtualUsers())
        records << QString::fromUtf8(name + '=' + record.password);
    return records;
}

void TestVirtualUserDialog::validation_data()
{
    QTest::addColumn<QStringList>("typed");
    QTest::addColumn<QString>("message");
    QTest::addColumn<QStringList>("reopened");

    const QString mismatch = QStringLiteral("Passwords are not equal.");
    const QString emptyPassword = QStringLiteral("Password must have length greater than zero.");
    const QString emptyName = QStringLiteral("User name length must be greater that zero");
    const auto unusable = [](const QString &name, const char *reason) {
        return QStringLiteral("Virtual user name \"%1\" cannot be used: %2.").arg(name, QLatin1String(reason));
    };
    QTest::newRow("mismatch before empty name") << QStringList{"", "a", "b"} << mismatch << QStringList{"", "", ""};
    QTest::newRow("mismatch keeps name") << QStringList{"eve", "", "b"} << mismatch << QStringList{"eve", "", ""};
    QTest::newRow("empty password before empty name")
        << QStringList{"", "", ""} << emptyPassword << QStringList{"", "", ""};
    QTest::newRow("empty name keeps passwords") << QStringList{"", "p", "p"} << emptyName << QStringList{"", "p", "p"};
    const QStringList bad[] = {{"a/b", "the name contains \"/\""},
                               {".eve", "the name begins with \".\""},
                               {"eve smith", "the name contains a blank"},
                               {QStringLiteral("eve\u00a0smith"), "the name contains a blank"},
                               {"eve\nsmith", "the name contains a line break"},
                               {"eve\tsmith", "the name contains a control character"},
                               {QStringLiteral("eve\u0085"), "the name contains a control character"}};
    for (const QStringList &row : bad) {
        QTest::addRow("refused %d: %s", int(&row - bad), qPrintable(row.at(1)))
            << QStringList{row.at(0), "p", "p"} << unusable(row.at(0), qPrintable(row.at(1)))
            << QStringList{row.at(0), "p", "p"};
    }
}

void TestVirtualUserDialog::validation()
{
    QFETCH(QStringList, typed);
    QFETCH(QString, message);
    QFETCH(QStringList, reopened);

    bool okHeldBack = false;
    bool echoShown = false;
    QStringList seenAgain;
    ModalHelper modal;
    modal.expect(createTitle, [&](QWidget *widget) {
        auto *dialog = qobject_cast<CreateVUserDialog *>(widget);
        dialog->findChild<QCheckBox *>(QStringLiteral("showPasswordCheckBox"))->click();
        echoShown = dialog->passwordLineEdit()->echoMode() == QLineEdit::Normal
            && dialog->confirmationLineEdit()->echoMode() == QLineEdit::Normal;
        fillAndAccept(typed, &okHeldBack)(widget);
    });
    modal.expect(message, QStringLiteral("OK"));
    modal.expect(createTitle, [&](QWidget *widget) {
        seenAgain = fields(qobject_cast<CreateVUserDialog *>(widget));
        ModalHelper::press(widget, QDialogButtonBox::Cancel);
    });
    m_window->addUser();
    QVERIFY2(modal.done(), qPrintable(modal.report()));

    QVERIFY(okHeldBack);
    QVERIFY(echoShown);
    QCOMPARE(modal.seen().at(1).icon, QMessageBox::Warning);
    QCOMPARE(seenAgain, reopened);
    QVERIFY(!m_window->findChild<QAction *>(QStringLiteral("actionSave"))->isEnabled());
    QCOMPARE(m_window->model()->config().virtualUserNames().size(), 2);
}

void TestVirtualUserDialog::add_data()
{
    QTest::addColumn<QString>("deletedFirst");
    QTest::addColumn<QStringList>("typed");
    QTest::addColumn<QString>("message");
    QTest::addColumn<QStringList>("saved");

    QTest::newRow("new user") << QString() << QStringList{"eve", "secret", "secret"} << QString()
                              << QStringList{"carol=c", "dave=d", "eve=secret"};
    QTest::newRow("existing name") << QString() << QStringList{"carol", "x", "x"}
                                   << QStringLiteral("User carol allready exists in users database.")
                                   << QStringList{"carol=c", "dave=d"};
    QTest::newRow("deleted name again") << QStringLiteral("dave") << QStringList{"dave", "new", "new"} << QString()
                                        << QStringList{"carol=c", "dave=new"};
}

void TestVirtualUserDialog::add()
{
    QFETCH(QString, deletedFirst);
    QFETCH(QStringList, typed);
    QFETCH(QString, message);
    QFETCH(QStringList, saved);

    ModalHelper modal;
    if (!deletedFirst.isEmpty()) {
        select(deletedFirst);
        modal.expect(QString(), QStringLiteral("OK"));
        m_window->deleteUser();
    }
    modal.expect(createTitle, fillAndAccept(typed));
    if (!message.isNull())
        modal.expect(message, QStringLiteral("OK"));
    m_window->addUser();
    QVERIFY2(modal.done(), qPrintable(modal.report()));

    QAction *save = m_window->findChild<QAction *>(QStringLiteral("actionSave"));
    QCOMPARE(save->isEnabled(), message.isNull());
    if (message.isNull()) {
        QCOMPARE(m_window->model()->userName(m_window->proxy()->mapToSource(m_window->view()->currentIndex())),
                 typed.at(0));
        save->trigger();
    }
    QCOMPARE(database(), saved);
}

void TestVirtualUserDialog::edit_data()
{
    QTest::addColumn<QStringList>("typed");
    QTest::addColumn<QString>("message");
    QTest::addColumn<QStringList>("saved");

    QTest::newRow("new password") << QStringList{"carol", "c2", "c2"} << QString() << QStringList{"carol=c2", "dave=d"};
    QTest::newRow("new name") << QStringList{"eve", "c", "c"} << QString() << QStringList{"dave=d", "eve=c"};
    QTest::newRow("new name and password")
        << QStringList{"eve", "e", "e"} << QString() << QStringList{"dave=d", "eve=e"};
    QTest::newRow("name of another user")
        << QStringList{"dave", "c", "c"} << QStringLiteral("User dave allready exists in users database.")
        << QStringList{"carol=c", "dave=d"};
}

void TestVirtualUserDialog::edit()
{
    QFETCH(QStringList, typed);
    QFETCH(QString, message);
    QFETCH(QStringList, saved);

    select(QStringLiteral("carol"));
    QStringList shown;
    ModalHelper modal;
    modal.expect(editTitle, [&](QWidget *widget) {
        shown = fields(qobject_cast<CreateVUserDialog *>(widget));
        fillAndAccept(typed)(widget);
    });
    if (!message.isNull())
        modal.expect(message, QStringLiteral("OK"));
    m_window->editUser();
    QVERIFY2(modal.done(), qPrintable(modal.report()));

    QCOMPARE(shown, (QStringList{"carol", "c", "c"}));
    TreeModel *model = m_window->model();
    const bool renamed = message.isNull() && typed.at(0) != QLatin1String("carol");
    QCOMPARE(model->indexOfUser(QStringLiteral("carol")).isValid(), !renamed);
    QVERIFY(model->indexOfUser(typed.at(0)).isValid());
    QAction *save = m_window->findChild<QAction *>(QStringLiteral("actionSave"));
    QCOMPARE(save->isEnabled(), message.isNull());
    save->trigger();
    QCOMPARE(database(), saved);
}

void TestVirtualUserDialog::noVirtualUserSelected_data()
{
    QTest::addColumn<bool>("editing");
    QTest::addColumn<QString>("row");

    QTest::newRow("edit, no row") << true << QString();
    QTest::newRow("edit, local user") << true << QStringLiteral("bob");
    QTest::newRow("edit, group") << true << QStringLiteral("Virtual users");
    QTest::newRow("delete, no row") << false << QString();
    QTest::newRow("delete, local user") << false << QStringLiteral("bob");
}

void TestVirtualUserDialog::noVirtualUserSelected()
{
    QFETCH(bool, editing);
    QFETCH(QString, row);

    if (row == QLatin1String("Virtual users"))
        m_window->view()->setCurrentIndex(
            m_window->proxy()->mapFromSource(m_window->model()->indexOfUser(QStringLiteral("carol")).parent()));
    else
        select(row);
    ModalHelper modal;
    modal.expect(selectMessage, QStringLiteral("OK"));
    if (editing)
        m_window->editUser();
    else
        m_window->deleteUser();
    QVERIFY2(modal.done(), qPrintable(modal.report()));
    QCOMPARE(modal.seen().first().icon, QMessageBox::Warning);
    QCOMPARE(m_window->model()->config().virtualUserNames().size(), 2);
    QVERIFY(!m_window->findChild<QAction *>(QStringLiteral("actionSave"))->isEnabled());
}

FTPCONFIG_TEST_MAIN(TestVirtualUserDialog)
#include "TestVirtualUserDialog.moc"

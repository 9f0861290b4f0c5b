// The cell editors of the users table and the permissions editor, driven
// through the main window's view on a fixture root.
#include "FixtureRoot.h"
#include "ModalHelper.h"
#include "TestMain.h"
#include "app/CMainWindow.h"
#include "app/Server.h"
#include "common/AppStrings.h"
#include "dialogs/PermissionsEditorDialog.h"
#include "policy/FtpServerConfig.h"
#include "usertable/CMainTreeView.h"
#include "usertable/CUsersFilterProxyModel.h"
#include "usertable/MyEditor.h"
#include "usertable/TreeModel.h"

#include <QAbstractItemModelTester>
#include <QCheckBox>
#include <QComboBox>
#include <QDialogButtonBox>
#include <QGroupBox>
#include <QLineEdit>
#include <QPushButton>
#include <QSettings>
#include <QTemporaryDir>

#include <memory>

#include <unistd.h>

namespace {

const QString anonymous = AppStrings::instance().anonymousUsers;

constexpr QFileDevice::Permissions classBits = QFileDevice::ReadOwner | QFileDevice::WriteOwner | QFileDevice::ExeOwner
    | QFileDevice::ReadGroup | QFileDevice::WriteGroup | QFileDevice::ExeGroup | QFileDevice::ReadOther
    | QFileDevice::WriteOther | QFileDevice::ExeOther;

template <typename T> T *child(QWidget *parent, const char *name)
{
    return parent->findChild<T *>(QLatin1String(name));
}

} // namespace

class TestDelegates : public QObject
{
    Q_OBJECT

private Q_SLOTS:
    void initTestCase();
    void init();
    void cleanup();
    void statusChoiceCommitsAtOnce_data();
    void statusChoiceCommitsAtOnce();
    void missingDirectory_data();
    void missingDirectory();
    void rightsRoundTrip_data();
    void rightsRoundTrip();
    void permissionBits();
    void missingRootInEditor_data();
    void missingRootInEditor();
    void modeCellAppliesRightsAndBits();

private:
    QModelIndex viewIndex(const QString &name, int column) const;
    QString cell(const QString &name, int column) const;
    template <typename T> T *openEditor(const QString &name, int column);

    QTemporaryDir m_settings;
    std::unique_ptr<Server> m_server;
    std::unique_ptr<FixtureRoot> m_root;
    std::unique_ptr<CMainWindow> m_window;
    std::unique_ptr<QAbstractItemModelTester> m_tester;
};

void TestDelegates::initTestCase()
{
    QVERIFY(m_settings.isValid());
    qputenv("XDG_CONFIG_HOME", QFile::encodeName(m_settings.path()));
    QApplication::setQuitOnLastWindowClosed(false);
    m_server = std::make_unique<Server>(QDBusConnection(QStringLiteral("ftpconfig-no-bus")));
}

void TestDelegates::init()
{
    QSettings().clear();
    m_root = std::make_unique<FixtureRoot>();
    QVERIFY(m_root->write());
    qputenv("FTPCONFIG_ROOT", QFile::encodeName(m_root->path()));
    m_window = std::make_unique<CMainWindow>(*m_server);
    m_tester = std::make_unique<QAbstractItemModelTester>(m_window->proxy(),
                                                          QAbstractItemModelTester::FailureReportingMode::QtTest);
    m_window->show();
    QVERIFY(QTest::qWaitForWindowExposed(m_window.get()));
}

void TestDelegates::cleanup()
{
    m_tester.reset();
    m_window.reset();
    m_root.reset();
    QCoreApplication::sendPostedEvents(nullptr, QEvent::DeferredDelete);
    const QWidgetList left = QApplication::topLevelWidgets();
    QVERIFY2(left.isEmpty(), left.isEmpty() ? "" : left.first()->metaObject()->className());
}

QModelIndex TestDelegates::viewIndex(const QString &name, int column) const
{
    return m_window->proxy()->mapFromSource(m_window->model()->indexOfUser(name, column));
}

QString TestDelegates::cell(const QString &name, int column) const
{
    return viewIndex(name, column).data().toString();
}

template <typename T> T *TestDelegates::openEditor(const QString &name, int column)
{
    CMainTreeView *view = m_window->view();
    const QModelIndex index = viewIndex(name, column);
    view->setCurrentIndex(index);
    view->edit(index);
    return qobject_cast<T *>(view->indexWidget(index));
}

void TestDelegates::statusChoiceCommitsAtOnce_data()
{
    QTest::addColumn<QString>("user");
    QTest::addColumn<QString>("before");
    QTest::addColumn<int>("openIndex");
    QTest::addColumn<QString>("after");
    QTest::newRow("denied bob, allowed") << "bob"
                                         << "denied" << 0 << "allowed";
    QTest::newRow("allowed bob, denied") << "bob"
                                         << "allowed" << 1 << "denied";
}

void TestDelegates::statusChoiceCommitsAtOnce()
{
    QFETCH(QString, user);
    QFETCH(QString, before);
    QFETCH(int, openIndex);
    QFETCH(QString, after);
    if (cell(user, TreeModel::StatusColumn) != before)
        QVERIFY(m_window->model()->setData(m_window->model()->indexOfUser(user, TreeModel::StatusColumn), before));
    QCOMPARE(cell(user, TreeModel::StatusColumn), before);

    auto *combo = openEditor<QComboBox>(user, TreeModel::StatusColumn);
    QVERIFY(combo);
    QCOMPARE(combo->currentIndex(), openIndex);
    combo->setCurrentText(after);
    // Still in the cell, and the access changed already.
    QCOMPARE(m_window->view()->indexWidget(viewIndex(user, TreeModel::StatusColumn)), combo);
    QCOMPARE(cell(user, TreeModel::StatusColumn), after);
    QVERIFY(m_window->model()->hasUnsavedChanges());
}

void TestDelegates::missingDirectory_data()
{
    QTest::addColumn<QString>("answer");
    QTest::addColumn<bool>("written");
    QTest::newRow("No leaves the cell") << "No" << false;
    QTest::newRow("Create") << "Create" << true;
}

void TestDelegates::missingDirectory()
{
    QFETCH(QString, answer);
    QFETCH(bool, written);
    const QString before = cell(QStringLiteral("bob"), TreeModel::DirectoryColumn);
    auto *editor = openEditor<MyEditor>(QStringLiteral("bob"), TreeModel::DirectoryColumn);
    QVERIFY(editor);
    QCOMPARE(editor->text(), before);
    editor->setText(QStringLiteral("/srv/bob"));

    ModalHelper modal;
    modal.expect(QStringLiteral("Directory /srv/bob does not exist."), answer);
    // Once the directory is bob's, the model asks to confine bob to it.
    if (written)
        modal.expect(QString(), QStringLiteral("No"));
    // The view commits and closes the editor from its event loop.
    QTest::keyClick(editor->focusProxy(), Qt::Key_Return);
    QTRY_VERIFY(!m_window->view()->indexWidget(viewIndex(QStringLiteral("bob"), TreeModel::DirectoryColumn)));
    QVERIFY2(modal.done(), qPrintable(modal.report()));
    QCOMPARE(modal.seen().first().informativeText, QStringLiteral("Do you want to create it?"));
    QStringList buttons = modal.seen().first().buttons;
    buttons.sort();
    QCOMPARE(buttons, (QStringList{"Create", "No"}));

    const QFileInfo created(m_root->filePath(QStringLiteral("/srv/bob")));
    QCOMPARE(created.isDir(), written);
    QCOMPARE(cell(QStringLiteral("bob"), TreeModel::DirectoryColumn), written ? QStringLiteral("/srv/bob") : before);
    if (written)
        QCOMPARE(m_window->model()->config().accounts().userNameById(created.ownerId()), QByteArray("bob"));
}

void TestDelegates::rightsRoundTrip_data()
{
    QTest::addColumn<QString>("user");
    QTest::addColumn<QByteArray>("guest");
    QTest::addColumn<QString>("rights");
    QTest::addColumn<bool>("uploadEnabled");
    QTest::addColumn<QString>("result");
    QTest::newRow("anonymous full access") << anonymous << QByteArray("NO") << "full access" << true << "full access";
    QTest::newRow("local, no guest mode") << "bob" << QByteArray("NO") << "full access" << false << "write, download";
    QTest::newRow("local, guest mode") << "bob" << QByteArray("YES") << "mkdir, upload, write" << true
                                       << "write, upload, mkdir";
    QTest::newRow("nothing") << anonymous << QByteArray("NO") << "" << true << "";
}

void TestDelegates::rightsRoundTrip()
{
    QFETCH(QString, user);
    QFETCH(QByteArray, guest);
    QFETCH(QString, rights);
    QFETCH(bool, uploadEnabled);
    QFETCH(QString, result);
    FtpServerConfig &config = m_window->model()->config();
    config.setOption("guest_enable", guest);
    PermissionsEditorDialog dialog(rights, config, user.toLocal8Bit());
    QCOMPARE(child<QCheckBox>(&dialog, "ftp_upload")->isEnabled(), uploadEnabled);
    QCOMPARE(child<QCheckBox>(&dialog, "ftp_mkdir")->isEnabled(), uploadEnabled);
    QCOMPARE(dialog.rightsString(), result);
}

void TestDelegates::permissionBits()
{
    QVERIFY(::chown(QFile::encodeName(m_root->filePath(QStringLiteral("/srv/ftp"))).constData(), 4242, 4343) == 0);
    PermissionsEditorDialog dialog(QString(), m_window->model()->config(), anonymous.toLocal8Bit());
    QVERIFY(child<QGroupBox>(&dialog, "fs_groupbox")->isEnabled());
    QCOMPARE(child<QComboBox>(&dialog, "owner_combo")->currentText(), QStringLiteral("4242"));
    QCOMPARE(child<QComboBox>(&dialog, "group_combo")->currentText(), QStringLiteral("4343"));
    QCOMPARE(dialog.permissions(), QFileInfo(m_root->filePath(QStringLiteral("/srv/ftp"))).permissions() & classBits);

    QPushButton *ok = child<QDialogButtonBox>(&dialog, "dialogButtonBox")->button(QDialogButtonBox::Ok);
    QVERIFY(!ok->isEnabled());
    for (QCheckBox *box : dialog.findChildren<QCheckBox *>(QRegularExpression(QStringLiteral("^fs_"))))
        box->setChecked(false);
    child<QCheckBox>(&dialog, "fs_owner_read")->setChecked(true);
    child<QCheckBox>(&dialog, "fs_other_execute")->setChecked(true);
    QVERIFY(ok->isEnabled());
    QCOMPARE(int(dialog.permissions()), 0x4001);
}

void TestDelegates::missingRootInEditor_data()
{
    QTest::addColumn<QString>("answer");
    QTest::addColumn<bool>("created");
    QTest::newRow("Create") << "Create" << true;
    QTest::newRow("No") << "No" << false;
}

void TestDelegates::missingRootInEditor()
{
    QFETCH(QString, answer);
    QFETCH(bool, created);
    QDir(m_root->filePath(QStringLiteral("/srv/ftp"))).removeRecursively();
    ModalHelper modal;
    modal.expect(QStringLiteral("Directory /srv/ftp does not exist."), answer);
    PermissionsEditorDialog dialog(QString(), m_window->model()->config(), anonymous.toLocal8Bit());
    QVERIFY2(modal.done(), qPrintable(modal.report()));
    QCOMPARE(modal.seen().first().informativeText, QStringLiteral("(Do you want to create it?"));
    QCOMPARE(QFileInfo(m_root->filePath(QStringLiteral("/srv/ftp"))).isDir(), created);
    QCOMPARE(child<QGroupBox>(&dialog, "fs_groupbox")->isEnabled(), created);
}

void TestDelegates::modeCellAppliesRightsAndBits()
{
    const QString ftpRoot = m_root->filePath(QStringLiteral("/srv/ftp"));
    constexpr QFileDevice::Permissions chosen = QFileDevice::ReadOwner | QFileDevice::WriteOwner | QFileDevice::ExeOwner
        | QFileDevice::ReadGroup | QFileDevice::ExeGroup | QFileDevice::ReadOther;
    QVERIFY((QFileInfo(ftpRoot).permissions() & classBits) != chosen);

    ModalHelper modal;
    modal.expect(QStringLiteral("Dialog"), [](QWidget *dialog) {
        child<QCheckBox>(dialog, "ftp_write")->setChecked(false);
        child<QCheckBox>(dialog, "ftp_download")->setChecked(true);
        child<QCheckBox>(dialog, "ftp_upload")->setChecked(false);
        child<QCheckBox>(dialog, "ftp_mkdir")->setChecked(false);
        child<QCheckBox>(dialog, "fs_other_execute")->setChecked(false);
        child<QCheckBox>(dialog, "fs_group_write")->setChecked(false);
        ModalHelper::press(dialog, QDialogButtonBox::Ok);
    });
    QVERIFY(!openEditor<QWidget>(anonymous, TreeModel::ModeColumn));
    QVERIFY2(modal.done(), qPrintable(modal.report()));
    QCOMPARE(cell(anonymous, TreeModel::ModeColumn), QStringLiteral("download"));
    QCOMPARE(QFileInfo(ftpRoot).permissions() & classBits, chosen);
}

FTPCONFIG_TEST_MAIN(TestDelegates)
#include "TestDelegates.moc"

// The cell editors of the users table and the permissions editor, driven
// through the main window's view on a fixture root.
#include "ModalHelper.h"
#include "TestMain.h"
#include "WindowFixture.h"
#include "common/AppStrings.h"
#include "dialogs/PermissionsEditorDialog.h"
#include "policy/FtpServerConfig.h"
#include "usertable/MyEditor.h"

#include <QCheckBox>
#include <QComboBox>
#include <QDialogButtonBox>
#include <QGroupBox>
#include <QLineEdit>
#include <QPushButton>

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
    void initTestCase()
    {
        QVERIFY(m_f.setUp());
    }

    void init()
    {
        QVERIFY(m_f.open());
    }

    void cleanup()
    {
        QCOMPARE(m_f.close(), QString());
    }

    void statusChoiceCommitsAtOnce_data()
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

    void statusChoiceCommitsAtOnce()
    {
        QFETCH(QString, user);
        QFETCH(QString, before);
        QFETCH(int, openIndex);
        QFETCH(QString, after);
        if (m_f.cell(user, TreeModel::StatusColumn) != before)
            QVERIFY(m_f.setStatus(user, before));
        QCOMPARE(m_f.cell(user, TreeModel::StatusColumn), before);

        auto *combo = openEditor<QComboBox>(user, TreeModel::StatusColumn);
        QVERIFY(combo);
        QCOMPARE(combo->currentIndex(), openIndex);
        combo->setCurrentText(after);
        // Still in the cell, and the access changed already.
        QCOMPARE(m_f.window->view()->indexWidget(m_f.viewIndex(user, TreeModel::StatusColumn)), combo);
        QCOMPARE(m_f.cell(user, TreeModel::StatusColumn), after);
        QVERIFY(m_f.window->model()->hasUnsavedChanges());
    }

    void missingDirectory_data()
    {
        QTest::addColumn<QString>("answer");
        QTest::addColumn<bool>("written");
        QTest::newRow("No leaves the cell") << "No" << false;
        QTest::newRow("Create") << "Create" << true;
    }

    void missingDirectory()
    {
        QFETCH(QString, answer);
        QFETCH(bool, written);
        const QString before = m_f.cell(QStringLiteral("bob"), TreeModel::DirectoryColumn);
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
        QTRY_VERIFY(!m_f.window->view()->indexWidget(m_f.viewIndex(QStringLiteral("bob"), TreeModel::DirectoryColumn)));
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QCOMPARE(modal.seen().first().informativeText, QStringLiteral("Do you want to create it?"));
        QStringList buttons = modal.seen().first().buttons;
        buttons.sort();
        QCOMPARE(buttons, (strings("Create", "No")));

        const QFileInfo created(m_f.root->filePath(QStringLiteral("/srv/bob")));
        QCOMPARE(created.isDir(), written);
        QCOMPARE(m_f.cell(QStringLiteral("bob"), TreeModel::DirectoryColumn),
                 written ? QStringLiteral("/srv/bob") : before);
        if (written)
            QCOMPARE(m_f.window->model()->config().accounts().userNameById(created.ownerId()), QByteArray("bob"));
    }

    void rightsRoundTrip_data()
    {
        QTest::addColumn<QString>("user");
        QTest::addColumn<QByteArray>("guest");
        QTest::addColumn<QString>("rights");
        QTest::addColumn<bool>("uploadEnabled");
        QTest::addColumn<QString>("result");
        QTest::newRow("anonymous full access")
            << anonymous << QByteArray("NO") << "full access" << true << "full access";
        QTest::newRow("local, no guest mode")
            << "bob" << QByteArray("NO") << "full access" << false << "write, download";
        QTest::newRow("local, guest mode")
            << "bob" << QByteArray("YES") << "mkdir, upload, write" << true << "write, upload, mkdir";
        QTest::newRow("nothing") << anonymous << QByteArray("NO") << "" << true << "";
    }

    void rightsRoundTrip()
    {
        QFETCH(QString, user);
        QFETCH(QByteArray, guest);
        QFETCH(QString, rights);
        QFETCH(bool, uploadEnabled);
        QFETCH(QString, result);
        FtpServerConfig &config = m_f.window->model()->config();
        config.setOption("guest_enable", guest);
        PermissionsEditorDialog dialog(rights, config, user.toLocal8Bit());
        QCOMPARE(child<QCheckBox>(&dialog, "ftp_upload")->isEnabled(), uploadEnabled);
        QCOMPARE(child<QCheckBox>(&dialog, "ftp_mkdir")->isEnabled(), uploadEnabled);
        QCOMPARE(dialog.rightsString(), result);
    }

    void permissionBits()
    {
        QVERIFY(::chown(QFile::encodeName(m_f.root->filePath(QStringLiteral("/srv/ftp"))).constData(), 4242, 4343)
                == 0);
        PermissionsEditorDialog dialog(QString(), m_f.window->model()->config(), anonymous.toLocal8Bit());
        QVERIFY(child<QGroupBox>(&dialog, "fs_groupbox")->isEnabled());
        QCOMPARE(child<QComboBox>(&dialog, "owner_combo")->currentText(), QStringLiteral("4242"));
        QCOMPARE(child<QComboBox>(&dialog, "group_combo")->currentText(), QStringLiteral("4343"));
        QCOMPARE(dialog.permissions(),
                 QFileInfo(m_f.root->filePath(QStringLiteral("/srv/ftp"))).permissions() & classBits);

        QPushButton *ok = child<QDialogButtonBox>(&dialog, "dialogButtonBox")->button(QDialogButtonBox::Ok);
        QVERIFY(!ok->isEnabled());
        for (QCheckBox *box : dialog.findChildren<QCheckBox *>(QRegularExpression(QStringLiteral("^fs_"))))
            box->setChecked(false);
        child<QCheckBox>(&dialog, "fs_owner_read")->setChecked(true);
        child<QCheckBox>(&dialog, "fs_other_execute")->setChecked(true);
        QVERIFY(ok->isEnabled());
        QCOMPARE(int(dialog.permissions()), 0x4001);
    }

    void missingRootInEditor_data()
    {
        QTest::addColumn<QString>("answer");
        QTest::addColumn<bool>("created");
        QTest::newRow("Create") << "Create" << true;
        QTest::newRow("No") << "No" << false;
    }

    void missingRootInEditor()
    {
        QFETCH(QString, answer);
        QFETCH(bool, created);
        QDir(m_f.root->filePath(QStringLiteral("/srv/ftp"))).removeRecursively();
        ModalHelper modal;
        modal.expect(QStringLiteral("Directory /srv/ftp does not exist."), answer);
        PermissionsEditorDialog dialog(QString(), m_f.window->model()->config(), anonymous.toLocal8Bit());
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QCOMPARE(modal.seen().first().informativeText, QStringLiteral("(Do you want to create it?"));
        QCOMPARE(QFileInfo(m_f.root->filePath(QStringLiteral("/srv/ftp"))).isDir(), created);
        QCOMPARE(child<QGroupBox>(&dialog, "fs_groupbox")->isEnabled(), created);
    }

    void modeCellAppliesRightsAndBits()
    {
        const QString ftpRoot = m_f.root->filePath(QStringLiteral("/srv/ftp"));
        constexpr QFileDevice::Permissions chosen = QFileDevice::ReadOwner | QFileDevice::WriteOwner
            | QFileDevice::ExeOwner | QFileDevice::ReadGroup | QFileDevice::ExeGroup | QFileDevice::ReadOther;
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
        QCOMPARE(m_f.cell(anonymous, TreeModel::ModeColumn), QStringLiteral("download"));
        QCOMPARE(QFileInfo(ftpRoot).permissions() & classBits, chosen);
    }

private:
    template <typename T> T *openEditor(const QString &name, int column)
    {
        const QModelIndex index = m_f.viewIndex(name, column);
        m_f.window->view()->setCurrentIndex(index);
        m_f.window->view()->edit(index);
        return qobject_cast<T *>(m_f.window->view()->indexWidget(index));
    }

    WindowFixture m_f;
};

FTPCONFIG_TEST_MAIN(TestDelegates)
#include "TestDelegates.moc"

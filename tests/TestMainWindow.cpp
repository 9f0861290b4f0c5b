#include "ModalHelper.h"
#include "TestMain.h"
#include "WindowFixture.h"
#include "accounts/AccountStore.h"
#include "app/LoginCheckDock.h"
#include "app/VexIntegration.h"
#include "common/AppStrings.h"
#include "dialogs/PermissionsEditorDialog.h"
#include "dialogs/SavePreviewDialog.h"
#include "policy/FtpServerConfig.h"
#include "usertable/CreateVUserDialog.h"
#include "usertable/MyEditor.h"

#include <QCheckBox>
#include <QComboBox>
#include <QDialogButtonBox>
#include <QGroupBox>
#include <QHeaderView>
#include <QLabel>
#include <QLineEdit>
#include <QListWidget>
#include <QPlainTextEdit>
#include <QPushButton>
#include <QToolBar>
#include <QTreeWidget>

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

QStringList storedKeys()
{
    QStringList keys;
    for (const char *key : {"MW/width", "MW/height", "MW/toolbars", "MW/toolbar_Orientation", "MW/treeHeaderState"}) {
        if (QSettings().contains(QLatin1String(key)))
            keys << QLatin1String(key);
    }
    return keys;
}

const QString createTitle = QStringLiteral("Create virtual user");

// Types into the dialog (the first keystroke is what releases Ok), then
// presses Ok; okHeldBack tells whether Ok was disabled before.
ModalHelper::Action fillAndAccept(const QStringList &values, bool *okHeldBack = nullptr)
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

QStringList fields(const CreateVUserDialog *dialog)
{
    return {dialog->nameLineEdit()->text(), dialog->passwordLineEdit()->text(), dialog->confirmationLineEdit()->text()};
}

} // namespace

// The main window on the window fixture (see WindowFixture.h): its
// actions, its questions, and the cell editors of the users table with the
// permissions editor, the virtual user dialogs.
class TestMainWindow : public QObject
{
    Q_OBJECT

private Q_SLOTS:
    void initTestCase()
    {
        vexInit("1.2.13", "Program to control FTP server VSFTPD");
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

    void firstRun()
    {
        QCOMPARE(m_f.window->size(), QSize(640, 480));
        QCOMPARE(m_f.window->findChild<QToolBar *>()->orientation(), Qt::Horizontal);
        const QHeaderView *header = m_f.window->view()->header();
        // QTreeView hides the hint of QAbstractItemView, which is public.
        const QAbstractItemView *view = m_f.window->view();
        QCOMPARE(header->count(), 5);
        QCOMPARE(m_f.window->model()->headerData(TreeModel::ServerColumn, Qt::Horizontal).toString(),
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
        QVERIFY(!m_f.action("actionSave")->isEnabled());
        QVERIFY(!m_f.window->findChild<QLabel *>(QStringLiteral("unsavedChangesLabel"))->isVisible());
        QCOMPARE(m_f.action("actionStartStopService")->text(), QStringLiteral("Start FTP service"));
        // Checked from the start, yet system users stay until toggled twice.
        QAction *hideSystem = m_f.action("hideSystemUsersAction");
        QVERIFY(hideSystem->isChecked());
        QVERIFY(!m_f.window->proxy()->hideSystemUsers());
        hideSystem->trigger();
        QVERIFY(!m_f.window->proxy()->hideSystemUsers());
        hideSystem->trigger();
        QVERIFY(m_f.window->proxy()->hideSystemUsers());
    }

    // bob denied, in memory until saved, then the window closed or the service
    // started.
    void unsavedChanges_data()
    {
        QTest::addColumn<bool>("closing"); // or starting the service
        QTest::addColumn<QString>("answer");
        QTest::addColumn<bool>("done"); // closed, or started
        QTest::addColumn<bool>("saved");
        QTest::addColumn<QString>("preview"); // the button pressed in the preview of the save
        QTest::newRow("close, Cancel keeps the window and writes no setting")
            << true << "Cancel" << false << false << QString();
        QTest::newRow("close, No closes unsaved and still writes the settings")
            << true << "No" << true << false << QString();
        QTest::newRow("close, Yes and Save: saved and closed") << true << "Yes" << true << true << "Save";
        QTest::newRow("close, Yes but the preview cancelled: the window stays")
            << true << "Yes" << false << false << "Cancel";
        QTest::newRow("start, Cancel: neither saved nor started") << false << "Cancel" << false << false << QString();
        QTest::newRow("start, No: started unsaved") << false << "No" << true << false << QString();
        QTest::newRow("start, Yes: saved, then started") << false << "Yes" << true << true << "Save";
        QTest::newRow("start, Yes but the preview cancelled: not started")
            << false << "Yes" << false << false << "Cancel";
    }

    void unsavedChanges()
    {
        QFETCH(bool, closing);
        QFETCH(QString, answer);
        QFETCH(bool, done);
        QFETCH(bool, saved);
        QFETCH(QString, preview);
        QVERIFY(m_f.setStatus(QStringLiteral("bob"), QStringLiteral("denied")));
        QVERIFY(m_f.action("actionSave")->isEnabled());
        QVERIFY(m_f.window->findChild<QLabel *>(QStringLiteral("unsavedChangesLabel"))->isVisible());

        ModalHelper modal;
        if (closing) {
            modal.expect(QStringLiteral("Do you want to save changes?"), answer);
            if (!preview.isNull())
                modal.expect(QStringLiteral("Save changes"), preview);
            QCOMPARE(m_f.window->close(), done);
        } else {
            modal.expect(QStringLiteral("You have unsaved changes. Do you want to save them before service start?"),
                         answer);
            if (!preview.isNull())
                modal.expect(QStringLiteral("Save changes"), preview);
            // The service fails to start here, which is how a start shows.
            if (done)
                modal.expect(QString(), QStringLiteral("OK"));
            m_f.action("actionStartStopService")->trigger();
        }
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QCOMPARE(modal.seen().first().icon, closing ? QMessageBox::Question : QMessageBox::Warning);
        if (closing) {
            QCOMPARE(m_f.window->isVisible(), !done);
            QCOMPARE(storedKeys().size(), done ? 5 : 0);
        } else if (done) {
            QCOMPARE(modal.seen().last().text, QStringLiteral("Failed to start vsftpd.\n") + m_f.server->lastError());
            QCOMPARE(modal.seen().last().icon, QMessageBox::NoIcon);
        }
        QCOMPARE(userlist().contains(QLatin1String("bob")), saved);
        QCOMPARE(m_f.action("actionSave")->isEnabled(), !saved);
    }

    void filterKeepsCurrentRow_data()
    {
        QTest::addColumn<QString>("filter");
        QTest::addColumn<QString>("user");
        QTest::newRow("system") << QStringLiteral("hideSystemUsersAction") << QStringLiteral("bob");
        QTest::newRow("denied") << QStringLiteral("hideDeniedUsersAction") << QStringLiteral("bob");
        QTest::newRow("allowed") << QStringLiteral("hideAllowedUsersAction") << QStringLiteral("root");
    }

    void filterKeepsCurrentRow()
    {
        QFETCH(QString, filter);
        QFETCH(QString, user);
        QVERIFY(m_f.select(user));
        const int before = m_f.window->proxy()->rowCount(m_f.window->proxy()->mapFromSource(m_f.source(user).parent()));
        QAction *toggle = m_f.action(qPrintable(filter));
        // Hide system users starts checked but unapplied: twice applies it.
        toggle->trigger();
        if (!toggle->isChecked())
            toggle->trigger();
        const QModelIndex current = m_f.window->view()->currentIndex();
        QCOMPARE(m_f.window->proxy()->mapToSource(current), m_f.source(user));
        QVERIFY(m_f.window->view()->selectionModel()->isSelected(current));
        // The filter did hide someone beside the kept row.
        QVERIFY(m_f.window->proxy()->rowCount(current.parent()) < before);
    }

    void userActionsFollowSelection_data()
    {
        QTest::addColumn<QString>("row");
        QTest::addColumn<bool>("shown");
        QTest::newRow("group") << QStringLiteral("Virtual users") << false;
        QTest::newRow("top row") << QStringLiteral("Everybody") << false;
        QTest::newRow("local user") << QStringLiteral("bob") << false;
        QTest::newRow("anonymous") << QStringLiteral("Anonymous users") << false;
        QTest::newRow("virtual user") << QStringLiteral("carol") << true;
    }

    void userActionsFollowSelection()
    {
        QFETCH(QString, row);
        QFETCH(bool, shown);
        QVERIFY(m_f.select(QStringLiteral("dave")));
        QVERIFY(m_f.select(row));
        QCOMPARE(m_f.action("actionEdit_user")->isVisible(), shown);
        QCOMPARE(m_f.action("actionDelete_user")->isVisible(), shown);
        // The login check follows the same selection.
        QCOMPARE(m_f.window->loginCheckDock()->userName(),
                 m_f.window->model()->isUserRow(m_f.source(row)) ? row : QString());
    }

    void loginCheckFollowsEdits()
    {
        QVERIFY(m_f.select(QStringLiteral("bob")));
        const QTreeWidget *tree = m_f.window->loginCheckDock()->findingsTree();
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

        QVERIFY(m_f.setStatus(QStringLiteral("bob"), QStringLiteral("denied")));
        QTRY_VERIFY(verdict() && verdict()->text(LoginCheckDock::ResultColumn) == QLatin1String("denied"));
        QCOMPARE(verdict()->text(LoginCheckDock::WhereColumn), QStringLiteral("FTP userlist file"));
        QVERIFY(verdict()->text(LoginCheckDock::MessageColumn).startsWith(QLatin1String("***Result: FALSE.")));
        // The server reads the same userlist: its forecast has a finding too.
        const QTreeWidgetItem *forecast = tree->topLevelItem(1)->child(1);
        QCOMPARE(forecast->text(LoginCheckDock::ResultColumn), QStringLiteral("denied"));
        QVERIFY(forecast->childCount() > 0);
        QVERIFY(!forecast->child(0)->text(LoginCheckDock::WhereColumn).isEmpty());
    }

    void statusChoiceCommitsAtOnce_data()
    {
        QTest::addColumn<QString>("before"); // bob's status
        QTest::addColumn<int>("openIndex");
        QTest::addColumn<QString>("after");
        QTest::newRow("denied bob, allowed") << "denied" << 0 << "allowed";
        QTest::newRow("allowed bob, denied") << "allowed" << 1 << "denied";
    }

    void statusChoiceCommitsAtOnce()
    {
        const QString user = QStringLiteral("bob");
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

    // The virtual user dialogs, and what Save then leaves in the database
    // that pam_userdb reads.
    void validation_data()
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
        QTest::newRow("mismatch before empty name") << strings("", "a", "b") << mismatch << strings("", "", "");
        QTest::newRow("mismatch keeps name") << strings("eve", "", "b") << mismatch << strings("eve", "", "");
        QTest::newRow("empty password before empty name")
            << strings("", "", "") << emptyPassword << strings("", "", "");
        QTest::newRow("empty name keeps passwords") << strings("", "p", "p") << emptyName << strings("", "p", "p");
        const QStringList bad[] = {strings("a/b", "the name contains \"/\""),
                                   strings(".eve", "the name begins with \".\""),
                                   strings("eve smith", "the name contains a blank"),
                                   strings("eve\u00a0smith", "the name contains a blank"),
                                   strings("eve\nsmith", "the name contains a line break"),
                                   strings("eve\tsmith", "the name contains a control character"),
                                   strings("eve\u0085", "the name contains a control character")};
        for (const QStringList &row : bad) {
            const QStringList typed = QStringList{row.at(0)} + strings("p", "p");
            QTest::addRow("refused %d: %s", int(&row - bad), qPrintable(row.at(1)))
                << typed << unusable(row.at(0), qPrintable(row.at(1))) << typed;
        }
    }

    void validation()
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
        m_f.window->addUser();
        QVERIFY2(modal.done(), qPrintable(modal.report()));

        QVERIFY(okHeldBack);
        QVERIFY(echoShown);
        QCOMPARE(modal.seen().at(1).icon, QMessageBox::Warning);
        QCOMPARE(seenAgain, reopened);
        QVERIFY(!m_f.action("actionSave")->isEnabled());
        QCOMPARE(m_f.window->model()->config().virtualUserNames().size(), 2);
    }

    // Adding a user, or editing carol; an add may follow the deletion of a
    // user.
    void addOrEdit_data()
    {
        QTest::addColumn<bool>("editing");
        QTest::addColumn<QString>("deletedFirst");
        QTest::addColumn<QStringList>("typed");
        QTest::addColumn<QString>("message");
        QTest::addColumn<QStringList>("saved");

        const auto row = [](const char *name, bool editing, const char *deletedFirst, const char *typed,
                            const QString &message, const char *saved) {
            QTest::newRow(name) << editing << QString::fromUtf8(deletedFirst) << words(typed) << message
                                << words(saved);
        };
        const QString exists = QStringLiteral("User %1 allready exists in users database.");
        const QString local = QStringLiteral("A user named root exists already.");
        row("new user", false, "", "eve secret secret", {}, "carol=c dave=d eve=secret");
        row("existing name", false, "", "carol x x", exists.arg(QLatin1String("carol")), "carol=c dave=d");
        row("deleted name again", false, "dave", "dave new new", {}, "carol=c dave=new");
        row("new password", true, "", "carol c2 c2", {}, "carol=c2 dave=d");
        row("new name", true, "", "eve c c", {}, "dave=d eve=c");
        row("new name and password", true, "", "eve e e", {}, "dave=d eve=e");
        row("name of another user", true, "", "dave c c", exists.arg(QLatin1String("dave")), "carol=c dave=d");
        row("local account's name", false, "", "root x x", local, "carol=c dave=d");
        row("renamed to a local account", true, "", "root c c", local, "carol=c dave=d");
    }

    void addOrEdit()
    {
        QFETCH(bool, editing);
        QFETCH(QString, deletedFirst);
        QFETCH(QStringList, typed);
        QFETCH(QString, message);
        QFETCH(QStringList, saved);

        ModalHelper modal;
        if (!deletedFirst.isEmpty()) {
            QVERIFY(m_f.select(deletedFirst));
            modal.expect(QString(), QStringLiteral("OK"));
            m_f.window->deleteUser();
        }
        QVERIFY(m_f.select(QStringLiteral("carol")));
        QStringList shown;
        modal.expect(editing ? QStringLiteral("Edit virtual user") : createTitle, [&](QWidget *widget) {
            shown = fields(qobject_cast<CreateVUserDialog *>(widget));
            fillAndAccept(typed)(widget);
        });
        if (!message.isNull())
            modal.expect(message, QStringLiteral("OK"));
        editing ? m_f.window->editUser() : m_f.window->addUser();
        QVERIFY2(modal.done(), qPrintable(modal.report()));

        QCOMPARE(shown, editing ? strings("carol", "c", "c") : strings("", "", ""));
        const bool renamed = editing && message.isNull() && typed.at(0) != QLatin1String("carol");
        QCOMPARE(m_f.source(QStringLiteral("carol")).isValid(), !renamed);
        QVERIFY(m_f.source(typed.at(0)).isValid());
        if (!editing && message.isNull())
            QCOMPARE(
                m_f.window->model()->userName(m_f.window->proxy()->mapToSource(m_f.window->view()->currentIndex())),
                typed.at(0));
        QCOMPARE(m_f.action("actionSave")->isEnabled(), message.isNull());
        // A disabled action still triggers when told to; a person cannot.
        if (message.isNull()) {
            modal.expect(QStringLiteral("Save changes"), QDialogButtonBox::Save);
            m_f.action("actionSave")->trigger();
            QVERIFY2(modal.done(), qPrintable(modal.report()));
        }
        QCOMPARE(database(), saved);
    }

    void savePreview_data()
    {
        QTest::addColumn<bool>("accepted");
        QTest::newRow("Save writes what was shown") << true;
        QTest::newRow("Cancel writes nothing") << false;
    }

    // Every kind of file a save writes: the main file and a new userlist (a
    // denial), a per-user file (rights), the database (names only).
    void savePreview()
    {
        QFETCH(bool, accepted);
        FtpServerConfig &config = m_f.window->model()->config();
        config.accounts().addVirtualUser("vera", "veras-secret");
        config.accounts().changeVirtualUser("carol", "carol", "carols-secret");
        config.accounts().removeVirtualUser("dave");
        QVERIFY(config.setUserRights("carol", QStringLiteral("download")));
        QVERIFY(m_f.setStatus(QStringLiteral("bob"), QStringLiteral("denied")));
        const FileMap before = m_f.root->files();

        QStringList entries;
        QByteArray diffs;
        QString users;
        ModalHelper modal;
        modal.expect(QStringLiteral("Save changes"), [&](QWidget *widget) {
            auto *preview = qobject_cast<SavePreviewDialog *>(widget);
            for (int row = 0; row < preview->filesList()->count(); ++row) {
                preview->filesList()->setCurrentRow(row);
                entries << preview->filesList()->item(row)->text();
                const QString shown = preview->diffView()->toPlainText();
                if (row + 1 < preview->filesList()->count())
                    diffs += shown.toUtf8();
                else
                    users = shown;
            }
            ModalHelper::press(widget, accepted ? QDialogButtonBox::Save : QDialogButtonBox::Cancel);
        });
        m_f.action("actionSave")->trigger();
        QVERIFY2(modal.done(), qPrintable(modal.report()));

        QCOMPARE(entries.join(QLatin1Char('|')),
                 QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf (new file)|/etc/vsftpd.chroot_list (new file)|"
                                "/etc/vsftpd.d/users.d/carol|/etc/vsftpd.conf|/etc/vsftpd/virtual.db (virtual users)"));
        for (const char *line : {"added: vera", "new password: carol", "removed: dave"})
            QVERIFY2(users.contains(QLatin1String(line)), qPrintable(users));
        QVERIFY(!users.contains(QLatin1String("secret")) && !diffs.contains("secret"));
        QCOMPARE(m_f.action("actionSave")->isEnabled(), !accepted);
        if (!accepted) {
            QCOMPARE(m_f.root->files(), before);
            return;
        }

        const FileMap after = m_f.root->files();
        QString why;
        FileMap patched = patchedFiles(before, diffs, why);
        QVERIFY2(why.isEmpty(), qPrintable(why + QString::fromUtf8(diffs)));
        for (const QString &path : after.keys()) {
            if (!path.endsWith(QLatin1String(".db")) && !path.endsWith(QLatin1String(".ftpconfig-bak")))
                QVERIFY2(patched.value(path) == after.value(path), qPrintable(path));
        }
        QCOMPARE(m_f.window->model()->config().virtualUserNames(), (QList<QByteArray>{"carol", "vera"}));
    }

    // Delete asks first; edit and delete want a virtual user selected.
    void editOrDelete_data()
    {
        QTest::addColumn<bool>("editing");
        QTest::addColumn<QString>("row");
        QTest::addColumn<QString>("answer"); // null: told to select one
        QTest::addColumn<bool>("removed");
        QTest::newRow("delete, OK removes") << false << "carol"
                                            << "OK" << true;
        QTest::newRow("delete, Cancel keeps") << false << "carol"
                                              << "Cancel" << false;
        QTest::newRow("edit, no row") << true << QString() << QString() << false;
        QTest::newRow("edit, local user") << true << "bob" << QString() << false;
        QTest::newRow("edit, group") << true << "Virtual users" << QString() << false;
        QTest::newRow("delete, no row") << false << QString() << QString() << false;
        QTest::newRow("delete, local user") << false << "bob" << QString() << false;
    }

    void editOrDelete()
    {
        QFETCH(bool, editing);
        QFETCH(QString, row);
        QFETCH(QString, answer);
        QFETCH(bool, removed);
        QVERIFY(m_f.select(row));
        ModalHelper modal;
        if (answer.isNull())
            modal.expect(QStringLiteral("Please, select virtual user which has to be changed."), QStringLiteral("OK"));
        else
            modal.expect(QStringLiteral("Are you sure you want to delete virtual user carol?"), answer);
        editing ? m_f.window->editUser() : m_f.window->deleteUser();
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QCOMPARE(modal.seen().first().icon, QMessageBox::Warning);
        QCOMPARE(m_f.source(QStringLiteral("carol")).isValid(), !removed);
        QVERIFY(m_f.source(QStringLiteral("dave")).isValid());
        QCOMPARE(m_f.window->model()->config().virtualUserNames().size(), removed ? 1 : 2);
        QCOMPARE(m_f.action("actionSave")->isEnabled(), removed);
        if (removed)
            QVERIFY(!m_f.action("actionDelete_user")->isVisible());
    }

private:
    QString userlist() const
    {
        return QString::fromUtf8(m_f.root->readFile(QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf")));
    }

    template <typename T> T *openEditor(const QString &name, int column)
    {
        const QModelIndex index = m_f.viewIndex(name, column);
        m_f.window->view()->setCurrentIndex(index);
        m_f.window->view()->edit(index);
        return qobject_cast<T *>(m_f.window->view()->indexWidget(index));
    }

    QStringList database() const
    {
        const AccountStore store(QByteArray("/etc/vsftpd/virtual"), RootDirectory(m_f.root->path()),
                                 AccountStore::Access::ReadOnly);
        QStringList records;
        for (const auto &[name, record] : store.virtualUsers())
            records << QString::fromUtf8(name + '=' + record.password);
        return records;
    }

    WindowFixture m_f;
};

FTPCONFIG_TEST_MAIN(TestMainWindow)
#include "TestMainWindow.moc"

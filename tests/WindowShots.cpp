// Opens the main window on the root in FTPCONFIG_ROOT the way the program
// does, and saves pictures into the directory named on the command line:
// the window with a refused user selected, its filter menu, the refusal box
// of an edit that cannot be repaired, the Login check dock, the permissions
// editor, then each dialog and box of the engine's questions, the way the
// program shows them, and the options dialog page by page.
#include "ModalHelper.h"
#include "WindowFixture.h"
#include "app/CMainWindow.h"
#include "app/LoginCheckDock.h"
#include "app/VexIntegration.h"
#include "common/AppStrings.h"
#include "dialogs/GuiInteraction.h"
#include "dialogs/TryLoginDialog.h"
#include "options/COptionsDialog.h"
#include "policy/FtpServerConfig.h"
#include "usertable/CMainTreeView.h"
#include "usertable/CUsersFilterProxyModel.h"
#include "usertable/CreateVUserDialog.h"
#include "usertable/TreeModel.h"

#include <QAbstractButton>
#include <QApplication>
#include <QDir>
#include <QLineEdit>
#include <QListWidget>
#include <QMenu>
#include <QPixmap>
#include <QSignalSpy>
#include <QTest>

#include <cstdio>

namespace {

bool g_saved = true;
QDir g_output;

void save(QWidget *widget, const QString &name)
{
    const QString file = g_output.filePath(name + QStringLiteral(".png"));
    if (!widget->grab().save(file)) {
        std::fprintf(stderr, "cannot write %s\n", qPrintable(file));
        g_saved = false;
    }
}

// Saves the widget, a box with details a second time with them open, and
// presses the button.
ModalHelper::Action shot(const QString &name, const QString &button)
{
    return [name, button](QWidget *widget) {
        save(widget, name);
        if (auto *box = qobject_cast<QMessageBox *>(widget); box && !box->detailedText().isEmpty()) {
            for (QAbstractButton *toggle : box->findChildren<QAbstractButton *>()) {
                if (box->buttonRole(toggle) == QMessageBox::ActionRole)
                    toggle->click();
            }
            save(widget, name + QStringLiteral("-details"));
        }
        ModalHelper::press(widget, button);
    };
}

Interaction::Question question(const QString &text, const QString &informative, const QString &detailed,
                               QList<Interaction::Button> buttons, const QString &acceptText = {})
{
    return {{Interaction::Icon::Question, QString(), text, informative, detailed}, buttons, acceptText, {}};
}

} // namespace

int main(int argc, char **argv)
{
    QApplication app(argc, argv);
    const QStringList arguments = QApplication::arguments();
    if (arguments.size() < 2 || arguments.size() > 4) {
        std::fprintf(stderr, "usage: windowshots <output directory> [selected user] [user refused on edit]\n");
        return 2;
    }
    g_output = QDir(arguments.at(1));
    const QString selected = arguments.value(2, QStringLiteral("mallory"));
    const QString refused = arguments.value(3, QStringLiteral("mallory"));
    if (!QDir().mkpath(g_output.path())) {
        std::fprintf(stderr, "cannot create %s\n", qPrintable(g_output.path()));
        return 1;
    }
    QApplication::setWindowIcon(
        QIcon::fromTheme(QStringLiteral("ftp"), QIcon(QPixmap(QStringLiteral(":/prefix/icons/app-icon.png")))));
    vexInit("1.2.13", "Program to control FTP server VSFTPD");

    // The size of a first run, then one with room for the dock.
    CMainWindow window;
    window.show();
    if (!QTest::qWaitForWindowExposed(&window) || !window.model()) {
        std::fprintf(stderr, "the window did not come up\n");
        return 1;
    }
    TreeModel &model = *window.model();
    const QModelIndex user = window.proxy()->mapFromSource(WindowFixture::find(model, selected));
    if (!user.isValid()) {
        std::fprintf(stderr, "no user %s in the table\n", qPrintable(selected));
        return 1;
    }
    window.view()->setCurrentIndex(user);
    QTest::qWait(100);
    save(&window, QStringLiteral("window-first-run"));
    window.resize(960, 720);
    window.resizeDocks({window.loginCheckDock()}, {260}, Qt::Vertical);
    QTest::qWait(100);
    save(&window, QStringLiteral("window"));
    save(window.loginCheckDock(), QStringLiteral("login-check"));

    const auto menu = window.findChild<QMenu *>(QStringLiteral("filterMenu"));
    menu->popup(window.mapToGlobal(QPoint(200, 200)));
    QTest::qWait(100);
    save(menu, QStringLiteral("filter-menu"));
    menu->hide();

    ModalHelper modal(10000);
    // "Try login" on the selected user, after a trial with a password.
    modal.expect(QStringLiteral("Try login: ") + selected, [](QWidget *dialog) {
        QTest::keyClicks(dialog->findChild<QLineEdit *>(QStringLiteral("passwordLineEdit")), QStringLiteral("secret"));
        QSignalSpy finished(qobject_cast<TryLoginDialog *>(dialog), &TryLoginDialog::trialFinished);
        ModalHelper::press(dialog, QStringLiteral("Try login"));
        finished.wait(10000);
        QTest::qWait(100);
        save(dialog, QStringLiteral("try-login"));
        ModalHelper::press(dialog, QDialogButtonBox::Close);
    });
    window.findChild<QAction *>(QStringLiteral("actionTry_login"))->trigger();

    // Every question the edit asks on the way is answered with its
    // refusing button; the refusal box is the picture.
    const QString refusal = QStringLiteral("Unable to change access status.");
    modal.expect(refusal, shot(QStringLiteral("window-refusal-box"), QStringLiteral("OK")));
    model.setData(WindowFixture::find(model, refused, TreeModel::StatusColumn), QStringLiteral("allowed"));

    const QString pamTitle = QStringLiteral("PAM configuration problem");
    modal.expect(pamTitle, shot(QStringLiteral("window-pam-dialog"), QStringLiteral("Skip")));
    GuiInteraction gui;
    gui.askPamProblem();

    // The mode cell's editor over the window, on the anonymous row.
    modal.expect(QStringLiteral("Dialog"), shot(QStringLiteral("permissions-editor"), QStringLiteral("Cancel")));
    window.view()->edit(window.proxy()->mapFromSource(
        WindowFixture::find(model, AppStrings::instance().anonymousUsers, TreeModel::ModeColumn)));

    // The dialogs alone.
    window.hide();
    modal.expect(pamTitle, shot(QStringLiteral("pam-dialog"), QStringLiteral("Skip")));
    gui.askPamProblem();

    modal.expect(QString(), shot(QStringLiteral("file-input-dialog"), QStringLiteral("Cancel")));
    gui.askPath(QStringLiteral("Virtual users database file defined in vsftpd PAM configuration is not found.\nIt "
                               "means, that FTP config was unable to create the following db file: "
                               "/var/lib/ftpconfig/vsftpd_virtual_users.db\nPlease, define new db file path."),
                QStringLiteral("/var/lib/ftpconfig/vsftpd_virtual_users.db"));

    modal.expect(QString(), shot(QStringLiteral("select-owner-dialog"), QStringLiteral("Cancel")));
    gui.chooseOwner({QStringLiteral("root"), QStringLiteral("daemon"), QStringLiteral("ftp"), QStringLiteral("bob")});

    modal.expect(refusal, shot(QStringLiteral("refusal-box"), QStringLiteral("OK")));
    gui.show({Interaction::Icon::Warning, QString(), refusal, QStringLiteral("Failed check type: FTP userlist file"),
              QStringLiteral("***Result: FALSE. Check: userlist file contains bob, userlist file mode = black users")});

    const AccessFailure failure{FailureKind::Filesystem,
                                QStringLiteral("***Result: FALSE. Check: user home directory /srv/ftp/bob does not "
                                               "exist.")};
    modal.expect(failure.message, shot(QStringLiteral("failure-dialog"), QStringLiteral("OK")));
    showFailureDialog(gui, failure);

    const auto create = question(QStringLiteral("User home directory /srv/ftp/bob does not exist."),
                                 QStringLiteral("Do you want to create it?"), QString(),
                                 {Interaction::Button::Accept, Interaction::Button::Cancel}, QStringLiteral("Create"));
    modal.expect(create.message.text, shot(QStringLiteral("create-question"), QStringLiteral("Cancel")));
    gui.ask(create);

    const auto permissions
        = question(QStringLiteral("User may download, but folder has no READ permission for user ftp"),
                   QStringLiteral("Let me fix it?"),
                   QStringLiteral("Detected mapped system user: ftp\nFolder owner: root\nFolder group: root\n\n"
                                  "Current permissions:\nrwx------\nNew permissions:\nrwx---r--"),
                   {Interaction::Button::Yes, Interaction::Button::No});
    modal.expect(permissions.message.text, shot(QStringLiteral("permissions-question"), QStringLiteral("No")));
    gui.ask(permissions);

    CreateVUserDialog virtualUser;
    virtualUser.nameLineEdit()->setText(QStringLiteral("eve"));
    virtualUser.passwordLineEdit()->setText(QStringLiteral("secret"));
    virtualUser.confirmationLineEdit()->setText(QStringLiteral("secret"));
    modal.expect(virtualUser.windowTitle(), shot(QStringLiteral("virtual-user-dialog"), QStringLiteral("Cancel")));
    virtualUser.run();

    // The options dialog at the size it opens with, then each page at the
    // smallest window size the program assumes.
    modal.expect(QStringLiteral("Options"), [](QWidget *options) {
        QTest::qWait(100);
        save(options, QStringLiteral("options"));
        options->resize(640, 480);
        auto *pages = options->findChild<QListWidget *>(QStringLiteral("pagesListWidget"));
        for (int page = 0; page < pages->count(); ++page) {
            pages->setCurrentRow(page);
            QTest::qWait(50);
            save(options, QStringLiteral("options-%1").arg(page));
        }
        ModalHelper::press(options, QStringLiteral("Cancel"));
    });
    COptionsDialog options(model.config());
    options.load();
    options.exec();

    // The preview of a save that adds a virtual user and changes the
    // selected user's rights; cancelled, so nothing is written.
    model.config().accounts().addVirtualUser("newcomer", "secret");
    model.config().setUserRights(selected.toUtf8(), QStringLiteral("download"));
    model.setUnsavedChanges(true);
    modal.expect(QStringLiteral("Save changes"), [](QWidget *preview) {
        auto *files = preview->findChild<QListWidget *>(QStringLiteral("filesListWidget"));
        files->setCurrentRow(files->count() > 2 ? 2 : 0); // the main file, likely
        QTest::qWait(100);
        save(preview, QStringLiteral("save-preview"));
        files->setCurrentRow(files->count() - 1);
        QTest::qWait(50);
        save(preview, QStringLiteral("save-preview-users"));
        ModalHelper::press(preview, QDialogButtonBox::Cancel);
    });
    window.save();

    if (!modal.done()) {
        std::fprintf(stderr, "%s\n", qPrintable(modal.report()));
        return 1;
    }
    return g_saved ? 0 : 1;
}

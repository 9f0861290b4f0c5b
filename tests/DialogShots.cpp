// Shows the dialogs and boxes of the engine's questions one at a time, the
// way the program shows them, and saves a picture of each into the
// directory named on the command line.
#include "ModalHelper.h"
#include "dialogs/GuiInteraction.h"
#include "policy/FtpServerConfig.h"
#include "usertable/CreateVUserDialog.h"

#include <QAbstractButton>
#include <QApplication>
#include <QDir>
#include <QLineEdit>
#include <QMessageBox>

#include <cstdio>

int main(int argc, char **argv)
{
    QApplication app(argc, argv);
    const QStringList arguments = QApplication::arguments();
    if (arguments.size() != 2) {
        std::fprintf(stderr, "usage: dialogshots <output directory>\n");
        return 2;
    }
    const QDir output(arguments.at(1));
    if (!QDir().mkpath(output.path())) {
        std::fprintf(stderr, "cannot create %s\n", qPrintable(output.path()));
        return 1;
    }

    bool saved = true;
    const auto save = [&](QWidget *widget, const QString &name) {
        const QString file = output.filePath(name + QStringLiteral(".png"));
        if (!widget->grab().save(file)) {
            std::fprintf(stderr, "cannot write %s\n", qPrintable(file));
            saved = false;
        }
    };
    const auto shot = [&](const QString &name, const QString &button) {
        return [&save, name, button](QWidget *widget) {
            save(widget, name);
            // A box with details is shown a second time with them open.
            if (auto *box = qobject_cast<QMessageBox *>(widget); box && !box->detailedText().isEmpty()) {
                for (QAbstractButton *toggle : box->findChildren<QAbstractButton *>()) {
                    if (box->buttonRole(toggle) == QMessageBox::ActionRole)
                        toggle->click();
                }
                save(widget, name + QStringLiteral("-details"));
            }
            ModalHelper::press(widget, button);
        };
    };

    ModalHelper modal;
    GuiInteraction gui;

    modal.expect(QStringLiteral("PAM configuration problem"),
                 shot(QStringLiteral("pam-dialog"), QStringLiteral("Skip")));
    gui.askPamProblem();

    modal.expect(QString(), shot(QStringLiteral("file-input-dialog"), QStringLiteral("Cancel")));
    gui.askPath(QStringLiteral("Virtual users database file defined in vsftpd PAM configuration is not found.\nIt "
                               "means, that FTP config was unable to create the following db file: "
                               "/var/lib/ftpconfig/vsftpd_virtual_users.db\nPlease, define new db file path."),
                QStringLiteral("/var/lib/ftpconfig/vsftpd_virtual_users.db"));

    modal.expect(QString(), shot(QStringLiteral("select-owner-dialog"), QStringLiteral("Cancel")));
    gui.chooseOwner({QStringLiteral("root"), QStringLiteral("daemon"), QStringLiteral("ftp"), QStringLiteral("bob")});

    const QString refused = QStringLiteral("Unable to change access status.");
    modal.expect(refused, shot(QStringLiteral("refusal-box"), QStringLiteral("OK")));
    gui.show({Interaction::Icon::Warning, QString(), refused, QStringLiteral("Failed check type: FTP userlist file"),
              QStringLiteral("***Result: FALSE. Check: userlist file contains bob, userlist file mode = black users")});

    const AccessFailure failure{FailureKind::Filesystem,
                                QStringLiteral("***Result: FALSE. Check: user home directory /srv/ftp/bob does not "
                                               "exist.")};
    modal.expect(failure.message, shot(QStringLiteral("failure-dialog"), QStringLiteral("OK")));
    showFailureDialog(gui, failure);

    Interaction::Question create;
    create.message
        = {Interaction::Icon::Question, QString(), QStringLiteral("User home directory /srv/ftp/bob does not exist."),
           QStringLiteral("Do you want to create it?"), QString()};
    create.buttons = {Interaction::Button::Accept, Interaction::Button::Cancel};
    create.acceptText = QStringLiteral("Create");
    modal.expect(create.message.text, shot(QStringLiteral("create-question"), QStringLiteral("Cancel")));
    gui.ask(create);

    Interaction::Question permissions;
    permissions.message = {Interaction::Icon::Question, QString(),
                           QStringLiteral("User may download, but folder has no READ permission for user ftp"),
                           QStringLiteral("Let me fix it?"),
                           QStringLiteral("Detected mapped system user: ftp\nFolder owner: root\nFolder group: root\n\n"
                                          "Current permissions:\nrwx------\nNew permissions:\nrwx---r--")};
    permissions.buttons = {Interaction::Button::Yes, Interaction::Button::No};
    modal.expect(permissions.message.text, shot(QStringLiteral("permissions-question"), QStringLiteral("No")));
    gui.ask(permissions);

    CreateVUserDialog virtualUser;
    virtualUser.nameLineEdit()->setText(QStringLiteral("eve"));
    virtualUser.passwordLineEdit()->setText(QStringLiteral("secret"));
    virtualUser.confirmationLineEdit()->setText(QStringLiteral("secret"));
    modal.expect(virtualUser.windowTitle(), shot(QStringLiteral("virtual-user-dialog"), QStringLiteral("Cancel")));
    virtualUser.run();

    if (!modal.done()) {
        std::fprintf(stderr, "%s\n", qPrintable(modal.report()));
        return 1;
    }
    return saved ? 0 : 1;
}

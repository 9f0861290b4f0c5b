#include "ModalHelper.h"
#include "TemporaryRoot.h"
#include "TestMain.h"
#include "TestStrings.h"
#include "dialogs/FileInputDialog.h"
#include "dialogs/GuiInteraction.h"
#include "dialogs/PAMDialog.h"
#include "policy/FtpServerConfig.h"

#include <QComboBox>
#include <QFileDialog>
#include <QLabel>
#include <QLineEdit>
#include <QPushButton>
#include <QStandardPaths>
#include <QTextBlock>
#include <QTextBrowser>
#include <QToolButton>

#include <iostream>
#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

Q_DECLARE_METATYPE(Interaction::Question)

namespace {

using Button = Interaction::Button;

Interaction::Question question(Interaction::Icon icon, const QString &title, const QString &text,
                               const QString &informative, const QString &detailed, QList<Button> buttons = {},
                               const QString &acceptText = {}, std::optional<Button> defaultButton = {})
{
    return {{icon, title, text, informative, detailed}, buttons, acceptText, defaultButton};
}

// Presses the named button, or closes the window when none is named.
ModalHelper::Action answer(const QString &button)
{
    return [button](QWidget *widget) {
        if (button.isEmpty())
            widget->close();
        else
            QVERIFY2(ModalHelper::press(widget, button), qPrintable(button));
    };
}

} // namespace

class TestDialogs : public QObject
{
    Q_OBJECT

private Q_SLOTS:
    void initTestCase()
    {
        // The file dialog keeps its state in the settings.
        QStandardPaths::setTestModeEnabled(true);
    }

    void cleanup()
    {
        QCOMPARE(ModalHelper::shownWindow(), QString());
    }

    // First, while the process has no other threads to lose in the fork. The
    // process ends with the status, and what it wrote so far is not lost.
    void exitProcess()
    {
        int fds[2];
        QVERIFY(::pipe(fds) == 0);
        const pid_t child = ::fork();
        QVERIFY(child >= 0);
        if (child == 0) {
            ::dup2(fds[1], STDOUT_FILENO);
            testsupport::forgetLeaksAtExit();
            std::cout << "written before the end";
            GuiInteraction().exitProcess(-1);
        }
        ::close(fds[1]);
        QByteArray out;
        char buffer[256];
        pollfd readable{fds[0], POLLIN, 0};
        for (ssize_t n = 1; n > 0 && ::poll(&readable, 1, 10000) > 0;) {
            n = ::read(fds[0], buffer, sizeof buffer);
            out.append(buffer, static_cast<int>(qMax<ssize_t>(n, 0)));
        }
        ::close(fds[0]);
        int status = 0;
        if (::waitpid(child, &status, WNOHANG) == 0) {
            ::kill(child, SIGKILL);
            ::waitpid(child, &status, 0);
        }
        QVERIFY2(WIFEXITED(status), "the process did not end by itself");
        QCOMPARE(WEXITSTATUS(status), 255);
        QCOMPARE(out, QByteArray("written before the end"));
    }

    void messages_data()
    {
        QTest::addColumn<Interaction::Question>("question"); // without buttons: a message
        QTest::addColumn<QString>("press"); // empty: the window is closed
        QTest::addColumn<int>("icon");
        QTest::addColumn<QStringList>("buttons");
        QTest::addColumn<QString>("defaultButton");
        QTest::addColumn<int>("answer");

        using Icon = Interaction::Icon;
        const QString t = QStringLiteral("Title");
        const QString x = QStringLiteral("Text");
        const QString i = QStringLiteral("Informative");
        const QString d = QStringLiteral("Detailed\nlines");
        QTest::newRow("information") << question(Icon::Information, t, x, {}, {}) << "OK"
                                     << int(QMessageBox::Information) << strings("OK") << QString() << -1;
        QTest::newRow("warning") << question(Icon::Warning, {}, x, i, {}) << "OK" << int(QMessageBox::Warning)
                                 << strings("OK") << QString() << -1;
        QTest::newRow("critical") << question(Icon::Critical, t, x, i, d) << "OK" << int(QMessageBox::Critical)
                                  << strings("OK") << QString() << -1;
        const auto create
            = question(Icon::Question, {}, x, i, {}, {Button::Accept, Button::Cancel}, QStringLiteral("Create"));
        QTest::newRow("create") << create << "Create" << int(QMessageBox::Question) << strings("Create", "Cancel")
                                << QString() << int(Button::Accept);
        QTest::newRow("create cancelled") << create << "Cancel" << int(QMessageBox::Question)
                                          << strings("Create", "Cancel") << QString() << int(Button::Cancel);
        const auto yesNo = question(Icon::Question, t, x, {}, d, {Button::Yes, Button::No}, {}, Button::Yes);
        QTest::newRow("default yes, answered no")
            << yesNo << "No" << int(QMessageBox::Question) << strings("Yes", "No") << "Yes" << int(Button::No);
        QTest::newRow("closed is no") << yesNo << QString() << int(QMessageBox::Question) << strings("Yes", "No")
                                      << "Yes" << int(Button::No);
        QTest::newRow("warning question")
            << question(Icon::Warning, {}, x, i, {}, {Button::Yes, Button::No}) << "Yes" << int(QMessageBox::Warning)
            << strings("Yes", "No") << QString() << int(Button::Yes);
    }

    void messages()
    {
        QFETCH(Interaction::Question, question);
        QFETCH(QString, press);
        QFETCH(int, icon);
        QFETCH(QStringList, buttons);
        QFETCH(QString, defaultButton);
        QFETCH(int, answer);

        QWidget window;
        window.show();
        QApplication::setActiveWindow(&window);
        QCOMPARE(QApplication::activeWindow(), &window);

        ModalHelper modal;
        modal.expect(question.message.text, ::answer(press));
        GuiInteraction gui;
        if (question.buttons.isEmpty())
            gui.show(question.message);
        else
            QCOMPARE(int(gui.ask(question)), answer);
        QVERIFY2(modal.done(), qPrintable(modal.report()));

        const ModalHelper::Seen &seen = modal.seen().first();
        QCOMPARE(seen.parent.data(), &window);
        QCOMPARE(seen.title, question.message.title);
        QCOMPARE(seen.informativeText, question.message.informativeText);
        QCOMPARE(seen.detailedText, question.message.detailedText);
        QCOMPARE(int(seen.icon), icon);
        QCOMPARE(seen.buttons, buttons);
        if (!defaultButton.isEmpty())
            QCOMPARE(seen.defaultButton, defaultButton);
    }

    void pamDialogText()
    {
        PAMDialog dialog;
        QCOMPARE(dialog.windowTitle(), QStringLiteral("PAM configuration problem"));
        QVERIFY(dialog.findChild<QPushButton *>(QStringLiteral("fix_button")));
        auto *browser = dialog.findChild<QTextBrowser *>();
        QVERIFY(browser && browser->isReadOnly());

        // Paragraphs one a line, an empty line between blocks.
        const QString expected = QStringLiteral(
            "Your vsftpd PAM configuration seems to be invalid. In order to allow the virtual user mechanism function "
            "properly, PAM vsftpd config file must contain something like these lines:\n\n"
            "auth    sufficient  /lib/security/pam_userdb.so db=/var/lib/ftpconfig/virtual_user_db\n"
            "account sufficient  /lib/security/pam_userdb.so db=/var/lib/ftpconfig/virtual_user_db\n\n"
            "Note: these lines must be BEFORE common unix login stack!\n\n"
            "FTP configurator detected, that you vsftpd PAM config file has no such lines.\n\n"
            "Variant 1: you have not configured vsftpd PAM file.\n"
            "Solution: Allow FTP configurator to attempt to fix this problem or fix it manually\n\n"
            "Variant 2: you have valid vsftpd PAM configuration, but done in different manner then FTP configurator "
            "expects.\nSolution: select \"Valid\", and FTP configurator will not notify you about this \"problem\" any "
            "more.");
        QStringList paragraphs;
        QStringList emphasised;
        for (QTextBlock block = browser->document()->begin(); block.isValid(); block = block.next()) {
            paragraphs << block.text();
            const QTextFragment first = block.begin().fragment();
            if (first.isValid() && first.charFormat().fontItalic())
                emphasised << QStringLiteral("italic:") + first.text().left(7);
            if (first.isValid() && first.charFormat().fontWeight() == QFont::Bold)
                emphasised << QStringLiteral("bold:") + first.text();
        }
        QCOMPARE(paragraphs.join(QLatin1Char('\n')), expected);
        QCOMPARE(emphasised,
                 strings("italic:auth   ", "italic:account", "bold:Note", "bold:Variant 1", "bold:Variant 2"));
    }

    void pamDialog_data()
    {
        QTest::addColumn<QString>("press");
        QTest::addColumn<int>("code");
        QTest::addColumn<int>("choice");
        QTest::newRow("skip") << QStringLiteral("Skip") << 1 << int(Interaction::PamChoice::Skip);
        QTest::newRow("valid") << QStringLiteral("Valid") << 2 << int(Interaction::PamChoice::Valid);
        QTest::newRow("fix") << QStringLiteral("Fix") << 3 << int(Interaction::PamChoice::Fix);
        QTest::newRow("closed is fix") << QString() << 0 << int(Interaction::PamChoice::Fix);
    }

    void pamDialog()
    {
        QFETCH(QString, press);
        QFETCH(int, code);
        QFETCH(int, choice);
        const QString title = QStringLiteral("PAM configuration problem");
        ModalHelper modal;
        modal.expect(title, answer(press)).expect(title, answer(press));
        PAMDialog dialog;
        QCOMPARE(dialog.exec(), code);
        GuiInteraction gui;
        QCOMPARE(int(gui.askPamProblem()), choice);
        QVERIFY2(modal.done(), qPrintable(modal.report()));
    }

    void fileInput_data()
    {
        QTest::addColumn<bool>("ensure"); // ensureDirectory(), or takeSelectedFile() of the path
        QTest::addColumn<QString>("path");
        QTest::addColumn<bool>("ok");
        QTest::addColumn<QString>("text"); // the line edit afterwards
        QTest::addColumn<QString>("boxTitle");
        QTest::addColumn<QString>("boxText");
        const QString db = QStringLiteral("/var/lib/ftpconfig/db/users.db");
        const QString blocked = QStringLiteral("/var/lib/blocker/db/users.db");
        QTest::newRow("directory made") << true << db << true << db << QString() << QString();
        QTest::newRow("directory refused")
            << true << blocked << false << blocked << QStringLiteral("Error creating directory")
            << QStringLiteral("Unable to create directory /var/lib/blocker/db. Virtual users database will not be "
                              "created.\n That means, that virtual users will not work.");
        QTest::newRow("suffix added") << false << QStringLiteral("/srv/users") << true
                                      << QStringLiteral("/srv/users.db") << QString() << QString();
        QTest::newRow("suffix kept") << false << db << true << db << QString() << QString();
        QTest::newRow("not a file") << false << QStringLiteral("/var/lib") << false << QStringLiteral("/old.db")
                                    << QStringLiteral("Invalid file path")
                                    << QStringLiteral("You have entered path to existing non-file entity.\nEnter path "
                                                      "to existing or not file:\nExample: "
                                                      "/var/lib/ftpconfig/virtual_users.db");
    }

    // Paths are checked and made under the root; the texts name them as the
    // administrator knows them.
    void fileInput()
    {
        QFETCH(bool, ensure);
        QFETCH(QString, path);
        QFETCH(bool, ok);
        QFETCH(QString, text);
        QFETCH(QString, boxTitle);
        QFETCH(QString, boxText);
        TemporaryRoot root;
        QVERIFY(root.writeFile(QStringLiteral("/var/lib/blocker"), "not a directory"));
        ModalHelper modal;
        if (!boxText.isEmpty())
            modal.expect(boxText, QStringLiteral("OK"));

        FileInputDialog dialog(nullptr, RootDirectory(root.path()));
        dialog.setText(ensure ? path : QStringLiteral("/old.db"));
        QCOMPARE(ensure ? dialog.ensureDirectory() : dialog.takeSelectedFile(path), ok);
        QCOMPARE(dialog.text(), text);
        if (ensure)
            QCOMPARE(QFileInfo(root.filePath(QFileInfo(path).path())).isDir(), ok);
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        if (!boxTitle.isEmpty())
            QCOMPARE(modal.seen().first().title, boxTitle);
    }

    void askPath_data()
    {
        QTest::addColumn<QString>("typed"); // typed into the line edit, or
        QTest::addColumn<QString>("picked"); // chosen in the file dialog
        QTest::addColumn<QString>("press");
        QTest::addColumn<QString>("result"); // null: cancelled
        QTest::newRow("typed") << QStringLiteral("/srv/ftp/users.db") << QString() << QStringLiteral("OK")
                               << QStringLiteral("/srv/ftp/users.db");
        QTest::newRow("picked") << QString() << QStringLiteral("/var/lib/picked") << QStringLiteral("OK")
                                << QStringLiteral("/var/lib/picked.db");
        QTest::newRow("cancelled") << QStringLiteral("/srv/ftp/users.db") << QString() << QStringLiteral("Cancel")
                                   << QString();
    }

    void askPath()
    {
        QFETCH(QString, typed);
        QFETCH(QString, picked);
        QFETCH(QString, press);
        QFETCH(QString, result);
        TemporaryRoot root;
        QVERIFY(root.makeDirectory(QStringLiteral("/var/lib")));
        const QString label = QStringLiteral("Enter new virtual users database file path:");
        const QString initial = QStringLiteral("/var/lib/ftpconfig/vsftpd_virtual_users.db");

        ModalHelper modal;
        modal.expect(QString(), [&](QWidget *dialog) {
            QCOMPARE(dialog->findChild<QLabel *>()->text(), label);
            auto *lineEdit = dialog->findChild<QLineEdit *>();
            QCOMPARE(lineEdit->text(), initial);
            if (picked.isEmpty())
                lineEdit->setText(typed);
            else
                dialog->findChild<QToolButton *>()->click();
            QVERIFY(ModalHelper::press(dialog, press));
        });
        if (!picked.isEmpty()) {
            modal.expect(QStringLiteral("Select database file"), [&](QWidget *dialog) {
                auto *files = qobject_cast<QFileDialog *>(dialog);
                QVERIFY(files);
                QCOMPARE(files->directory().absolutePath(), root.filePath(QStringLiteral("/var/lib")));
                files->findChild<QLineEdit *>(QStringLiteral("fileNameEdit"))->setText(root.filePath(picked));
                static_cast<QDialog *>(files)->accept(); // as its Save button does
            });
        }
        GuiInteraction gui(RootDirectory(root.path()));
        const std::optional<QString> entered = gui.askPath(label, initial);
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QCOMPARE(entered.value_or(QString()), result);
        QCOMPARE(entered.has_value(), !result.isNull());
    }

    void chooseOwner_data()
    {
        QTest::addColumn<QString>("choose");
        QTest::addColumn<QString>("press");
        QTest::addColumn<QString>("owner"); // null: cancelled
        QTest::newRow("chosen") << QStringLiteral("bob") << QStringLiteral("OK") << QStringLiteral("bob");
        QTest::newRow("first offered") << QString() << QStringLiteral("OK") << QStringLiteral("root");
        QTest::newRow("cancelled") << QStringLiteral("bob") << QStringLiteral("Cancel") << QString();
    }

    void chooseOwner()
    {
        QFETCH(QString, choose);
        QFETCH(QString, press);
        QFETCH(QString, owner);
        const QStringList accounts{QStringLiteral("root"), QStringLiteral("ftp"), QStringLiteral("bob")};
        ModalHelper modal;
        modal.expect(QString(), [&](QWidget *dialog) {
            auto *combo = dialog->findChild<QComboBox *>();
            QCOMPARE(combo->count(), accounts.size());
            for (int i = 0; i < combo->count(); ++i) {
                QCOMPARE(combo->itemText(i), accounts.at(i));
                QVERIFY(combo->itemIcon(i).isNull());
            }
            if (!choose.isEmpty())
                combo->setCurrentText(choose);
            QVERIFY(ModalHelper::press(dialog, press));
        });
        GuiInteraction gui;
        const std::optional<QString> chosen = gui.chooseOwner(accounts);
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QCOMPARE(chosen.value_or(QString()), owner);
        QCOMPARE(chosen.has_value(), !owner.isNull());
    }
};

FTPCONFIG_TEST_MAIN(TestDialogs)
#include "TestDialogs.moc"

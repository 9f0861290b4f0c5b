#include "ModalHelper.h"
#include "TestMain.h"
#include "WindowFixture.h"
#include "accounts/AccountStore.h"
#include "policy/FtpServerConfig.h"
#include "usertable/CreateVUserDialog.h"

#include <QAction>
#include <QCheckBox>
#include <QLineEdit>
#include <QPushButton>

namespace {

const QString createTitle = QStringLiteral("Create virtual user");
const QString editTitle = QStringLiteral("Edit virtual user");
const QString selectMessage = QStringLiteral("Please, select virtual user which has to be changed.");

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

// The virtual user dialogs run from the main window of the window fixture
// (carol "c" and dave "d"), and what Save then leaves in the database that
// pam_userdb reads.
class TestVirtualUserDialog : public QObject
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

        const QString exists = QStringLiteral("User %1 allready exists in users database.");
        QTest::newRow("new user") << false << QString() << strings("eve", "secret", "secret") << QString()
                                  << strings("carol=c", "dave=d", "eve=secret");
        QTest::newRow("existing name") << false << QString() << strings("carol", "x", "x")
                                       << exists.arg(QLatin1String("carol")) << strings("carol=c", "dave=d");
        QTest::newRow("deleted name again") << false << QStringLiteral("dave") << strings("dave", "new", "new")
                                            << QString() << strings("carol=c", "dave=new");
        QTest::newRow("new password") << true << QString() << strings("carol", "c2", "c2") << QString()
                                      << strings("carol=c2", "dave=d");
        QTest::newRow("new name") << true << QString() << strings("eve", "c", "c") << QString()
                                  << strings("dave=d", "eve=c");
        QTest::newRow("new name and password")
            << true << QString() << strings("eve", "e", "e") << QString() << strings("dave=d", "eve=e");
        QTest::newRow("name of another user") << true << QString() << strings("dave", "c", "c")
                                              << exists.arg(QLatin1String("dave")) << strings("carol=c", "dave=d");
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
        modal.expect(editing ? editTitle : createTitle, [&](QWidget *widget) {
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
        m_f.action("actionSave")->trigger();
        QCOMPARE(database(), saved);
    }

    void noVirtualUserSelected_data()
    {
        QTest::addColumn<bool>("editing");
        QTest::addColumn<QString>("row");

        QTest::newRow("edit, no row") << true << QString();
        QTest::newRow("edit, local user") << true << QStringLiteral("bob");
        QTest::newRow("edit, group") << true << QStringLiteral("Virtual users");
        QTest::newRow("delete, no row") << false << QString();
        QTest::newRow("delete, local user") << false << QStringLiteral("bob");
    }

    void noVirtualUserSelected()
    {
        QFETCH(bool, editing);
        QFETCH(QString, row);

        QVERIFY(m_f.select(row));
        ModalHelper modal;
        modal.expect(selectMessage, QStringLiteral("OK"));
        if (editing)
            m_f.window->editUser();
        else
            m_f.window->deleteUser();
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QCOMPARE(modal.seen().first().icon, QMessageBox::Warning);
        QCOMPARE(m_f.window->model()->config().virtualUserNames().size(), 2);
        QVERIFY(!m_f.action("actionSave")->isEnabled());
    }

private:
    QStringList database() const
    {
        const AccountStore store(WindowFixture::virtualDb.toUtf8(), RootDirectory(m_f.root->path()),
                                 AccountStore::Access::ReadOnly);
        QStringList records;
        for (const auto &[name, record] : store.virtualUsers())
            records << QString::fromUtf8(name + '=' + record.password);
        return records;
    }

    WindowFixture m_f;
};

FTPCONFIG_TEST_MAIN(TestVirtualUserDialog)
#include "TestVirtualUserDialog.moc"

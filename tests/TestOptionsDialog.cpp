#include "EngineFixture.h"
#include "ModalHelper.h"
#include "TestMain.h"
#include "WindowFixture.h"
#include "app/VexIntegration.h"
#include "common/AppStrings.h"
#include "options/COptionsDialog.h"
#include "policy/FtpServerConfig.h"

#include <QCheckBox>
#include <QComboBox>
#include <QDoubleSpinBox>
#include <QFileDialog>
#include <QGroupBox>
#include <QInputDialog>
#include <QLineEdit>
#include <QListWidget>
#include <QPlainTextEdit>
#include <QPushButton>
#include <QRadioButton>
#include <QSpinBox>
#include <QSplitter>
#include <QToolButton>

#include <sys/stat.h>

namespace {

const QString absent = QStringLiteral("<absent>");
const QString both = QStringLiteral("IPv4 and IPv6 (vsftpd refuses to start)");
const QString allInterfaces = AppStrings::instance().allInterfaces;

// Every key of the dialog, none at its default, in the spellings vsftpd
// takes ("True", "1", "false"), with an account and an address the dialog
// has no entry for.
const QByteArray allKeys = "# every option of the dialog\n"
                           "guest_enable=True\nguest_username=bob\nlocal_enable=1\nwrite_enable=yes\n"
                           "allow_writeable_chroot=YES\nxferlog_enable=YES\n\n"
                           "ftpd_banner=Welcome to the test server\nbanner_file=/etc/vsftpd.banner\n"
                           "cmds_allowed=USER,PASS,QUIT\ndeny_file={*.mp3,.private}\nhide_file={.hidden}\n"
                           "anonymous_enable=NO\nanon_world_readable_only=false\nno_anon_password=YES\n"
                           "anon_max_rate=1\nftp_username=alice\nanon_umask=022\nchown_upload_mode=0644\n"
                           "chown_username=nosuchuser\nbanned_email_file=/etc/banned\ndeny_email_enable=YES\n"
                           "# connections\n"
                           "connect_from_port_20=YES\npasv_enable=NO\nport_enable=NO\nsession_support=YES\n"
                           "delay_failed_login=5\ndelay_successful_login=2\nidle_session_timeout=600\n"
                           "ftp_data_port=2020\nlisten_port=2121\nmax_clients=50\nmax_per_ip=4\nlisten=YES\n"
                           "listen_ipv6=YES\nlisten_address=192.0.2.7\nlisten_address6=2001:db8::7\n"
                           "download_enable=NO\nascii_download_enable=YES\nascii_upload_enable=YES\n"
                           "async_abor_enable=YES\nchown_uploads=YES\ndelete_failed_uploads=YES\n"
                           "log_ftp_protocol=YES\nls_recurse_enable=YES\nmdtm_write=NO\nuse_localtime=YES\n"
                           "local_max_rate=1048576\nlocal_umask=022\nchroot_list_enable=YES\n"
                           "chroot_local_user=YES\nchroot_list_file=/etc/chroot_users\nchmod_enable=NO\n"
                           "dirlist_enable=NO\ndirmessage_enable=YES\ndual_log_enable=YES\nforce_dot_files=YES\n"
                           "hide_ids=YES\nmessage_file=.welcome\n";

const QString conf = QStringLiteral("/etc/vsftpd.conf");

QString utf8(const char *text)
{
    return QString::fromUtf8(text);
}
QString utf8(const QString &text)
{
    return text;
}

QByteArray debianStock()
{
    QFile file(QStringLiteral(FTPCONFIG_TEST_DATA "/debian-vsftpd.conf"));
    return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray();
}

// A widget's state as one text: "on"/"off", the selected or typed text, the
// number shown, the list joined with ",", the checked radio button of a
// group.
QString stateOf(QWidget *widget)
{
    if (auto *box = qobject_cast<QCheckBox *>(widget))
        return box->isChecked() ? QStringLiteral("on") : QStringLiteral("off");
    if (auto *group = qobject_cast<QGroupBox *>(widget)) {
        if (group->isCheckable())
            return group->isChecked() ? QStringLiteral("on") : QStringLiteral("off");
        for (QRadioButton *radio : group->findChildren<QRadioButton *>()) {
            if (radio->isChecked())
                return radio->objectName();
        }
        return QString();
    }
    if (auto *combo = qobject_cast<QComboBox *>(widget))
        return combo->currentText();
    if (auto *spin = qobject_cast<QDoubleSpinBox *>(widget))
        return QString::number(spin->value(), 'f', 2);
    if (auto *spin = qobject_cast<QSpinBox *>(widget))
        return QString::number(spin->value());
    if (auto *edit = qobject_cast<QLineEdit *>(widget))
        return edit->text();
    if (auto *text = qobject_cast<QPlainTextEdit *>(widget))
        return text->toPlainText();
    if (auto *list = qobject_cast<QListWidget *>(widget)) {
        QStringList texts;
        for (int row = 0; row < list->count(); ++row)
            texts << list->item(row)->text();
        return texts.join(QLatin1Char(','));
    }
    return QStringLiteral("<unknown widget>");
}

void setState(QWidget *widget, const QString &state)
{
    if (auto *box = qobject_cast<QCheckBox *>(widget))
        box->setChecked(state == QLatin1String("on"));
    else if (auto *group = qobject_cast<QGroupBox *>(widget); group && group->isCheckable())
        group->setChecked(state == QLatin1String("on"));
    else if (group)
        group->findChild<QRadioButton *>(state)->setChecked(true);
    else if (auto *combo = qobject_cast<QComboBox *>(widget))
        combo->setCurrentIndex(combo->findText(state));
    else if (auto *spin = qobject_cast<QDoubleSpinBox *>(widget))
        spin->setValue(state.toDouble());
    else if (auto *spin = qobject_cast<QSpinBox *>(widget))
        spin->setValue(state.toInt());
    else if (auto *edit = qobject_cast<QLineEdit *>(widget))
        edit->setText(state);
    else if (auto *list = qobject_cast<QListWidget *>(widget)) {
        list->clear();
        list->addItems(state.split(QLatin1Char(',')));
    }
}

// The lines of a configuration text but those of one key.
QList<QByteArray> linesWithout(const QByteArray &text, const QByteArray &key)
{
    QList<QByteArray> lines = text.split('\n');
    lines.erase(
        std::remove_if(lines.begin(), lines.end(), [&](const QByteArray &line) { return line.startsWith(key + '='); }),
        lines.end());
    return lines;
}

mode_t modeOf(const QString &file)
{
    struct stat status = {};
    return ::stat(QFile::encodeName(file).constData(), &status) == 0 ? status.st_mode & 07777 : 0;
}

ino_t inodeOf(const QString &file)
{
    struct stat status = {};
    return ::stat(QFile::encodeName(file).constData(), &status) == 0 ? status.st_ino : 0;
}

// Types into the input dialog and presses OK, or cancels it for a null text.
ModalHelper::Action input(const QString &text)
{
    return [text](QWidget *widget) {
        auto *dialog = qobject_cast<QInputDialog *>(widget);
        QVERIFY(dialog);
        if (text.isNull()) {
            dialog->reject();
            return;
        }
        dialog->setTextValue(text);
        dialog->accept();
    };
}

// The dialog over an engine on a fixture root, as the main window opens it.
struct Opened
{
    bool open(const FileMap &files)
    {
        return engine.load(files) && show();
    }
    // Over the engine as it is now.
    bool show()
    {
        before = engine.mainText();
        dialog = std::make_unique<COptionsDialog>(*engine.config);
        dialog->load();
        // Not modal: the modal helper answers only the boxes it opens.
        dialog->setWindowModality(Qt::NonModal);
        dialog->show();
        return true;
    }
    template <typename T = QWidget> T *child(const QString &name) const
    {
        return dialog->findChild<T *>(name);
    }
    // As the OK button does; true when the dialog closed and stored.
    bool accept()
    {
        dialog->accept();
        if (dialog->isVisible())
            return false;
        dialog->save();
        return true;
    }
    QString value(const QByteArray &key) const
    {
        return QString::fromUtf8(engine.config->value(key, absent.toUtf8()));
    }

    EngineFixture engine;
    std::unique_ptr<COptionsDialog> dialog;
    QByteArray before;
};

} // namespace

// The options dialog over the engine: each key from the file to its widget
// and back, the lines it does not change left as they are, the list and
// file editors, refused input, and the main window that runs it.
class TestOptionsDialog : public QObject
{
    Q_OBJECT

private Q_SLOTS:
    void initTestCase()
    {
        // Geometry and splitter state go to settings of the test's own.
        vexInit("1.2.13", "Program to control FTP server VSFTPD");
        QVERIFY(m_window.setUp());
    }

    void cleanup()
    {
        QCOMPARE(ModalHelper::shownWindow(), QString());
    }

    // Opened and accepted without a change, the configuration prints as it
    // was read, and no side file is written or made.
    void untouched_data()
    {
        QTest::addColumn<QByteArray>("text");
        QTest::newRow("every key") << allKeys;
        QTest::newRow("Debian's stock file") << debianStock();
        QTest::newRow("fixture") << FixtureRoot::defaults().value(conf);
        QTest::newRow("no listener, listed users confined")
            << QByteArray("listen=NO\nlisten_ipv6=NO\nchroot_list_enable=YES\n");
        QTest::newRow("values no widget can show")
            << QByteArray("listen=yes\nanon_max_rate=abc\nlisten_port=99999\nidle_session_timeout=-5\n"
                          "anon_umask=9\nchown_username=\nlisten_address=0.0.0.0\ncmds_allowed=\n"
                          "listen_address6=::\nftp_data_port=021\n");
    }
    void untouched()
    {
        QFETCH(QByteArray, text);
        QVERIFY(!text.isEmpty());
        Opened opened;
        QVERIFY(opened.open({{conf, text},
                             {QStringLiteral("/etc/vsftpd.banner"), "Hello\r\nthere"},
                             {QStringLiteral("/etc/banned"), "\n a@b.c \n"}}));
        const FileMap files = opened.engine.root.files();
        QVERIFY(opened.accept());
        QCOMPARE(opened.engine.mainText(), opened.before);
        QCOMPARE(opened.engine.root.files(), files);
    }

    // Every key: the file's value in its widget, and a change of the
    // widget written into that key's line alone. Rates are bytes per second
    // in the file, megabytes per second in the dialog. A key missing from the
    // file shows its default and, left so, is not written.
    void keys_data()
    {
        QTest::addColumn<QByteArray>("text");
        QTest::addColumn<QByteArray>("key");
        QTest::addColumn<QString>("widget");
        QTest::addColumn<QString>("shown");
        QTest::addColumn<QString>("changed");
        QTest::addColumn<QString>("written");
        const auto in = [](const char *name, const QByteArray &text, const char *key, const auto &widget,
                           const auto &shown, const auto &changed, const auto &written) {
            QTest::newRow(name) << text << QByteArray(key) << utf8(widget) << utf8(shown) << utf8(changed)
                                << utf8(written);
        };
        const auto row = [&in](const char *key, const auto &widget, const auto &shown, const auto &changed,
                               const auto &written) { in(key, allKeys, key, widget, shown, changed, written); };
        // A key's check box is named after it: guest_enable, guestEnableCheckBox.
        const auto toggles = [&in](bool on, std::initializer_list<const char *> keys) {
            for (const char *key : keys) {
                QString widget = QString::fromUtf8(key) + QStringLiteral("CheckBox");
                for (int at; (at = widget.indexOf(QLatin1Char('_'))) >= 0;)
                    widget.replace(at, 2, widget.at(at + 1).toUpper());
                in(key, allKeys, key, widget, on ? "on" : "off", on ? "off" : "on", on ? "NO" : "YES");
            }
        };
        toggles(true, {"guest_enable",          "local_enable",        "write_enable",         "allow_writeable_chroot",
                       "xferlog_enable",        "no_anon_password",    "connect_from_port_20", "session_support",
                       "ascii_download_enable", "ascii_upload_enable", "async_abor_enable",    "chown_uploads",
                       "delete_failed_uploads", "log_ftp_protocol",    "ls_recurse_enable",    "use_localtime",
                       "dirmessage_enable",     "dual_log_enable",     "force_dot_files",      "hide_ids"});
        toggles(false,
                {"anonymous_enable", "anon_world_readable_only", "pasv_enable", "port_enable", "download_enable",
                 "mdtm_write", "chmod_enable", "dirlist_enable"});
        const auto unset = [&in](const char *widget, const auto &shown) {
            in(widget, "listen=YES\n", "", widget, shown, shown, absent);
        };
        row("guest_username", "guestUsernameComboBox", "bob", "root", "root");
        row("ftpd_banner", "ftpdBannerLineEdit", "Welcome to the test server", "Hi", "Hi");
        row("banner_file", "bannerFileLineEdit", "/etc/vsftpd.banner", "/etc/issue.ftp", "/etc/issue.ftp");
        row("cmds_allowed", "commandsListWidget", "USER,PASS,QUIT", "USER,PASS", "USER,PASS");
        in("cmds_allowed unchecked", allKeys, "cmds_allowed", "cmdsAllowedGroupBox", "on", "off", absent);
        row("deny_file", "denyFileLineEdit", "{*.mp3,.private}", "", "<absent>");
        row("hide_file", "hideFileLineEdit", "{.hidden}", "{*.bak}", "{*.bak}");
        row("anon_max_rate", "anonMaxRateDoubleSpinBox", "0.01", "2.50", "2621440");
        row("ftp_username", "ftpUsernameComboBox", "alice", "ftp", "ftp");
        row("anon_umask", "anonUmaskLineEdit", "022", "027", "027");
        row("chown_upload_mode", "chownUploadModeLineEdit", "0644", "0600", "0600");
        row("chown_username", "chownUsernameComboBox", "nosuchuser", "root", "root");
        row("banned_email_file", "bannedEmailFileLineEdit", "/etc/banned", "", "<absent>");
        in("deny_email_enable", allKeys, "deny_email_enable", "denyEmailEnableGroupBox", "on", "off", "NO");
        row("delay_failed_login", "delayFailedLoginSpinBox", "5", "0", "0");
        row("delay_successful_login", "delaySuccessfulLoginSpinBox", "2", "3", "3");
        row("idle_session_timeout", "idleSessionTimeoutSpinBox", "600", "2147483647", "2147483647");
        row("ftp_data_port", "ftpDataPortSpinBox", "2020", "65535", "65535");
        row("listen_port", "listenPortSpinBox", "2121", "21", "21");
        row("max_clients", "maxClientsSpinBox", "50", "0", "0");
        row("max_per_ip", "maxPerIpSpinBox", "4", "10", "10");
        row("listen", "listenerComboBox", both, "IPv6 (and IPv4 where the system maps it)", "NO");
        row("listen_ipv6", "listenerComboBox", both, "IPv4", "NO");
        row("listen_address", "listenAddressComboBox", "192.0.2.7", allInterfaces, "0.0.0.0");
        row("listen_address6", "listenAddress6ComboBox", "2001:db8::7", allInterfaces, "::");
        row("local_max_rate", "localMaxRateDoubleSpinBox", "1.00", "0.01", "10240");
        row("local_umask", "localUmaskLineEdit", "022", "002", "002");
        row("chroot_list_enable", "chrootChoiceGroupBox", "chrootAllButListedRadioButton", "chrootAllRadioButton",
            "NO");
        row("chroot_local_user", "chrootChoiceGroupBox", "chrootAllButListedRadioButton", "chrootListedRadioButton",
            "NO");
        row("chroot_list_file", "chrootListFileLineEdit", "/etc/chroot_users", "/etc/vsftpd.chroot_list",
            "/etc/vsftpd.chroot_list");
        row("message_file", "messageFileLineEdit", ".welcome", "/srv/ftp/.message", "/srv/ftp/.message");
        in("a rate read as strtod reads", "listen=YES\nlocal_max_rate=2.5e6x\n", "local_max_rate",
           "localMaxRateDoubleSpinBox", "2.38", "0.50", "524288");
        in("a rate that is no number", "listen=YES\nlocal_max_rate=fast\n", "local_max_rate",
           "localMaxRateDoubleSpinBox", "0.00", "4095.99", "4294956032");
        in("a rate absent is unlimited", "listen=YES\n", "anon_max_rate", "anonMaxRateDoubleSpinBox", "0.00", "2.50",
           "2621440");
        unset("listenPortSpinBox", "21");
        unset("messageFileLineEdit", ".message");
        unset("ftpDataPortSpinBox", "20");
        unset("idleSessionTimeoutSpinBox", "300");
        unset("delayFailedLoginSpinBox", "1");
        unset("anonUmaskLineEdit", "077");
        unset("chownUploadModeLineEdit", "0600");
        unset("chownUsernameComboBox", "root");
        unset("guestUsernameComboBox", "ftp");
        unset("bannedEmailFileLineEdit", "/etc/vsftpd.banned_emails");
        unset("chrootListFileLineEdit", "/etc/vsftpd.chroot_list");
        unset("anonymousEnableCheckBox", "on");
        unset("mdtmWriteCheckBox", "on");
        unset("localEnableCheckBox", "off");
        unset("cmdsAllowedGroupBox", "off");
        unset("listenerComboBox", "IPv4");
        unset("listenAddressComboBox", allInterfaces);
        unset("chrootChoiceGroupBox", "chrootNobodyRadioButton");
    }
    void keys()
    {
        QFETCH(QByteArray, text);
        QFETCH(QByteArray, key);
        QFETCH(QString, widget);
        QFETCH(QString, shown);
        QFETCH(QString, changed);
        QFETCH(QString, written);
        Opened opened;
        QVERIFY(opened.open({{conf, text}}));
        QWidget *edited = opened.child(widget);
        QVERIFY2(edited, qPrintable(widget));
        QCOMPARE(stateOf(edited), shown);
        setState(edited, changed);
        QCOMPARE(stateOf(edited), changed);
        QVERIFY(opened.accept());
        QCOMPARE(opened.value(key), written);
        QCOMPARE(linesWithout(opened.engine.mainText(), key), linesWithout(opened.before, key));
    }

    // The add buttons of the command and e-mail lists: what is asked, what
    // is refused, what is added.
    void listInput_data()
    {
        QTest::addColumn<QString>("button");
        QTest::addColumn<QString>("text");
        QTest::addColumn<QString>("warning");
        QTest::addColumn<QString>("list");
        // A null text cancels the input dialog.
        const auto row
            = [](const char *name, const char *button, const char *text, const char *warning, const char *list) {
                  QTest::newRow(name) << QString::fromUtf8(button) << QString::fromUtf8(text)
                                      << QString::fromUtf8(warning) << QString::fromUtf8(list);
              };
        const char *command = "addCommandPushButton";
        const char *email = "addEmailPushButton";
        row("command cancelled", command, nullptr, "", "USER,PASS");
        row("command empty", command, "", "", "USER,PASS");
        row("command", command, "STOR", "", "USER,PASS,STOR");
        row("command twice", command, "PASS", "", "USER,PASS");
        row("command with a blank", command, "RE TR", "Bad command name: RE TR", "USER,PASS");
        row("command with a comma", command, "A,B", "Bad command name: A,B", "USER,PASS");
        row("address cancelled", email, nullptr, "", "old@example.org");
        row("address", email, "new.one@example.org", "", "old@example.org,new.one@example.org");
        row("address twice", email, "old@example.org", "", "old@example.org");
        for (const char *bad : {"a@b", "ab.c", "a b@c.d", "@b.c", "a@b.c.", "a@@b.c"})
            row(bad, email, bad, QStringLiteral("Bad email address: %1").arg(QLatin1String(bad)).toUtf8().constData(),
                "old@example.org");
    }
    void listInput()
    {
        QFETCH(QString, button);
        QFETCH(QString, text);
        QFETCH(QString, warning);
        QFETCH(QString, list);
        Opened opened;
        QVERIFY(opened.open({{conf, "listen=YES\ncmds_allowed=USER,PASS\ndeny_email_enable=YES\n"},
                             {QStringLiteral("/etc/vsftpd.banned_emails"), "old@example.org\n"}}));
        ModalHelper modal;
        modal.expect(QString(), input(text));
        if (!warning.isEmpty())
            modal.expect(warning, QStringLiteral("OK"));
        opened.child<QPushButton>(button)->click();
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        const bool commands = button == QLatin1String("addCommandPushButton");
        QCOMPARE(
            stateOf(opened.child(commands ? QStringLiteral("commandsListWidget") : QStringLiteral("emailsListWidget"))),
            list);
        if (!warning.isEmpty())
            QCOMPARE(modal.seen().last().title, QStringLiteral("Warning!"));
    }

    // Delete and move buttons act only on a list with something in it.
    void buttonRules()
    {
        Opened opened;
        QVERIFY(opened.open({{conf, "listen=YES\ncmds_allowed=USER\nchroot_list_enable=YES\n"},
                             {QStringLiteral("/etc/vsftpd.chroot_list"), "bob\n"}}));
        auto *commands = opened.child<QListWidget>(QStringLiteral("commandsListWidget"));
        auto *remove = opened.child<QPushButton>(QStringLiteral("deleteCommandPushButton"));
        auto *emailRemove = opened.child<QPushButton>(QStringLiteral("deleteEmailPushButton"));
        QVERIFY(remove->isEnabled());
        QVERIFY(!emailRemove->isEnabled());
        commands->setCurrentRow(0);
        remove->click();
        QCOMPARE(commands->count(), 0);
        QVERIFY(!remove->isEnabled());
        opened.dialog->deleteCommandListElement();
        opened.dialog->deleteEmailListElement();
        QCOMPARE(commands->count(), 0);

        auto *users = opened.child<QListWidget>(QStringLiteral("usersListWidget"));
        auto *listed = opened.child<QListWidget>(QStringLiteral("chrootUsersListWidget"));
        auto *right = opened.child<QToolButton>(QStringLiteral("moveRightToolButton"));
        auto *left = opened.child<QToolButton>(QStringLiteral("moveLeftToolButton"));
        QCOMPARE(stateOf(listed), QStringLiteral("bob"));
        QVERIFY(right->isEnabled() && left->isEnabled());
        users->selectAll();
        right->click();
        QCOMPARE(users->count(), 0);
        QVERIFY(!right->isEnabled() && left->isEnabled());
        listed->selectAll();
        left->click();
        QCOMPARE(listed->count(), 0);
        QVERIFY(right->isEnabled() && !left->isEnabled());
        QCOMPARE(users->count(), FixtureRoot::defaults().value(QStringLiteral("/etc/passwd")).count('\n'));
    }

    // Refused input leaves the dialog open with nothing stored or written.
    void badInput_data()
    {
        QTest::addColumn<QString>("widget");
        QTest::addColumn<QString>("text");
        QTest::addColumn<QString>("warning");
        const auto row = [](const char *widget, const char *text, const char *warning) {
            QTest::newRow(widget) << QString::fromUtf8(widget) << QString::fromUtf8(text) << QString::fromUtf8(warning);
        };
        row("anonUmaskLineEdit", "8", "anon_umask: \"8\" is not an octal number such as 022.");
        row("localUmaskLineEdit", "", "local_umask: \"\" is not an octal number such as 022.");
        row("chownUploadModeLineEdit", "06x0", "chown_upload_mode: \"06x0\" is not an octal number such as 022.");
        row("listenPortSpinBox", "70000", "listen_port: \"70000\" is not a number from 0 to 65535.");
        row("maxClientsSpinBox", "", "max_clients: \"\" is not a number from 0 to 2147483647.");
        const auto control = [](const char *name, const char *widget, const char *text, const char *key) {
            QTest::newRow(name) << QString::fromUtf8(widget) << QString::fromUtf8(text)
                                << QString::fromUtf8(key)
                    + QStringLiteral(": Line breaks and control characters cannot be stored.");
        };
        control("banner path", "bannerFileLineEdit", "/etc/banner\nx", "banner_file");
        control("chroot path", "chrootListFileLineEdit", "/etc/list\r", "chroot_list_file");
        control("e-mail path", "bannedEmailFileLineEdit", "/etc/\tbanned", "banned_email_file");
        control("message path", "messageFileLineEdit", ".message\n", "message_file");
        control("banner", "ftpdBannerLineEdit", "Hello\nworld", "ftpd_banner");
    }
    void badInput()
    {
        QFETCH(QString, widget);
        QFETCH(QString, text);
        QFETCH(QString, warning);
        Opened opened;
        QVERIFY(opened.open({{conf, "listen=YES\nbanner_file=/etc/vsftpd.banner\n"}}));
        // Changes beside the refused one, which must not be stored or
        // written either.
        opened.child<QCheckBox>(QStringLiteral("hideIdsCheckBox"))->setChecked(true);
        opened.child<QPlainTextEdit>(QStringLiteral("bannerFileTextEdit"))->setPlainText(QStringLiteral("hi"));
        QWidget *edited = opened.child(widget);
        if (auto *spin = qobject_cast<QAbstractSpinBox *>(edited))
            edited = spin->findChild<QLineEdit *>();
        qobject_cast<QLineEdit *>(edited)->setText(text);
        const FileMap files = opened.engine.root.files();
        ModalHelper modal;
        modal.expect(warning, QStringLiteral("OK"));
        QVERIFY(!opened.accept());
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QVERIFY(opened.dialog->isVisible());
        QCOMPARE(opened.engine.mainText(), opened.before);
        QCOMPARE(opened.engine.root.files(), files);
        opened.dialog->reject();
    }

    // The side files: written on acceptance when their content changed,
    // their modes kept, a missing one made only with something in it, the
    // chroot list the table changed shown and kept by the engine.
    void sideFiles()
    {
        Opened opened;
        const QString banner = QStringLiteral("/etc/vsftpd.banner");
        const QString banned = QStringLiteral("/etc/banned");
        const QString message = QStringLiteral("/srv/ftp/.message");
        const QString chroot = QStringLiteral("/etc/chroot_users");
        QVERIFY(opened.engine.write({{conf,
                                      "listen=YES\nbanner_file=/etc/vsftpd.banner\nbanned_email_file=/etc/banned\n"
                                      "message_file=/srv/ftp/.message\nchroot_list_enable=YES\n"
                                      "chroot_list_file=/etc/chroot_users\n"}}));
        QVERIFY(opened.engine.root.writeFile(banner, "Hello\n", 0640));
        QVERIFY(opened.engine.root.writeFile(banned, "old@example.org\n", 0600));
        QVERIFY(opened.engine.start());
        // A change of the table, not saved yet.
        opened.engine.config->chrootList().append(QStringLiteral("alice"));
        QVERIFY(opened.show());

        auto *listed = opened.child<QListWidget>(QStringLiteral("chrootUsersListWidget"));
        auto *users = opened.child<QListWidget>(QStringLiteral("usersListWidget"));
        QCOMPARE(stateOf(listed), QStringLiteral("alice"));
        QVERIFY(users->findItems(QStringLiteral("alice"), Qt::MatchExactly).isEmpty());
        QCOMPARE(opened.child<QPlainTextEdit>(QStringLiteral("bannerFileTextEdit"))->toPlainText(),
                 QStringLiteral("Hello"));
        QCOMPARE(stateOf(opened.child(QStringLiteral("emailsListWidget"))), QStringLiteral("old@example.org"));

        opened.child<QPlainTextEdit>(QStringLiteral("bannerFileTextEdit"))->setPlainText(QStringLiteral("Welcome"));
        opened.child<QListWidget>(QStringLiteral("emailsListWidget"))->addItem(QStringLiteral("new@example.org"));
        opened.child<QPlainTextEdit>(QStringLiteral("messageFileTextEdit"))->setPlainText(QStringLiteral("Read me\n"));
        users->findItems(QStringLiteral("bob"), Qt::MatchExactly).first()->setSelected(true);
        opened.child<QToolButton>(QStringLiteral("moveRightToolButton"))->click();
        QVERIFY(opened.accept());

        const TemporaryRoot &root = opened.engine.root;
        QCOMPARE(root.readFile(banner), QByteArray("Welcome\n"));
        QCOMPARE(modeOf(root.filePath(banner)), mode_t(0640));
        QCOMPARE(root.readFile(banned), QByteArray("old@example.org\nnew@example.org\n"));
        QCOMPARE(modeOf(root.filePath(banned)), mode_t(0600));
        QCOMPARE(root.readFile(message), QByteArray("Read me\n"));
        QCOMPARE(root.readFile(chroot), QByteArray("alice\nbob\n"));
        QCOMPARE(opened.engine.mainText(), opened.before);
        QCOMPARE(opened.engine.config->chrootList().names(), strings("alice", "bob"));
        // The save finds the list as the dialog wrote it and leaves it.
        const ino_t written = inodeOf(root.filePath(chroot));
        opened.engine.config->save();
        QCOMPARE(inodeOf(root.filePath(chroot)), written);

        // A file that cannot be written is named with the reason; the
        // dialog stays open.
        Opened failing;
        QVERIFY(failing.open({{conf, "listen=YES\nbanner_file=/no/such/dir/banner\n"}}));
        failing.child<QPlainTextEdit>(QStringLiteral("bannerFileTextEdit"))->setPlainText(QStringLiteral("x"));
        ModalHelper modal;
        QString shown;
        modal.expect(QString(), [&shown](QWidget *widget) {
            shown = qobject_cast<QMessageBox *>(widget)->text();
            ModalHelper::press(widget, QStringLiteral("OK"));
        });
        QVERIFY(!failing.accept());
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QVERIFY2(shown.startsWith(QLatin1String("Unable to write /no/such/dir/banner: ")) && shown.size() > 37,
                 qPrintable(shown));
        QVERIFY(!failing.engine.root.exists(QStringLiteral("/no/such/dir/banner")));
        failing.dialog->reject();
    }

    // The size and the splitter as the dialog was left, the next time.
    void remembersLayout()
    {
        QSettings().clear();
        for (const QSize size : {QSize(700, 500), QSize(600, 450)}) {
            Opened opened;
            QVERIFY(opened.open({{conf, "listen=YES\n"}}));
            auto *splitter = opened.child<QSplitter>(QStringLiteral("pagesSplitter"));
            if (size == QSize(600, 450)) {
                QCOMPARE(opened.dialog->size(), QSize(700, 500));
                QCOMPARE(splitter->sizes().first(), 250);
            }
            opened.dialog->resize(size);
            splitter->setSizes({250, size.width() - 250});
            opened.dialog->reject();
        }
    }

    // Each file chooser puts the chosen file, as the administrator knows
    // it inside the root, into its line edit and loads its editor.
    void choosers_data()
    {
        QTest::addColumn<QString>("button");
        QTest::addColumn<QString>("title");
        QTest::addColumn<bool>("startsAtPath");
        QTest::addColumn<QString>("chosen");
        QTest::addColumn<QString>("edit");
        QTest::addColumn<QString>("editor");
        QTest::addColumn<QString>("shown");
        const auto row = [](const char *button, const char *title, bool startsAtPath, const char *chosen,
                            const char *edit, const char *editor, const char *shown) {
            QTest::newRow(button) << QString::fromUtf8(button) << QString::fromUtf8(title) << startsAtPath
                                  << QString::fromUtf8(chosen) << QString::fromUtf8(edit) << QString::fromUtf8(editor)
                                  << QString::fromUtf8(shown);
        };
        row("bannedEmailFileToolButton", "Select file with e-mail addresses", true, "/etc/other/emails",
            "bannedEmailFileLineEdit", "emailsListWidget", "x@example.org");
        row("chrootListFileToolButton", "Point to file", false, "/etc/other/chroot", "chrootListFileLineEdit",
            "chrootUsersListWidget", "bob");
        row("bannerFileToolButton", "Point to file", false, "/etc/other/banner", "bannerFileLineEdit",
            "bannerFileTextEdit", "Hi\nthere");
        row("messageFileToolButton", "Select per-directory message file", true, "/etc/other/message",
            "messageFileLineEdit", "messageFileTextEdit", "Read me");
    }
    void choosers()
    {
        QFETCH(QString, button);
        QFETCH(QString, title);
        QFETCH(bool, startsAtPath);
        QFETCH(QString, chosen);
        QFETCH(QString, edit);
        QFETCH(QString, editor);
        QFETCH(QString, shown);
        Opened opened;
        const TemporaryRoot &root = opened.engine.root;
        QVERIFY(opened.open({{conf,
                              "listen=YES\ndeny_email_enable=YES\nchroot_list_enable=YES\n"
                              "dirmessage_enable=YES\nmessage_file=/etc/vsftpd.message\n"
                              "banner_file=/etc/vsftpd.banner\n"},
                             {QStringLiteral("/etc/other/emails"), "x@example.org\n"},
                             {QStringLiteral("/etc/other/chroot"), "bob\n"},
                             {QStringLiteral("/etc/other/banner"), "Hi\nthere\n"},
                             {QStringLiteral("/etc/other/message"), "Read me\n"}}));
        ModalHelper modal;
        modal.expect(title, [&](QWidget *dialog) {
            auto *files = qobject_cast<QFileDialog *>(dialog);
            QVERIFY(files);
            if (startsAtPath)
                QCOMPARE(files->directory().absolutePath(), root.filePath(QStringLiteral("/etc")));
            files->findChild<QLineEdit *>(QStringLiteral("fileNameEdit"))->setText(root.filePath(chosen));
            static_cast<QDialog *>(files)->accept(); // as its Open button does
        });
        opened.child<QToolButton>(button)->click();
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QCOMPARE(stateOf(opened.child(edit)), chosen);
        QCOMPARE(stateOf(opened.child(editor)), shown);
    }

    // The window's Options action: accepted, the verdicts follow the new
    // options and the window has unsaved changes; cancelled, nothing.
    void mainWindow_data()
    {
        QTest::addColumn<QString>("button");
        QTest::addColumn<bool>("unsaved");
        QTest::addColumn<QString>("bob");
        QTest::newRow("accepted") << QStringLiteral("OK") << true << AppStrings::instance().denied;
        QTest::newRow("cancelled") << QStringLiteral("Cancel") << false << AppStrings::instance().allowed;
    }
    void mainWindow()
    {
        QFETCH(QString, button);
        QFETCH(bool, unsaved);
        QFETCH(QString, bob);
        QVERIFY(m_window.open());
        QCOMPARE(m_window.cell(QStringLiteral("bob"), TreeModel::StatusColumn), AppStrings::instance().allowed);
        QAction *options = m_window.action("actionOptions");
        QVERIFY(options->isEnabled());
        ModalHelper modal;
        modal.expect(QStringLiteral("Options"), [button](QWidget *widget) {
            widget->findChild<QCheckBox *>(QStringLiteral("localEnableCheckBox"))->setChecked(false);
            QVERIFY(ModalHelper::press(widget, button));
        });
        options->trigger();
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QCOMPARE(m_window.cell(QStringLiteral("bob"), TreeModel::StatusColumn), bob);
        QCOMPARE(m_window.action("actionSave")->isEnabled(), unsaved);
        QCOMPARE(m_window.window->model()->config().value("local_enable"), QByteArray(unsaved ? "NO" : "YES"));
        QCOMPARE(m_window.close(), QString());
    }

private:
    WindowFixture m_window;
};

FTPCONFIG_TEST_MAIN(TestOptionsDialog)
#include "TestOptionsDialog.moc"

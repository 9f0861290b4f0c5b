#include "FixtureRoot.h"
#include "Process.h"
#include "TestMain.h"
#include "TestStrings.h"
#include "accounts/VirtualUserDb.h"

#include <QTemporaryDir>
#include <QtTest>

#include <sys/stat.h>

namespace {

const QString Ctl = QStringLiteral(FTPCONFIG_CTL);
const QByteArray Backup = ".ftpconfig-bak";
using Passwords = QMap<QByteArray, QByteArray>;

// A fixture root with the virtual user "vic" (password "secret") and a
// main configuration only its owner may read.
struct CtlRoot : FixtureRoot
{
    CtlRoot()
    {
        write({{QStringLiteral("/etc/vsftpd.conf"),
                "listen=YES\nlocal_enable=YES\nchroot_local_user=NO\nuserlist_enable=YES\nuserlist_deny=NO\n"},
               {QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf"), "alice\n"},
               {QStringLiteral("/home/bob/.profile"), "# bob\n"},
               {QStringLiteral("/etc/pam.d/vsftpd"),
                "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                "@include common-account\n@include common-auth\n"}});
        ::chmod(QFile::encodeName(filePath(QStringLiteral("/etc/vsftpd.conf"))).constData(), 0640);
        writeVirtualUsers(QStringLiteral("/etc/vsftpd/virtual.db"), {{"vic", "secret"}});
    }

    ProcessResult run(const QStringList &arguments, const QByteArray &input = {}) const
    {
        // The PAM check's "Valid" answer lives in the settings: keep the
        // administrator's own out of the test.
        qputenv("XDG_CONFIG_HOME", QFile::encodeName(m_settings.path()));
        return runProcess(Ctl, QStringList{QStringLiteral("--root"), path()} + arguments, input, 60000);
    }

    Passwords virtualUsers() const
    {
        VirtualUserDb db("/etc/vsftpd/virtual", RootDirectory(path()), VirtualUserDb::Access::ReadOnly);
        Passwords users;
        for (const auto &[name, password] : db.readAll())
            users.insert(name, password);
        return users;
    }

private:
    QTemporaryDir m_settings;
};

// The text files and the backups, without the binary database.
FileMap textFiles(const FileMap &files)
{
    FileMap texts;
    for (auto it = files.begin(); it != files.end(); ++it) {
        if (!it.key().endsWith(QLatin1String(".db")) && !it.key().endsWith(QLatin1String(".db.ftpconfig-bak")))
            texts.insert(it.key(), it.value());
    }
    return texts;
}

QStringList backupsOf(const FileMap &files)
{
    QStringList backups;
    for (const QString &path : files.keys()) {
        if (path.endsWith(QLatin1String(Backup)))
            backups << path.chopped(Backup.size());
    }
    return backups;
}

int modeOf(const QString &path)
{
    struct stat info
    {
    };
    ::lstat(QFile::encodeName(path).constData(), &info);
    return int(info.st_mode & 07777);
}

} // namespace

class TestCtl : public QObject
{
    Q_OBJECT

private slots:
    void commands_data()
    {
        QTest::addColumn<QStringList>("arguments");
        QTest::addColumn<QByteArray>("input");
        // A line each changed file must hold afterwards, by path.
        QTest::addColumn<FileMap>("lines");
        QTest::addColumn<QByteArray>("planLine"); // of the dry run, for the database
        QTest::addColumn<Passwords>("virtualUsers");

        const Passwords vic{{"vic", "secret"}};
        const QString conf = QStringLiteral("/etc/vsftpd.conf");
        const QString userlist = QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf");
        const QString bob = QStringLiteral("/etc/vsftpd.d/users.d/bob");
        const auto row = [](const char *command, const QByteArray &input, const FileMap &lines,
                            const QByteArray &planLine, const Passwords &users) {
            QTest::newRow(command) << words(command) << input << lines << planLine << users;
        };
        row("allow bob", {}, {{userlist, "alice\nbob\n"}, {conf, "userlist_enable=yes\n"}}, {}, vic);
        // The allowed list becomes a list of the denied: asked, and emptied.
        row("--yes deny bob", {}, {{userlist, "bob\n"}, {conf, "userlist_deny=yes\n"}}, {}, vic);
        row("--yes root bob /srv/bob", {},
            {{bob, "local_root=/srv/bob\n"}, {QStringLiteral("/etc/vsftpd.chroot_list"), "bob\n"}}, {}, vic);
        row("rights bob write,download", {}, {{bob, "anon_upload_enable=no\n"}}, {}, vic);
        row("set ftpd_banner Hi", {}, {{conf, "ftpd_banner=Hi\n"}}, {}, vic);
        row("unset chroot_local_user", {}, {{conf, "local_enable=YES\n"}}, {}, vic);
        row("vuser add eve", "pw eve\n", {}, "virtual user added to /etc/vsftpd/virtual.db: eve\n",
            {{"vic", "secret"}, {"eve", "pw eve"}});
        row("vuser passwd vic", "new\n", {}, "virtual user changed in /etc/vsftpd/virtual.db: vic (password)\n",
            {{"vic", "new"}});
        row("vuser del vic", {}, {}, "virtual user removed from /etc/vsftpd/virtual.db: vic\n", {});
    }

    // Each command twice on the same root: a dry run writes nothing, and its
    // diff, applied with patch to the files as they were, gives byte for byte
    // what the real run then writes; the real run keeps each file it replaces.
    void commands()
    {
        QFETCH(QStringList, arguments);
        QFETCH(QByteArray, input);
        QFETCH(FileMap, lines);
        QFETCH(QByteArray, planLine);
        QFETCH(Passwords, virtualUsers);

        CtlRoot root;
        const FileMap before = root.files();
        const auto dry = root.run(QStringList{QStringLiteral("--dry-run")} + arguments, input);
        QVERIFY2(dry.finished && dry.exitCode == 0, dry.err.constData());
        QCOMPARE(root.files(), before);
        QVERIFY2(planLine.isEmpty() == !dry.out.contains("virtual user"), dry.out.constData());
        QVERIFY2(dry.out.startsWith(planLine), dry.out.constData());
        QVERIFY(!dry.out.contains("secret") && (input.isEmpty() || !dry.out.contains(input.trimmed())));

        const auto real = root.run(arguments, input);
        QVERIFY2(real.finished && real.exitCode == 0, real.err.constData());
        const FileMap after = root.files();
        QCOMPARE(root.virtualUsers(), virtualUsers);

        QString why;
        const FileMap patched = textFiles(patchedFiles(before, dry.out, why));
        QVERIFY2(why.isEmpty(), qPrintable(why));
        FileMap written = textFiles(after);
        for (const QString &path : backupsOf(after))
            written.remove(path + QLatin1String(Backup));
        for (const QString &path : patched.keys() + written.keys())
            QVERIFY2(patched.value(path, "<none>") == written.value(path, "<none>"),
                     qPrintable(path + QStringLiteral(":\n") + QString::fromUtf8(patched.value(path, "<none>"))
                                + QStringLiteral("\nwritten:\n") + QString::fromUtf8(written.value(path, "<none>"))));

        for (auto it = lines.begin(); it != lines.end(); ++it)
            QVERIFY2(after.value(it.key()).contains(*it),
                     qPrintable(it.key() + QLatin1Char('\n') + QString::fromUtf8(after.value(it.key()))));
        // Every file replaced, the database included, is kept as it was with
        // its mode; a file that did not exist is kept as nothing.
        QStringList replaced;
        for (auto it = before.begin(); it != before.end(); ++it) {
            if (after.value(it.key()) != *it)
                replaced << it.key();
        }
        QCOMPARE(backupsOf(after), replaced);
        for (const QString &path : replaced) {
            QCOMPARE(after.value(path + QLatin1String(Backup)), before.value(path));
            const int mode = path.endsWith(QLatin1String(".db")) ? 0600 : modeOf(root.filePath(path));
            QCOMPARE(modeOf(root.filePath(path + QLatin1String(Backup))), mode);
        }
        QVERIFY(!replaced.isEmpty());
    }

    void refusals_data()
    {
        QTest::addColumn<QStringList>("arguments");
        QTest::addColumn<QByteArray>("input");
        QTest::addColumn<int>("status");
        QTest::addColumn<QByteArray>("message");

        const auto row
            = [](const char *name, const QStringList &arguments, const QByteArray &input, int status,
                 const QByteArray &message) { QTest::newRow(name) << arguments << input << status << message; };
        const QByteArray onStdin = "a password is read from standard input, never from the command line";
        row("question without --yes", words("root bob /srv/bob"), {}, 2,
            "a question needs an answer (run with --yes to accept its repair):\nThis user is not chroot'ed");
        row("password argument", words("vuser add eve pw"), "pw\n", 2, onStdin);
        row("password option", words("--password=pw vuser add"), {}, 2, onStdin);
        row("no password", words("vuser add eve"), {}, 1, "no password on standard input");
        row("bad name", words("vuser add .eve"), "pw\n", 1,
            "\".eve\" cannot be a user name: the name begins with \".\".");
        row("name of an account", words("vuser add bob"), "pw\n", 1, "A user named bob exists already.");
        row("virtual user twice", words("vuser add vic"), "pw\n", 1, "User vic allready exists in users database.");
        row("no such virtual user", words("vuser del bob"), {}, 1,
            "Unable to find information about virtual user bob in database.");
        row("unknown key", words("set no_such_key yes"), {}, 1,
            "unknown setting \"no_such_key\": vsftpd stops (unrecognised variable in config file)");
        row("bad bool", words("set listen maybe"), {}, 1, "listen=\"maybe\" is not a yes/no value");
        row("bad number", words("set listen_port 21a"), {}, 1, "listen_port=\"21a\" is not a number");
        row("unknown user", words("allow ghost"), {}, 1, "no user named ghost");
        row("refused allow", words("allow locked"), {}, 1,
            "Unable to change access status.\n***Result: FALSE. Check: user locked  has bad passwd");
        row("unknown right", words("rights bob") << QStringLiteral("write, fly"), {}, 1, "\"fly\" is no right");
        row("relative root", words("root bob srv"), {}, 1, "The directory must be an absolute path.");
        row("unknown command", words("frobnicate"), {}, 2, "unknown command: frobnicate");
        row("missing argument", words("set listen"), {}, 2, "set takes 2 argument(s)");
    }

    void refusals()
    {
        QFETCH(QStringList, arguments);
        QFETCH(QByteArray, input);
        QFETCH(int, status);
        QFETCH(QByteArray, message);

        CtlRoot root;
        const FileMap before = root.files();
        const auto result = root.run(arguments, input);
        QVERIFY(result.finished);
        QCOMPARE(result.exitCode, status);
        QVERIFY2(result.err.contains("ftpconfig-ctl: " + message), result.err.constData());
        QCOMPARE(root.files(), before);
    }

    void listAndGet()
    {
        CtlRoot root;
        const auto list = root.run(words("list"));
        const auto json = root.run(words("list --json"));
        const auto get = root.run(words("get local_enable"));
        const auto unset = root.run(words("get ftpd_banner"));
        QCOMPARE(get.exitCode, 0);
        QCOMPARE(get.out, QByteArray("YES\n"));
        QCOMPARE(unset.exitCode, 1);
        QVERIFY(list.exitCode == 0 && list.out.contains("vic") && list.out.contains("bob"));
        QVERIFY(json.exitCode == 0 && json.out.startsWith('{') && json.out.contains("\"vic\""));
    }
};

FTPCONFIG_TEST_GUILESS_MAIN(TestCtl)

#include "TestCtl.moc"

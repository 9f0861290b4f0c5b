#include "FixtureRoot.h"
#include "Process.h"
#include "TestMain.h"

#include <QCryptographicHash>
#include <QDirIterator>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QtTest>

#include <sys/stat.h>

namespace {

const QString Report = QStringLiteral(FTPCONFIG_REPORT);

ProcessResult report(const QStringList &arguments)
{
    // The report honours the PAM check's "Valid" setting: keep the
    // administrator's own settings out of the test.
    qputenv("XDG_CONFIG_HOME", QByteArray(QDir::tempPath().toUtf8() + "/ftpconfig-report-test-config"));
    return runProcess(Report, arguments, {}, 60000);
}

// Every entry below the root with its type, mode, size and content digest.
QStringList snapshot(const QString &root)
{
    QStringList entries;
    QDirIterator it(root, QDir::AllEntries | QDir::Hidden | QDir::System | QDir::NoDotAndDotDot,
                    QDirIterator::Subdirectories);
    while (it.hasNext()) {
        const QString path = it.next();
        struct stat info
        {
        };
        ::lstat(QFile::encodeName(path).constData(), &info);
        QByteArray digest;
        if (S_ISREG(info.st_mode)) {
            QFile file(path);
            if (file.open(QIODevice::ReadOnly))
                digest = QCryptographicHash::hash(file.readAll(), QCryptographicHash::Sha256).toHex();
        }
        entries << QStringLiteral("%1 %2 %3 %4")
                       .arg(path.mid(root.size()))
                       .arg(info.st_mode, 0, 8)
                       .arg(info.st_size)
                       .arg(QString::fromLatin1(digest));
    }
    entries.sort();
    return entries;
}

QJsonObject userOf(const QJsonDocument &document, const QString &name)
{
    const QJsonArray users = document.object().value(QStringLiteral("users")).toArray();
    for (const QJsonValue &user : users) {
        if (user.toObject().value(QStringLiteral("name")).toString() == name)
            return user.toObject();
    }
    return {};
}

} // namespace

class TestReport : public QObject
{
    Q_OBJECT

private slots:
    void badRoots_data();
    void badRoots();
    void table();
    void json_data();
    void json();
    void createsNothing();
    void hostileFiles_data();
    void hostileFiles();
};

void TestReport::badRoots_data()
{
    QTest::addColumn<QByteArray>("kind");
    QTest::addColumn<int>("status");
    QTest::addColumn<QByteArray>("error"); // "%1": the root

    QTest::newRow("missing root") << QByteArray("missing") << 2 << QByteArray("cannot read root %1: no such directory");
    QTest::newRow("root is a file") << QByteArray("file") << 2 << QByteArray("cannot read root %1: not a directory");
    QTest::newRow("unknown option") << QByteArray("option") << 2 << QByteArray("unknown argument: --frobnicate");
    QTest::newRow("no PAM file") << QByteArray("nopam") << 255
                                 << QByteArray("Initialization error: Unable to find /etc/pam.d/vsftpd");
    QTest::newRow("main configuration is a directory")
        << QByteArray("maindir") << 255 << QByteArray("Initialization error: Unable to open /etc/vsftpd.conf");
}

void TestReport::badRoots()
{
    QFETCH(QByteArray, kind);
    QFETCH(int, status);
    QFETCH(QByteArray, error);

    FixtureRoot root;
    QString rootPath = root.path();
    QStringList arguments;
    if (kind == "missing") {
        rootPath = root.filePath(QStringLiteral("/does/not/exist"));
    } else if (kind == "file") {
        QVERIFY(root.writeFile(QStringLiteral("/plain"), "x"));
        rootPath = root.filePath(QStringLiteral("/plain"));
    } else if (kind == "option") {
        arguments << QStringLiteral("--frobnicate");
    } else if (kind == "nopam") {
        QVERIFY(root.write({{QStringLiteral("/etc/pam.d/vsftpd"), QByteArray()}}));
    } else {
        QVERIFY(root.write({{QStringLiteral("/etc/vsftpd.conf"), QByteArray()}}));
        QVERIFY(root.makeDirectory(QStringLiteral("/etc/vsftpd.conf")));
    }
    const ProcessResult result = report(arguments << QStringLiteral("--root") << rootPath);
    QVERIFY(result.finished);
    QCOMPARE(result.exitCode, status);
    QCOMPARE(result.out, QByteArray());
    const QByteArray line = "ftpconfig-report: " + error.replace("%1", rootPath.toUtf8()) + '\n';
    QVERIFY2(result.err.endsWith(line), result.err.constData());
}

void TestReport::table()
{
    FixtureRoot root;
    QVERIFY(root.write(
        {{QStringLiteral("/etc/vsftpd.d/allowed_user_list.conf"), "alice\n"},
         {QStringLiteral("/etc/vsftpd.conf"), "local_enable=YES\nwrite_enable=YES\nchroot_list_enable=YES\n"},
         {QStringLiteral("/etc/vsftpd.chroot_list"), "bob\n"}}));
    const ProcessResult result = report({QStringLiteral("--root"), root.path()});
    QCOMPARE(result.exitCode, 0);
    // Server-wide findings come first, then the table.
    const QByteArray table = result.out.mid(result.out.indexOf("USER "));
    const QList<QByteArray> lines = table.split('\n');
    QVERIFY(lines.first().startsWith("USER"));
    // Columns start where their titles do.
    const QList<QByteArray> titles{"USER",   "KIND", "STATUS", "SERVER ",    "DIRECTORY",
                                   "RIGHTS", "FILE", "REASON", "SERVER SAYS"};
    QList<int> starts;
    for (const QByteArray &title : titles)
        starts << lines.first().indexOf(title);
    const auto columns = [&](const QByteArray &user) {
        QByteArrayList fields;
        for (const QByteArray &l : lines) {
            for (int i = 0; l.startsWith(user + ' ') && i < starts.size(); ++i)
                fields << l.mid(starts[i], (i + 1 < starts.size() ? starts[i + 1] : l.size()) - starts[i]).trimmed();
        }
        return fields;
    };
    QCOMPARE(columns("USER").join('|'), QByteArray("USER|KIND|STATUS|SERVER|DIRECTORY|RIGHTS|FILE|REASON|SERVER SAYS"));
    // "*": the server's own forecast stands beside the verdict, whatever it is.
    const QByteArray expected[] = {
        "bob|local|allowed|*|/home/bob|write, download, mkdir|-|-",
        "alice|local|denied|*|/|write, download, mkdir|FTP userlist file|"
        "***Result: FALSE. Check: userlist file contains alice, userlist file mode = black users",
        "root|local|denied|*|/|write, download, mkdir|PAM ftpusers file|"
        "***Result: FALSE. Check: ftpusers file (item:user|ruser, sense:deny) contains  root record.",
        "Anonymous users|anonymous|allowed|*|/srv/ftp|download|-|-",
    };
    for (const QByteArray &row : expected) {
        QByteArrayList actual = columns(row.left(row.indexOf('|')));
        QVERIFY2(actual.size() >= 8, actual.join('|').constData());
        QVERIFY(QByteArrayList({"allowed", "denied", "unknown"}).contains(actual[3]));
        actual[3] = "*";
        QCOMPARE(actual.mid(0, 8).join('|'), row);
    }
    // One line per account, the anonymous row, the header and the final newline.
    QCOMPARE(lines.size(), 8 + 1 + 1 + 1);
}

void TestReport::json_data()
{
    QTest::addColumn<FileMap>("files");
    QTest::addColumn<QString>("user");
    QTest::addColumn<QString>("expected"); // kind|status|failureKind|message

    const QByteArray userdb = "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                              "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n";
    const FileMap guests{{QStringLiteral("/etc/vsftpd.conf"), "local_enable=YES\nguest_enable=YES\n"},
                         {QStringLiteral("/etc/pam.d/vsftpd"), userdb}};
    QTest::newRow("local") << FileMap() << QStringLiteral("locked")
                           << QStringLiteral("local|denied|5|***Result: FALSE. Check: user locked  has bad passwd in "
                                             "/etc/shadow (* or !).");
    QTest::newRow("anonymous") << FileMap{{QStringLiteral("/etc/vsftpd.conf"),
                                           "anonymous_enable=NO\nlocal_enable=YES\n"}}
                               << QStringLiteral("Anonymous users")
                               << QStringLiteral("anonymous|denied|3|***Result: FALSE. Check: main ftp config has "
                                                 "anonymous_enable option != yes.");
    QTest::newRow("virtual") << guests << QStringLiteral("vic") << QStringLiteral("virtual|allowed|0|");
    FileMap behind = guests;
    behind[QStringLiteral("/etc/pam.d/vsftpd")].prepend("auth required pam_unix.so\n");
    QTest::newRow("virtual behind another module")
        << behind << QStringLiteral("vic")
        << QStringLiteral("virtual|denied|0|PAM configuration problem: the first auth or account line of the PAM "
                          "file is not \"sufficient pam_userdb.so\"");
}

void TestReport::json()
{
    QFETCH(FileMap, files);
    QFETCH(QString, user);
    QFETCH(QString, expected);

    FixtureRoot root;
    QVERIFY(root.write(files));
    QVERIFY(root.writeVirtualUsers(QStringLiteral("/etc/vsftpd/virtual.db"), {{"vic", "secret"}}));
    const ProcessResult result = report({QStringLiteral("--json"), QStringLiteral("--root"), root.path()});
    QCOMPARE(result.exitCode, 0);
    QJsonParseError error{};
    const QJsonDocument document = QJsonDocument::fromJson(result.out, &error);
    QCOMPARE(error.error, QJsonParseError::NoError);
    QCOMPARE(document.object().value(QLatin1String("root")).toString(), root.path());
    const QJsonObject row = userOf(document, user);
    const auto field = [&](const char *key) { return row.value(QLatin1String(key)).toVariant().toString(); };
    QCOMPARE(
        QStringList({field("kind"), field("status"), field("failureKind"), field("message")}).join(QLatin1Char('|')),
        expected);
}

void TestReport::createsNothing()
{
    // A fresh machine: no main configuration, no per-user directory, a PAM
    // file naming a database that does not exist, no state directory.
    FixtureRoot root;
    QVERIFY(root.write(
        {{QStringLiteral("/etc/vsftpd.conf"), QByteArray()},
         {QStringLiteral("/etc/pam.d/vsftpd"), "auth sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n"}}));
    const QStringList before = snapshot(root.path());
    const ProcessResult result = report({QStringLiteral("--json"), QStringLiteral("--root"), root.path()});
    QCOMPARE(result.exitCode, 0);
    QCOMPARE(snapshot(root.path()), before);
    QVERIFY(result.err.contains("/etc/vsftpd.conf not found"));
    // Read as "listen=YES" alone: local users are refused for want of
    // local_enable, anonymous users admitted.
    const QJsonDocument document = QJsonDocument::fromJson(result.out);
    QCOMPARE(userOf(document, QStringLiteral("bob")).value(QLatin1String("message")).toString(),
             QStringLiteral("***Result: FALSE. Check: main ftp config has no local_enable defined"));
    QCOMPARE(userOf(document, QStringLiteral("Anonymous users")).value(QLatin1String("status")).toString(),
             QStringLiteral("allowed"));
}

void TestReport::hostileFiles_data()
{
    QTest::addColumn<QByteArray>("file");
    QTest::addColumn<QByteArray>("content");

    QByteArray junk;
    for (int i = 0; i < 4096; ++i)
        junk += static_cast<char>((i * 7919) % 256);
    for (const char *file : {"/etc/vsftpd.conf", "/etc/pam.d/vsftpd", "/etc/passwd", "/etc/group", "/srv/users.db"})
        QTest::addRow("binary %s", file) << QByteArray(file) << junk;
    QTest::newRow("odd keys") << QByteArray("/etc/vsftpd.conf")
                              << QByteArray("user_config_dir=\nuserlist_file=/\nlocal_root=\nanon_root=/etc/passwd\n"
                                            "pam_service_name=../../etc/passwd\n=\n");
    QTest::newRow("database path is a directory")
        << QByteArray("/etc/pam.d/vsftpd") << QByteArray("auth sufficient pam_userdb.so db=/srv/\n");
}

void TestReport::hostileFiles()
{
    QFETCH(QByteArray, file);
    QFETCH(QByteArray, content);

    FixtureRoot root;
    const QByteArray pam = file == "/etc/pam.d/vsftpd" ? content : "auth sufficient pam_userdb.so db=/srv/users\n";
    QVERIFY(root.write({{QString::fromLatin1(file), content}, {QStringLiteral("/etc/pam.d/vsftpd"), pam}}));
    const ProcessResult result = report({QStringLiteral("--root"), root.path()});
    QVERIFY(result.finished);
    // A clean verdict or a clean refusal, never a crash.
    QVERIFY2(result.exitCode == 0 || result.exitCode == 255, result.err.constData());
    if (result.exitCode == 0)
        QVERIFY(result.out.startsWith("USER") || result.out.contains("\nUSER"));
    else
        QVERIFY(result.err.contains("ftpconfig-report: "));
}

FTPCONFIG_TEST_GUILESS_MAIN(TestReport)
#include "TestReport.moc"

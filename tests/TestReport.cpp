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

using FileMap = QMap<QString, QByteArray>;
Q_DECLARE_METATYPE(FileMap)

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
    QTest::addColumn<QString>("kind");
    QTest::addColumn<int>("status");
    QTest::addColumn<QString>("error");

    QTest::newRow("missing root") << "missing" << 2 << "cannot read root %1: no such directory";
    QTest::newRow("root is a file") << "file" << 2 << "cannot read root %1: not a directory";
    QTest::newRow("unknown option") << "option" << 2 << "unknown argument: --frobnicate";
    QTest::newRow("no PAM file") << "nopam" << 255 << "Initialization error: Unable to find /etc/pam.d/vsftpd";
    QTest::newRow("main configuration is a directory")
        << "maindir" << 255 << "Initialization error: Unable to open /etc/vsftpd.conf";
}

void TestReport::badRoots()
{
    QFETCH(QString, kind);
    QFETCH(int, status);
    QFETCH(QString, error);

    FixtureRoot root;
    QString rootPath = root.path();
    QStringList arguments;
    if (kind == QLatin1String("missing")) {
        rootPath = root.filePath("/does/not/exist");
    } else if (kind == QLatin1String("file")) {
        QVERIFY(root.writeFile("/plain", "x"));
        rootPath = root.filePath("/plain");
    } else if (kind == QLatin1String("option")) {
        arguments << QStringLiteral("--frobnicate");
    } else if (kind == QLatin1String("nopam")) {
        QVERIFY(root.write({{"/etc/pam.d/vsftpd", QByteArray()}}));
    } else {
        QVERIFY(root.write({{"/etc/vsftpd.conf", QByteArray()}}));
        QVERIFY(root.makeDirectory("/etc/vsftpd.conf"));
    }
    const ProcessResult result = report(arguments << QStringLiteral("--root") << rootPath);
    QVERIFY(result.finished);
    QCOMPARE(result.exitCode, status);
    QCOMPARE(result.out, QByteArray());
    if (error.contains(QLatin1String("%1")))
        error = error.arg(rootPath);
    const QByteArray line = "ftpconfig-report: " + error.toUtf8() + '\n';
    QVERIFY2(result.err.endsWith(line), result.err.constData());
}

void TestReport::table()
{
    FixtureRoot root;
    QVERIFY(root.write({{"/etc/vsftpd.d/allowed_user_list.conf", "alice\n"},
                        {"/etc/vsftpd.conf", "local_enable=YES\nwrite_enable=YES\nchroot_list_enable=YES\n"},
                        {"/etc/vsftpd.chroot_list", "bob\n"}}));
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
        QStringList fields;
        for (const QByteArray &l : lines) {
            if (!l.startsWith(user + ' '))
                continue;
            for (int i = 0; i < starts.size(); ++i) {
                const int end = i + 1 < starts.size() ? starts[i + 1] : l.size();
                fields << QString::fromUtf8(l.mid(starts[i], end - starts[i])).trimmed();
            }
        }
        return fields;
    };
    const QStringList header = columns("USER");
    QCOMPARE(header,
             (QStringList{"USER", "KIND", "STATUS", "SERVER", "DIRECTORY", "RIGHTS", "FILE", "REASON", "SERVER SAYS"}));
    const QStringList expected[] = {
        {"bob", "local", "allowed", "", "/home/bob", "write, download, mkdir", "-", "-"},
        {"alice", "local", "denied", "", "/", "write, download, mkdir", "FTP userlist file",
         "***Result: FALSE. Check: userlist file contains alice, userlist file mode = black users"},
        {"root", "local", "denied", "", "/", "write, download, mkdir", "PAM ftpusers file",
         "***Result: FALSE. Check: ftpusers file (item:user|ruser, sense:deny) contains  root record."},
        {"Anonymous users", "anonymous", "allowed", "", "/srv/ftp", "download", "-", "-"},
    };
    for (const QStringList &row : expected) {
        QStringList actual = columns(row.first().toUtf8());
        QVERIFY2(actual.size() >= 8, qPrintable(actual.join('|')));
        // The server's own forecast stands beside the verdict, whatever it is.
        QVERIFY(QStringList({"allowed", "denied", "unknown"}).contains(actual[3]));
        actual[3].clear();
        QCOMPARE(actual.mid(0, 8), row);
    }
    // One line per account, the anonymous row, the header and the final newline.
    QCOMPARE(lines.size(), 8 + 1 + 1 + 1);
}

void TestReport::json_data()
{
    QTest::addColumn<FileMap>("files");
    QTest::addColumn<QString>("user");
    QTest::addColumn<QString>("kind");
    QTest::addColumn<QString>("status");
    QTest::addColumn<int>("failureKind");
    QTest::addColumn<QString>("message");

    const QByteArray userdb = "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                              "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n";
    const QByteArray guests = "local_enable=YES\nguest_enable=YES\n";
    QTest::newRow("local") << FileMap{} << "locked"
                           << "local"
                           << "denied" << 5
                           << "***Result: FALSE. Check: user locked  has bad passwd in /etc/shadow (* or !).";
    QTest::newRow("anonymous") << FileMap{{"/etc/vsftpd.conf", "anonymous_enable=NO\nlocal_enable=YES\n"}}
                               << "Anonymous users"
                               << "anonymous"
                               << "denied" << 3
                               << "***Result: FALSE. Check: main ftp config has anonymous_enable option != yes.";
    QTest::newRow("virtual") << FileMap{{"/etc/vsftpd.conf", guests}, {"/etc/pam.d/vsftpd", userdb}} << "vic"
                             << "virtual"
                             << "allowed" << 0 << "";
    QTest::newRow("virtual behind another module")
        << FileMap{{"/etc/vsftpd.conf", guests}, {"/etc/pam.d/vsftpd", "auth required pam_unix.so\n" + userdb}} << "vic"
        << "virtual"
        << "denied" << 0
        << "PAM configuration problem: the first auth or account line of the PAM file is not \"sufficient "
           "pam_userdb.so\"";
}

void TestReport::json()
{
    QFETCH(FileMap, files);
    QFETCH(QString, user);
    QFETCH(QString, kind);
    QFETCH(QString, status);
    QFETCH(int, failureKind);
    QFETCH(QString, message);

    FixtureRoot root;
    QVERIFY(root.write(files));
    QVERIFY(root.writeVirtualUsers("/etc/vsftpd/virtual.db", {{"vic", "secret"}}));
    const ProcessResult result = report({QStringLiteral("--json"), QStringLiteral("--root"), root.path()});
    QCOMPARE(result.exitCode, 0);
    QJsonParseError error{};
    const QJsonDocument document = QJsonDocument::fromJson(result.out, &error);
    QCOMPARE(error.error, QJsonParseError::NoError);
    QCOMPARE(document.object().value("root").toString(), root.path());
    const QJsonObject row = userOf(document, user);
    QCOMPARE(row.value("kind").toString(), kind);
    QCOMPARE(row.value("status").toString(), status);
    QCOMPARE(row.value("failureKind").toInt(), failureKind);
    QCOMPARE(row.value("message").toString(), message);
}

void TestReport::createsNothing()
{
    // A fresh machine: no main configuration, no per-user directory, a PAM
    // file naming a database that does not exist, no state directory.
    FixtureRoot root;
    QVERIFY(root.write({{"/etc/vsftpd.conf", QByteArray()},
                        {"/etc/pam.d/vsftpd", "auth sufficient pam_userdb.so db=/var/lib/ftpconfig/users\n"}}));
    const QStringList before = snapshot(root.path());
    const ProcessResult result = report({QStringLiteral("--json"), QStringLiteral("--root"), root.path()});
    QCOMPARE(result.exitCode, 0);
    QCOMPARE(snapshot(root.path()), before);
    QVERIFY(result.err.contains("/etc/vsftpd.conf not found"));
    // Read as "listen=YES" alone: local users are refused for want of
    // local_enable, anonymous users admitted.
    const QJsonDocument document = QJsonDocument::fromJson(result.out);
    QCOMPARE(userOf(document, "bob").value("message").toString(),
             QStringLiteral("***Result: FALSE. Check: main ftp config has no local_enable defined"));
    QCOMPARE(userOf(document, "Anonymous users").value("status").toString(), QStringLiteral("allowed"));
}

void TestReport::hostileFiles_data()
{
    QTest::addColumn<QString>("file");
    QTest::addColumn<QByteArray>("content");

    QByteArray junk;
    for (int i = 0; i < 4096; ++i)
        junk += static_cast<char>((i * 7919) % 256);
    QTest::newRow("binary main configuration") << "/etc/vsftpd.conf" << junk;
    QTest::newRow("binary PAM file") << "/etc/pam.d/vsftpd" << junk;
    QTest::newRow("binary passwd") << "/etc/passwd" << junk;
    QTest::newRow("binary group") << "/etc/group" << junk;
    QTest::newRow("binary database") << "/srv/users.db" << junk;
    QTest::newRow("odd keys") << "/etc/vsftpd.conf"
                              << QByteArray("user_config_dir=\nuserlist_file=/\nlocal_root=\nanon_root=/etc/passwd\n"
                                            "pam_service_name=../../etc/passwd\n=\n");
    QTest::newRow("database path is a directory")
        << "/etc/pam.d/vsftpd" << QByteArray("auth sufficient pam_userdb.so db=/srv/\n");
}

void TestReport::hostileFiles()
{
    QFETCH(QString, file);
    QFETCH(QByteArray, content);

    FixtureRoot root;
    QVERIFY(root.write({{file, content},
                        {"/etc/pam.d/vsftpd",
                         file == "/etc/pam.d/vsftpd" ? content : "auth sufficient pam_userdb.so db=/srv/users\n"}}));
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

#include "FixtureRoot.h"
#include "Process.h"
#include "Scenario.h"
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

QJsonObject userOf(const QJsonObject &document, const QString &name)
{
    const QJsonArray users = document.value(QStringLiteral("users")).toArray();
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
    void runs_data()
    {
        addScenarioRows(QStringLiteral("report.txt"));
    }

    void runs()
    {
        QFETCH(Scenario, scenario);
        FixtureRoot root;
        QVERIFY(root.write(scenario.files));
        QVERIFY(root.writeVirtualUsers(QStringLiteral("/etc/vsftpd/virtual.db"), {{"vic", "secret"}}));
        const QString rootPath = scenario.has(QStringLiteral("root"))
            ? root.filePath(scenario.value(QStringLiteral("root")))
            : root.path();
        const QStringList before = snapshot(root.path());
        const ProcessResult result
            = report(scenario.value(QStringLiteral("args")).split(QLatin1Char(' '), Qt::SkipEmptyParts)
                     << QStringLiteral("--root") << rootPath);
        QVERIFY(result.finished);
        QCOMPARE(result.exitCode, scenario.value(QStringLiteral("status"), QStringLiteral("0")).toInt());
        const QString err = QString::fromUtf8(result.err);
        if (scenario.has(QStringLiteral("error"))) {
            QCOMPARE(result.out, QByteArray());
            const QString line = scenario.value(QStringLiteral("error")).replace(QLatin1String("{root}"), rootPath);
            QVERIFY2(err.endsWith(QStringLiteral("ftpconfig-report: %1\n").arg(line)), qPrintable(err));
        }
        for (const QString &line : scenario.values(QStringLiteral("says")))
            QVERIFY2(err.contains(line), qPrintable(err));
        if (scenario.has(QStringLiteral("creates-nothing")))
            QCOMPARE(snapshot(root.path()), before);
        const QJsonObject document = QJsonDocument::fromJson(result.out).object();
        for (const QString &expected : scenario.values(QStringLiteral("user"))) {
            QCOMPARE(document.value(QLatin1String("root")).toString(), root.path());
            const QJsonObject row = userOf(document, expected.section(QLatin1Char('|'), 0, 0));
            QStringList fields;
            for (const char *key : {"name", "kind", "status", "failureKind", "message"})
                fields << row.value(QLatin1String(key)).toVariant().toString();
            QCOMPARE(fields.join(QLatin1Char('|')), expected);
        }
    }

    void table()
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
                    fields
                        << l.mid(starts[i], (i + 1 < starts.size() ? starts[i + 1] : l.size()) - starts[i]).trimmed();
            }
            return fields;
        };
        QCOMPARE(columns("USER").join('|'),
                 QByteArray("USER|KIND|STATUS|SERVER|DIRECTORY|RIGHTS|FILE|REASON|SERVER SAYS"));
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

    void manyRows()
    {
        // More rows than the writers make at a time on each thread, and an odd
        // number: every row once, in the table's order, in both outputs.
        FixtureRoot root;
        QVERIFY(root.write({{QStringLiteral("/etc/vsftpd.conf"), "local_enable=YES\nguest_enable=YES\n"},
                            {QStringLiteral("/etc/pam.d/vsftpd"),
                             "auth sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                             "account sufficient pam_userdb.so db=/etc/vsftpd/virtual\n"
                             "@include common-auth\n"}}));
        QMap<QByteArray, QByteArray> virtualUsers;
        for (int i = 0; i < 9001; ++i)
            virtualUsers.insert("v" + QByteArray::number(i), "secret");
        QVERIFY(root.writeVirtualUsers(QStringLiteral("/etc/vsftpd/virtual.db"), virtualUsers));

        const ProcessResult json = report({QStringLiteral("--root"), root.path(), QStringLiteral("--json")});
        QCOMPARE(json.exitCode, 0);
        QJsonParseError error{};
        const QJsonArray users
            = QJsonDocument::fromJson(json.out, &error).object().value(QStringLiteral("users")).toArray();
        QCOMPARE(error.error, QJsonParseError::NoError);
        QStringList names;
        for (const QJsonValue &user : users)
            names << user.toObject().value(QStringLiteral("name")).toString();
        const int locals = names.indexOf(QStringLiteral("v0"));
        QVERIFY(locals > 0);
        QStringList expected = names.mid(0, locals);
        for (const QByteArray &name : virtualUsers.keys())
            expected << QString::fromUtf8(name);
        expected << QStringLiteral("Anonymous users");
        QCOMPARE(names, expected);

        const ProcessResult text = report({QStringLiteral("--root"), root.path()});
        QCOMPARE(text.exitCode, 0);
        QList<QByteArray> lines = text.out.mid(text.out.indexOf("USER ")).split('\n');
        QCOMPARE(lines.takeLast(), QByteArray());
        QCOMPARE(lines.size(), expected.size() + 1);
        for (int i = 0; i < expected.size(); ++i)
            QVERIFY2(lines[i + 1].startsWith(expected[i].toUtf8() + ' '), lines[i + 1].constData());
    }

    void serverFindingsOnce_data()
    {
        QTest::addColumn<QByteArray>("config");
        QTest::addColumn<bool>("fails");
        QTest::newRow("failing server") << QByteArray("listen=YES\nlisten_ipv6=YES\nlocal_enable=YES\n") << true;
        QTest::newRow("repeated key") << QByteArray(
            "listen=YES\nlocal_enable=YES\nnopriv_user=ftp\nsecure_chroot_dir=/srv/ftp\n"
            "write_enable=YES\nwrite_enable=NO\n")
                                      << false;
    }

    void serverFindingsOnce()
    {
        QFETCH(QByteArray, config);
        QFETCH(bool, fails);
        FixtureRoot root;
        QVERIFY(root.write({{QStringLiteral("/etc/vsftpd.conf"), config}}));
        const ProcessResult json = report({QStringLiteral("--root"), root.path(), QStringLiteral("--json")});
        const ProcessResult text = report({QStringLiteral("--root"), root.path()});
        QCOMPARE(json.exitCode, 0);
        QCOMPARE(text.exitCode, 0);
        const QJsonObject server = QJsonDocument::fromJson(json.out).object().value(QLatin1String("server")).toObject();
        QCOMPARE(server.value(QLatin1String("fails")).toBool(), fails);
        const QJsonArray findings = server.value(QLatin1String("findings")).toArray();
        QVERIFY(!findings.isEmpty());
        // Written once at the top, in no user's row; a user without a finding of
        // its own shows the first of them in the table.
        int rows = 0;
        for (const QJsonValue &user :
             QJsonDocument::fromJson(json.out).object().value(QLatin1String("users")).toArray()) {
            const QJsonArray own = user[QLatin1String("forecast")][QLatin1String("findings")].toArray();
            for (const QJsonValue &finding : own)
                QVERIFY2(!findings.contains(finding), qPrintable(user[QLatin1String("name")].toString()));
            if (fails)
                QCOMPARE(own.size(), 0);
            ++rows;
        }
        QCOMPARE(rows, 8 + 1);
        const QJsonObject first = findings.first().toObject();
        const QByteArray said = QStringLiteral("%1:%2: %3")
                                    .arg(first[QLatin1String("file")].toString())
                                    .arg(first[QLatin1String("line")].toInt())
                                    .arg(first[QLatin1String("message")].toString())
                                    .toUtf8();
        const QList<QByteArray> lines = text.out.split('\n');
        const auto anonymous = std::find_if(lines.begin(), lines.end(),
                                            [](const QByteArray &l) { return l.startsWith("Anonymous users "); });
        QVERIFY(anonymous != lines.end());
        QVERIFY2(anonymous->endsWith(said), anonymous->constData());
    }

    void hostileFiles_data()
    {
        QTest::addColumn<QByteArray>("file");
        QTest::addColumn<QByteArray>("content");

        QByteArray junk;
        for (int i = 0; i < 4096; ++i)
            junk += static_cast<char>((i * 7919) % 256);
        for (const char *file : {"/etc/vsftpd.conf", "/etc/pam.d/vsftpd", "/etc/passwd", "/etc/group", "/srv/users.db"})
            QTest::addRow("binary %s", file) << QByteArray(file) << junk;
        QTest::newRow("odd keys") << QByteArray("/etc/vsftpd.conf")
                                  << QByteArray(
                                         "user_config_dir=\nuserlist_file=/\nlocal_root=\nanon_root=/etc/passwd\n"
                                         "pam_service_name=../../etc/passwd\n=\n");
        QTest::newRow("database path is a directory")
            << QByteArray("/etc/pam.d/vsftpd") << QByteArray("auth sufficient pam_userdb.so db=/srv/\n");
    }

    void hostileFiles()
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
};

FTPCONFIG_TEST_GUILESS_MAIN(TestReport)

#include "TestReport.moc"

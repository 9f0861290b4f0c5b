// Real PAM reads what the engine saves after it rebuilt a damaged database
// environment: pam_userdb, driven by pamtester, must still admit every
// virtual user (e2e/saves.toml has the edits of single users under vsftpd).
// Runs only inside scripts/with-private-etc.sh, which gives it a private /etc.
#include "CaptureStream.h"
#include "EngineFixture.h"
#include "Process.h"
#include "TestMain.h"

#include <iostream>

#include <QFile>
#include <QtTest>

namespace {

const QByteArray DbPath = "/var/lib/ftpconfig/vsftpd_virtual_users";
const QString Service = QStringLiteral("ftpconfig-userdb-test");

bool etcIsPrivate()
{
    if (qEnvironmentVariable("FTPCONFIG_PRIVATE_ETC") != QLatin1String("1"))
        return false;
    QFile mounts(QStringLiteral("/proc/self/mountinfo"));
    if (!mounts.open(QIODevice::ReadOnly))
        return false;
    for (const QByteArray &line : mounts.readAll().split('\n')) {
        const QList<QByteArray> fields = line.split(' ');
        if (fields.size() > 4 && fields[4] == "/etc")
            return true;
    }
    return false;
}

struct Login
{
    QByteArray user;
    QByteArray password;
    bool succeeds;
};

} // namespace

class TestPamUserdb : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase();
    void recoveryKeepsUntouchedUsers();

private:
    void writePamService(const QByteArray &db);
    // Checks each login with pamtester: authentication and account stacks.
    void expectLogins(const QList<Login> &logins, const char *phase);
};

void TestPamUserdb::initTestCase()
{
    QVERIFY2(etcIsPrivate(), "run this test through scripts/with-private-etc.sh: it writes to /etc/pam.d");
    QVERIFY2(QFile::exists(QStringLiteral("/usr/bin/pamtester")), "pamtester is not installed");
}

void TestPamUserdb::expectLogins(const QList<Login> &logins, const char *phase)
{
    for (const Login &login : logins) {
        const ProcessResult result = runProcess(
            QStringLiteral("pamtester"),
            {Service, QString::fromUtf8(login.user), QStringLiteral("authenticate"), QStringLiteral("acct_mgmt")},
            login.password + '\n', 20000);
        QVERIFY2(result.finished, "pamtester did not finish");
        const QByteArray what
            = QByteArray(phase) + ": " + login.user + " with \"" + login.password + "\" -> " + result.out + result.err;
        QVERIFY2((result.exitCode == 0) == login.succeeds, what.constData());
    }
}

// pam_userdb appends ".db" itself: the PAM file names the path without it.
void TestPamUserdb::writePamService(const QByteArray &db)
{
    QFile pam(QStringLiteral("/etc/pam.d/") + Service);
    QVERIFY(pam.open(QIODevice::WriteOnly | QIODevice::Truncate));
    pam.write("auth sufficient pam_userdb.so db=" + db
              + "\n"
                "account sufficient pam_userdb.so db="
              + db
              + "\n"
                "auth required pam_deny.so\n"
                "account required pam_deny.so\n");
    pam.close();
}

// The environment breaks while the program runs; the save rebuilds it, and
// the users nobody touched must still log in afterwards.
void TestPamUserdb::recoveryKeepsUntouchedUsers()
{
    EngineFixture engine;
    QVERIFY(engine.write(
        {{QStringLiteral("/etc/pam.d/vsftpd"),
          "auth sufficient pam_userdb.so db=" + DbPath + "\naccount sufficient pam_userdb.so db=" + DbPath + "\n"}}));
    QVERIFY(engine.root.writeVirtualUsers(QString::fromUtf8(DbPath + ".db"), {{"anna", "a1"}, {"ben", "b2"}}));
    writePamService(QFile::encodeName(engine.root.filePath(QString::fromUtf8(DbPath))));
    QVERIFY(engine.start());
    FtpServerConfig &config = *engine.config;
    config.accounts().addVirtualUser("carl", "c3");
    // Garbage over the environment's shared region, as a crash might leave it.
    QFile region(engine.root.filePath(QStringLiteral("/var/lib/ftpconfig/__db.001")));
    QVERIFY(region.open(QIODevice::ReadWrite));
    QVERIFY(region.write(QByteArray(int(region.size()), '\x7f')) > 0);
    region.close();

    CaptureStream out(std::cout);
    CaptureStream err(std::cerr);
    config.save();
    QVERIFY2(QString::fromStdString(err.text()).contains(QLatin1String("Db env. error. Re-creating database")),
             err.text().c_str());
    expectLogins({{"anna", "a1", true}, {"ben", "b2", true}, {"carl", "c3", true}}, "after the recovery");
}

FTPCONFIG_TEST_GUILESS_MAIN(TestPamUserdb)
#include "TestPamUserdb.moc"

// The login forecast over the rows of tests/data/scenarios/forecast.txt: a
// small machine the way the server sees it (accounts with shadow aging,
// Debian's common PAM stacks, the directories vsftpd needs) and what vsftpd
// would do with the server and with one user's login.
#include "EngineFixture.h"
#include "TestMain.h"
#include "forecast/LoginForecast.h"

#include <QStandardPaths>
#include <QtTest>
#include <functional>

#include <sys/stat.h>
#include <unistd.h>

namespace {

// The shadow fields of the table count their days up to this one.
const QDate Today(2026, 11, 22);

// The first finding as "file:line: message", or nothing.
QString first(const QList<ForecastFinding> &findings)
{
    if (findings.isEmpty())
        return QString();
    const ForecastFinding &f = findings.constFirst();
    return QStringLiteral("%1:%2: %3").arg(f.file).arg(f.line).arg(f.message);
}

// Homes belong to their users and are not writable by others; the guest
// home is read-only, as a chroot must be. A row's "setup" changes that.
bool prepare(const FixtureRoot &root, const QString &setup)
{
    for (const char *dir :
         {"/var/run/vsftpd/empty", "/srv/guest", "/home/nologin", "/home/expired", "/home/mustchange", "/home/empty"}) {
        if (!root.makeDirectory(QString::fromLatin1(dir)))
            return false;
    }
    const QByteArray bob = QFile::encodeName(root.filePath(QStringLiteral("/home/bob")));
    const QByteArray alice = QFile::encodeName(root.filePath(QStringLiteral("/home/alice")));
    const QByteArray guest = QFile::encodeName(root.filePath(QStringLiteral("/srv/guest")));
    const QByteArray ftp = QFile::encodeName(root.filePath(QStringLiteral("/srv/ftp")));
    if (::chown(bob.constData(), 1000, 1000) + ::chmod(bob.constData(), 0755) + ::chown(alice.constData(), 1001, 1001)
            + ::chmod(alice.constData(), 0755) + ::chown(guest.constData(), 1100, 1100)
            + ::chmod(guest.constData(), 0555)
        != 0)
        return false;
    const QMap<QString, std::function<bool()>> setups{
        {QStringLiteral("nohome"),
         [&] { return QDir(root.filePath(QStringLiteral("/home/bob"))).removeRecursively(); }},
        {QStringLiteral("closed"),
         [&] { return ::chown(bob.constData(), 0, 0) + ::chmod(bob.constData(), 0700) == 0; }},
        {QStringLiteral("readonly"), [&] { return ::chmod(bob.constData(), 0555) == 0; }},
        {QStringLiteral("userroot"),
         [&] {
             return root.makeDirectory(QStringLiteral("/srv/bob"))
                 && ::chmod(QFile::encodeName(root.filePath(QStringLiteral("/srv/bob"))).constData(), 0755) == 0;
         }},
        {QStringLiteral("guestwritable"), [&] { return ::chmod(guest.constData(), 0755) == 0; }},
        {QStringLiteral("ftpclosed"), [&] { return ::chmod(ftp.constData(), 0700) == 0; }},
        {QStringLiteral("ftpowned"), [&] { return ::chown(ftp.constData(), 107, 113) == 0; }},
    };
    // Or commands, "; " between them: "mkdir PATH", "chmod MODE PATH",
    // "chown UID:GID PATH".
    for (const QString &command : setup.split(QStringLiteral("; "), Qt::SkipEmptyParts)) {
        const QStringList words = command.split(QLatin1Char(' '));
        const QByteArray path = QFile::encodeName(root.filePath(words.value(words.size() - 1)));
        const QStringList ids = words.value(1).split(QLatin1Char(':'));
        const bool done = setups.contains(command)                    ? setups.value(command)()
            : words.size() == 2 && words[0] == QLatin1String("mkdir") ? root.makeDirectory(words[1])
            : words.size() == 3 && words[0] == QLatin1String("chmod")
            ? ::chmod(path.constData(), words[1].toUInt(nullptr, 8)) == 0
            : words.size() == 3 && words[0] == QLatin1String("chown") && ids.size() == 2
                && ::chown(path.constData(), ids[0].toUInt(), ids[1].toUInt()) == 0;
        if (!done)
            return false;
    }
    return true;
}

} // namespace

class TestLoginForecast : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase()
    {
        QStandardPaths::setTestModeEnabled(true);
    }

    void forecast_data()
    {
        addScenarioRows(QStringLiteral("forecast.txt"));
    }

    void forecast()
    {
        QFETCH(Scenario, scenario);
        EngineFixture engine(FtpServerConfig::Mode::ReadOnly);
        QVERIFY(engine.write(scenario.files));
        QVERIFY(prepare(engine.root, scenario.value(QStringLiteral("setup"))));
        QVERIFY(engine.start());
        LoginForecast forecast(*engine.config, Today);

        const bool fails = scenario.value(QStringLiteral("server")) == QLatin1String("fails");
        const QString serverFinding = scenario.value(QStringLiteral("server-finding"));
        QCOMPARE(forecast.serverFails(), fails);
        QCOMPARE(first(forecast.serverFindings()).left(serverFinding.size()), serverFinding);
        if (serverFinding.isEmpty())
            QCOMPARE(forecast.serverFindings().size(), 0);
        // A server that does not start refuses everybody with the same reason.
        for (const QByteArray &user : {QByteArray("bob"), QByteArray("Anonymous users")}) {
            const UserForecast login = forecast.forecast(user);
            QVERIFY(!fails
                    || (login.status == ForecastStatus::Denied
                        && login.findings.constFirst().message == forecast.serverFindings().constFirst().message));
        }
        if (!scenario.has(QStringLiteral("user")))
            return;
        const UserForecast login = forecast.forecast(scenario.bytes(QStringLiteral("user")));
        const QString finding = scenario.value(QStringLiteral("finding"));
        QCOMPARE(first(login.findings).left(finding.size()), finding);
        // Where ssl_enable is on, what a TLS client gets: the start of its finding.
        if (scenario.has(QStringLiteral("tls"))) {
            const auto tls = std::find_if(login.findings.begin(), login.findings.end(), [](const ForecastFinding &f) {
                return f.message.startsWith(QLatin1String("a TLS client"));
            });
            QVERIFY(tls != login.findings.end());
            QCOMPARE(tls->message.left(scenario.value(QStringLiteral("tls")).size()),
                     scenario.value(QStringLiteral("tls")));
        }
        static const QStringList statuses{QStringLiteral("allowed"), QStringLiteral("denied"),
                                          QStringLiteral("unknown")};
        QCOMPARE(statuses.value(static_cast<int>(login.status)), scenario.value(QStringLiteral("status")));
    }
};

FTPCONFIG_TEST_GUILESS_MAIN(TestLoginForecast)

#include "TestLoginForecast.moc"

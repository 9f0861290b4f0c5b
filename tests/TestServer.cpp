#include "app/Server.h"

#include "TestMain.h"

#include <QDBusMessage>
#include <QDeadlineTimer>
#include <QProcess>
#include <QSignalSpy>
#include <QTemporaryDir>
#include <QTest>

#include <csignal>
#include <sys/prctl.h>

namespace {

const QString unitInterfaceName = QStringLiteral("org.freedesktop.systemd1.Unit");

// A helper that dies with the test, even when the test is killed.
class HelperProcess : public QProcess
{
protected:
    void setupChildProcess() override
    {
        prctl(PR_SET_PDEATHSIG, SIGKILL);
    }
};

// Starts a helper that prints one line once it is ready; returns that line.
QByteArray startHelper(QProcess &process, const QString &program, const QStringList &arguments)
{
    process.start(program, arguments);
    const QDeadlineTimer deadline(10000);
    while (!process.canReadLine() && process.waitForReadyRead(int(deadline.remainingTime()))) { }
    return process.readLine().trimmed();
}

void stopHelper(QProcess &process)
{
    if (process.state() != QProcess::NotRunning) {
        process.kill();
        process.waitForFinished(5000);
    }
}

// A call on fakesystemd's control object; true when it answered.
bool control(const QString &method, const QVariantList &arguments)
{
    QDBusMessage call
        = QDBusMessage::createMethodCall(QStringLiteral("org.freedesktop.systemd1"), QStringLiteral("/control"),
                                         QStringLiteral("local.ftpconfig.FakeSystemd"), method);
    call.setArguments(arguments);
    return QDBusConnection::systemBus().call(call, QDBus::Block, 5000).type() == QDBusMessage::ReplyMessage;
}

bool announce(const QString &interfaceName, const QString &state)
{
    return control(QStringLiteral("Announce"), {interfaceName, state});
}

} // namespace

// Server on a private dbus-daemon, with fakesystemd in systemd's place.
class TestServer : public QObject
{
    Q_OBJECT

private slots:
    void initTestCase()
    {
        QVERIFY(m_dir.isValid());
        QFile config(m_dir.filePath(QStringLiteral("bus.conf")));
        QVERIFY(config.open(QIODevice::WriteOnly));
        config.write(QStringLiteral("<busconfig><listen>unix:dir=%1</listen><auth>EXTERNAL</auth>"
                                    "<policy context=\"default\"><allow send_destination=\"*\" eavesdrop=\"true\"/>"
                                    "<allow eavesdrop=\"true\"/><allow own=\"*\"/></policy></busconfig>")
                         .arg(m_dir.path())
                         .toUtf8());
        config.close();
        const QByteArray address = startHelper(m_daemon, QStringLiteral("dbus-daemon"),
                                               {QStringLiteral("--config-file=") + config.fileName(),
                                                QStringLiteral("--print-address"), QStringLiteral("--nofork")});
        QVERIFY2(address.startsWith("unix:"), m_daemon.readAllStandardError().constData());
        // Before the first use of the system bus, which reads it once.
        qputenv("DBUS_SYSTEM_BUS_ADDRESS", address);
        QVERIFY(QDBusConnection::systemBus().isConnected());
        // The bus holds incoming messages back until the event loop has run once.
        QCoreApplication::processEvents();
    }

    void cleanupTestCase()
    {
        stopHelper(m_daemon);
    }

    void cleanup()
    {
        stopHelper(m_systemd);
    }

    // First: libdbus aborts on a first call to an empty path.
    void unitNotLoaded()
    {
        QVERIFY(startSystemd({QStringLiteral("--no-unit")}));
        Server server(QDBusConnection::systemBus());
        QVERIFY(!server.running());
        QCOMPARE(server.lastError(), QStringLiteral("Unit vsftpd.service not loaded."));
        QVERIFY(!server.start());
        QVERIFY(!server.stop());
        QCOMPARE(server.lastError(), QStringLiteral("Unit vsftpd.service not loaded."));
    }

    // Steps, separated by spaces: an operation ("Start", "Stop", "Reload"),
    // or a PropertiesChanged "<interface suffix>:<ActiveState>" where an
    // empty state leaves ActiveState out.
    void follows_data()
    {
        QTest::addColumn<bool>("initial");
        QTest::addColumn<QString>("steps");
        QTest::addColumn<QList<bool>>("emitted");
        QTest::newRow("start") << false << "Start" << QList<bool>{true};
        QTest::newRow("stop") << true << "Stop" << QList<bool>{false};
        QTest::newRow("reload passes reloading") << true << "Reload" << QList<bool>{false, true};
        QTest::newRow("start, stop") << false << "Start Stop" << QList<bool>{true, false};
        QTest::newRow("transitional, active") << false << "Unit:activating Unit:active" << QList<bool>{true};
        QTest::newRow("repeated active") << true << "Unit:active Unit:active" << QList<bool>{};
        QTest::newRow("failed") << true << "Unit:failed" << QList<bool>{false};
        QTest::newRow("other interface") << false << "Service:active" << QList<bool>{};
        QTest::newRow("no ActiveState") << true << "Unit:" << QList<bool>{};
    }

    void follows()
    {
        QFETCH(bool, initial);
        QFETCH(QString, steps);
        QFETCH(QList<bool>, emitted);
        QVERIFY(startSystemd());
        QVERIFY(announce(unitInterfaceName, initial ? QStringLiteral("active") : QStringLiteral("inactive")));
        Server server(QDBusConnection::systemBus());
        QCOMPARE(server.running(), initial);
        QSignalSpy spy(&server, &Server::runningChanged);
        for (const QString &step : steps.split(QLatin1Char(' '))) {
            const QStringList signal = step.split(QLatin1Char(':'));
            if (signal.size() == 2) {
                QVERIFY(announce(QStringLiteral("org.freedesktop.systemd1.") + signal[0], signal[1]));
                continue;
            }
            const bool before = server.running();
            QVERIFY(step == QLatin1String("Start")      ? server.start()
                        : step == QLatin1String("Stop") ? server.stop()
                                                        : server.reload());
            QCOMPARE(server.running(), before); // only systemd's signal changes it
        }
        // Each step waited for fakesystemd's reply, which follows its signals:
        // they are all queued here by now, in order.
        QCoreApplication::processEvents();
        QList<bool> seen;
        for (const QList<QVariant> &arguments : spy)
            seen << arguments.at(0).toBool();
        QCOMPARE(seen, emitted);
        QCOMPARE(server.running(), emitted.isEmpty() ? initial : emitted.last());
    }

    void startRefused()
    {
        QVERIFY(startSystemd());
        Server server(QDBusConnection::systemBus());
        QVERIFY(server.lastError().isEmpty());
        const QString message = QStringLiteral("Unit vsftpd.service is masked.");
        QVERIFY(control(QStringLiteral("FailNextStart"), {message}));
        QVERIFY(!server.start());
        QCOMPARE(server.lastError(), message);
        QVERIFY(server.start());
        QTRY_VERIFY_WITH_TIMEOUT(server.running(), 5000);
    }

    void instanceUsesSystemBus()
    {
        QVERIFY(startSystemd());
        QVERIFY(announce(unitInterfaceName, QStringLiteral("active")));
        QVERIFY(Server::instance().running());
        QCOMPARE(&Server::instance(), &Server::instance());
    }

private:
    bool startSystemd(const QStringList &arguments = {})
    {
        m_systemd.setProcessChannelMode(QProcess::ForwardedErrorChannel);
        const QString address = QString::fromLocal8Bit(qgetenv("DBUS_SYSTEM_BUS_ADDRESS"));
        return startHelper(m_systemd, QStringLiteral(FAKESYSTEMD_PATH), QStringList{address} + arguments) == "ready";
    }

    QTemporaryDir m_dir;
    HelperProcess m_daemon;
    HelperProcess m_systemd;
};

FTPCONFIG_TEST_GUILESS_MAIN(TestServer)
#include "TestServer.moc"

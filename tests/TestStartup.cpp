#include "FixtureRoot.h"
#include "ModalHelper.h"
#include "Process.h"
#include "TestMain.h"
#include "app/QtSingleApplication.h"
#include "app/Startup.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QLocalSocket>
#include <QProcess>
#include <QTemporaryDir>

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

const QString program = QStringLiteral(FTPCONFIG_PROGRAM);
const QByteArray launched = "Program is allready launched.\n";
// Lines of the program's debug categories, enabled in every started process.
const QByteArray shown = "ftpconfig.startup: main window shown";
const QByteArray activated = "ftpconfig.instance: window brought to the front";
const QByteArray refusing = "ftpconfig.startup: refusing the real user id 65534";

// A socket file nobody listens on, as a crashed instance leaves it.
bool leaveStaleSocket(const QString &path)
{
    QFile::remove(path);
    const QByteArray name = QFile::encodeName(path);
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    if (name.size() >= static_cast<int>(sizeof address.sun_path))
        return false;
    qstrcpy(address.sun_path, name.constData());
    const int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
    const bool bound = ::bind(fd, reinterpret_cast<const sockaddr *>(&address), sizeof address) == 0;
    ::close(fd);
    return bound && QFileInfo(path).exists();
}

// The termination signal, then the kill signal to one that does not end;
// false when it had to be killed.
bool terminate(QProcess &process)
{
    process.terminate();
    if (process.waitForFinished(15000))
        return true;
    process.kill();
    process.waitForFinished(5000);
    return false;
}

} // namespace

class TestStartup : public QObject
{
    Q_OBJECT

private Q_SLOTS:
    void initTestCase()
    {
        if (::getuid() != 0)
            QSKIP("starts the program as root and as nobody: run as root");
        QVERIFY(QFileInfo(program).isExecutable());
        // Qt would otherwise make and leave /tmp/runtime-nobody.
        QVERIFY(m_nobodyRuntime.isValid());
        QVERIFY(::chown(QFile::encodeName(m_nobodyRuntime.path()).constData(), 65534, 65534) == 0);
        QVERIFY(m_root.write());
        // Started processes keep their settings here; the PAM question is
        // answered for good, so that the window comes up without a dialog.
        QVERIFY(m_config.writeFile(QStringLiteral("/ftpconfig/ftpconfig.conf"), "[General]\nskip_pam_check=true\n"));
        qputenv("XDG_CONFIG_HOME", QFile::encodeName(m_config.path()));
        qputenv("QT_LOGGING_RULES", "ftpconfig.*.debug=true");

        qputenv("FTPCONFIG_ROOT", QFile::encodeName(m_root.path()));
        m_serverName = QtSingleApplication::serverName();
        qunsetenv("FTPCONFIG_ROOT");
        QVERIFY(leaveStaleSocket(m_serverName));
        startFirst();
    }

    void cleanupTestCase()
    {
        if (m_first.state() == QProcess::NotRunning)
            return;
        // The termination signal ends the event loop: the ordinary exit, with
        // the loop's status and the socket removed.
        const bool finished = terminate(m_first);
        m_firstErr += m_first.readAllStandardError();
        QVERIFY2(finished && m_first.exitStatus() == QProcess::NormalExit, m_firstErr.constData());
        QCOMPARE(m_first.exitCode(), 0);
        QVERIFY(!QFileInfo::exists(m_serverName));
    }

    void cleanup()
    {
        QCOMPARE(ModalHelper::shownWindow(), QString());
    }

    void refusalBox()
    {
        ModalHelper modal;
        modal.expect(QStringLiteral("Invalid launcher user. VSFTPD configurator must be launched by root."),
                     QStringLiteral("OK"));
        QCOMPARE(refuseNonRootLauncher(), -1);
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        QCOMPARE(modal.seen().first().icon, QMessageBox::Critical);
    }

    void secondStart_data()
    {
        QTest::addColumn<bool>("nobody");
        QTest::addColumn<bool>("rootOption");
        QTest::newRow("root, FTPCONFIG_ROOT") << false << false;
        QTest::newRow("root, --root") << false << true;
        QTest::newRow("nobody, --root") << true << true;
    }

    // A second start of any user wakes the first and ends at once, without a
    // window and without the root check.
    void secondStart()
    {
        QFETCH(bool, nobody);
        QFETCH(bool, rootOption);
        QStringList command{program};
        if (rootOption)
            command << QStringLiteral("--root=") + m_root.path();
        else
            qputenv("FTPCONFIG_ROOT", QFile::encodeName(m_root.path()));
        const ProcessResult second = nobody ? runProcess(QStringLiteral("setpriv"), asNobody(command))
                                            : runProcess(command.first(), command.mid(1));
        qunsetenv("FTPCONFIG_ROOT");
        QVERIFY2(second.finished, second.err.constData());
        QCOMPARE(second.exitCode, 0);
        QVERIFY2(second.err.contains(launched), second.err.constData());
        QVERIFY2(!second.err.contains(shown) && !second.err.contains(refusing), second.err.constData());
        ++m_expectedActivations;
        QTRY_COMPARE(activations(), m_expectedActivations);
        QCOMPARE(m_first.state(), QProcess::Running);
    }

    void messages_data()
    {
        QTest::addColumn<QByteArray>("sent");
        QTest::addColumn<bool>("receipt");
        QTest::addColumn<int>("activation");
        QTest::newRow("wake up") << QByteArray("wake up\n") << true << 1;
        QTest::newRow("another message") << QByteArray("hello\n") << true << 0;
        QTest::newRow("wake up with trailing blank") << QByteArray("wake up \n") << true << 0;
        QTest::newRow("unfinished line") << QByteArray("wake up") << false << 0;
        QTest::newRow("overlong") << QByteArray(300, 'a') + "\n" << false << 0;
        QTest::newRow("control character") << QByteArray("wake\x01up\n") << false << 0;
        QTest::newRow("not UTF-8") << QByteArray("wake up\xff\n") << false << 0;
        // Also shows that none of the refused messages activated late.
        QTest::newRow("wake up again") << QByteArray("wake up\n") << true << 1;
    }

    // Whoever can reach the socket can write anything to it: only one line of
    // bounded text is answered, and only "wake up" activates.
    void messages()
    {
        QFETCH(QByteArray, sent);
        QFETCH(bool, receipt);
        QFETCH(int, activation);
        QLocalSocket socket;
        socket.connectToServer(m_serverName);
        QVERIFY(socket.waitForConnected(5000));
        socket.write(sent);
        QVERIFY(socket.waitForBytesWritten(5000));
        const bool answered = socket.waitForReadyRead(receipt ? 5000 : 1000) && socket.readAll() == "\n";
        QCOMPARE(answered, receipt);
        socket.abort();
        m_expectedActivations += activation;
        QTRY_COMPARE(activations(), m_expectedActivations);
    }

    // Alone, a start by another user than root shows the critical box and,
    // once the box is gone, ends with -1. The box is made to go by the
    // termination signal, which ends its event loop like any other.
    void nonRootAlone()
    {
        QTemporaryDir otherRoot;
        QVERIFY(otherRoot.isValid());
        QProcess nonRoot;
        QByteArray err;
        connect(&nonRoot, &QProcess::readyReadStandardError, this, [&] { err += nonRoot.readAllStandardError(); });
        nonRoot.start(QStringLiteral("setpriv"), asNobody({program, QStringLiteral("--root"), otherRoot.path()}));
        QVERIFY(nonRoot.waitForStarted());
        QTRY_VERIFY_WITH_TIMEOUT(err.contains(refusing) || nonRoot.state() != QProcess::Running, 30000);
        QTest::qWait(300);
        const bool blocked = nonRoot.state() == QProcess::Running;
        const bool finished = terminate(nonRoot);
        err += nonRoot.readAllStandardError();
        QVERIFY2(blocked, err.constData());
        QVERIFY(finished);
        QCOMPARE(nonRoot.exitStatus(), QProcess::NormalExit);
        QCOMPARE(nonRoot.exitCode(), 255);
        QVERIFY2(!err.contains(launched) && !err.contains(shown), err.constData());
    }

private:
    int activations() const
    {
        return m_firstErr.count(activated);
    }

    // The command as user and group 65534 without supplementary groups.
    QStringList asNobody(const QStringList &command) const
    {
        return QStringList{QStringLiteral("--reuid=65534"), QStringLiteral("--regid=65534"),
                           QStringLiteral("--clear-groups"), QStringLiteral("env"),
                           QStringLiteral("XDG_RUNTIME_DIR=") + m_nobodyRuntime.path()}
        + command;
    }

    // The first instance, started over the stale socket: it must take the name
    // over rather than take the dead socket for a running instance.
    void startFirst()
    {
        connect(&m_first, &QProcess::readyReadStandardError, this,
                [this] { m_firstErr += m_first.readAllStandardError(); });
        m_first.start(program, {QStringLiteral("--root"), m_root.path()});
        QVERIFY(m_first.waitForStarted());
        QTRY_VERIFY_WITH_TIMEOUT(m_firstErr.contains(shown) || m_first.state() != QProcess::Running, 60000);
        QVERIFY2(m_first.state() == QProcess::Running, m_firstErr.constData());
        QVERIFY2(!m_firstErr.contains(launched), m_firstErr.constData());
    }

    TemporaryRoot m_config;
    QTemporaryDir m_nobodyRuntime;
    FixtureRoot m_root;
    QString m_serverName;
    QProcess m_first;
    QByteArray m_firstErr;
    int m_expectedActivations = 0;
};

FTPCONFIG_TEST_MAIN(TestStartup)
#include "TestStartup.moc"

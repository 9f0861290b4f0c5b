#include "QtSingleApplication.h"

#include "common/RootDirectory.h"

#include <QCryptographicHash>
#include <QDeadlineTimer>
#include <QFileInfo>
#include <QLocalServer>
#include <QLocalSocket>
#include <QLockFile>
#include <QLoggingCategory>
#include <QTimer>
#include <QWidget>

#include <unistd.h>

// Off unless enabled (QT_LOGGING_RULES="ftpconfig.instance.debug=true"):
// then every received message and every activation is logged.
Q_LOGGING_CATEGORY(lcInstance, "ftpconfig.instance", QtWarningMsg)

namespace {

// A sender that has not finished its line by then is dropped.
constexpr int ReceiveTimeoutMs = 5000;

int remainingMs(const QDeadlineTimer &deadline)
{
    return static_cast<int>(qMax<qint64>(0, deadline.remainingTime()));
}

bool isAcceptableText(const QByteArray &line)
{
    for (const char c : line) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f)
            return false;
    }
    // Valid UTF-8 survives the round trip unchanged.
    return QString::fromUtf8(line).toUtf8() == line;
}

} // namespace

QtSingleApplication::QtSingleApplication(int &argc, char **argv, bool guiEnabled)
    : QApplication(argc, argv)
    , m_serverName(serverName())
{
    Q_ASSERT(guiEnabled);
    Q_UNUSED(guiEnabled)
    listenOrFindRunning();
}

QtSingleApplication::~QtSingleApplication() = default;

QString QtSingleApplication::serverName()
{
    // A fixed directory rather than the user's temporary one: a start by any
    // user must find the same socket. Each administered root has its own.
    const RootDirectory root = RootDirectory::fromEnvironment();
    if (root.isSystemRoot())
        return QStringLiteral("/tmp/ftpconfig-instance");
    const QByteArray digest = QCryptographicHash::hash(root.path().toUtf8(), QCryptographicHash::Sha256).toHex();
    return QStringLiteral("/tmp/ftpconfig-instance-") + QString::fromLatin1(digest.left(16));
}

QString QtSingleApplication::wakeUpMessage()
{
    return QStringLiteral("wake up");
}

bool QtSingleApplication::isRunning() const
{
    return m_running;
}

void QtSingleApplication::listenOrFindRunning()
{
    // Two instances starting together must not both find no answer and then
    // remove each other's socket. Without the lock (say, another user's
    // stale lock file) the check goes on unguarded.
    QLockFile lock(m_serverName + QStringLiteral(".lock"));
    if (!lock.tryLock(2000))
        qCDebug(lcInstance) << "checking for a running instance without the lock";

    QLocalSocket probe;
    probe.connectToServer(m_serverName);
    if (probe.waitForConnected(1000)) {
        // Anybody can create the path in /tmp; a root start is not turned
        // away by a socket another user made.
        if (::getuid() != 0 || QFileInfo(m_serverName).ownerId() == 0) {
            m_running = true;
            return;
        }
        qCWarning(lcInstance).noquote() << "ignoring" << m_serverName << "which root does not own";
    }
    probe.abort();

    // Nobody answers: a socket left by a crashed instance, or none at all.
    QLocalServer::removeServer(m_serverName);
    m_server = new QLocalServer(this);
    m_server->setSocketOptions(QLocalServer::WorldAccessOption);
    if (!m_server->listen(m_serverName)) {
        qCWarning(lcInstance).noquote() << "cannot listen on" << m_serverName << ":" << m_server->errorString();
        delete m_server;
        m_server = nullptr;
        return;
    }
    connect(m_server, &QLocalServer::newConnection, this, &QtSingleApplication::acceptConnections);
    qCDebug(lcInstance).noquote() << "listening on" << m_serverName;
}

void QtSingleApplication::acceptConnections()
{
    while (QLocalSocket *socket = m_server->nextPendingConnection()) {
        // One line and its newline are all a sender may have buffered.
        socket->setReadBufferSize(MaxMessageBytes + 1);
        connect(socket, &QLocalSocket::disconnected, socket, &QObject::deleteLater);
        connect(socket, &QLocalSocket::readyRead, this, [this, socket] { readMessage(socket); });
        QTimer::singleShot(ReceiveTimeoutMs, socket, [socket] {
            socket->abort();
            socket->deleteLater();
        });
    }
}

void QtSingleApplication::readMessage(QLocalSocket *socket)
{
    if (!socket->canReadLine()) {
        if (socket->bytesAvailable() > MaxMessageBytes) {
            qCDebug(lcInstance) << "refused an overlong message";
            socket->abort();
            socket->deleteLater();
        }
        return;
    }
    QByteArray line = socket->readLine(MaxMessageBytes + 2);
    if (!line.endsWith('\n')) {
        socket->abort();
        socket->deleteLater();
        return;
    }
    line.chop(1);
    if (!isAcceptableText(line)) {
        qCDebug(lcInstance) << "refused a message that is not one line of text";
        socket->abort();
        socket->deleteLater();
        return;
    }
    // The receipt tells the sender it may go.
    socket->write("\n");
    socket->flush();
    socket->disconnectFromServer();

    const QString message = QString::fromUtf8(line);
    qCDebug(lcInstance).noquote() << "received:" << message;
    emit messageReceived(message);
}

bool QtSingleApplication::sendMessage(const QString &message, int timeout)
{
    const QByteArray data = message.toUtf8();
    if (!m_running || data.size() > MaxMessageBytes || !isAcceptableText(data))
        return false;

    const QDeadlineTimer deadline(timeout);
    QLocalSocket socket;
    socket.connectToServer(m_serverName);
    if (!socket.waitForConnected(remainingMs(deadline)))
        return false;
    socket.write(data + '\n');
    while (socket.bytesToWrite() > 0) {
        if (!socket.waitForBytesWritten(remainingMs(deadline)))
            return false;
    }
    if (!socket.waitForReadyRead(remainingMs(deadline)))
        return false;
    return socket.read(1) == QByteArrayLiteral("\n");
}

void QtSingleApplication::setActivationWindow(QWidget *window, bool activateOnMessage)
{
    m_activationWindow = window;
    disconnect(m_activationConnection);
    if (activateOnMessage)
        m_activationConnection = connect(this, &QtSingleApplication::messageReceived, this, [this](const QString &m) {
            if (m == wakeUpMessage())
                activateWindow();
        });
}

QWidget *QtSingleApplication::activationWindow() const
{
    return m_activationWindow;
}

void QtSingleApplication::activateWindow()
{
    if (!m_activationWindow)
        return;
    m_activationWindow->setWindowState(m_activationWindow->windowState() & ~Qt::WindowMinimized);
    m_activationWindow->raise();
    m_activationWindow->activateWindow();
    qCDebug(lcInstance) << "window brought to the front";
}

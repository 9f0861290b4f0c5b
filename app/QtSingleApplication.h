#pragma once

#include <QApplication>
#include <QPointer>
#include <QString>

class QLocalServer;
class QLocalSocket;
class QWidget;

// An application of which one instance runs per administered root. The
// first instance listens on a local socket that every user can reach, so
// that a start by any user finds a running root instance; later instances
// only send it a message and end.
//
// Whoever can connect can send, so received messages are untrusted: they are
// bounded in length, must be valid UTF-8 on one line, and the activation
// window reacts only to "wake up".
class QtSingleApplication : public QApplication
{
    Q_OBJECT

public:
    // Qt 5's QApplication is always a GUI application; the flag is kept for
    // callers written against Qt Solutions' class and must be true.
    QtSingleApplication(int &argc, char **argv, bool guiEnabled = true);
    ~QtSingleApplication() override;

    // True when another instance was found listening at construction.
    bool isRunning() const;
    // Delivers a message to the running instance and waits for its receipt.
    // False when there is none, the message is refused locally (too long,
    // more than one line) or the timeout (milliseconds, for the whole
    // exchange) passes.
    bool sendMessage(const QString &message, int timeout = 5000);

    // With activateOnMessage, a "wake up" message brings the window to the
    // front.
    void setActivationWindow(QWidget *window, bool activateOnMessage = true);
    QWidget *activationWindow() const;

    // The socket of the instance for the root directory in FTPCONFIG_ROOT.
    static QString serverName();
    // The one message that the activation window reacts to.
    static QString wakeUpMessage();

    static constexpr int MaxMessageBytes = 256;

signals:
    void messageReceived(const QString &message);

public slots:
    void activateWindow();

private:
    void listenOrFindRunning();
    void acceptConnections();
    void readMessage(QLocalSocket *socket);

    QString m_serverName;
    QLocalServer *m_server = nullptr;
    bool m_running = false;
    QPointer<QWidget> m_activationWindow;
    QMetaObject::Connection m_activationConnection;
};

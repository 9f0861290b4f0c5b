#include "ModalHelper.h"
#include "TestMain.h"
#include "WindowFixture.h"
#include "dialogs/TryLoginDialog.h"
#include "trylogin/TryLogin.h"

#include <QLineEdit>
#include <QMutex>
#include <QPushButton>
#include <QSignalSpy>
#include <QTcpServer>
#include <QTcpSocket>
#include <QThread>
#include <QTreeWidget>
#include <QTreeWidgetItemIterator>

#include <algorithm>
#include <memory>

using Answers = QMap<QByteArray, QByteArray>;

namespace {

// A server that answers each command word from a script; "PASV" opens a
// data port whose listing is sent on LIST. A word without an answer is met
// with silence, one answered "close" ends the connection.
class ScriptedFtpServer : public QObject
{
public:
    ScriptedFtpServer(const QByteArray &banner, const QMap<QByteArray, QByteArray> &answers)
        : m_banner(banner)
        , m_answers(answers)
    {
        m_control.listen(QHostAddress::LocalHost);
        m_data.listen(QHostAddress::LocalHost);
        connect(&m_control, &QTcpServer::newConnection, this, [this] {
            QTcpSocket *socket = m_control.nextPendingConnection();
            connect(socket, &QTcpSocket::readyRead, this, [this, socket] { answer(socket); });
            socket->write(m_banner);
        });
    }

    quint16 port() const
    {
        return m_control.serverPort();
    }

    QList<QByteArray> commands;

private:
    void answer(QTcpSocket *socket)
    {
        while (socket->canReadLine()) {
            const QByteArray line = socket->readLine().trimmed();
            commands << line;
            const QByteArray word = line.split(' ').first();
            const QByteArray reply = m_answers.value(word);
            if (reply == "close") {
                socket->disconnectFromHost();
                return;
            }
            if (word == "PASV") {
                const quint16 port = m_data.serverPort();
                socket->write("227 Entering Passive Mode (127,0,0,1," + QByteArray::number(port / 256) + ','
                              + QByteArray::number(port % 256) + ").\r\n");
            } else if (word == "LIST" && !reply.isEmpty()) {
                socket->write("150 Here comes the directory listing.\r\n");
                if (!m_data.hasPendingConnections())
                    m_data.waitForNewConnection(2000);
                QTcpSocket *data = m_data.nextPendingConnection();
                data->write(reply);
                data->disconnectFromHost();
                socket->write("226 Directory send OK.\r\n");
            } else {
                socket->write(reply);
            }
        }
    }

    QByteArray m_banner;
    QMap<QByteArray, QByteArray> m_answers;
    QTcpServer m_control;
    QTcpServer m_data;
};

QString rowText(const TryLoginStep &step)
{
    return step.command + QLatin1Char('|') + outcomeText(step.outcome) + QLatin1Char('|') + step.text;
}

} // namespace

// "Try login": the FTP client against scripted servers, and the dialog from
// the main window's action.
class TestTryLogin : public QObject
{
    Q_OBJECT

private Q_SLOTS:
    void initTestCase()
    {
        QVERIFY(m_f.setUp());
    }

    void cleanup()
    {
        QCOMPARE(ModalHelper::shownWindow(), QString());
    }

    void ftpSteps_data()
    {
        QTest::addColumn<QByteArray>("banner");
        QTest::addColumn<Answers>("answers");
        // Each one a row the client reports, in order: "COMMAND|RESULT|PIECE".
        QTest::addColumn<QByteArrayList>("expected");

        const Answers full{{"USER", "331 Please specify the password.\r\n"},
                           {"PASS", "230 Login successful.\r\n"},
                           {"PWD", "257 \"/home/bob\" is the current directory\r\n"},
                           {"LIST", "-rw-r--r-- 1 0 0 3 Nov 23 hello.txt\r\n"},
                           {"QUIT", "221 Goodbye.\r\n"}};
        QTest::newRow("allowed, banner of two lines")
            << QByteArray("220-Welcome\r\n220-to the test\r\n220 (vsFTPd 3.0.3)\r\n") << full
            << QByteArrayList{"banner|passed|220-Welcome\n220-to the test\n220 (vsFTPd 3.0.3)",
                              "USER bob|passed|331",
                              "PASS ********|passed|230 Login successful.",
                              "PWD|passed|/home/bob",
                              "PASV|passed|227",
                              "LIST|passed|150",
                              "listing|passed|hello.txt",
                              "end of LIST|passed|226",
                              "QUIT|passed|221"};
        auto refused = full;
        refused.insert("PASS", "530 Login incorrect.\r\n");
        QTest::newRow("refused") << QByteArray("220 ready\r\n") << refused
                                 << QByteArrayList{"banner|passed|220", "USER bob|passed|331",
                                                   "PASS ********|failed|530 Login incorrect.", "QUIT|passed|221"};
        QTest::newRow("500 OOPS at the greeting")
            << QByteArray("500 OOPS: vsftpd: refusing to run with writable root inside chroot()\r\n") << full
            << QByteArrayList{"banner|failed|500 OOPS"};
        auto closing = full;
        closing.insert("USER", "close");
        QTest::newRow("closed after USER")
            << QByteArray("220 ready\r\n") << closing
            << QByteArrayList{"banner|passed|220", "USER bob|failed|(connection closed by the server)"};
        // No answer to PASS: the step ends at its time bound, QUIT too.
        auto silent = full;
        silent.remove("PASS");
        silent.remove("QUIT");
        QTest::newRow("silent server") << QByteArray("220 ready\r\n") << silent
                                       << QByteArrayList{"banner|passed|220", "USER bob|passed|331",
                                                         "PASS ********|failed|(no reply within 0.5 s)",
                                                         "QUIT|failed|(no reply within 0.5 s)"};
    }

    void ftpSteps()
    {
        QFETCH(QByteArray, banner);
        QFETCH(Answers, answers);
        QFETCH(QByteArrayList, expected);
        ScriptedFtpServer server(banner, answers);
        TryLoginRequest request;
        request.user = "bob";
        request.password = "secret-Pw";
        request.port = server.port();
        request.stepTimeoutMs = 500;
        const QStringList rows = runFtp(request);
        QVERIFY2(rows.size() == expected.size(), qPrintable(rows.join(QLatin1Char('\n'))));
        for (int i = 0; i < rows.size(); ++i) {
            const QStringList want = QString::fromUtf8(expected.at(i)).split(QLatin1Char('|'));
            const QStringList got = rows.at(i).split(QLatin1Char('|'));
            QCOMPARE(got.value(0), want.value(0));
            QCOMPARE(got.value(1), want.value(1));
            QVERIFY2(got.mid(2).join(QLatin1Char('|')).contains(want.value(2)), qPrintable(rows.at(i)));
        }
        // The password reaches the server once, and no row shows it.
        QCOMPARE(server.commands.count("PASS secret-Pw"), rows.filter(QStringLiteral("PASS ********|")).size());
        QVERIFY(!rows.join(QLatin1Char('\n')).contains(QLatin1String("secret-Pw")));
    }

    void notListening()
    {
        quint16 port = 0;
        {
            QTcpServer probe;
            QVERIFY(probe.listen(QHostAddress::LocalHost));
            port = probe.serverPort();
        }
        TryLoginRequest request;
        request.port = port;
        const QStringList rows = runFtp(request);
        QCOMPARE(rows.size(), 1);
        QVERIFY2(rows.first().startsWith(
                     QStringLiteral("connect to 127.0.0.1:%1|failed|vsftpd is not listening on").arg(port)),
                 qPrintable(rows.first()));
    }

    // From the window's action on a user row: the password hidden, the
    // verdict and the forecast beside steps that say why PAM and the server
    // are not tried on a root other than "/", the field empty at the end.
    void dialogFromWindow()
    {
        QVERIFY(m_f.open());
        QAction *action = m_f.window->findChild<QAction *>(QStringLiteral("actionTry_login"));
        QVERIFY(action);
        m_f.window->view()->setCurrentIndex(m_f.viewIndex(QStringLiteral("Local users")));
        QVERIFY(!action->isEnabled());
        m_f.window->view()->setCurrentIndex(m_f.viewIndex(QStringLiteral("bob")));
        QVERIFY(action->isEnabled());

        QStringList rows;
        QPointer<QLineEdit> field;
        ModalHelper modal;
        modal.expect(QStringLiteral("Try login: bob"), [&](QWidget *widget) {
            auto *dialog = qobject_cast<TryLoginDialog *>(widget);
            field = dialog->findChild<QLineEdit *>(QStringLiteral("passwordLineEdit"));
            QCOMPARE(field->echoMode(), QLineEdit::Password);
            QTest::keyClicks(field, QStringLiteral("bob-Pw"));
            QSignalSpy finished(dialog, &TryLoginDialog::trialFinished);
            QTest::keyClick(field, Qt::Key_Return);
            QVERIFY(finished.wait(5000));
            QVERIFY(!dialog->isRunning());
            for (QTreeWidgetItemIterator it(dialog->stepsTree()); *it; ++it)
                rows << (*it)->text(0) + QLatin1Char('|') + (*it)->text(1) + QLatin1Char('|') + (*it)->text(2);
            QVERIFY(ModalHelper::press(dialog, QDialogButtonBox::Close));
        });
        action->trigger();
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        const QString status = m_f.source(QStringLiteral("bob"), TreeModel::StatusColumn).data().toString();
        const QString reason = QStringLiteral("Not run: the program works on %1").arg(m_f.root->path());
        const QStringList expected{QStringLiteral("Program's verdict|") + status + QLatin1Char('|'),
                                   QStringLiteral("Server forecast|"),
                                   QStringLiteral("PAM|skipped|"),
                                   QStringLiteral("pam_start|skipped|") + reason,
                                   QStringLiteral("FTP|skipped|"),
                                   QStringLiteral("connect|skipped|") + reason};
        for (const QString &want : expected)
            QVERIFY2(std::any_of(rows.cbegin(), rows.cend(), [&](const QString &row) { return row.startsWith(want); }),
                     qPrintable(want + QStringLiteral(" not in:\n") + rows.join(QLatin1Char('\n'))));
        QVERIFY(!rows.join(QLatin1Char('\n')).contains(QLatin1String("bob-Pw")));
        QVERIFY(!field);
        QCOMPARE(m_f.close(), QString());
    }

private:
    // The client on a worker thread, as the dialog runs it; its rows.
    QStringList runFtp(const TryLoginRequest &request)
    {
        QStringList rows;
        QMutex mutex;
        const std::atomic_bool cancel{false};
        std::unique_ptr<QThread> worker(QThread::create([&] {
            tryFtpLogin(
                request, false,
                [&](const TryLoginStep &step) {
                    QMutexLocker lock(&mutex);
                    rows << rowText(step);
                },
                cancel);
        }));
        worker->start();
        // The scripted server answers from this thread's event loop.
        if (!QTest::qWaitFor([&] { return worker->isFinished(); }, 10000))
            worker->wait();
        QMutexLocker lock(&mutex);
        return rows;
    }

    WindowFixture m_f;
};

FTPCONFIG_TEST_MAIN(TestTryLogin)
#include "TestTryLogin.moc"

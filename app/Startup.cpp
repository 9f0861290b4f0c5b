#include "Startup.h"

#include "CMainWindow.h"
#include "QtSingleApplication.h"
#include "VexIntegration.h"

#include <QApplication>
#include <QDesktopWidget>
#include <QIcon>
#include <QLoggingCategory>
#include <QMessageBox>
#include <QPixmap>
#include <QSocketNotifier>

#include <csignal>
#include <cstdio>
#include <cstring>
#include <memory>
#include <vector>

#include <fcntl.h>
#include <unistd.h>

// Off unless enabled (QT_LOGGING_RULES="ftpconfig.startup.debug=true").
Q_LOGGING_CATEGORY(lcStartup, "ftpconfig.startup", QtWarningMsg)

namespace {

int g_signalPipe[2] = {-1, -1};

void onTerminationSignal(int)
{
    const char byte = 1;
    [[maybe_unused]] const ssize_t written = ::write(g_signalPipe[1], &byte, 1);
}

// SIGTERM and SIGINT end the event loops, the main one and that of any
// modal box, so that the program leaves through its ordinary exits (the
// window destroyed, the database closed) instead of where it stands. The
// handler only writes to a pipe; the event loop does the rest.
void catchTerminationSignals()
{
    if (::pipe2(g_signalPipe, O_CLOEXEC | O_NONBLOCK) != 0)
        return;
    struct sigaction action = {};
    action.sa_handler = onTerminationSignal;
    sigemptyset(&action.sa_mask);
    action.sa_flags = SA_RESTART;
    sigaction(SIGTERM, &action, nullptr);
    sigaction(SIGINT, &action, nullptr);
}

void quitOnTerminationSignal(QCoreApplication *application)
{
    if (g_signalPipe[0] < 0)
        return;
    auto *notifier = new QSocketNotifier(g_signalPipe[0], QSocketNotifier::Read, application);
    QObject::connect(notifier, &QSocketNotifier::activated, application, [] {
        char buffer[16];
        while (::read(g_signalPipe[0], buffer, sizeof buffer) > 0) { }
        qCDebug(lcStartup) << "termination signal: leaving the event loops";
        QCoreApplication::quit();
    });
}

// Takes "--root DIR" and "--root=DIR" out of the arguments (Qt must not see
// them) and makes DIR the root directory before anything resolves a path.
bool takeRootOption(std::vector<char *> &arguments)
{
    static const char option[] = "--root";
    const std::size_t length = std::strlen(option);
    for (auto it = arguments.begin() + 1; it != arguments.end();) {
        const char *directory = nullptr;
        auto end = it + 1;
        if (std::strcmp(*it, option) == 0) {
            if (end == arguments.end())
                return false;
            directory = *end;
            ++end;
        } else if (std::strncmp(*it, option, length) == 0 && (*it)[length] == '=') {
            directory = *it + length + 1;
        } else {
            ++it;
            continue;
        }
        if (*directory == '\0')
            return false;
        qputenv("FTPCONFIG_ROOT", QByteArray(directory));
        it = arguments.erase(it, end);
    }
    return true;
}

} // namespace

bool isLaunchedByRoot()
{
    return ::getuid() == 0;
}

int refuseNonRootLauncher()
{
    qCDebug(lcStartup) << "refusing the real user id" << ::getuid();
    QMessageBox box(
        QMessageBox::Critical, QString(),
        QCoreApplication::translate("Startup", "Invalid launcher user. VSFTPD configurator must be launched by root."),
        QMessageBox::Ok, QApplication::desktop());
    box.exec();
    return -1;
}

int runFtpConfig(int argc, char **argv)
{
    std::vector<char *> arguments(argv, argv + argc);
    if (arguments.empty() || !takeRootOption(arguments)) {
        std::fputs("ftpconfig: --root needs a directory\n", stderr);
        return -1;
    }
    int count = static_cast<int>(arguments.size());
    arguments.push_back(nullptr);

    catchTerminationSignals();
    QtSingleApplication application(count, arguments.data(), true);
    quitOnTerminationSignal(&application);

    if (application.isRunning()) {
        application.sendMessage(QtSingleApplication::wakeUpMessage(), 5000);
        std::fputs("Program is allready launched.\n", stderr);
        return 0;
    }

    QApplication::setWindowIcon(
        QIcon::fromTheme(QStringLiteral("ftp"), QIcon(QPixmap(QStringLiteral(":/prefix/icons/app-icon.png")))));
    vexInit("1.2.13", "Program to control FTP server VSFTPD");

    if (!isLaunchedByRoot())
        return refuseNonRootLauncher();

    auto window = std::make_unique<CMainWindow>();
    application.setActivationWindow(window.get(), true);
    window->show();
    qCDebug(lcStartup) << "main window shown";
    const int result = application.exec();
    window.reset();
    return result;
}

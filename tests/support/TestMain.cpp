#include "TestMain.h"

#include <cstdio>

namespace {

QtMessageHandler g_testlibHandler = nullptr;
int g_warnings = 0;

void failOnWarning(QtMsgType type, const QMessageLogContext &context, const QString &message)
{
    // QtTest's own handler prints the message where it happened.
    g_testlibHandler(type, context, message);
    if (type != QtWarningMsg)
        return;
    // The offscreen platform says so of every window with a layout; it is
    // no fault of the code under test.
    if (message == QLatin1String("This plugin does not support propagateSizeHints()"))
        return;
    ++g_warnings;
    if (QTest::currentTestFunction()) {
        const QByteArray what = "Qt warning: " + message.toLocal8Bit();
        QTest::qFail(what.constData(), context.file ? context.file : "unknown", context.line);
    }
}

bool g_leaksForgotten = false;

} // namespace

// LeakSanitizer asks this at exit: a forked child that ends the process on
// purpose leaves the parent's threads and test logger behind, no leaks of
// the code under test.
extern "C" int __lsan_is_turned_off()
{
    return g_leaksForgotten ? 1 : 0;
}

void testsupport::forgetLeaksAtExit()
{
    g_leaksForgotten = true;
}

int testsupport::runTests(QObject *testObject, int argc, char **argv)
{
    QTest::qInit(testObject, argc, argv);
    // After qInit: QtTest has installed its handler, which ours wraps.
    g_testlibHandler = qInstallMessageHandler(failOnWarning);
    int result = QTest::qRun();
    qInstallMessageHandler(g_testlibHandler);
    QTest::qCleanup();
    if (g_warnings > 0) {
        std::fprintf(stderr, "FAIL: %d Qt warning(s) during the run\n", g_warnings);
        if (result == 0)
            result = 1;
    }
    return result;
}

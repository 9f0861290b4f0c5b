#pragma once

#include <QApplication>
#include <QCoreApplication>
#include <QObject>
#include <QtTest>

namespace testsupport {
// Runs the test object like QTest::qExec, except that every Qt warning
// fails the test function it happens in (or, outside one, the run).
int runTests(QObject *testObject, int argc, char **argv);
// In a forked child that is about to end the process: no leak check at its
// exit under LeakSanitizer.
void forgetLeaksAtExit();
} // namespace testsupport

#define FTPCONFIG_TEST_MAIN(TestObject)                        \
    int main(int argc, char **argv)                            \
    {                                                          \
        QApplication app(argc, argv);                          \
        app.setAttribute(Qt::AA_Use96Dpi, true);               \
        TestObject testObject;                                 \
        return testsupport::runTests(&testObject, argc, argv); \
    }

#define FTPCONFIG_TEST_GUILESS_MAIN(TestObject)                \
    int main(int argc, char **argv)                            \
    {                                                          \
        QCoreApplication app(argc, argv);                      \
        TestObject testObject;                                 \
        return testsupport::runTests(&testObject, argc, argv); \
    }

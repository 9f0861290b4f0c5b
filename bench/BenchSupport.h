#pragma once

// What the benchmarks share: writing the files of a generated root and
// loading a pam_userdb database with the library's own tool.

#include <QByteArray>
#include <QDir>
#include <QElapsedTimer>
#include <QFile>
#include <QFileInfo>
#include <QProcess>
#include <QString>

#include <cstdio>

inline void writeBenchFile(const QString &path, const QByteArray &content)
{
    QDir().mkpath(QFileInfo(path).absolutePath());
    QFile file(path);
    if (!file.open(QIODevice::WriteOnly) || file.write(content) != content.size())
        std::fprintf(stderr, "cannot write %s\n", qPrintable(path));
}

// Runs a program to its end with the input on its standard input; returns
// how long it took in milliseconds.
inline double runBenchProgram(const QString &program, const QStringList &args, const QByteArray &input = {})
{
    QElapsedTimer timer;
    timer.start();
    QProcess process;
    process.start(program, args);
    process.write(input);
    process.closeWriteChannel();
    process.waitForFinished(600000);
    if (process.exitCode() != 0)
        std::fprintf(stderr, "%s failed: %s\n", qPrintable(program), process.readAllStandardError().constData());
    return timer.nsecsElapsed() / 1e6;
}

// "virtual<i>" / "password<i>" for i below count, as db5.3_load reads them.
inline QByteArray virtualUserPairs(int count)
{
    QByteArray pairs;
    for (int i = 0; i < count; ++i)
        pairs += "virtual" + QByteArray::number(i) + "\npassword" + QByteArray::number(i) + "\n";
    return pairs;
}

inline double loadBenchDatabase(const QString &file, const QByteArray &pairs)
{
    QDir().mkpath(QFileInfo(file).absolutePath());
    return runBenchProgram(QStringLiteral("db5.3_load"),
                           {QStringLiteral("-T"), QStringLiteral("-t"), QStringLiteral("hash"), file}, pairs);
}

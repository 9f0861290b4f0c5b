#pragma once

#include <QByteArray>
#include <QString>
#include <QStringList>

struct ProcessResult
{
    int exitCode = -1;
    bool finished = false;
    QByteArray out;
    QByteArray err;
};

// Runs a program to its end, bounded in time; a program still running at the
// deadline is killed by its pid and reported as not finished.
ProcessResult runProcess(const QString &program, const QStringList &arguments, const QByteArray &input = {},
                         int timeoutMs = 30000);

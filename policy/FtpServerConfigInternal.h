#pragma once

// Helpers shared by the files that implement FtpServerConfig; not for
// anybody else.

#include "policy/AccessFailure.h"

#include <QByteArray>
#include <QString>

#include <string>

namespace engine {

// Refusal messages are built untranslated: administrators search for them.
inline QString refusal(const char *text)
{
    return QStringLiteral("***Result: FALSE. Check: ") + QLatin1String(text);
}

inline bool refuse(AccessFailure *failure, FailureKind kind, const QString &message)
{
    if (failure) {
        failure->kind = kind;
        failure->message = message;
    }
    return false;
}

inline QString text(const QByteArray &bytes)
{
    return QString::fromUtf8(bytes);
}

inline std::string str(const QByteArray &bytes)
{
    return bytes.toStdString();
}

inline QString directoryOf(const QString &path)
{
    const int slash = path.lastIndexOf(QLatin1Char('/'));
    return slash <= 0 ? QStringLiteral("/") : path.left(slash);
}

// Where the program keeps its own lists unless the configuration names others.
inline const QByteArray DefaultListDirectory = "/etc/vsftpd.d/";

} // namespace engine

using namespace engine;

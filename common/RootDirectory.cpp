#include "RootDirectory.h"

#include <QDir>
#include <QFile>

RootDirectory::RootDirectory(const QString &path)
{
    const QString clean = QDir::cleanPath(path.isEmpty() ? QStringLiteral("/") : path);
    m_path = clean == QLatin1String("/") ? QString() : clean;
}

RootDirectory RootDirectory::fromEnvironment()
{
    const QString fromEnv = qEnvironmentVariable("FTPCONFIG_ROOT");
    return RootDirectory(fromEnv.isEmpty() ? QStringLiteral("/") : QDir(fromEnv).absolutePath());
}

bool RootDirectory::isSystemRoot() const
{
    return m_path.isEmpty();
}

const QString &RootDirectory::path() const
{
    static const QString systemRoot = QStringLiteral("/");
    return m_path.isEmpty() ? systemRoot : m_path;
}

QString RootDirectory::resolve(const QString &absolutePath) const
{
    if (m_path.isEmpty() || !absolutePath.startsWith(QLatin1Char('/')))
        return absolutePath;
    return m_path + absolutePath;
}

QByteArray RootDirectory::resolve(const QByteArray &absolutePath) const
{
    if (m_path.isEmpty() || !absolutePath.startsWith('/'))
        return absolutePath;
    return QFile::encodeName(m_path) + absolutePath;
}

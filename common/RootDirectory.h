#pragma once

#include <QByteArray>
#include <QString>

// The directory that stands for "/" for every file the program reads or
// writes: "/" on a live system, or a sandbox, a mounted image, a test's
// temporary root. Paths shown to the administrator and written into files
// stay as the administrator knows them; only file system access resolves.
class RootDirectory
{
public:
    explicit RootDirectory(const QString &path = QStringLiteral("/"));

    // FTPCONFIG_ROOT when set and not empty, otherwise "/".
    static RootDirectory fromEnvironment();

    bool isSystemRoot() const;
    const QString &path() const;

    // "/etc/vsftpd.conf" -> "<root>/etc/vsftpd.conf". Relative paths are
    // left as they are.
    QString resolve(const QString &absolutePath) const;
    QByteArray resolve(const QByteArray &absolutePath) const;

private:
    QString m_path; // without a trailing "/", empty for the system root
};

#include "TemporaryRoot.h"
#include "Process.h"

#include <QDir>
#include <QDirIterator>
#include <QFile>
#include <QFileInfo>

#include <sys/stat.h>

TemporaryRoot::TemporaryRoot(const QString &base)
    : m_dir((base.isEmpty() ? QDir::tempPath() : base) + QStringLiteral("/ftpconfig-root-XXXXXX"))
{
}

bool TemporaryRoot::isValid() const
{
    return m_dir.isValid();
}

QString TemporaryRoot::path() const
{
    return m_dir.path();
}

QString TemporaryRoot::filePath(const QString &absolutePath) const
{
    return m_dir.path() + (absolutePath.startsWith(QLatin1Char('/')) ? absolutePath : QLatin1Char('/') + absolutePath);
}

bool TemporaryRoot::writeFile(const QString &absolutePath, const QByteArray &content, int mode) const
{
    const QString target = filePath(absolutePath);
    if (!QDir().mkpath(QFileInfo(target).absolutePath()))
        return false;
    QFile file(target);
    if (!file.open(QIODevice::WriteOnly | QIODevice::Truncate))
        return false;
    if (file.write(content) != content.size())
        return false;
    file.close();
    return ::chmod(QFile::encodeName(target).constData(), static_cast<mode_t>(mode)) == 0;
}

QByteArray TemporaryRoot::readFile(const QString &absolutePath) const
{
    QFile file(filePath(absolutePath));
    if (!file.open(QIODevice::ReadOnly))
        return {};
    return file.readAll();
}

bool TemporaryRoot::exists(const QString &absolutePath) const
{
    return QFileInfo::exists(filePath(absolutePath));
}

bool TemporaryRoot::makeDirectory(const QString &absolutePath) const
{
    return QDir().mkpath(filePath(absolutePath));
}

FileMap TemporaryRoot::files() const
{
    return regularFiles(m_dir.path());
}

FileMap regularFiles(const QString &directory)
{
    FileMap files;
    QDirIterator it(directory, QDir::Files | QDir::Hidden | QDir::System, QDirIterator::Subdirectories);
    while (it.hasNext()) {
        const QString path = it.next();
        const QString name = path.mid(directory.size());
        if (name.startsWith(QLatin1String("/var/lib/ftpconfig/")))
            continue;
        QFile file(path);
        files.insert(name, file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray("<unreadable>"));
    }
    return files;
}

FileMap patchedFiles(const FileMap &files, const QByteArray &diff, QString &why)
{
    QTemporaryDir patched;
    for (auto it = files.begin(); it != files.end(); ++it) {
        QDir().mkpath(QFileInfo(patched.path() + it.key()).absolutePath());
        QFile file(patched.path() + it.key());
        if (!file.open(QIODevice::WriteOnly) || file.write(*it) != it->size()) {
            why = QStringLiteral("cannot write ") + file.fileName();
            return {};
        }
    }
    const QList<QByteArray> lines = diff.split('\n');
    for (int i = 1; i + 1 < lines.size(); ++i) {
        if (lines[i - 1] == "--- /dev/null" && lines[i].startsWith("+++ b/") && !lines[i + 1].startsWith("@@")) {
            const QString path = patched.path() + QFile::decodeName(lines[i].mid(5));
            QDir().mkpath(QFileInfo(path).absolutePath());
            QFile(path).open(QIODevice::WriteOnly);
        }
    }
    const ProcessResult patch
        = runProcess(QStringLiteral("patch"),
                     {QStringLiteral("-p1"), QStringLiteral("-s"), QStringLiteral("-d"), patched.path()}, diff, 30000);
    if (!patch.finished || patch.exitCode != 0) {
        why = QString::fromLocal8Bit(patch.out + patch.err);
        return {};
    }
    return regularFiles(patched.path());
}

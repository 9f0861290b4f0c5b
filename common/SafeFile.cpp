#include "SafeFile.h"

#include <QCoreApplication>
#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

QString systemError(const char *what, int error)
{
    return QStringLiteral("%1: %2").arg(QLatin1String(what), QString::fromLocal8Bit(std::strerror(error)));
}

bool writeAll(int fd, const QByteArray &content)
{
    const char *data = content.constData();
    qsizetype left = content.size();
    while (left > 0) {
        const ssize_t written = ::write(fd, data, static_cast<size_t>(left));
        if (written < 0) {
            if (errno == EINTR)
                continue;
            return false;
        }
        data += written;
        left -= written;
    }
    return true;
}

// Only root can have made the directory, and only root can change it: each
// from dir up to and including top (or "/" when dir is not below top).
bool onlyRootWrites(const QString &dir, const QString &top)
{
    const QString stop = (dir == top || dir.startsWith(top + QLatin1Char('/'))) ? top : QStringLiteral("/");
    QString current = dir;
    for (;;) {
        struct stat info
        {
        };
        if (::stat(QFile::encodeName(current).constData(), &info) != 0 || info.st_uid != 0
            || (info.st_mode & (S_IWGRP | S_IWOTH)))
            return false;
        if (current == stop || current == QLatin1String("/"))
            return true;
        current = QFileInfo(current).absolutePath();
    }
}

// The file a chain of links at path ends in, when root alone made every
// link and root alone can change the directories they live in; an error
// otherwise. A path that is no link is its own end.
std::optional<QString> linkTarget(const QString &path, const QString &trustedTop, QString &target)
{
    target = path;
    for (int hops = 0;; ++hops) {
        struct stat info
        {
        };
        const QByteArray name = QFile::encodeName(target);
        if (::lstat(name.constData(), &info) != 0 || !S_ISLNK(info.st_mode)) {
            if (hops > 0 && !onlyRootWrites(QFileInfo(target).absolutePath(), trustedTop))
                return QStringLiteral("the link %1 leads into %2, which others than root may change")
                    .arg(path, QFileInfo(target).absolutePath());
            return std::nullopt;
        }
        if (hops == 8)
            return QStringLiteral("too many links at %1").arg(path);
        if (info.st_uid != 0 || !onlyRootWrites(QFileInfo(target).absolutePath(), trustedTop))
            return QStringLiteral("%1 is a link that someone other than root could have planted").arg(target);
        const QString next = QFile::symLinkTarget(target);
        if (next.isEmpty())
            return systemError("cannot read the link", errno);
        target = QDir::cleanPath(next);
    }
}

} // namespace

std::optional<QString> writeFileAtomically(const QString &linkPath, const QByteArray &content, mode_t newFileMode,
                                           const QString &trustedTop)
{
    // A link root made is kept, and the file it leads to is replaced.
    QString path;
    if (const auto refused = linkTarget(linkPath, QDir::cleanPath(trustedTop), path))
        return refused;
    const QByteArray target = QFile::encodeName(path);
    const QFileInfo info(path);
    const QByteArray directory = QFile::encodeName(info.absolutePath());

    mode_t mode = newFileMode;
    std::optional<std::pair<uid_t, gid_t>> owner;
    struct stat existing
    {
    };
    if (::lstat(target.constData(), &existing) == 0) {
        if (S_ISDIR(existing.st_mode))
            return systemError("the target is a directory", EISDIR);
        if (S_ISREG(existing.st_mode)) {
            mode = existing.st_mode & 07777;
            owner = std::make_pair(existing.st_uid, existing.st_gid);
        }
    }

    QByteArray temporary = directory + "/." + QFile::encodeName(info.fileName()) + ".ftpconfig-XXXXXX";
    const int fd = ::mkstemp(temporary.data());
    if (fd < 0)
        return systemError("cannot create a temporary file", errno);
    const auto fail = [&](const char *what) {
        const int error = errno;
        ::close(fd);
        ::unlink(temporary.constData());
        return systemError(what, error);
    };
    if (!writeAll(fd, content))
        return fail("cannot write");
    if (::fchmod(fd, mode) != 0)
        return fail("cannot set the mode");
    if (owner && ::fchown(fd, owner->first, owner->second) != 0)
        return fail("cannot set the owner");
    if (::fsync(fd) != 0)
        return fail("cannot sync");
    if (::close(fd) != 0) {
        const int error = errno;
        ::unlink(temporary.constData());
        return systemError("cannot close", error);
    }
    if (::rename(temporary.constData(), target.constData()) != 0) {
        const int error = errno;
        ::unlink(temporary.constData());
        return systemError("cannot rename", error);
    }
    // Temporary files of this target that an interrupted write left behind.
    const QDir dir(info.absolutePath());
    const QString prefix = QLatin1Char('.') + info.fileName() + QLatin1String(".ftpconfig-");
    for (const QString &stale : dir.entryList({prefix + QLatin1Char('*')}, QDir::Files | QDir::Hidden | QDir::System)) {
        if (stale.size() == prefix.size() + 6)
            QFile::remove(dir.filePath(stale));
    }
    // The rename itself reaches the disk with the directory.
    const int dirFd = ::open(directory.constData(), O_RDONLY | O_DIRECTORY);
    if (dirFd >= 0) {
        ::fsync(dirFd);
        ::close(dirFd);
    }
    return std::nullopt;
}

std::optional<QString> invalidNameReason(const QByteArray &name)
{
    const auto tr = [](const char *text) { return QCoreApplication::translate("SafeFile", text); };
    if (name.isEmpty())
        return tr("the name is empty");
    if (name.contains('/'))
        return tr("the name contains \"/\"");
    if (name.startsWith('.'))
        return tr("the name begins with \".\"");
    if (name.contains('\n'))
        return tr("the name contains a line break");
    for (const char c : name) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f)
            return tr("the name contains a control character");
    }
    return std::nullopt;
}

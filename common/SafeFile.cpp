#include "SafeFile.h"

#include <QCoreApplication>
#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QRandomGenerator>
#include <QSet>

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <map>
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

// Files kept open at once while a batch is written: far below the usual
// limit of 1,024 descriptors, and enough to share the waits for the disk.
constexpr int MaxOpenFiles = 256;

// A new file beside the target, named as mkstemp names one, but created
// with its final mode: most files then need no chmod of their own.
int createTemporary(QByteArray &name, mode_t mode)
{
    static const char letters[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789";
    const int random = name.size() - 6;
    for (int attempt = 0; attempt < 100; ++attempt) {
        for (int i = 0; i < 6; ++i)
            name[random + i] = letters[QRandomGenerator::global()->bounded(int(sizeof letters) - 1)];
        const int fd = ::open(name.constData(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, mode);
        if (fd >= 0 || errno != EEXIST)
            return fd;
    }
    errno = EEXIST;
    return -1;
}

void discard(AtomicBatch::Pending &file, const char *what, int error)
{
    if (file.fd >= 0)
        ::close(file.fd);
    file.fd = -1;
    ::unlink(file.temporary.constData());
    file.error = systemError(what, error);
}

// The temporary file of a target, written but not yet synced.
// The mode and owner given replace those of an existing target (a backup
// takes its original's, whatever an older backup had).
void prepare(AtomicBatch::Pending &file, const QString &linkPath, const QByteArray &content, mode_t newFileMode,
             const QString &trustedTop, std::optional<std::pair<uid_t, gid_t>> forcedOwner = std::nullopt)
{
    // A link root made is kept, and the file it leads to is replaced.
    QString path;
    if (const auto refused = linkTarget(linkPath, QDir::cleanPath(trustedTop), path)) {
        file.error = refused;
        return;
    }
    file.target = QFile::encodeName(path);
    const QFileInfo info(path);

    mode_t mode = newFileMode;
    std::optional<std::pair<uid_t, gid_t>> owner;
    struct stat existing
    {
    };
    if (::lstat(file.target.constData(), &existing) == 0) {
        if (S_ISDIR(existing.st_mode)) {
            file.error = systemError("the target is a directory", EISDIR);
            return;
        }
        if (S_ISREG(existing.st_mode) && !forcedOwner) {
            mode = existing.st_mode & 07777;
            owner = std::make_pair(existing.st_uid, existing.st_gid);
        }
    }
    if (forcedOwner)
        owner = forcedOwner;

    file.temporary
        = QFile::encodeName(info.absolutePath()) + "/." + QFile::encodeName(info.fileName()) + ".ftpconfig-XXXXXX";
    file.fd = createTemporary(file.temporary, mode);
    if (file.fd < 0) {
        file.error = systemError("cannot create a temporary file", errno);
        return;
    }
    // Each change of an inode is one more metadata update for the file
    // system to order and write: the mode and owner are set only when the
    // new file does not have them already.
    struct stat created
    {
    };
    if (!writeAll(file.fd, content))
        discard(file, "cannot write", errno);
    else if (::fstat(file.fd, &created) != 0)
        discard(file, "cannot read the mode", errno);
    else if ((created.st_mode & 07777) != mode && ::fchmod(file.fd, mode) != 0)
        discard(file, "cannot set the mode", errno);
    else if (owner && (created.st_uid != owner->first || created.st_gid != owner->second)
             && ::fchown(file.fd, owner->first, owner->second) != 0)
        discard(file, "cannot set the owner", errno);
}

// Temporary files of these targets in one directory that interrupted
// writes left behind: one listing for them all.
void removeStale(const QString &directory, const QSet<QString> &names)
{
    const QLatin1String marker(".ftpconfig-");
    const int suffix = marker.size() + 6;
    const QDir dir(directory);
    for (const QString &entry : dir.entryList(QDir::Files | QDir::Hidden | QDir::System)) {
        if (entry.size() > suffix + 1 && entry.startsWith(QLatin1Char('.'))
            && entry.midRef(entry.size() - suffix, marker.size()) == marker
            && names.contains(entry.mid(1, entry.size() - 1 - suffix)))
            QFile::remove(dir.filePath(entry));
    }
}

} // namespace

AtomicBatch::~AtomicBatch()
{
    // Files added but never committed: their targets stay as they are.
    for (const Pending &file : m_files) {
        if (file.error)
            continue;
        if (file.fd >= 0)
            ::close(file.fd);
        ::unlink(file.temporary.constData());
    }
}

std::optional<QString> AtomicBatch::add(const QString &path, const QByteArray &content, mode_t newFileMode,
                                        const QString &trustedTop)
{
    if (m_open == MaxOpenFiles)
        syncOpenFiles();
    m_files.emplace_back();
    Pending &file = m_files.back();
    prepare(file, path, content, newFileMode, trustedTop);
    if (file.fd >= 0)
        ++m_open;
    return file.error;
}

std::optional<QString> AtomicBatch::addBackup(const QString &path, const QString &trustedTop,
                                              std::optional<mode_t> keptMode, bool changedInPlace)
{
    QString original;
    std::optional<QString> refused = linkTarget(path, QDir::cleanPath(trustedTop), original);
    QByteArray content;
    struct stat info
    {
    };
    if (!refused) {
        // Read without following a link planted after the check: the copy
        // is of the file the save is about to replace, or of nothing.
        const int fd = ::open(QFile::encodeName(original).constData(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC);
        if (fd < 0 || ::fstat(fd, &info) != 0 || !S_ISREG(info.st_mode)) {
            refused = systemError("cannot read the file to keep", fd < 0 ? errno : EINVAL);
        } else if (!changedInPlace && (!keptMode || *keptMode == (info.st_mode & 07777))
                   && linkBackup(fd, path, trustedTop)) {
            // The file being replaced becomes the backup itself: nothing is
            // copied or synced, its mode and owner are its own, and the save
            // only renames it, like the files it writes.
            ::close(fd);
            return std::nullopt;
        } else {
            char buffer[65536];
            ssize_t got;
            while ((got = ::read(fd, buffer, sizeof buffer)) != 0) {
                if (got < 0 && errno == EINTR)
                    continue;
                if (got < 0) {
                    refused = systemError("cannot read the file to keep", errno);
                    break;
                }
                content.append(buffer, static_cast<int>(got));
            }
        }
        if (fd >= 0)
            ::close(fd);
    }
    if (refused) {
        m_files.emplace_back();
        m_files.back().error = refused;
        return refused;
    }
    if (m_open == MaxOpenFiles)
        syncOpenFiles();
    m_files.emplace_back();
    Pending &file = m_files.back();
    prepare(file, backupPath(path), content, keptMode.value_or(info.st_mode & 07777), trustedTop,
            std::make_pair(info.st_uid, info.st_gid));
    if (file.fd >= 0)
        ++m_open;
    return file.error;
}

bool AtomicBatch::linkBackup(int fd, const QString &path, const QString &trustedTop)
{
    QString target;
    if (linkTarget(backupPath(path), QDir::cleanPath(trustedTop), target))
        return false; // the copy reports why
    const QFileInfo info(target);
    const QByteArray stem
        = QFile::encodeName(info.absolutePath()) + "/." + QFile::encodeName(info.fileName()) + ".ftpconfig-";
    for (int attempt = 0; attempt < 16; ++attempt) {
        const QByteArray temporary
            = stem + QByteArray::number(QRandomGenerator::global()->generate() & 0xffffff, 36).rightJustified(6, '0');
        // The inode that was opened and checked, not whatever the name
        // leads to by now.
        if (::linkat(fd, "", AT_FDCWD, temporary.constData(), AT_EMPTY_PATH) == 0) {
            m_files.push_back(Pending{QFile::encodeName(target), temporary, -1, std::nullopt});
            return true;
        }
        if (errno != EEXIST)
            return false; // another file system, or no right to link: copied instead
    }
    return false;
}

void AtomicBatch::syncOpenFiles()
{
    // Each fsync ends in a flush of the disk's cache, and a thousand
    // flushes in a row cost far more than writing the files. Past a few
    // files the file system is synced once instead (syncfs: every dirty
    // file on it, ours among them, then one flush); it reports a failed
    // writeback as fsync does.
    constexpr int SyncWholeFileSystemFrom = 8;
    std::map<dev_t, int> failed; // errno of syncfs by file system, 0 when it succeeded
    if (m_open >= SyncWholeFileSystemFrom) {
        for (const Pending &file : m_files) {
            struct stat info;
            if (file.fd >= 0 && ::fstat(file.fd, &info) == 0 && !failed.count(info.st_dev))
                failed[info.st_dev] = ::syncfs(file.fd) == 0 ? 0 : errno;
        }
    } else {
        // Writeback of every file is started before the first wait, so
        // that the disk takes them together.
        for (const Pending &file : m_files) {
            if (file.fd >= 0)
                ::sync_file_range(file.fd, 0, 0, SYNC_FILE_RANGE_WRITE);
        }
    }
    for (Pending &file : m_files) {
        if (file.fd < 0)
            continue;
        struct stat info;
        int error = 0;
        if (failed.empty())
            error = ::fsync(file.fd) == 0 ? 0 : errno;
        else if (::fstat(file.fd, &info) != 0)
            error = errno;
        else if (!failed.count(info.st_dev))
            error = ::fsync(file.fd) == 0 ? 0 : errno;
        else
            error = failed[info.st_dev];
        if (error != 0) {
            discard(file, "cannot sync", error);
            continue;
        }
        const int closed = ::close(file.fd);
        file.fd = -1;
        if (closed != 0)
            discard(file, "cannot close", errno);
    }
    m_open = 0;
}

std::vector<std::optional<QString>> AtomicBatch::commit()
{
    // Every new content is on the disk before any target is replaced.
    syncOpenFiles();
    std::map<QString, QSet<QString>> replaced;
    for (Pending &file : m_files) {
        if (file.error)
            continue;
        if (::rename(file.temporary.constData(), file.target.constData()) != 0) {
            discard(file, "cannot rename", errno);
            continue;
        }
        const QFileInfo info(QFile::decodeName(file.target));
        replaced[info.absolutePath()].insert(info.fileName());
    }
    for (const auto &[directory, names] : replaced) {
        removeStale(directory, names);
        // The renames reach the disk with their directory.
        const int dirFd = ::open(QFile::encodeName(directory).constData(), O_RDONLY | O_DIRECTORY);
        if (dirFd >= 0) {
            ::fsync(dirFd);
            ::close(dirFd);
        }
    }
    std::vector<std::optional<QString>> results;
    results.reserve(m_files.size());
    for (Pending &file : m_files)
        results.push_back(std::move(file.error));
    m_files.clear();
    return results;
}

std::optional<QString> writeFileAtomically(const QString &path, const QByteArray &content, mode_t newFileMode,
                                           const QString &trustedTop)
{
    AtomicBatch batch;
    if (const auto refused = batch.add(path, content, newFileMode, trustedTop))
        return refused;
    return batch.commit().front();
}

QString backupPath(const QString &path)
{
    return path + QStringLiteral(".ftpconfig-bak");
}

std::optional<QString> writeBackup(const QString &path, const QString &trustedTop, std::optional<mode_t> keptMode,
                                   bool changedInPlace)
{
    AtomicBatch batch;
    if (const auto refused = batch.addBackup(path, trustedTop, keptMode, changedInPlace))
        return refused;
    return batch.commit().front();
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

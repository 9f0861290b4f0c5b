#pragma once

#include <QByteArray>
#include <QString>

#include <optional>
#include <sys/types.h>
#include <vector>

// Writes a whole file so that a crash or a full disk leaves either the old
// file or the new one, never a torn or empty one: a temporary file in the
// same directory, flushed and synced, renamed over the target. An existing
// target keeps its mode and owner. A symlink at the path (administrators
// keep configuration in a repository and link it) is kept and the file it
// leads to is written, when root made the link and only root can change
// the directories on the way (checked up to trustedTop, the root directory
// the program works in); otherwise nothing is written through it. Like
// invalidNameReason: nothing on success, otherwise why it failed (the
// target is then untouched).
std::optional<QString> writeFileAtomically(const QString &path, const QByteArray &content, mode_t newFileMode = 0644,
                                           const QString &trustedTop = QStringLiteral("/"));

// Many files written as writeFileAtomically writes one, with the same link,
// mode and owner rules, but with the waits for the disk shared: every
// temporary file is written first, their writes to the disk are started
// together and all are synced before the first rename, and each directory
// is synced once after the last. A save of a thousand per-user files no
// longer waits for the disk two thousand times in a row. A crash still
// leaves each file old or new; files added but never committed are not
// written at all.
class AtomicBatch
{
public:
    AtomicBatch() = default;
    AtomicBatch(const AtomicBatch &) = delete;
    AtomicBatch &operator=(const AtomicBatch &) = delete;
    ~AtomicBatch();

    // Writes the temporary file of path. Nothing when it is ready,
    // otherwise why not: the target is then left alone by commit().
    std::optional<QString> add(const QString &path, const QByteArray &content, mode_t newFileMode = 0644,
                               const QString &trustedTop = QStringLiteral("/"));
    // The temporary file of backupPath(path): a copy of the file at path
    // (through a link root made, as a write would follow it), with the
    // original's mode, or keptMode when given, and its owner. Where it can,
    // the original itself is linked under the backup's name (the save
    // replaces it by a new file, so its old content stays as it was).
    // A file that is changed in place afterwards (a database) is always
    // copied.
    std::optional<QString> addBackup(const QString &path, const QString &trustedTop = QStringLiteral("/"),
                                     std::optional<mode_t> keptMode = std::nullopt, bool changedInPlace = false);
    // Replaces the targets; one result per add(), in the order of the calls,
    // a refused add() keeping its reason. The batch is empty afterwards.
    std::vector<std::optional<QString>> commit();

    // One file of the batch: its temporary file, open until it is synced.
    struct Pending
    {
        QByteArray target;
        QByteArray temporary;
        int fd = -1;
        std::optional<QString> error;
    };

private:
    void syncOpenFiles();
    // Links the open original as the temporary file of its backup; false
    // when that cannot be done and a copy is needed.
    bool linkBackup(int fd, const QString &path, const QString &trustedTop);

    std::vector<Pending> m_files;
    int m_open = 0;
};

// Where a save keeps the version of a file it replaces.
QString backupPath(const QString &path);

// Copies the file at path to backupPath(path) as AtomicBatch::addBackup
// does, written at once; nothing on success, otherwise why not.
std::optional<QString> writeBackup(const QString &path, const QString &trustedTop = QStringLiteral("/"),
                                   std::optional<mode_t> keptMode = std::nullopt, bool changedInPlace = false);

// Why a name may not become a file name in a directory of ours or a line of
// a list, or nothing when it may: an empty name, "/", a leading ".", a
// control character or a newline are refused.
std::optional<QString> invalidNameReason(const QByteArray &name);

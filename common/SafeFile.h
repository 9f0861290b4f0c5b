#pragma once

#include <QByteArray>
#include <QString>

#include <optional>
#include <sys/types.h>

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

// Why a name may not become a file name in a directory of ours or a line of
// a list, or nothing when it may: an empty name, "/", a leading ".", a
// control character or a newline are refused.
std::optional<QString> invalidNameReason(const QByteArray &name);

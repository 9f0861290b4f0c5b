#pragma once

#include <QByteArray>
#include <QString>

#include <optional>
#include <sys/types.h>

// Writes a whole file so that a crash or a full disk leaves either the old
// file or the new one, never a torn or empty one: a temporary file in the
// same directory, flushed and synced, renamed over the target. An existing
// target keeps its mode and owner; a symlink planted at the target is
// replaced, never written through. Returns an empty string on success,
// otherwise why it failed (the target is then untouched).
QString writeFileAtomically(const QString &path, const QByteArray &content, mode_t newFileMode = 0644);

// Why a name may not become a file name in a directory of ours or a line of
// a list, or nothing when it may: an empty name, "/", a leading ".", a
// control character or a newline are refused.
std::optional<QString> invalidNameReason(const QByteArray &name);

#pragma once

#include "TemporaryRoot.h"

#include <QByteArray>
#include <QString>

// A temporary root with a small Debian-like system:
//   root, ftp (home /srv/ftp), bob and alice with hashes, locked ("!" in
//   shadow), starred ("*" in passwd), lockedhash ("!$6$..."), doublebang
//   ("!!"); groups of the same names, "ftpusers" (alice) and "writers" (ftp);
//   a vsftpd.conf with local users enabled, Debian's PAM file with its
//   pam_listfile rule, and /etc/ftpusers listing root.
class FixtureRoot : public TemporaryRoot
{
public:
    explicit FixtureRoot(const QString &base = QString());

    // Writes the default files, overridden by the given ones ("path" ->
    // content; a null QByteArray leaves a default file out).
    bool write(const FileMap &files = {});
    // Virtual users (name -> password) written with db5.3_load.
    bool writeVirtualUsers(const QString &path, const QMap<QByteArray, QByteArray> &users);

    static FileMap defaults();
};

#pragma once

#include <QByteArray>
#include <QMap>
#include <QString>
#include <QTemporaryDir>

// Files of a root by the absolute paths the program knows them by.
using FileMap = QMap<QString, QByteArray>;

// Every regular file below the directory, by its path below it, except the
// database environment (/var/lib/ftpconfig/), which recovers on its own.
FileMap regularFiles(const QString &directory);

// The files with a unified diff (a/ and b/ before the paths) applied by
// patch; a new empty file, of which a diff shows the headers only, is made
// empty. Empty, with the reason in why, when patch refuses the diff.
FileMap patchedFiles(const FileMap &files, const QByteArray &diff, QString &why);

// A private directory that stands for "/" in a test: files are named by the
// absolute paths the program knows them by and land below the directory.
class TemporaryRoot
{
public:
    // The directory is made below base: another file system, say.
    explicit TemporaryRoot(const QString &base = QString());

    bool isValid() const;
    QString path() const;
    QString filePath(const QString &absolutePath) const;

    // Creates missing parent directories. Fails the calling test on error.
    bool writeFile(const QString &absolutePath, const QByteArray &content, int mode = 0644) const;
    QByteArray readFile(const QString &absolutePath) const;
    bool exists(const QString &absolutePath) const;
    bool makeDirectory(const QString &absolutePath) const;
    FileMap files() const;

private:
    QTemporaryDir m_dir;
};

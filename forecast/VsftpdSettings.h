#pragma once

#include "config/ConfigFile.h"

#include <QByteArray>
#include <QHash>
#include <QList>
#include <QString>

#include <map>

// A configuration file read the way vsftpd 3.0.3 reads it: every line that
// is not empty and does not begin with "#" is "key=value", blanks before the
// key passed over, blanks around "=" kept; a line without "=", an unknown
// key or a bad yes/no value stops the server; a repeated key takes its last
// value.
class VsftpdSettings
{
public:
    enum class Kind { Unknown, Bool, Number, String };

    struct Setting
    {
        QByteArray value;
        int line = 0; // 1-based; 0 for a line added in memory
    };

    struct Problem
    {
        int line = 0;
        QString message;
    };

    // Reads the elements of a parsed file (the main configuration or a
    // per-user file).
    explicit VsftpdSettings(const ConfigElementList &elements);

    static Kind kindOf(const QByteArray &key);

    // Lines the server refuses to start with (for a per-user file: with
    // which it ends the session).
    const QList<Problem> &errors() const;
    // What stops the server before any line is read.
    void addError(int line, const QString &message);
    // Keys set more than once: the server takes the last value.
    const QList<Problem> &repeats() const;

    bool contains(const QByteArray &key) const;
    const Setting *find(const QByteArray &key) const;
    QByteArray value(const QByteArray &key, const QByteArray &defaultValue = {}) const;
    // YES, TRUE and 1 in any case are yes; absent keys take the default.
    bool isYes(const QByteArray &key, bool defaultValue) const;
    int line(const QByteArray &key) const;

    // The same for a key written in the code: looked up without copying it
    // to the heap, as happens several times for every user of a report.
    template <size_t N> bool contains(const char (&key)[N]) const
    {
        return contains(QByteArray::fromRawData(key, N - 1));
    }
    template <size_t N> const Setting *find(const char (&key)[N]) const
    {
        return find(QByteArray::fromRawData(key, N - 1));
    }
    template <size_t N> QByteArray value(const char (&key)[N], const QByteArray &defaultValue = {}) const
    {
        return value(QByteArray::fromRawData(key, N - 1), defaultValue);
    }
    template <size_t N> bool isYes(const char (&key)[N], bool defaultValue) const
    {
        return isYes(QByteArray::fromRawData(key, N - 1), defaultValue);
    }
    template <size_t N> int line(const char (&key)[N]) const
    {
        return line(QByteArray::fromRawData(key, N - 1));
    }

private:
    void readLine(const QByteArray &key, const QByteArray &value, int line);

    // Looked up several times for every user of the report: hashed.
    QHash<QByteArray, Setting> m_settings;
    QList<Problem> m_errors;
    QList<Problem> m_repeats;
};

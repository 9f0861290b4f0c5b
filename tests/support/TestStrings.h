#pragma once

#include <QStringList>

// A string list from UTF-8 literals, for the data tables of tests built
// without the implicit casts from ASCII.
template <typename... Texts> QStringList strings(const Texts &...texts)
{
    return {QString::fromUtf8(texts)...};
}

// Words split at blanks, as a table writes a command line or a list.
inline QStringList words(const char *line)
{
    return QString::fromUtf8(line).split(QLatin1Char(' '));
}

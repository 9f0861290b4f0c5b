#pragma once

#include "common/NameFilter.h"

#include <QByteArray>
#include <QSet>
#include <QString>
#include <QStringList>

// A list of user names, one per line of its file (the userlist, the chroot
// list), in file order, with a lookup that stays fast for long lists: every
// user of the table is looked up in it.
class NameList
{
public:
    NameList() = default;
    explicit NameList(const QStringList &names);

    const QStringList &names() const;
    bool contains(const QString &name) const;
    // The same for a name as the accounts hold it (UTF-8), with nothing
    // converted: the table asks this for every user.
    bool contains(const QByteArray &name) const;
    bool isEmpty() const;
    int size() const;

    void append(const QString &name);
    // Removes every occurrence; returns how many there were.
    int removeAll(const QString &name);
    void clear();

    QString join(QChar separator) const;

private:
    QStringList m_names;
    QSet<QByteArray> m_index; // UTF-8
    NameFilter m_filter; // in front of the index
};

#include "NameList.h"

NameList::NameList(const QStringList &names)
    : m_names(names)
{
    m_index.reserve(names.size());
    for (const QString &name : names)
        m_index.insert(name.toUtf8());
}

const QStringList &NameList::names() const
{
    return m_names;
}

bool NameList::contains(const QString &name) const
{
    return m_index.contains(name.toUtf8());
}

bool NameList::contains(const QByteArray &name) const
{
    return m_index.contains(name);
}

bool NameList::isEmpty() const
{
    return m_names.isEmpty();
}

int NameList::size() const
{
    return m_names.size();
}

void NameList::append(const QString &name)
{
    m_names.append(name);
    m_index.insert(name.toUtf8());
}

int NameList::removeAll(const QString &name)
{
    m_index.remove(name.toUtf8());
    return m_names.removeAll(name);
}

void NameList::clear()
{
    m_names.clear();
    m_index.clear();
}

QString NameList::join(QChar separator) const
{
    return m_names.join(separator);
}

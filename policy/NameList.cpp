#include "NameList.h"

NameList::NameList(const QStringList &names)
    : m_names(names)
{
    m_index.reserve(names.size());
    m_filter.reset(names.size());
    for (const QString &name : names) {
        const QByteArray utf8 = name.toUtf8();
        m_index.insert(utf8);
        m_filter.add(utf8);
    }
}

const QStringList &NameList::names() const
{
    return m_names;
}

bool NameList::contains(const QString &name) const
{
    return contains(name.toUtf8());
}

bool NameList::contains(const QByteArray &name) const
{
    return m_filter.mayContain(name) && m_index.contains(name);
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
    const QByteArray utf8 = name.toUtf8();
    m_index.insert(utf8);
    m_filter.add(utf8);
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
    m_filter = NameFilter();
}

QString NameList::join(QChar separator) const
{
    return m_names.join(separator);
}

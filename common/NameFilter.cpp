#include "NameFilter.h"

#include <QHash>

#include <algorithm>

void NameFilter::reset(int expected)
{
    // Sixteen bits a name: about one name in sixteen that is not in the
    // set passes.
    size_t words = 1;
    while (words * 64 < static_cast<size_t>(std::max(expected, 1)) * 16)
        words *= 2;
    m_words.assign(words, 0);
}

void NameFilter::add(const QByteArray &name)
{
    // Never reset, it lets every name through: the set may hold names it
    // was not told of.
    if (m_words.empty())
        return;
    const size_t bit = qHash(name) & (m_words.size() * 64 - 1);
    m_words[bit / 64] |= quint64(1) << (bit % 64);
}

bool NameFilter::mayContain(const QByteArray &name) const
{
    if (m_words.empty())
        return true;
    const size_t bit = qHash(name) & (m_words.size() * 64 - 1);
    return m_words[bit / 64] & (quint64(1) << (bit % 64));
}

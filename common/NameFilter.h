#pragma once

#include <QByteArray>

#include <vector>

// A bit for each hash value of the names of a set: a name whose bit is
// clear is not in the set. Most names asked of a list are not on it, and
// these bits stay in the processor's cache where a set of thousands of
// names does not. Empty, it lets every name through.
class NameFilter
{
public:
    // Cleared, with room for about that many names.
    void reset(int expected);
    void add(const QByteArray &name);
    bool mayContain(const QByteArray &name) const;

private:
    std::vector<quint64> m_words;
};

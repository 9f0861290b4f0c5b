#include "UnifiedDiff.h"

#include <algorithm>
#include <string_view>
#include <vector>

namespace {

constexpr int Context = 3;
// Beyond this many differing lines the shortest edit is not worth its
// memory (the square of it): the differing middle is shown removed and
// added as a whole, which is still a correct patch.
constexpr int MaxEdits = 2000;

enum class Op : char { Equal, Delete, Insert };

// Lines with their terminators: a last line without "\n" differs from the
// same text with one, as it does for diff.
std::vector<std::string_view> splitLines(const QByteArray &text)
{
    std::vector<std::string_view> lines;
    const std::string_view all(text.constData(), static_cast<size_t>(text.size()));
    size_t start = 0;
    while (start < all.size()) {
        const size_t end = all.find('\n', start);
        const size_t next = end == std::string_view::npos ? all.size() : end + 1;
        lines.push_back(all.substr(start, next - start));
        start = next;
    }
    return lines;
}

// Myers' shortest edit script between a and b, in order; empty when the
// differences exceed MaxEdits.
std::vector<Op> shortestEdit(const std::vector<std::string_view> &a, const std::vector<std::string_view> &b)
{
    const int n = static_cast<int>(a.size());
    const int m = static_cast<int>(b.size());
    const int max = std::min(n + m, MaxEdits);
    const int offset = max + 1;
    std::vector<int> v(2 * static_cast<size_t>(max) + 3, 0);
    // trace[d] holds the furthest x of every diagonal -d..d after step d.
    std::vector<std::vector<int>> trace;
    int found = -1;
    for (int d = 0; d <= max && found < 0; ++d) {
        for (int k = -d; k <= d; k += 2) {
            int x = (k == -d || (k != d && v[offset + k - 1] < v[offset + k + 1])) ? v[offset + k + 1]
                                                                                   : v[offset + k - 1] + 1;
            int y = x - k;
            while (x < n && y < m && a[x] == b[y]) {
                ++x;
                ++y;
            }
            v[offset + k] = x;
            if (x >= n && y >= m) {
                found = d;
                break;
            }
        }
        trace.emplace_back(v.begin() + offset - d, v.begin() + offset + d + 1);
    }
    if (found < 0)
        return {};

    std::vector<Op> ops;
    int x = n;
    int y = m;
    for (int d = found; d > 0; --d) {
        const std::vector<int> &previous = trace[d - 1];
        const auto furthest = [&](int k) { return previous[k + d - 1]; };
        const int k = x - y;
        const bool down = k == -d || (k != d && furthest(k - 1) < furthest(k + 1));
        const int previousK = down ? k + 1 : k - 1;
        const int previousX = furthest(previousK);
        const int previousY = previousX - previousK;
        while (x > previousX + (down ? 0 : 1) && y > previousY + (down ? 1 : 0)) {
            ops.push_back(Op::Equal);
            --x;
            --y;
        }
        ops.push_back(down ? Op::Insert : Op::Delete);
        x = previousX;
        y = previousY;
    }
    for (; x > 0; --x)
        ops.push_back(Op::Equal);
    std::reverse(ops.begin(), ops.end());
    return ops;
}

QByteArray range(int start, int count)
{
    // GNU's form: an empty range names the line before it, one line only
    // its number.
    if (count == 0)
        return QByteArray::number(start) + ",0";
    if (count == 1)
        return QByteArray::number(start + 1);
    return QByteArray::number(start + 1) + ',' + QByteArray::number(count);
}

} // namespace

QByteArray unifiedDiff(const QByteArray &before, const QByteArray &after, const QByteArray &fromLabel,
                       const QByteArray &toLabel)
{
    if (before == after)
        return {};
    const std::vector<std::string_view> a = splitLines(before);
    const std::vector<std::string_view> b = splitLines(after);

    // Common ends need no search: most saves change a few lines.
    size_t prefix = 0;
    while (prefix < a.size() && prefix < b.size() && a[prefix] == b[prefix])
        ++prefix;
    size_t suffix = 0;
    while (suffix < a.size() - prefix && suffix < b.size() - prefix
           && a[a.size() - 1 - suffix] == b[b.size() - 1 - suffix])
        ++suffix;
    const std::vector<std::string_view> middleA(a.begin() + static_cast<long>(prefix),
                                                a.end() - static_cast<long>(suffix));
    const std::vector<std::string_view> middleB(b.begin() + static_cast<long>(prefix),
                                                b.end() - static_cast<long>(suffix));
    std::vector<Op> middle = shortestEdit(middleA, middleB);
    if (middle.empty()) {
        middle.assign(middleA.size(), Op::Delete);
        middle.insert(middle.end(), middleB.size(), Op::Insert);
    }
    std::vector<Op> ops(prefix, Op::Equal);
    ops.insert(ops.end(), middle.begin(), middle.end());
    ops.insert(ops.end(), suffix, Op::Equal);

    // Where each operation starts in the two texts.
    std::vector<int> oldAt(ops.size() + 1, 0);
    std::vector<int> newAt(ops.size() + 1, 0);
    for (size_t i = 0; i < ops.size(); ++i) {
        oldAt[i + 1] = oldAt[i] + (ops[i] != Op::Insert ? 1 : 0);
        newAt[i + 1] = newAt[i] + (ops[i] != Op::Delete ? 1 : 0);
    }

    QByteArray out = "--- " + fromLabel + "\n+++ " + toLabel + '\n';
    const auto put = [&](char mark, std::string_view line) {
        out += mark;
        out.append(line.data(), static_cast<int>(line.size()));
        if (line.empty() || line.back() != '\n')
            out += "\n\\ No newline at end of file\n";
    };
    size_t i = 0;
    while (i < ops.size()) {
        if (ops[i] == Op::Equal) {
            ++i;
            continue;
        }
        const size_t start = i > static_cast<size_t>(Context) ? i - Context : 0;
        // Changes closer than twice the context share a hunk.
        size_t end = i;
        while (true) {
            while (end < ops.size() && ops[end] != Op::Equal)
                ++end;
            size_t same = end;
            while (same < ops.size() && ops[same] == Op::Equal)
                ++same;
            if (same < ops.size() && same - end <= 2 * static_cast<size_t>(Context)) {
                end = same;
                continue;
            }
            end = std::min(same, end + Context);
            break;
        }
        out += "@@ -" + range(oldAt[start], oldAt[end] - oldAt[start]) + " +"
            + range(newAt[start], newAt[end] - newAt[start]) + " @@\n";
        for (size_t j = start; j < end; ++j) {
            switch (ops[j]) {
            case Op::Equal:
                put(' ', a[static_cast<size_t>(oldAt[j])]);
                break;
            case Op::Delete:
                put('-', a[static_cast<size_t>(oldAt[j])]);
                break;
            case Op::Insert:
                put('+', b[static_cast<size_t>(newAt[j])]);
                break;
            }
        }
        i = end;
    }
    return out;
}

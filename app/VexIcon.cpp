#include "VexIcon.h"

#include <QIconEngine>
#include <QPainter>
#include <QPixmap>
#include <QStyle>

namespace {

// Draws on demand rather than composing pixmaps once, so that every size a
// view asks for (and the disabled and selected modes) gets its emblem.
class EmblemIconEngine : public QIconEngine
{
public:
    EmblemIconEngine(const QIcon &base, const QIcon &emblem)
        : m_base(base)
        , m_emblem(emblem)
    {
    }

    void paint(QPainter *painter, const QRect &rect, QIcon::Mode mode, QIcon::State state) override
    {
        // The emblem sits on the base as drawn, which may be smaller than
        // the rectangle when the theme has no larger image.
        const QRect baseRect
            = QStyle::alignedRect(Qt::LeftToRight, Qt::AlignCenter, m_base.actualSize(rect.size(), mode, state), rect);
        m_base.paint(painter, baseRect, Qt::AlignCenter, mode, state);
        const int side = qMax(1, qMin(baseRect.width(), baseRect.height()) / 2);
        const QRect corner(baseRect.right() - side + 1, baseRect.bottom() - side + 1, side, side);
        m_emblem.paint(painter, corner, Qt::AlignCenter, mode, state);
    }

    QSize actualSize(const QSize &size, QIcon::Mode mode, QIcon::State state) override
    {
        return m_base.actualSize(size, mode, state);
    }

    QPixmap pixmap(const QSize &size, QIcon::Mode mode, QIcon::State state) override
    {
        const QSize drawn = actualSize(size, mode, state);
        QPixmap result(drawn);
        result.fill(Qt::transparent);
        QPainter painter(&result);
        paint(&painter, QRect(QPoint(0, 0), drawn), mode, state);
        return result;
    }

    QList<QSize> availableSizes(QIcon::Mode mode, QIcon::State state) const override
    {
        return m_base.availableSizes(mode, state);
    }

    QString iconName() const override
    {
        return m_base.name();
    }

    QString key() const override
    {
        return QStringLiteral("EmblemIconEngine");
    }

    QIconEngine *clone() const override
    {
        return new EmblemIconEngine(m_base, m_emblem);
    }

private:
    QIcon m_base;
    QIcon m_emblem;
};

} // namespace

QIcon VexIcon::fromTheme(const QString &name, const QString &emblem, const QIcon &fallback)
{
    if (!QIcon::hasThemeIcon(name))
        return fallback;
    const QIcon base = QIcon::fromTheme(name);
    if (emblem.isEmpty() || !QIcon::hasThemeIcon(emblem))
        return base;
    return QIcon(new EmblemIconEngine(base, QIcon::fromTheme(emblem)));
}

#include "WrappingDelegate.h"

#include <QHeaderView>
#include <QTreeView>

WrappingDelegate::WrappingDelegate(QTreeView *view, int wrappingColumn)
    : QStyledItemDelegate(view)
    , m_view(view)
    , m_column(wrappingColumn)
{
}

QSize WrappingDelegate::sizeHint(const QStyleOptionViewItem &option, const QModelIndex &index) const
{
    if (index.column() != m_column)
        return QStyledItemDelegate::sizeHint(option, index);
    QStyleOptionViewItem sized = option;
    sized.rect = QRect(0, 0, qMax(m_view->columnWidth(index.column()), 1), 1 << 16);
    return QStyledItemDelegate::sizeHint(sized, index);
}

void WrappingDelegate::install(QTreeView *view, int wrappingColumn)
{
    view->setUniformRowHeights(false);
    view->setWordWrap(true);
    view->setItemDelegate(new WrappingDelegate(view, wrappingColumn));
    // The view keeps the row heights of the old widths.
    QObject::connect(view->header(), &QHeaderView::sectionResized, view, [view] { view->doItemsLayout(); });
}

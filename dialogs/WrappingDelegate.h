#pragma once

#include <QStyledItemDelegate>

class QTreeView;

// QTreeView asks for row heights without the column's width, so wrapped
// text would keep one line: this gives the wrapping column its width. The
// other columns are sized to their contents, on one line.
class WrappingDelegate : public QStyledItemDelegate
{
public:
    WrappingDelegate(QTreeView *view, int wrappingColumn);

    QSize sizeHint(const QStyleOptionViewItem &option, const QModelIndex &index) const override;

    // Wraps the view's column: the delegate, and a new layout of the rows
    // whenever a column changes width.
    static void install(QTreeView *view, int wrappingColumn);

private:
    QTreeView *m_view;
    int m_column;
};

#include "CMainTreeView.h"

CMainTreeView::CMainTreeView(QWidget *parent)
    : QTreeView(parent)
{
    setObjectName(QStringLiteral("usersTreeView"));
    setAlternatingRowColors(true);
    setUniformRowHeights(true);
    setEditTriggers(QAbstractItemView::DoubleClicked | QAbstractItemView::SelectedClicked
                    | QAbstractItemView::EditKeyPressed);
}

void CMainTreeView::currentChanged(const QModelIndex &current, const QModelIndex &previous)
{
    QTreeView::currentChanged(current, previous);
    emit selected(current);
}

void CMainTreeView::expandGroups()
{
    expandGroups(QModelIndex(), 0);
}

void CMainTreeView::expandGroups(const QModelIndex &parent, int depth)
{
    // Groups are the table's top two levels: the users below them hold no
    // rows, and asking 110,000 of them whether they do costs a filter
    // toggle more than the expanding itself.
    const QAbstractItemModel *rows = model();
    if (!rows || depth >= 2)
        return;
    const int count = rows->rowCount(parent);
    for (int row = 0; row < count; ++row) {
        const QModelIndex index = rows->index(row, 0, parent);
        if (!rows->hasChildren(index))
            continue;
        if (!isExpanded(index))
            expand(index);
        expandGroups(index, depth + 1);
    }
}
